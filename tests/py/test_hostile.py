"""Hostile and careless callers: Python code that changes the objects native
code is reading, crafted state, deep and cyclic structures, unbounded
positions. Each ends in a clear Python exception (or is refused up front) and
leaves the objects usable; a fuzz test drives random call sequences with such
values in a child process, watched for crashes and hangs.
"""

import gc
import os
import random
import re
import logging
import select
import subprocess
import sys
import tempfile
import threading
import time
import unittest

from tests.py import support

try:
    from pysource import _fastaccess as fa
    from pysource import analysis, logicalinspect, optpgen
    from pysource import treelens as tl
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)

# Seconds the fuzz test runs, and seconds one call may take before it counts
# as a hang.
kFuzzSeconds = float(os.environ.get('TREELENS_HOSTILE_SECONDS', 20 if support.kSanitized else 60))
kCallTimeout = 60 if support.kSanitized else 20
kCallsPerChild = 1000 if support.kSanitized else 5000

kLine = [(b'x', (0, 0)), (b'=', (0, 2)), (b'1', (0, 4))]


def Record(tokens=kLine, **kw):
    return fa.CLogicalLine(list(tokens), **kw)


def Field(obj, kind):
    """The pickled field of obj holding a kind instance (or at index kind)."""
    state = obj.__reduce__()[2]
    if isinstance(kind, int):
        return state[kind]
    return [v for v in state if isinstance(v, kind)][0]


class Action(bytes):
    """A token text whose __hash__ and __eq__ run a side effect once."""

    def __new__(cls, text, effect):
        self = bytes.__new__(cls, text)
        self.effect = effect
        return self

    def _Run(self):
        effect, self.effect = self.effect, None
        if effect is not None:
            effect()

    def __hash__(self):
        self._Run()
        return bytes.__hash__(self)

    def __eq__(self, other):
        self._Run()
        return bytes.__eq__(self, other)


def Raises(test, exc, func, *args):
    """Calls func; asserts it raises exc and returns the exception."""
    try:
        func(*args)
    except exc as e:
        return e
    test.fail('%s did not raise %s' % (func, exc.__name__))


class HostileTestBase(unittest.TestCase):

    def setUp(self):
        if tl is None:
            raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)

    def assertAnalyzes(self, analyzer):
        self.assertIsNone(analyzer.AnalyzeSingleLogical(Record(), False))


