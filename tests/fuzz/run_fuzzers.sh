#!/bin/sh
# Builds every fuzz target with clang and libFuzzer (address and undefined
# sanitizers) in its own build folder and runs each one briefly on a copy of its
# seed corpus, so that new inputs never land in the source tree.
#   run_fuzzers.sh SOURCE_DIR BUILD_DIR [SECONDS_PER_TARGET]
set -eu
src=$1
out=$2
seconds=${3:-5}
flags="-fsanitize=fuzzer-no-link,address,undefined -fno-sanitize-recover=undefined"

if [ ! -f "$out/CMakeCache.txt" ]; then
    cmake -S "$src" -B "$out" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo \
        -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ \
        -DCMAKE_C_FLAGS="$flags" -DCMAKE_CXX_FLAGS="$flags" \
        -DCMAKE_EXE_LINKER_FLAGS="-fsanitize=address,undefined" \
        -DTAVO_FUZZ=ON -DTAVO_BUILD_BENCH=OFF >"$out.configure.log" 2>&1 || {
        cat "$out.configure.log"
        exit 1
    }
fi

targets=""
for f in "$src"/tests/fuzz/*Fuzzer.cpp; do
    name=$(basename "$f" .cpp)
    targets="$targets fuzz_${name%Fuzzer}"
done
# shellcheck disable=SC2086
cmake --build "$out" --target $targets -j2

status=0
for t in $targets; do
    name=${t#fuzz_}
    work="$out/corpus-run/$name"
    rm -rf "$work"
    mkdir -p "$work"
    if [ -d "$src/tests/fuzz/corpus/$name" ]; then
        cp -R "$src/tests/fuzz/corpus/$name/." "$work/"
    fi
    echo "== $t: ${seconds}s"
    # A fixed seed makes every run explore the same inputs in the same order, so a
    # run of this length covers a prefix of what a longer run with the seed covered.
    if ! (cd "$out" && "$out/tests/fuzz/$t" -seed=1 -max_total_time="$seconds" \
        -print_final_stats=1 -detect_leaks=1 "$work"); then
        echo "== $t FAILED (reproducer in $out)"
        status=1
    fi
done
exit $status
