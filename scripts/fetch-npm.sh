#!/bin/sh
# Puts what only tests use from npm into DIR, at the versions that SOURCE/package-lock.json
# names. Without npm or a network nothing is there, and the tests say that they do without.
#
# usage: scripts/fetch-npm.sh SOURCE DIR
set -eu
cd "$(dirname "$0")/.."

if ! command -v npm >/dev/null 2>&1; then
    echo "fetch-npm: no npm here; tests do without what $1 names" >&2
    exit 0
fi
mkdir -p "$2"
if cmp -s "$1/package-lock.json" "$2/package-lock.json" && [ -d "$2/node_modules" ]; then
    exit 0
fi
cp "$1/package.json" "$1/package-lock.json" "$2"
npm ci --prefix "$2" --ignore-scripts --no-audit --no-fund --loglevel=error ||
    { rm -rf "$2"; echo "fetch-npm: npm failed; tests do without what $1 names" >&2; }
