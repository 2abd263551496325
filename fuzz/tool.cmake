# Fuzz target of the command-line tool's collection-file reader.
add_executable(fuzz_collection_json ${CMAKE_CURRENT_LIST_DIR}/fuzz_collection_json.cc)
target_link_libraries(fuzz_collection_json PRIVATE reliqa_tool_readers)
target_link_options(fuzz_collection_json PRIVATE -fsanitize=fuzzer)
add_dependencies(fuzz_targets fuzz_collection_json)
