#!/bin/sh
# Checks that every C and C++ file of ours is as clang-format 14 writes it (other
# versions differ in details); --fix rewrites them.
set -eu
cd "$(dirname "$0")/.."

formatter=clang-format-14
if ! command -v "$formatter" >/dev/null 2>&1; then
    formatter=clang-format
fi
mode="--dry-run -Werror"
if [ "${1:-}" = --fix ]; then
    mode="-i"
fi

# Without git (a release archive, or a checkout that belongs to somebody else)
# every file counts.
sources() {
    git ls-files -z --cached --others --exclude-standard -- '*.h' '*.cpp' '*.c' 2>/dev/null ||
        find . -name 'build*' -prune -o \( -name '*.h' -o -name '*.cpp' -o -name '*.c' \) -print0
}
# $mode is a list of words.
# shellcheck disable=SC2086
sources | xargs -0 -r -n 16 -P "$(nproc)" "$formatter" --style=file $mode
