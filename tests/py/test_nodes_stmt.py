"""Statement nodes: accessors on trees parsed from real source, the import-name helpers, argument
checks, Python-level overrides seen from native code, and malformed trees."""

import StringIO
import sys
import unittest

try:
    from pysource import treelens as tl
    from pysource import utils
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


_kAnalyzers = {}


def Parse(version, source, in_async_def=False):
    """The tree of the first logical line of source under the grammar of version."""
    if version not in _kAnalyzers:
        if version == '2.7':
            _kAnalyzers[version] = tl.CPGenAnalyzerImpl((2, 7, 0), tl.kPy2DefaultGrammar, None, False)
        else:
            _kAnalyzers[version] = tl.CPGenAnalyzerImpl((3, 6, 0))
    logical = utils.GetLogicalsFromText(source + b'\n')[0]
    return _kAnalyzers[version].ParseToNode(logical, in_async_def)


def Find(node, cls):
    """The first node of class cls in the tree, in preorder."""
    if isinstance(node, cls):
        return node
    for child in node.fChildren or ():
        found = Find(child, cls)
        if found is not None:
            return found
    return None


def Leaves(node):
    if node is None:
        return None
    if node.fChildren is None:
        return [node.fText]
    out = []
    for child in node.fChildren:
        out.extend(Leaves(child))
    return out


def Text(node):
    leaves = Leaves(node)
    return None if leaves is None else b' '.join(leaves)


def Make(cls, children=None, text=None, context=0, name=b'made'):
    """A node of class cls with the given fields, as the factory would fill them.

    Children that are not nodes (which a node refuses to be given) are put
    into its children list afterwards, as a careless caller could.
    """
    node = cls(tl.CNodeClassInfo(cls, 300, name))
    valid = None if children is None else [c for c in children if isinstance(c, tl.CNode)]
    node.__setstate__((valid, node.fClsInfo, context, None, text))
    if children is not None and len(valid) != len(children):
        node.fChildren[:] = children
    return node


def Leaf(text, cls=None):
    return Make(cls or tl.CNode, text=text)


def AsNames(records):
    """CAsName records as (module_name, as_name) pairs; the state is pickled in field-name order."""
    pairs = []
    for record in records:
        as_name, module_name = record.__reduce__()[2]
        pairs.append((module_name, as_name))
    return pairs


def Native(node, name):
    return tl._CallNativeNodeOp(node, name)


