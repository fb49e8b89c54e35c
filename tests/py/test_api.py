"""pysource.analysis: versions, auto, the async rule, texts, files, folders and the plain-data view."""

import os
import shutil
import tempfile
import unittest

from tests.py import support

try:
    from pysource import analysis, symbolinfo, treelens, utils
except ImportError as _exc:  # native modules not built
    analysis = None
    _kImportError = str(_exc)


def setUpModule():
    if analysis is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


def Errors(text, version, checks=True):
    return [(line, col) for line, col, _ in analysis.AnalyzeText(text, version, checks=checks).SyntaxErrors()]


def Since(version):
    """The Python 3 versions from `version` on, as a space-separated string."""
    return ' '.join(v for v in analysis.kVersions if v != '2.7' and Triple(v) >= Triple(version))


def Triple(version):
    return tuple(int(p) for p in version.split('.'))


class VersionTest(unittest.TestCase):

    def testEachVersionAcceptsItsOwnSyntax(self):
        # source, versions that accept it
        py3 = Since('3.5')
        cases = [(b'print x\n', '2.7'),
                 (b'exec "x" in d\n', '2.7'),
                 (b'x = 0777 + 10L + 0xFFL\n', '2.7'),
                 (b"x = ur'a' if a <> b else 1\n", '2.7'),
                 (b"x = '\\u00e9'; y = b'\\u'; z = r'\\N'\n", '2.7 ' + py3),
                 (b"x = '\\u'\n", '2.7'),
                 (b"x = '\\N{DASH}'\n", '2.7 ' + py3),
                 (b'x = 1_000\n', Since('3.6')),
                 (b"x = f'{y}'\n", Since('3.6')),
                 (b'x: int = 1\n', Since('3.6')),
                 (b"x = rb'a'\n", py3),
                 (b'print(x, file=f)\n', py3),
                 (b'from __future__ import print_function\nprint(x, file=f)\n', '2.7 ' + py3),
                 (b'x = 0; y = 00; z = 0.5 + 07.5 + 0e1 + 0777j\n', '2.7 ' + py3),
                 # async and await: names up to 3.6, keywords everywhere from 3.7.
                 (b'async = await = 1\n', '2.7 3.5 3.6'),
                 (b'def f():\n    return (await x async for x in y)\n', Since('3.7')),
                 # 3.8: assignment expressions, positional-only parameters, starred returns.
                 (b'if (n := len(a)) > 1: f(x := 2)\n', Since('3.8')),
                 (b'def f(a, /, b): return *a, b\n', Since('3.8')),
                 (b"x = f'{y=}'\n", Since('3.8')),
                 # 3.9: any decorator, parenthesized with items, starred for, set displays.
                 (b'@buttons[0].clicked.connect\ndef f(): pass\n', Since('3.9')),
                 (b'with (open(a) as f, open(b) as g,): pass\n', Since('3.9')),
                 (b'with (a, b) as c: pass\n', '2.7 ' + py3),
                 (b'for x in *a, *b: pass\n', Since('3.9')),
                 (b'x = {y := 1, 2}\n', Since('3.9')),
                 # 3.10: match statements, assignment expressions in subscripts; the soft
                 # keywords stay names elsewhere.
                 (b'match p:\n    case Point(x=0, y=y) | [_, *y] if y: pass\n    case _: pass\n', Since('3.10')),
                 (b'match(x)\nmatch = case = _ = 1\ncase.x, match[1:2]\n', '2.7 ' + py3),
                 (b'x[y := 1]\n', Since('3.10')),
                 # 3.11: except*, starred subscripts and annotations.
                 (b'try:\n    pass\nexcept* E as e:\n    pass\n', Since('3.11')),
                 (b'def f(*args: *Ts): return x[*a, b]\n', Since('3.11')),
                 # 3.12: type parameters and the type statement; 3.13: their defaults.
                 (b'class C[T: int, *Ts, **P](B): pass\ntype X[T] = list[T]\n', Since('3.12')),
                 (b'type = 1\ntype(x)\n', '2.7 ' + py3),
                 (b'def f[T = int](x: T): pass\n', Since('3.13'))]
        for text, accepting in cases:
            for version in analysis.kVersions:
                errors = Errors(text, version)
                self.assertEqual(errors == [], version in accepting.split(), (text, version, errors))

    def testTokenErrorsPointAtTheToken(self):
        result = analysis.AnalyzeText(b'x = 1\ny = (1 +\n     0777)\n', '3.6')
        self.assertEqual(result.SyntaxErrors(), [(3, 6, 'invalid token')])
        self.assertEqual(result.logicals[1].GetDerivedInfo(), None)

    def testAsyncRuleIsCPython36s(self):
        text = (b'async def f():\n'
                b'    await g()\n'
                b'    def h():\n'
                b'        await k()\n'
                b'    class C:\n'
                b'        @d\n'
                b'        def m(self): return await x\n'
                b'async  \\\n'
                b'  def e(): pass\n'
                b'await = 1\n')
        logicals = utils.GetLogicalsFromText(text)
        self.assertEqual([utils.InAsyncDef(l) for l in logicals],
                         [False, True, True, True, True, True, True, False, False])
        self.assertEqual(Errors(text, '3.6', checks=False), [])
        self.assertEqual(Errors(text, '3.5', checks=False), [])
        # The grammar takes await in the plain defs; CPython then rejects it there.
        self.assertEqual(Errors(text, '3.6'), [(4, 9), (7, 29)])

    def testAutoPicksTheNewestVersionWithoutErrors(self):
        # source, version picked, errors kept
        cases = [(b'', '3.13', []),
                 (b'x = 1\n', '3.13', []),
                 (b'x = 1\nprint x\n', '2.7', []),
                 (b'def f():\n    x = 0777\n', '2.7', []),
                 (b'print(x, end="")\nx = 1_0\n', '3.13', []),
                 (b'async = 1\nx = f"{async}"\n', '3.6', []),
                 (b'match x:\n    case 1: pass\nasync = 1\n', '3.13', [(3, 7)]),
                 (b'print x\ny = f"{x}"\n', '3.13', [(1, 7)]),
                 (b'if x\n', '3.13', [(1, 5)]),
                 # No version parses it: the fewest lines in error, the newest on a tie.
                 (b'print "x"\ny = 1\nx = (\n', '2.7', [(3, 6)]),
                 (b'async = 1\nx = f"{async}"\ny = 1L\n', '3.6', [(3, 5)])]
        for text, version, errors in cases:
            result = analysis.AnalyzeText(text)
            self.assertEqual((result.version, Errors(text, result.version)), (version, errors), text)
            self.assertEqual(result.status, analysis.kSyntaxError if errors else analysis.kOk)
            self.assertEqual(result.SyntaxErrors() != [], errors != [])


