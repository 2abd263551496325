# The shipped configuration links the static archives that
# scripts/build-deps.sh built under RELIQA_DEPS with the same runtime and
# flags. A library of the machine (Debian's, built on GNU's C++ runtime) would
# link as well and fail when it runs, so every dependency found must come from
# there.
if(NOT RELIQA_DEPS OR NOT IS_DIRECTORY "${RELIQA_DEPS}/lib")
  message(FATAL_ERROR "The shipped configuration needs RELIQA_DEPS, the prefix that "
                      "scripts/build-deps.sh prints (scripts/build-abi.sh passes it)")
endif()

# SQLite's archive needs what its shared library would have brought along.
set_property(TARGET SQLite::SQLite3 APPEND PROPERTY INTERFACE_LINK_LIBRARIES m ${CMAKE_DL_LIBS} Threads::Threads)

foreach(target IN ITEMS glog::glog gflags fmt::fmt double-conversion::double-conversion
                        simdjson::simdjson SQLite::SQLite3 GTest::gtest GTest::gtest_main GTest::gmock)
  if(NOT TARGET ${target})
    message(FATAL_ERROR "${target} was not found under ${RELIQA_DEPS}")
  endif()
  get_target_property(_type ${target} TYPE)
  get_target_property(_location ${target} LOCATION)
  cmake_path(IS_PREFIX RELIQA_DEPS "${_location}" NORMALIZE _inside)
  if(NOT _type STREQUAL "STATIC_LIBRARY" AND NOT _type STREQUAL "UNKNOWN_LIBRARY" OR NOT _inside)
    message(FATAL_ERROR "${target} is ${_location} (${_type}), not a static archive under ${RELIQA_DEPS}")
  endif()
endforeach()