class ImportTest(unittest.TestCase):

    def testImportNames(self):
        cases = [
            (b'import a.b as c, d', [(b'a.b', b'c'), (b'd', None)]),
            (b'import a', [(b'a', None)]),
            (b'import a.b.c', [(b'a.b.c', None)]),
            (b'import a as b', [(b'a', b'b')]),
            (b'import a, b.c, d as e', [(b'a', None), (b'b.c', None), (b'd', b'e')]),
        ]
        for version in ('2.7', '3.6'):
            for source, expected in cases:
                node = Parse(version, source)
                self.assertIsInstance(node, tl.CImportNamesStmt, source)
                self.assertEqual(AsNames(node.GetAsNameList()), expected, (version, source))

    def testFromImports(self):
        cases = [
            # source, versions, from string, names, star
            (b'from . import (x as y, z)', ('2.7', '3.6'), b'.', [(b'x', b'y'), (b'z', None)], False),
            (b'from ..a import b', ('2.7', '3.6'), b'..a', [(b'b', None)], False),
            (b'from .a.b import c as d', ('2.7', '3.6'), b'.a.b', [(b'c', b'd')], False),
            (b'from m import *', ('2.7', '3.6'), b'm', [(b'*', None)], True),
            (b'from a.b import (c, d,)', ('2.7', '3.6'), b'a.b', [(b'c', None), (b'd', None)], False),
            (b'from m import a, b as c', ('2.7', '3.6'), b'm', [(b'a', None), (b'b', b'c')], False),
            # "..." is one token in the 3.x grammar and three in 2.7.
            (b'from ... import x', ('2.7', '3.6'), b'...', [(b'x', None)], False),
            (b'from .... m import x', ('3.6',), b'....m', [(b'x', None)], False),
        ]
        for source, versions, from_string, names, star in cases:
            for version in versions:
                node = Parse(version, source)
                where = (version, source)
                self.assertIsInstance(node, tl.CFromImportStmt, where)
                self.assertEqual(node.GetFromString(), from_string, where)
                self.assertEqual(AsNames(node.GetAsNameList()), names, where)
                self.assertIs(node.GetImportStar(), star, where)
                self.assertEqual(node.fChildren[node._GetImportIndex()].fText, b'import', where)

    def testFromWithoutImportKeyword(self):
        node = Make(tl.CFromImportStmt, [Leaf(b'from', tl.CKeywordLiteral), Leaf(b'm', tl.CNameLiteral)])
        self.assertEqual(node._GetImportIndex(), -1)
        self.assertIsNone(node.GetFromString())
        self.assertEqual(Make(tl.CFromImportStmt)._GetImportIndex(), -1)

    def testMatchingChildToken(self):
        node = Parse('2.7', b'from a import b')
        cases = [(b'import', 2), (b'from', 0), (b'b', 3), (b'c', -1), (None, -1)]
        for text, expected in cases:
            self.assertEqual(tl._GetMatchingChildToken(node, text), expected, text)
            self.assertEqual(tl._GetMatchingChildToken(node=node, text=text), expected, text)
        self.assertEqual(tl._GetMatchingChildToken(node.GetChild(0), b'from'), -1)
        interior = Parse('2.7', b'import a.b')
        self.assertEqual(tl._GetMatchingChildToken(interior, None), 1)
        checks = [
            ((None, b'x'), "Argument 'node' has incorrect type (expected pysource.treelens.CNode, got NoneType)"),
            ((node, 1), "Argument 'text' has incorrect type (expected str, got int)"),
            ((node, u'import'), "Argument 'text' has incorrect type (expected str, got unicode)"),
        ]
        for args, message in checks:
            with self.assertRaises(TypeError) as cm:
                tl._GetMatchingChildToken(*args)
            self.assertEqual(str(cm.exception), message)

    def testMatchingChildTokenNeverRaises(self):
        broken = Make(tl.CFromImportStmt, [Leaf(b'from'), 7, Leaf(b'import')])
        err = StringIO.StringIO()
        old, sys.stderr = sys.stderr, err
        try:
            self.assertEqual(tl._GetMatchingChildToken(broken, b'import'), -1)
            self.assertIsNone(broken.GetFromString())
        finally:
            sys.stderr = old
        self.assertIn('pysource.treelens._GetMatchingChildToken', err.getvalue())
        self.assertIn('Cannot convert int to pysource.treelens.CNode', err.getvalue())

    def testTextForImportName(self):
        dotted = Find(Parse('2.7', b'import a.bb.c as d'), tl.CDottedName)
        self.assertEqual(tl._TextForImportName([dotted]), b'a.bb.c')
        self.assertEqual(tl._TextForImportName([Leaf(b'.'), Leaf(b'.'), dotted]), b'..a.bb.c')
        self.assertEqual(tl._TextForImportName([]), b'')
        self.assertEqual(tl._TextForImportName([Make(tl.CNode, [])]), b'')
        checks = [
            (None, TypeError, "Argument 'node_list' has incorrect type (expected list, got NoneType)"),
            ((dotted,), TypeError, "Argument 'node_list' has incorrect type (expected list, got tuple)"),
            ([dotted, 1], TypeError, 'Cannot convert int to pysource.treelens.CNode'),
            ([Make(tl.CNode)], TypeError, "Argument 'node_list' has incorrect type (expected list, got NoneType)"),
        ]
        for arg, exc, message in checks:
            with self.assertRaises(exc) as cm:
                tl._TextForImportName(arg)
            self.assertEqual(str(cm.exception), message, arg)

    def testCyclicTreeRaises(self):
        loop = Make(tl.CNode, [])
        loop.fChildren.append(loop)
        try:
            self.assertRaises(RuntimeError, tl._TextForImportName, [loop])
        finally:
            del loop.fChildren[:]

    def testProcessNames(self):
        tree = Parse('3.6', b'import a.b as c, d')
        names = tree.GetChild(1)
        self.assertEqual(AsNames(tl._ProcessAsNamesList(names)), [(b'a.b', b'c'), (b'd', None)])
        self.assertEqual(AsNames([tl._ProcessSingleModuleNameAs(names.GetChild(0))]), [(b'a.b', b'c')])
        self.assertEqual(AsNames([tl._ProcessSingleModuleNameAs(names.GetChild(2))]), [(b'd', None)])
        # A whole list read as one name: its texts joined, no alias.
        self.assertEqual(AsNames([tl._ProcessSingleModuleNameAs(names)]), [(b'a.basc,d', None)])
        for func in (tl._ProcessAsNamesList, tl._ProcessSingleModuleNameAs):
            with self.assertRaises(TypeError) as cm:
                func(None)
            self.assertEqual(str(cm.exception),
                             "Argument 'node' has incorrect type (expected pysource.treelens.CNode, got NoneType)")

    def testOverridesSeenFromNativeCode(self):
        class AliasAsInt(tl.CNode):
            def GetChildText(self, i):
                return 5 if i == 2 else tl.CNode.GetChildText(self, i)

        class Unaliased(tl.CNode):
            def GetChildCount(self):
                return 1

        parts = [Leaf(b'a', tl.CNameLiteral), Leaf(b'as', tl.CKeywordLiteral), Leaf(b'b', tl.CNameLiteral)]
        self.assertEqual(AsNames([tl._ProcessSingleModuleNameAs(Make(tl.CNode, list(parts)))]), [(b'a', b'b')])
        self.assertEqual(AsNames([tl._ProcessSingleModuleNameAs(Make(Unaliased, list(parts)))]),
                         [(b'aasb', None)])
        with self.assertRaises(TypeError) as cm:
            tl._ProcessSingleModuleNameAs(Make(AliasAsInt, list(parts)))
        self.assertEqual(str(cm.exception), 'Expected bytes, got int')

        class FromAt(tl.CFromImportStmt):
            def _GetImportIndex(self):
                return 3

        tree = Parse('2.7', b'from ..a import b')
        node = Make(FromAt, list(tree.fChildren))
        self.assertEqual(node.GetFromString(), b'..')
        self.assertEqual(AsNames(node.GetAsNameList()), [(b'import', None)])


