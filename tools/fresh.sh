#!/usr/bin/env bash
# fresh.sh [COMMAND...]: runs ./dev COMMAND (run) in a new Debian 12 root that holds a shell and nothing
# else, on a copy of what is committed. It answers what no working machine can: does the project
# install all it needs by itself? Several commands are separated by commas: fresh.sh run , test.
#
# Wants root, debootstrap and a Debian mirror (MIRROR, or the one this system installs from). The
# bare root is kept in build/fresh/base.tar and used again; FRESH_KEEP=1 keeps the used one.
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
project=$PWD
work=$project/build/fresh
root=$work/root
base=$work/base.tar
suite=bookworm

say() { printf '== %s\n' "$*"; }
die() {
    printf 'fresh: %s\n' "$*" >&2
    exit 1
}

[ "$(id -u)" -eq 0 ] || die "a root of its own takes root: run it with sudo"
command -v debootstrap >/dev/null || die "no debootstrap here: ./dev fresh installs it"
[ -z "$(git status --porcelain)" ] || say "only what is committed is tried; this tree holds more"

mirror() {
    [ -z "${MIRROR:-}" ] || {
        printf '%s' "$MIRROR"
        return
    }
    # shellcheck disable=SC2016  # these are apt's variables
    apt-get indextargets --format '$(REPO_URI) $(CODENAME)' 'Created-By: Packages' 2>/dev/null |
        awk -v suite="$suite" '$2 == suite { print $1; exit }'
}

make_base() {
    local from
    from=$(mirror)
    [ -n "$from" ] || die "this system installs from no $suite mirror: name one in MIRROR"
    say "making a bare $suite root (kept in build/fresh/base.tar)"
    rm -rf --one-file-system "$root"
    mkdir -p "$root"
    debootstrap --variant=minbase "$suite" "$root" "$from" >"$work/debootstrap.log" 2>&1 ||
        die "debootstrap failed: see build/fresh/debootstrap.log"
    tar -C "$root" -cf "$base.part" .
    mv "$base.part" "$base"
}

# The command runs in mount and process namespaces of its own: what it mounts or leaves running
# ends with it, and nothing of this machine's environment reaches it.
inside() {
    # shellcheck disable=SC2016  # expanded by the inner shell
    unshare --mount --pid --fork bash -c '
        mount -t proc proc "$1/proc" && mount --rbind /dev "$1/dev" && shift_root=$1 && shift &&
        exec chroot "$shift_root" /usr/bin/env -i HOME=/srv LANG=C.UTF-8 \
            PATH=/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin \
            bash -c "cd /srv/treehfs && exec \"\$@\"" bash "$@"' fresh "$root" "$@"
}

mkdir -p "$work"
[ -f "$base" ] || make_base
say "unpacking the bare root and a copy of the last commit"
rm -rf --one-file-system "$root"
mkdir -p "$root"
tar -C "$root" -xf "$base"
cp /etc/resolv.conf "$root/etc/resolv.conf"
git clone -q --no-local "$project" "$root/srv/treehfs"
rm -rf "$root/srv/treehfs/.git"

separator=,
status=0
try() {
    local started=$SECONDS
    say "fresh root: ./dev $*"
    inside ./dev "$@" </dev/null || status=$?
    say "fresh root: ./dev $* ended with $status after $((SECONDS - started)) s"
}

[ $# -gt 0 ] || set -- run
command=()
for word in "$@" "$separator"; do
    if [ "$word" != "$separator" ]; then
        command+=("$word")
        continue
    fi
    [ ${#command[@]} -eq 0 ] || try "${command[@]}"
    command=()
    [ "$status" -eq 0 ] || break
done
[ -n "${FRESH_KEEP:-}" ] || rm -rf --one-file-system "$root"
exit "$status"
