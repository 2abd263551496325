# Sourced by scripts/package.sh and scripts/check-libs.sh: the libraries that
# the platform provides, which the app does not ship. Here they are Debian's C
# library and C++ runtime; on a phone they come with the platform and the NDK.
is_system_lib() {  # is_system_lib <soname>
  case "$1" in
    libc.so.6 | libm.so.6 | libstdc++.so.6 | libgcc_s.so.1 | libpthread.so.0 | libdl.so.2 | librt.so.1 | ld-linux*) return 0 ;;
    *) return 1 ;;
  esac
}
