"""pysource.treelens over the 2.7, 3.6, 3.7 and 3.8 standard libraries and the typeshed stubs,
checked against CPython's own compiler.

Every logical line of a file that CPython compiles must analyze to None with
the grammar of the same version, and the whole-file checks find nothing in it; a line that yields a SyntaxError must be one
that CPython also rejects (its source, completed as the analyzer completes its
tokens, does not compile). What each analyzed line records is checked against
CPython's ast of the same completed line (tests/py/astfacts.py; the 3.x side
runs in the 3.x interpreter, and under 3.8 it also counts the names f-strings
read). Also: analyzing the 2.7 standard library five times leaves memory flat
after the first pass.
"""

import gc
import json
import os
import re
import sys
import unicodedata
import unittest

from tests.py import astfacts
from tests.py import support

try:
    from pysource import treelens as tl
    from pysource import analysis
    from pysource import filechecks
    from pysource import symbolinfo as si
    from pysource.utils import GetLogicalsFromText
    sys.path.insert(0, os.path.join(support.kRoot, 'bench'))
    from treelens_bench import CompletedSource
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


def Analyze(analyzer, text, async_scopes, counts, analyzed=None):
    """(logical, result) of every logical line of text whose result is not None.

    The lines that analyze to None are appended to `analyzed`.
    """
    failed = []
    logicals = GetLogicalsFromText(text)
    counts.append(len(logicals))
    for logical in logicals:
        in_async = async_scopes and support.InAsyncDef(logical)
        result = analyzer.AnalyzeSingleLogical(logical, in_async)
        if result is not None:
            failed.append((logical, result))
        elif analyzed is not None:
            analyzed.append(logical)
    return failed


def FileErrors(version, path, text):
    """What only the whole file shows (encoding, indentation, decorators, ...):
    a description per line given an error."""
    logicals = GetLogicalsFromText(text)
    errors = [None] * len(logicals)
    filechecks.Check(version, logicals, errors, text, path)
    return ['%s:%d: whole file: %s' % (path, l.fFirstLine + 1, e.msg)
            for l, e in zip(logicals, errors) if e is not None]


kTypeParamPrefix = b':t:'
kWord = re.compile(br'[A-Za-z_][A-Za-z_0-9]*')
kQuoted = re.compile(br"'[^']*'")  # an encoded string literal in a rendered name
kFString = re.compile(br"""[rR]?[fF][rR]?['"]""")


def Recorded(logical):
    """What the analyzer recorded on a logical, in the terms of the ast facts."""
    equivs = logical.fTypeEquivs
    return {'tokens': [t for t, _ in logical.fTokens], 'defined': set(logical.fNamesDefined),
            'reads': set(n for n, i in equivs if i == si.kGetPrefix),
            'within': [(n, i) for n, i in equivs if i.startswith(si.kWithinExprPrefix)],
            'equivs': set(equivs), 'args': logical.fArgNames, 'bases': logical.fBaseClassNames}


def NFKC(name):
    return unicodedata.normalize('NFKC', name.decode('utf-8', 'replace')).encode('utf-8')


def Disagreements(rec, facts):
    """Where the recorded info and CPython's ast facts of one line disagree."""
    utf8 = lambda names: [n.encode('utf-8') if not isinstance(n, bytes) else n for n in names]
    tokens, out = rec['tokens'], []
    raw_reads = rec['reads']
    if any(ord(c) > 127 for c in b''.join(tokens)):  # CPython 3 binds identifiers NFKC-normalized
        rec = dict(rec, defined=set(NFKC(n) for n in rec['defined']), reads=set(NFKC(n) for n in rec['reads']))
    significant = [t for t in tokens if not t.startswith((b'#', b'\\'))]
    out.extend('binds %s' % n for n in utf8(facts['bound']) if n not in rec['defined'])
    out.extend('reads %s' % n for n in utf8(facts['loads']) if n not in rec['reads'])
    # A name read may be rendered with subscripts, calls and literals (`a[i].f`, `','.join`):
    # its words must be on the line.
    line = b' '.join(tokens)
    out.extend('reads absent %s' % n for n in raw_reads if any(w not in line for w in kWord.findall(kQuoted.sub(b'', n))))
    for name, info in rec['within']:
        i = int(info[len(si.kWithinExprPrefix):])
        last = name.split(b'.')[-1]  # inside an f-string: the f-string token that holds it
        if not (0 <= i < len(tokens) and (tokens[i] == last or (kFString.match(tokens[i]) and last in tokens[i]))):
            out.append('within %s at %d' % (name, i))
    bound_within = set(n for n, _ in rec['within'])
    out.extend('no within %s' % n for n in utf8(facts['within']) if n not in bound_within)
    # A type parameter is recorded as (name, ':t:' + its star prefix), not as a name the line binds.
    params = set(n for n, i in rec['equivs'] if i.startswith(kTypeParamPrefix))
    out.extend('type parameter %s' % n for n in utf8(facts.get('typeparams') or []) if n not in params)
    out.extend('global %s' % n for n in utf8(facts['globals']) if (n, si.kGlobalPrefix) not in rec['equivs'])
    out.extend('nonlocal %s' % n for n in utf8(facts['nonlocals'])
               if (n, si.kNonlocalPrefix) not in rec['equivs'])
    if significant[:1] == [b'def'] or significant[:2] == [b'async', b'def']:
        if facts['args'] is not None and utf8(facts['args']) != rec['args']:
            out.append('args %r' % rec['args'])
    if significant[:1] == [b'class'] and facts['bases'] is not None and utf8(facts['bases']) != rec['bases']:
        out.append('bases %r' % rec['bases'])
    return out


