#!/usr/bin/env bash
# try_packages.sh: installs the Debian packages that lie beside it on a bare system (tools/fresh.sh
# makes one), looks into a volume with the program, then builds and runs the example that the
# development package brings.
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")"
export DEBIAN_FRONTEND=noninteractive DEBCONF_NOWARNINGS=yes

say() { printf '== %s\n' "$*"; }
apt() { apt-get -qq "$@" --no-install-recommends -y </dev/null >/dev/null; }

apt-get -qq update
say "installing treehfs"
apt install ./treehfs_*.deb
say "treehfs version, demo, check"
treehfs version
(cd /tmp && treehfs demo | tail -n 2 && treehfs check --quick demo.img | tail -n 1)
test -s /usr/share/bash-completion/completions/treehfs

say "installing libtreehfs-dev, a compiler and CMake"
apt install ./libtreehfs0_*.deb ./libtreehfs-dev_*.deb g++ cmake make pkg-config
say "building and running examples/first with what is installed"
cp -r /usr/share/doc/libtreehfs-dev/examples/first /tmp/first
cmake -S /tmp/first -B /tmp/first/build --log-level=WARNING >/dev/null
cmake --build /tmp/first/build >/dev/null
treehfs format /tmp/play.img --size 8M --with-attributes --name Play >/dev/null
/tmp/first/build/first /tmp/play.img
treehfs check --full /tmp/play.img | tail -n 1

say "building a C program with pkg-config"
printf '#include <stdio.h>\n#include <treehfs/treehfs.h>\nint main(void) { %s }\n' \
    'return puts(treehfs_version()) < 0;' >/tmp/version.c
# shellcheck disable=SC2046  # words are wanted
gcc /tmp/version.c -o /tmp/version $(pkg-config --cflags --libs treehfs)
/tmp/version

say "removing them"
apt purge treehfs libtreehfs-dev libtreehfs0
[ ! -e /usr/bin/treehfs ] && [ ! -e /usr/include/treehfs ]
say "the packages install, run and go away"
