"""Node and token utilities: token end index, next kept token, tuple/set/generator atoms, parentheses,
sequence literals and string-literal quotes."""

import unittest

from tests.py.test_nodes_expr import Find, Parse, Text, Unraisable

try:
    from pysource import treelens as tl
    from pysource import _fastaccess
    from pysource.utils import GetLogicalsFromText
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


def Atom(version, source):
    return Find(Parse(version, b'z = ' + source), tl.CAtom)


class TokenEndTest(unittest.TestCase):

    def testEnds(self):
        tree = Parse('3.6', b'x = f(a, b) + 1  # c')
        self.assertEqual(tl.GetTokenEndIndex(tree.GetChild(0)), 1)
        self.assertEqual(tl.GetTokenEndIndex(tree.GetChild(2)), 10)
        call = Find(tree, tl.CAtomExpr)
        self.assertEqual(tl.GetTokenEndIndex(call), 8)
        leaf = Find(tree, tl.CNameLiteral, 2)
        self.assertEqual((leaf.fText, leaf.fContext, tl.GetTokenEndIndex(leaf)), (b'a', 4, 5))

    def testArguments(self):
        for arg, message in [
                (None, "Argument 'node' has incorrect type (expected pysource.treelens.CNode, got NoneType)"),
                (4, "Argument 'node' has incorrect type (expected pysource.treelens.CNode, got int)")]:
            with self.assertRaises(TypeError) as ctx:
                tl.GetTokenEndIndex(arg)
            self.assertEqual(str(ctx.exception), message)
        with self.assertRaises(TypeError) as ctx:
            tl.GetTokenEndIndex(tl.CNode(None))
        self.assertEqual(str(ctx.exception), "unsupported operand type(s) for +: 'NoneType' and 'int'")


class NextTokenTest(unittest.TestCase):

    def testList(self):
        toks = [b'a', b'# c', b'\\', b'b']
        for i, expected in [(-1, b'a'), (0, b'b'), (1, b'b'), (3, None), (10, None)]:
            self.assertEqual(tl._NativeOnly('NextNonRemovedTokenInList', toks, i), expected, i)
        with self.assertRaises(TypeError) as ctx:
            tl._NativeOnly('NextNonRemovedTokenInList', None, 0)
        self.assertEqual(str(ctx.exception), "object of type 'NoneType' has no len()")
        with self.assertRaises(TypeError) as ctx:
            tl._NativeOnly('NextNonRemovedTokenInList', [b'a', u'b'], 0)
        self.assertEqual(str(ctx.exception), 'Expected bytes, got unicode')

    def testLogical(self):
        logical = GetLogicalsFromText(b'x = (a,  # c\n  b)\n')[0]
        texts = [t for t, _ in logical.fTokens]
        self.assertEqual(texts[4:6], [b',', b'# c'])
        self.assertEqual(tl._NativeOnly('NextNonRemovedTokenInLogical', logical, 4), b'b')
        self.assertIsNone(tl._NativeOnly('NextNonRemovedTokenInLogical', logical, len(texts) - 1))
        with self.assertRaises(TypeError) as ctx:
            tl._NativeOnly('NextNonRemovedTokenInLogical', texts, 0)
        self.assertEqual(str(ctx.exception), 'Argument must be a logical')


class AtomKindTest(unittest.TestCase):

    def testKinds(self):
        # (version, source, set literal, generator, tuple)
        cases = [
            ('3.6', b'{1, 2}', True, False, False),
            ('3.6', b'{1: 2}', False, False, False),
            ('3.6', b'{}', False, False, False),
            ('3.6', b'{x}', True, False, False),
            ('3.6', b'{*a, b}', True, False, False),
            ('3.6', b'{**a}', False, False, False),
            ('3.6', b'{**a, **b}', False, False, False),
            ('3.6', b'{x for x in y}', True, False, False),
            ('3.6', b'{k: v for k, v in d}', False, False, False),
            ('3.6', b'(x for x in y)', False, True, False),
            ('3.6', b'(x for x in y if x for z in x)', False, True, False),
            ('3.6', b'(x)', False, False, False),
            ('3.6', b'(x,)', False, False, True),
            ('3.6', b'(x, y)', False, False, True),
            ('3.6', b'()', False, False, True),
            ('3.6', b'(yield x, y)', False, False, False),
            ('3.6', b'[x, y]', False, False, False),
            ('3.6', b'[x for x in y]', False, False, False),
            ('2.7', b'{1, 2}', True, False, False),
            ('2.7', b'{1: 2, 3: 4}', False, False, False),
            ('2.7', b'(x for x in y)', False, True, False),
            ('2.7', b'(1, 2)', False, False, True),
            ('2.7', b'`x, y`', False, False, False),
        ]
        for version, source, is_set, is_gen, is_tuple in cases:
            atom = Atom(version, source)
            what = '%s %s' % (version, source)
            self.assertIs(tl.IsSetLiteral(atom), is_set, what)
            self.assertIs(tl.IsGenExpression(atom), is_gen, what)
            self.assertIs(tl.IsTupleExpression(atom), is_tuple, what)

    def testNeverRaise(self):
        for func in (tl.IsSetLiteral, tl.IsGenExpression, tl.IsTupleExpression):
            self.assertIs(func(None), False)
            result, err = Unraisable(func, tl.CAtom(None))
            self.assertIs(result, False)
            if func is not tl.IsGenExpression:  # which tests the child count first
                self.assertIn("ValueError: 'Atom node with no children' in 'pysource.treelens.%s' ignored"
                              % func.__name__, err)
            with self.assertRaises(TypeError) as ctx:
                func(tl.CNode(None))
            self.assertEqual(str(ctx.exception), "Argument 'atom_node' has incorrect type "
                             "(expected pysource.treelens.CAtom, got pysource.treelens.CNode)")


