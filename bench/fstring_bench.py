"""Lines that hold f-strings, from the 3.6 standard library: treelens vs CPython 3.6's parser.

treelens runs AnalyzeSingleLogical with the 3.6 grammar on every logical line
that holds an f-string, once with the f-string inspection (parsing and walking
each embedded expression) and once without it. The same lines' token counts
pick a control set: for every f-string line, a line of the same token count
without f-strings. An f-string line should cost at most three times its
control. The peer is CPython 3.6's compile(..., PyCF_ONLY_AST) on the same
lines (completed as the analyzer completes them), timed in a 3.6 process.

A second pass times GetExpressionPartList per f-string token.

Usage: TREELENS_BUILD_DIR=<build> python2.7 bench/fstring_bench.py [repeat]
"""

import gc
import json
import os
import random
import sys
import time

sys.path.insert(0, os.path.dirname(os.path.dirname(os.path.abspath(__file__))))

from tests.py import support  # noqa: E402
from pysource import treelens, _fastaccess  # noqa: E402
from pysource.utils import GetLogicalsFromText  # noqa: E402
from treelens_bench import CompletedSource  # noqa: E402

kPeerScript = r'''
import ast, json, sys, time
sources = [s.encode('latin-1') for s in json.loads(sys.stdin.read())]
best = None
for _ in range(REPEAT):
    start = time.time()
    for src in sources:
        try:
            compile(src, '<s>', 'exec', ast.PyCF_ONLY_AST)
        except (SyntaxError, ValueError, TypeError):
            pass
    elapsed = time.time() - start
    best = elapsed if best is None else min(best, elapsed)
sys.stdout.write(json.dumps(best))
'''


def LoadLines():
    """(f-string lines, control lines of the same token counts), each as (logical, in_async_def)."""
    support_ = treelens.CFStringSupport()
    with_f, by_count = [], {}
    for path in support.CorpusFiles('3.6'):
        for logical in GetLogicalsFromText(support.ReadBytes(path)):
            if logical.fKind in (21, 22):
                continue
            entry = (logical, support.InAsyncDef(logical))
            if support_._FStringTokenList(logical):
                with_f.append(entry)
            else:
                by_count.setdefault(logical.fTokenCount, []).append(entry)
    rnd = random.Random(498)
    control = []
    for logical, _ in with_f:
        near = min(by_count, key=lambda n: abs(n - logical.fTokenCount))
        control.append(rnd.choice(by_count[near]))
    return with_f, control


def Best(repeat, run):
    best = None
    for _ in range(repeat):
        gc.collect()
        start = time.time()
        run()
        elapsed = time.time() - start
        best = elapsed if best is None else min(best, elapsed)
    return best


def Full(analyzer, lines):
    analyze = analyzer.AnalyzeSingleLogical

    def Run():
        for logical, in_async in lines:
            logical.fInspected = False
            analyze(logical, in_async)
    return Run


def WithoutInspection(analyzer, lines):
    inspect = analyzer._InspectSingleLogical
    clear = _fastaccess.ClearLogicalDerivedInfo

    def Run():
        for logical, in_async in lines:
            clear(logical)
            try:
                inspect(logical, in_async, True)
            except Exception:
                pass
    return Run


def main():
    repeat = int(sys.argv[1]) if len(sys.argv) > 1 else 5
    with_f, control = LoadLines()
    if not with_f:
        sys.exit('no Python 3.6 standard library')
    analyzer = treelens.CPGenAnalyzerImpl((3, 6, 0))
    n = len(with_f)
    tokens = sum(l.fTokenCount for l, _ in with_f)
    full = Best(repeat, Full(analyzer, with_f))
    bare = Best(repeat, WithoutInspection(analyzer, with_f))
    ctrl = Best(repeat, Full(analyzer, control))
    sources = [CompletedSource(l) for l, _ in with_f]
    out = support.RunOracle('3.6', kPeerScript.replace('REPEAT', str(repeat)),
                            json.dumps([s.decode('latin-1') for s in sources]))
    peer = json.loads(out) if out else None
    print('f-string lines: %d, %.1f tokens/line; control lines: %.1f tokens/line (best of %d runs)'
          % (n, float(tokens) / n, float(sum(l.fTokenCount for l, _ in control)) / n, repeat))
    print('treelens AnalyzeSingleLogical, f-string lines:         %7.2f us/line' % (full * 1e6 / n))
    print('treelens without the f-string inspection, same lines:  %7.2f us/line' % (bare * 1e6 / n))
    print('treelens AnalyzeSingleLogical, control lines:          %7.2f us/line' % (ctrl * 1e6 / n))
    if peer:
        print('CPython 3.6 compile(PyCF_ONLY_AST), f-string lines:    %7.2f us/line' % (peer * 1e6 / n))
    print('ratio f-string line / control line: %.2f (aim: at most 3)' % (full / ctrl))
    print('ratio with / without inspection: %.2f' % (full / bare))
    if peer:
        print('ratio treelens / CPython 3.6: %.2f' % (full / peer))

    sup = treelens.CFStringSupport()
    toks = [t for l, _ in with_f for t, _ in sup._FStringTokenList(l)]
    parts = Best(repeat, lambda: [sup.GetExpressionPartList(t) for t in toks])
    print('GetExpressionPartList: %d tokens, %.2f us/token' % (len(toks), parts * 1e6 / len(toks)))


if __name__ == '__main__':
    main()
