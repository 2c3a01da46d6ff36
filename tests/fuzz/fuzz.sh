#!/usr/bin/env bash
# Builds the fuzz targets into BUILD_DIR and runs each for SECONDS, starting from its committed
# seeds (corpus/NAME) and the corpus it grew before (BUILD_DIR/corpus/NAME). Prints executions
# and corpus size per target; an input that fails is kept in BUILD_DIR/artifacts.
# Usage: tests/fuzz/fuzz.sh BUILD_DIR SECONDS
set -euo pipefail
root=$(cd "$(dirname "$0")/../.." && pwd)
build=$1
seconds=$2

cmake -S "$root/tests/fuzz" -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=Debug \
    -DCMAKE_CXX_COMPILER=clang++ -DCMAKE_CXX_FLAGS=-O1 >/dev/null
cmake --build "$build" -- -j"$(nproc)"

mkdir -p "$build/artifacts"
failed=()
printf '%-22s %12s %8s %8s\n' target executions seeds corpus
for fuzzer in "$build"/fuzzers/*Fuzzer; do
    name=$(basename "$fuzzer")
    seeds=$root/tests/fuzz/corpus/$name
    corpus=$build/corpus/$name
    log=$build/$name.log
    mkdir -p "$corpus"
    if ! "$fuzzer" -max_total_time="$seconds" -timeout=10 -print_final_stats=1 \
        -artifact_prefix="$build/artifacts/$name-" "$corpus" "$seeds" >"$log" 2>&1; then
        failed+=("$name")
        tail -n 40 "$log" >&2
    fi
    executions=$(sed -n 's/^stat::number_of_executed_units: *//p' "$log" | tail -n 1)
    printf '%-22s %12s %8s %8s\n' "$name" "${executions:-?}" "$(ls "$seeds" | wc -l)" \
        "$(ls "$corpus" | wc -l)"
done
if [ ${#failed[@]} -gt 0 ]; then
    echo "failed: ${failed[*]} (inputs in $build/artifacts)" >&2
    exit 1
fi
