"""The type-hint walker: what annotations and type comments record under the 2.7, 3.6 and 3.8 analyzers,
its operations, and three judges over real code: CPython's ast of the typeshed stubs (3.6 and 3.8), the same defs
rewritten in the type-comment form, and the type comments CPython 3.8 itself attaches. Also mangled
comments on real lines, and the hint parser's free lists and memory over repeated passes.
"""

import gc
import json
import logging
import logging.handlers
import os
import random
import sys
import unittest

from tests.py import support

try:
    from pysource import treelens as tl
    from pysource import symbolinfo as si
    from pysource import utils
    from pysource import analysis
    sys.path.insert(0, os.path.join(support.kRoot, 'bench'))
    from treelens_bench import CompletedSource
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


def HintsOf(logicals):
    """(plain hints, argument hints) recorded on the logicals: (name, hint text) pairs."""
    pick = lambda pairs: [(n, i[len(si.kTypeHintPrefix):]) for n, i in pairs if i.startswith(si.kTypeHintPrefix)]
    plain, args = [], []
    for logical in logicals:
        plain.extend(pick(logical.fTypeEquivs))
        args.extend(pick(logical.fArgTypeEquivs))
    return plain, args


def Analyze(version, source):
    """The logicals of source, each analyzed; results that are not None fail the calling test."""
    logicals = utils.GetLogicalsFromText(source)
    results = [support.Analyzer(version).AnalyzeSingleLogical(l, support.InAsyncDef(l)) for l in logicals]
    return logicals, [r for r in results if r is not None]


# 3.9 to 3.13 analyzers: unions, builtin generics, a starred annotation, type parameters.
kCases312 = [
    (b'x: int | None = None\n', [(b'x', b'int | None')], []),
    (b'def f[T](x: T, *args: *Ts, **kw: list[int]) -> dict[str, T] | None: pass\n', [],
     [(b'x', b'T'), (b'args', b'*Ts'), (b'kw', b'list[int]'), (b'return', b'dict[str, T] | None')]),
    (b'class C[T: (int, str)]:\n    attr: tuple[T, *Ts]\n', [(b'attr', b'tuple[T, *Ts]')], []),
]


class ReportsCollected(object):
    """Mixin: a test fails when the analyzer reports an internal error while it runs."""

    def setUp(self):
        self.reports = logging.handlers.BufferingHandler(1 << 20)
        logging.getLogger('pysource').addHandler(self.reports)

    def tearDown(self):
        logging.getLogger('pysource').removeHandler(self.reports)
        self.assertEqual([r.getMessage() for r in self.reports.buffer], [])


A0, A1 = si.BuildArgInfo(0, None), si.BuildArgInfo(1, None)

