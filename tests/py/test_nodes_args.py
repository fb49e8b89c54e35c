"""Argument lists: CArgInfo, parameter and argument nodes, GetDefiningArgInfoList and GetUsedArgInfoList."""

import subprocess
import sys
import unittest

from tests.py import support
from tests.py.test_nodes_expr import Find, NewParser, Parse, Text

try:
    from pysource import treelens as tl
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


def Show(infos):
    """Records as (name, value, prefix, type_expr) texts; nested lists stay lists."""
    return [Show(i) if isinstance(i, list) else (Text(i.name), Text(i.value), i.prefix, Text(i.type_expr))
            for i in infos]


def DefiningList(version, source):
    tree = Parse(version, source)
    if isinstance(tree, tl.CFuncdefStmt):
        return tl.GetDefiningArgInfoList(tree.GetChild(2))
    lam = Find(tree, tl.CLambdaExpr)
    args = lam.GetChild(1)
    return [] if args.fText == b':' else tl.GetDefiningArgInfoList(args)


def UsedList(version, source):
    trailer = Find(Parse(version, source), tl.CTrailer)
    nested = trailer.GetNestedNode()
    return [] if nested is None else tl.GetUsedArgInfoList(nested)


class ArgInfoTest(unittest.TestCase):

    def testFields(self):
        info = tl.CArgInfo()
        self.assertEqual((info.name, info.value, info.prefix, info.type_expr), (None,) * 4)
        node = tl.CNameLiteral(None)
        info.name, info.value, info.type_expr, info.prefix = node, node, node, b'*'
        self.assertEqual((info.name, info.value, info.prefix, info.type_expr), (node, node, b'*', node))
        info.name = info.prefix = None
        self.assertEqual((info.name, info.prefix), (None, None))
        for field, value in [('name', b'x'), ('value', 1), ('type_expr', object()), ('prefix', u'*'),
                             ('prefix', node)]:
            with self.assertRaises(TypeError):
                setattr(info, field, value)
        self.assertRaises(TypeError, tl.CArgInfo, 1)


