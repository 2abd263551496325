# The boosted-tree engine: tree nodes, model reader and writer, compiled
# forests and the boosting model.
add_library(gbdt STATIC
  BoostingModel/NodeArena.cc
  BoostingModel/tree.cc
  BoostingModel/serialize.cc
  BoostingModel/ModelWriter.cc
  BoostingModel/BoostingModel.cc
  BoostingModel/TreeShap.cc
  FastTreeEnsembleSimd.cc
  CompleteTreeWalk.cc
  CompleteBlockWalk.cc)
target_include_directories(gbdt PUBLIC ${PROJECT_SOURCE_DIR})
target_link_libraries(gbdt PUBLIC feature_map glog::glog)

foreach(test IN ITEMS
    BoostingModel/NodeArena_test
    BoostingModel/tree_test
    BoostingModel/serialize_test
    BoostingModel/ModelWriter_test
    BoostingModel/BoostingModel_test
    BoostingModel/TreeShap_test
    CompleteTreeWalk_test
    FastTreeEnsemble_test)
  get_filename_component(name ${test} NAME)
  reliqa_test(gbdt_${name} SOURCES ${test}.cc LIBS gbdt)
endforeach()

# The explainer's lanes are plain loops that want the vectorizer (GCC runs it
# fully only from -O3; the results are the same bits either way).
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  set_source_files_properties(BoostingModel/TreeShap.cc PROPERTIES COMPILE_OPTIONS "-O3")
endif()
