# Sourced by scripts/sysroot.sh and scripts/build-deps.sh, which make things
# from Debian's archive once and keep them under $CACHE, one directory per
# key: what the machine's apt sources are, and how a finished directory takes
# its place.
CACHE=${XDG_CACHE_HOME:-$HOME/.cache}/reliqa

# Prints the given files without their whole-line comments and blank lines:
# what a cache key hashes of the scripts and files that make the directory,
# so that editing a comment does not make it anew.
key_text() {
  grep -hv -e '^[[:space:]]*#' -e '^[[:space:]]*$' "$@" || true
}

# Prints the machine's configured Debian sources as one-line "deb" entries,
# deb822 stanzas included (one line per URI and suite).
debian_sources() {
  local f
  for f in /etc/apt/sources.list /etc/apt/sources.list.d/*.list; do
    [ -f "$f" ] && grep -hE '^[[:space:]]*deb[[:space:]]' "$f" || true
  done
  for f in /etc/apt/sources.list.d/*.sources; do
    [ -f "$f" ] || continue
    awk 'function flush() { if (types ~ /(^| )deb( |$)/ && enabled != "no")
                              for (i = 1; i <= nu; i++) for (j = 1; j <= ns; j++)
                                print "deb" (key ? " [signed-by=" key "]" : "") " " u[i] " " s[j] " " comps
                            types = ""; comps = ""; key = ""; enabled = ""; nu = 0; ns = 0 }
         /^[[:space:]]*#/ { next }
         /^[[:space:]]*$/ { flush(); next }
         { field = tolower($1); sub(/:$/, "", field); $1 = "" ; sub(/^ /, "")
           if (field == "types") types = $0
           else if (field == "uris") nu = split($0, u, " ")
           else if (field == "suites") ns = split($0, s, " ")
           else if (field == "components") comps = $0
           else if (field == "signed-by") key = $0
           else if (field == "enabled") enabled = tolower($0) }
         END { flush() }' "$f"
  done
}

# Moves the finished <dir>.tmp to <dir>, marked complete, and removes the
# older complete directories of the same kind (<dir> up to its last "-", the
# key), which an older key made and nothing uses any more. A directory that is
# not complete (another run's, still at work) is left alone. Prints <dir>.
publish_cached() {  # publish_cached <dir>
  local dir=$1 old
  touch "$dir.tmp/.complete"
  mv "$dir.tmp" "$dir"
  for old in "${dir%-*}"-*; do
    [ "$old" != "$dir" ] && [ -f "$old/.complete" ] && rm -rf "$old"
  done
  echo "$dir"
}
