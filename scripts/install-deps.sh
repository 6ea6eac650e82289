#!/bin/sh
# Installs those of the named Debian packages that are missing. Says nothing and
# needs neither root nor a network when all of them are there.
#
# usage: scripts/install-deps.sh PACKAGE...
set -eu

if ! command -v dpkg-query >/dev/null 2>&1; then
    echo "install-deps: this is no Debian system; the build expects what these packages hold:" >&2
    echo "  $*" >&2
    exit 0
fi

installed=$(dpkg-query -W -f '${Package}:${db:Status-Status}\n' "$@" 2>/dev/null || true)
missing=""
for package in "$@"; do
    if ! printf '%s\n' "$installed" | grep -qxF "$package:installed"; then
        missing="$missing $package"
    fi
done
if [ -z "$missing" ]; then
    exit 0
fi

echo "install-deps: installing$missing"
as_root=""
if [ "$(id -u)" -ne 0 ]; then
    if ! command -v sudo >/dev/null 2>&1; then
        echo "install-deps: neither root nor sudo here; as root, run:" >&2
        echo "  apt-get update && apt-get install --no-install-recommends$missing" >&2
        exit 1
    fi
    as_root="sudo"
fi
# A list that cannot be fetched may not matter: the installation decides.
$as_root env DEBIAN_FRONTEND=noninteractive apt-get update -q ||
    echo "install-deps: apt-get update failed; trying with the lists at hand" >&2
# $missing is a list of words.
# shellcheck disable=SC2086
exec $as_root env DEBIAN_FRONTEND=noninteractive \
    apt-get install -q -y --no-install-recommends $missing
