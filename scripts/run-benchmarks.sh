#!/bin/sh
# Runs the benchmarks of a build: the pieces first, then the whole daemon.
#
# usage: scripts/run-benchmarks.sh BUILD_DIR
set -eu
build=$1
for piece in "$build"/*_benchmark; do
    [ -x "$piece" ] && "$piece"
done
"$build/halyard-load" "$build/halyardd"
exec "$(dirname "$0")/with-tracefs.sh" "$build/halyard-trace-load" "$build/halyardd"
