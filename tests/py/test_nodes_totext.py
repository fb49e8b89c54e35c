"""CNodeToTextConverter: rendering of real expression trees under its options, argument checks,
TextForNode overrides seen from native code, and malformed trees."""

import pickle
import sys
import unittest

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


_kAnalyzers = {}


def Expr(version, source, in_async_def=False):
    """The tree of an expression statement: the expression node itself."""
    if version not in _kAnalyzers:
        if version == '2.7':
            _kAnalyzers[version] = tl.CPGenAnalyzerImpl((2, 7, 0), tl.kPy2DefaultGrammar, None, False)
        else:
            _kAnalyzers[version] = tl.CPGenAnalyzerImpl((3, 6, 0))
    logical = utils.GetLogicalsFromText(source + b'\n')[0]
    return _kAnalyzers[version].ParseToNode(logical, in_async_def)


def Make(cls, children=None, text=None):
    node = cls(tl.CNodeClassInfo(cls, 300, b'made'))
    node.__setstate__((children, node.fClsInfo, 0, None, text))
    return node


def AllTrue():
    return tl.CNodeToTextConverter(True, True, True)


class RenderTest(unittest.TestCase):

    def Check(self, conv, cases, **options):
        for case in cases:
            versions, source, expected = case if len(case) == 3 else (('2.7', '3.6'),) + case
            for version in versions:
                got = conv.TextForNode(Expr(version, source), **options)
                self.assertEqual(got, expected, '%s %r %r: %r' % (version, source, options, got))

    def testAllOptions(self):
        encode = si.EncodeStringLiteral
        cases = [
            (b'a.b.c', b'a.b.c'),
            (b'f(x, 1)', b'f(' + si.JoinTokens([b'x', b',', b'1']) + b')'),
            (b'a[i]', b'a[i]'),
            (b'((x))', b'x'),
            (b'x', b'x'),
            (b'()', b'( )'),
            (b'[]', b'[]'),
            (b'{}', b'{}'),
            (b'(1, 2)', b'(1, 2)'),
            (b'[1, {2: 3}]', b'[1, {2: 3}]'),
            (b'{1, 2}', b'{1, 2}'),
            (b'-x', b'-x'),
            (b'not x', b'not x'),
            (b'x if y else z', b'x if y else z'),
            (b'lambda x, y=2: x', b'lambda x, y=2: x'),
            (b'[x for x in y if x]', b'[x for x in y if x]'),
            # Spacing as in brackets: slices and keyword arguments.
            (b'a[1:2, ::3]', si.JoinTokens(b'a [ 1 : 2 , : : 3 ]'.split())),
            (b'f(a, b=1)', b'f(a, b=1)'),
            (b'f(*a, **k)', b'f(*a, **k)'),
            # The exponent is part of the text.
            (b'x ** 2', b'x ** 2'),
            (b'a.b(c)[d].e ** -f', b'a.b(c)[d].e ** -f'),
            (b'2 ** x ** y', b'2 ** x ** y'),
            # A dot after an integer keeps its blank; 3.real would be a float and a name.
            (b'3 .real', si.JoinTokens([b'3', b'.', b'real'])),
            (b'1.5.real', b'1.5.real'),
            (b'x1.real', b'x1.real'),
            # Simple parentheses are dropped inside composite text too.
            (b'(a + b) * c', b'a + b * c'),
            (b'f((x))', b'f(x)'),
            (b'((a, b))', b'(a, b)'),
            # String literals: plain ones through EncodeStringLiteral, others empty.
            (b"'abc'", encode(b"'abc'")),
            (b'"a b,c.d_\'e"', encode(b'"a b,c.d_\'e"')),
            (b"'caf\xc3\xa9'", encode(b"'caf\xc3\xa9'")),
            (b"u'x y'", encode(b"u'x y'")),
            (b"'a-b'", b"''"),
            (b"u'$'", b"u''"),
            (b"'tab\\t'", b"''"),
            (b"'a' 'b-c'", encode(b"'a'")),
            (b"'a-' 'b'", b"''"),
            (b"f('x')", b"f(" + encode(b"'x'") + b")"),
            (('2.7',), b'`x`', b'`x`'),
            (('2.7',), b'a[...]', b'a[...]'),
            (('3.6',), b'a[...]', b'a[...]'),
            (('3.6',), b'{**a, b: c}', b'{**a, b: c}'),
            (('3.6',), b'[*a, b]', b'[*a, b]'),
            # Any node renders, a 2.7 print statement too.
            (('2.7',), b'print >> f, a.b', si.JoinTokens([b'print', b'>>', b'f', b',', b'a.b'])),
        ]
        self.Check(AllTrue(), cases)

    def testAwaitPrefix(self):
        conv = AllTrue()
        for source, expected in [(b'await f(x)', b'await f(x)'), (b'await x ** 2', b'await x ** 2')]:
            self.assertEqual(conv.TextForNode(Expr('3.6', source, True)), expected, source)
        self.assertIsNone(conv.TextForNode(Expr('3.6', b'await x', True), dotted_name_only=True))
        self.assertIsNone(tl.CNodeToTextConverter().TextForNode(Expr('3.6', b'await x', True)))

    def testDottedNameOnly(self):
        cases = [(b'a.b', b'a.b'), (b'a', b'a'), (b'a()', None), (b'a[0]', None), (b'a.b()', None),
                 (b'1', None), (b'x ** 2', None), (b'(a)', b'a'), (b'[a]', None), (b'a + b', None),
                 (b"'s'", None)]
        self.Check(AllTrue(), cases, dotted_name_only=True)
        self.Check(tl.CNodeToTextConverter(), cases, dotted_name_only=True)

    def testLiteralOnly(self):
        cases = [
            (b'x', None), (b'1', b'1'), (b'True', b'True'), (b'False', b'False'), (b'None', b'None'),
            (b'a.b', None), (b'None.x', None), (b'f(x)', None), (b'[1, None]', b'[1, None]'),
            (b'[1, x]', None), (b'-1', b'-1'), (b"'s'", si.EncodeStringLiteral(b"'s'")),
            # Call arguments are rendered as names only.
            (b'(1).f', None),
        ]
        self.Check(AllTrue(), cases, literal_only=True)

    def testKeepSimpleParens(self):
        cases = [(b'(x)', b'(x)'), (b'((x))', b'((x))'), (b'(a).b', b'(a).b'), (b'[(x)]', b'[(x)]')]
        self.Check(AllTrue(), cases, discard_simple_parens=False)

    def testOptionsOff(self):
        cases = [
            (b'[1]', b'[]'), (b'{1: 2}', b'{}'), (b'{1}', b'{}'), (b'f(x)', b'f()'), (b'a[i]', b'a[]'),
            (b'a + b', None), (b'()', None), (b'(1, 2)', None), (b"'abc'", b"''"), (b"u'abc'", b"u''"),
            (b"'a' 'b'", b"''"), (b'x', b'x'), (b'a.b', b'a.b'), (b'x ** 2', None), (b'f(x)(y)', b'f()()'),
        ]
        self.Check(tl.CNodeToTextConverter(), cases)
        self.Check(tl.CNodeToTextConverter(include_arg_text=True), [(b'f(x)', b'f(x)'), (b'a[i]', b'a[]'),
                                                                    (b'f(x + 1)', b'f()')])
        self.Check(tl.CNodeToTextConverter(include_bracket_text=True),
                   [(b'f(x)', b'f()'), (b'a[i]', b'a[i]'), (b'[x]', b'[x]')])
        self.Check(tl.CNodeToTextConverter(include_string_contents=True),
                   [(b"f('s')", b'f()'), (b"'s'", si.EncodeStringLiteral(b"'s'"))])

    def testAtomPlusTrailers(self):
        conv = AllTrue()
        power = Expr('2.7', b'a.b(c)[d]')
        atom, trailers = power.GetAtom(), power.GetTrailers()
        self.assertEqual(conv.TextForAtomPlusTrailers(atom, trailers), b'a.b(c)[d]')
        self.assertEqual(conv.TextForAtomPlusTrailers(atom, trailers[:1], dotted_name_only=True), b'a.b')
        self.assertIsNone(conv.TextForAtomPlusTrailers(atom, trailers, dotted_name_only=True))
        self.assertEqual(conv.TextForAtomPlusTrailers(atom, []), b'a')
        self.assertIsNone(conv.TextForAtomPlusTrailers(atom, [], literal_only=True))
        paren = Expr('2.7', b'(a)')
        self.assertEqual(conv.TextForAtomPlusTrailers(paren, []), b'a')
        self.assertEqual(conv.TextForAtomPlusTrailers(paren, [], discard_simple_parens=False), b'(a)')
        # With trailers the atom keeps its parentheses.
        self.assertEqual(conv.TextForAtomPlusTrailers(paren, trailers[:1]), b'(a).b')
        bad = Make(tl.CTrailer, [Make(tl.CNode, text=b'{'), atom])
        checks = [
            ((atom, None), TypeError, "Argument 'trailers' has incorrect type (expected list, got NoneType)"),
            ((atom, (trailers[0],)), TypeError,
             "Argument 'trailers' has incorrect type (expected list, got tuple)"),
            ((None, []), TypeError,
             "Argument 'atom_node' has incorrect type (expected pysource.treelens.CNode, got NoneType)"),
            ((atom, [atom]), TypeError, 'Cannot convert pysource.treelens.CNameLiteral to pysource.treelens.CTrailer'),
            ((atom, [bad]), ValueError, 'Bad trailer node'),
            ((atom, [Make(tl.CTrailer, [])]), ValueError, 'Trailer node with no children'),
        ]
        for args, exc, message in checks:
            with self.assertRaises(exc) as cm:
                conv.TextForAtomPlusTrailers(*args)
            self.assertEqual(str(cm.exception), message)

    def testStringLiteralMethod(self):
        conv, plain = AllTrue(), tl.CNodeToTextConverter()
        cases = [(b"'a'", si.EncodeStringLiteral(b"'a'"), b"''"), (b"ur'a'", si.EncodeStringLiteral(b"ur'a'"), b"u''"),
                 (b"b'-'", b"''", b"''"), (b"U'-'", b"u''", b"u''")]
        for text, full, empty in cases:
            node = Make(tl.CStringLiteral, text=text)
            self.assertEqual((conv._TextForStringLiteral(node), plain._TextForStringLiteral(node)), (full, empty))
        with self.assertRaises(TypeError) as cm:
            conv._TextForStringLiteral(Expr('2.7', b'x'))
        self.assertEqual(str(cm.exception), "Argument 'node' has incorrect type (expected "
                         "pysource.treelens.CStringLiteral, got pysource.treelens.CNameLiteral)")
        self.assertRaises(TypeError, conv._TextForStringLiteral, Make(tl.CStringLiteral))

    def testArgumentChecks(self):
        conv = AllTrue()
        with self.assertRaises(TypeError) as cm:
            conv.TextForNode(None)
        self.assertEqual(str(cm.exception),
                         "Argument 'node' has incorrect type (expected pysource.treelens.CNode, got NoneType)")
        self.assertRaises(TypeError, conv.TextForNode)
        self.assertRaises(TypeError, conv.TextForNode, Expr('2.7', b'x'), bogus=True)
        self.assertRaises(TypeError, tl.CNodeToTextConverter, 1, 2, 3, 4)
        self.assertRaises(TypeError, tl.CNodeToTextConverter, include_everything=True)
        conv = tl.CNodeToTextConverter(include_bracket_text=[1], include_string_contents=0, include_arg_text='')
        self.assertEqual(conv.TextForNode(Expr('2.7', b"f(x)['s']")), b"f()['']")

    def testPickle(self):
        conv = tl.CNodeToTextConverter(True, False, True)
        copy = pickle.loads(pickle.dumps(conv))
        self.assertEqual(copy.__reduce__()[2], (True, True, False))
        self.assertEqual(copy.TextForNode(Expr('2.7', b"f(x)['s']")), b"f(x)['']")


