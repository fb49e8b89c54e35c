"""Behaviour of pysource.optpgen: trees, converters, errors, recovery, memory."""

import gc
import pickle
import resource
import StringIO
import sys
import unittest
import weakref

from lib2to3.pgen2 import parse as _l2parse

from tests.py import support

try:
    from pysource import optpgen
    from tests.py import test_optpgen_corpus as corpus
except ImportError as _exc:  # native modules not built
    optpgen = None
    _kImportError = str(_exc)

NAME, NUMBER, NEWLINE, ENDMARKER, LPAR, RPAR, PLUS, EQUAL = 1, 2, 4, 0, 7, 8, 14, 22

kTinyGrammar = """
start: stmt* ENDMARKER
stmt: NAME '=' expr NEWLINE | 'print' expr NEWLINE
expr: term ('+' term)*
term: NAME | NUMBER | '(' expr ')'
"""


def TinyGrammar():
    names, ops = corpus.TokenTables()
    return optpgen.ParserGenerator('<tiny>', names, ops,
                                   StringIO.StringIO(kTinyGrammar)).make_grammar()


def Tokens(*pairs):
    """(type, value, context) triples, context = index."""
    return [(t, v, i) for i, (t, v) in enumerate(pairs)]


kAssign = Tokens((NAME, 'x'), (EQUAL, '='), (NAME, 'a'), (PLUS, '+'),
                 (NUMBER, '1'), (NEWLINE, '\n'), (ENDMARKER, None))


def Feed(parser, toks, start=None):
    parser.setup(start)
    for t, v, c in toks:
        if parser.addtoken(t, v, c):
            return True
    return False


class Recorder(optpgen.NodeConverter if optpgen else object):
    """Python converter building (type, value, context, children) tuples and
    recording its calls."""

    def __init__(self):
        self.calls = []

    def convert(self, grammar, node_type, value, context, children):
        self.calls.append((grammar, node_type, value, context, children))
        return (node_type, value, context, children)


class OptpgenTestBase(unittest.TestCase):

    def setUp(self):
        if optpgen is None:
            self.skipTest('native modules not built: %s' % _kImportError)
        self.grammar = TinyGrammar()
        self.sym = self.grammar.symbol2number

    def assertParseError(self, parser, toks, msg, bad_index, start=None):
        try:
            Feed(parser, toks, start)
        except optpgen.ParseError as e:
            t, v, c = toks[bad_index]
            self.assertEqual((msg, t, v, c), (e.msg, e.type, e.value, e.context))
            return e
        self.fail('no ParseError for %r' % (toks,))


