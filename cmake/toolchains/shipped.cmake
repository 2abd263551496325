# The configuration an app ships, shared by the toolchain files of every ABI
# (x86_64.cmake, and arm64.cmake and armhf.cmake through cross-common.cmake):
#   - clang and lld, against a Debian sysroot of the ABI (scripts/sysroot.sh
#     makes one; scripts/build-abi.sh passes it as RELIQA_SYSROOT);
#   - LLVM's C++ runtime of that sysroot (libc++, libc++abi and libunwind)
#     linked statically into every library and program, as the NDK's
#     c++_static is, and hidden in every shared library (--exclude-libs), so
#     that no library exports it;
#   - hidden visibility for everything compiled, so that a shared library
#     exports only what its code marks and unused code can be dropped;
#   - the dependencies that scripts/build-deps.sh builds the same way, found
#     under RELIQA_DEPS (their install prefix), never on the machine.
# A process can hold several libraries built so, each with its own copy of the
# runtime: a C++ exception must not leave the library that threw it (see
# host/jni/Api.h).
#
# The including file sets RELIQA_TRIPLE, the target triple, and
# RELIQA_TARGET_FLAGS, the target's code generation flags. (Toolchain files are
# read more than once: set, never append.)

set(RELIQA_SHIPPED_CONFIGURATION ON)

if(NOT RELIQA_SYSROOT AND DEFINED ENV{RELIQA_SYSROOT})
  set(RELIQA_SYSROOT "$ENV{RELIQA_SYSROOT}")
endif()
if(NOT RELIQA_SYSROOT OR NOT EXISTS "${RELIQA_SYSROOT}/usr/include")
  message(FATAL_ERROR "Set RELIQA_SYSROOT to a ${RELIQA_TRIPLE} sysroot (scripts/sysroot.sh makes one).")
endif()
if(NOT RELIQA_DEPS AND DEFINED ENV{RELIQA_DEPS})
  set(RELIQA_DEPS "$ENV{RELIQA_DEPS}")
endif()
# try_compile projects read this file again and need the same values.
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES RELIQA_DEPS RELIQA_SYSROOT)

set(CMAKE_SYSROOT "${RELIQA_SYSROOT}")
set(CMAKE_C_COMPILER clang)
set(CMAKE_CXX_COMPILER clang++)
set(CMAKE_C_COMPILER_TARGET ${RELIQA_TRIPLE})
set(CMAKE_CXX_COMPILER_TARGET ${RELIQA_TRIPLE})
set(_llvm "${RELIQA_SYSROOT}/usr/lib/llvm-14")

# Every compile starts with the project's code and hardening flags (an
# optimised build: the shipped configuration is never a debug one).
include(${CMAKE_CURRENT_LIST_DIR}/../BuildFlags.cmake)
list(JOIN RELIQA_CODE_FLAGS " " _code)
list(JOIN RELIQA_HARDENING_FLAGS " " _hardening)
set(_flags "${RELIQA_TARGET_FLAGS} ${_code} ${_hardening} -fvisibility=hidden")
set(CMAKE_C_FLAGS_INIT "${_flags}")
set(CMAKE_CXX_FLAGS_INIT "${_flags} -fvisibility-inlines-hidden \
--start-no-unused-arguments -nostdinc++ --end-no-unused-arguments -isystem ${_llvm}/include/c++/v1")

# The runtime's archives follow everything else on a C++ link line; the
# driver's own C++ library and libgcc_s stay out. libgcc's builtins remain
# (statically). LLVM's unwinder, not libgcc's, because it is the one whose
# state travels with each frame: an exception thrown by one copy of the
# runtime unwinds through frames of another library without aborting.
# (Debian's libc++.a holds libc++abi's objects too; libc++abi.a is named for
# builds of LLVM that keep them apart.)
set(CMAKE_CXX_STANDARD_LIBRARIES "${_llvm}/lib/libc++.a ${_llvm}/lib/libc++abi.a ${_llvm}/lib/libunwind.a")
set(CMAKE_EXE_LINKER_FLAGS_INIT "-fuse-ld=lld -nostdlib++ -static-libgcc")
set(CMAKE_SHARED_LINKER_FLAGS_INIT "${CMAKE_EXE_LINKER_FLAGS_INIT} -Wl,--exclude-libs,ALL")
set(CMAKE_MODULE_LINKER_FLAGS_INIT "${CMAKE_SHARED_LINKER_FLAGS_INIT}")

# Libraries, headers and packages come from the dependencies' prefix, then
# from the sysroot; programs (and the JDK's headers, host/jni) from the
# machine.
set(CMAKE_FIND_ROOT_PATH ${RELIQA_DEPS} "${RELIQA_SYSROOT}")
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
