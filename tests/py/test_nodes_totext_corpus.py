"""CNodeToTextConverter over every expression node of the 2.7 standard library (3.6: the *36 module).

Round trip: with all three options true, an expression whose tokens are all
names, numbers, operators, commas, dots and square or curly brackets (no
parentheses, which the converter drops, and no strings, which it encodes)
renders as JoinTokens of its own tokens, so no piece is dropped or moved.
Sweep: the seven other option sets render every expression node without an
exception, and a second pass over the same files leaves no objects behind.
"""

import gc
import itertools
import sys
import unittest

from tests.py import support

try:
    from pysource import treelens as tl
    from pysource import optpgen
    from pysource import symbolinfo as si
    from pysource.utils import GetLogicalsFromText
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


kSkippedKinds = (21, 22)
kParens = frozenset([b'(', b')'])
# The keywords of each language: in 3.x print and exec are names (a.print).
kKeywords = {
    '2.7': None,
    '3.6': ['False', 'None', 'True', 'and', 'as', 'assert', 'break', 'class', 'continue', 'def', 'del',
            'elif', 'else', 'except', 'finally', 'for', 'from', 'global', 'if', 'import', 'in', 'is',
            'lambda', 'nonlocal', 'not', 'or', 'pass', 'raise', 'return', 'try', 'while', 'with', 'yield'],
}


def Trees(version, files):
    """(where, tree, discard) for every logical line of files that parses."""
    triple = tuple(int(p) for p in version.split('.')) + (0,)
    parser = tl.CPGenParserImpl(triple, 'Python-Grammar-%s' % version, kKeywords[version], version != '2.7')
    for path in files:
        for logical in GetLogicalsFromText(support.ReadBytes(path)):
            if logical.fKind in kSkippedKinds:
                continue
            try:
                tree = parser.ParseToNode(logical, version != '2.7' and support.InAsyncDef(logical))
            except (SyntaxError, optpgen.ParseError):
                continue
            if tree is not None:
                yield '%s:%d' % (path, logical.fFirstLine + 1), tree
                parser.DiscardNode(tree)


def ExpressionNodes(tree):
    """(node, tokens or None) for every expression node, in preorder; tokens
    are the node's leaf texts when none is a string or a parenthesis."""
    out = []

    def Visit(node):
        if node.fChildren is None:
            text = node.fText
            plain = not isinstance(node, tl.CStringLiteral) and text not in kParens
            tokens = [text] if plain else None
        else:
            tokens = []
            for child in node.fChildren:
                sub = Visit(child)
                if sub is None or tokens is None:
                    tokens = None
                else:
                    tokens.extend(sub)
        if isinstance(node, tl.CExpression):
            out.append((node, tokens))
        return tokens
    Visit(tree)
    return out


class Runner(object):

    def __init__(self, version):
        self.version = version
        self.failures = []
        self.counts = {'trees': 0, 'nodes': 0, 'round trips': 0, 'renders': 0}
        flags = list(itertools.product((False, True), repeat=3))
        self.converters = [tl.CNodeToTextConverter(*f) for f in flags if f != (True, True, True)]

    def Fail(self, where, node, what):
        if len(self.failures) < 40:
            self.failures.append('%s: %r %s' % (where, node, what))

    def Run(self, files):
        conv = tl.CNodeToTextConverter(True, True, True)
        counts = self.counts
        for where, tree in Trees(self.version, files):
            counts['trees'] += 1
            for node, tokens in ExpressionNodes(tree):
                counts['nodes'] += 1
                try:
                    text = conv.TextForNode(node)
                except Exception as exc:
                    self.Fail(where, node, 'all options: %s: %s' % (type(exc).__name__, exc))
                    continue
                if tokens is not None:
                    counts['round trips'] += 1
                    expected = tokens[0] if len(tokens) == 1 else si.JoinTokens(tokens)
                    if text != expected:
                        self.Fail(where, node, 'renders %r, tokens join to %r' % (text, expected))
                for other in self.converters:
                    counts['renders'] += 1
                    try:
                        other.TextForNode(node)
                    except Exception as exc:
                        self.Fail(where, node, '%r: %s: %s' % (other.__reduce__()[2], type(exc).__name__, exc))


class CorpusCheck(object):
    """Runs the round trip and the sweep over one standard library."""

    def Check(self, version):
        files = support.CorpusFiles(version)
        if not files:
            self.skipTest('no Python %s standard library' % version)
        runner = Runner(version)
        runner.Run(files)
        counts = dict(runner.counts)
        again = files[:20]
        gc.collect()
        before = len(gc.get_objects())
        runner.Run(again)
        gc.collect()
        grown = len(gc.get_objects()) - before
        sys.stderr.write('\n%s: %d files, %d trees, %d expression nodes, %d round trips, %d other renders\n'
                         % (version, len(files), counts['trees'], counts['nodes'], counts['round trips'],
                            counts['renders']))
        self.assertEqual(runner.failures, [])
        self.assertGreater(counts['round trips'], counts['nodes'] // 2)
        self.assertLess(grown, 50, 'objects grew by %d' % grown)


class CorpusTest(CorpusCheck, unittest.TestCase):

    def testStdlib27(self):
        self.Check('2.7')


if __name__ == '__main__':
    unittest.main()
