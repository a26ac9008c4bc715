#!/usr/bin/env bash
# run.sh BUILD_FOLDER SECONDS [TARGET...]: fuzzes each target for a while, from the seeds and what
# earlier runs found worth keeping. The canary goes first: it must fail.
set -euo pipefail
build=$(cd "$1" && pwd)
seconds=$2
shift 2
targets=("$@")
[ ${#targets[@]} -gt 0 ] || targets=(node open ops image journal)
here=$(cd "$(dirname "${BASH_SOURCE[0]}")" && pwd)
work=$build/../fuzz-found
mkdir -p "$work/seeds"
"$build/fuzz_seeds" "$work/seeds"

if "$build/fuzz_canary" -max_total_time=60 -artifact_prefix="$work/canary-" \
    "$here/corpus/canary" >"$work/canary.log" 2>&1; then
    echo "fuzz: the canary lived: failures would not be seen" >&2
    exit 1
fi
grep -q 'does not hold' "$work/canary.log"
echo "canary: failed, as it must"

status=0
for target in "${targets[@]}"; do
    mkdir -p "$work/$target"
    if "$build/fuzz_$target" -max_total_time="$seconds" -timeout=20 -rss_limit_mb=2048 \
        -max_len=262144 -print_final_stats=1 -artifact_prefix="$work/$target-" \
        "$work/$target" "$work/seeds/$target" "$here/corpus/$target" \
        >"$work/$target.log" 2>&1; then
        runs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$work/$target.log")
        echo "$target: $runs runs in $seconds s, nothing found"
    else
        status=1
        echo "$target: FAILED, see $work/$target.log; the input lies beside it"
        tail -n 25 "$work/$target.log"
    fi
done
exit "$status"
