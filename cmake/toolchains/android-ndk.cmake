# Android with the NDK's own toolchain: what a real app builds with. Written
# from the NDK's documented CMake variables and not run here (the build
# machine has no NDK; x86_64.cmake, arm64.cmake and armhf.cmake stand in for
# it, with Debian's clang and libc++).
#
#   cmake -S . -B build-android-arm64-v8a -G Ninja \
#     -DCMAKE_TOOLCHAIN_FILE=cmake/toolchains/android-ndk.cmake \
#     -DANDROID_NDK=<the NDK> -DANDROID_ABI=arm64-v8a \
#     -DRELIQA_DEPS=<the dependencies, built with this same toolchain>
#   cmake --build build-android-arm64-v8a --target reliqaclassifier_jni kestrova_host
#
# ANDROID_ABI is arm64-v8a, armeabi-v7a or x86_64. The NDK is named by
# ANDROID_NDK, or else by the environment's ANDROID_NDK_HOME or
# ANDROID_NDK_ROOT. What the app ships is fixed here: API level 21 (the
# archive's minSdkVersion), the NDK's static libc++ (c++_static) and 16 KB
# pages; everything else comes from the NDK's own toolchain file. The project
# adds what every build of it has (no floating-point contraction, sections
# per function, the shared libraries' hardening).

if(NOT ANDROID_NDK)
  if(DEFINED ENV{ANDROID_NDK_HOME})
    set(ANDROID_NDK "$ENV{ANDROID_NDK_HOME}")
  elseif(DEFINED ENV{ANDROID_NDK_ROOT})
    set(ANDROID_NDK "$ENV{ANDROID_NDK_ROOT}")
  endif()
endif()
if(NOT ANDROID_NDK OR NOT EXISTS "${ANDROID_NDK}/build/cmake/android.toolchain.cmake")
  message(FATAL_ERROR "Set ANDROID_NDK (or ANDROID_NDK_HOME) to an Android NDK")
endif()
if(NOT ANDROID_ABI)
  message(FATAL_ERROR "Set ANDROID_ABI to arm64-v8a, armeabi-v7a or x86_64")
endif()

set(ANDROID_PLATFORM android-21)
set(ANDROID_STL c++_static)
set(ANDROID_SUPPORT_FLEXIBLE_PAGE_SIZES ON)
include("${ANDROID_NDK}/build/cmake/android.toolchain.cmake")

set(RELIQA_SHIPPED_CONFIGURATION ON)
set(CMAKE_C_VISIBILITY_PRESET hidden)
set(CMAKE_CXX_VISIBILITY_PRESET hidden)
set(CMAKE_VISIBILITY_INLINES_HIDDEN ON)
# The dependencies' prefix is searched like the NDK's sysroot.
if(RELIQA_DEPS)
  list(APPEND CMAKE_FIND_ROOT_PATH "${RELIQA_DEPS}")
endif()
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES ANDROID_NDK RELIQA_DEPS)
