#!/usr/bin/env bash
# Installs what is missing (vsftpd included), builds and starts the
# configurator. Until the main window exists, it prints what the program
# would show for this machine: who can log in to vsftpd, by the program's
# verdict and by the forecast of the server itself (ftpconfig-report).
# FTPCONFIG_ROOT selects another root than "/".
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/install-deps.sh run
scripts/build.sh build -DCMAKE_BUILD_TYPE=RelWithDebInfo
exec build/ftpconfig-report "$@"
