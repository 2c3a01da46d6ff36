#!/usr/bin/env bash
# Cross-builds the logging library, a module that logs through KalbLogClient and their test
# program with MinGW-w64 into BUILD_DIR, and runs the program under Wine in a prefix of its own
# (BUILD_DIR/wine, made on the first run).
# Usage: tests/windows/windows.sh BUILD_DIR
set -euo pipefail
root=$(cd "$(dirname "$0")/../.." && pwd)
build=$(mkdir -p "$1" && cd "$1" && pwd)

cmake -S "$root/tests/windows" -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=Debug \
    -DCMAKE_TOOLCHAIN_FILE="$root/tests/windows/mingw-w64-x86_64.cmake" >/dev/null
cmake --build "$build" -- -j"$(nproc)"

# Debian's wine64 package puts its loader outside PATH (and a folder of the same name elsewhere).
wine=$(command -v wine64 || true)
if [ -z "$wine" ]; then
    for path in $(dpkg -L wine64); do
        if [ "${path##*/}" = wine64 ] && [ -f "$path" ] && [ -x "$path" ]; then
            wine=$path
            break
        fi
    done
fi
if [ -z "$wine" ]; then
    echo "no wine64 loader: install the wine64 package" >&2
    exit 1
fi
export WINEPREFIX=$build/wine WINEDEBUG=-all
# No prompt to install Mono or Gecko into a new prefix, no display needed.
export WINEDLLOVERRIDES="mscoree,mshtml=" DISPLAY=
if [ ! -f "$WINEPREFIX/system.reg" ]; then
    echo "making the Wine prefix $WINEPREFIX"
    if ! "$wine" wineboot --init </dev/null >"$build/wineboot.log" 2>&1; then
        echo "making the Wine prefix failed, see $build/wineboot.log" >&2
        exit 1
    fi
fi
"$wine" "$build/bin/KalbLogClientWindowsTest.exe" </dev/null