# (source, plain hints, argument hints); checked under the 2.7 and the Python 3 analyzers.
kCases = [
    (b'x = []  # type: List[int]\n', [(b'x', b'List[int]')], []),
    (b'x = y = []  # type: List[int]\n', [(b'x', b'List[int]')], []),  # the first target only
    (b'a, (b, c) = f()  # type: int, (str, Dict[str, int])\n',
     [(b'a', b'int'), (b'b', b'str'), (b'c', b'Dict[str, int]')], []),
    (b'a, b, c = f()  # type: int, str\n', [(b'a', b'int'), (b'b', b'str')], []),
    (b'a, b = f()  # type: Tuple[int, str]\n', [], []),  # no sequence to match element-wise
    (b'for k, v in d.items():  # type: str, int\n    pass\n', [(b'k', b'str'), (b'v', b'int')], []),
    (b'with f() as a, g() as self.b:  # type: IO[str]\n    pass\n', [(b'a', b'IO[str]'), (b'self.b', b'IO[str]')], []),
    (b'x = (1,  # type: int\n     2)\n', [], []),  # a comment on an earlier row ends nothing
    (b'x = (1,\n     2)  # type: Tuple[int, int]\n', [(b'x', b'Tuple[int, int]')], []),
    (b'x = 1  #type:int\n', [(b'x', b'int')], []),
    (b'x = 1  # the type: int\n', [], []),
    (b'x = 1  # noqa # type: int\n', [(b'x', b'int')], []),
    (b'x = 1  # type:\n', [], []),
    (b'x = 1  # type: ignore\n', [], []),
    (b'x = 1  # type: ignore[attr-defined]\n', [], []),
    (b'x = f()  # type: ignored\n', [(b'x', b'ignored')], []),
    (b'self.x = 1  # type: int  # note\n', [(b'self.x', b'int')], []),
    (b'x = 1  # type: Optional["Foo"]\n', [(b'x', b'Optional[' + si.EncodeStringLiteral(b'"Foo"') + b']')], []),
    (b'x[0] = f()  # type: int\n', [], []),  # no name to record
    (b'x = 1  # type: List[int\n', [], []),  # does not parse
    (b'x = 1  # type: y = 2\n', [], []),  # a statement, no type
    (b'x += 1  # type: int\n', [], []),
    (b'def f(a, b):  # type: (int, str) -> bool\n', [], [(b'a', b'int'), (b'b', b'str'), (b'return', b'bool')]),
    (b'def f():  # type: (...) -> int\n', [], [(b'return', b'int')]),
    (b'def f(d):  # type: (Dict[str, int]) -> None\n', [], [(b'd', b'Dict[str, int]'), (b'return', b'None')]),
    (b'def f(a, *b, **c):  # type: (int, *str, **float) -> None\n', [],
     [(b'a', b'int'), (b'b', b'str'), (b'c', b'float'), (b'return', b'None')]),
    (b'def f(a):  # type: (int, str) -> None\n', [], [(b'a', b'int'), (b'return', b'None')]),  # surplus type
    (b'def f(a):  # type: (int) -> "Foo"\n', [], [(b'a', b'int'), (b'return', b'Foo')]),
    (b'def f(a,  # type: int\n      b,  # type: str\n      ):\n', [], [(b'a', b'int'), (b'b', b'str')]),
    (b'def f(self, a):  # type: (int) -> None\n', [], [(b'self', b'int'), (b'return', b'None')]),
    (b'class C:\n    def f(self, a):  # type: (int) -> None\n', [], [(b'a', b'int'), (b'return', b'None')]),
    (b'class C:\n    def f(self, a):  # type: (C, int) -> None\n', [],
     [(b'self', b'C'), (b'a', b'int'), (b'return', b'None')]),
    (b'def f(a, b):\n    # type: (int, str) -> bool\n', [(A0, b'int'), (A1, b'str'), (b'return', b'bool')], []),
    (b'# type: int\n', [], []),
]

kCases36 = [
    (b'x: List[int] = []\n', [(b'x', b'List[int]')], []),
    (b'self.x: "Foo"\n', [(b'self.x', si.EncodeStringLiteral(b'"Foo"'))], []),
    (b'x: int = 1  # type: str\n', [(b'x', b'int')], []),
    (b'if c: y: int = 1\n', [(b'y', b'int')], []),
    (b'def f(a: int, b: "Foo" = None, *c: str, d: Dict[str, int], **e: float) -> "Bar": pass\n', [],
     [(b'a', b'int'), (b'b', si.EncodeStringLiteral(b'"Foo"')), (b'c', b'str'), (b'd', b'Dict[str, int]'),
      (b'e', b'float'), (b'return', b'Bar')]),
    (b'def f(a: int, b,  # type: str\n      ): pass\n', [], [(b'a', b'int'), (b'b', b'str')]),
    (b'async def f(a: int) -> Awaitable[None]: pass\n', [], [(b'a', b'int'), (b'return', b'Awaitable[None]')]),
]

# 3.8: positional-only parameters, annotated and in the comment form; an annotated tuple value.
kCases38 = [
    (b'def f(a: int, /, b: str = x, *, c: T) -> None: pass\n', [],
     [(b'a', b'int'), (b'b', b'str'), (b'c', b'T'), (b'return', b'None')]),
    (b'def f(a, /, b):  # type: (int, str) -> None\n', [], [(b'a', b'int'), (b'b', b'str'), (b'return', b'None')]),
    (b'x: Tuple[int, int] = 1, 2\n', [(b'x', b'Tuple[int, int]')], []),
    (b'if (n := f()):  # type: ignore\n', [], []),
]


