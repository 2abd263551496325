# The flags that every compile and every shared library of the project gets,
# defined once: the top CMakeLists.txt applies them to the project, and the
# shipped configuration's toolchain (cmake/toolchains/shipped.cmake) starts
# every compile with them, so that scripts/build-deps.sh builds the
# dependencies with them as well.
#
# RELIQA_CODE_FLAGS: features, scores and logging texts must be the same bits
#   on every ABI, and each operation of the arithmetic rounds on its own: no
#   fused multiply-add, whatever the target's compiler would do by default.
#   One section per function and datum, so that a library drops what nothing
#   reaches.
# RELIQA_HARDENING_FLAGS: what the platform's toolchain applies by default to
#   optimised code (not to sanitizer builds, which check more themselves).
# RELIQA_SHARED_LINK_FLAGS: 16 KB pages (required on 64-bit phones),
#   read-only relocations bound at load, a build ID for symbol files, and
#   unused sections dropped.
set(RELIQA_CODE_FLAGS -ffp-contract=off -ffunction-sections -fdata-sections)
set(RELIQA_HARDENING_FLAGS -fstack-protector-strong -U_FORTIFY_SOURCE -D_FORTIFY_SOURCE=2)
set(RELIQA_SHARED_LINK_FLAGS -Wl,-z,max-page-size=16384 -Wl,-z,relro,-z,now -Wl,--build-id -Wl,--gc-sections)
