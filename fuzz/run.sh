#!/usr/bin/env bash
# run.sh BUILD_FOLDER SECONDS [TARGET...]: fuzzes each target for a while, from the seeds, the
# corpus and what earlier runs found worth keeping, and says what came of it. The canary goes first:
# it must fail.
set -euo pipefail
build=$(cd "$1" && pwd)
seconds=$2
shift 2
here=$(cd "$(dirname "${BASH_SOURCE[0]}")" && pwd)
work=$build/../fuzz-found
mkdir -p "$work/seeds"
targets=("$@")
[ ${#targets[@]} -gt 0 ] || targets=(node finder script journal open ops image)
"$build/fuzz_seeds" "$work/seeds"

# Longest input worth trying, by target: the longest seeds and a little more.
most_bytes() {
    case $1 in
        node) echo 4200 ;;
        finder | script) echo 9000 ;;
        journal) echo 33000 ;;
        *) echo 140000 ;;
    esac
}

run_target() {
    mkdir -p "$work/$1"
    "$build/fuzz_$1" -max_total_time="$seconds" -timeout=20 -rss_limit_mb=2048 \
        -max_len="$(most_bytes "$1")" -print_final_stats=1 -artifact_prefix="$work/$1-" \
        "$work/$1" "$work/seeds/$1" "$here/corpus/$1" >"$work/$1.log" 2>&1
}

runs_of() { sed -n 's/^stat::number_of_executed_units: *//p' "$work/$1.log"; }

if "$build/fuzz_canary" -max_total_time=60 -artifact_prefix="$work/canary-" \
    "$here/corpus/canary" >"$work/canary.log" 2>&1; then
    echo "fuzz: the canary lived: failures would not be seen" >&2
    exit 1
fi
grep -q 'does not hold' "$work/canary.log"
echo "canary: failed, as it must"

status=0
for target in "${targets[@]}"; do
    if [ ! -x "$build/fuzz_$target" ]; then
        echo "fuzz: there is no target '$target'" >&2
        exit 16
    fi
    if run_target "$target"; then
        echo "$target: $(runs_of "$target") runs in $seconds s, nothing found"
    else
        status=1
        echo "$target: FAILED, see $work/$target.log; the input lies beside it"
        tail -n 25 "$work/$target.log"
    fi
done
exit "$status"
