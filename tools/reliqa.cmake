# The `reliqa` command-line tool (build/bin/reliqa) and its tests.
#
# reliqa_tool_models: model inspection, partial dependence, explanations and
#                     their charts (needs the engine).
# reliqa:             the tool.
set(_reliqa_dir ${CMAKE_CURRENT_SOURCE_DIR}/reliqa)

add_library(reliqa_tool_models STATIC
  ${_reliqa_dir}/chart.cc
  ${_reliqa_dir}/explain.cc
  ${_reliqa_dir}/inspect.cc
  ${_reliqa_dir}/io.cc
  ${_reliqa_dir}/pdp.cc
)
target_link_libraries(reliqa_tool_models PUBLIC reliqa_readers gbdt reliqa_json)

reliqa_test(reliqa_tool_models_test SOURCES ${_reliqa_dir}/inspect_pdp_test.cc LIBS reliqa_tool_models)

# Features and scores of a few hundred collections, bit for bit as a native
# build computed them (golden_data.py writes the file): the same on every ABI.
reliqa_test(reliqa_golden_test
  SOURCES ${_reliqa_dir}/golden_test.cc
  LIBS reliqa_readers reliqa_features gbdt)
target_compile_definitions(reliqa_golden_test PRIVATE
  GOLDEN_COLLECTIONS="${_reliqa_dir}/testdata/golden_collections.jsonl"
  GOLDEN_MODEL="${PROJECT_SOURCE_DIR}/examples/model.txt")

add_executable(reliqa ${_reliqa_dir}/main.cc ${_reliqa_dir}/commands.cc)
target_link_libraries(reliqa PRIVATE reliqa_tool_models reliqa_xgboost reliqa_classifier_store CLI11::CLI11)

# End-to-end tests of the tool as a user runs it: error paths, JSON Lines
# streaming, the guard that keeps a rejected model out of the store.
find_program(RELIQA_DEBIAN_PYTHON python3 PATHS /usr/bin NO_DEFAULT_PATH NO_CMAKE_FIND_ROOT_PATH REQUIRED)
add_test(NAME reliqa_cli_test
  COMMAND ${RELIQA_DEBIAN_PYTHON} ${_reliqa_dir}/cli_test.py $<TARGET_FILE:reliqa> ${PROJECT_SOURCE_DIR})
set_tests_properties(reliqa_cli_test PROPERTIES ENVIRONMENT "${RELIQA_TEST_ENVIRONMENT}" TIMEOUT 300)

# Converted models against XGBoost itself: the same verdicts and scores within
# 1e-6 on a few thousand rows, on and just below split values. The trainer runs
# on this machine only, so the tool must too.
if(NOT CMAKE_CROSSCOMPILING AND NOT RELIQA_SANITIZER AND NOT RELIQA_FUZZ)
  add_test(NAME trainer_crosscheck
    COMMAND ${RELIQA_DEBIAN_PYTHON} ${_reliqa_dir}/crosscheck.py $<TARGET_FILE:reliqa>
            ${CMAKE_CURRENT_BINARY_DIR}/crosscheck)
  set_tests_properties(trainer_crosscheck PROPERTIES ENVIRONMENT "${RELIQA_TEST_ENVIRONMENT}" TIMEOUT 900)
endif()