class TreeTest(OptpgenTestBase):

    def testRawTreeAsLib2to3(self):
        ref = _l2parse.Parser(self.grammar, corpus._RawConvert)
        raw = optpgen.CreateParser(self.grammar, None)
        cases = [
            ('assignment', kAssign),
            ('keyword', Tokens((NAME, 'print'), (NAME, 'print2'),
                               (NEWLINE, '\n'), (ENDMARKER, None))),
            ('empty', Tokens((ENDMARKER, None))),
            ('nested', Tokens((NAME, 'print'), (LPAR, '('), (LPAR, '('),
                              (NAME, 'a'), (RPAR, ')'), (RPAR, ')'),
                              (NEWLINE, '\n'), (ENDMARKER, None))),
        ]
        for name, toks in cases:
            self.assertEqual(corpus.ReferenceParse(ref, toks),
                             corpus.NativeParse(raw, toks), name)

    def testPromoteSingleChild(self):
        raw = optpgen.CreateParser(self.grammar, None)
        promoted = optpgen.CreateParser(self.grammar, None,
                                        promotesinglechild=True)
        Feed(raw, kAssign)
        Feed(promoted, kAssign)
        self.assertEqual(corpus.Promoted(raw.getrootnode()),
                         promoted.getrootnode())
        # `x = a + 1`: term nodes vanish, expr keeps its three children.
        stmt = promoted.getrootnode()[3][0]
        self.assertEqual((NAME, 'x', 0, None), stmt[3][0])
        self.assertEqual([(NAME, 'a', 2, None), (PLUS, '+', 3, None),
                          (NUMBER, '1', 4, None)], stmt[3][2][3])
        # Every converted nonterminal has two children or more.
        rec = Recorder()
        p = optpgen.CreateParser(self.grammar, rec, True)
        Feed(p, kAssign)
        sizes = [len(c[4]) for c in rec.calls if c[4] is not None]
        self.assertTrue(sizes and min(sizes) >= 2, sizes)

    def testPythonConverterArguments(self):
        rec = Recorder()
        p = optpgen.CreateParser(self.grammar, rec)
        self.assertFalse(p._usesnative)
        Feed(p, kAssign)
        raw = optpgen.CreateParser(self.grammar, None)
        Feed(raw, kAssign)
        self.assertEqual(raw.getrootnode(), p.getrootnode())
        for grammar, node_type, value, context, children in rec.calls:
            self.assertIs(self.grammar, grammar)
            if node_type < 256:
                self.assertIsNone(children, node_type)
            else:
                self.assertIsNone(value, node_type)
                self.assertIsInstance(children, list)
        # The first call is the first token; the last the start symbol.
        self.assertEqual((NAME, 'x', 0, None), rec.calls[0][1:])
        self.assertEqual((self.sym['start'], None, None), rec.calls[-1][1:4])

    def testConvertReturningNoneDropsNode(self):
        class DropNewlines(Recorder):
            def convert(self, grammar, node_type, value, context, children):
                if node_type == NEWLINE:
                    return None
                return (node_type, value, context, children)
        p = optpgen.CreateParser(self.grammar, DropNewlines())
        Feed(p, kAssign)
        stmt = p.getrootnode()[3][0]
        self.assertEqual([NAME, EQUAL, self.sym['expr']],
                         [c[0] for c in stmt[3]])
        # A dropped root leaves no root node.
        class DropAll(Recorder):
            def convert(self, *args):
                return None
        p = optpgen.CreateParser(self.grammar, DropAll())
        self.assertTrue(Feed(p, kAssign))
        self.assertIsNone(p.getrootnode())

    def testKeywordValues(self):
        # Unicode keyword texts are keywords; a NAME without text is a name.
        p = optpgen.CreateParser(self.grammar, None)
        Feed(p, Tokens((NAME, u'print'), (NAME, 'a'), (NEWLINE, '\n'),
                       (ENDMARKER, None)))
        self.assertEqual(self.sym['stmt'], p.getrootnode()[3][0][0])
        self.assertParseError(p, Tokens((NAME, None), (NAME, 'a')),
                              'bad input', 1)


class ConverterPathTest(OptpgenTestBase):

    def testNativeSlotAndOverrides(self):
        self.assertIn('convert', optpgen._NoOpConverter.__dict__)

        class Plain(optpgen._NoOpConverter):
            pass

        class Override(optpgen._NoOpConverter):
            def __init__(self):
                self.seen = 0

            def convert(self, *args):
                self.seen += 1
                return optpgen._NoOpConverter.convert(self, *args)

        class Other(object):
            def convert(self, grammar, node_type, value, context, children):
                return node_type
        cases = [
            # _NoOpConverter defines convert in C: no override.
            ('native', optpgen._NoOpConverter(), True),
            ('native dropping', optpgen._NoOpConverter(drop=True), True),
            ('subclass without convert', Plain(), True),
            ('subclass overriding convert', Override(), False),
            ('object with convert', Other(), False),
            ('raw', None, False),
        ]
        # Tokens become their text (ENDMARKER's None drops it), nonterminals
        # their children.
        tree = [['x', '=', [['a'], '+', ['1']], '\n']]
        for name, conv, native in cases:
            p = optpgen.CreateParser(self.grammar, conv)
            self.assertTrue(Feed(p, kAssign), name)
            self.assertEqual(native, p._usesnative, name)
            if isinstance(conv, optpgen._NoOpConverter):
                self.assertEqual((7, 5), (conv.tokens, conv.nodes), name)
                self.assertEqual(None if 'drop' in name else tree,
                                 p.getrootnode(), name)
        # The override saw every call, and then ran the native slot.
        self.assertEqual(12, cases[3][1].seen)

    def testBaseConverterAndBadConverters(self):
        p = optpgen.CreateParser(self.grammar, optpgen.NodeConverter())
        p.setup()
        with self.assertRaises(NotImplementedError):
            p.addtoken(NAME, 'x', 0)
        with self.assertRaises(TypeError):
            optpgen.CreateParser(self.grammar, object())
        with self.assertRaises(NotImplementedError):
            optpgen.NodeConverter().convert(self.grammar, 1, 'x', 0, None)
        conv = optpgen._NoOpConverter()
        children = []
        self.assertEqual('x', conv.convert(self.grammar, 1, 'x', 0, None))
        self.assertIs(children, conv.convert(self.grammar, 256, None, 0,
                                             children))
        self.assertEqual((1, 1), (conv.tokens, conv.nodes))
        with self.assertRaises(TypeError):
            conv.convert(self.grammar, 'NAME', 'x', 0, None)