class RegressionTest(HostileTestBase):

    @classmethod
    def setUpClass(cls):
        if tl is not None:
            cls.analyzer = tl.CPGenAnalyzerImpl((3, 6, 0))
            cls.parser = tl.CPGenParserImpl((3, 6, 0))

    def testStateChangedDuringParse(self):
        # Python code run mid-parse re-initialises the record, empties the
        # token list, or re-initialises the parser: the parse goes on over the
        # tokens it read first, and re-initialising a busy parser is refused.
        seen = []

        def ReinitParser():
            try:
                self.parser.__init__((3, 6, 0))
            except RuntimeError as e:
                seen.append(str(e))

        def Line(effect, tail=5):
            return [Action(b'abc', effect), b'=', b'1'] + [b'+', b'x'] * tail

        rec = Record()
        rec.__init__([(t, (0, 2 * i)) for i, t in enumerate(Line(lambda: rec.__init__([(b'q', (0, 0))])))])
        self.assertIsNone(self.analyzer.AnalyzeSingleLogical(rec, False))
        self.assertEqual(1, len(rec.fTokens))
        toks = Line(lambda: toks.__delitem__(slice(None)))
        self.assertIsInstance(self.parser.ParseTokenListToNode(toks, False), tl.CExprStmt)
        self.assertEqual([], toks)
        self.assertIsInstance(self.parser.ParseTokenListToNode(Line(ReinitParser), False), tl.CExprStmt)
        self.assertEqual(1, len(seen))
        self.assertIn('busy', seen[0])
        # The analyzer itself re-initialised mid-analysis keeps its old parser alive.
        analyzer = tl.CPGenAnalyzerImpl((3, 6, 0))
        rec = Record([(t, (0, 2 * i)) for i, t in enumerate(Line(lambda: analyzer.__init__((3, 6, 0))))])
        self.assertIsNone(analyzer.AnalyzeSingleLogical(rec, False))
        self.assertAnalyzes(analyzer)
        self.assertAnalyzes(self.analyzer)
        self.assertIsInstance(self.parser.ParseTokenListToNode([b'y', b'=', b'2'], False), tl.CExprStmt)

    def testConverterEmptiesFedTokens(self):
        grammar = Field(self.parser, 5)  # _fGrammar
        tokens = [(1, b'x', 0), (22, b'=', 1), (2, b'1', 2), (4, b'\n', 3), (0, b'', 4)]

        class Converter(object):
            def convert(self, gram, type_, value, context, children):
                del fed[:]
                gc.collect()
                return (type_, value, context, children)

        parser = optpgen.Parser(grammar, Converter())
        fed = list(tokens)
        self.assertFalse(optpgen._FeedTokens(parser, fed))
        fed = list(tokens)
        parser2 = optpgen.Parser(grammar)
        self.assertTrue(optpgen._FeedTokens(parser2, fed))
        self.assertEqual(grammar.start, parser2.getrootnode()[0])

    def testEngineAfterFailedSetup(self):
        grammar = Field(self.parser, 5)
        parser = optpgen.Parser(grammar)
        for start in (1, -1, 2 ** 40, 255):
            parser.setup()
            parser.addtoken(1, b'x', 0)
            e = Raises(self, ValueError, parser.setup, start)
            self.assertEqual('Unknown start symbol: %d' % start, str(e))
            Raises(self, RuntimeError, parser.addtoken, 4, b'\n', 1)
            self.assertIsNone(parser.getrootnode())
        parser.setup()
        results = [parser.addtoken(*t) for t in [(1, b'x', 0), (4, b'\n', 1), (0, b'', 2)]]
        self.assertEqual([False, False, True], results)

    def testGrammarsThatWouldLoop(self):
        class Grammar(object):
            labels = [(0, 'EMPTY'), (4, None), (256, None), (257, None)]
            dfas = {256: ([[(3, 0), (0, 0)]], {1: 1}), 257: ([[(0, 0)]], {1: 1})}
            start, tokens, keywords = 256, {4: 1}, {}
        sound = ([[(1, 1)], [(0, 1)]], {1: 1})
        cases = [
            ('first set disagrees with the arcs of symbol 256', {}),
            ('left-recursive symbol 256', {'dfas': {256: ([[(2, 1)], [(0, 1)]], {1: 1}), 257: sound}}),
            ('first set disagrees with the arcs of symbol 256',
             {'dfas': {256: ([[(1, 1)], [(0, 1)]], {}), 257: sound}}),
        ]
        for message, attrs in cases:
            g = Grammar()
            for k, v in attrs.items():
                setattr(g, k, v)
            e = Raises(self, ValueError, optpgen.Parser, g)
            self.assertEqual('Invalid grammar object: ' + message, str(e))
        # The sound version of the same grammar parses.
        g = Grammar()
        g.dfas = {256: ([[(3, 0), (0, 0)]], {1: 1}), 257: sound}
        parser = optpgen.Parser(g)
        parser.setup()
        self.assertFalse(parser.addtoken(4, b'\n', 0))

    def testGrammarChangedWhileRead(self):
        # An item whose iteration empties the labels list being read.
        class Pair(object):
            def __iter__(self):
                del labels[:]
                return iter((4, None))
        grammar = Field(self.parser, 5)

        class Grammar(object):
            pass
        g = Grammar()
        for name in ('dfas', 'start', 'tokens', 'keywords'):
            setattr(g, name, getattr(grammar, name))
        labels = list(grammar.labels)
        labels[1] = Pair()
        g.labels = labels
        self.assertIsNotNone(optpgen.Parser(g))

    def testStoredTypesChecked(self):
        factory = Field(self.parser, tl.CNodeFactory)
        info = Field(factory, 0)[1]  # NAME
        cases = [
            (self.parser.convert, (None, 300, None, 0, (1, 2)), 'Expected list, got tuple'),
            (factory.NewNode, (info, 300, None, 0, 12345678), 'Expected list, got int'),
            (factory.NewNode, (info, 1, 7, 0, None), 'Expected bytes, got int'),
            (factory.ConvertSingleNode, (1, [b'x'], 0, None), 'Expected bytes, got list'),
        ]
        for func, args, message in cases:
            e = Raises(self, TypeError, func, *args)
            self.assertEqual(message, str(e))
        node = factory.NewNode(info, 1, b'x', 0, None)
        self.assertIsNone(node.GetChild(0))
        self.parser.DiscardNode(node)
        self.assertIsInstance(self.parser.ParseTokenListToNode([b'x', b'=', b'1'], False), tl.CExprStmt)

    def testCraftedPickles(self):
        info = tl.CNodeClassInfo(tl.CNode, 1, b'NAME')
        factory = tl.CNodeFactory.__new__(tl.CNodeFactory)
        e = Raises(self, TypeError, factory.__setstate__, (['a', 'b'], None, {}))
        self.assertIn('in _fClassInfoList', str(e))
        self.assertEqual(0, factory._FreeNodeCount())
        # A list changed after it was stored is checked where it is read.
        items = [info]
        factory.__setstate__((items, None, {}))
        items.append('a')
        Raises(self, TypeError, factory._FreeNodeCount)
        # Cycles: a parameter that is its own nested list, a node that is its
        # own last child, a free list that points back at its head.
        paren = tl.CNode(None)
        paren.__setstate__((None, None, 0, None, b'('))
        param = tl.CFunctionParameterDef.__new__(tl.CFunctionParameterDef)
        param.__setstate__(([paren, param, paren], None, None, None, None))
        node = tl.CNode(None)
        node.__setstate__(([node], None, 3, None, None))
        atom = tl.CAtom(None)
        atom.__setstate__(([paren, atom, paren], None, 3, None, None))
        for func, arg in [(tl.GetDefiningArgInfoList, param), (tl.GetTokenEndIndex, node),
                          (tl.DropSimpleParens, atom)]:
            e = Raises(self, RuntimeError, func, arg)
            self.assertIn('maximum recursion depth exceeded', str(e))
        leaf = tl.CNode(info)
        leaf.__setstate__((None, info, 0, leaf, None))
        info.__setstate__((tl.CNode, leaf, b'NAME', 1))
        factory.__setstate__(([info], None, {}))
        e = Raises(self, ValueError, factory._FreeNodeCount)
        self.assertEqual('the free list of state 1 is cyclic', str(e))
        info.__init__(tl.CNode, 1, b'NAME')  # drains the list
        self.assertEqual(0, factory._FreeNodeCount())
        # A failed __setstate__ changes nothing.
        node2 = tl.CNode(info)
        Raises(self, TypeError, node2.__setstate__, (None, info, 5, None, 12))
        self.assertIs(info, node2.fClsInfo)
        self.assertIsNone(node2.fContext)

    def testDeepRawTree(self):
        factory = Field(self.parser, tl.CNodeFactory)
        old = sys.getrecursionlimit()
        sys.setrecursionlimit(10 ** 6)
        try:
            raw = (1, b'x', 0, None)
            for _ in range(100000):
                raw = (300, None, 0, [raw, (1, b'y', 0, None)])
            e = Raises(self, RuntimeError, factory.RecursiveConvert, raw)
            self.assertEqual('maximum recursion depth exceeded while converting a raw tree', str(e))
            del raw
        finally:
            sys.setrecursionlimit(old)
        raw = (1, b'x', 0, None)
        for _ in range(1000):
            raw = (300, None, 0, [raw, (1, b'y', 0, None)])
        self.assertIsInstance(factory.RecursiveConvert(raw), tl.CNode)

    def testExtremeIndexes(self):
        # Index arithmetic saturates (the sanitizer build checks for overflow).
        tree = self.parser.ParseTokenListToNode(
            [b'x', b'=', b'[', b'a', b',', b'b', b']', b',', b'(', b'c', b',', b')', b'=', b'd'], False)
        nodes, stack = [], [tree]
        while stack:
            nodes.append(stack.pop())
            stack.extend(nodes[-1].fChildren or [])
        calls = 0
        for node in nodes:
            for name in _NativeCallables(node):
                if not name.startswith('Get') or name in ('GetChildCount', 'GetStateName'):
                    continue
                for index in (2 ** 63 - 1, -2 ** 63, 2 ** 62, -2 ** 62 - 1):
                    try:
                        getattr(node, name)(index)
                        calls += 1
                    except (TypeError, ValueError, IndexError, OverflowError):
                        calls += 1
        self.assertGreater(calls, 50)
        self.assertIsInstance(self.parser.ParseTokenListToNode([b'y', b'=', b'2'], False), tl.CExprStmt)

    def testSyntaxErrorTextBounded(self):
        cases = [
            ([(b'x', (-10 ** 8, 0)), (b'y', (10 ** 8, 5))], b'x y'),
            ([(b'x', (-2 ** 31, -2 ** 31)), (b')', (2 ** 31 - 1, 2 ** 31 - 1))], b'x )'),
            ([(b'x', (0, 0)), (b')', (0, 2 ** 31 - 1))], b'x )'),
        ]
        for tokens, line_text in cases:
            rec = Record(tokens, line_text=line_text)
            error = self.analyzer.AnalyzeSingleLogical(rec, False)
            self.assertIsInstance(error, SyntaxError, tokens)
            self.assertLess(len(error.text), logicalinspect.kSlack + 100, tokens)
            self.assertEqual(error.text, logicalinspect.TextFromTokens(rec))
        # Real layouts keep their blanks.
        self.assertEqual(b'f(a,\n      b)', logicalinspect.TextFromTokens(
            Record([(b'f', (0, 0)), (b'(', (0, 1)), (b'a', (0, 2)), (b',', (0, 3)),
                    (b'b', (1, 6)), (b')', (1, 7))], line_text=b'f(a,\n      b)')))
        self.assertAnalyzes(self.analyzer)


