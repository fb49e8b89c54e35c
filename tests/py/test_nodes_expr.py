"""Expression node accessors on trees parsed from source under the 2.7, 3.5 and 3.6 grammars."""

import StringIO
import sys
import unittest

try:
    from pysource import treelens as tl
    from pysource.utils import GetLogicalsFromText
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


_kParsers = {}


def NewParser(version, cls_for_state=None):
    """A CPGenParserImpl for 'X.Y'; cls_for_state maps state names to classes for this parser only."""
    triple = tuple(int(p) for p in version.split('.')) + (0,)
    saved = dict(tl.CPGenParserImpl.kClsForState)
    tl.CPGenParserImpl.kClsForState.update(cls_for_state or {})
    try:
        return tl.CPGenParserImpl(triple, 'Python-Grammar-%s' % version, None, version != '2.7')
    finally:
        tl.CPGenParserImpl.kClsForState.clear()
        tl.CPGenParserImpl.kClsForState.update(saved)


def Parse(version, source, in_async_def=False, parser=None):
    if parser is None:
        parser = _kParsers.get(version) or _kParsers.setdefault(version, NewParser(version))
    return parser.ParseToNode(GetLogicalsFromText(source + b'\n')[0], in_async_def)


def Nodes(node):
    out = [node]
    for child in node.fChildren or ():
        out.extend(Nodes(child))
    return out


def Find(tree, cls, index=0):
    """The index'th node of exactly class cls in preorder."""
    return [n for n in Nodes(tree) if type(n) is cls][index]


def Text(node):
    """Leaf texts of a node joined by blanks; None stays None."""
    if node is None:
        return None
    return b' '.join(n.fText for n in Nodes(node) if n.fText is not None)


def Unraisable(func, *args):
    """(result, stderr text) of a call whose errors are reported as unraisable."""
    saved, sys.stderr = sys.stderr, StringIO.StringIO()
    try:
        result = func(*args)
        return result, sys.stderr.getvalue()
    finally:
        sys.stderr = saved


class AtomTest(unittest.TestCase):

    def testShapes(self):
        # (version, source, bracket, sub-expression texts, comprehension, two+ strings)
        cases = [
            ('3.6', b'(1, 2)', b'(', [b'1', b'2'], False, False),
            ('3.6', b'(1)', b'(', [], False, False),
            ('3.6', b'[1]', b'[', [b'1'], False, False),
            ('3.6', b'[1, 2,]', b'[', [b'1', b'2'], False, False),
            ('3.6', b'{1, 2}', b'{', [], False, False),
            ('3.6', b'()', b'(', [], False, False),
            ('3.6', b'[]', b'[', [], False, False),
            ('3.6', b'[x for x in y]', b'[', [], True, False),
            ('3.6', b'(x for x in y)', b'(', [], True, False),
            ('3.6', b'{x for x in y}', b'{', [], True, False),
            ('3.6', b'{k: v for k, v in d}', b'{', [], True, False),
            ('3.6', b'{k: v}', b'{', [], False, False),
            ('3.6', b"'a' 'b'", None, [], False, True),
            ('3.6', b"'a' b'b' f'c'", None, [], False, True),
            ('3.6', b'(yield x)', b'(', [], False, False),
            ('2.7', b'[1, 2]', b'[', [b'1', b'2'], False, False),
            ('2.7', b'[a]', b'[', [b'a'], False, False),
            ('2.7', b'[x for x in y]', b'[', [], True, False),
            ('2.7', b'`x`', None, [], False, False),
            ('2.7', b"'a' u'b'", None, [], False, True),
        ]
        for version, source, bracket, subs, comprehension, strings in cases:
            atom = Find(Parse(version, b'z = ' + source), tl.CAtom)
            what = '%s %s' % (version, source)
            self.assertEqual(atom.GetInitialBracket(), bracket, what)
            self.assertEqual(atom.GetSubExprCount(), len(subs), what)
            self.assertEqual([Text(atom.GetSubExpr(i)) for i in range(len(subs))], subs, what)
            if not subs:
                self.assertIsNone(atom.GetSubExpr(0), what)
            self.assertIs(atom.IsComprehension(), comprehension, what)
            self.assertIs(atom.IsLiteral(), not comprehension, what)
            self.assertIs(atom.IsTwoPlusStringLiterals(), strings, what)

    def testSubExprIsTheElementNode(self):
        atom = Find(Parse('3.6', b'z = [a]'), tl.CAtom)
        self.assertIs(atom.GetSubExpr(0), atom.GetChild(1))
        self.assertIsNone(atom.GetSubExpr(1))
        atom = Find(Parse('3.6', b'z = (a, b)'), tl.CAtom)
        with self.assertRaises(ValueError) as ctx:
            atom.GetSubExpr(2)
        self.assertEqual(str(ctx.exception), 'Not enough expressions in list')

    def testNoChildren(self):
        atom = tl.CAtom(None)
        with self.assertRaises(ValueError) as ctx:
            atom.GetInitialBracket()
        self.assertEqual(str(ctx.exception), 'Atom node with no children')
        self.assertEqual(atom.GetSubExprCount(), 0)
        self.assertIsNone(atom.GetSubExpr(0))
        self.assertIs(atom.IsComprehension(), False)
        self.assertIs(atom.IsLiteral(), True)
        self.assertIs(atom.IsTwoPlusStringLiterals(), False)

    def testArgumentChecks(self):
        atom = Find(Parse('3.6', b'z = (a, b)'), tl.CAtom)
        for call, exc in [(lambda: atom.GetSubExpr('0'), TypeError),
                          (lambda: atom.GetSubExpr(None), TypeError),
                          (lambda: atom.GetSubExprCount(1), TypeError),
                          (lambda: atom.GetInitialBracket(1), TypeError),
                          (lambda: tl.CAtom.GetSubExprCount(tl.CNode(None)), TypeError)]:
            self.assertRaises(exc, call)


