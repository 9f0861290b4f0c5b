#!/usr/bin/env bash
# Runs a command in a private mount namespace where /etc is a copy of the
# machine's /etc: what the command writes there never reaches the machine.
#   scripts/with-private-etc.sh command [arguments...]
set -euo pipefail
[ $# -gt 0 ] || { echo "usage: $0 command [arguments...]" >&2; exit 2; }
exec unshare -m --propagation private bash -c '
    set -euo pipefail
    copy=$(mktemp -d /tmp/ftpconfig-etc-XXXXXX)
    trap "umount /etc 2>/dev/null || true; rm -rf \"$copy\"" EXIT
    cp -a /etc/. "$copy/"
    mount --bind "$copy" /etc
    FTPCONFIG_PRIVATE_ETC=1 "$@"
' with-private-etc "$@"
