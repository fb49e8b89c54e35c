"""Analysing the 2.7 standard library one logical line at a time: treelens vs CPython's parser.

Both sides run in this process over the same logical lines, split beforehand
with GetLogicalsFromText. treelens runs CPGenAnalyzerImpl.AnalyzeSingleLogical
with the 2.7 grammar on every logical line (parse, walk, record, discard),
once more with the syntax checks after parsing switched on, and, for
comparison, the parse alone (ParseToNode and DiscardNode of a parser of the
same grammar). The peers are CPython 2.7's compile(..., ast.PyCF_ONLY_AST) on
the source text of the same lines, completed the way the analyzer completes
them (a block header gets a "pass" body, a lone else/elif/except/finally its
opening clause, a decorator its function), and that compile followed by an
ast.walk that collects the names read and bound, which is what a Python user
would write to get the same facts. Prints microseconds per logical line for
each and the ratios.

A third part analyzes the 3.8 standard library's logical lines with the 3.8
analyzer and, on the same lines, with the 3.6 analyzer (the lines the 3.6
grammar rejects included: both run every line), and prints microseconds per
line for each and the ratio.

A second pass renders every expression node of the same lines to text with
the walker's converter (all three options true) and prints nanoseconds per
node, side by side with the host's JoinTokens over each node's own tokens.

Usage: TREELENS_BUILD_DIR=<build> python2.7 bench/treelens_bench.py [repeat] [file_limit] [render_repeat]
       [py38_file_limit]
"""

import ast
import gc
import os
import sys
import time

sys.path.insert(0, os.path.dirname(os.path.dirname(os.path.abspath(__file__))))

from tests.py import support  # noqa: E402
from pysource import treelens  # noqa: E402
from pysource import symbolinfo  # noqa: E402
from pysource.utils import GetLogicalsFromText  # noqa: E402

kTryKind = 11


def SignificantTokens(logical):
    return [t for t, _ in logical.fTokens if not t.startswith(b'#') and t != b'\\']


def CompletedSource(logical):
    """The logical's source, dedented and completed as the analyzer completes its tokens."""
    text = logical.fLineText
    text = text[len(text) - len(text.lstrip(b' \t\f')):]
    if not text.endswith(b'\n'):
        text += b'\n'
    toks = SignificantTokens(logical)
    if not toks:
        return text
    first, last = toks[0], toks[-1]
    if first == b'elif':
        text = text[2:]
    elif first in (b'except', b'finally'):
        text = b'try: pass\n' + text
    elif first == b'else':
        text = b'if 0: pass\n' + text
    if logical.fKind == kTryKind:
        if last == b':':
            text += b' pass\n'
        return text + b'finally: pass\n'
    if first == b'@':
        return text + b'def function(): pass\n'
    soft = first in (b'match', b'case') and len(toks) > 1 and toks[1] not in kNotSoftKeywordFollowers
    if soft and first == b'case' and b':' in toks:
        text = b'match 0:\n ' + text
    if last == b':':
        if soft and first == b'match':
            return text + b' case _: pass\n'
        text += b' pass\n'
    return text


# Tokens after `match` or `case` that make the line an ordinary statement.
kNotSoftKeywordFollowers = frozenset([b'=', b'.', b')', b']', b'}', b',', b';', b':', b':=', b'+=', b'-=', b'*=',
                                      b'/=', b'%=', b'&=', b'|=', b'^=', b'<<=', b'>>=', b'**=', b'//=', b'@='])


def LoadLogicals(limit):
    logicals = []
    for path in support.CorpusFiles('2.7', limit=limit):
        logicals.extend(GetLogicalsFromText(support.ReadBytes(path)))
    return logicals


def TimeTreelens(analyzer, logicals, repeat, in_async=None, results=None):
    """Best seconds of AnalyzeSingleLogical over the logicals; in_async gives each
    line's in_async_def (False by default); results, a list, gets the last run's."""
    flags = in_async or [False] * len(logicals)
    best = None
    for _ in range(repeat):
        for logical in logicals:
            logical.fInspected = False
        gc.collect()
        analyze = analyzer.AnalyzeSingleLogical
        start = time.time()
        found = [analyze(logical, flag) for logical, flag in zip(logicals, flags)]
        elapsed = time.time() - start
        best = elapsed if best is None else min(best, elapsed)
    if results is not None:
        results[:] = found
    return best


def TimeVersion(version, logicals, repeat):
    """Best seconds of the version's analyzer over the logicals, and how many it rejects."""
    from pysource import analysis
    flags = [version in ('3.5', '3.6') and support.InAsyncDef(l) for l in logicals]
    results = []
    best = TimeTreelens(analysis.GetAnalyzer(version).Impl(), logicals, repeat, flags, results)
    return best, sum(1 for r in results if r is not None)


def TimeParseOnly(logicals, repeat):
    parser = treelens.CPGenParserImpl((2, 7, 0), treelens.kPy2DefaultGrammar, None, False)
    parse, discard = parser.ParseToNode, parser.DiscardNode
    best = None
    for _ in range(repeat):
        gc.collect()
        start = time.time()
        for logical in logicals:
            try:
                tree = parse(logical, False)
            except Exception:
                continue
            if tree is not None:
                discard(tree)
        elapsed = time.time() - start
        best = elapsed if best is None else min(best, elapsed)
    return best


