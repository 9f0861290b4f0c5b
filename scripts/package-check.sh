#!/usr/bin/env bash
# Builds the Debian package, checks it with lintian, installs it with apt in a
# clean Debian 12 chroot and starts the installed programs there: the report
# on a demo root (scripts/demo-root.sh) and the window on the offscreen
# platform. Not part of scripts/test.sh: it needs root, the network
# (deb.debian.org, for the chroot and the package's dependencies) and several
# minutes. Everything but the build directory is removed at the end.
#   scripts/package-check.sh        (builds into build-deb unless BUILD_DIR says otherwise)
set -euo pipefail
cd "$(dirname "$0")/.."
build=${BUILD_DIR:-build-deb}
mirror=${MIRROR:-http://deb.debian.org}
lock=/tmp/ftpconfig-build.lock

if [ "$(id -u)" -ne 0 ]; then
    echo "$0: run as root (the chroot and the window need it)" >&2
    exit 1
fi
for tool in cpack lintian mmdebstrap dpkg-shlibdeps fakeroot; do
    command -v "$tool" >/dev/null || {
        echo "$0: $tool is missing (apt-get install cmake lintian mmdebstrap dpkg-dev fakeroot)" >&2
        exit 1
    }
done

step() { printf '\n== %s\n' "$*"; }

step "build ($build)"
# The compiler and linker flags of a Debian package build (hardening).
flock "$lock" cmake -S . -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_INSTALL_PREFIX=/usr \
    -DWITH_TESTS=OFF -DWITH_BENCHMARKS=OFF \
    "-DCMAKE_CXX_FLAGS=$(dpkg-buildflags --get CPPFLAGS) $(dpkg-buildflags --get CXXFLAGS)" \
    "-DCMAKE_EXE_LINKER_FLAGS=$(dpkg-buildflags --get LDFLAGS)" >/dev/null
flock "$lock" cmake --build "$build" -j2
rm -f "$build"/ftpconfig_*.deb
# cpack installs the build into its staging tree: a build of its own too.
(cd "$build" && flock "$lock" cpack -G DEB >/dev/null)
debs=("$build"/ftpconfig_*.deb)
deb=$(realpath "${debs[0]}")
echo "$deb"

step "dpkg-deb -I"
dpkg-deb -I "$deb" control
step "dpkg-deb -c"
dpkg-deb -c "$deb"

step "lintian"
# Exits non-zero on an error; warnings are printed and allowed.
lintian "$deb"
echo "lintian: no error"

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
scripts/demo-root.sh "$work/demo" >/dev/null

# Run inside the chroot once the package is installed. The window must still
# be running when timeout ends it (status 124) after having shown itself.
cat >"$work/run-installed.sh" <<'EOF'
set -eu
echo "-- dpkg -L ftpconfig"
dpkg -L ftpconfig | sort
echo "-- dependencies installed"
dpkg-query -W -f '${Package} ${Version}\n' vsftpd pkexec 2>&1 || true
echo "-- libraries"
for program in /usr/bin/ftpconfig*; do
    if ldd "$program" | grep 'not found'; then
        echo "$program: missing libraries" >&2
        exit 1
    fi
done
echo "every program finds its libraries"
echo "-- ftpconfig-report --root /demo"
ftpconfig-report --root /demo
if [ -x /usr/bin/ftpconfig-ctl ]; then
    echo "-- ftpconfig-ctl --root /demo list"
    ftpconfig-ctl --root /demo list
fi
echo "-- QT_QPA_PLATFORM=offscreen timeout 5 ftpconfig --root /demo"
status=0
QT_QPA_PLATFORM=offscreen QT_LOGGING_RULES='ftpconfig.startup.debug=true' XDG_CONFIG_HOME=/tmp/config \
    timeout 5 ftpconfig --root /demo >/tmp/window.log 2>&1 || status=$?
cat /tmp/window.log
echo "ftpconfig: timeout's status $status"
if [ "$status" -ne 124 ] || ! grep -q 'main window shown' /tmp/window.log; then
    echo "ftpconfig did not keep its window open for 5 seconds" >&2
    exit 1
fi
echo "ftpconfig showed its window and ran until stopped"
EOF

step "apt install ./$(basename "$deb") in a clean Debian 12 (mmdebstrap)"
# The hooks' "$1" is the chroot, given by mmdebstrap to the hook's shell.
# mmdebstrap's apt leaves recommended packages out; apt on an installed
# system takes them, so the recommended vsftpd and pkexec are installed too.
# shellcheck disable=SC2016
mmdebstrap --variant=apt \
    --customize-hook="copy-in $deb /root" \
    --customize-hook="copy-in $work/demo /" \
    --customize-hook="copy-in $work/run-installed.sh /root" \
    --customize-hook='chroot "$1" sh -c "cd /root && DEBIAN_FRONTEND=noninteractive apt install -y -o APT::Install-Recommends=true ./ftpconfig_*.deb"' \
    --customize-hook='chroot "$1" sh /root/run-installed.sh' \
    bookworm "$work/chroot" "deb $mirror/debian bookworm main" "deb $mirror/debian bookworm-updates main" \
    "deb $mirror/debian-security bookworm-security main"

step "package check passed"