class ErrorTest(OptpgenTestBase):

    def testRejectedTokens(self):
        p = optpgen.CreateParser(self.grammar, optpgen._NoOpConverter())
        cases = [
            ('bad input', Tokens((NAME, 'x'), (NAME, 'y')), 1),
            ('bad input', Tokens((NAME, 'x'), (EQUAL, '='), (RPAR, ')')), 2),
            ('bad token', Tokens((NAME, 'x'), (201, '$')), 1),
            ('bad token', Tokens((9999, 'x'),), 0),
            ('bad token', Tokens((-1, 'x'),), 0),
            ('bad token', Tokens((2 ** 70, 'x'),), 0),
            ('bad token', Tokens(('NAME', 'x'),), 0),
            ('bad token', Tokens((self.sym['expr'], 'x'),), 0),
        ]
        for msg, toks, bad in cases:
            e = self.assertParseError(p, toks, msg, bad)
            self.assertEqual('%s: type=%r, value=%r, context=%r'
                             % ((msg,) + toks[bad]), str(e))
            # Usable again after setup.
            self.assertTrue(Feed(p, kAssign), toks)

    def testTooMuchInput(self):
        ref = _l2parse.Parser(self.grammar, corpus._RawConvert)
        p = optpgen.CreateParser(self.grammar, None)
        expr = self.sym['expr']
        # The start symbol is complete before `)`: as lib2to3 reports it.
        toks = Tokens((NAME, 'a'), (PLUS, '+'), (NAME, 'b'), (RPAR, ')'))
        ref.setup(expr)
        with self.assertRaises(_l2parse.ParseError) as ctx:
            for t, v, c in toks:
                ref.addtoken(t, v, c)
        self.assertEqual('too much input', ctx.exception.msg)
        self.assertParseError(p, toks, 'too much input', 3, start=expr)
        # Input after the parse returned True.
        self.assertTrue(Feed(p, kAssign))
        with self.assertRaises(optpgen.ParseError) as ctx:
            p.addtoken(NAME, 'y', 99)
        self.assertEqual(('too much input', NAME, 'y', 99),
                         (ctx.exception.msg, ctx.exception.type,
                          ctx.exception.value, ctx.exception.context))

    def testDeepNesting(self):
        grammar = corpus.GrammarFor('2.7')
        for conv in (None, optpgen._NoOpConverter(), Recorder()):
            p = optpgen.CreateParser(grammar, conv, True)
            p.setup()
            n = 100000
            with self.assertRaises(optpgen.ParseError) as ctx:
                for i in xrange(n):
                    p.addtoken(LPAR, '(', i)
            e = ctx.exception
            self.assertEqual(('too much nesting', LPAR, '('),
                             (e.msg, e.type, e.value))
            self.assertTrue(0 < e.context < optpgen.kMaxDepth, e.context)
            self.assertTrue(Feed(p, kAssign[:2] + [(NUMBER, '1', 2),
                                                   (NEWLINE, '\n', 3),
                                                   (ENDMARKER, None, 4)]))
        # Nesting CPython accepts stays within the bound.
        toks = ([(NAME, 'x', 0), (EQUAL, '=', 0)] + [(LPAR, '(', 0)] * 80 +
                [(NAME, 'a', 0)] + [(RPAR, ')', 0)] * 80 +
                [(NEWLINE, '\n', 0), (ENDMARKER, None, 0)])
        self.assertTrue(Feed(optpgen.CreateParser(grammar, None), toks))

    def testMaxDepth(self):
        grammar = corpus.GrammarFor('2.7')

        def Opened(parser):
            parser.setup()
            for i in xrange(100000):
                try:
                    parser.addtoken(LPAR, '(', i)
                except optpgen.ParseError as e:
                    self.assertEqual(e.msg, 'too much nesting')
                    return i
        default = optpgen.CreateParser(grammar, None)
        self.assertEqual(default.maxdepth, optpgen.kMaxDepth)
        deeper = optpgen.CreateParser(grammar, Recorder(), True, maxdepth=optpgen.kMaxDepth + 200)
        self.assertEqual(deeper.maxdepth, optpgen.kMaxDepth + 200)
        # Each parenthesis opens the same chain of nonterminals, so 200 more
        # frames hold a fixed number more of them.
        self.assertGreater(Opened(deeper), Opened(default))
        shallow = optpgen.Parser(grammar, maxdepth=1)
        self.assertEqual(Opened(shallow), 0)
        self.assertTrue(Feed(deeper, kAssign))
        for bad in (0, -1, optpgen.kMaxDepthLimit + 1, 2 ** 70):
            with self.assertRaises(ValueError):
                optpgen.CreateParser(grammar, None, maxdepth=bad)
        for bad in ('10', 1.5):
            with self.assertRaises(TypeError):
                optpgen.Parser(grammar, maxdepth=bad)

    def testMisuse(self):
        p = optpgen.CreateParser(self.grammar, None)
        with self.assertRaises(RuntimeError):
            p.addtoken(NAME, 'x', 0)          # before setup
        self.assertParseError(p, Tokens((NAME, 'x'), (NAME, 'y')), 'bad input', 1)
        with self.assertRaises(RuntimeError):
            p.addtoken(NAME, 'x', 0)          # after an error
        for start in (0, 255, 9999, -1):
            with self.assertRaises(ValueError):
                p.setup(start)
        with self.assertRaises(TypeError):
            p.setup('start')
        self.assertTrue(Feed(p, kAssign))

    def testConvertRaising(self):
        class Boom(Exception):
            pass

        class Raiser(Recorder):
            def __init__(self, at):
                Recorder.__init__(self)
                self.at = at

            def convert(self, grammar, node_type, value, context, children):
                if node_type == self.at:
                    raise Boom(node_type)
                return Recorder.convert(self, grammar, node_type, value,
                                        context, children)
        for at in (NAME, EQUAL, self.sym['term'], self.sym['start']):
            conv = Raiser(at)
            p = optpgen.CreateParser(self.grammar, conv)
            with self.assertRaises(Boom):
                Feed(p, kAssign)
            conv.at = None
            self.assertTrue(Feed(p, kAssign), at)
            self.assertEqual(self.sym['start'], p.getrootnode()[0])

    def testReentryRefused(self):
        class Reenter(Recorder):
            def convert(self, grammar, node_type, value, context, children):
                if self.method:
                    getattr(self.parser, self.method)(*self.args)
                return Recorder.convert(self, grammar, node_type, value,
                                        context, children)
        conv = Reenter()
        p = conv.parser = optpgen.CreateParser(self.grammar, conv)
        for method, args in (('setup', ()), ('addtoken', (NAME, 'x', 0))):
            conv.method, conv.args = method, args
            with self.assertRaises(RuntimeError) as ctx:
                Feed(p, kAssign)
            self.assertIn('busy', str(ctx.exception), method)
        conv.method = None
        self.assertTrue(Feed(p, kAssign))
        del conv.parser

    def testParseErrorPickles(self):
        e = optpgen.ParseError('bad input', 1, 'x', (1, 2))
        e2 = pickle.loads(pickle.dumps(e, 2))
        self.assertEqual((e.msg, e.type, e.value, e.context, str(e)),
                         (e2.msg, e2.type, e2.value, e2.context, str(e2)))
        self.assertTrue(issubclass(optpgen.ParseError, Exception))


