#!/usr/bin/env bash
# run.sh libfuzzer|afl BUILD_FOLDER SECONDS [TARGET...]: fuzzes each target for a while, from the
# seeds, the corpus and what earlier runs found worth keeping, and says what came of it. The canary
# goes first: it must fail. Both fuzzers take up what the other one found.
set -euo pipefail
fuzzer=$1
build=$(cd "$2" && pwd)
seconds=$3
shift 3
here=$(cd "$(dirname "${BASH_SOURCE[0]}")" && pwd)
work=$build/../fuzz-found
mkdir -p "$work/seeds"
targets=("$@")
[ ${#targets[@]} -gt 0 ] || targets=(node finder script journal open ops image)
"$build/fuzz_seeds" "$work/seeds"

# Whole volumes are made and dropped with every input: their memory is kept for the next one.
export GLIBC_TUNABLES=glibc.malloc.mmap_threshold=67108864:glibc.malloc.trim_threshold=268435456

# Longest input worth trying, by target: the longest seeds and a little more.
most_bytes() {
    case $1 in
        node) echo 4200 ;;
        finder | script) echo 9000 ;;
        journal) echo 33000 ;;
        ops) echo 6002 ;;
        open) echo 140000 ;;
        *) echo 190000 ;;
    esac
}

# Without entropic schedules: weighing thousands of inputs by their features takes a third of the
# time and finds no more.
libfuzzer_run() {
    "$build/fuzz_$1" -max_total_time="$seconds" -timeout=20 -rss_limit_mb=2048 -entropic=0 \
        -max_len="$(most_bytes "$1")" -print_final_stats=1 -artifact_prefix="$work/$1-" \
        "$work/$1" "$work/seeds/$1" "$here/corpus/$1" >"$work/$1.log" 2>&1
}

# New code is looked for as long as it turns up; too short a run says nothing of that.
libfuzzer_edges() { awk -v enough=50000 -f "$here/edges.awk" "$work/$1.log"; }

libfuzzer_runs() { sed -n 's/^stat::number_of_executed_units: *//p' "$work/$1.log"; }

# Inputs that ended a run lie in AFL++'s folder of crashes and hangs.
afl_run() {
    local from=$work/afl-from-$1 to=$work/afl-$1
    rm -rf "$from" "$to"
    mkdir -p "$from"
    find "$work/$1" "$work/seeds/$1" "$here/corpus/$1" -type f -exec cp -t "$from" {} +
    AFL_NO_UI=1 AFL_SKIP_CPUFREQ=1 AFL_I_DONT_CARE_ABOUT_MISSING_CRASHES=1 AFL_NO_AFFINITY=1 \
        AFL_IGNORE_SEED_PROBLEMS=1 afl-fuzz -i "$from" -o "$to" -V "$seconds" -t 20000+ -m none \
        -G "$(most_bytes "$1")" -- "$build/fuzz_$1" >"$work/$1.log" 2>&1 || return 1
    find "$to/default/queue" -maxdepth 1 -type f -name '*,op:*' -exec cp -t "$work/$1" {} +
    [ -z "$(find "$to/default/crashes" "$to/default/hangs" -type f -name 'id:*')" ]
}

afl_stat() { sed -n "s/^$2 *: *//p" "$work/afl-$1/default/fuzzer_stats"; }

afl_edges() { echo "$(afl_stat "$1" edges_found) edges"; }

afl_runs() { afl_stat "$1" execs_done; }

# The canary's input is in its corpus, so the targets' seeds are not needed to kill it.
libfuzzer_canary() {
    "$build/fuzz_canary" -max_total_time=60 -artifact_prefix="$work/canary-" "$here/corpus/canary" \
        >"$work/canary.log" 2>&1
}

afl_canary() {
    "$build/fuzz_canary" "$here"/corpus/canary/* >"$work/canary.log" 2>&1
}

case $fuzzer in
    libfuzzer)
        canary() { libfuzzer_canary; }
        run_target() { libfuzzer_run "$1"; }
        runs_of() { libfuzzer_runs "$1"; }
        edges_of() { libfuzzer_edges "$1"; }
        ;;
    afl)
        canary() { afl_canary; }
        run_target() { afl_run "$1"; }
        runs_of() { afl_runs "$1"; }
        edges_of() { afl_edges "$1"; }
        ;;
esac

if canary 2>/dev/null; then
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
    mkdir -p "$work/$target"
    if run_target "$target"; then
        edges=$(edges_of "$target")
        echo "$target: $(runs_of "$target") runs in $seconds s, nothing found; $edges"
    else
        status=1
        echo "$target: FAILED, see $work/$target.log; the input lies beside it"
        tail -n 25 "$work/$target.log"
    fi
done
exit "$status"