kMaxJudgedTokens = 2500


class AstJudge(object):
    """Checks analyzed logicals against the ast facts of their completed sources, in batches.

    facts_of maps a list of completed sources to their facts (None where CPython cannot parse);
    disagreements are appended to `wrong`.
    """

    def __init__(self, facts_of, wrong, batch=1):
        self.facts_of, self.wrong, self.batch, self.pending = facts_of, wrong, batch, []

    def Add(self, path, logicals):
        # The walker stops at its visit limit (10,000 nodes) and says so: what it recorded of
        # a line that long (a generated table of thousands of tokens) is partial, not judged.
        self.pending.extend(((path, l.fFirstLine + 1, l.fLineText[:120], Recorded(l)), CompletedSource(l))
                            for l in logicals if l.fTokenCount <= kMaxJudgedTokens)
        if len(self.pending) >= self.batch:
            self.Flush()

    def Flush(self):
        pending, self.pending = self.pending, []
        facts = self.facts_of([src for _, src in pending]) if pending else []
        for ((path, line, text, rec), _), fact in zip(pending, facts):
            if fact is not None:
                self.wrong.extend('%s:%d: %r: %s' % (path, line, text, d) for d in Disagreements(rec, fact))


def HasFString(logical):
    return any(kFString.match(t) for t, _ in logical.fTokens)


def Triple(version):
    return tuple(int(p) for p in version.split('.'))


def FactsOf(version):
    """The function giving the ast facts of sources as the X.Y interpreter gives them."""
    script = kFactsMain % (Triple(version) >= (3, 8))

    def Facts(sources):
        data = json.dumps([[str(i), src.decode('latin-1')] for i, src in enumerate(sources)])
        out = json.loads(support.RunOracle(version, script, data))
        return [out[str(i)] for i in range(len(sources))]
    return Facts


kFactsMain = ('import sys; sys.path.insert(0, %r); import astfacts; astfacts.Main(%%s)'
              % os.path.dirname(os.path.abspath(__file__)))


def Describe(path, logical, result):
    return '%s:%d: %r -> %r' % (path, logical.fFirstLine + 1, logical.fLineText[:120], result)


