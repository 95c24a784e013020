#!/bin/sh
# Prints the test ratio: lines of test code and test data against lines of
# product code, both counted as non-blank, non-comment lines.
#
#   tests:   every git-tracked text file under tests/ except .md, .png and .bin
#            (sources, scripts, CMake files, tables of cases, transcripts)
#   product: the .c/.cc/.cpp/.h/.hpp files under src/, platform/ and sim/
#
# A comment line is one whose first non-blank characters are // or, outside C
# and C++ files, #. In C and C++ files a # line is a preprocessor directive and
# counts as code on both sides. Files are read as they are in the working tree.
#
# Usage: tools/test-ratio.sh [REPO]   (default: the repository holding this script)
set -eu

repo=${1:-$(cd "$(dirname "$0")/.." && pwd)}
cd "$repo"

count() {
    # Reads NUL-separated file names on stdin; prints the number of counted lines.
    xargs -0 -r awk '
        FNR == 1 { cfam = (FILENAME ~ /\.(c|cc|cpp|cxx|h|hh|hpp)$/) }
        {
            l = $0
            sub(/^[ \t\r]+/, "", l)
            if (l == "") next
            if (substr(l, 1, 2) == "//") next
            if (!cfam && substr(l, 1, 1) == "#") next
            n++
        }
        END { print n + 0 }' | awk '{ s += $1 } END { print s + 0 }'
}

text_files() {
    # Keeps the tracked files that exist and hold text (grep -I skips binary ones).
    while IFS= read -r f; do
        [ -f "$f" ] && grep -Iq . "$f" && printf '%s\0' "$f"
    done
    return 0
}

tests=$(git ls-files -- tests | grep -vE '\.(md|png|bin)$' | text_files | count)
code=$(git ls-files -- src platform sim | grep -E '\.(c|cc|cpp|h|hpp)$' | text_files | count)

awk -v t="$tests" -v c="$code" 'BEGIN {
    printf "tests %d / code %d = %.2f\n", t, c, (c > 0 ? t / c : 0)
}'
