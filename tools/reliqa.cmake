# The `reliqa` command-line tool (build/bin/reliqa) and its tests.
#
# reliqa_tool: everything but main(), so that tests and fuzz targets can use
# the readers. The tool needs the engine (gbdt), the classifier
# (reliqa_classifier) and the store (keystash); until they exist in the tree it
# is skipped with a note.
set(_reliqa_dir ${CMAKE_CURRENT_SOURCE_DIR}/reliqa)

set(_reliqa_needs gbdt reliqa_classifier keystash)
set(_reliqa_missing "")
foreach(t ${_reliqa_needs})
  if(NOT TARGET ${t})
    list(APPEND _reliqa_missing ${t})
  endif()
endforeach()

# The readers depend only on the records and simdjson.
add_library(reliqa_tool_readers STATIC
  ${_reliqa_dir}/chart.cc
  ${_reliqa_dir}/collection_reader.cc
  ${_reliqa_dir}/feature_rows.cc
  ${_reliqa_dir}/io.cc
  ${_reliqa_dir}/json_doc.cc
)
target_include_directories(reliqa_tool_readers PUBLIC ${PROJECT_SOURCE_DIR})
target_link_libraries(reliqa_tool_readers PUBLIC simdjson::simdjson glog::glog)

reliqa_test(reliqa_tool_readers_test
  SOURCES ${_reliqa_dir}/collection_reader_test.cc ${_reliqa_dir}/feature_rows_test.cc
  LIBS reliqa_tool_readers)

if(_reliqa_missing)
  message(STATUS "reliqa tool: waiting for ${_reliqa_missing}; only its readers are built")
  return()
endif()
