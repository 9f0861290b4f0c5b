#!/usr/bin/env bash
# Installs the Debian 12 packages that are missing for building and running
# (run) or also for testing (test). Must run as root.
#   scripts/install-deps.sh run|test
set -euo pipefail
kind=${1:-run}
run_packages=(cmake ninja-build g++ pkg-config qtbase5-dev qtbase5-dev-tools libdb5.3++-dev vsftpd librsvg2-bin libpam0g-dev)
test_packages=(clang libclang-rt-14-dev clang-format db5.3-util pamtester python3 dbus curl util-linux desktop-file-utils libxml2-utils xvfb xauth)
packages=("${run_packages[@]}")
[ "$kind" = test ] && packages+=("${test_packages[@]}")
missing=()
for p in "${packages[@]}"; do
    dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed' || missing+=("$p")
done
if [ ${#missing[@]} -gt 0 ]; then
    echo "Installing: ${missing[*]}"
    export DEBIAN_FRONTEND=noninteractive
    apt-get update -qq
    apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
fi