class RecordsTest(ReportsCollected, unittest.TestCase):

    def testCases(self):
        for versions, cases in ((('2.7', '3.6', '3.7', '3.8', '3.13'), kCases), (('3.6', '3.7', '3.8', '3.13'), kCases36),
                                (('3.8', '3.9', '3.13'), kCases38), (('3.12', '3.13'), kCases312)):
            for version in versions:
                for source, plain, args in cases:
                    logicals, failed = Analyze(version, source)
                    self.assertEqual(failed, [], (version, source))
                    self.assertEqual(HintsOf(logicals), (plain, args), '%s under %s' % (source, version))

    def testTwoPointSevenDefaultHintGrammar(self):
        # Signature comments are Python 3 expressions in Python 2 code too: the analyzer's default
        # hint grammar parses them, a 2.7 hint grammar cannot.
        source = b'def f(a):  # type: (int) -> None\n'
        for hint_grammar, want in ((tl.kPy3DefaultGrammar, [(b'a', b'int'), (b'return', b'None')]),
                                   (tl.kPy2DefaultGrammar, [])):
            analyzer = tl.CPGenAnalyzerImpl((2, 7, 0), tl.kPy2DefaultGrammar, None, False, hint_grammar)
            logical = utils.GetLogicalsFromText(source)[0]
            self.assertIsNone(analyzer.AnalyzeSingleLogical(logical, False))
            self.assertEqual(HintsOf([logical])[1], want, hint_grammar)


class OperationsTest(unittest.TestCase):

    def setUp(self):
        self.walker = support.Analyzer('3.6')._fTypeHintWalker

    def testCommentsAndSignatures(self):
        for comment, hint in [(b'#  type:  List[int]  ', b'List[int]'), (b'type: int', None), (b'# type:', b''),
                              (b'# type:ignore#x', None), (b'# type: a # type: b', b'a # type: b')]:
            self.assertEqual(self.walker._GetHintFromComment(comment), hint, comment)
        self.assertRaisesRegexp(TypeError, '^Expected bytes, got unicode$', self.walker._GetHintFromComment, u'# type: x')
        rewrite = lambda hint: b' '.join(self.walker._RewriteFuncdefCommentHint(hint))
        self.assertEqual(rewrite(b'(Dict[str, int], *str, **x) -> None'),
                         b'def function ( a : Dict [ str , int ] , * a : str , ** a : x ) -> None :')
        self.assertEqual(rewrite(b'(Tuple[int, ...]) -> None'), b'def function ( a : Tuple [ int , ... ] ) -> None :')

    def testParseHint(self):
        parser = self.walker._fHintParser
        free = parser._FreeNodeCount()
        for hint in (b'', b'int\nstr', b'List['):  # nothing, two logical lines, no parse
            self.assertIsNone(self.walker._ParseHint(hint), hint)
        for hint, cls in ((b'Dict[str, "Foo"]', tl.CAtomExpr), (b'x = 1', tl.CExprStmt)):
            node = self.walker._ParseHint(hint)
            self.assertIsInstance(node, cls)
            parser.DiscardNode(node)
        self.assertGreaterEqual(parser._FreeNodeCount(), free)
        self.assertRaisesRegexp(TypeError, '^Expected list, got tuple$', self.walker._ParseHintTokList, (b'int',))
        self.assertRaisesRegexp(TypeError, '^Expected bytes, got unicode$', self.walker._ParseHint, u'int')
        self.assertRaisesRegexp(TypeError, '^logical must be a logical line$', self.walker._FindComment, 0, object())

    def testWalkState(self):
        walker = tl.CTypeHintWalker((3, 6, 0), tl.kPy3DefaultGrammar)
        parser = tl.CPGenParserImpl((3, 6, 0))
        logical = utils.GetLogicalsFromText(b'x = (1,\n     2)  # type: int\n')[0]
        tree = parser.ParseToNode(logical, False)
        seen = []

        def Nested(w, node):  # a handler that tries a second walk
            seen.append((w._fCommentHintCount, w._GetRowRange(node)))
            self.assertRaisesRegexp(ValueError, '^Only one logical may be walked at a time$', w.Walk, node, logical)
            seen.append(w._fCommentHintCount)
            return False
        walker._fDispatchDict[tl.CExprStmt] = Nested
        self.assertIsNone(walker.Walk(tree, logical))
        self.assertEqual(seen, [(1, (0, 2)), 1])
        self.assertEqual((walker._fCommentHintCount, walker._fLogical, walker._fNodeStack), (0, None, []))
        self.assertRaisesRegexp(TypeError, 'Cannot convert', walker.Walk, 1, logical)
        self.assertRaisesRegexp(TypeError, '^Argument must be a logical$', walker.Walk, tree, object())
        self.assertEqual((walker._fCommentHintCount, walker._fLogical), (0, None))
        parser.DiscardNode(tree)


