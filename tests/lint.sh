#!/usr/bin/env bash
# lint.sh [--changed [BASE] | FILE...]: everything that can be said about the code without running
# it. Without files the whole project; --changed: what differs from BASE (main) or is new. Findings
# are errors. What a tool is missing for is said and skipped. Clean units are remembered in
# build/lint-*; LINT_JOBS is how many are looked at together.
# shellcheck disable=SC2317  # steps are called through step()
set -uo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.." || exit 1
jobs=${LINT_JOBS:-$(nproc 2>/dev/null || echo 2)}
failed=0

step() {
    local name=$1 started=$SECONDS
    printf '== %s\n' "$name"
    shift
    "$@" || {
        failed=1
        printf 'lint: findings above\n'
    }
    printf '   %s: %d s\n' "$name" $((SECONDS - started))
}
have() { command -v "$1" >/dev/null || ! printf 'lint: no %s here, skipped\n' "$1"; }

if [ "${1:-}" = --changed ]; then
    mapfile -t sources < <({
        git diff --name-only --diff-filter=d "${2:-main}" -- '*.cpp' '*.h'
        git ls-files -o --exclude-standard '*.cpp' '*.h'
    } | sort -u)
elif [ $# -gt 0 ]; then
    sources=("$@")
else
    mapfile -t sources < <(git ls-files -co --exclude-standard '*.cpp' '*.h')
fi
units=()
for source in "${sources[@]}"; do
    [[ $source == *.cpp && -f $source ]] && units+=("$source")
done
format() {
    [ "${#sources[@]}" -eq 0 ] || clang-format --dry-run --Werror "${sources[@]}"
}
have clang-format && step "clang-format" format

configure() {
    cmake -S . -B "build/lint-$1" -G Ninja -DCMAKE_CXX_COMPILER="$1" -DCMAKE_BUILD_TYPE=Debug \
        -DTREEHFS_WARNINGS_END_BUILD=ON -DCMAKE_CXX_COMPILER_LAUNCHER= >/dev/null
}
# Compiles every unit for its warnings alone, with the options of the build.
syntax() {
    [ "${#units[@]}" -gt 0 ] || return 0
    python3 tests/lint_units.py warnings "build/lint-$1" "$jobs" "${units[@]}"
}
for compiler in g++ clang++; do
    have "$compiler" || continue
    if configure "$compiler"; then
        step "$compiler, warnings" syntax "$compiler"
    else
        failed=1
    fi
done

tidy() {
    local own
    mapfile -t own < <(printf '%s\n' "${units[@]}" | grep -E '^(src|python)/')
    [ "${#own[@]}" -gt 0 ] || return 0
    python3 tests/lint_units.py tidy build/lint-clang++ "$jobs" "${own[@]}"
}
[ -f build/lint-clang++/compile_commands.json ] && have clang-tidy && step "clang-tidy" tidy

check_cpp() {
    local own
    mapfile -t own < <(printf '%s\n' "${units[@]}" | sed -n '/^src\//p')
    [ "${#own[@]}" -gt 0 ] || return 0
    mkdir -p build/lint-cppcheck
    cppcheck --quiet --cppcheck-build-dir=build/lint-cppcheck --std=c++20 --language=c++ \
        -j "$jobs" -I src --inline-suppr \
        --enable=warning,performance,portability --error-exitcode=1 \
        --suppressions-list=tests/cppcheck.txt \
        --template='{file}:{line}: {severity}: {message} [{id}]' \
        "${own[@]}"
}
have cppcheck && step "cppcheck" check_cpp

have shellcheck && {
    mapfile -t scripts < <(git ls-files -co --exclude-standard dev .ci/run '*.sh')
    step "shellcheck" shellcheck "${scripts[@]}"
}

for check in banned lengths sites layers; do
    step "health: $check" python3 "tests/health/$check.py"
done
[ "$failed" -eq 0 ] && printf '== nothing to complain about\n'
exit "$failed"