class CApiTest(OptpgenTestBase):
    """The ParserApi capsule, called through ctypes as a native driver would."""

    def Api(self):
        import ctypes
        obj = ctypes.py_object
        get = ctypes.pythonapi.PyCapsule_GetPointer
        get.restype = ctypes.c_void_p
        get.argtypes = [obj, ctypes.c_char_p]

        class ParserApi(ctypes.Structure):
            _fields_ = [
                ('Version', ctypes.c_int),
                ('ParserType', ctypes.c_void_p),
                ('NodeConverterType', ctypes.c_void_p),
                ('ParseError', obj),
                ('Setup', ctypes.PYFUNCTYPE(ctypes.c_int, obj, ctypes.c_int)),
                ('AddToken', ctypes.PYFUNCTYPE(ctypes.c_int, obj, ctypes.c_int,
                                               obj, obj)),
                ('GetRootNode', ctypes.PYFUNCTYPE(obj, obj)),
            ]
        ptr = get(optpgen._C_API, 'pysource.optpgen._C_API')
        return ParserApi.from_address(ptr)

    def testEntryPoints(self):
        api = self.Api()
        self.assertEqual((1, optpgen.ParseError),
                         (api.Version, api.ParseError))
        p = optpgen.CreateParser(self.grammar, None, True)
        self.assertEqual(0, api.Setup(p, self.sym['start']))
        results = [api.AddToken(p, t, v, c) for t, v, c in kAssign]
        self.assertEqual([0] * 6 + [1], results)
        expected = optpgen.CreateParser(self.grammar, None, True)
        Feed(expected, kAssign)
        self.assertEqual(expected.getrootnode(), api.GetRootNode(p))
        api.Setup(p, self.sym['start'])
        api.AddToken(p, NAME, 'x', 0)
        with self.assertRaises(optpgen.ParseError) as ctx:
            api.AddToken(p, NAME, 'y', 1)
        self.assertEqual(('bad input', 1), (ctx.exception.msg,
                                            ctx.exception.context))
        with self.assertRaises(ValueError):
            api.Setup(p, 3)
        with self.assertRaises(TypeError):
            api.AddToken(self.grammar, NAME, 'x', 0)
        with self.assertRaises(TypeError):
            api.GetRootNode(None)


