#!/usr/bin/env bash
# Size of the tests against the rest: cloc code lines (no blanks, no comments)
# of the tracked sources under tests/, java/test* and fuzz/, against every other
# tracked source file, the launcher and the scripts included.
#   bash scripts/count-lines.sh   ->   tests 3858 code 9803 ratio 0.394
set -euo pipefail
cd "$(dirname "$0")/.."
command -v cloc >/dev/null || { echo "cloc is missing: apt-get install cloc" >&2; exit 1; }

files=$(git ls-files | grep -E '\.(cpp|cc|h|hpp|java|py|sh)$|^halvenor$|^\.ci/run$')
count() { xargs cloc --quiet --csv --force-lang="Bourne Shell",halvenor | awk -F, '$2 == "SUM" {print $5}'; }
tests=$(grep -E '^(tests/|fuzz/|java/test)' <<<"$files" | count)
code=$(grep -vE '^(tests/|fuzz/|java/test)' <<<"$files" | count)
echo "tests $tests code $code ratio $(awk -v t="$tests" -v c="$code" 'BEGIN {printf "%.3f", t / c}')"
