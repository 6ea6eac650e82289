#!/bin/sh
# Runs a command where tracefs is mounted. What the machine mounts is used as it
# is; where nobody has mounted it, and we may, the command gets a mount namespace
# of its own with it, which ends with the command.
#
# usage: scripts/with-tracefs.sh COMMAND [ARGUMENT...]
set -eu
tracefs=/sys/kernel/tracing
mount_it='mount -t tracefs nodev "$0" && exec "$@"'

if [ -e "$tracefs/uprobe_events" ]; then
    exec "$@"
fi
# Tried first, so that a failure of the command is not taken for one of the mount.
if unshare --mount sh -c "$mount_it" "$tracefs" true 2>/dev/null; then
    exec unshare --mount sh -c "$mount_it" "$tracefs" "$@"
fi
echo "with-tracefs: no tracefs at $tracefs and no right to mount it: kernel traces are not tested" >&2
exec "$@"
