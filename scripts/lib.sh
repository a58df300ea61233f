# What the scripts share; sourced by them. Goes to the project's folder and stays there.
# shellcheck shell=bash
set -euo pipefail
unset CDPATH

scripts=$(dirname -- "$(readlink -f -- "${BASH_SOURCE[0]}")")
project=$(dirname -- "$scripts")
cd -- "$project"

say() { printf '== %s\n' "$*"; }

die() {
    printf '%s: %s\n' "${0##*/}" "$*" >&2
    exit 1
}

# Prints the comment at the top of the calling script.
usage() { sed -n '2,/^[^#]/{s/^# \{0,1\}//p}' "$0"; }

jobs=${CMAKE_BUILD_PARALLEL_LEVEL:-$(nproc)}
export CMAKE_BUILD_PARALLEL_LEVEL=$jobs
export CTEST_PARALLEL_LEVEL=${CTEST_PARALLEL_LEVEL:-$jobs}
if command -v ccache >/dev/null; then
    export CMAKE_C_COMPILER_LAUNCHER=${CMAKE_C_COMPILER_LAUNCHER-ccache}
    export CMAKE_CXX_COMPILER_LAUNCHER=${CMAKE_CXX_COMPILER_LAUNCHER-ccache}
fi

install_packages() { "$scripts/install-packages" "$@"; }

# Whether the cache in build/PRESET was made for this very folder: a copied or moved checkout brings an old one along.
belongs_here() { grep -qxF "CMAKE_HOME_DIRECTORY:INTERNAL=$project" "build/$1/CMakeCache.txt"; }

is_configured() { [[ -f build/$1/build.ninja ]] && belongs_here "$1"; }

# configure PRESET [CMAKE ARGUMENT]...
configure() {
    local preset=$1 fresh=()
    shift
    if [[ -f build/$preset/CMakeCache.txt ]] && ! belongs_here "$preset"; then
        say "build/$preset belongs to another folder: configuring it anew"
        fresh=(--fresh)
    fi
    local output
    if ! output=$(cmake --preset "$preset" "${fresh[@]}" "$@"); then
        printf '%s\n' "$output"
        die "the $preset preset could not be configured"
    fi
}

# The command prefix under which programs with the thread sanitizer start: it cannot cope with more than 28 random bits.
thread_sanitizer_prefix() {
    local bits=0
    [[ -r /proc/sys/vm/mmap_rnd_bits ]] && bits=$(</proc/sys/vm/mmap_rnd_bits)
    if ((bits > 28)); then
        setarch -R true 2>/dev/null ||
            die "the thread sanitizer needs vm.mmap_rnd_bits of at most 28 (here $bits) or a working \"setarch -R\""
        echo "setarch -R"
    fi
}

# Every C++ file of the project, each ended by a NUL.
source_files() {
    find . \( -path ./build -o -path ./out -o -path ./.git -o -path ./.cache \) -prune -o \
        -type f \( -name '*.cpp' -o -name '*.h' \) -printf '%P\0' | sort -z
}