class StdlibAutoTest(unittest.TestCase):
    """auto picks the version that compiles a file when only one of 2.7 and 3.6 does."""

    kCompileScript = r'''
import sys
for path in sys.stdin.read().splitlines():
    try:
        with open(path, 'rb') as f:
            compile(f.read(), path, 'exec', dont_inherit=True)
        sys.stdout.write(path + '\n')
    except Exception:
        pass
'''

    def Compiling(self, version, files):
        if version == '2.7':
            return set(p for p in files if Compiles27(support.ReadBytes(p)))
        out = support.RunOracle(version, self.kCompileScript, '\n'.join(files))
        if out is None:
            self.skipTest('no Python %s' % version)
        return set(out.splitlines())

    def testOnlyOneVersionCompiles(self):
        for lib, other in (('2.7', '3.6'), ('3.6', '2.7')):
            files = support.CorpusFiles(lib)
            if not files:
                continue
            only = self.Compiling(lib, files) - self.Compiling(other, files)
            # A 3.6 file may be read as a newer Python 3 one.
            wrong = [(p, r.version) for p in sorted(only)
                     for r in [analysis.AnalyzeFile(p)] if (r.version == '2.7') != (lib == '2.7')]
            self.assertGreater(len(only), 10 if support.kSanitized else 300, lib)
            self.assertEqual(wrong, [], lib)


def Compiles27(source):
    try:
        compile(source, '<s>', 'exec', 0, True)
        return True
    except (SyntaxError, ValueError, TypeError):
        return False