class ParensTest(unittest.TestCase):

    def testDropSimpleParens(self):
        cases = [
            (b'((a))', b'a'),
            (b'(a)', b'a'),
            (b'(a, b)', b'( a , b )'),
            (b'((a, b))', b'( a , b )'),
            (b'(x for x in y)', b'( x for x in y )'),
            (b'[a]', b'[ a ]'),
            (b'(-a)', b'- a'),
            (b'a', b'a'),
        ]
        for source, expected in cases:
            tree = Parse('3.6', b'z = ' + source)
            self.assertEqual(Text(tl.DropSimpleParens(tree.GetChild(2))), expected, source)
        self.assertIsNone(tl.DropSimpleParens(None))
        self.assertRaises(TypeError, tl.DropSimpleParens, 1)

    def testExpandSeqLiteral(self):
        # (version, source, any bracket, drop parentheses, element texts or None)
        cases = [
            ('3.6', b'(a, b)', False, True, [b'a', b'b']),
            ('3.6', b'((a, b))', False, True, [b'a', b'b']),
            ('3.6', b'((a, b))', False, False, [b'( a , b )']),
            ('3.6', b'()', False, True, []),
            ('3.6', b'(a)', False, True, None),
            ('3.6', b'(a)', False, False, [b'a']),
            ('3.6', b'[a, b]', False, True, None),
            ('3.6', b'[a, b]', True, True, [b'a', b'b']),
            ('3.6', b'[]', True, True, []),
            ('3.6', b'[a]', True, True, [b'a']),
            ('3.6', b'(a, ...)', False, True, [b'a', None]),
            ('3.6', b'a', True, True, None),
            ('2.7', b'(a, b,)', False, True, [b'a', b'b']),
        ]
        for version, source, any_bracket, drop, expected in cases:
            node = Parse(version, b'z = ' + source).GetChild(2)
            result = tl._NativeOnly('ExpandSeqLiteral', node, any_bracket, drop)
            what = '%s %s %s %s' % (version, source, any_bracket, drop)
            self.assertEqual(None if result is None else [Text(e) for e in result], expected, what)


class StripQuotesTest(unittest.TestCase):

    def testStrip(self):
        cases = [
            (b"r'abc'", (b'abc', b"r'", b"'")),
            (b'abc', (b'abc', b'', b'')),
            (b"'abc", (b"'abc", b'', b'')),
            (b"''", (b'', b"'", b"'")),
            (b"'''x'''", (b'x', b"'''", b"'''")),
            (b"'''x'", (b"''x", b"'", b"'")),
            (b"'''abc'", (b"'''abc'", b'', b'')),
            (b'""""""', (b'', b'"""', b'"""')),
            (b"'''", (b"'", b"'", b"'")),
            (b"BRf'x'", (b'x', b"BRf'", b"'")),
            (b"'x\"", (b"'x\"", b'', b'')),
            (b'rb', (b'rb', b'', b'')),
            (b"'", (b"'", b'', b'')),
            (b'', (b'', b'', b'')),
            (b"'\x00'", (b'\x00', b"'", b"'")),
        ]
        for text, expected in cases:
            result = tl.StripPyQuotes(text)
            self.assertEqual(result, expected, repr(text))
            self.assertEqual(result[1] + result[0] + result[2], text, repr(text))
        for bad in (None, u'x', 3):
            with self.assertRaises(TypeError) as ctx:
                tl.StripPyQuotes(bad)
            self.assertEqual(str(ctx.exception), 'Expected bytes, got %s' % type(bad).__name__)


class LambdaTest(unittest.TestCase):

    def testNativeAccessors(self):
        for source, args, body in [(b'lambda: x', None, b'x'), (b'lambda a, b=1: a + b', b'a , b = 1', b'a + b'),
                                   (b'lambda *a: a', b'* a', b'a')]:
            lam = Find(Parse('3.6', b'z = ' + source), tl.CLambdaExpr)
            self.assertEqual(Text(tl._CallNativeNodeOp(lam, 'GetArgumentsNode')), args, source)
            self.assertEqual(Text(tl._CallNativeNodeOp(lam, 'GetBodyExpr')), body, source)
        self.assertRaises(AttributeError, tl._CallNativeNodeOp, tl.CAtom(None), 'GetBodyExpr')


if __name__ == '__main__':
    unittest.main()