class ListTest(unittest.TestCase):

    def testTrailingComma(self):
        tree = Parse('3.6', b'a, b,')
        self.assertIsInstance(tree, tl.CTestListStarExpr)
        self.assertEqual(tree.GetChildCount(), 4)
        self.assertEqual(tree.GetSubExprCount(), 2)
        self.assertIs(tree.IsTuple(), True)
        self.assertIs(tree.IsGenExpr(), False)
        self.assertEqual(Text(tree.GetSubExpr(1)), b'b')
        # A negative index reads child 2 * i as a list index: -1 is child -2.
        self.assertEqual(Text(tree.GetSubExpr(-1)), b'b')
        with self.assertRaises(ValueError) as ctx:
            tree.GetSubExpr(2)
        self.assertEqual(str(ctx.exception), 'Not enough expressions in list')
        self.assertRaises(IndexError, tree.GetSubExpr, -3)

    def testElementThatIsNoExpression(self):
        tree = Parse('3.6', b'a, b')
        with self.assertRaises(ValueError) as ctx:
            tree.GetSubExpr(-1)
        self.assertEqual(str(ctx.exception),
                         'Elenment -2 of %r needs to be a CExpression; fChildren = %r' % (tree, tree.fChildren))

    def testEllipsisElement(self):
        tree = Parse('3.6', b'a, ...')
        self.assertEqual(tree.GetSubExprCount(), 2)
        self.assertIsNone(tree.GetSubExpr(1))

    def testGenerator(self):
        body = Find(Parse('3.6', b'z = (x for x in y)'), tl.CTestListStarExpr)
        self.assertIs(body.IsGenExpr(), True)
        self.assertIs(body.IsTuple(), False)
        self.assertEqual(body.GetSubExprCount(), 0)
        self.assertIsNone(body.GetSubExpr(0))

    def testSingleAndStarred(self):
        tree = Parse('3.6', b'*a, b = c')
        targets = tree.GetChild(0)
        star = targets.GetSubExpr(0)
        self.assertIsInstance(star, tl.CStarExpression)
        self.assertEqual(Text(star.GetStarredExpression()), b'a')
        self.assertIs(targets.IsTuple(), True)

    def testListmaker27(self):
        maker = Find(Parse('2.7', b'z = [a, b,]'), tl.CListmakerNode)
        self.assertEqual(maker.GetSubExprCount(), 2)
        self.assertEqual([Text(maker.GetSubExpr(i)) for i in range(3)], [b'a', b'b', None])
        comp = Find(Parse('2.7', b'z = [a for a in b]'), tl.CListmakerNode)
        self.assertEqual(comp.GetSubExprCount(), 0)
        self.assertIsNone(comp.GetSubExpr(0))
        self.assertRaises(TypeError, maker.GetSubExpr, 'x')


