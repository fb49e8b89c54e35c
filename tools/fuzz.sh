#!/usr/bin/env bash
# Builds the libFuzzer targets with clang into build-fuzz and runs one of them
# for a number of inputs, starting from its seed corpus in tests/fuzz/corpus.
#   tools/fuzz.sh TARGET RUNS [libFuzzer options...]
# TARGET is tokenize, pgen or analysis. New inputs libFuzzer keeps go to
# build-fuzz/corpus/TARGET; crashes to build-fuzz/crashes/.
set -euo pipefail
here=$(cd "$(dirname "$0")/.." && pwd)
target=${1:?target: tokenize, pgen or analysis}; runs=${2:?number of inputs}; shift 2
bdir="$here/build-fuzz"
"$here/tools/build.sh" "$bdir" -DCMAKE_CXX_COMPILER=clang++ -DTREELENS_FUZZ=ON \
  -DTREELENS_TESTS=OFF -DTREELENS_BENCH=OFF -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
corpus="$bdir/corpus/$target"
mkdir -p "$corpus" "$bdir/crashes"
cd "$here"
export TREELENS_BUILD_DIR="$bdir" ASAN_OPTIONS="${ASAN_OPTIONS:-detect_leaks=0}"
exec "$bdir/${target}_fuzz" -runs="$runs" -artifact_prefix="$bdir/crashes/" -print_final_stats=1 \
  "$@" "$corpus" "$here/tests/fuzz/corpus/$target"
