#!/usr/bin/env bash
# Fails when a C++ file differs from what .clang-format makes of it.
set -euo pipefail
cd "$(dirname "$0")/.."
bad=0
while IFS= read -r f; do
    if ! clang-format --dry-run -Werror "$f" >/dev/null 2>&1; then
        echo "not formatted: $f (run: clang-format -i $f)"
        bad=1
    fi
done < <(git ls-files -co --exclude-standard '*.cpp' '*.h')
exit $bad
