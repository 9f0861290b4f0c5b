#!/usr/bin/env bash
# Pictures of the real window under Xvfb, on a fresh demo root
# (scripts/demo-root.sh), into screenshots/: the window, its filter menu,
# the Login check dock, a refusal box, the PAM problem dialog, and each of
# the engine's other dialogs. Builds into build/ unless BUILD_DIR says
# otherwise.
#   scripts/screenshots.sh
set -euo pipefail
cd "$(dirname "$0")/.."
build=${BUILD_DIR:-build}
command -v xvfb-run >/dev/null || scripts/install-deps.sh test
# Only the picture program: builds take turns (see scripts/build.sh).
lock=/tmp/ftpconfig-build.lock
flock "$lock" cmake -S . -B "$build" -G Ninja -DWITH_TESTS=ON >/dev/null
flock "$lock" cmake --build "$build" -j2 --target windowshots >/dev/null

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
scripts/demo-root.sh "$work/root" >/dev/null
mkdir -p screenshots
rm -f screenshots/*.png

# A settings directory of its own: the window opens as on a first run and
# the administrator's stored layout stays untouched.
export XDG_CONFIG_HOME="$work/config" FTPCONFIG_ROOT="$work/root"
shoot() {
    xvfb-run -a -s "-screen 0 1280x1024x24" "$@"
}
shoot "$build/tests/windowshots" screenshots mallory mallory
ls screenshots/*.png
