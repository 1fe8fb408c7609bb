#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Installs the Debian 12 packages that a job needs, and only those that are missing.
#
#   scripts/install-dependencies.sh [group...]      groups: build demo test lint bench fuzz package all
#
# Without a group: build and test. Every group brings "build" with it. Needs root or a sudo that asks no password, but
# only when something is missing; otherwise it names what is missing and exits 1.
set -euo pipefail

packages_of() {
  case $1 in
    build) echo build-essential cmake ninja-build pkg-config libjsoncpp-dev libboost-dev libkmod-dev libmnl-dev libcli11-dev libtinyxml2-dev ;;
    demo) echo iptables iproute2 kmod netbase ;;
    test) packages_of demo && echo libgtest-dev libgmock-dev ;;
    lint) packages_of test && echo git clang-format clang-tidy shellcheck ;;
    bench) packages_of demo && echo libbenchmark-dev python3 ;;
    fuzz) echo clang libclang-rt-14-dev ;;
    package) echo debootstrap dpkg-dev file ;;
    all) for group in test lint bench fuzz package; do packages_of "$group"; done ;;
    *)
      echo "${0##*/}: unknown group \"$1\"; known: build demo test lint bench fuzz package all" >&2
      exit 2
      ;;
  esac
}

[[ $# -gt 0 ]] || set -- test
names=$(packages_of build)
for group in "$@"; do
  names+=" $(packages_of "$group")"
done

missing=()
for package in $(tr ' ' '\n' <<<"$names" | LC_ALL=C sort -u); do
  status=$(dpkg-query -W -f='${db:Status-Status}' "$package" 2>/dev/null) || status=unknown
  [[ $status == installed ]] || missing+=("$package")
done
[[ ${#missing[@]} -gt 0 ]] || exit 0

as_root=(env)
if [[ $EUID -ne 0 ]]; then
  if ! sudo -n true 2>/dev/null; then
    echo "${0##*/}: missing packages; as root: apt-get install ${missing[*]}" >&2
    exit 1
  fi
  as_root=(sudo -n env)
fi

log=$(mktemp)
trap 'rm -f "$log"' EXIT
apt() {
  "${as_root[@]}" DEBIAN_FRONTEND=noninteractive apt-get -qq -o DPkg::Lock::Timeout=300 "$@" >"$log" 2>&1 ||
    { cat "$log" >&2; echo "${0##*/}: apt-get $* failed" >&2; exit 1; }
}
echo "Installing ${missing[*]}"
apt update
apt install --no-install-recommends "${missing[@]}"
