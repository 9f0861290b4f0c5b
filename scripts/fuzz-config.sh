#!/usr/bin/env bash
# Fuzzes the configuration parser and printer with libFuzzer for a bounded time.
#   scripts/fuzz-config.sh [seconds] [--update-corpus]
# Starts from the committed corpus in tests/data/config-corpus; with
# --update-corpus a small sample of the inputs that add coverage is added to
# it (the unit tests replay every file of it). A violation leaves its input in
# build-fuzz/crash-*: add it to the corpus under a telling name once fixed.
set -euo pipefail
cd "$(dirname "$0")/.."
seconds=${1:-60}
update=${2:-}
out=build-fuzz
scripts/build.sh "$out" -DCMAKE_CXX_COMPILER=clang++ -DWITH_FUZZER=ON -DCMAKE_BUILD_TYPE=RelWithDebInfo
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
cp tests/data/config-corpus/* "$work/"
"$out/tests/fuzz/fuzzconfig" -max_total_time="$seconds" -max_len=4096 -timeout=10 -rss_limit_mb=2048 \
    -artifact_prefix="$out/" "$work" 2>&1 | tail -n 5
if [ "$update" = "--update-corpus" ]; then
    fresh=$(mktemp -d)
    "$out/tests/fuzz/fuzzconfig" -merge=1 "$fresh" tests/data/config-corpus "$work" 2>&1 | tail -n 1
    # Keep the committed corpus small: at most 16 new inputs, the smallest.
    ls -S -r "$fresh" | head -n 16 | while read -r f; do cp -n "$fresh/$f" tests/data/config-corpus/; done
    rm -rf "$fresh"
fi
echo "fuzz-config: no violation in ${seconds}s"