class GrammarTablesTest(OptpgenTestBase):

    def testTablesBuiltOncePerGrammar(self):
        before = optpgen._GetTablesBuildCount()
        for _ in range(3):
            optpgen.CreateParser(self.grammar, None)
        self.assertEqual(before + 1, optpgen._GetTablesBuildCount())
        other = TinyGrammar()
        optpgen.CreateParser(other, None)
        self.assertEqual(before + 2, optpgen._GetTablesBuildCount())
        ref = weakref.ref(other)
        del other
        gc.collect()
        self.assertIsNone(ref())

    def testGeneratorTokenTables(self):
        names, ops = corpus.TokenTables()
        grammar = corpus.GrammarFor('3.6')
        self.assertEqual('pysource._pgengen', optpgen.ParserGenerator.__module__)
        # '->' and '...' take the numbers the tables give; ASYNC and AWAIT are
        # token names of the 3.6 grammar.
        for number in (51, 52, 53, 54):
            self.assertIn(number, grammar.tokens, number)
        self.assertNotIn(55, grammar.tokens)
        with self.assertRaises(ValueError):
            optpgen.ParserGenerator('<x>', names, {}, StringIO.StringIO(
                "start: '+' NAME ENDMARKER\n")).make_grammar()
        with self.assertRaises(ValueError):
            optpgen.ParserGenerator('<x>', {1: 'NAME'}, ops, StringIO.StringIO(
                "start: NAME ENDMARKER\n")).make_grammar()

    def testMalformedGrammars(self):
        def Broken(change):
            g = TinyGrammar()
            change(g)
            return g
        expr = self.sym['expr']

        def SetArc(g, arc):
            g.dfas[expr][0][0][0] = arc
        cases = [
            ('arc target', lambda g: SetArc(g, (1, 99))),
            ('arc label', lambda g: SetArc(g, (999, 0))),
            ('arc shape', lambda g: SetArc(g, (1,))),
            ('label type', lambda g: g.labels.append((9999, None))),
            ('token type', lambda g: g.tokens.__setitem__(300, 1)),
            ('token label', lambda g: g.tokens.__setitem__(1, 999)),
            ('token to symbol', lambda g: g.tokens.__setitem__(
                1, [i for i, (t, v) in enumerate(g.labels) if t >= 256][0])),
            ('keyword label', lambda g: g.keywords.__setitem__('if', -1)),
            ('keyword text', lambda g: g.keywords.__setitem__(1, 1)),
            ('first set', lambda g: g.dfas[expr][1].__setitem__(5000, 1)),
            ('start', lambda g: setattr(g, 'start', 9999)),
            ('no states', lambda g: g.dfas.__setitem__(expr, ([], {}))),
            ('labels', lambda g: setattr(g, 'labels', 5)),
            ('dfas', lambda g: setattr(g, 'dfas', [1, 2])),
            ('symbol', lambda g: g.dfas.__setitem__(12, g.dfas[expr])),
        ]
        for name, change in cases:
            with self.assertRaises(ValueError) as ctx:
                optpgen.CreateParser(Broken(change), None)
            self.assertTrue(str(ctx.exception).startswith(
                'Invalid grammar object: '), name)

    def testUnweakrefableGrammar(self):
        class Plain(object):
            __slots__ = ('labels', 'keywords', 'tokens', 'dfas', 'start')
        g = Plain()
        for attr in Plain.__slots__:
            setattr(g, attr, getattr(self.grammar, attr))
        p = optpgen.CreateParser(g, None)
        self.assertTrue(Feed(p, kAssign))


