"""The symbol walker: what lines record under each grammar, the walk limits, and CDispatchWalker."""

import gc
import json
import os
import re
import StringIO
import subprocess
import sys
import unittest

from tests.py import support

try:
    from pysource import treelens as tl
    from pysource import symbolinfo as si
    from pysource import utils
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


def Record(version, source, in_async_def=False):
    """(result, defined, reads, other equivs, args, arg equivs, bases) of the line."""
    result, L = support.AnalyzeLine(version, source, in_async_def)
    reads = set(n for n, i in L.fTypeEquivs if i == si.kGetPrefix)
    symbol = lambda pairs: [(n, i) for n, i in pairs if not i.startswith(si.kTypeHintPrefix)]  # hints: test_hints
    others = [(n, i) for n, i in symbol(L.fTypeEquivs) if i != si.kGetPrefix]
    return result, L.fNamesDefined, reads, others, L.fArgNames, symbol(L.fArgTypeEquivs), L.fBaseClassNames


def Lit(kind, text=None):
    return si.BuildLiteralInfo(kind, text)


class RecordsTest(unittest.TestCase):
    """Each case: version, source, and the parts of the record it must equal (None: not checked)."""

    def check(self, version, source, defined=None, reads=None, equivs=None, args=None, arg_equivs=None,
              bases=None, in_async_def=False):
        got = Record(version, source, in_async_def)
        self.assertIsNone(got[0], (source, got[0]))
        for want, have, what in ((defined, got[1], 'defined'), (reads, got[2], 'reads'),
                                 (equivs, got[3], 'equivs'), (args, got[4], 'args'),
                                 (arg_equivs, got[5], 'arg equivs'), (bases, got[6], 'bases')):
            if want is not None:
                self.assertEqual(want, set(have) if isinstance(want, set) else have,
                                 '%s under %s: %s' % (source, version, what))

    def testAssignments(self):
        for v in ('2.7', '3.6'):
            self.check(v, b'x = 1\n', [b'x'], set(), [(b'x', Lit(b'int', b'1'))])
            self.check(v, b'a.b = c\n', [b'a.b'], {b'a', b'c'}, [(b'a.b', b'c')])
            self.check(v, b'a[i] = 1\n', [], {b'a', b'i'}, [(b'a[i]', Lit(b'int', b'1'))])
            self.check(v, b'a, b = f()\n', [b'a', b'b'], {b'f'}, [(b'f', si.kCalledPrefix + b'()')][:0])
            self.check(v, b'a = b = g(1)\n', [b'a', b'b'], {b'g'})
            self.check(v, b'x += y\n', [], {b'y'}, [])
            self.check(v, b'(a) = 1\n', [b'a'])                       # parenthesized target
            self.check(v, b'f(x).y = 1\n', [b'f(x).y'], {b'f', b'x'})   # call arguments in a target are read
            self.check(v, b'(p or q)[k] = 1\n', [], {b'p', b'q', b'k'})
            self.check(v, b'[y for y in z if y]\n', [], {b'y', b'z'}, [(b'y', si.kWithinExprPrefix + b'3')])
        self.check('3.6', b'a, *b = 1, 2, 3\n', [b'a', b'b'], set(),
                   [(b'a', Lit(b'int', b'1')), (b'b', tl.kListInstanceName)])
        self.check('3.6', b'x: int\n', [], {b'int'}, [])
        self.check('3.6', b'x: int = y\n', [b'x'], {b'int', b'y'}, [(b'x', b'y')])
        # Two bindings of one name in one line: two infos, each with its token index.
        self.check('3.6', b'[a for a in b for a in c]\n', equivs=[(b'a', si.kWithinExprPrefix + b'3'),
                                                              (b'a', si.kWithinExprPrefix + b'7')])

    def testAugmentedAssignmentFollowsTheMimicFlag(self):
        self.check('3.6', b'x += y\n', [], {b'y'})
        tl.kMimicAstInspectBugs = False
        try:
            self.check('3.6', b'x += y\n', [], {b'x', b'y'})
        finally:
            tl.kMimicAstInspectBugs = True

    def testTypeEquivalences(self):
        cases = [(b'[1]', tl.kListInstanceName), (b'{1, 2}', Lit(b'set', b'{1, 2}')),
                 (b'{}', Lit(b'dict', b'{}')), (b'(1, 2)', tl.kTupleInstanceName),
                 (b'1, 2', tl.kTupleInstanceName), (b'(y)', b'y'), (b'-1', tl.kLiteralPrefix + b'int:'),
                 (b'-1.5', tl.kLiteralPrefix + b'float:'), (b'None', tl.kLiteralPrefix + b'None: None'),
                 (b'True', tl.kLiteralPrefix + b'bool: True'), (b"'a' 'b'", tl.kStringInstanceName),
                 (b"u'a b'", tl.kUnicodeInstanceName + b' ' + si.EncodeStringLiteral(b"u'a b'")),
                 (b'a.b[c]', b'a.b[c]'), (b'a ** 2', None), (b'0x1e', Lit(b'int', b'0x1e'))]
        for value, info in cases:
            equivs = [(b'x', info)] if info is not None else []
            self.check('3.6', b'x = ' + value + b'\n', [b'x'], equivs=equivs)

    def testForAndWith(self):
        for v in ('2.7', '3.6'):
            self.check(v, b'for q in items: pass\n', [b'q'], {b'items'}, [(b'q', b'items' + si.kIterationSubscript)])
            self.check(v, b'for q in [1, 2]: pass\n', [b'q'], set(), [])
            self.check(v, b'for i, j in enumerate(k): pass\n', [b'i', b'j'], {b'enumerate', b'k'})
            self.check(v, b'with open(path) as self.f: pass\n', [b'self.f'], {b'open', b'path', b'self'},
                       [(b'self.f', b'open(path)'), (b'open', si.kCalledPrefix + b'(path)')])
            self.check(v, b'with lock: pass\n', [], {b'lock'})
        self.check('3.6', b'with a as (b, c), d as e: pass\n', [b'b', b'c', b'e'], {b'a', b'd'})

    def testImports(self):
        for v in ('2.7', '3.6'):
            imp = si.kImportPrefix
            self.check(v, b'import os, os.path\n', [b'os', b'os'], set(), [(b'os', imp + b'os')] * 2)
            self.check(v, b'import a.b as c\n', [b'c'], set(),
                       [(b'c', imp + b'a.b'), (b'c', si.kImportAsNamePrefix + b'c')])
            self.check(v, b'from p.q import r as s, t\n', [b's', b't'], set(),
                       [(b's', si.kFromImportPrefix + b'p.q r'), (b's', si.kImportAsNamePrefix + b's'),
                        (b't', si.kFromImportPrefix + b'p.q t')])
            self.check(v, b'from . import x\n', [b'x'], set(), [(b'x', si.kFromImportPrefix + b'. x')])
            self.check(v, b'from m import *\n', [], set(), [(b'*', si.kFromImportPrefix + b'm *')])

    def testDefinitions(self):
        tup, dic = tl.kTupleInstanceName, tl.kDictInstanceName
        self.check('3.6', b'def f(a, b=1, *args, **kw): pass\n', [], set(), [], [b'a', b'b', b'args', b'kw'],
                   [(b'b', Lit(b'int', b'1')), (b'args', tup), (b'kw', dic)])
        self.check('3.6', b'def f(x: int = g()) -> str: pass\n', [], {b'g', b'int', b'str'}, None, [b'x'],
                   [(b'x', b'g()')])
        self.check('3.6', b'def f(a, *, b=z, **kw): return q\n', reads={b'z'}, args=[b'a', b'b', b'kw'])
        self.check('2.7', b'def f(a, (b, c), d=None): pass\n', args=[b'a', b'b', b'c', b'd'],
                   arg_equivs=[(b'd', tl.kLiteralPrefix + b'None: None')])
        self.check('3.6', b'f = lambda x, y=z: x\n', [b'f'], {b'x', b'z'},
                   [(b'x', si.kWithinExprPrefix + b'3'), (b'y', si.kWithinExprPrefix + b'5')])
        self.check('2.7', b'f = lambda (a, b): a\n', [b'f'], {b'a'})
        self.check('3.6', b'class C(Base, m.Mixin, metaclass=M): pass\n', [], set(), [], bases=[b'Base', b'm.Mixin'])
        self.check('3.6', b'class C(*bases): pass\n', bases=[])  # a starred sequence is no base class
        self.check('3.6', b'global a, b\n', [], set(), [(b'a', si.kGlobalPrefix), (b'b', si.kGlobalPrefix)])
        self.check('3.6', b'nonlocal a\n', [], set(), [(b'a', si.kNonlocalPrefix)])
        self.check('3.6', b'@dec.x(1)\n', [], {b'dec', b'dec.x'}, [(b'dec.x', si.kCalledPrefix + b'(1)')])

    def testReturnAndYield(self):
        self.check('3.6', b'return\n', equivs=[])
        self.check('3.6', b'return a, b\n', reads={b'a', b'b'}, equivs=[])
        self.check('3.6', b'return 1\n', equivs=[(b'return', Lit(b'int', b'1'))])
        self.check('3.6', b'yield\n', equivs=[])
        self.check('3.6', b'x = yield y\n', [b'x'], {b'y'}, [(b'yield', b'y')])
        self.check('3.6', b'yield from g()\n', reads={b'g'}, equivs=[(b'yield', b'from g()')])
        self.check('3.6', b'yield a, b\n', equivs=[(b'yield', tl.kTupleInstanceName)])

    def testExceptClauses(self):
        for v, sep in (('2.7', b','), ('2.7', b' as'), ('3.6', b' as')):
            self.check(v, b'except ValueError' + sep + b' e: pass\n', [b'e'], {b'ValueError'},
                       [(b'e', b'ValueError:')])
        self.check('3.6', b'except (A, b.B) as e: pass\n', [b'e'], {b'A', b'b', b'b.B'},
                   [(b'e', b'A:'), (b'e', b'b.B:')])
        # Python 2 admits any target; it is bound like an assignment target.
        self.check('2.7', b'except E, (a, b): pass\n', [b'a', b'b'], {b'E'})
        self.check('2.7', b'except E, self.x: pass\n', [b'self.x'], {b'E', b'self'})

    def testCallsAndIsinstance(self):
        called = si.kCalledPrefix
        self.check('3.6', b'isinstance(x, (A, b.C))\n', reads={b'isinstance', b'x', b'A', b'b', b'b.C'},
                   equivs=[(b'x', b'A:'), (b'x', b'b.C:'), (b'isinstance', called + b'(x,(A, b.C))')])
        self.check('3.6', b'f(a=1)\n', reads={b'f'}, equivs=[])
        self.check('3.6', b'f(*a)\n', reads={b'f', b'a'}, equivs=[])
        self.check('3.6', b'f()\n', reads={b'f'}, equivs=[])
        self.check('3.6', b'f(x for x in y)\n', reads={b'f', b'x', b'y'})
        self.check('3.6', b'a[0](b)\n', reads={b'a', b'b'}, equivs=[])
        result = Record('3.6', b'f(x for x in y, 1)\n')
        self.assertIsInstance(result[0], SyntaxError)
        self.assertEqual((result[0].msg, result[0].lineno, result[0].offset),
                         ('Generator expression must be parenthesized if not sole argument', 1, 3))
        self.assertEqual(result[1:], ([], set(), [], [], [], []))  # a failed line keeps nothing

    def testPython2Statements(self):
        self.check('2.7', b'print >>f, x, `y`\n', [], {b'f', b'x', b'y'})
        self.check('2.7', b'exec code in ns\n', [], {b'code', b'ns'})
        self.check('2.7', b'[x for x in y]\n', equivs=[(b'x', si.kWithinExprPrefix + b'3')])

    def testPython38(self):
        w, tup, called = si.kWithinExprPrefix, tl.kTupleInstanceName, si.kCalledPrefix
        # An assignment expression binds like an assignment, also in a comprehension, and reads its value.
        self.check('3.8', b'if (n := len(a)) > 10: pass\n', [b'n'], {b'a', b'len'},
                   [(b'n', b'len(a)'), (b'len', called + b'(a)')])
        self.check('3.8', b'while chunk := f.read(): pass\n', [b'chunk'], {b'f', b'f.read'})
        self.check('3.8', b'[y for x in d if (y := g(x))]\n', [b'y'], {b'x', b'y', b'd', b'g'},
                   [(b'y', b'g(x)'), (b'g', called + b'(x)'), (b'x', w + b'3')])
        self.check('3.8', b'print(z := 1, sep=s)\n', [b'z'], {b'print', b's'}, [(b'z', Lit(b'int', b'1'))])
        self.check('3.8', b'a = (b := 2)\n', [b'a', b'b'], set(), [(b'a', Lit(b'int', b'2')), (b'b', Lit(b'int', b'2'))])
        self.check('3.8', b'x = [y := 1, y]\n', [b'x', b'y'], {b'y'})
        # Positional-only parameters are arguments in order; the '/' is none.
        self.check('3.8', b'def f(a, b=1, /, c=2, *, d): pass\n', args=[b'a', b'b', b'c', b'd'],
                   arg_equivs=[(b'b', Lit(b'int', b'1')), (b'c', Lit(b'int', b'2'))])
        self.check('3.8', b'def f(a, /): pass\n', args=[b'a'])
        self.check('3.8', b'g = lambda a, /, b: a\n', [b'g'], {b'a'}, [(b'a', w + b'3'), (b'b', w + b'7')])
        # Unparenthesized starred values after return and yield, and an annotated assignment's tuple.
        self.check('3.8', b'return *a, b\n', reads={b'a', b'b'})
        self.check('3.8', b'yield *a, b\n', reads={b'a', b'b'}, equivs=[(b'yield', tup)])
        self.check('3.8', b'x: T = 1, 2\n', [b'x'], {b'T'}, [(b'x', tup)])
        # The self-documenting f-string field reads its expression.
        self.check('3.8', b"s = f'{x=} {y = !r:>{w}}'\n", [b's'], {b'x', b'y', b'w'})
        for version in ('3.6', '3.7'):
            for source in (b'(n := 1)\n', b'def f(a, /): pass\n', b"s = f'{x=}'\n"):
                self.assertIsInstance(Record(version, source)[0], SyntaxError, (version, source))

    def testPython39To313(self):
        called, tp = si.kCalledPrefix, si.kTypeParamPrefix
        # Decorators of any form read their names; a dotted one is called with the function.
        self.check('3.9', b'@buttons[0].clicked.connect\n', [],
                   {b'buttons', b'buttons[0].clicked', b'buttons[0].clicked.connect'}, [])
        self.check('3.9', b'@a.b\n', [], {b'a', b'a.b'}, [(b'a.b', called + b'()')])
        self.check('3.9', b'@a.b(x)\n', [], {b'a', b'a.b', b'x'}, [(b'a.b', called + b'(x)')])
        self.check('3.9', b'with (open(p) as f, g() as h,): pass\n', [b'f', b'h'], {b'open', b'p', b'g'})
        self.check('3.9', b'for x in *a, *b: pass\n', [b'x'], {b'a', b'b'})
        self.check('3.10', b'x[y := 1]\n', [b'y'], {b'x'})
        # Patterns: captures, stars, mapping rests and as-names bind, `_` binds nothing;
        # value and class patterns read their dotted names; the subject and guard are read.
        self.check('3.10', b'match self.x, *y:\n', [], {b'self', b'self.x', b'y'})
        self.check('3.10', b'case [a, *rest, _] if rest: pass\n', [b'a', b'rest'], {b'rest'})
        self.check('3.10', b'case {"k": v, m.K: 1, **kw}: pass\n', [b'v', b'kw'], {b'm', b'm.K'})
        self.check('3.10', b'case mod.Point(x=0, y=yy) | Other(yy): pass\n', set([b'yy']),
                   {b'mod', b'mod.Point', b'Other'})
        self.check('3.10', b'case (1 | -2 | 3+4j | "s" | None) as z: return z\n', [b'z'], {b'z'})
        self.check('3.10', b'case _: pass\n', [], set(), [])
        self.check('3.10', b'case *_, [*_]: pass\n', [], set(), [])
        # Lines that only start with a soft keyword stay ordinary statements.
        self.check('3.10', b'match = re.match(p, s)\n', [b'match'], {b're', b're.match', b'p', b's'})
        self.check('3.10', b'case(x)\n', [], {b'case', b'x'})
        self.check('3.12', b'type(x)\n', [], {b'type', b'x'})
        self.check('3.11', b'except* (A, B) as e:\n', [b'e'], {b'A', b'B'})
        self.check('3.11', b'def f(*args: *Ts): pass\n', args=[b'args'])
        # Type parameters: (name, ':t:' + prefix), not names the line defines; bounds and defaults read.
        self.check('3.12', b'def f[T: int, *Ts, **P](x: T) -> T: pass\n', [], {b'int', b'T'},
                   [(b'T', tp), (b'Ts', tp + b'*'), (b'P', tp + b'**')], args=[b'x'])
        self.check('3.12', b'class C[T](Base): pass\n', [], set(), [(b'T', tp)], bases=[b'Base'])
        self.check('3.12', b'type X[T] = list[T] | Y\n', [b'X'], {b'list', b'T', b'Y'}, [(b'T', tp)])
        self.check('3.13', b'def f[T = int, *Ts = *tuple[int]](): pass\n', [], {b'int', b'tuple'},
                   [(b'T', tp), (b'Ts', tp + b'*')])

    def testAsync(self):
        self.check('3.6', b'x = await y\n', [b'x'], {b'y'}, in_async_def=True)
        self.check('3.6', b'async for a in b: pass\n', [b'a'], {b'b'}, in_async_def=True)
        self.check('3.6', b'async with a as b: pass\n', reads={b'a'}, in_async_def=True)


