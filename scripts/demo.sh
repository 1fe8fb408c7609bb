#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Runs the demonstration of a finished build, in namespaces of its own. Exits non-zero when anything it sees is not as
# expected.
#
#   scripts/demo.sh <build directory>
set -euo pipefail

if [[ $# -ne 1 ]]; then
  echo "usage: ${0##*/} <build directory>" >&2
  exit 2
fi
build=$(cd "$1" && pwd)
# /sbin is not in every user's PATH; ip lies there.
PATH=$PATH:/usr/sbin:/sbin exec "$build/demo/veld_demo" "$build"