def Oracle(version, script, items):
    """Runs script under Python X.Y with the JSON of items on stdin; its JSON output, or None."""
    out = support.RunOracle(version, script, json.dumps(items))
    return None if out is None else json.loads(out)


def Latin(text):
    return text.decode('latin-1')


# Judges annotations: for each [key, completed source, plain hints, argument hints] the differences
# between the recorded hints and the annotations of CPython's ast ({key: [differences]}; None
# where the source does not compile). A recorded hint text must parse to the annotation's tree;
# string values are not compared, since the recorded text encodes strings (a forward reference
# returned is compared by its contents).
kAnnotationJudge = r'''
import ast, json, re, sys

def Tree(node):
    for n in ast.walk(node):
        if isinstance(n, (ast.Str, ast.Bytes)):
            n.s = ''
    return ast.dump(node).replace("Bytes(s='')", "Str(s='')")

def Dotted(node):
    parts = []
    while isinstance(node, ast.Attribute):
        parts.append(node.attr)
        node = node.value
    return '.'.join([node.id] + parts[::-1]) if isinstance(node, ast.Name) else None

def Same(text, want):
    if want[0] == 'str':
        return re.sub(r'\s', '', text) == re.sub(r'\s', '', want[1])
    try:
        return Tree(ast.parse(text.strip(), mode='eval').body) == want[1]
    except SyntaxError:
        return False

out = {}
for key, src, plain, args in json.loads(sys.stdin.read()):
    try:
        tree = ast.parse(src.encode('latin-1'))
    except (SyntaxError, ValueError, TypeError):
        out[key] = None
        continue
    want_plain, want_args = [], []
    nodes = sorted((n for n in ast.walk(tree) if isinstance(n, (ast.AnnAssign, ast.FunctionDef, ast.AsyncFunctionDef))),
                   key=lambda n: (n.lineno, n.col_offset))
    for n in nodes:
        if isinstance(n, ast.AnnAssign):
            name = Dotted(n.target)
            if name is not None:
                want_plain.append((name, ('tree', Tree(n.annotation))))
            continue
        a = n.args
        for arg in getattr(a, 'posonlyargs', []) + a.args + [a.vararg] + a.kwonlyargs + [a.kwarg]:
            if arg is not None and arg.annotation is not None:
                want_args.append((arg.arg, ('tree', Tree(arg.annotation))))
        if n.returns is not None:
            ret = ('str', n.returns.s) if isinstance(n.returns, ast.Str) else ('tree', Tree(n.returns))
            want_args.append(('return', ret))
    wrong = []
    for what, have, want in (('plain', plain, want_plain), ('args', args, want_args)):
        if len(have) != len(want) or any(h[0] != w[0] or not Same(h[1], w[1]) for h, w in zip(have, want)):
            wrong.append('%s %r, ast %r' % (what, have, [(n, w[1][:80]) for n, w in want]))
    out[key] = wrong
sys.stdout.write(json.dumps(out))
'''

# Prints {key: whether CPython attaches a type comment to some statement or parameter} for
# [key, source] items (None where the source does not parse).
kTypeCommentJudge = r'''
import ast, json, sys
out = {}
for key, src in json.loads(sys.stdin.read()):
    try:
        tree = ast.parse(src, type_comments=True)
    except (SyntaxError, ValueError):
        out[key] = None
        continue
    out[key] = any(getattr(n, 'type_comment', None) is not None for n in ast.walk(tree))
sys.stdout.write(json.dumps(out))
'''


