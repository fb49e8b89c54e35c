"""pysource.optpgen against lib2to3's parser and CPython on the 2.7 stdlib.

Also holds the token-stream helpers shared with the 3.6 corpus test and the
benchmark: logical lines are completed the way the analysis module completes
them before parsing (synthetic prefixes for a lone else/elif/except/finally,
"pass" after a trailing colon, a synthetic function after a decorator).
"""

import os
import token
import unittest

from lib2to3.pgen2 import grammar as _l2grammar
from lib2to3.pgen2 import parse as _l2parse

from pysource import config
from tests.py import support

try:
    from pysource import optpgen
    from pysource import utils
    from pysource import _fastaccess
except ImportError as _exc:  # native modules not built
    optpgen = None
    _kImportError = str(_exc)

NAME, NUMBER, NEWLINE, ENDMARKER, COLON = 1, 2, 4, 0, 11
AT, ELLIPSIS, AWAIT, ASYNC = 50, 52, 53, 54
kCommentType, kBackslashType = 202, 203
kTryKind = 11


def TokenTables():
    """The token-name and operator tables the analysis module passes."""
    names = dict(token.tok_name)
    names[51] = 'RARROW'
    names[53] = 'AWAIT'
    names[54] = 'ASYNC'
    names[56] = 'ATEQUAL'
    ops = dict(_l2grammar.opmap)
    ops['...'] = 52
    ops['->'] = 51
    ops['@='] = 56
    return names, ops


_gGrammars = {}


def GrammarFor(version):
    """Grammar object of resources/pgen-grammars/Python-Grammar-<version>,
    or lib2to3's own grammar file when the project's is missing."""
    if version not in _gGrammars:
        path = config.GetLoomFilename('resources/pgen-grammars/Python-Grammar-'
                                      + version)
        if not os.path.exists(path):
            path = os.path.join(os.path.dirname(_l2grammar.__file__), '..',
                                'Grammar.txt')
        names, ops = TokenTables()
        _gGrammars[version] = optpgen.ParserGenerator(
            path, tok_number2name=names, op_text2number=ops).make_grammar()
    return _gGrammars[version]


def _AsyncKeywords(logical):
    """Whether async and await are keywords in the logical: inside an async
    def body (the host's rule), or on the async def line itself."""
    return support.InAsyncDef(logical) or (logical.fKind == 2 and utils._StartsAsyncDef(logical))


def LogicalTokens(logical, py3_grammar):
    """(type, value, context) triples for one logical line, completed to a
    statement and ended by NEWLINE and ENDMARKER; context is the token
    index. None for comment-only and blank lines."""
    if logical.fKind in (21, 22):
        return None
    pairs = logical.fTokens
    n = len(pairs)
    async_kw = py3_grammar and _AsyncKeywords(logical)
    out = []
    add = out.append
    first = True
    decorator = False
    last_type = -1
    for i, (text, pos) in enumerate(pairs):
        tok_type = _fastaccess.GetTokenType(text)
        if first and tok_type == NAME:
            if text == 'elif':
                text = 'if'
            elif text in ('except', 'finally'):
                out.extend([(NAME, 'try', i), (COLON, ':', i), (NAME, 'pass', i),
                            (NEWLINE, '\n', i)])
            elif text == 'else':
                out.extend([(NAME, 'if', i), (NUMBER, '0', i), (COLON, ':', i),
                            (NAME, 'pass', i), (NEWLINE, '\n', i)])
            elif text == 'async' and py3_grammar and not async_kw:
                rest = [t for t, p in pairs[i + 1:]
                        if _fastaccess.GetTokenType(t) != kCommentType]
                if rest and rest[0] == 'def':
                    tok_type = ASYNC
        elif first and tok_type == AT:
            decorator = True
        if async_kw and tok_type == NAME:
            if text == 'async':
                tok_type = ASYNC
            elif text == 'await':
                tok_type = AWAIT
        if tok_type == kCommentType:
            continue
        if tok_type == kBackslashType and (i + 1 == n or
                                           pairs[i + 1][1][0] > pos[0]):
            continue
        if tok_type == ELLIPSIS and not py3_grammar:
            out.extend([(23, '.', i)] * 3)
            continue
        add((tok_type, text, i))
        first = False
        last_type = tok_type
    if logical.fKind == kTryKind:
        if last_type == COLON:
            add((NAME, 'pass', n))
        out.extend([(NEWLINE, '\n', n), (NAME, 'finally', n), (COLON, ':', n),
                    (NAME, 'pass', n)])
    elif decorator:
        out.extend([(NEWLINE, '\n', n), (NAME, 'def', n), (NAME, 'function', n),
                    (7, '(', n), (8, ')', n), (COLON, ':', n), (NAME, 'pass', n)])
    elif last_type == COLON:
        add((NAME, 'pass', n))
    out.extend([(NEWLINE, '\n', n), (ENDMARKER, None, n)])
    return out


