#!/bin/sh
# Runs a Windows test program under wine with the build tree's own prefix:
# a 64-bit program under wine64 in a win64 prefix, a 32-bit one under 32-bit
# wine in a win32 prefix. The first run creates the prefix; later runs reuse it.
# Usage: wine-run.sh win32|win64 PREFIX PROGRAM [ARGS...]
arch=$1 prefix=$2
shift 2
case $arch in
  win64) loader=/usr/lib/wine/wine64 ;;
  win32)
    loader=/usr/lib/wine/wine
    if ! sh "$(dirname "$0")/../scripts/probe-i386.sh" >/dev/null; then
      echo "wine-run: this machine does not run 32-bit x86 code (scripts/probe-i386.sh): cannot run $1" >&2
      exit 1
    fi
    ;;
  *) echo "usage: wine-run.sh win32|win64 PREFIX PROGRAM [ARGS...]" >&2; exit 2 ;;
esac
export WINEPREFIX="$prefix" WINEARCH="$arch" WINEDEBUG=-all WINEDLLOVERRIDES="mscoree,mshtml="
if [ ! -f "$prefix/system.reg" ]; then
  mkdir -p "$prefix"
  "$loader" wineboot --init >/dev/null 2>&1
  /usr/lib/wine/wineserver -w 2>/dev/null || true
fi
exec "$loader" "$@"
