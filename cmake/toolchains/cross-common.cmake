# Shared part of the cross toolchains: Debian's clang and lld for the target
# triple, against a Debian sysroot of that architecture (scripts/sysroot.sh
# makes one; scripts/build-abi.sh passes it as RELIQA_SYSROOT), and Debian's
# qemu-user-static to run what the build makes.
#
# The including file sets RELIQA_TRIPLE, RELIQA_QEMU and, optionally,
# RELIQA_TARGET_FLAGS before including this one.

set(CMAKE_SYSTEM_NAME Linux)

if(NOT RELIQA_SYSROOT AND DEFINED ENV{RELIQA_SYSROOT})
  set(RELIQA_SYSROOT "$ENV{RELIQA_SYSROOT}")
endif()
if(NOT RELIQA_SYSROOT OR NOT EXISTS "${RELIQA_SYSROOT}/usr/include")
  message(FATAL_ERROR "Set RELIQA_SYSROOT to a ${RELIQA_TRIPLE} sysroot (scripts/sysroot.sh makes one).")
endif()
# try_compile projects read this file again and need the same sysroot.
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES RELIQA_SYSROOT)

set(CMAKE_SYSROOT "${RELIQA_SYSROOT}")
set(CMAKE_C_COMPILER clang)
set(CMAKE_CXX_COMPILER clang++)
set(CMAKE_C_COMPILER_TARGET ${RELIQA_TRIPLE})
set(CMAKE_CXX_COMPILER_TARGET ${RELIQA_TRIPLE})
set(CMAKE_C_FLAGS_INIT "${RELIQA_TARGET_FLAGS}")
set(CMAKE_CXX_FLAGS_INIT "${RELIQA_TARGET_FLAGS}")
foreach(kind EXE SHARED MODULE)
  set(CMAKE_${kind}_LINKER_FLAGS_INIT "-fuse-ld=lld")
endforeach()

set(CMAKE_FIND_ROOT_PATH "${RELIQA_SYSROOT}")
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)

find_program(RELIQA_QEMU ${RELIQA_QEMU_NAME} REQUIRED)