def FileTokenStreams(path, py3_grammar):
    """Token streams of the logical lines of a file (see LogicalTokens)."""
    streams = []
    for logical in utils.GetLogicalsFromText(support.ReadBytes(path)):
        toks = LogicalTokens(logical, py3_grammar)
        if toks is not None:
            streams.append(toks)
    return streams


kCompileScript = r'''
import sys
for path in sys.stdin.read().splitlines():
    try:
        with open(path, 'rb') as f:
            compile(f.read(), path, 'exec', dont_inherit=True)
    except Exception:
        continue
    sys.stdout.write(path + '\n')
'''
kPrintFunctionFlag = 0x10000


def CompilingFiles(version, files):
    """The files CPython <version> compiles, or None without that Python.
    For 2.7, files using the print function are left out: the 2.7 grammar
    has the print statement."""
    if version != '2.7':
        out = support.RunOracle(version, kCompileScript, '\n'.join(files))
        return None if out is None else out.splitlines()
    result = []
    for path in files:
        try:
            code = compile(support.ReadBytes(path), path, 'exec', 0, True)
        except Exception:
            continue
        if not code.co_flags & kPrintFunctionFlag:
            result.append(path)
    return result


class RawNode(tuple):
    """A raw node lib2to3's pop() can set `used_names` on."""


def _RawConvert(grammar, node):
    return RawNode(node)


def ReferenceParse(parser, toks):
    """Raw tree from lib2to3's parser, or its ParseError as a tuple."""
    parser.setup()
    try:
        for t, v, c in toks:
            if parser.addtoken(t, v, c):
                break
    except _l2parse.ParseError as e:
        return ('ParseError', e.msg, e.type, e.value, e.context)
    return parser.rootnode


def NativeParse(parser, toks):
    """Tree from a native parser, or its ParseError as a tuple."""
    parser.setup()
    try:
        for t, v, c in toks:
            if parser.addtoken(t, v, c):
                break
    except optpgen.ParseError as e:
        return ('ParseError', e.msg, e.type, e.value, e.context)
    return parser.getrootnode()


def Promoted(node):
    """A raw tree with every one-child nonterminal replaced by its child."""
    children = node[3]
    if children is None:
        return node
    if len(children) == 1:
        return Promoted(children[0])
    return (node[0], node[1], node[2], [Promoted(c) for c in children])


class DifferentialMixin(object):
    """Compares the native parser with lib2to3's over a stdlib corpus."""

    kVersion = None      # stdlib and grammar version
    kPy3Grammar = None

    def setUp(self):
        if optpgen is None:
            self.skipTest('native modules not built: %s' % _kImportError)
        self.files = support.CorpusFiles(self.kVersion)
        if not self.files:
            self.skipTest('no %s standard library' % self.kVersion)
        self.grammar = GrammarFor(self.kVersion)

    def testSameTreesAndErrorsAsLib2to3(self):
        ref = _l2parse.Parser(self.grammar, _RawConvert)
        raw = optpgen.CreateParser(self.grammar, None)
        promoted = optpgen.CreateParser(self.grammar, None,
                                        promotesinglechild=True)
        lines = errors = 0
        for path in self.files:
            for toks in FileTokenStreams(path, self.kPy3Grammar):
                expected = ReferenceParse(ref, toks)
                got = NativeParse(raw, toks)
                if got != expected:
                    self.fail('%s: %r\nnative %r\nlib2to3 %r'
                              % (path, toks, got, expected))
                lines += 1
                if expected[0] == 'ParseError':
                    errors += 1
                    continue
                got = NativeParse(promoted, toks)
                if got != Promoted(expected):
                    self.fail('%s: promoted %r\n%r' % (path, toks, got))
        self.assertGreater(lines, 0)
        print('\n%s corpus: %d files, %d logical lines, %d ParseErrors'
              % (self.kVersion, len(self.files), lines, errors))


    def testEveryCompilingLineParses(self):
        files = CompilingFiles(self.kVersion, self.files)
        if files is None:
            self.skipTest('no Python %s interpreter' % self.kVersion)
        parser = optpgen.CreateParser(self.grammar, optpgen._NoOpConverter(),
                                      promotesinglechild=True)
        lines = 0
        failures = []
        for path in files:
            for toks in FileTokenStreams(path, self.kPy3Grammar):
                parser.setup()
                try:
                    for t, v, c in toks:
                        if parser.addtoken(t, v, c):
                            break
                except optpgen.ParseError as e:
                    failures.append('%s: %s at %r' % (path, e, toks))
                lines += 1
        self.assertEqual([], failures[:20])
        print('\n%s: %d compiling files of %d, %d logical lines parse'
              % (self.kVersion, len(files), len(self.files), lines))


class Corpus27Test(DifferentialMixin, unittest.TestCase):
    kVersion = '2.7'
    kPy3Grammar = False


if __name__ == '__main__':
    unittest.main()
