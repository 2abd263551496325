# The configuration an app ships, shared by the toolchain files of every ABI
# (x86_64.cmake, arm64.cmake, armhf.cmake):
#   - clang and lld;
#   - LLVM's C++ runtime (libc++, libc++abi and libunwind) linked statically
#     into every library and program, as the NDK's c++_static is, and hidden
#     in every shared library (--exclude-libs), so that no library exports it;
#   - hidden visibility for everything compiled, so that a shared library
#     exports only what its code marks and unused code can be dropped;
#   - the dependencies that scripts/build-deps.sh builds the same way, found
#     under RELIQA_DEPS (their install prefix), never on the machine.
# A process can hold several libraries built so, each with its own copy of the
# runtime: a C++ exception must not leave the library that threw it (see
# host/jni/Api.h).
#
# The including file sets RELIQA_LLVM_ROOT, the directory holding libc++'s
# headers (include/c++/v1) and archives (lib/): the build machine's LLVM, or a
# sysroot's; and RELIQA_TARGET_FLAGS, the target's code generation flags.

set(RELIQA_SHIPPED_CONFIGURATION ON)

set(CMAKE_C_COMPILER clang)
set(CMAKE_CXX_COMPILER clang++)

# (Toolchain files are read more than once: set, never append.)
set(_flags "${RELIQA_TARGET_FLAGS} -ffp-contract=off -ffunction-sections -fdata-sections -fvisibility=hidden")
set(CMAKE_C_FLAGS_INIT "${_flags}")
set(CMAKE_CXX_FLAGS_INIT
  "${_flags} -fvisibility-inlines-hidden --start-no-unused-arguments -nostdinc++ --end-no-unused-arguments -isystem ${RELIQA_LLVM_ROOT}/include/c++/v1")

# The runtime's archives follow everything else on a C++ link line; the
# driver's own C++ library and libgcc_s stay out. libgcc's builtins remain
# (statically). LLVM's unwinder, not libgcc's, because it is the one whose
# state travels with each frame: an exception thrown by one copy of the
# runtime unwinds through frames of another library without aborting.
set(CMAKE_CXX_STANDARD_LIBRARIES
  "${RELIQA_LLVM_ROOT}/lib/libc++.a ${RELIQA_LLVM_ROOT}/lib/libc++abi.a ${RELIQA_LLVM_ROOT}/lib/libunwind.a")
set(CMAKE_EXE_LINKER_FLAGS_INIT "-fuse-ld=lld -nostdlib++ -static-libgcc")
set(CMAKE_SHARED_LINKER_FLAGS_INIT "${CMAKE_EXE_LINKER_FLAGS_INIT} -Wl,--exclude-libs,ALL")
set(CMAKE_MODULE_LINKER_FLAGS_INIT "${CMAKE_SHARED_LINKER_FLAGS_INIT}")

if(NOT RELIQA_DEPS AND DEFINED ENV{RELIQA_DEPS})
  set(RELIQA_DEPS "$ENV{RELIQA_DEPS}")
endif()
# try_compile projects read this file again and need the same values.
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES RELIQA_DEPS RELIQA_SYSROOT)