class ViewTest(unittest.TestCase):

    def testViewOfOneRecord(self):
        result = analysis.AnalyzeText(b'import os\n\nclass C(B):\n    def f(self, a=1):\n'
                                      b'        x = y\n        if x\n', '3.6')
        views = result.Lines()
        self.assertEqual([(v['line'], v['kind']) for v in views],
                         [(1, 'stmt'), (2, 'blank'), (3, 'class'), (4, 'def'), (5, 'stmt'),
                          (6, 'stmt')])
        self.assertEqual(b''.join(v['text'] for v in views), b''.join(l.fLineText
                                                                     for l in result.logicals))
        self.assertEqual(views[2]['bases'], [b'B'])
        self.assertEqual((views[3]['args'], views[3]['arg_equivs']),
                         ([b'self', b'a'], [(b'a', symbolinfo.BuildLiteralInfo(b'int', b'1'))]))
        self.assertEqual((views[4]['defines'], views[4]['reads'], views[4]['equivs']),
                         ([b'x'], [b'y'], [(b'x', b'y')]))
        self.assertEqual(views[5]['error'], {'message': 'invalid syntax', 'line': 6, 'column': 13,
                                             'byte_column': 13})
        self.assertEqual((views[5]['defines'], views[5]['reads']), ([], []))

    def testReadsAreTheGetInfos(self):
        logical = utils.GetLogicalsFromText(b'x = y\n')[0]
        logical.AppendTypeEquiv(b'y', symbolinfo.kGetPrefix)
        logical.AppendTypeEquiv(b'x', b'y')
        view = analysis.LineView(logical)
        self.assertEqual((view['reads'], view['equivs']), ([b'y'], [(b'x', b'y')]))

    def testSameRecordsAsTheAnalyzerByHand(self):
        examples = os.path.join(support.kRoot, 'examples')
        for version, names in (('2.7', ['legacy.py', 'sample.py']),
                               ('3.6', ['modern.py', 'sample.py'])):
            paths = [os.path.join(examples, n) for n in names] + support.CorpusFiles(version, 5)
            impl = treelens.CPGenAnalyzerImpl(
                analysis.kGrammars[version][0], analysis.kGrammars[version][1],
                list(analysis.kPy3Keywords) if version != '2.7' else None,
                version != '2.7', 'Python-Grammar-3.6')
            for path in paths:
                text = support.ReadBytes(path)
                logicals = utils.GetLogicalsFromText(text)
                by_hand = [analysis.LineView(l, impl.AnalyzeSingleLogical(
                    l, version != '2.7' and utils.InAsyncDef(l))) for l in logicals]
                self.assertEqual(analysis.AnalyzeText(text, version).Lines(), by_hand, path)

    def testErrorsLocatedInTheFileAsCPythonLocatesThem(self):
        # text, version, (lineno, offset, text) of CPython's error, view's (column, byte column)
        cases = [(b'x = 1\ns = "\xc3\xa9\xc3\xa9" +  = 2\n', '3.8',
                  (2, 13, b's = "\xc3\xa9\xc3\xa9" +  = 2\n'), (13, 15)),
                 # Python 2 reads a file without a coding cookie as ASCII.
                 (b'# coding: utf-8\ns = "\xc3\xa9\xc3\xa9" +  = 2\n', '2.7',
                  (2, 15, b's = "\xc3\xa9\xc3\xa9" +  = 2\n'), (13, 15)),
                 # The checks after parsing keep CPython's offset (3.6: 0-based bytes).
                 (b'y = (1,\n     2); f() = 1\n', '3.6', (2, 9, b'     2); f() = 1\n'), (10, 10))]
        for text, version, located, columns in cases:
            for path in ('pkg/m.py', None):
                result = analysis.AnalyzeText(text, version, path)
                error = [e for e in result.errors if e is not None][0]
                self.assertEqual((error.filename, error.lineno, error.offset, error.text),
                                 (path or '<string>',) + located, (text, version))
            view = [v['error'] for v in result.Lines() if v['error']][0]
            self.assertEqual((view['line'], view['column'], view['byte_column']),
                             (located[0],) + columns)

    def testTextsThatAreNotSource(self):
        result = analysis.AnalyzeText(b'x = 1\ny = "\0"\n')
        self.assertEqual((result.status, result.problem, result.logicals),
                         (analysis.kUnreadable, 'not Python source: NUL byte at line 2, column 6',
                          []))
        self.assertEqual(analysis.AnalyzeText(u'x = "\xe9"\n').logicals[0].fLineText,
                         b'x = "\xc3\xa9"\n')


class FolderTest(unittest.TestCase):

    def setUp(self):
        self.tmp = tempfile.mkdtemp()
        for rel in ('b.py', 'a/z.pyi', 'a/y.py', 'a/notes.txt', '.hidden/h.py', 'a/.x.py'):
            path = os.path.join(self.tmp, rel)
            if not os.path.isdir(os.path.dirname(path)):
                os.makedirs(os.path.dirname(path))
            with open(path, 'wb') as f:
                f.write(b'print x\n' if rel == 'b.py' else b'x = 1\n')
        os.symlink(self.tmp, os.path.join(self.tmp, 'a', 'loop'))
        os.symlink(os.path.join(self.tmp, 'missing'), os.path.join(self.tmp, 'a', 'gone.py'))

    def tearDown(self):
        shutil.rmtree(self.tmp)

    def testFolderInOrderWithProblemsReported(self):
        got = [(os.path.relpath(r.path, self.tmp), r.version, r.status)
               for r in analysis.AnalyzeFolder(self.tmp)]
        self.assertEqual(got, [('a/gone.py', None, analysis.kUnreadable),
                               ('a/loop', None, analysis.kSkipped),
                               ('a/y.py', '3.13', analysis.kOk),
                               ('a/z.pyi', '3.13', analysis.kOk),
                               ('b.py', '2.7', analysis.kOk)])
        self.assertEqual(analysis.WorstStatus(s for _, _, s in got), analysis.kUnreadable)
        result = analysis.AnalyzeFile(os.path.join(self.tmp, 'a', 'gone.py'))
        self.assertEqual(result.problem, 'cannot read: No such file or directory')


if __name__ == '__main__':
    unittest.main()
