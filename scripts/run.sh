#!/usr/bin/env bash
# Installs what is missing (vsftpd included), builds the configurator and
# opens its window on this machine's configuration. Without a display it
# prints the report instead: who can log in to vsftpd, by the program's
# verdict and by the forecast of the server itself. FTPCONFIG_ROOT=DIR
# opens DIR as "/" instead (scripts/demo-root.sh makes one to try).
# Arguments go to the program; BUILD_DIR changes the build directory (build).
set -euo pipefail
cd "$(dirname "$0")/.."
build=${BUILD_DIR:-build}
scripts/install-deps.sh run
# Only the two programs; builds take turns (see scripts/build.sh).
lock=/tmp/ftpconfig-build.lock
flock "$lock" cmake -S . -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
flock "$lock" cmake --build "$build" -j2 --target ftpconfig ftpconfig-report
if [ -z "${DISPLAY:-}" ] && [ -z "${WAYLAND_DISPLAY:-}" ]; then
    echo "No display (neither DISPLAY nor WAYLAND_DISPLAY is set): printing the report instead of opening the window." >&2
    exec "$build"/report/ftpconfig-report "$@"
fi
exec "$build"/app/ftpconfig "$@"