def Tree(version, source):
    logical = utils.GetLogicalsFromText(source)[0]
    return support.Analyzer(version).ParseToNode(logical, False), logical


def _Rebuilt(w, state):
    clone = type(w).__new__(type(w))
    clone.__setstate__(state)
    return clone


class CapturedStdout(object):

    def __enter__(self):
        self.saved, sys.stdout = sys.stdout, StringIO.StringIO()
        return sys.stdout

    def __exit__(self, *exc):
        sys.stdout = self.saved


def Idle(walker):
    return (walker._fLogical, walker._fVisitCount, walker._fRecurseCount) == (None, 0, 0)


class DriverTest(unittest.TestCase):

    def testLimitsReportAndRecover(self):
        deep = b'x = a.b + c + ' + b'(' * 45 + b'y' + b')' * 45 + b'\n'
        with CapturedStdout() as out:
            result, defined, reads = Record('3.6', deep)[:3]
        self.assertIsNone(result)
        self.assertEqual(out.getvalue(), 'RuntimeError raised in CNodeWalker.Walk: '
                         "RuntimeError('Maximum recurse count in _VisitNode exceeded',)\n")
        self.assertEqual((defined, reads), ([b'x'], {b'a', b'a.b', b'c'}))  # what came before the limit
        walker = support.Analyzer('3.6')._fNodeWalker
        self.assertTrue(Idle(walker))
        self.assertEqual((walker._fLoadedNames, walker._fStoredNames), ({}, {}))
        self.assertEqual(Record('3.6', b'a = b\n')[2], {b'b'})  # the next walk works

    def testVisitLimitIsInclusive(self):
        node, logical = Tree('3.6', b'x = [a, b, c]\n')
        needed = None
        for limit in range(1, 60):
            walker = _Rebuilt(tl.CNodeWalker(), WalkerState(_fMaxVisits=limit))
            with CapturedStdout() as out:
                walker.Walk(node, utils.GetLogicalsFromText(b'x = [a, b, c]\n')[0])
            if not out.getvalue():
                needed = limit
                break
            self.assertIn('Maximum number of calls', out.getvalue())
        self.assertIsNotNone(needed)
        self.assertGreater(needed, 5)

    def testBusyAndIdle(self):
        walker = tl.CNodeWalker()
        self.assertIsNone(walker.Walk(None, 'anything'))
        self.assertTrue(Idle(walker))
        node, _ = Tree('3.6', b'y\n')

        class Host(object):  # a record of the host's own making: its methods are called by name
            def __init__(self):
                self.calls = []

            def AppendTypeEquiv(self, name, info):
                self.calls.append((name, info))
                walker.Walk(None, self)

        with self.assertRaisesRegexp(ValueError, 'Only one logical may be walked at a time'):
            walker.Walk(node, Host())
        self.assertTrue(Idle(walker))
        self.assertEqual(walker._fLoadedNames, {})
        self.assertRaises(TypeError, tl.CNodeWalker, 1)
        self.assertRaises(TypeError, tl.CNodeWalker, x=1)

    def testPythonOperations(self):
        walker = tl.CNodeWalker()
        node, _ = Tree('3.6', b'x = a.b\n')
        self.assertEqual(walker._TypeEquivForNode(node.GetPostEqualsTestExpr(0)), b'a.b')
        self.assertIsNone(walker._RaiseIfNotInstance(node, tl.CExprStmt))
        with self.assertRaisesRegexp(ValueError, 'Node is not a .*CAtom'):
            walker._RaiseIfNotInstance(node, tl.CAtom)
        with self.assertRaisesRegexp(AttributeError, 'None has no attribute named: fChildren'):
            walker._VisitChildren(None)
        walker._ProcessLoadName(b'q')
        self.assertEqual(walker._fLoadedNames, {b'q': b''})
        self.assertRaises(TypeError, walker._VisitExprStmt, node.GetInitialTestExpr())


