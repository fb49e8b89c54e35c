"""Parser engine speed: pysource.optpgen against lib2to3's parser.

Parses every logical line of the 2.7 standard library (completed to a
statement as the analysis module does) with the native parser and, on the
same token streams, with lib2to3.pgen2.parse.Parser, and prints tokens per
second side by side. With the C++ benchmark built ($TREELENS_BUILD_DIR/
pgen_bench), it also times the engine alone on the same tokens.

    PYTHONPATH=. TREELENS_BUILD_DIR=build python2.7 bench/pgen_bench.py [--files N]
"""

import argparse
import gc
import os
import subprocess
import sys
import tempfile
import time

from lib2to3.pgen2 import parse as l2parse

from pysource import optpgen
from tests.py import support
from tests.py.test_optpgen_corpus import FileTokenStreams, GrammarFor, RawNode


class _L2List(list):
    """A children list lib2to3's pop() can set `used_names` on."""


def _L2NoOp(grammar, node):
    """What _NoOpConverter does: a token becomes its text, a nonterminal its
    children."""
    if node[3] is None:
        return node[1]
    return _L2List(node[3])


def _L2Raw(grammar, node):
    return RawNode(node)


def TimeLib2to3(parser, streams):
    start = time.time()
    for toks in streams:
        parser.setup()
        try:
            for t, v, c in toks:
                if parser.addtoken(t, v, c):
                    break
        except l2parse.ParseError:
            pass
    return time.time() - start


def TimeNativeLoop(parser, streams):
    start = time.time()
    for toks in streams:
        parser.setup()
        try:
            for t, v, c in toks:
                if parser.addtoken(t, v, c):
                    break
        except optpgen.ParseError:
            pass
    return time.time() - start


def TimeNativeFeed(parser, streams):
    feed = optpgen._FeedTokens
    start = time.time()
    for toks in streams:
        try:
            feed(parser, toks)
        except optpgen.ParseError:
            pass
    return time.time() - start


def DumpForCpp(path, grammar, all_streams):
    """Writes the grammar tables and token streams for bench/pgen_bench.cpp."""
    with open(path, 'wb') as f:
        w = f.write
        w('pgen-bench 1\n')
        w('labels %d %s\n' % (len(grammar.labels),
                              ' '.join(str(t) for t, v in grammar.labels)))
        w('tokens %d %s\n' % (len(grammar.tokens), ' '.join(
            '%d %d' % kv for kv in sorted(grammar.tokens.items()))))
        w('keywords %d %s\n' % (len(grammar.keywords), ' '.join(
            '%s %d' % kv for kv in sorted(grammar.keywords.items()))))
        w('start %d\n' % grammar.start)
        w('dfas %d\n' % len(grammar.dfas))
        for symbol, (states, first) in sorted(grammar.dfas.items()):
            w('dfa %d %d %d %s\n' % (symbol, len(states), len(first),
                                     ' '.join(str(l) for l in sorted(first))))
            for arcs in states:
                w('state %d %s\n' % (len(arcs), ' '.join(
                    '%d %d' % arc for arc in arcs)))
        w('streams %d\n' % len(all_streams))
        for toks in all_streams:
            w('%d %s\n' % (len(toks), ' '.join(
                '%d %s' % (t, v if t == 1 else '-') for t, v, c in toks)))


def main():
    ap = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    ap.add_argument('--files', type=int, default=None,
                    help='sample this many stdlib files (default: all)')
    ap.add_argument('--gc', action='store_true',
                    help='leave the cyclic garbage collector on while timing')
    args = ap.parse_args()

    grammar = GrammarFor('2.7')
    files = support.CorpusFiles('2.7', limit=args.files)
    noop = optpgen._NoOpConverter
    runs = [
        ('optpgen, no-op converter, promoted (native feed)', TimeNativeFeed,
         optpgen.CreateParser(grammar, noop(), promotesinglechild=True)),
        ('optpgen, no-op converter, promoted (Python loop)', TimeNativeLoop,
         optpgen.CreateParser(grammar, noop(), promotesinglechild=True)),
        ('optpgen, no-op converter (native feed)', TimeNativeFeed,
         optpgen.CreateParser(grammar, noop())),
        ('optpgen, no-op converter dropping nodes', TimeNativeFeed,
         optpgen.CreateParser(grammar, noop(drop=True))),
        ('optpgen, raw tuples (native feed)', TimeNativeFeed,
         optpgen.CreateParser(grammar, None)),
        ('lib2to3, no-op converter', TimeLib2to3,
         l2parse.Parser(grammar, _L2NoOp)),
        ('lib2to3, raw tuples', TimeLib2to3, l2parse.Parser(grammar, _L2Raw)),
    ]
    kBase = 5
    totals = [0.0] * len(runs)
    tokens = lines = 0
    all_streams = []
    for path in files:
        streams = FileTokenStreams(path, False)
        all_streams.extend(streams)
        lines += len(streams)
        tokens += sum(len(s) for s in streams)
        if not args.gc:
            gc.disable()
        for i, (name, timer, parser) in enumerate(runs):
            totals[i] += timer(parser, streams)
        gc.enable()

    print('2.7 stdlib: %d files, %d logical lines, %d tokens (collector %s)'
          % (len(files), lines, tokens, 'on' if args.gc else 'off'))
    base = totals[kBase]
    print('%-50s %9s %12s %9s %9s' % ('parser', 'seconds', 'tokens/s',
                                      'ns/token', 'vs lib2to3'))
    for (name, timer, parser), secs in zip(runs, totals):
        print('%-50s %9.2f %12.0f %9.1f %8.1fx'
              % (name, secs, tokens / secs, secs * 1e9 / tokens, base / secs))

    exe = os.path.join(os.environ.get('TREELENS_BUILD_DIR', 'build'),
                       'pgen_bench')
    if not os.path.exists(exe):
        print('(engine alone: build %s to time it)' % exe)
        return
    fd, data = tempfile.mkstemp(suffix='.pgen')
    os.close(fd)
    try:
        DumpForCpp(data, grammar, all_streams)
        env = dict(os.environ, PGEN_BENCH_DATA=data)
        sys.stdout.flush()
        subprocess.check_call([exe, '--benchmark_counters_tabular=true'],
                              env=env)
    finally:
        os.unlink(data)


if __name__ == '__main__':
    main()
