#!/usr/bin/env bash
# Installs the Debian packages on a clean Debian 12 and uses them there:
# a minimal bookworm made with debootstrap, `apt install` of the two
# packages (apt brings what they depend on), then `kivi`, and the hello
# example built through find_package and through pkg-config.
#
#   scripts/check_deb.sh DEB_DIR [--root DIR]
#
# DEB_DIR holds libkiviossdk1_*.deb and libkiviossdk-dev_*.deb (`cpack -G
# DEB` in a build tree configured with -DCMAKE_INSTALL_PREFIX=/usr). Needs
# root and Debian's mirror; --root reuses a chroot made before (it is changed).
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."
debs=$(realpath "${1:?usage: scripts/check_deb.sh DEB_DIR [--root DIR]}")
root=${3:-$(mktemp -d /tmp/kivi-deb-root.XXXXXX)}
[[ $(id -u) == 0 ]] || { echo "check_deb.sh: needs root (debootstrap, chroot)" >&2; exit 1; }
if [[ ! -x $root/usr/bin/apt-get ]]; then
  command -v debootstrap >/dev/null || apt-get install -y debootstrap
  debootstrap --variant=minbase bookworm "$root" http://deb.debian.org/debian >"$root.log" 2>&1 ||
    { tail -n 20 "$root.log" >&2; exit 1; }
fi
mkdir -p "$root/tmp/kivi"
cp "$debs"/libkiviossdk1_*.deb "$debs"/libkiviossdk-dev_*.deb "$root/tmp/kivi/"
cp -r examples/hello "$root/tmp/kivi/hello"
mount -t proc proc "$root/proc"
mkdir -p "$root/dev/pts"
mount --bind /dev/pts "$root/dev/pts"
trap 'umount "$root/dev/pts"; umount "$root/proc"' EXIT
cp /etc/resolv.conf "$root/etc/resolv.conf" 2>/dev/null || true
chroot "$root" /bin/bash -euo pipefail -c '
  export DEBIAN_FRONTEND=noninteractive
  apt-get update -qq
  apt-get install -y -qq /tmp/kivi/*.deb >/tmp/kivi/apt.log
  kivi --version
  kivi sha256 abc
  apt-get install -y -qq g++ cmake make pkg-config >>/tmp/kivi/apt.log
  cd /tmp/kivi/hello
  cmake -S . -B build >/dev/null && cmake --build build >/dev/null && ./build/hello
  g++ -std=c++20 main.cpp -o hello-pc $(pkg-config --cflags --libs kiviossdk) && ./hello-pc
'
echo "check_deb.sh: the packages install and work on a clean Debian 12 ($root)"