def TimeCPythonWalk(sources, repeat):
    """compile to an AST, then ast.walk collecting the names read and bound."""
    best = None
    flags, Name, Load, walk = ast.PyCF_ONLY_AST, ast.Name, ast.Load, ast.walk
    for _ in range(repeat):
        gc.collect()
        start = time.time()
        for src in sources:
            try:
                tree = compile(src, '<s>', 'exec', flags)
            except (SyntaxError, ValueError, TypeError):
                continue
            reads, binds = set(), set()
            for node in walk(tree):
                if isinstance(node, Name):
                    (reads if isinstance(node.ctx, Load) else binds).add(node.id)
        elapsed = time.time() - start
        best = elapsed if best is None else min(best, elapsed)
    return best


def TimeCPython(sources, repeat):
    best = None
    flags = ast.PyCF_ONLY_AST
    for _ in range(repeat):
        gc.collect()
        start = time.time()
        for src in sources:
            try:
                compile(src, '<s>', 'exec', flags)
            except (SyntaxError, ValueError, TypeError):
                pass
        elapsed = time.time() - start
        best = elapsed if best is None else min(best, elapsed)
    return best


def ExpressionNodes(tree):
    """(node, its leaf texts) for every expression node of a tree."""
    out = []

    def Visit(node):
        if node.fChildren is None:
            tokens = [node.fText]
        else:
            tokens = []
            for child in node.fChildren:
                tokens.extend(Visit(child))
        if isinstance(node, treelens.CExpression):
            out.append((node, tokens))
        return tokens
    Visit(tree)
    return out


def WalkerConverter():
    """The converter the symbol walker renders with: all three options true."""
    conv = getattr(treelens.CNodeWalker(), '_fToText', None)
    if conv is None:
        conv = treelens.CNodeToTextConverter(include_string_contents=True, include_bracket_text=True,
                                             include_arg_text=True)
    return conv


def TimeRendering(logicals, repeat):
    """Best total seconds of TextForNode and of JoinTokens over every expression node, and the node count."""
    parser = treelens.CPGenParserImpl((2, 7, 0), treelens.kPy2DefaultGrammar, None, False)
    text_for_node = WalkerConverter().TextForNode
    join = symbolinfo.JoinTokens
    clock = time.time
    best_ours = best_peer = None
    count = 0
    for _ in range(repeat):
        ours = peer = 0.0
        count = 0
        for logical in logicals:
            try:
                tree = parser.ParseToNode(logical, False)
            except Exception:
                continue
            if tree is None:
                continue
            pairs = ExpressionNodes(tree)
            count += len(pairs)
            start = clock()
            for node, _ in pairs:
                text_for_node(node)
            middle = clock()
            for _, tokens in pairs:
                join(tokens)
            ours += middle - start
            peer += clock() - middle
            del pairs
            parser.DiscardNode(tree)
        best_ours = ours if best_ours is None else min(best_ours, ours)
        best_peer = peer if best_peer is None else min(best_peer, peer)
    return best_ours, best_peer, count