# Reads a JSON list of [key, source] pairs on stdin; prints the keys of the
# sources that compile.
kOracleScript = r'''
import json, sys
ok = []
for key, src in json.loads(sys.stdin.read()):
    try:
        compile(src.encode('latin-1'), '<s>', 'exec')
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
        compile(source, '<s>', 'exec')
        return True
    except (SyntaxError, ValueError, TypeError):
        return False


class Corpus27Test(unittest.TestCase):

    def testStdlib(self):
        analyzer = analysis.GetAnalyzer('2.7')
        files = support.CorpusFiles('2.7')
        wrong, judged, print_function_files, rejected_files, counts = [], [], 0, 0, []
        judge = AstJudge(lambda sources: [astfacts.Facts(src) for src in sources], judged)
        for path in files:
            text = support.ReadBytes(path)
            logicals = GetLogicalsFromText(text)
            uses_print_function = analysis.UsesPrintFunction(logicals)
            print_function_files += uses_print_function
            analyzed = []
            failed = Analyze(analyzer.ImplFor(logicals), text, False, counts, analyzed)
            if not uses_print_function:  # ast.parse has no print_function flag here
                judge.Add(path, analyzed)
            if Compiles27(text):
                wrong.extend(Describe(path, l, r) for l, r in failed)
                wrong.extend(FileErrors('2.7', path, text))
                continue
            rejected_files += 1
            wrong.extend(Describe(path, l, r) for l, r in failed if Compiles27(CompletedSource(l)))
        sys.stderr.write('\n2.7 corpus: %d files (%d rejected by CPython, %d import print_function), '
                         '%d logical lines, %d disagree, %d disagree with the ast\n'
                         % (len(files), rejected_files, print_function_files, sum(counts), len(wrong),
                            len(judged)))
        self.assertEqual(wrong[:40], [])
        self.assertEqual(judged[:40], [], '\n'.join(judged[:40]))


class Corpus3Test(unittest.TestCase):
    """Each Python 3 version's analyzer over that version's standard library, judged by its CPython."""

    def Check(self, version, files, what='standard library'):
        if not files or support.Interpreter(version) is None:
            self.skipTest('no Python %s %s' % (version, what))
        analyzer = analysis.GetAnalyzer(version).ImplFor([])
        # 3.7 on, async and await are keywords everywhere: no scope rule to apply.
        async_scopes = Triple(version) < (3, 7)
        texts = [(path, support.ReadBytes(path)) for path in files]
        compiling = OracleCompiles(version, texts)
        wrong, judged, suspects, counts = [], [], [], []
        judge = AstJudge(FactsOf(version), judged, batch=40000)  # one process per 40,000 lines
        # 3.12's f-strings (a field reusing the string's quote, comments, line breaks) are
        # lexed as 3.11 lexes them: lines with f-strings that 3.11's CPython rejects are
        # set aside, not judged.
        pep701 = Triple(version) >= (3, 12)
        deferred = []  # (path, logical, result) of f-string lines
        for path, text in texts:
            analyzed = []
            for logical, result in Analyze(analyzer, text, async_scopes, counts, analyzed):
                if pep701 and HasFString(logical):
                    deferred.append((path, logical, result))
                elif path in compiling:
                    wrong.append(Describe(path, logical, result))
                else:
                    suspects.append((len(suspects), (path, logical, result)))
            if path in compiling:
                wrong.extend(FileErrors(version, path, text))
            if pep701:
                deferred.extend((path, l, None) for l in analyzed if HasFString(l))
                analyzed = [l for l in analyzed if not HasFString(l)]
            judge.Add(path, analyzed)
        older = OracleCompiles('3.11', [(i, CompletedSource(l)) for i, (_, l, _) in enumerate(deferred)]) or set()
        if Triple(version) >= (3, 9):
            # auto (newest first) finds no error in a file CPython compiles either.
            set_aside = set(path for i, (path, _, _) in enumerate(deferred) if i not in older)
            for path, text in texts:
                if path in compiling and path not in set_aside:
                    result = analysis.AnalyzeText(text)
                    wrong.extend('%s: auto (%s): %r' % (path, result.version, e) for e in result.SyntaxErrors()[:1])
        for i, (path, logical, result) in enumerate(deferred):
            if i not in older:
                continue
            if result is None:
                judge.Add(path, [logical])
            elif path in compiling:
                wrong.append(Describe(path, logical, result))
            else:
                suspects.append((len(suspects), (path, logical, result)))
        judge.Flush()
        accepted = OracleCompiles(version, [(i, CompletedSource(l)) for i, (_, l, _) in suspects])
        wrong.extend(Describe(*item) for i, item in suspects if i in accepted)
        sys.stderr.write('\n%s %s: %d files (%d rejected by CPython), %d logical lines, %d disagree, '
                         '%d disagree with the ast, %d lines with 3.12 f-strings set aside\n'
                         % (version, what, len(texts), len(texts) - len(compiling), sum(counts), len(wrong),
                            len(judged), len(deferred) - len(older)))
        self.assertEqual(wrong[:40], [])
        self.assertEqual(judged[:40], [], '\n'.join(judged[:40]))

    def testStdlib36(self):
        self.Check('3.6', support.CorpusFiles('3.6'))

    def testStdlib37(self):
        self.Check('3.7', support.CorpusFiles('3.7'))

    def testStdlib38(self):
        self.Check('3.8', support.CorpusFiles('3.8'))

    def testStubs38(self):
        self.Check('3.8', support.StubFiles(), 'typeshed stubs')

    def testStdlib39(self):
        self.Check('3.9', support.CorpusFiles('3.9'))

    def testStdlib310(self):
        self.Check('3.10', support.CorpusFiles('3.10'))

    def testStdlib311(self):
        self.Check('3.11', support.CorpusFiles('3.11'))

    def testStdlib312(self):
        self.Check('3.12', support.CorpusFiles('3.12'))

    def testStdlib313(self):
        self.Check('3.13', support.CorpusFiles('3.13'))

    def testStubs313(self):
        self.Check('3.13', support.StubFiles(), 'typeshed stubs')


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
