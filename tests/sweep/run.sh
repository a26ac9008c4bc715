#!/usr/bin/env bash
# run.sh PROGRAM [PATTERN]: the whole sweep, or the parts whose names match the pattern (as
# --gtest_filter has it), a part a process and as many at once as there are processors (SWEEP_JOBS).
# What a part said stays in build/sweep/<digest of PROGRAM>; parts that passed there are not run
# again, so a sweep that was broken off goes on. Ends with the sum of all that has been tried.
# shellcheck disable=SC2016,SC2317  # part() is called by the shells that xargs starts
set -uo pipefail
program=$1 pattern=${2:-*}
jobs=${SWEEP_JOBS:-$(nproc 2>/dev/null || echo 2)}
logs=build/sweep/$(sha256sum "$program" | cut -c 1-12)
mkdir -p "$logs"
# A build in the meantime would have later parts run another program.
[ -x "$logs/program" ] || cp "$program" "$logs/program"
program=$logs/program
# Trials allocate much and hold little: short stacks and a small quarantine, which still holds what
# several trials free, save a third. A part that fails fails again without these, with its stacks.
export ASAN_OPTIONS=malloc_context_size=1:quarantine_size_mb=1:${ASAN_OPTIONS:-}

# Names of parts, one a line.
parts() {
    "$program" --gtest_list_tests --gtest_filter="$pattern" |
        awk '/^[^ ].*\.$/ { suite = $1 } /^ / { print suite $1 }'
}
passed() { grep -qs '^passed' "$logs/${1//\//.}"; }
part() {
    local log=$logs/${1//\//.} started=$SECONDS
    TREEHFS_SWEEP=all "$program" --gtest_brief=1 --gtest_filter="$1" >"$log.part" 2>&1 || {
        printf '   %s: failed\n' "$1"
        cat "$log.part"
        return 1
    }
    printf 'passed in %d s\n' $((SECONDS - started)) >>"$log.part"
    mv "$log.part" "$log"
    printf '   %s: %s, %d s\n' "$1" "$(grep -m 1 -o '^[0-9]* trials' "$log")" $((SECONDS - started))
}
export -f part passed
export program logs

mapfile -t wanted < <(parts)
[ "${#wanted[@]}" -gt 0 ] || {
    printf 'sweep: no part is called %s\n' "$pattern" >&2
    exit 1
}
left=()
for name in "${wanted[@]}"; do
    passed "$name" || left+=("$name")
done
printf '   %d parts, %d of them to be run\n' "${#wanted[@]}" "${#left[@]}"
status=0
[ "${#left[@]}" -eq 0 ] ||
    printf '%s\0' "${left[@]}" | xargs -0 -n 1 -P "$jobs" bash -c 'part "$0"' || status=1
complete=0 trials=0
for name in "${wanted[@]}"; do
    passed "$name" || continue
    complete=$((complete + 1))
    trials=$((trials + $(grep -m 1 -o '^[0-9]* trials' "$logs/${name//\//.}" | cut -d ' ' -f 1)))
done
printf '   %d of %d parts have passed: %d trials\n' "$complete" "${#wanted[@]}" "$trials"
exit "$status"
