#!/bin/sh
# Puts the OpenTelemetry project's decoder, at the version that tests/otlp/package-lock.json
# names, into DIR. Without npm or a network nothing is there, and the tests say that they do
# without.
#
# usage: scripts/fetch-otlp.sh DIR
set -eu
cd "$(dirname "$0")/.."

if ! command -v npm >/dev/null 2>&1; then
    echo "fetch-otlp: no npm here; requests are tested without another decoder" >&2
    exit 0
fi
mkdir -p "$1"
if cmp -s tests/otlp/package-lock.json "$1/package-lock.json" && [ -d "$1/node_modules" ]; then
    exit 0
fi
cp tests/otlp/package.json tests/otlp/package-lock.json "$1"
npm ci --prefix "$1" --ignore-scripts --no-audit --no-fund --loglevel=error ||
    { rm -rf "$1"; echo "fetch-otlp: npm failed; requests are tested without another decoder" >&2; }
