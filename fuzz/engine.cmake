# Model reader fuzz target: arbitrary bytes through read, BoostingModel
# construction, prediction and the tree operations.
add_executable(fuzz_model_reader model_reader_fuzz.cc)
target_link_libraries(fuzz_model_reader PRIVATE gbdt)
target_link_options(fuzz_model_reader PRIVATE -fsanitize=fuzzer)
add_dependencies(fuzz_targets fuzz_model_reader)