# ---- The hostile-caller fuzz test ----

kDunders = frozenset(['__init__', '__setstate__', '__reduce__', '__repr__', '__len__', '__getitem__',
                      '__iter__', '__call__', '__eq__', '__hash__', '__nonzero__'])


# An argument count named by a TypeError or a __setstate__ ValueError.
kArityMessage = re.compile(r'(?:exactly|takes|needs|expected|at most) (\d+) (?:positional )?(?:arg|values)')


class _Captured(logging.Handler):
    def __init__(self):
        logging.Handler.__init__(self)
        self.records = []

    def emit(self, record):
        self.records.append(record)


def RemoveTree(top):
    """Removes a folder tree without recursion (it may be deeper than the stack)
    and without a child process (a fork right after threads ran may hang)."""
    stack = [top]
    while stack:
        path = stack[-1]
        entries = [os.path.join(path, n) for n in os.listdir(path)]
        folders = [e for e in entries if os.path.isdir(e) and not os.path.islink(e)]
        if folders:
            stack.extend(folders)
            continue
        for entry in entries:
            os.remove(entry)
        os.rmdir(stack.pop())


class ApiTest(HostileTestBase):
    """The analysis API under threads, a failing analyzer, and folders that
    hold what is not a source file."""

    def setUp(self):
        HostileTestBase.setUp(self)
        self.tmp = tempfile.mkdtemp()

    def tearDown(self):
        RemoveTree(self.tmp)

    def testThreadsGetTheSingleThreadedResult(self):
        text = b''.join(b'def f%d(a, b=x%d):\n    y = a + b\n    return [z for z in y]\n'
                        b'class C%d(B): pass\nq = = 1\n' % (i, i, i) for i in range(20))
        wanted = analysis.AnalyzeText(text, '3.6').Lines()
        got = []

        def Run():
            for _ in range(4):
                got.append(analysis.AnalyzeText(text, '3.6').Lines() == wanted)

        def Yield(frame, event, arg):
            # Hand the interpreter to another thread whenever the analyzer
            # calls back into Python code (the parse error of 'q = = 1').
            if event == 'call' and frame.f_globals.get('__name__') in ('pysource.optpgen',
                                                                     'pysource.logicalinspect'):
                time.sleep(0.0001)
        threading.setprofile(Yield)
        try:
            threads = [threading.Thread(target=Run) for _ in range(4)]
            for thread in threads:
                thread.start()
            for thread in threads:
                thread.join()
        finally:
            threading.setprofile(None)
        self.assertEqual(got, [True] * 16)

    def testAnalyzerFailureIsNeverACleanLine(self):
        # The native analyzer reports a failure and returns None; the API must
        # not take that for a line with no error and nothing recorded.
        def Fail(logical):
            raise RuntimeError('host failed')
        handler = _Captured()
        logger = logging.getLogger('pysource')
        logger.addHandler(handler)
        saved, logicalinspect.TextFromTokens = logicalinspect.TextFromTokens, Fail
        path = os.path.join(self.tmp, 'bad.py')
        with open(path, 'wb') as f:
            f.write(b'x = 1\ny = = 1\n')
        try:
            e = Raises(self, analysis.AnalysisFailure, analysis.AnalyzeText, b'x = 1\ny = = 1\n', '3.6')
            self.assertIn('line 2', str(e))
            self.assertIn('host failed', str(e))
            result = analysis.AnalyzeFile(path, '3.6')
            self.assertEqual((result.status, result.logicals), (analysis.kFailed, []))
        finally:
            logicalinspect.TextFromTokens = saved
            logger.removeHandler(handler)
        self.assertEqual(len(handler.records), 2)      # reported all the same
        self.assertEqual(analysis.AnalyzeFile(path, '3.6').SyntaxErrors(), [(2, 5, 'invalid syntax')])

    def testOnlyRegularFilesBoundedInSizeAreRead(self):
        os.mkfifo(os.path.join(self.tmp, 'fifo.py'))
        os.symlink('/dev/zero', os.path.join(self.tmp, 'zero.py'))
        with open(os.path.join(self.tmp, 'sparse.py'), 'wb') as f:
            f.truncate(analysis.kMaxSourceBytes + 1)
        with open(os.path.join(self.tmp, 'ok.py'), 'wb') as f:
            f.write(b'x = 1\n')
        # (These would block forever, or read without bound, if opened plainly.)
        got = [(os.path.basename(r.path), r.status, r.problem)
               for r in analysis.AnalyzeFolder(self.tmp, follow_links=True)]
        self.assertEqual(got, [
            ('fifo.py', analysis.kUnreadable, 'cannot read: not a regular file (a FIFO)'),
            ('ok.py', analysis.kOk, None),
            ('sparse.py', analysis.kUnreadable,
             'too large: %d bytes or more (the limit is %d bytes)'
             % (analysis.kMaxSourceBytes + 1, analysis.kMaxSourceBytes)),
            ('zero.py', analysis.kUnreadable,
             'cannot read: not a regular file (a character device)')])

    def testDeepTreesAndAnyNames(self):
        deep = os.path.join(self.tmp, 'deep')
        os.mkdir(deep)
        fd = os.open(deep, os.O_RDONLY)
        cwd = os.getcwd()
        try:
            os.chdir(deep)
            for _ in range(1100):           # deeper than the interpreter's recursion
                os.mkdir('d')
                os.chdir('d')
            with open('x.py', 'wb') as f:
                f.write(b'x = 1\n')
        finally:
            os.chdir(cwd)
            os.close(fd)
        with open(os.path.join(self.tmp, b'\xff\n.py'), 'wb') as f:
            f.write(b'y = 2\n')
        got = [(r.path, r.status) for r in analysis.AnalyzeFolder(self.tmp.decode('ascii'))]
        self.assertEqual(got, [(os.path.join(self.tmp.decode('ascii'), u'deep', *[u'd'] * 1100)
                                + u'/x.py', analysis.kOk),
                               (os.path.join(self.tmp, b'\xff\n.py'), analysis.kOk)])
        self.assertEqual(map(type, [p for p, _ in got]), [unicode, bytes])

    def testSymlinksStayWithinTheFoldersGiven(self):
        inside, outside = os.path.join(self.tmp, 'in'), os.path.join(self.tmp, 'out')
        os.makedirs(os.path.join(inside, 'sub'))
        os.mkdir(outside)
        with open(os.path.join(outside, 'secret.py'), 'wb') as f:
            f.write(b'password = "x"\n')
        with open(os.path.join(inside, 'sub', 'm.py'), 'wb') as f:
            f.write(b'm = 1\n')
        os.symlink(os.path.join(outside, 'secret.py'), os.path.join(inside, 'a.py'))
        os.symlink(outside, os.path.join(inside, 'b'))
        os.symlink(os.path.join(inside, 'sub', 'm.py'), os.path.join(inside, 'c.py'))
        os.symlink('sub', os.path.join(inside, 'd'))
        note = 'symlink to outside the folders searched, not followed'
        for follow, wanted in (
                (False, [('a.py', analysis.kSkipped, note), ('b', analysis.kSkipped, note),
                         ('c.py', analysis.kOk, None), ('d/m.py', analysis.kOk, None)]),
                (True, [('a.py', analysis.kOk, None), ('b/secret.py', analysis.kOk, None),
                        ('c.py', analysis.kOk, None), ('d/m.py', analysis.kOk, None)])):
            got = [(os.path.relpath(r.path, inside), r.status, r.problem)
                   for r in analysis.AnalyzeFolder(inside, follow_links=follow)]
            self.assertEqual(got, wanted, follow)
        # Both folders given: a link from one into the other is within them.
        self.assertEqual([(os.path.relpath(p, self.tmp), s) for p, s, _ in
                          analysis.IterSourcePaths([inside, outside])][:2],
                         [('in/a.py', analysis.kOk), ('in/b/secret.py', analysis.kOk)])


