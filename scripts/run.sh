#!/usr/bin/env bash
# Installs what is missing, builds and starts the configurator.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/install-deps.sh run
scripts/build.sh build -DCMAKE_BUILD_TYPE=RelWithDebInfo
exec build/ftpconfig "$@"
