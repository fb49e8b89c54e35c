#!/usr/bin/env bash
# Prints the path of a working CPython 2.7 interpreter, or fails with a message.
# Same search order as cmake/FindPython27.cmake.
set -u
cands=()
[ -n "${PYTHON2:-}" ] && cands+=("$PYTHON2")
for root in "${PYENV_ROOT:-}" "${HOME:-/root}/.pyenv" /root/.pyenv; do
  [ -n "$root" ] || continue
  for p in $(ls -d "$root"/versions/2.7*/bin/python2.7 2>/dev/null | sort -r); do cands+=("$p"); done
done
for n in python2.7 python2; do
  p=$(command -v "$n" 2>/dev/null) && cands+=("$p")
done
for c in "${cands[@]}"; do
  if v=$("$c" -c 'import sys; print("%d.%d" % sys.version_info[:2])' 2>/dev/null) && [ "$v" = "2.7" ]; then
    echo "$c"; exit 0
  fi
done
echo "error: no CPython 2.7 interpreter found (set PYTHON2=/path/to/python2.7)" >&2
exit 1