def main():
    repeat = int(sys.argv[1]) if len(sys.argv) > 1 else 3
    limit = int(sys.argv[2]) if len(sys.argv) > 2 else None
    logicals = LoadLogicals(limit)
    sources = [CompletedSource(l) for l in logicals]
    analyzer = treelens.CPGenAnalyzerImpl((2, 7, 0), treelens.kPy2DefaultGrammar, None, False)
    n = len(logicals)
    checking = treelens.CPGenAnalyzerImpl((2, 7, 0), treelens.kPy2DefaultGrammar, None, False,
                                          syntax_checks=True)
    # Alternated, so that a busy spell of the machine hits both alike.
    ours, checked = [min(t) for t in zip(*[(TimeTreelens(analyzer, logicals, 1),
                                            TimeTreelens(checking, logicals, 1))
                                           for _ in range(repeat)])]
    parse_only = TimeParseOnly(logicals, repeat)
    peer = TimeCPython(sources, repeat)
    peer_walk = TimeCPythonWalk(sources, repeat)
    print('logical lines: %d (best of %d runs)' % (n, repeat))
    print('treelens AnalyzeSingleLogical (full analysis): %7.3f us/line' % (ours * 1e6 / n))
    print('treelens full analysis with the syntax checks: %7.3f us/line' % (checked * 1e6 / n))
    print('treelens parse only (ParseToNode + DiscardNode): %7.3f us/line' % (parse_only * 1e6 / n))
    print('CPython compile(PyCF_ONLY_AST): %7.3f us/line' % (peer * 1e6 / n))
    print('CPython compile + ast.walk of names: %7.3f us/line' % (peer_walk * 1e6 / n))
    print('ratio full analysis / parse only: %.3f' % (ours / parse_only))
    print('ratio with the syntax checks / full analysis: %.3f' % (checked / ours))
    print('ratio full analysis / CPython compile: %.3f' % (ours / peer))
    print('ratio full analysis / CPython compile + walk: %.3f' % (ours / peer_walk))
    render_repeat = int(sys.argv[3]) if len(sys.argv) > 3 else 1
    ours, peer, nodes = TimeRendering(logicals, render_repeat)
    print('expression nodes: %d (best of %d runs)' % (nodes, render_repeat))
    print('treelens TextForNode, all options: %9.1f ns/node' % (ours * 1e9 / nodes))
    print('symbolinfo.JoinTokens of the node tokens: %9.1f ns/node' % (peer * 1e9 / nodes))
    print('ratio TextForNode / JoinTokens: %.3f' % (ours / peer))
    py38_limit = int(sys.argv[4]) if len(sys.argv) > 4 else limit
    logicals = []
    for path in support.CorpusFiles('3.8', limit=py38_limit):
        logicals.extend(GetLogicalsFromText(support.ReadBytes(path)))
    if not logicals:
        print('no Python 3.8 standard library: 3.8 analyzer not timed')
        return
    n = len(logicals)
    new, new_rejected = TimeVersion('3.8', logicals, repeat)
    old, old_rejected = TimeVersion('3.6', logicals, repeat)
    print('3.8 standard library logical lines: %d (best of %d runs)' % (n, repeat))
    print('treelens 3.8 analyzer: %7.3f us/line (%d lines rejected)' % (new * 1e6 / n, new_rejected))
    print('treelens 3.6 analyzer, same lines: %7.3f us/line (%d lines rejected)' % (old * 1e6 / n, old_rejected))
    print('ratio 3.8 / 3.6 analyzer: %.3f' % (new / old))
    TimeNewestVersion(repeat, int(sys.argv[5]) if len(sys.argv) > 5 else py38_limit)


def TimeAuto(files, repeat, order=None):
    """Best seconds of AnalyzeText(..., 'auto') over the files, and their logical lines;
    order replaces the versions auto tries."""
    from pysource import analysis
    texts = [support.ReadBytes(p) for p in files]
    saved = analysis.kAutoOrder
    if order:
        analysis.kAutoOrder = order
    try:
        best, lines = None, 0
        for _ in range(repeat):
            gc.collect()
            start = time.time()
            lines = sum(len(analysis.AnalyzeText(t).logicals) for t in texts)
            elapsed = time.time() - start
            best = elapsed if best is None else min(best, elapsed)
    finally:
        analysis.kAutoOrder = saved
    return best, lines


def TimeNewestVersion(repeat, limit):
    """The 3.13 analyzer against 3.8's on the 3.13 standard library lines both
    accept, and auto on the 3.13 standard library against auto as it was
    before 3.9 (trying 3.8 first) on the 3.8 standard library."""
    from pysource import analysis
    files = support.CorpusFiles('3.13', limit=limit)
    if not files:
        print('no Python 3.13 standard library: 3.13 analyzer not timed')
        return
    logicals = []
    for path in files:
        logicals.extend(GetLogicalsFromText(support.ReadBytes(path)))
    verdicts = {}
    for version in ('3.13', '3.8'):
        results = []
        TimeTreelens(analysis.GetAnalyzer(version).Impl(), logicals, 1, None, results)
        verdicts[version] = results
    both = [l for l, a, b in zip(logicals, verdicts['3.13'], verdicts['3.8']) if a is None and b is None]
    n = len(both)
    new, old = [min(t) for t in zip(*[(TimeVersion('3.13', both, 1)[0], TimeVersion('3.8', both, 1)[0])
                                      for _ in range(repeat)])]
    print('3.13 standard library logical lines: %d, accepted by both the 3.13 and 3.8 analyzers: %d'
          % (len(logicals), n))
    print('treelens 3.13 analyzer: %7.3f us/line' % (new * 1e6 / n))
    print('treelens 3.8 analyzer, same lines: %7.3f us/line' % (old * 1e6 / n))
    print('ratio 3.13 / 3.8 analyzer: %.3f' % (new / old))
    files38 = support.CorpusFiles('3.8', limit=limit)
    old_order = ('3.8', '3.7', '3.6', '3.5', '2.7')
    TimeAuto(files, 1)  # every version's analyzer made once, outside the timings
    # Alternated, so that a busy spell of the machine hits both alike.
    runs = [(TimeAuto(files, 1), TimeAuto(files38, 1, old_order)) for _ in range(repeat)]
    auto, lines = min(r[0] for r in runs)
    auto38, lines38 = min(r[1] for r in runs)
    print('auto (3.13 first) on the 3.13 standard library: %7.3f us/line (%d lines)' % (auto * 1e6 / lines, lines))
    print('auto trying 3.8 first on the 3.8 standard library: %7.3f us/line (%d lines)'
          % (auto38 * 1e6 / lines38, lines38))
    print('ratio auto 3.13 / auto 3.8, per line: %.3f' % ((auto / lines) / (auto38 / lines38)))


if __name__ == '__main__':
    main()
