# Shared part of the toolchains of the phone ABIs (arm64.cmake, armhf.cmake):
# the shipped configuration (libcxx-static.cmake) cross-built for the target
# triple against a Debian sysroot of that architecture (scripts/sysroot.sh
# makes one; scripts/build-abi.sh passes it as RELIQA_SYSROOT), with the
# sysroot's LLVM C++ runtime, and Debian's qemu-user-static to run what the
# build makes.
#
# The including file sets RELIQA_TRIPLE, RELIQA_QEMU_NAME and, optionally,
# RELIQA_TARGET_FLAGS before including this one.

set(CMAKE_SYSTEM_NAME Linux)

if(NOT RELIQA_SYSROOT AND DEFINED ENV{RELIQA_SYSROOT})
  set(RELIQA_SYSROOT "$ENV{RELIQA_SYSROOT}")
endif()
if(NOT RELIQA_SYSROOT OR NOT EXISTS "${RELIQA_SYSROOT}/usr/include")
  message(FATAL_ERROR "Set RELIQA_SYSROOT to a ${RELIQA_TRIPLE} sysroot (scripts/sysroot.sh makes one).")
endif()

set(CMAKE_SYSROOT "${RELIQA_SYSROOT}")
set(CMAKE_C_COMPILER_TARGET ${RELIQA_TRIPLE})
set(CMAKE_CXX_COMPILER_TARGET ${RELIQA_TRIPLE})
set(RELIQA_LLVM_ROOT "${RELIQA_SYSROOT}/usr/lib/llvm-14")
include(${CMAKE_CURRENT_LIST_DIR}/libcxx-static.cmake)

# Libraries, headers and packages come from the dependencies' prefix, then
# from the sysroot; programs from the build machine.
set(CMAKE_FIND_ROOT_PATH ${RELIQA_DEPS} "${RELIQA_SYSROOT}")
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)

find_program(RELIQA_QEMU ${RELIQA_QEMU_NAME} REQUIRED)