class TruncatedTest(unittest.TestCase):
    """A line past the walk's limits keeps what was recorded, is marked, and is noted with its path and line."""

    kSource = (b'ok = 1\n'
               b'x = [' + b', '.join(b'n%d' % i for i in range(6000)) + b']\n'  # past 10000 visits
               b'y = p + ' + b'(' * 45 + b'q' + b')' * 45 + b'\n'                # past depth 40
               b'z = r\n')

    def testMarkedAndKept(self):
        from pysource import analysis
        with CapturedStdout():
            result = analysis.AnalyzeText(self.kSource, '3.6', path='t.py')
        views = result.Lines()
        self.assertEqual([v['truncated'] for v in views], [False, True, True, False])
        self.assertEqual(views[1]['reads'][:3], [b'n0', b'n1', b'n2'])
        self.assertGreater(len(views[1]['reads']), 4000)
        self.assertEqual((views[2]['reads'], views[3]['reads']), ([b'p'], [b'r']))
        logical = result.logicals[1]
        from pysource import _fastaccess
        _fastaccess.ClearLogicalDerivedInfo(logical)  # the mark goes with the derived info
        self.assertFalse(logical.fTruncated)

    def testCommandLineReports(self):
        from pysource import cli
        for fmt, marks in (('jsonl', ['"truncated": false', '"truncated": true', '"truncated": true',
                                      '"truncated": false']),
                           ('text', [None, 'truncated: the walk stopped', 'truncated: the walk stopped', None])):
            out, err = StringIO.StringIO(), StringIO.StringIO()
            status = cli.Main(['--lang', '3.6', '--format', fmt, '--stdin-filename', 'in.py', '-'],
                              stdin=StringIO.StringIO(self.kSource), stdout=out, stderr=err)
            self.assertEqual(status, 0)
            if fmt == 'jsonl':
                blocks = out.getvalue().splitlines()
            else:
                # The file's version line, then a block per line that records something.
                blocks = re.split(r'\n(?=in\.py:)', out.getvalue())[1:]
            self.assertEqual([m is None or m in b for m, b in zip(marks, blocks)], [True] * 4, fmt)
            self.assertEqual(len(blocks), 4)
            notes = [l for l in err.getvalue().splitlines() if 'note' in l]
            self.assertEqual([n.split(': note:')[0] for n in notes], ['in.py:2', 'in.py:3'])
            self.assertNotIn('RuntimeError', err.getvalue())


