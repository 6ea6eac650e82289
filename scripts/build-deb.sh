#!/bin/sh
# Builds the Debian packages out of a copy of the tree, so that nothing is left in it.
#
# usage: scripts/build-deb.sh FOLDER [dpkg-buildpackage option...]
#
# The packages are in FOLDER then. What is not committed yet is packaged as well. The same
# files give the same packages, whatever FOLDER, umask, language and time zone are.
set -eu
cd "$(dirname "$0")/.."
mkdir -p "$1"
folder=$(cd "$1" && pwd)
shift

files=$(mktemp)
trap 'rm -f "$files"' EXIT
if git rev-parse --git-dir >/dev/null 2>&1; then
    : "${SOURCE_DATE_EPOCH:=$(git log -1 --format=%ct)}"
    # Without those that are deleted and not committed yet.
    git ls-files -z --cached --others --exclude-standard | xargs -0 ls -d --zero 2>/dev/null >"$files" || true
else
    : "${SOURCE_DATE_EPOCH:=$(dpkg-parsechangelog --show-field Timestamp)}"
    find . -path './build*' -prune -o '(' -type f -o -type l ')' -print0 >"$files"
fi
export SOURCE_DATE_EPOCH

rm -rf "$folder/halyard"
mkdir "$folder/halyard"
# Times and modes are the checkout's, and would go into the packages.
tar --create --null --verbatim-files-from --files-from="$files" --mtime="@$SOURCE_DATE_EPOCH" \
    --mode=u=rwX,go=rX | tar --extract --preserve-permissions --directory="$folder/halyard"

# debhelper gives its children another home, in which the compiler cache would be empty.
if [ -z "${CCACHE_DIR:-}" ] && command -v ccache >/dev/null 2>&1; then
    CCACHE_DIR=$(ccache --get-config cache_dir)
    export CCACHE_DIR
fi
cd "$folder/halyard"
dpkg-buildpackage --unsigned-source --unsigned-changes --build=binary "$@"
