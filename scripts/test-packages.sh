#!/bin/bash
# SPDX-License-Identifier: Apache-2.0
# Installs the built packages in a clean Debian tree, sets the firewall up and switches it on in a network namespace of
# its own, purges the packages again, and compares: nothing may be left behind. Needs root and debootstrap.
#
#   scripts/test-packages.sh DIRECTORY      where the *.deb files are; the tree is made there, too, and removed again
#   VELD_MIRROR=URL                         another mirror than that of the system
set -euo pipefail

packages=$(realpath "${1:?name the directory of the packages}")
# The system has its sources in the one form or the other, so that one of the files is missing.
sources=$(cat /etc/apt/sources.list /etc/apt/sources.list.d/* 2>/dev/null || true)
mirror=${VELD_MIRROR:-$(sed -nE 's/^(deb .*|URIs: *)(https?:[^ ]+).*/\2/p;' <<<"$sources" | sed -n 1p)}
[[ $EUID -eq 0 ]] || { echo "${0##*/}: needs root" >&2; exit 1; }
shopt -s nullglob
debs=("$packages"/*.deb)
[[ ${#debs[@]} -gt 0 ]] || { echo "${0##*/}: no packages in $packages; run make package" >&2; exit 1; }

# Mounts and the network are this script's own, so that its end undoes them.
if [[ ${VELD_UNSHARED:-} != yes ]]; then
  VELD_UNSHARED=yes VELD_MIRROR=$mirror exec unshare --mount --propagation private "$0" "$packages"
fi
tree=$(mktemp -d "$packages/tree.XXXXXX")
trap 'umount -R "$tree/proc" "$tree/dev" 2>/dev/null || true; rm -rf --one-file-system "$tree"' EXIT

echo "Making a clean tree"
debootstrap --variant=minbase --include=iptables,libjsoncpp25 bookworm "$tree" "$mirror" >"$packages/debootstrap.log" ||
  { tail -20 "$packages/debootstrap.log" >&2; exit 1; }
mount -t proc proc "$tree/proc"
mount --bind /dev "$tree/dev"
mkdir "$tree/packages"
cp "${debs[@]}" "$tree/packages/"
run() { chroot "$tree" env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin DEBIAN_FRONTEND=noninteractive LC_ALL=C "$@"; }
listing() { # every path but those of dpkg, apt and the logs
  (cd "$tree" && find . -xdev \( -path ./proc -o -path ./dev -o -path ./packages -o -path ./var/lib/dpkg -o \
    -path ./var/cache -o -path ./var/log -o -path ./var/lib/apt \) -prune -o -print | LC_ALL=C sort)
}
mapfile -t inside < <(cd "$tree" && printf '/%s\n' packages/*.deb)
mapfile -t names < <(for deb in "${debs[@]}"; do dpkg-deb -f "$deb" Package; done)

# What other packages these need comes first, and stays: only these are compared.
mapfile -t needed < <(run apt-get -s install --no-install-recommends -y "${inside[@]}" |
  sed -nE 's/^Inst ([^ ]+).*/\1/p' | grep -vxFf <(printf '%s\n' "${names[@]}") || true)
[[ ${#needed[@]} -eq 0 ]] || run apt-get -qq install --no-install-recommends -y "${needed[@]}" >"$packages/apt.log" 2>&1
listing >"$packages/before.txt"

echo "Installing ${names[*]}"
# shellcheck disable=SC2016  # expanded inside
unshare --net chroot "$tree" env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin DEBIAN_FRONTEND=noninteractive LC_ALL=C \
  bash -euo pipefail -c '
    dpkg -i "$@" >/dev/null
    veldfwctl setup
    veldfwctl enable
    veldfwctl status
    printf "[Scanner]\nports=6566/tcp|6567\n" >/packages/scanner
    veldfwctl service import --from /packages/scanner
    iptables -S INPUT_FIREWALL | grep -q -- "-j RETURN" || { echo "no rules are in force" >&2; exit 1; }
    dpkg -P $(for deb in "$@"; do dpkg-deb -f "$deb" Package; done) >/dev/null
    left=$(iptables -S; ip6tables -S)
    ! grep FIREWALL <<<"$left" || { echo "chains are left in the kernel" >&2; exit 1; }
  ' install "${inside[@]}"
listing >"$packages/after.txt"
if ! diff "$packages/before.txt" "$packages/after.txt"; then
  echo "${0##*/}: the purge left the paths above behind (>) or removed them (<)" >&2
  exit 1
fi
echo "Nothing was left behind"
