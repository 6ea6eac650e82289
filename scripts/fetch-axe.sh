#!/bin/sh
# Puts axe-core, at the version that tests/report/package-lock.json names, into DIR.
# Without npm or a network nothing is there, and the tests say that they do without.
#
# usage: scripts/fetch-axe.sh DIR
set -eu
cd "$(dirname "$0")/.."

if ! command -v npm >/dev/null 2>&1; then
    echo "fetch-axe: no npm here; the report's page is tested without axe-core" >&2
    exit 0
fi
mkdir -p "$1"
if cmp -s tests/report/package-lock.json "$1/package-lock.json" && [ -d "$1/node_modules" ]; then
    exit 0
fi
cp tests/report/package.json tests/report/package-lock.json "$1"
npm ci --prefix "$1" --ignore-scripts --no-audit --no-fund --loglevel=error ||
    { rm -rf "$1"; echo "fetch-axe: npm failed; the report's page is tested without axe-core" >&2; }