class AtomExprPowerTest(unittest.TestCase):

    def testAwait35(self):
        tree = Parse('3.5', b'await f(x)', in_async_def=True)
        self.assertIsInstance(tree, tl.CAtomExpr)
        self.assertIsInstance(tree.GetPrefix(), tl.CKeywordLiteral)
        self.assertEqual(tree.GetPrefix().fText, b'await')
        self.assertEqual(Text(tree.GetAtom()), b'f')
        trailers = tree.GetTrailers()
        self.assertEqual([Text(t) for t in trailers], [b'( x )'])
        self.assertIsNot(tree.GetTrailers(), trailers)

    def testAwaitAsName35(self):
        tree = Parse('3.5', b'await(x)')
        self.assertIsNone(tree.GetPrefix())
        self.assertEqual(tree.GetAtom().fText, b'await')
        self.assertEqual(len(tree.GetTrailers()), 1)

    def testPower(self):
        # (version, source, atom, trailers, exponent)
        cases = [
            ('3.6', b'x ** 2', b'x', [], b'2'),
            ('3.6', b'a.b(c) ** 2', b'a', [b'. b', b'( c )'], b'2'),
            ('3.6', b'a.b(c) ** -2', b'a', [b'. b', b'( c )'], b'- 2'),
            ('2.7', b'a.b(c) ** 2', b'a', [b'. b', b'( c )'], b'2'),
            ('2.7', b'a[1] ** b ** c', b'a', [b'[ 1 ]'], b'b ** c'),
        ]
        for version, source, atom, trailers, exponent in cases:
            power = Find(Parse(version, b'z = ' + source), tl.CPower)
            what = '%s %s' % (version, source)
            self.assertEqual(Text(power.GetAtom()), atom, what)
            self.assertEqual([Text(t) for t in power.GetTrailers()], trailers, what)
            self.assertEqual(Text(power.GetExponentNode()), exponent, what)
        self.assertIsNone(Find(Parse('2.7', b'z = a.b'), tl.CPower).GetExponentNode())

    def testPowerIsFinal(self):
        with self.assertRaises(TypeError):
            type('P', (tl.CPower,), {})


class LiteralTest(unittest.TestCase):

    def testNumbers(self):
        for text, is_float in [(b'0x1e', False), (b'0XE', False), (b'0x1EL', False), (b'10', False),
                               (b'1.5', True), (b'1j', False), (b'1e5', True), (b'1E5', True), (b'.5', True),
                               (b'0777L', False), (b'0e0', True), (b'1_0.5', True)]:
            number = Find(Parse('2.7' if text.endswith(b'L') else '3.6', b'z = ' + text), tl.CNumberLiteral)
            self.assertEqual(number.fText, text)
            self.assertIs(number.IsFloat(), is_float, text)

    def testStrings(self):
        # (version, text, unicode, contents)
        cases = [
            ('2.7', b"u'x'", True, b'x'),
            ('2.7', b"ur'x'", True, b'x'),
            ('2.7', b"UR'x'", True, b'x'),
            ('3.6', b'b"x"', False, b'x'),
            ('3.6', b"''", False, b''),
            ('3.6', b'""', False, b''),
            ('3.6', b"'''abc'''", False, b'abc'),
            ('3.6', b'"""a"b"""', False, b'a"b'),
            ('3.6', b"'abc", False, b'abc'),
            ('3.6', b"rb'x'", False, b'x'),
            ('3.6', b"f'{x}'", False, b'{x}'),
            ('3.6', b"'x'", False, b'x'),
        ]
        for version, text, is_unicode, contents in cases:
            string = Find(Parse(version, b'z = ' + text), tl.CStringLiteral)
            self.assertEqual(string.fText, text)
            self.assertIs(string.IsUnicode(), is_unicode, text)
            self.assertEqual(string.GetStringContents(), contents, text)

    def testNoText(self):
        self.assertEqual(Unraisable(tl.CNumberLiteral(None).IsFloat)[0], False)
        self.assertEqual(Unraisable(tl.CStringLiteral(None).IsUnicode)[0], False)
        self.assertRaises(TypeError, tl.CStringLiteral(None).GetStringContents)

    def testFactor(self):
        for op in (b'-', b'+', b'~'):
            factor = Find(Parse('3.6', b'z = %sx' % op), tl.CFactorExpr)
            self.assertEqual(factor.GetUnaryOperator(), op)
        self.assertIsNone(tl.CFactorExpr(None).GetUnaryOperator())


