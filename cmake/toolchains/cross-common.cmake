# Shared part of the toolchains of the phone ABIs (arm64.cmake, armhf.cmake):
# the shipped configuration (shipped.cmake) cross-built for the target, and
# Debian's qemu-user-static to run what the build makes.
#
# The including file sets CMAKE_SYSTEM_PROCESSOR, RELIQA_TRIPLE,
# RELIQA_QEMU_NAME and RELIQA_TARGET_FLAGS before including this one.

set(CMAKE_SYSTEM_NAME Linux)
include(${CMAKE_CURRENT_LIST_DIR}/shipped.cmake)
find_program(RELIQA_QEMU ${RELIQA_QEMU_NAME} REQUIRED)