class DefiningTest(unittest.TestCase):

    def testParameters(self):
        cases = [
            ('3.6', b'def f(): pass', []),
            ('3.6', b'def f(a): pass', [(b'a', None, None, None)]),
            ('3.6', b'def f(a, b=1, *args, **kw): pass',
             [(b'a', None, None, None), (b'b', b'1', None, None), (b'args', None, b'*', None),
              (b'kw', None, b'**', None)]),
            ('3.6', b'def f(a, *, b): pass',
             [(b'a', None, None, None), (None, None, b'*', None), (b'b', None, None, None)]),
            ('3.6', b'def f(a: int = 3): pass', [(b'a', b'3', None, b'int')]),
            ('3.6', b'def f(a: int): pass', [(b'a', None, None, b'int')]),
            ('3.6', b'def f(a: int, *b: str, c: x.y = 1, **d: e,): pass',
             [(b'a', None, None, b'int'), (b'b', None, b'*', b'str'), (b'c', b'1', None, b'x . y'),
              (b'd', None, b'**', b'e')]),
            ('3.6', b'def f(*args): pass', [(b'args', None, b'*', None)]),
            ('3.6', b'def f(a,): pass', [(b'a', None, None, None)]),
            ('3.5', b'def f(a, b: int=2): pass', [(b'a', None, None, None), (b'b', b'2', None, b'int')]),
            ('2.7', b'def f((a, b), c): pass', [[(b'a', None, None, None), (b'b', None, None, None)],
                                                  (b'c', None, None, None)]),
            ('2.7', b'def f((a, (b, c)), d=(1, 2)): pass',
             [[(b'a', None, None, None), [(b'b', None, None, None), (b'c', None, None, None)]],
              (b'd', b'( 1 , 2 )', None, None)]),
            ('2.7', b'def f((a, b)): pass', [[(b'a', None, None, None), (b'b', None, None, None)]]),
            ('2.7', b'def f((a)): pass', [[(b'a', None, None, None)]]),
            ('3.6', b'z = lambda: x', []),
            ('3.6', b'z = lambda x: x', [(b'x', None, None, None)]),
            ('3.6', b'z = lambda x, y=2: x', [(b'x', None, None, None), (b'y', b'2', None, None)]),
            ('3.6', b'z = lambda *a, **k: 0', [(b'a', None, b'*', None), (b'k', None, b'**', None)]),
            ('2.7', b'z = lambda (a, b), c=1: 0',
             [[(b'a', None, None, None), (b'b', None, None, None)], (b'c', b'1', None, None)]),
        ]
        for version, source, expected in cases:
            self.assertEqual(Show(DefiningList(version, source)), expected, '%s %s' % (version, source))

    def testParameterDefAccessors(self):
        param = Find(Parse('3.6', b'def f(a: int): pass'), tl.CFunctionParameterDef)
        self.assertEqual(param.GetName().fText, b'a')
        self.assertEqual(param.GetTypeExpr().fText, b'int')
        self.assertIsNone(param.GetNestedListNode())
        nested = Find(Parse('2.7', b'def f((a, b)): pass'), tl.CFunctionParameterDef)
        self.assertEqual(Text(nested.GetNestedListNode()), b'a , b')
        self.assertIsNone(nested.GetName())
        self.assertIsNone(nested.GetTypeExpr())
        empty = tl.CFunctionParameterDef(None)
        self.assertEqual((empty.GetNestedListNode(), empty.GetName(), empty.GetTypeExpr()), (None,) * 3)
        self.assertIsNone(tl.CParametersNode(None).GetArgName(3))
        self.assertRaises(TypeError, tl.CParametersNode(None).GetArgName)

    def testAssertions(self):
        # Anything but a name where a name belongs is asserted unless run with -O,
        # which takes it for the name (and ignores such a child inside a list).
        with self.assertRaises(AssertionError) as ctx:
            tl.GetDefiningArgInfoList(Find(Parse('3.6', b'z = (a)'), tl.CAtom))
        self.assertIsInstance(ctx.exception.args[0], tl.CAtom)
        for value in (None, (1, 2)):
            with self.assertRaises(AssertionError) as ctx:
                tl.GetDefiningArgInfoList(value)
            self.assertEqual(ctx.exception.args, (value,))

    def testParenAssertion(self):

        class Word(tl.CExpression):
            pass

        parser = NewParser('3.6', {'NAME': Word})
        arglist = Find(Parse('3.6', b'def f(a, b): pass', parser=parser), tl.CDefiningArglistNode)
        with self.assertRaises(AssertionError) as ctx:
            tl.GetDefiningArgInfoList(arglist)
        self.assertEqual(str(ctx.exception), 'Text is not ( or ): text = a, type(child) = %s' % Word)

    def testAssertionsDisabledUnderOptimize(self):
        script = (b'from tests.py.test_nodes_expr import Find, NewParser, Parse\n'
                  b'from pysource import treelens as tl\n'
                  b'atom = Find(Parse("3.6", b"z = (a)"), tl.CAtom)\n'
                  b'[info] = tl.GetDefiningArgInfoList(atom)\n'
                  b'assert info.name is atom\n'
                  b'class Word(tl.CExpression): pass\n'
                  b'parser = NewParser("3.6", {"NAME": Word})\n'
                  b'tree = Parse("3.6", b"def f(*a, b=1): pass", parser=parser)\n'
                  b'infos = tl.GetDefiningArgInfoList(Find(tree, tl.CDefiningArglistNode))\n'
                  b'print([(i.prefix, i.name) for i in infos], tl.GetDefiningArgInfoList(None)[0].name)\n')
        proc = subprocess.Popen([sys.executable, '-O', '-c', script], cwd=support.kRoot,
                                stdout=subprocess.PIPE, stderr=subprocess.PIPE)
        out, err = proc.communicate()
        self.assertEqual((proc.returncode, out.strip()), (0, b"([('*', None)], None)"), err)


