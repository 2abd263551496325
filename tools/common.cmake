# What the `reliqa` tool and the Python package share (tools/common/).
#
# reliqa_readers:          JSON readers (collections, feature rows, server-feature
#                          texts) with messages that name file, line and member.
# reliqa_xgboost:          reading XGBoost JSON models, converting them, and
#                          taking node covers from them.
# reliqa_classifier_store: a classifier over the SQLite store at a path.
# reliqa_log_replay:       logged classification lines read and scored a block
#                          at a time (the Python package's replay).
set(_common_dir ${CMAKE_CURRENT_SOURCE_DIR}/common)

add_library(reliqa_readers STATIC
  ${_common_dir}/collection_reader.cc
  ${_common_dir}/feature_rows.cc
  ${_common_dir}/json_doc.cc
)
target_include_directories(reliqa_readers PUBLIC ${PROJECT_SOURCE_DIR})
target_link_libraries(reliqa_readers PUBLIC reliqa_features reliqa_json simdjson::simdjson glog::glog)

reliqa_test(reliqa_readers_test
  SOURCES ${_common_dir}/collection_reader_test.cc ${_common_dir}/feature_rows_test.cc
  LIBS reliqa_readers)

add_library(reliqa_xgboost STATIC ${_common_dir}/xgboost_model.cc ${_common_dir}/xgboost_covers.cc)
target_link_libraries(reliqa_xgboost PUBLIC reliqa_readers gbdt)

reliqa_test(reliqa_xgboost_test
  SOURCES ${_common_dir}/xgboost_model_test.cc ${_common_dir}/xgboost_covers_test.cc
  LIBS reliqa_xgboost)

add_library(reliqa_classifier_store STATIC ${_common_dir}/classifier_store.cc)
target_link_libraries(reliqa_classifier_store PUBLIC reliqa_classifier keystash gbdt)

add_library(reliqa_log_replay STATIC ${_common_dir}/log_block.cc)
target_link_libraries(reliqa_log_replay PUBLIC reliqa_readers gbdt)
