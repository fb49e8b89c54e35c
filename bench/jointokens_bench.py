"""JoinTokens speed: the native pysource._fastaccess.JoinTokens against the Python
symbolinfo._JoinTokensPy, on the same inputs.

Inputs are the significant token texts of every logical line of the 2.7
standard library (sampled with --files), and the same lines cut into short
runs of at most four tokens, the size the node-to-text converter usually joins.
Prints nanoseconds per call for both and their ratio.

    PYTHONPATH=. TREELENS_BUILD_DIR=build python2.7 bench/jointokens_bench.py [--files N] [--repeat R]
"""

import argparse
import gc
import os
import sys
import time

sys.path.insert(0, os.path.dirname(os.path.dirname(os.path.abspath(__file__))))

from tests.py import support  # noqa: E402
from pysource import _fastaccess  # noqa: E402
from pysource import symbolinfo  # noqa: E402
from pysource.utils import GetLogicalsFromText  # noqa: E402

kCommentType = 202
kBackslashType = 203


def LineTokens(files):
    lines = []
    for path in files:
        for logical in GetLogicalsFromText(support.ReadBytes(path)):
            toks = [text for i, (text, _) in enumerate(logical.fTokens)
                    if _fastaccess.GetLogicalTokenType(logical, i)
                    not in (kCommentType, kBackslashType)]
            if toks:
                lines.append(toks)
    return lines


def ShortRuns(lines, size=4):
    return [toks[i:i + size] for toks in lines for i in range(0, len(toks), size)]


def BestSeconds(join, inputs, repeat):
    best = None
    gc.disable()
    try:
        for _ in range(repeat):
            start = time.time()
            for texts in inputs:
                join(texts)
            spent = time.time() - start
            best = spent if best is None else min(best, spent)
    finally:
        gc.enable()
    return best


def main():
    parser = argparse.ArgumentParser(description=__doc__.split('\n')[0])
    parser.add_argument('--files', type=int, default=300, help='stdlib files sampled (0: all)')
    parser.add_argument('--repeat', type=int, default=3, help='runs; the best is reported')
    args = parser.parse_args()
    lines = LineTokens(support.CorpusFiles('2.7', limit=args.files or None))
    native, python = _fastaccess.JoinTokens, symbolinfo._JoinTokensPy
    for name, inputs in (('whole logical lines', lines), ('runs of <= 4 tokens', ShortRuns(lines))):
        count = len(inputs)
        tokens = sum(len(t) for t in inputs)
        ours = BestSeconds(native, inputs, args.repeat)
        peer = BestSeconds(python, inputs, args.repeat)
        print('%s: %d calls, %.1f tokens per call (best of %d runs)'
              % (name, count, float(tokens) / count, args.repeat))
        print('  native JoinTokens: %10.1f ns/call' % (ours * 1e9 / count))
        print('  Python JoinTokens: %10.1f ns/call' % (peer * 1e9 / count))
        print('  ratio native / Python: %.4f' % (ours / peer))


if __name__ == '__main__':
    main()
