#!/usr/bin/env bash
# Configures and builds into a build directory. Builds on one machine take
# turns (a lock file): two at once would overload its two cores.
#   scripts/build.sh [build-dir] [extra cmake options...]
set -euo pipefail
cd "$(dirname "$0")/.."
dir=${1:-build}
shift || true
lock=/tmp/ftpconfig-build.lock
flock "$lock" cmake -S . -B "$dir" -G Ninja "$@" >/dev/null
flock "$lock" cmake --build "$dir" -j2