class YieldTest(unittest.TestCase):

    def testYield(self):
        # (version, source, value, yield from)
        cases = [
            ('3.6', b'yield from x', b'x', True),
            ('3.6', b'yield x', b'x', False),
            ('3.6', b'yield a, b', b'a , b', False),
            ('2.7', b'yield a, b', b'a , b', False),
            ('3.6', b'z = yield from f()', b'f ( )', True),
        ]
        for version, source, value, is_from in cases:
            node = Find(Parse(version, source), tl.CYieldExpr)
            what = '%s %s' % (version, source)
            self.assertEqual(Text(node.GetValue()), value, what)
            self.assertIs(node.IsYieldFrom(), is_from, what)
        arg = Find(Parse('3.6', b'yield from x'), tl.CYieldArg)
        self.assertEqual(arg.GetValue().fText, b'x')
        self.assertIs(arg.IsYieldFrom(), True)
        self.assertIs(tl.CYieldArg(None).IsYieldFrom(), False)
        self.assertIsNone(tl.CYieldExpr(None).GetValue())


class CompForTest(unittest.TestCase):

    def testClauses(self):
        # (version, source, async, target, iterable, next clause)
        cases = [
            ('3.6', b'[i for i in y]', False, b'i', b'y', None),
            ('3.6', b'[i for i in y if i]', False, b'i', b'y', b'if i'),
            ('3.6', b'[i for a, b in y for c in d]', False, b'a , b', b'y', b'for c in d'),
            ('3.6', b'[i async for i in y]', True, b'i', b'y', None),
            ('3.6', b'[i async for i in y if i]', True, b'i', b'y', b'if i'),
            ('2.7', b'[i for i in y if i]', False, b'i', b'y', b'if i'),
            ('2.7', b'[i for i in 1, 2]', False, b'i', b'1 , 2', None),
        ]
        for version, source, is_async, target, iterable, next_clause in cases:
            clause = Find(Parse(version, b'z = ' + source, in_async_def=is_async), tl.CCompForNode)
            what = '%s %s' % (version, source)
            self.assertEqual(clause.GetStateName(), b'list_for' if version == '2.7' else b'comp_for', what)
            self.assertIs(clause.IsAsync(), is_async, what)
            self.assertEqual(Text(clause.GetTargetNode()), target, what)
            self.assertEqual(Text(clause.GetInNode()), iterable, what)
            self.assertEqual(Text(clause.GetCompIterNode()), next_clause, what)


class TrailerTest(unittest.TestCase):

    def testTrailers(self):
        # (source, dot name, nested, initial token)
        cases = [
            (b'f.name', b'name', None, b'.'),
            (b'f()', None, None, b'('),
            (b'f(a)', None, b'a', b'('),
            (b'f(a, b=1)', None, b'a , b = 1', b'('),
            (b'f[i]', None, b'i', b'['),
            (b'f[1:2]', None, b'1 : 2', b'['),
        ]
        for source, dot, nested, initial in cases:
            trailer = Find(Parse('3.6', source), tl.CTrailer)
            self.assertEqual(trailer.GetDotName(), dot, source)
            self.assertEqual(Text(trailer.GetNestedNode()), nested, source)
            self.assertEqual(trailer.GetInitialToken(), initial, source)
        with self.assertRaises(ValueError) as ctx:
            tl.CTrailer(None).GetInitialToken()
        self.assertEqual(str(ctx.exception), 'Trailer node with no children')

    def testLambdaIsNativeOnly(self):
        self.assertFalse(hasattr(tl.CLambdaExpr, 'GetBodyExpr'))
        self.assertFalse(hasattr(tl.CLambdaExpr, 'GetArgumentsNode'))