def _NativeCallables(obj):
    """Names of the native methods and functions of a module or object."""
    names = []
    for name in sorted(dir(obj)):
        if name.startswith('__') and name not in kDunders:
            continue
        try:
            value = getattr(obj, name)
        except Exception:
            continue
        if type(value).__name__ in ('builtin_function_or_method', 'method-wrapper') or name == '__init__':
            names.append(name)
    return names


class _World(object):
    """The objects of one fuzz run and the pool of hostile values."""

    def __init__(self, rnd):
        from pysource import utils
        self.rnd = rnd
        self.busy = False
        self.arity = {}  # (type name, method) -> argument count
        self.succeeded = 0
        self.analyzers = [tl.CPGenAnalyzerImpl((3, 6, 0)),
                          tl.CPGenAnalyzerImpl((2, 7, 0), tl.kPy2DefaultGrammar, None, False)]
        self.parsers = [Field(self.analyzers[0], tl.CPGenParserImpl),
                        tl.CPGenParserImpl((3, 5, 0), 'Python-Grammar-3.5')]
        self.grammar = Field(self.parsers[0], 5)
        self.factories = [Field(self.parsers[0], tl.CNodeFactory)]
        self.infos = list(Field(self.factories[0], 0)[:40])
        source = (b'import os\nclass A(B, metaclass=M):\n  def f(self, a, (b, c)=1, *d, **e) -> x:\n'
                  b'    return [x for x in y if x], {a: b}, (1,), f(*a, k=2)\n@dec\nasync def g(): await z\n'
                  b'from . import (a as b, c)\nx: int = lambda q: q.r[1:2] ** -3\n')
        self.records = list(utils.GetLogicalsFromText(source))
        self.records += [Record([(b'(', (2 ** 31 - 1, -5)), (b'\\', (-1, 0))]), Record([])]
        self.nodes = []
        for toks in ([b'x', b'=', b'(', b'a', b',', b'b', b')'], [b'def', b'f', b'(', b'a', b',', b'*', b'b',
                     b',', b'c', b'=', b'1', b')', b':'], [b'f', b'(', b'*', b'a', b',', b'k', b'=', b'1', b')']):
            self._Collect(self.parsers[0].ParseTokenListToNode(toks, False))
        self.nodes += self._HostileNodes()
        self.engines = [optpgen.Parser(self.grammar), optpgen.Parser(self.grammar, self._Converter(self)),
                        optpgen.Parser(self.grammar, self.parsers[1], True)]
        self.lists = [[b'x', b'=', b'1'], [(1, b'x', 0), (4, b'\n', 1), (0, b'', 2)], []]
        cycle = []
        cycle.append(cycle)
        world = self

        class HostileList(list):
            def __iter__(self):
                world.Mischief()
                return list.__iter__(self)

            def __len__(self):
                world.Mischief()
                return list.__len__(self)
        self.lists.append(HostileList([b'x', b'=', b'(', b'1', b')']))
        self.lists.append(HostileList([(1, b'x', 0), (22, b'=', 1), (2, b'1', 2), (4, b'\n', 3)]))
        self.scalars = [None, True, 0, 1, -1, 255, 256, 300, 2 ** 31 - 1, 2 ** 31, -2 ** 31 - 1, 2 ** 63,
                        -2 ** 63, 2 ** 100, 1.5, b'', b'x', b'(', b'\\', b'#c', b'\n', b'def', u'\xe9',
                        cycle, {}, {1: 2}, (), (1, b'x', 0, None), (300, None, 0, [(1, b'x', 0, None)] * 2),
                        object(), tl.CNode, tl.CAtom, type, len]
        self.targets = [fa, tl, optpgen]
        # Walkers: the analyzer's own, fresh ones, and one whose handler makes mischief mid-walk.
        self.walkers = [self.analyzers[0]._fNodeWalker, tl.CNodeWalker(), self.analyzers[1]._fTypeHintWalker,
                        tl.CDispatchWalker({tl.CNameLiteral: lambda w, n: self.Mischief() or True})]

    def _Collect(self, node):
        stack, seen = [node], set()  # trees made from crafted children may be cyclic
        while stack and len(self.nodes) < 400:
            n = stack.pop()
            if isinstance(n, tl.CNode) and id(n) not in seen:
                seen.add(id(n))
                self.nodes.append(n)
                stack.extend(n.fChildren or [])

    def _HostileNodes(self):
        """Python subclasses of node classes whose accessors misbehave."""
        world = self

        def Misbehave(values):
            def Method(self, *args):
                world.Mischief()
                return world.rnd.choice(values + [world.Value()])
            return Method
        counts = [0, 1, 3, -1, 2 ** 62, -2 ** 63, 2 ** 63 - 1, 'x']
        found = []
        for base in (tl.CNode, tl.CExpression, tl.CAtom, tl.CTestListStarExpr, tl.CListmakerNode,
                     tl.CFunctionParameterDef, tl.CExceptClause, tl.CFromImportStmt):
            try:
                cls = type('Hostile' + base.__name__, (base,), {
                    'GetChildCount': Misbehave(counts), 'GetSubExprCount': Misbehave(counts),
                    'GetChild': Misbehave([None]), 'GetSubExpr': Misbehave([None]),
                    'GetChildText': Misbehave([b'(', b',', b'as', None])})
            except TypeError:  # a final class
                continue
            node = cls(self.rnd.choice(self.infos))
            node.__setstate__((self.rnd.sample(self.nodes, 3), self.rnd.choice(self.infos), 0, None, None))
            found.append(node)
        return found

    class _Converter(object):
        def __init__(self, world):
            self.world = world

        def convert(self, gram, type_, value, context, children):
            self.world.Mischief()
            if self.world.rnd.random() < 0.1:
                return self.world.Value()
            return (type_, value, context, children)

    def Objects(self):
        return (self.analyzers + self.parsers + self.factories + self.infos + self.records +
                self.nodes + self.engines + self.lists)

    def Mischief(self):
        """Changes some object, as Python code run from native code might."""
        if self.busy or self.rnd.random() < 0.3:
            return
        self.busy = True
        rnd = self.rnd
        try:
            which = rnd.randrange(7)
            if which == 0:
                rnd.choice(self.records).__init__([(self.Text(), (rnd.randrange(3), rnd.randrange(9)))
                                                   for _ in range(rnd.randrange(4))])
            elif which == 1:
                del rnd.choice(self.lists)[:]
            elif which == 2:
                rnd.choice(self.parsers).__init__((3, 6, 0))
            elif which == 3:
                rnd.choice(self.analyzers).__init__((3, 6, 0))
            elif which == 4:
                rnd.choice(self.nodes).__setstate__(self.Tuple(5))
            elif which == 5:
                rnd.choice(self.infos).__setstate__(self.Tuple(4))
            else:
                gc.collect()
        except Exception:
            pass
        finally:
            self.busy = False

    def Text(self):
        texts = [b'x', b'def', b'(', b')', b':', b'=', b'\\', b'#', b'async', b'else', b'**', b'1']
        text = self.rnd.choice(texts)
        return Action(text, self.Mischief) if self.rnd.random() < 0.3 else text

    def Tuple(self, n):
        return tuple(self.Value() for _ in range(n))

    def Value(self, depth=0):
        rnd = self.rnd
        kind = rnd.randrange(10)
        if kind < 3:
            return rnd.choice(self.scalars)
        if kind < 6:
            return rnd.choice(self.Objects())
        if kind == 6:
            return self.Text()
        if kind == 7 and depth < 2:
            return [self.Value(depth + 1) for _ in range(rnd.randrange(4))]
        if kind == 8 and depth < 2:
            return self.Tuple(rnd.randrange(14)) if depth else (self.Text(), (rnd.choice(self.scalars), 0))
        return [(self.Text(), (rnd.randrange(-2, 3), rnd.randrange(9))) for _ in range(rnd.randrange(5))]

    def Raw(self, depth=0):
        rnd = self.rnd
        if depth > 3 or rnd.random() < 0.4:
            return (rnd.choice([1, 2, 3, 4, 7, 8, 11, 22]), self.Text(), rnd.randrange(9), None)
        return (rnd.randrange(256, 340), None, rnd.randrange(9),
                [self.Raw(depth + 1) for _ in range(rnd.randrange(4))])

    def Plausible(self, name, key):
        """Arguments of the right shape for the main operations, or None."""
        rnd = self.rnd
        node = lambda: rnd.choice(self.nodes)
        kids = lambda: rnd.choice([None, [node() for _ in range(rnd.randrange(4))]])
        texts = lambda: [self.Text() for _ in range(rnd.randrange(8))]
        text = lambda: rnd.choice([None, self.Text()])
        shapes = {
            'AnalyzeSingleLogical': lambda: (rnd.choice(self.records), rnd.random() < 0.5),
            'ParseToNode': lambda: (rnd.choice(self.records), rnd.random() < 0.5),
            '_InspectSingleLogical': lambda: (rnd.choice(self.records), False, rnd.random() < 0.5),
            'ParseTokenListToNode': lambda: (texts(), rnd.random() < 0.5),
            '_AddTokenList': lambda: (texts(), rnd.randrange(9)),
            'addtoken': lambda: (rnd.choice([0, 1, 2, 4, 7, 8, 11, 22, 300]), self.Text(), rnd.randrange(9)),
            'setup': lambda: (rnd.choice([None, self.grammar.start, 257, 1, -1]),),
            'NewNode': lambda: (rnd.choice(self.infos), rnd.randrange(300), text(), 0, kids()),
            'ConvertSingleNode': lambda: (rnd.randrange(340), text(), 0, kids()),
            'convert': lambda: (self.grammar, rnd.randrange(340), text(), 0, kids()),
            'RecursiveConvert': lambda: (self.Raw(),),
            'DiscardNodes': lambda: (node(),),
            'DiscardNode': lambda: (node(),),
            '_FeedTokens': lambda: (rnd.choice(self.engines), [(rnd.choice([1, 2, 4, 0, 22]), self.Text(), i)
                                                               for i in range(rnd.randrange(6))]),
            '__setstate__': lambda: (self.Tuple(self.arity.get(key, rnd.randrange(14))),),
            'CreateSyntaxError': lambda: ('invalid syntax', rnd.choice(self.records), rnd.randrange(-3, 6)),
        }
        shape = shapes.get(name)
        if shape is not None:
            return list(shape())
        if name[:1].isupper() and rnd.random() < 0.7:
            # The module's node functions and node methods take nodes and indexes.
            return [node() if rnd.random() < 0.7 else rnd.randrange(-2, 4)
                    for _ in range(self.arity.get(key, 1))]
        return None

    def Call(self, log):
        rnd = self.rnd
        kinds = [self.analyzers, self.parsers, self.factories, self.infos, self.records, self.nodes,
                 self.engines, self.walkers, self.targets, self.targets]
        target = rnd.choice(rnd.choice(kinds))
        names = _NativeCallables(target)
        if not names:
            return
        plain = [n for n in names if not n.startswith('__')]
        name = rnd.choice(plain if plain and rnd.random() < 0.8 else names)
        key = (type(target).__name__, name)
        args = self.Plausible(name, key) if rnd.random() < 0.7 else None
        if args is None:
            args = [self.Value() for _ in range(self.arity.get(key, rnd.randrange(6)))]

        log('%s.%s(%s)' % (getattr(target, '__name__', type(target).__name__), name,
                           ', '.join(type(a).__name__ for a in args)))
        try:
            result = getattr(target, name)(*args)
        except (TypeError, ValueError) as e:
            # Learn the arity the message names, for the next calls.
            found = kArityMessage.search(str(e).replace('no arg', '0 arg').replace('one arg', '1 arg'))
            if found and rnd.random() < 0.8:
                self.arity[key] = int(found.group(1))
            return
        except Exception:
            return
        self.succeeded += 1
        if isinstance(result, tl.CNode) and len(self.nodes) < 400:
            self._Collect(result)