class StatementTest(unittest.TestCase):

    def testFuncdef(self):
        cases = [
            ('3.6', b'def f(a) -> int: pass', b'f', b'int'),
            ('3.6', b'def f(a): pass', b'f', None),
            ('2.7', b'def g(a, (b, c)): return a', b'g', None),
            ('3.6', b'def h(*, k: int = 1) -> a.b: pass', b'h', b'a . b'),
        ]
        for version, source, name, return_type in cases:
            node = Parse(version, source)
            self.assertIsInstance(node, tl.CFuncdefStmt)
            self.assertEqual(Native(node, 'GetName'), name, source)
            self.assertEqual(Text(node.GetReturnType()), return_type, source)
            self.assertIsInstance(node.GetParameters(), tl.CParametersNode, source)
            self.assertIs(node.GetSuite(), node.fChildren[-1], source)
        node = Find(Parse('3.6', b'async def f(x): pass'), tl.CFuncdefStmt)
        self.assertEqual((Native(node, 'GetName'), node.GetReturnType()), (b'f', None))

    def testClassdefBaseClasses(self):
        cases = [
            ('2.7', b'class A: pass', []),
            ('2.7', b'class A(): pass', []),
            ('2.7', b'class A(B): pass', [(None, b'B')]),
            ('2.7', b'class A(B, C): pass', [(None, b'B'), (None, b'C')]),
            ('3.6', b'class A(B.C, metaclass=M): pass', [(None, b'B . C'), (b'metaclass', b'M')]),
        ]
        for version, source, expected in cases:
            infos = Parse(version, source).GetBaseClassList()
            self.assertEqual([(Text(i.name), Text(i.value)) for i in infos], expected, source)

    def testNameLists(self):
        cases = [('2.7', b'global a, b', [b'a', b'b']), ('3.6', b'global a', [b'a']),
                 ('3.6', b'nonlocal x, y, z', [b'x', b'y', b'z'])]
        for version, source, expected in cases:
            node = Parse(version, source)
            self.assertIsInstance(node, (tl.CGlobalStmt, tl.CNonlocalStmt))
            names = node.GetUtf8NameList()
            self.assertEqual(names, expected, source)
            self.assertIsNot(names, node.GetUtf8NameList())
        self.assertEqual(Make(tl.CGlobalStmt, [Leaf(b'global'), Leaf(b'a', tl.CNameLiteral)]).GetUtf8NameList(),
                         [b'a'])

    def testForStmt(self):
        node = Parse('2.7', b'for x, y in z: pass')
        self.assertEqual(Text(node.GetTarget()), b'x , y')
        self.assertEqual(Text(node.GetInExpression()), b'z')
        self.assertEqual(Text(node.GetBody()), b'pass')
        self.assertIsNone(node.GetElseBody())
        # An else clause only comes in a tree built whole, not from one logical line.
        parts = list(node.fChildren) + [Leaf(b'else', tl.CKeywordLiteral), Leaf(b':'), Leaf(b'body')]
        self.assertEqual(Make(tl.CForStmt, parts).GetElseBody().fText, b'body')
        self.assertIsNone(Make(tl.CForStmt, parts[:6] + [Leaf(b'other')] + parts[7:]).GetElseBody())
        self.assertIsNone(Make(tl.CForStmt, parts[:8]).GetElseBody())

    def testWithItems(self):
        node = Parse('2.7', b'with open(f) as g, h: pass')
        items = Native(node, 'GetWithItems')
        self.assertEqual(len(items), 1)
        self.assertEqual(Text(Native(items[0], 'GetExpression')), b'open ( f )')
        self.assertEqual(Text(Native(items[0], 'GetTarget')), b'g')
        self.assertEqual(Native(Parse('3.6', b'with a, b: pass'), 'GetWithItems'), [])
        items = Native(Parse('3.6', b'with a as (b, c), d as e: pass'), 'GetWithItems')
        self.assertEqual([Text(Native(i, 'GetTarget')) for i in items], [b'( b , c )', b'e'])

    def testExceptClauses(self):
        cases = [
            ('2.7', b'except ValueError, e:', b'ValueError', b'e'),
            ('2.7', b'except ValueError as e:', b'ValueError', b'e'),
            ('3.6', b'except ValueError as e:', b'ValueError', b'e'),
            ('2.7', b'except (A, B), (c, d):', b'( A , B )', b'( c , d )'),
            ('3.6', b'except (A, B):', b'( A , B )', None),
        ]
        for version, source, exc_type, target in cases:
            clause = Find(Parse(version, source), tl.CExceptClause)
            self.assertEqual(Text(Native(clause, 'GetExceptionType')), exc_type, (version, source))
            self.assertEqual(Text(Native(clause, 'GetTarget')), target, (version, source))
        # A bare "except" is a lone keyword, never a clause node of its own.
        self.assertIsInstance(Parse('3.6', b'except:').GetChild(3), tl.CKeywordLiteral)
        bare = Make(tl.CExceptClause, [Leaf(b'except', tl.CKeywordLiteral)])
        self.assertEqual((Native(bare, 'GetExceptionType'), Native(bare, 'GetTarget')), (None, None))
        self.assertIsNone(Native(Make(tl.CExceptClause, []), 'GetTarget'))
        self.assertIsNone(Native(Make(tl.CExceptClause), 'GetExceptionType'))

    def testAugmentedAssignment(self):
        for op in (b'+=', b'-=', b'*=', b'/=', b'%=', b'&=', b'|=', b'^=', b'<<=', b'>>=', b'**=', b'//='):
            node = Parse('2.7', b'x ' + op + b' 1')
            self.assertEqual(node.GetAugAssignOp(), op)
            self.assertEqual(Native(node, 'GetEqualCount'), 0, op)
        self.assertIsNone(Parse('3.6', b'x @= 1').GetAugAssignOp())
        self.assertIsNone(Parse('2.7', b'x = 1').GetAugAssignOp())

    def testAssignments(self):
        node = Parse('2.7', b'a = b = c')
        self.assertEqual(Native(node, 'GetEqualCount'), 2)
        self.assertEqual(node.GetInitialTestExpr().fText, b'a')
        self.assertEqual([node.GetPostEqualsTestExpr(i).fText for i in (0, 1, -1)], [b'b', b'c', b'a'])
        self.assertIsNone(node.GetAnnotatedAssignNode())
        for bad in (2, 3, sys.maxsize):
            with self.assertRaises(ValueError) as cm:
                node.GetPostEqualsTestExpr(bad)
            self.assertEqual(str(cm.exception), "Not enough ='s")
        self.assertRaises(IndexError, node.GetPostEqualsTestExpr, -4)
        self.assertRaises(IndexError, node.GetPostEqualsTestExpr, -sys.maxsize - 1)
        self.assertRaises(TypeError, node.GetPostEqualsTestExpr, b'0')
        self.assertRaises(TypeError, node.GetPostEqualsTestExpr)
        node = Parse('2.7', b'x = yield y')
        self.assertIsInstance(node.GetPostEqualsTestExpr(0), tl.CYieldExpr)

    def testEqualCountNeverRaises(self):
        broken = Make(tl.CExprStmt, [Leaf(b'a'), Leaf(b'='), b'junk'])
        err = StringIO.StringIO()
        old, sys.stderr = sys.stderr, err
        try:
            self.assertEqual(Native(broken, 'GetEqualCount'), 0)
        finally:
            sys.stderr = old
        self.assertIn('pysource.treelens.CExprStmt.GetEqualCount', err.getvalue())

    def testAnnotations(self):
        node = Parse('3.6', b'x: int = 5')
        ann = node.GetAnnotatedAssignNode()
        self.assertIsInstance(ann, tl.CAnnotatedAssignNode)
        self.assertEqual((ann.GetTypeHintNode().fText, ann.GetPostEqualsTestExpr().fText), (b'int', b'5'))
        self.assertEqual(Native(node, 'GetEqualCount'), 0)
        ann = Parse('3.6', b'a.b: List[int]').GetAnnotatedAssignNode()
        self.assertEqual(Text(ann.GetTypeHintNode()), b'List [ int ]')
        self.assertIsNone(ann.GetPostEqualsTestExpr())

    def testReturn(self):
        cases = [(b'return x', b'x'), (b'return a, b', b'a , b')]
        for source, expected in cases:
            self.assertEqual(Text(Parse('2.7', source).GetValue()), expected, source)
        # A bare "return" is a lone keyword; the node form has no value.
        self.assertIsInstance(Parse('2.7', b'return'), tl.CKeywordLiteral)
        self.assertIsNone(Make(tl.CReturnStmt, [Leaf(b'return', tl.CKeywordLiteral)]).GetValue())

    def testDecorators(self):
        cases = [
            ('2.7', b'@a.b(c)', b'a . b', [(None, b'c')]),
            ('3.6', b'@f', b'f', []),
            ('2.7', b'@f()', b'f', []),
            ('2.7', b'@f(a, b=1, *c)', b'f', [(None, b'a'), (None, b'1'), (b'*', b'c')]),
            ('3.6', b'@f(a, b=1, *c)', b'f', [(None, b'a'), (None, b'1'), (b'*', b'* c')]),
        ]
        for version, source, name, args in cases:
            node = Find(Parse(version, source), tl.CSingleDecorator)
            self.assertEqual(Text(Native(node, 'GetDottedName')), name, source)
            infos = Native(node, 'GetUsedArgList')
            self.assertEqual([(i.prefix, Text(i.value)) for i in infos], args, (version, source))

    def testNativeOpsCheckTheClass(self):
        node = Parse('2.7', b'x = 1')
        with self.assertRaises(AttributeError) as cm:
            Native(node, 'GetName')
        self.assertEqual(str(cm.exception), 'pysource.treelens.CExprStmt has no native-only operation GetName')
        self.assertRaises(TypeError, Native, None, 'GetName')
        with self.assertRaises(TypeError):
            tl.CForStmt.GetTarget(node)

    def testMalformedShapes(self):
        short = Make(tl.CFuncdefStmt, [Leaf(b'def')])
        self.assertRaises(IndexError, short.GetParameters)
        self.assertRaises(IndexError, Native, short, 'GetName')
        leaf = Make(tl.CReturnStmt, text=b'return')
        self.assertIsNone(leaf.GetValue())
        self.assertRaises(TypeError, Make(tl.CForStmt, text=b'for').GetTarget)

    def testNoReferenceLeaks(self):
        tree = Parse('2.7', b'from . import (x as y, z)')
        stmt = Parse('2.7', b'a = b = c')
        calls = [(tree.GetAsNameList, ()), (tree.GetFromString, ()), (stmt.GetPostEqualsTestExpr, (1,)),
                 (stmt.GetInitialTestExpr, ()), (stmt.GetAugAssignOp, ())]
        watched = [tree, stmt] + list(tree.fChildren) + list(stmt.fChildren)
        for func, args in calls:
            func(*args)
            before = [sys.getrefcount(n) for n in watched]
            for _ in range(100):
                func(*args)
            self.assertEqual([sys.getrefcount(n) for n in watched], before, func.__name__)


if __name__ == '__main__':
    unittest.main()