class MemoryTest(OptpgenTestBase):

    def testParserCyclesAreCollected(self):
        conv = Recorder()
        p = optpgen.CreateParser(self.grammar, conv)
        conv.parser = p
        p.setup()
        p.addtoken(NAME, 'x', conv)   # a partial tree refers to the converter
        ref = weakref.ref(p)
        del p, conv
        gc.collect()
        self.assertIsNone(ref())

    def testReferencesBalanced(self):
        value, context = 'xx_value', object()
        toks = [(NAME, value, context), (NAME, 'y', context)]
        p = optpgen.CreateParser(self.grammar, None)
        counts = sys.getrefcount(value), sys.getrefcount(context)
        for _ in range(100):
            Feed(p, kAssign)
            try:
                Feed(p, toks)
            except optpgen.ParseError:
                pass
        p.setup()
        del p
        sys.exc_clear()
        self.assertEqual(counts, (sys.getrefcount(value),
                                  sys.getrefcount(context)))

    def testManyParsesKeepMemoryFlat(self):
        n = 20000 if support.kSanitized else 200000

        class Raiser(Recorder):
            def convert(self, grammar, node_type, value, context, children):
                raise KeyError(node_type)
        parsers = [optpgen.CreateParser(self.grammar, c, True)
                   for c in (None, optpgen._NoOpConverter())]
        failing = optpgen.CreateParser(self.grammar, Raiser())
        bad = Tokens((NAME, 'x'), (NAME, 'y'))

        def Round(count):
            for i in xrange(count):
                Feed(parsers[i & 1], kAssign)
                try:
                    Feed(parsers[i & 1], bad)
                except optpgen.ParseError:
                    pass
                if i % 16 == 0:
                    try:
                        Feed(failing, kAssign)
                    except KeyError:
                        pass
        Round(n // 10)
        before = resource.getrusage(resource.RUSAGE_SELF).ru_maxrss
        Round(n)
        grown_kb = resource.getrusage(resource.RUSAGE_SELF).ru_maxrss - before
        if support.kSanitized:
            return  # freed memory sits in the sanitizer's quarantine
        self.assertLess(grown_kb, 4096, '%d parses grew %d kB' % (n, grown_kb))


if __name__ == '__main__':
    unittest.main()
