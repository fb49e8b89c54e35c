#!/usr/bin/env bash
# Configures and builds into $1 (default: build). Extra arguments go to cmake.
set -euo pipefail
here=$(cd "$(dirname "$0")/.." && pwd)
bdir=${1:-build}; shift || true
case "$bdir" in /*) ;; *) bdir="$here/$bdir" ;; esac
py2=$("$here/tools/find-python2.sh")
cmake -S "$here" -B "$bdir" -DPYTHON2="$py2" "$@" >/dev/null
cmake --build "$bdir" -j "$(nproc)"