def StubLogicals(version='3.6', limit=None):
    """(path, logicals) of the typeshed stubs, analyzed under version; skips the test without them."""
    files = support.StubFiles(limit)
    if not files:
        raise unittest.SkipTest('typeshed stubs not fetched (tools/fetch-stubs.sh needs npm)')
    for path in files:
        yield path, Analyze(version, support.ReadBytes(path))[0]


def Significant(logical):
    return [t for t, _ in logical.fTokens if not t.startswith((b'#', b'\\'))]


_kParsers = {}


def Parse(logical, in_async_def=False, version='3.6'):
    """The tree of a logical under version (the caller discards it with Parser(version).DiscardNode), or None."""
    try:
        return Parser(version).ParseToNode(logical, in_async_def)
    except Exception:
        return None


def Parser(version='3.6'):
    if version not in _kParsers:
        triple, grammar, _ = analysis.kGrammars[version]
        _kParsers[version] = tl.CPGenParserImpl(triple, grammar, list(analysis.kKeywords[version]), True)
    return _kParsers[version]


def CommentForm(logical, version='3.6'):
    """(the def of an annotated def logical in the type-comment form, in a class?), or None.

    Every parameter but a method's first must be annotated and the return type given.
    """
    tree = Parse(logical, support.InAsyncDef(logical), version)
    if tree is None:
        return None
    if isinstance(tree, tl.CFuncdefStmt):
        params = [a for a in tl.GetDefiningArgInfoList(tree.GetParameters()) if isinstance(a, tl.CArgInfo)]
        params = [(a.prefix or b'', a.name.fText) for a in params if a.name is not None]
    Parser(version).DiscardNode(tree)
    if not isinstance(tree, tl.CFuncdefStmt):
        return None
    _, args = HintsOf([logical])
    hints = dict(args)
    in_class = logical.fParentScope is not None and logical.fParentScope.fKind == 1
    typed = params[1:] if in_class and params and params[0][1] not in hints else params
    # Rendered strings with encoded characters would not render back to themselves.
    if b'return' not in hints or any(name not in hints for _, name in typed) or len(hints) != len(typed) + 1 or \
            any(b'%' in h for h in hints.values()):
        return None
    sig = b', '.join(p + n for p, n in params)
    types = b', '.join(p + hints[n] for p, n in typed)
    head = b'async def ' if Significant(logical)[0] == b'async' else b'def '
    return head + Significant(logical)[1 if head == b'def ' else 2] + b'(' + sig + b'):  # type: (' + types + \
        b') -> ' + hints[b'return'] + b'\n', in_class


class StubCorpusTest(ReportsCollected, unittest.TestCase):
    """Over the typeshed stubs: annotations judged by CPython, then the same defs as type comments."""

    def testAnnotationsAndCommentForm36(self):
        self.Check('3.6')

    def testAnnotationsAndCommentForm38(self):
        self.Check('3.8')

    def Check(self, version):
        items, forms, lines = [], [], 0
        for path, logicals in StubLogicals(version):
            for i, logical in enumerate(logicals):
                lines += 1
                if logical.fKind not in (0, 1, 2) or b':' not in Significant(logical):
                    continue
                plain, args = HintsOf([logical])
                key = '%s:%d' % (path, logical.fFirstLine + 1)
                items.append([key, Latin(CompletedSource(logical)), [(Latin(n), Latin(t)) for n, t in plain],
                              [(Latin(n), Latin(t)) for n, t in args]])
                if logical.fKind == 2 and args:
                    form = CommentForm(logical, version)
                    if form is not None:
                        forms.append((key, args, form))
        judged = Oracle(version, kAnnotationJudge, items)
        if judged is None:
            self.skipTest('no Python %s' % version)
        wrong = ['%s: %s' % (k, d) for k, diffs in sorted(judged.items()) if diffs for d in diffs]
        compiled = sum(1 for v in judged.values() if v is not None)
        # The comment form records what the annotations record, under 2.7 (where type comments are the
        # only way to give hints) as under the version.
        for key, args, (source, in_class) in forms:
            prefix = b'class C:\n    ' if in_class else b''
            for form_version in ('2.7', version):
                logicals, failed = Analyze(form_version, prefix + source)
                if failed and form_version == '2.7':  # not 2.7 code: async def, keyword-only parameters, print
                    continue
                got = HintsOf(logicals[-1:])[1]
                if failed or got != args:
                    wrong.append('%s under %s: %r records %r, annotated %r'
                                 % (key, form_version, source, got, args))
        sys.stderr.write('\nstubs: %d logical lines, %d judged by CPython %s, %d defs in the comment form, '
                         '%d disagree\n' % (lines, compiled, version, len(forms), len(wrong)))
        self.assertGreater(compiled, 0)
        self.assertEqual(wrong[:30], [], '\n'.join(wrong[:30]))


