"""pysource.treelens over the 2.7 and 3.6 standard libraries, checked against CPython's own compiler.

Every logical line of a file that CPython compiles must analyze to None with
the grammar of the same version; a line that yields a SyntaxError must be one
that CPython also rejects (its source, completed as the analyzer completes its
tokens, does not compile). Also: analyzing the 2.7 standard library five times
leaves memory flat after the first pass.
"""

import gc
import json
import os
import sys
import unittest

from tests.py import support

try:
    from pysource import treelens as tl
    from pysource import analysis
    from pysource.utils import GetLogicalsFromText
    sys.path.insert(0, os.path.join(support.kRoot, 'bench'))
    from treelens_bench import CompletedSource
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


def Analyze(analyzer, text, async_scopes, counts):
    """(logical, result) of every logical line of text whose result is not None."""
    failed = []
    logicals = GetLogicalsFromText(text)
    counts.append(len(logicals))
    for logical in logicals:
        in_async = async_scopes and support.InAsyncDef(logical)
        result = analyzer.AnalyzeSingleLogical(logical, in_async)
        if result is not None:
            failed.append((logical, result))
    return failed


def Describe(path, logical, result):
    return '%s:%d: %r -> %r' % (path, logical.fFirstLine + 1, logical.fLineText[:120], result)


# Reads a JSON list of [key, source] pairs on stdin; prints the keys of the
# sources that compile.
kOracleScript = r'''
import json, sys
ok = []
for key, src in json.loads(sys.stdin.read()):
    try:
        compile(src.encode('latin-1'), '<s>', 'exec', 0x400)
        ok.append(key)
    except (SyntaxError, ValueError, TypeError):
        pass
sys.stdout.write(json.dumps(ok))
'''


def OracleCompiles(version, items):
    """Keys of the (key, source bytes) items that CPython X.Y compiles, or None without the oracle."""
    data = json.dumps([[key, src.decode('latin-1')] for key, src in items])
    out = support.RunOracle(version, kOracleScript, data)
    return None if out is None else set(json.loads(out))


def Compiles27(source):
    try:
        compile(source, '<s>', 'exec', 0x400)
        return True
    except (SyntaxError, ValueError, TypeError):
        return False


class Corpus27Test(unittest.TestCase):

    def testStdlib(self):
        analyzer = analysis.GetAnalyzer('2.7')
        files = support.CorpusFiles('2.7')
        wrong, print_function_files, rejected_files, counts = [], 0, 0, []
        for path in files:
            text = support.ReadBytes(path)
            logicals = GetLogicalsFromText(text)
            if analysis.UsesPrintFunction(logicals):
                print_function_files += 1
            failed = Analyze(analyzer.ImplFor(logicals), text, False, counts)
            if Compiles27(text):
                wrong.extend(Describe(path, l, r) for l, r in failed)
                continue
            rejected_files += 1
            wrong.extend(Describe(path, l, r) for l, r in failed if Compiles27(CompletedSource(l)))
        sys.stderr.write('\n2.7 corpus: %d files (%d rejected by CPython, %d import print_function), '
                         '%d logical lines, %d disagree\n'
                         % (len(files), rejected_files, print_function_files, sum(counts), len(wrong)))
        self.assertEqual(wrong[:40], [])


class Corpus36Test(unittest.TestCase):

    def testStdlib(self):
        files = support.CorpusFiles('3.6')
        if not files or support.Interpreter('3.6') is None:
            self.skipTest('no Python 3.6 standard library')
        analyzer = tl.CPGenAnalyzerImpl((3, 6, 0), 'Python-Grammar-3.6', None, True)
        texts = [(path, support.ReadBytes(path)) for path in files]
        compiling = OracleCompiles('3.6', texts)
        wrong, suspects, counts = [], [], []
        for path, text in texts:
            for logical, result in Analyze(analyzer, text, True, counts):
                if path in compiling:
                    wrong.append(Describe(path, logical, result))
                else:
                    suspects.append((len(suspects), (path, logical, result)))
        accepted = OracleCompiles('3.6', [(i, CompletedSource(l)) for i, (_, l, _) in suspects])
        wrong.extend(Describe(*item) for i, item in suspects if i in accepted)
        sys.stderr.write('\n3.6 corpus: %d files (%d rejected by CPython), %d logical lines, %d disagree\n'
                         % (len(texts), len(texts) - len(compiling), sum(counts), len(wrong)))
        self.assertEqual(wrong[:40], [])


def ResidentBytes():
    with open('/proc/self/statm') as f:
        return int(f.read().split()[1]) * os.sysconf('SC_PAGE_SIZE')


class FlatMemoryTest(unittest.TestCase):

    def testFivePasses(self):
        if not os.path.exists('/proc/self/statm'):
            self.skipTest('no /proc')
        analyzer = tl.CPGenAnalyzerImpl((2, 7, 0), tl.kPy2DefaultGrammar, None, False)
        texts = [support.ReadBytes(p) for p in support.CorpusFiles('2.7')]
        passes = []
        for _ in range(5):
            for text in texts:
                for logical in GetLogicalsFromText(text):
                    analyzer.AnalyzeSingleLogical(logical, False)
            gc.collect()
            passes.append((analyzer._FreeNodeCount(), len(gc.get_objects()), ResidentBytes()))
        free, objects, rss = passes[0]
        for i, (f, o, r) in enumerate(passes[1:], 2):
            self.assertEqual(f, free, 'pass %d: free nodes %d, first pass %d' % (i, f, free))
            self.assertLessEqual(o, objects + 50, 'pass %d: %d GC objects, first pass %d' % (i, o, objects))
            if not support.kSanitized:  # the sanitizer's quarantine holds freed memory back
                self.assertLessEqual(r, rss + (2 << 20), 'pass %d: RSS %d, first pass %d' % (i, r, rss))


if __name__ == '__main__':
    unittest.main()
