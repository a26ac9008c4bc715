#!/usr/bin/env bash
# fresh.sh [STEP...]: tries what is committed in a new Debian 12 root that holds a shell and nothing
# else. It answers what no working machine can: does the project install all it needs by itself, and
# do its packages name all they need?
#
# A step is a command of ./dev, with its arguments: fresh.sh run "test cache". After the step
# `package`, the packages are installed in another new root, and run there; the step `installed`
# does so with those that ./dev package has made here. Without steps: run, test, package.
#
# Wants root, debootstrap and a Debian mirror (MIRROR, or the one this system installs from). What
# apt is told here about proxies and dates it is told there. The bare root is kept in
# build/fresh/base.tar and used again; FRESH_KEEP=1 keeps the used one.
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
project=$PWD
work=$project/build/fresh
root=$work/root
second=$work/packages-root
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

# How this system reaches its mirror: proxies, retries, the dates it insists on.
apt_settings() {
    apt-config dump Acquire | grep -E '^Acquire::(https?|ftp|Retries|Check|ForceIPv)[:-]' || true
}

make_base() {
    local from proxy
    from=$(mirror)
    [ -n "$from" ] || die "this system installs from no $suite mirror: name one in MIRROR"
    say "making a bare $suite root (kept in build/fresh/base.tar)"
    rm -rf --one-file-system "$root"
    mkdir -p "$root"
    proxy=$(apt-config dump Acquire::http::Proxy | sed -n 's/^Acquire::http::Proxy "\(.*\)";/\1/p')
    ${proxy:+env "http_proxy=$proxy"} \
        debootstrap --variant=minbase "$suite" "$root" "$from" >"$work/debootstrap.log" 2>&1 ||
        die "debootstrap failed: see build/fresh/debootstrap.log"
    tar -C "$root" -cf "$base.part" .
    mv "$base.part" "$base"
}

new_root() {
    rm -rf --one-file-system "$root"
    mkdir -p "$root"
    tar -C "$root" -xf "$base"
    cp /etc/resolv.conf "$root/etc/resolv.conf"
    apt_settings >"$root/etc/apt/apt.conf.d/90machine"
}

# The command runs in mount and process namespaces of its own: what it mounts or leaves running
# ends with it, and nothing of this machine's environment reaches it.
inside() {
    # shellcheck disable=SC2016  # expanded by the inner shell
    unshare --mount --pid --fork bash -c '
        mount -t proc proc "$1/proc" && mount --rbind /dev "$1/dev" &&
        mount --rbind /sys "$1/sys" && root=$1 && shift &&
        exec chroot "$root" /usr/bin/env -i HOME=/srv LANG=C.UTF-8 \
            PATH=/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin \
            bash -c "cd /srv/treehfs && exec \"\$@\"" bash "$@"' fresh "$root" "$@" </dev/null
}

# Says how long a step took, and how long processors were at it: on a machine that has other work
# the second figure is the one to go by.
timed() {
    local status=0
    local TIMEFORMAT="== fresh root: $* took %0R s, %0U + %0S s of processors' time"
    say "fresh root: $*"
    time inside "$@" || status=$?
    [ "$status" -eq 0 ] || say "fresh root: $* ended with $status"
    return "$status"
}

# Runs what a user of the packages would, in a root that was not there when they were built.
try_packages() {
    local made=$1/build/package
    local root=$second  # for new_root and inside; the project's root stays
    [ -n "$(find "$made" -name '*.deb' 2>/dev/null)" ] || die "no packages: ./dev package makes them"
    say "another bare root, for the packages"
    rm -rf "$work/packages"
    mkdir -p "$work/packages"
    cp "$made"/*.deb "$work/packages/"
    new_root
    mkdir -p "$root/srv/treehfs"
    cp "$work"/packages/*.deb tools/try_packages.sh "$root/srv/treehfs/"
    timed ./try_packages.sh
    [ -n "${FRESH_KEEP:-}" ] || rm -rf --one-file-system "$second"
}

clear_up() {
    [ -n "${FRESH_KEEP:-}" ] || rm -rf --one-file-system "$root" "$second"
}

mkdir -p "$work"
trap clear_up EXIT
[ -f "$base" ] || make_base
say "unpacking the bare root and a copy of the last commit"
new_root
git clone -q --no-local "$project" "$root/srv/treehfs"
rm -rf "$root/srv/treehfs/.git"

[ $# -gt 0 ] || set -- run test package
for step in "$@"; do
    read -ra words <<<"$step"
    if [ "$step" = installed ]; then
        try_packages "$project"
        continue
    fi
    timed ./dev "${words[@]}"
    [ "${words[0]}" != package ] || try_packages "$root/srv/treehfs"
done
say "all that was asked works in a bare root: $*"
