# arm64-v8a: 64-bit ARM, Debian's aarch64-linux-gnu.
set(CMAKE_SYSTEM_PROCESSOR aarch64)
set(RELIQA_TRIPLE aarch64-linux-gnu)
set(RELIQA_QEMU_NAME qemu-aarch64-static)
set(RELIQA_TARGET_FLAGS "")
include(${CMAKE_CURRENT_LIST_DIR}/cross-common.cmake)
