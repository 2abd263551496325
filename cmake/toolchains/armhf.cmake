# 32-bit ARM like a phone's armeabi-v7a: ARMv7-A, Thumb-2, NEON, and a 32-bit
# time_t. Debian's arm-linux-gnueabihf passes floats in VFP registers where
# Android passes them in core registers; the arithmetic is the same.
set(CMAKE_SYSTEM_PROCESSOR armv7-a)
set(RELIQA_TRIPLE arm-linux-gnueabihf)
set(RELIQA_QEMU_NAME qemu-arm-static)
set(RELIQA_TARGET_FLAGS "-march=armv7-a -mthumb -mfpu=neon -mfloat-abi=hard")
include(${CMAKE_CURRENT_LIST_DIR}/cross-common.cmake)
