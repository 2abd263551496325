# Feature extraction and end-to-end classification against scoring alone.
add_executable(classifier_bench ${CMAKE_CURRENT_LIST_DIR}/classifier_bench.cc)
target_link_libraries(classifier_bench PRIVATE reliqa_classifier keystash_testing benchmark::benchmark)
