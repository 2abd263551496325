# FeatureMap: feature id to value, in ascending id order.
add_library(feature_map STATIC ${CMAKE_CURRENT_LIST_DIR}/FeatureMap.cc)
target_include_directories(feature_map PUBLIC ${PROJECT_SOURCE_DIR})

reliqa_test(feature_map_test
  SOURCES ${CMAKE_CURRENT_LIST_DIR}/FeatureMap_test.cc
  LIBS feature_map)