def _RunChild(seed, calls):
    rnd = random.Random(seed)
    world = _World(rnd)
    out = sys.stdout

    def Log(text):
        out.write(text + '\n')
        out.flush()

    for i in range(calls):
        world.Call(Log)
    # A fresh analyzer works after all that.
    analyzer = tl.CPGenAnalyzerImpl((3, 6, 0))
    assert analyzer.AnalyzeSingleLogical(Record(), False) is None
    Log('%d calls succeeded' % world.succeeded)
    Log('DONE')


class HostileCallerFuzzTest(HostileTestBase):

    def testRandomCallSequences(self):
        deadline = time.time() + kFuzzSeconds
        seed = int(os.environ.get('TREELENS_HOSTILE_SEED', 1))
        runs = 0
        while time.time() < deadline or runs == 0:
            self._RunOne(seed + runs)
            runs += 1

    def _RunOne(self, seed):
        cmd = [sys.executable, '-m', 'tests.py.test_hostile', 'child', str(seed), str(kCallsPerChild)]
        err = tempfile.TemporaryFile()
        proc = subprocess.Popen(cmd, cwd=support.kRoot, stdout=subprocess.PIPE, stderr=err)
        last = []
        buf = b''
        try:
            while True:
                ready, _, _ = select.select([proc.stdout], [], [], kCallTimeout)
                if not ready:
                    proc.kill()
                    self.fail('seed %d: hung after\n%s' % (seed, '\n'.join(last[-20:])))
                chunk = os.read(proc.stdout.fileno(), 65536)
                if not chunk:
                    break
                buf += chunk
                lines = buf.split(b'\n')
                buf = lines.pop()
                last = (last + lines)[-40:]
        finally:
            proc.wait()
            err.seek(0)
            err = err.read()
        if proc.returncode != 0 or not last or last[-1] != b'DONE':
            self.fail('seed %d: child exited with %d after\n%s\n%s' % (
                seed, proc.returncode, '\n'.join(last[-20:]), err[-3000:]))


if __name__ == '__main__' and len(sys.argv) == 4 and sys.argv[1] == 'child':
    _RunChild(int(sys.argv[2]), int(sys.argv[3]))
