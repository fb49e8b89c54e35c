#!/usr/bin/env bash
# Fetches the typeshed stub files (.pyi) that the npm package pyright ships, a corpus of annotated
# Python for the hint tests and benchmark, into $TREELENS_STUBS (default ~/.cache/treelens/stubs).
set -euo pipefail
dest=${TREELENS_STUBS:-${XDG_CACHE_HOME:-$HOME/.cache}/treelens/stubs}
version=1.1.414
[ -d "$dest/typeshed-fallback" ] && exit 0
command -v npm >/dev/null || { echo "npm not found: stub corpus not fetched" >&2; exit 1; }
tmp=$(mktemp -d)
trap 'rm -rf "$tmp"' EXIT
(cd "$tmp" && npm pack --silent "pyright@$version" >/dev/null)
tar xzf "$tmp"/pyright-*.tgz -C "$tmp" package/dist/typeshed-fallback
mkdir -p "$dest"
mv "$tmp/package/dist/typeshed-fallback" "$dest/"
echo "stub corpus in $dest/typeshed-fallback"
