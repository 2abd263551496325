# The `reliqa` tool streaming JSON Lines through `classify -` and `features -`.
add_executable(tool_bench ${CMAKE_CURRENT_LIST_DIR}/tool_bench.cc)
target_include_directories(tool_bench PRIVATE ${PROJECT_SOURCE_DIR})
target_link_libraries(tool_bench PRIVATE benchmark::benchmark fmt::fmt)
target_compile_definitions(tool_bench PRIVATE
  RELIQA_TOOL="$<TARGET_FILE:reliqa>"
  EXAMPLE_MODEL="${PROJECT_SOURCE_DIR}/examples/model.txt")
add_dependencies(tool_bench reliqa)
