# x86_64 as an app ships it (shipped.cmake). Built against a sysroot like the
# phone ABIs (LLVM's C++ runtime cannot be installed on the machine beside the
# plain builds' libraries), and run on this machine.
set(RELIQA_TRIPLE x86_64-linux-gnu)
set(RELIQA_TARGET_FLAGS "")
include(${CMAKE_CURRENT_LIST_DIR}/shipped.cmake)