def Shape(walker, node, rnd):
    """A hint matching a target's shape (int for a name, a tuple for a sequence), or None."""
    count = node.GetSubExprCount() if isinstance(node, tl.CExpression) else 0
    if count:
        parts = [Shape(walker, node.GetSubExpr(i), rnd) for i in range(count)]
        return None if None in parts else b'(' + b', '.join(parts) + (b',)' if count == 1 else b')')
    if walker._fNameConv.TextForNode(node, dotted_name_only=True) is None:
        return None
    return rnd.choice([b'int', b'List[str]', b'Dict[str, Tuple[int, ...]]', b'"Foo"', b'Optional[C.D]'])


def CommentedStatements(rnd, limit):
    """Assignments, for and with statements of the 3.6 stdlib with type comments appended.

    Targets are names, dotted names and sequences of them, so that every comment CPython attaches
    names something here too. Some comments are not type comments for either side.
    """
    walker = support.Analyzer('3.6')._fTypeHintWalker
    out = []
    for path in support.CorpusFiles('3.6', limit=limit):
        for logical in utils.GetLogicalsFromText(support.ReadBytes(path)):
            if logical.fKind != 0 and Significant(logical)[:1] not in ([b'for'], [b'with']):
                continue
            if any(t.startswith(b'#') for t, _ in logical.fTokens) or support.InAsyncDef(logical):
                continue
            tree = Parse(logical)
            if tree is None:
                continue
            if isinstance(tree, tl.CExprStmt) and tree.GetAnnotatedAssignNode() is None and b'=' in Significant(logical):
                targets = [tree.GetInitialTestExpr()]
            elif isinstance(tree, tl.CForStmt):
                targets = [tree.GetTarget()]
            elif isinstance(tree, tl.CWithStmt):
                targets = [c.fChildren[2] for c in tree.fChildren if isinstance(c, tl.CWithItem)]
            else:
                targets = []
            hints = [Shape(walker, t, rnd) for t in targets]
            Parser().DiscardNode(tree)
            if hints and None not in hints and (isinstance(tree, tl.CExprStmt) or len(set(hints)) == 1):
                form = rnd.choice([b'  # type: %s', b'  #type:%s', b'  # the type: %s', b'  # type: ignore'])
                text = logical.fLineText.rstrip(b'\r\n')
                text = text[len(text) - len(text.lstrip(b' \t')):]
                if text.endswith(b':'):
                    out.append(text + form.replace(b'%s', hints[0]) + b'\n    pass\n')
                else:
                    out.append(text + form.replace(b'%s', hints[0]) + b'\n')
    return out


