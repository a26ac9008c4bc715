#!/usr/bin/env bash
# memcheck.sh PROGRAM: one program of tests under valgrind; says how long it took, and what was
# found only then. Left out is what repeats under another name: the digests (the model's calls
# again, many more of them). VALGRIND_OPTS=--track-origins=yes says where undefined bytes began,
# and takes twice as long.
set -uo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/../.." || exit 1
name=$(basename "$1")
log=build/memcheck-$name.log
export TREEHFS_SEED=1 TREEHFS_MODEL_CALLS=${TREEHFS_MODEL_CALLS:-6000}

started=$SECONDS status=0
valgrind --quiet --error-exitcode=99 --leak-check=full --errors-for-leak-kinds=definite \
    --suppressions=tests/quality/valgrind.supp \
    "$1" --gtest_brief=1 --gtest_filter=-ModelDigest.* </dev/null >"$log" 2>&1 || status=$?
tests=$(sed -n 's/^\[==========\] \([0-9]*\) tests.*/\1/p' "$log")
printf '   %-14s %4s tests, %4d s, ' "$name" "${tests:-no}" $((SECONDS - started))
if [ "$status" -eq 0 ] && [ "${tests:-0}" -gt 0 ]; then
    printf 'nothing found\n'
else
    printf 'status %d: %s\n' "$status" "$log"
    cat "$log"
    exit 1
fi
