#!/usr/bin/env bash
# minimise.sh BUILD_FOLDER [TARGET...]: takes into fuzz/corpus what runs found: the fewest and
# smallest inputs that reach what the seeds do not reach. Needs a libFuzzer build.
set -euo pipefail
build=$(cd "$1" && pwd)
shift
here=$(cd "$(dirname "${BASH_SOURCE[0]}")" && pwd)
work=$build/../fuzz-found
targets=("$@")
[ ${#targets[@]} -gt 0 ] || targets=(node finder script journal open ops image)
most_files=${CORPUS_FILES:-20}
most_bytes=${CORPUS_BYTES:-2500}

# As many of the listed files as wanted, small and large ones alike.
spread() {
    awk -v most="$most_files" '{ path[NR] = $2 }
        END { if (NR < most) most = NR
              for (i = 1; i <= most; i++) print path[int(i * NR / most)] }'
}

for target in "${targets[@]}"; do
    merged=$work/merged-$target
    rm -rf "$merged"
    mkdir -p "$merged" "$work/$target"
    cp "$work/seeds/$target"/* "$merged"
    "$build/fuzz_$target" -merge=1 "$merged" "$here/corpus/$target" "$work/$target" \
        >"$work/merge-$target.log" 2>&1
    (cd "$work/seeds/$target" && find . -type f -print0) |
        (cd "$merged" && xargs -0 rm -f)
    find "$merged" -type f -size -"$most_bytes"c -printf "%s %p\n" | sort -n |
        spread | xargs -r cp -n -t "$here/corpus/$target"
    echo "$target: $(find "$here/corpus/$target" -type f | wc -l) inputs," \
        "$(du -sb "$here/corpus/$target" | cut -f1) bytes"
done