class ReferenceTest(unittest.TestCase):

    def testNoReferenceLeaks(self):
        conv = AllTrue()
        for source in (b'a.b(c, d=1)[e] ** 2', b"{'k': [x for x in y]}", b'f(x)', b"'s' 't'"):
            tree = Expr('2.7', source)
            watched = [conv, tree] + list(tree.fChildren)
            conv.TextForNode(tree)
            before = [sys.getrefcount(o) for o in watched]
            for _ in range(100):
                conv.TextForNode(tree)
                conv.TextForNode(tree, dotted_name_only=True)
                conv.TextForNode(tree, literal_only=True, discard_simple_parens=False)
            self.assertEqual([sys.getrefcount(o) for o in watched], before, source)


class OverrideTest(unittest.TestCase):

    def testOverrideSeenFromNativeCode(self):
        class Upper(tl.CNodeToTextConverter):
            def TextForNode(self, node, dotted_name_only=False, discard_simple_parens=True, literal_only=False):
                if isinstance(node, tl.CNameLiteral):
                    return node.fText.upper()
                return tl.CNodeToTextConverter.TextForNode(self, node, dotted_name_only, discard_simple_parens,
                                                           literal_only)
        conv = Upper(True, True, True)
        # The override sees every node the base class renders through TextForNode;
        # the parenthesised y reaches it as the atom, whose name the base class renders.
        cases = [(b'a + b', b'A + B'), (b'a.b(c)', b'A.b(C)'), (b'[x, (y)]', b'[X, y]'), (b'x ** y', b'X ** Y')]
        for source, expected in cases:
            self.assertEqual(conv.TextForNode(Expr('2.7', source)), expected, source)
        power = Expr('2.7', b'a.b(c)')
        self.assertEqual(conv.TextForAtomPlusTrailers(power.GetAtom(), power.GetTrailers()), b'A.b(C)')

    def testOverrideResultIsChecked(self):
        class Bad(tl.CNodeToTextConverter):
            def TextForNode(self, node, *args):
                if isinstance(node, tl.CNumberLiteral):
                    return 7
                if isinstance(node, tl.CNameLiteral):
                    raise KeyError('no name')
                return tl.CNodeToTextConverter.TextForNode(self, node, *args)
        conv = Bad(True, True, True)
        with self.assertRaises(TypeError) as cm:
            conv.TextForNode(Expr('2.7', b'[1, 2]'))
        self.assertEqual(str(cm.exception), 'Expected bytes, got int')
        self.assertRaises(KeyError, conv.TextForNode, Expr('2.7', b'-x'))

    def testCyclicTreeRaises(self):
        atom = Make(tl.CAtom, [])
        atom.fChildren.extend([Make(tl.CNode, text=b'['), atom, Make(tl.CNode, text=b']')])
        try:
            self.assertRaises(RuntimeError, AllTrue().TextForNode, atom)
        finally:
            del atom.fChildren[:]


if __name__ == '__main__':
    unittest.main()
