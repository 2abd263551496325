# Side-by-side benchmark against XGBoost's C API (libxgboost-dev).
#
#   cmake --build build --target xgboost_bench_models   # trains and converts the models once
#   build/bin/xgboost_bench
#
# Debian's xgboost package config refers to a command-line binary that the
# package does not ship, so find_package(xgboost) fails there; the library and
# its header are found directly instead.
find_library(RELIQA_XGBOOST_LIBRARY NAMES xgboost)
find_path(RELIQA_XGBOOST_INCLUDE xgboost/c_api.h)
find_program(RELIQA_BENCH_PYTHON python3 PATHS /usr/bin NO_DEFAULT_PATH REQUIRED)
if(NOT RELIQA_XGBOOST_LIBRARY OR NOT RELIQA_XGBOOST_INCLUDE)
  message(FATAL_ERROR "libxgboost-dev not found: install it, or configure with -DRELIQA_BENCH=OFF")
endif()

set(_xgb_models ${CMAKE_BINARY_DIR}/xgboost-bench-models)
add_custom_command(
  OUTPUT ${_xgb_models}/m2000_d8.txt ${_xgb_models}/m2000_d8.ubj
  COMMAND ${RELIQA_BENCH_PYTHON} ${CMAKE_CURRENT_LIST_DIR}/xgboost_models.py $<TARGET_FILE:reliqa> ${_xgb_models}
  DEPENDS reliqa ${CMAKE_CURRENT_LIST_DIR}/xgboost_models.py
  COMMENT "Training and converting the XGBoost benchmark models (a few minutes)"
  VERBATIM)
add_custom_target(xgboost_bench_models DEPENDS ${_xgb_models}/m2000_d8.txt)

add_executable(xgboost_bench ${CMAKE_CURRENT_LIST_DIR}/xgboost_bench.cc)
target_include_directories(xgboost_bench PRIVATE ${RELIQA_XGBOOST_INCLUDE})
target_link_libraries(xgboost_bench PRIVATE gbdt benchmark::benchmark ${RELIQA_XGBOOST_LIBRARY})
target_compile_definitions(xgboost_bench PRIVATE RELIQA_XGBOOST_BENCH_MODELS="${_xgb_models}")

# Contributions of the benchmark models against XGBoost's pred_contribs, on
# rows with and without NaN (trains the models first if they are missing).
if(RELIQA_PYTHON)
  add_test(NAME trainer_contributions
    COMMAND ${RELIQA_BENCH_PYTHON} ${CMAKE_CURRENT_LIST_DIR}/explain_bench.py --check
            --models ${_xgb_models} --reliqa $<TARGET_FILE:reliqa>)
  set_tests_properties(trainer_contributions PROPERTIES
    ENVIRONMENT "${RELIQA_TEST_ENVIRONMENT};PYTHONPATH=${CMAKE_BINARY_DIR}/python"
    TIMEOUT 900)
endif()