class RefcountTest(unittest.TestCase):

    def testAccessorsKeepRefcounts(self):
        sources = [('3.6', b'z = [(a, b), [c], -d ** e.f(g)[h], (yield from i), *j, 1.5, u"k", '
                           b'(x async for x in y)]'),
                   ('2.7', b'z = [a for b in c], [d, e], `f`, a.b(c) ** 2')]
        for version, source in sources:
            tree = Parse(version, source, in_async_def=True)
            nodes = Nodes(tree)
            calls = []
            for node in nodes:
                for name in ('GetSubExpr', 'GetSubExprCount', 'GetInitialBracket', 'IsLiteral', 'IsComprehension',
                             'IsTwoPlusStringLiterals', 'GetStarredExpression', 'GetValue', 'IsYieldFrom',
                             'IsTuple', 'IsGenExpr', 'GetPrefix', 'GetAtom', 'GetTrailers', 'GetExponentNode',
                             'IsFloat', 'IsUnicode', 'GetStringContents', 'GetUnaryOperator', 'IsAsync',
                             'GetTargetNode', 'GetInNode', 'GetCompIterNode', 'GetDotName', 'GetNestedNode',
                             'GetInitialToken'):
                    method = getattr(node, name, None)
                    if method is not None:
                        calls.append((method, (0,) if name == 'GetSubExpr' else ()))
            for method, args in calls:
                method(*args)
            before = [sys.getrefcount(n) for n in nodes] + [sys.getrefcount(n.fText) for n in nodes]
            for _ in range(100):
                for method, args in calls:
                    method(*args)
            after = [sys.getrefcount(n) for n in nodes] + [sys.getrefcount(n.fText) for n in nodes]
            self.assertEqual(after, before, version)


class OverrideTest(unittest.TestCase):
    """Python subclasses built by the parser: native callers honour their overrides."""

    def testOverridesSeenFromNative(self):

        class SquareAtom(tl.CAtom):
            def GetInitialBracket(self):
                return b'['

        parser = NewParser('3.6', {'atom': SquareAtom})
        atom = Find(Parse('3.6', b'z = (a)', parser=parser), SquareAtom)
        # (a) counts 0, but as "[a]" it is a one-element list.
        self.assertEqual(atom.GetSubExprCount(), 1)
        self.assertEqual(atom.GetSubExpr(0).fText, b'a')
        self.assertIs(tl.IsTupleExpression(atom), False)
        self.assertEqual(tl.CAtom.GetInitialBracket(atom), b'(')

    def testRaisingOverridesInNeverRaisingOperations(self):

        class BadAtom(tl.CAtom):
            def IsComprehension(self):
                raise RuntimeError('bang')

        class BadClause(tl.CCompForNode):
            def IsAsync(self):
                raise RuntimeError('boom')

        parser = NewParser('3.6', {'atom': BadAtom, 'comp_for': BadClause})
        atom = Find(Parse('3.6', b'z = (a, b)', parser=parser), BadAtom)
        self.assertRaises(RuntimeError, atom.IsComprehension)
        for call, expected, where in [(atom.IsLiteral, False, 'CAtom.IsLiteral'),
                                      (atom.GetSubExprCount, 0, 'CAtom.IsLiteral')]:
            result, err = Unraisable(call)
            self.assertEqual(result, expected, where)
            self.assertIn("RuntimeError('bang',) in 'pysource.treelens.%s' ignored" % where, err)
        clause = Find(Parse('3.6', b'z = [a for b in c]', parser=parser), BadClause)
        result, err = Unraisable(clause.GetTargetNode)
        self.assertEqual(result.fText, b'b')
        self.assertIn("'pysource.treelens.CCompForNode.IsAsync' ignored", err)

    def testOverrideReturningNewNodes(self):

        class Fresh(tl.CAtom):
            def GetSubExpr(self, i):
                return tl.CNameLiteral(None)

        parser = NewParser('3.6', {'atom': Fresh})
        outer = Find(Parse('3.6', b'z = [(a, b)]', parser=parser), Fresh)
        refs = sys.getrefcount(tl.CNameLiteral)
        for _ in range(100):
            # The native body of the outer atom delegates to the inner atom's override.
            sub = tl.CAtom.GetSubExpr(outer, 0)
            self.assertIsInstance(sub, tl.CNameLiteral)
            self.assertIsNone(sub.fText)
        del sub
        self.assertLessEqual(sys.getrefcount(tl.CNameLiteral) - refs, 1)


if __name__ == '__main__':
    unittest.main()