class TypeCommentOracleTest(ReportsCollected, unittest.TestCase):
    """The statements CPython 3.8 attaches a type comment to are those that get a hint here."""

    def testAgainstCPython(self):
        if support.Interpreter('3.8') is None:
            self.skipTest('no Python 3.8')
        rnd = random.Random(86)
        sources = CommentedStatements(rnd, 40 if support.kSanitized else 250)
        for path, logicals in StubLogicals(limit=40 if support.kSanitized else 400):
            for logical in logicals:
                form = logical.fKind == 2 and CommentForm(logical)
                if form:
                    source, in_class = form
                    if rnd.random() < 0.3:  # the comment on the first line of the body
                        head, comment = source.split(b'  # type: ')
                        source = head + b'\n    # type: ' + comment
                    source = source + b'    ...\n'
                    sources.append(b'class C:\n' + b''.join(b'    ' + l for l in source.splitlines(True))
                                   if in_class else source)
        attached = Oracle('3.8', kTypeCommentJudge, [[str(i), Latin(s)] for i, s in enumerate(sources)])
        wrong, counts = [], [0, 0]
        for i, source in enumerate(sources):
            cpython = attached[str(i)]
            if cpython is None:
                continue
            logicals, failed = Analyze('3.6', source)
            here = any(HintsOf(logicals)[0] + HintsOf(logicals)[1]) and not failed
            counts[cpython] += 1
            if here != cpython:
                wrong.append('%r: CPython %s, here %s' % (source, cpython, here))
        sys.stderr.write('\ntype comments: %d sources, %d with a comment CPython attaches, %d without, '
                         '%d disagree\n' % (len(sources), counts[1], counts[0], len(wrong)))
        self.assertTrue(counts[0] and counts[1], counts)
        self.assertEqual(wrong[:30], [], '\n'.join(wrong[:30]))


class RobustnessTest(ReportsCollected, unittest.TestCase):

    def testMangledTypeComments(self):
        rnd = random.Random(int(os.environ.get('TREELENS_FUZZ_SEED') or 977))
        rounds = int(os.environ.get('TREELENS_FUZZ_ROUNDS') or (300 if support.kSanitized else 1500))
        lines = [l.fLineText.rstrip(b'\r\n') for path in support.CorpusFiles('3.6', limit=15)
                 for l in utils.GetLogicalsFromText(support.ReadBytes(path)) if l.fKind not in (21, 22)]
        pieces = [b'(', b')', b'[', b']', b',', b'->', b'...', b'*', b'**', b'"', b"'x'", b'int', b'#', b'type:',
                  b'ignore', b'\\', b'lambda', b':', b'=', b'def', b'None', b'yield', b'{', b'}', b'\x00', b'\xff']
        analyzers = [support.Analyzer('2.7'), support.Analyzer('3.6'),
                     tl.CPGenAnalyzerImpl((3, 7, 0), tl.kPy3DefaultGrammar, list(analysis.kPy3Keywords))]
        for _ in range(rounds):
            hint = b''.join(rnd.choice(pieces) + rnd.choice([b'', b' ']) for _ in range(rnd.randrange(8)))
            if rnd.random() < 0.5:
                hint = rnd.choice([b'(int, str) -> ', b'(...) -> ', b'List[', b'']) + hint
            comment = rnd.choice([b'# type: ', b'#type:', b'# noqa # type: ', b'# type: ignore']) + hint
            line = rnd.choice(lines)
            if rnd.random() < 0.3:  # inside a continued line, or on a line of its own
                line = line.replace(b',', b',  ' + comment.replace(b'\\', b'') + b'\n', 1)
            source = line + b'  ' + comment + b'\n' if rnd.random() < 0.8 else comment + b'\n'
            for logical in utils.GetLogicalsFromText(source):
                for analyzer in analyzers:
                    logical.fInspected = False
                    result = analyzer.AnalyzeSingleLogical(logical, False)
                    self.assertTrue(result is None or isinstance(result, SyntaxError), (source, result))
        for analyzer in analyzers:
            walker = analyzer._fTypeHintWalker
            self.assertEqual((walker._fCommentHintCount, walker._fLogical), (0, None))

    def testFreeListsAndMemoryFlat(self):
        analyzer = tl.CPGenAnalyzerImpl((2, 7, 0), tl.kPy2DefaultGrammar, None, False)
        parser = analyzer._fTypeHintWalker._fHintParser
        text = b''.join(source for source, _, _ in kCases) * 3
        passes = []
        for _ in range(4):
            for logical in utils.GetLogicalsFromText(text):
                analyzer.AnalyzeSingleLogical(logical, False)
            gc.collect()
            passes.append((parser._FreeNodeCount(), len(gc.get_objects())))
        self.assertGreater(passes[0][0], 0)
        for free, objects in passes[1:]:
            self.assertEqual(free, passes[0][0], passes)
            self.assertLessEqual(objects, passes[0][1] + 20, passes)


if __name__ == '__main__':
    unittest.main()
