# x86_64 as an app ships it (libcxx-static.cmake), built and run on this
# machine: its LLVM (Debian's libc++-14-dev and libc++abi-14-dev) and, before
# the machine's own libraries, the dependencies under RELIQA_DEPS.
set(RELIQA_LLVM_ROOT /usr/lib/llvm-14)
set(RELIQA_TARGET_FLAGS "")
include(${CMAKE_CURRENT_LIST_DIR}/libcxx-static.cmake)
if(RELIQA_DEPS)
  list(FIND CMAKE_PREFIX_PATH "${RELIQA_DEPS}" _index)
  if(_index EQUAL -1)
    list(PREPEND CMAKE_PREFIX_PATH "${RELIQA_DEPS}")
  endif()
endif()
