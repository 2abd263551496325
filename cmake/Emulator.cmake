# Cross builds: <build>/emulator runs a program of the target ABI under
# qemu-user with the sysroot's loader and libraries. CTest runs every test
# through it, and a program that it runs finds it in the environment variable
# RELIQA_EMULATOR to start a child process of this build.
set(RELIQA_EMULATOR ${CMAKE_BINARY_DIR}/emulator)
file(CONFIGURE OUTPUT ${RELIQA_EMULATOR} @ONLY CONTENT [[#!/bin/sh
# Runs a program built for @CMAKE_SYSTEM_PROCESSOR@: emulator PROGRAM [ARGS...]
# What it runs starts programs of this build through it as well.
RELIQA_EMULATOR='@RELIQA_EMULATOR@' QEMU_LD_PREFIX='@CMAKE_SYSROOT@' exec '@RELIQA_QEMU@' "$@"
]])
file(CHMOD ${RELIQA_EMULATOR} PERMISSIONS OWNER_READ OWNER_WRITE OWNER_EXECUTE
     GROUP_READ GROUP_EXECUTE WORLD_READ WORLD_EXECUTE)
set(CMAKE_CROSSCOMPILING_EMULATOR ${RELIQA_EMULATOR})
