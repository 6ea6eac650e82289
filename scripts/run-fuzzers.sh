#!/bin/sh
# Runs every fuzzer of a build for a while, as many at once as there are
# processors. Corpora grow in BUILD_DIR/corpus; fuzz/corpus/NAME, where it exists,
# seeds the fuzzer NAME_fuzz.
#
# usage: scripts/run-fuzzers.sh BUILD_DIR SECONDS
set -eu
root=$(cd "$(dirname "$0")/.." && pwd)
build=$1
seconds=$2

run_one() {
    name=$(basename "$1" _fuzz)
    corpus="$build/corpus/$name"
    mkdir -p "$corpus"
    seeds="$root/fuzz/corpus/$name"
    [ -d "$seeds" ] || seeds=""
    # $seeds is one word or none.
    # shellcheck disable=SC2086
    if "$1" -max_total_time="$seconds" -timeout=10 -rss_limit_mb=2048 -print_final_stats=1 \
        -artifact_prefix="$corpus-crash-" "$corpus" $seeds >"$corpus.log" 2>&1; then
        runs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$corpus.log")
        echo "fuzz: $name: $runs runs in $seconds s, nothing found"
    else
        echo "fuzz: $name FAILED; the input is beside $corpus.log, which ends:" >&2
        tail -n 40 "$corpus.log" >&2
        return 1
    fi
}

if [ "${3:-}" = --one ]; then
    run_one "$4"
    exit
fi
if ! ls "$build"/*_fuzz >/dev/null 2>&1; then
    echo "fuzz: no fuzzers in $build" >&2
    exit 1
fi
ls "$build"/*_fuzz | xargs -n 1 -P "$(nproc)" "$0" "$build" "$seconds" --one
