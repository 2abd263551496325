# Number text, compact JSON and the cache over the host's key-value store.

add_library(reliqa_json STATIC
  ${CMAKE_CURRENT_LIST_DIR}/NumberText.cc
  ${CMAKE_CURRENT_LIST_DIR}/JsonWriter.cc
  ${CMAKE_CURRENT_LIST_DIR}/FeatureMapJson.cc)
target_include_directories(reliqa_json PUBLIC ${PROJECT_SOURCE_DIR})
target_link_libraries(reliqa_json PUBLIC feature_map double-conversion::double-conversion PRIVATE simdjson::simdjson)

add_library(reliqa_cache STATIC ${CMAKE_CURRENT_LIST_DIR}/CacheManager.cc)
target_link_libraries(reliqa_cache PUBLIC reliqa_json keystash_interface PRIVATE glog::glog fmt::fmt)

reliqa_test(reliqa_json_test
  SOURCES
    ${CMAKE_CURRENT_LIST_DIR}/NumberText_test.cc
    ${CMAKE_CURRENT_LIST_DIR}/FeatureMapJson_test.cc
  LIBS reliqa_json)

reliqa_test(reliqa_cache_test
  SOURCES ${CMAKE_CURRENT_LIST_DIR}/CacheManager_test.cc
  LIBS reliqa_cache keystash_testing glog::glog)