class UsedTest(unittest.TestCase):

    def testArguments(self):
        cases = [
            ('3.6', b'f()', []),
            ('3.6', b'f(a)', [(None, b'a', None, None)]),
            ('3.6', b'f(a,)', [(None, b'a', None, None)]),
            ('3.6', b'f(a, b=2, *c, **d)',
             [(None, b'a', None, None), (b'b', b'2', None, None), (None, b'* c', b'*', None),
              (None, b'** d', b'**', None)]),
            ('3.6', b'f(*args)', [(None, b'* args', b'*', None)]),
            ('3.6', b'f(x for x in y)', [(None, b'x for x in y', None, None)]),
            ('3.6', b'f(a, *b, c=1, **d)',
             [(None, b'a', None, None), (None, b'* b', b'*', None), (b'c', b'1', None, None),
              (None, b'** d', b'**', None)]),
            ('2.7', b'f(a, b=2, *c, **d)',
             [(None, b'a', None, None), (b'b', b'2', None, None), (None, b'c', b'*', None),
              (None, b'd', b'**', None)]),
            ('2.7', b'f(*args)', [(None, b'args', b'*', None)]),
            ('2.7', b'f(a, (b, c))', [(None, b'a', None, None), (None, b'( b , c )', None, None)]),
        ]
        for version, source, expected in cases:
            self.assertEqual(Show(UsedList(version, source)), expected, '%s %s' % (version, source))

    def testClassBases27(self):
        tree = Parse('2.7', b'class C(A, B): pass')
        bases = Find(tree, tl.CTestListStarExpr)
        self.assertEqual(Show(tl.GetUsedArgInfoList(bases)), [(None, b'A', None, None), (None, b'B', None, None)])

    def testGeneratorArgument(self):
        arg = Find(Parse('3.6', b'f(x for x in y)'), tl.CSingleUsedArgumentNode)
        [info] = tl.GetUsedArgInfoList(arg)
        self.assertIs(info.value, arg)
        self.assertIs(arg.IsUnparenthesizedGenExpr(), True)
        second = Find(Parse('3.6', b'f(a, i for i in range(9))'), tl.CSingleUsedArgumentNode)
        self.assertIs(second.IsUnparenthesizedGenExpr(), True)
        self.assertIs(second.GetValue(), second)
        paren = Find(Parse('3.6', b'f(a, (i for i in range(9)))'), tl.CTrailer).GetNestedNode()
        self.assertFalse(any(isinstance(n, tl.CSingleUsedArgumentNode) for n in paren.fChildren))
        keyword = Find(Parse('3.6', b'f(a=1)'), tl.CSingleUsedArgumentNode)
        self.assertIs(keyword.IsUnparenthesizedGenExpr(), False)
        self.assertEqual((keyword.GetPrefix(), keyword.GetName().fText, keyword.GetValue().fText),
                         (None, b'a', b'1'))
        self.assertIs(tl.CSingleUsedArgumentNode(None).IsUnparenthesizedGenExpr(), False)

    def testOtherNodes(self):
        name = Find(Parse('3.6', b'f(a)'), tl.CTrailer).GetNestedNode()
        self.assertEqual(Show(tl.GetUsedArgInfoList(name)), [(None, b'a', None, None)])
        self.assertEqual(Show(tl.GetUsedArgInfoList(None)), [(None, None, None, None)])
        self.assertRaises(TypeError, tl.GetUsedArgInfoList, 3)
        self.assertRaises(TypeError, tl.GetUsedArgInfoList)


class OverrideTest(unittest.TestCase):

    def testOverriddenAccessorsFeedTheList(self):

        class Swapped(tl.CSingleUsedArgumentNode):
            def GetName(self):
                return self.GetChild(2)

            def GetValue(self):
                return self.GetChild(0)

            def GetPrefix(self):
                return b'**'

        parser = NewParser('3.6', {'argument': Swapped})
        trailer = Find(Parse('3.6', b'f(a=1, b)', parser=parser), tl.CTrailer)
        self.assertEqual(Show(tl.GetUsedArgInfoList(trailer.GetNestedNode())),
                         [(b'1', b'a', b'**', None), (None, b'b', None, None)])

        class WrongType(tl.CSingleUsedArgumentNode):
            def GetValue(self):
                return b'text'

        parser = NewParser('3.6', {'argument': WrongType})
        trailer = Find(Parse('3.6', b'f(a=1)', parser=parser), tl.CTrailer)
        self.assertRaises(TypeError, tl.GetUsedArgInfoList, trailer.GetNestedNode())


if __name__ == '__main__':
    unittest.main()
