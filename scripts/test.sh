#!/usr/bin/env bash
# Installs what is missing, builds, and runs every test: the format check, a
# bounded fuzz run of the configuration parser, the unit tests under
# AddressSanitizer/UndefinedBehaviorSanitizer, then the unit tests of the
# ordinary build (whose summary closes the output). Must run as root.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/install-deps.sh test
scripts/check-format.sh
scripts/fuzz-config.sh "${FUZZ_SECONDS:-30}"

scripts/build.sh build-asan -DCMAKE_BUILD_TYPE=Debug -DWITH_ASAN=ON -DWITH_TESTS=ON -DWITH_BENCHMARKS=OFF
(cd build-asan && ASAN_OPTIONS=detect_leaks=1 UBSAN_OPTIONS=print_stacktrace=1 \
    LSAN_OPTIONS="suppressions=$PWD/../tests/lsan.supp:fast_unwind_on_malloc=0" ctest -j2 --output-on-failure)

scripts/build.sh build -DCMAKE_BUILD_TYPE=RelWithDebInfo -DWITH_TESTS=ON -DWITH_BENCHMARKS=ON
(cd build && ctest -j2 --output-on-failure)
