# Fuzz targets of the classifier's stored-value decoding.
foreach(target fuzz_feature_map_json fuzz_number_text)
  add_executable(${target} ${CMAKE_CURRENT_LIST_DIR}/${target}.cc)
  target_link_libraries(${target} PRIVATE reliqa_json)
  target_link_options(${target} PRIVATE -fsanitize=fuzzer)
  add_dependencies(fuzz_targets ${target})
endforeach()