class LinearCostTest(unittest.TestCase):
    """Long chains record a bounded number of prefixes; one line's checks are linear in its names."""

    def testChainsRecordBoundedPrefixes(self):
        shapes = [(b'x = a%s\n', b'.a'), (b'x = a%s\n', b'.b()'), (b'x: a%s = 1\n', b'.a'),
                  (b'@a%s\n', b'.a'), (b'a%s = 1\n', b'[i].b')]
        for shape, piece in shapes:
            sizes = []
            for n in (20, 200, 2000):
                source = shape % (piece * n)
                L = support.AnalyzeLine('3.8', source)[1]
                infos = list(L.fTypeEquivs) + [(n, b'') for n in L.fNamesDefined]
                sizes.append((len(infos), sum(len(n) + len(i) for n, i in infos) // len(source)))
            # Entries stop growing past the cap; their bytes stay a bounded multiple of the line.
            self.assertEqual(sizes[1][0], sizes[2][0], (shape, piece, sizes))
            self.assertLessEqual(sizes[2][1], 4, (shape, piece, sizes))
        reads = Record('3.8', b'x = a' + b'.a' * 40 + b'(q)\n')[2]
        self.assertEqual(len(reads), 34)  # a, a.a ... 32 trailers deep, and the argument q
        self.assertIn(b'q', reads)

    def testChecksLinearInNames(self):
        # 200,000 names: comparing every pair takes many minutes; a minute of CPU is generous.
        script = ('import resource, sys; resource.setrlimit(resource.RLIMIT_CPU, (60, 60)); '
                  'sys.stdout = open("/dev/null", "w"); '
                  'from pysource import analysis; n = 200000; '
                  'kw = b"f(" + b", ".join(b"k%d=1" % i for i in range(n)) + b", k7=2)\\n"; '
                  'params = b", ".join(b"p%d" % i for i in range(n)); '
                  'df = b"def f(" + params + b", p5): global " + params + b"\\n"; '
                  'gl = b"def f(" + params + b"): global " + params + b"\\n"; '
                  'print >>sys.stderr, [analysis.AnalyzeText(s, "3.8").SyntaxErrors() for s in (kw, df, gl)]')
        env = dict(os.environ, PYTHONPATH=support.kRoot)
        if 'TREELENS_BUILD_DIR' in env:
            env['TREELENS_BUILD_DIR'] = os.path.abspath(env['TREELENS_BUILD_DIR'])
        proc = subprocess.Popen([sys.executable, '-c', script], stdout=subprocess.PIPE, stderr=subprocess.PIPE,
                                env=env, cwd=support.kRoot)
        out, err = proc.communicate()
        self.assertEqual(proc.returncode, 0, err[-2000:])
        self.assertIn("keyword argument repeated", err)
        self.assertIn("duplicate argument 'p5' in function definition", err)
        self.assertIn("name 'p0' is parameter and global", err)


class KeptMemoryTest(unittest.TestCase):

    def testRecordsShareNamesAndPairs(self):
        from pysource import analysis
        source = b'def f(self):\n    self.items.append(self.x)\n    return self.items.append(self.x)\n'
        first, second = analysis.AnalyzeText(source, '3.8').logicals[1:]
        pairs = dict((p, p) for p in second.fTypeEquivs)
        self.assertEqual(len(first.fTypeEquivs), 5)
        for pair in first.fTypeEquivs:
            self.assertIs(pairs[pair], pair)  # one pair for both lines
        long_name = b'n' * 200  # long texts are neither interned nor shared
        logicals = utils.GetLogicalsFromText(b'x\ny\n')
        for L in logicals:
            L.AppendTypeEquiv(long_name, b'i')
        self.assertIsNot(logicals[0].fTypeEquivs[0], logicals[1].fTypeEquivs[0])
        self.assertEqual(logicals[0].fTypeEquivs[0], logicals[1].fTypeEquivs[0])


class DeterminismTest(unittest.TestCase):

    def testSameUnderEveryHashSeed(self):
        outputs = set()
        for seed, jobs in (('1', '1'), ('2', '1'), ('3', '2')):
            env = dict(os.environ, PYTHONPATH=support.kRoot, PYTHONHASHSEED=seed)
            if 'TREELENS_BUILD_DIR' in env:
                env['TREELENS_BUILD_DIR'] = os.path.abspath(env['TREELENS_BUILD_DIR'])
            proc = subprocess.Popen([sys.executable, '-m', 'pysource.cli', '-q', '-j', jobs, '--format',
                                     'jsonl', os.path.join(support.kRoot, 'examples')],
                                    stdout=subprocess.PIPE, stderr=subprocess.PIPE, env=env)
            out, err = proc.communicate()
            self.assertEqual(proc.returncode, 0, err)
            outputs.add(out)
        self.assertEqual(len(outputs), 1)
        # Names read are in the order the line first mentions them.
        line = [json.loads(l) for l in outputs.pop().splitlines() if 'results = await asyncio' in l][0]
        self.assertEqual(line['reads'], ['asyncio', 'asyncio.gather', 'self', 'self.fetch', 'u', 'urls'])


def WalkerState(**fields):
    w = tl.CNodeWalker()
    names = sorted(['_fLogical', '_fLoadNameContext', '_fStoreWithinSubExpr', '_fLoadedNames', '_fStoredNames',
                    '_fVisitCount', '_fRecurseCount', '_fMaxVisits', '_fMaxRecurseCount', '_fToText',
                    '_fIncludeExprText'])
    return tuple(fields.get(n, getattr(w, n)) for n in names)


class DispatchWalkerTest(unittest.TestCase):

    def testDispatch(self):
        node, logical = Tree('3.6', b'x = f(a, b.c)\n')
        seen = []

        class Sub(tl.CNameLiteral):
            pass

        def Record(result):
            return lambda walker, n: seen.append((type(n).__name__, n.fText)) or result

        walker = tl.CDispatchWalker({tl.CNameLiteral: Record(True), tl.CTrailer: False,
                                     tl.CAtomExpr: Record(None), tl.CExprStmt: Record(1), Sub: Record(True)})
        walker.Walk(node, logical)
        # The call is handled, not entered; so its trailer is never met.
        self.assertEqual(seen, [('CExprStmt', None), ('CNameLiteral', b'x'), ('CAtomExpr', None)])
        self.assertTrue(Idle(walker))
        self.assertEqual(walker._fNodeStack, [])

    def testOverridesAndErrors(self):
        node, logical = Tree('3.6', b'x = (((y)))\n')
        visited = []

        class Mine(tl.CDispatchWalker):
            def _VisitNode(self, n):
                visited.append(len(self._fNodeStack))
                return tl.CDispatchWalker._VisitNode(self, n)

        Mine({}).Walk(node, logical)  # the native walk calls the Python override at every level
        self.assertEqual(visited[:2], [0, 1])
        self.assertGreaterEqual(max(visited), 4)
        with self.assertRaisesRegexp(TypeError, 'Expected dict, got int'):
            tl.CDispatchWalker(5)
        walker = tl.CDispatchWalker(None)
        self.assertRaises(AttributeError, walker.Walk, node, logical)
        self.assertTrue(Idle(walker))
        self.assertRaises(TypeError, tl.CDispatchWalker({}).Walk, None, logical)
        deep, deep_logical = Tree('3.6', b'x = ' + b'(' * 45 + b'y' + b')' * 45 + b'\n')
        with CapturedStdout() as out:
            tl.CDispatchWalker({}).Walk(deep, deep_logical)
        self.assertTrue(out.getvalue().startswith('RuntimeError raised in CNodeWalker.Walk: '))

    def testReentryAndStackTampering(self):
        node, logical = Tree('3.6', b'x = y\n')
        walker = tl.CDispatchWalker({})
        walker._fDispatchDict[tl.CNameLiteral] = lambda w, n: w.Walk(n, logical)
        self.assertRaisesRegexp(ValueError, 'Only one logical', walker.Walk, node, logical)
        walker = tl.CDispatchWalker({})
        walker._fDispatchDict[tl.CNameLiteral] = lambda w, n: w._fNodeStack.pop()
        self.assertRaises(AssertionError, walker.Walk, node, logical)
        self.assertTrue(Idle(walker) and walker._fNodeStack == [])


if __name__ == '__main__':
    unittest.main()


class LeakTest(unittest.TestCase):

    def testNothingKeptAcrossWalks(self):
        sources = {'2.7': [b'print >>f, `x`\n', b'def f(a, (b, c)=d, *e): pass\n', b'except E, (a, b): pass\n',
                           b'x = lambda (a, b)=1: a\n'],
                   '3.6': [b'a, *b = c.d(e, f=1)[g] = [h for h in i if h]\n', b'import a.b as c, d\n',
                           b'from . import x as y\n', b'def f(a: int = 1, *b, c, **d) -> e: pass\n',
                           b'class C(B, metaclass=M): pass\n', b'isinstance(x, (A, B))\n', b'x = -1.5, u"s"\n',
                           b'with a as (b, c): pass\n', b'except (A, B) as e: pass\n', b'f(x for x in y, 1)\n',
                           b'return {1: 2}\n', b'x: int = yield from g()\n', b'global a\n', b'@d.e(f)\n',
                           b'x = ' + b'(' * 45 + b'y' + b')' * 45 + b'\n', b'for a, b in c: pass\n']}
        watched = [si.kGetPrefix, si.kWithinExprPrefix, tl.kListInstanceName, tl.kTupleInstanceName,
                   support.Analyzer('3.6'), support.Analyzer('2.7')]

        def Run(count):
            with CapturedStdout():
                for _ in range(count):
                    for version, lines in sorted(sources.items()):
                        for source in lines:
                            support.AnalyzeLine(version, source)
        Run(3)
        gc.collect()
        objects, refs = len(gc.get_objects()), [sys.getrefcount(o) for o in watched]
        Run(100)
        gc.collect()
        self.assertLessEqual(len(gc.get_objects()) - objects, 2)
        self.assertEqual([sys.getrefcount(o) for o in watched], refs)
