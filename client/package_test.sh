#!/usr/bin/env bash
# Installs the client library into a folder under the build folder and builds the examples against it, through pkg-config
# and through CMake. Checks what the library shows to the outside.
#
# usage: package_test.sh BUILD CMAKE PKG_CONFIG CC CXX
set -euo pipefail
build=$1 cmake=$2 pkg_config=$3 cc=$4 cxx=$5
here=$(dirname -- "$(readlink -f -- "$0")")
work=$build/client/package_test
tree=$work/tree

fail() {
    echo "package_test: $*" >&2
    exit 1
}

# Without a service the examples say so and exit with 1.
run() {
    local status=0 text
    text=$(VELA_REPORTING_ADDRESS="unix:path=$work/nobody" XDG_RUNTIME_DIR="$work" LD_LIBRARY_PATH="$libraries" \
        "$1" 2>&1) || status=$?
    [[ $status == 1 && $text == *"no service"* ]] || fail "$1 exited with $status and said: $text"
}

rm -rf "$work"
mkdir -p "$work"
DESTDIR=$tree "$cmake" --install "$build" --component client >"$work/install.log"
pc=$(find "$tree" -name velareporting.pc)
[[ -n $pc ]] || fail "no velareporting.pc was installed"
libraries=$(dirname -- "$(dirname -- "$pc")")

symbols=$(nm -D --defined-only "$libraries/libvelareporting.so" | awk '{print $3}' | grep -v '^VELAREPORTING_0$' | sort)
[[ -n $symbols ]] || fail "the library shows nothing"
strangers=$(grep -v '^VelaReporting[A-Za-z]*@@VELAREPORTING_0$' <<<"$symbols" || true)
[[ -z $strangers ]] || fail "the library shows more than its functions: $strangers"
declared=$(grep -ohE 'VelaReporting[A-Za-z]+[(;]' "$here/include/vela/channels.h" "$here/include/vela/reporting.h" \
    "$here/include/vela/trace.h" | tr -d '(;' | sort -u)
while IFS= read -r symbol; do
    grep -qx "${symbol%%@@*}" <<<"$declared" || fail "$symbol is not declared in a header"
done <<<"$symbols"
readelf -d "$libraries/libvelareporting.so" | grep -q 'SONAME.*\[libvelareporting\.so\.0\]' || fail "wrong SONAME"

export PKG_CONFIG_PATH=$libraries/pkgconfig
unset PKG_CONFIG_SYSROOT_DIR
read -ra flags <<<"$("$pkg_config" --cflags --libs velareporting)"
"$cc" -std=c99 -Wall -Wextra -Wpedantic -Werror -o "$work/example_c" "$here/example.c" "${flags[@]}"
"$cxx" -std=c++20 -Wall -Wextra -Wpedantic -Werror -o "$work/example_cpp" "$here/example.cpp" "${flags[@]}"
run "$work/example_c"
"$cc" -std=c99 -Wall -Wextra -Wpedantic -Werror -o "$work/channels_example" "$here/channels_example.c" "${flags[@]}"
VELA_RUNTIME=$work LD_LIBRARY_PATH=$libraries "$work/channels_example" 1 >"$work/channels.log"
[[ -n $(find "$work/hwstats" -name '*.channels') ]] || fail "channels_example published nothing"

"$cc" -std=c99 -Wall -Wextra -Wpedantic -Werror -o "$work/trace_example" "$here/trace_example.c" "${flags[@]}"
traced=$(VELA_RUNTIME=$work LD_LIBRARY_PATH=$libraries "$work/trace_example" 1)
[[ $traced == "1 intervals emitted" ]] || fail "trace_example said: $traced"
# A program that is not made for any place has a copy of the library's data.
"$cc" -std=c99 -fno-pie -no-pie -o "$work/trace_example_fixed" "$here/trace_example.c" "${flags[@]}"
VELA_RUNTIME=$work LD_LIBRARY_PATH=$libraries "$work/trace_example_fixed" 1 >"$work/trace.log"

"$cmake" -S "$here/package_test" -B "$work/cmake" -DCMAKE_C_COMPILER="$cc" -DCMAKE_CXX_COMPILER="$cxx" \
    -DCMAKE_PREFIX_PATH="$(dirname -- "$libraries")" -DCMAKE_FIND_ROOT_PATH="$tree" >"$work/configure.log"
"$cmake" --build "$work/cmake" >"$work/build.log"
run "$work/cmake/example_c"
echo "package_test: pkg-config and CMake both work"
