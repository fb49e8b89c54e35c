"""Every node accessor on every node of every logical line of the 2.7 and 3.6 standard libraries.

Each line is parsed with the grammar of its version; every accessor of every
node's class is called from Python. None may raise: the exceptions the node
classes document are for malformed shapes, which the parser never builds.
The trees go back to the free lists, so a leak shows as a growing node count.
"""

import gc
import sys
import unittest

from tests.py import support

try:
    from pysource import treelens as tl
    from pysource import optpgen
    from pysource.utils import GetLogicalsFromText
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


def _NoArgs(*names):
    return [(name, ()) for name in names]


def AccessorTable():
    """Class -> [(method name, argument tuple)] of the accessors to call."""
    return {
        tl.CAtom: _NoArgs('GetInitialBracket', 'IsLiteral', 'IsComprehension', 'IsTwoPlusStringLiterals',
                          ),
        tl.CStarExpression: _NoArgs('GetStarredExpression'),
        tl.CYieldExpr: _NoArgs('GetValue', 'IsYieldFrom'),
        tl.CYieldArg: _NoArgs('GetValue', 'IsYieldFrom'),
        tl.CTestListStarExpr: _NoArgs('IsTuple', 'IsGenExpr'),
        tl.CAtomExpr: _NoArgs('GetPrefix', 'GetAtom', 'GetTrailers'),
        tl.CPower: _NoArgs('GetAtom', 'GetTrailers', 'GetExponentNode'),
        tl.CNumberLiteral: _NoArgs('IsFloat'),
        tl.CStringLiteral: _NoArgs('IsUnicode', 'GetStringContents'),
        tl.CFactorExpr: _NoArgs('GetUnaryOperator'),
        tl.CCompForNode: _NoArgs('IsAsync', 'GetTargetNode', 'GetInNode', 'GetCompIterNode'),
        tl.CTrailer: _NoArgs('GetDotName', 'GetNestedNode', 'GetInitialToken'),
        tl.CFunctionParameterDef: _NoArgs('GetNestedListNode', 'GetName', 'GetTypeExpr'),
        tl.CSingleUsedArgumentNode: _NoArgs('GetPrefix', 'GetName', 'GetValue', 'IsUnparenthesizedGenExpr'),
        tl.CParametersNode: [('GetArgName', (0,))],
        tl.CNode: _NoArgs('GetChildCount', 'GetStateName') + [('GetChild', (0,)), ('GetChildText', (0,))],
        tl.CFuncdefStmt: _NoArgs('GetParameters', 'GetReturnType', 'GetSuite'),
        tl.CClassdefStmt: _NoArgs('GetBaseClassList'),
        tl.CGlobalStmt: _NoArgs('GetUtf8NameList'),
        tl.CNonlocalStmt: _NoArgs('GetUtf8NameList'),
        tl.CForStmt: _NoArgs('GetTarget', 'GetInExpression', 'GetBody', 'GetElseBody'),
        tl.CExprStmt: _NoArgs('GetAnnotatedAssignNode', 'GetInitialTestExpr', 'GetAugAssignOp'),
        tl.CAnnotatedAssignNode: _NoArgs('GetTypeHintNode', 'GetPostEqualsTestExpr'),
        tl.CReturnStmt: _NoArgs('GetValue'),
        tl.CImportNamesStmt: _NoArgs('GetAsNameList'),
        tl.CFromImportStmt: _NoArgs('_GetImportIndex', 'GetFromString', 'GetImportStar', 'GetAsNameList'),
    }


def NativeOnlyTable():
    """Class -> names of its native-only operations, called through _CallNativeNodeOp."""
    return {
        tl.CFuncdefStmt: ('GetName',),
        tl.CWithStmt: ('GetWithItems',),
        tl.CWithItem: ('GetExpression', 'GetTarget'),
        tl.CExceptClause: ('GetExceptionType', 'GetTarget'),
        tl.CExprStmt: ('GetEqualCount',),
        tl.CSingleDecorator: ('GetDottedName', 'GetUsedArgList'),
    }


def Nodes(node):
    stack = [node]
    while stack:
        n = stack.pop()
        yield n
        if n.fChildren:
            stack.extend(reversed(n.fChildren))


class Sweep(object):
    """Calls every accessor of every node; collects the unexpected failures."""

    kExpected = ('Not enough expressions in list',)

    def __init__(self, version):
        self.version = version
        self.table = [(cls, calls) for cls, calls in AccessorTable().items()]
        self.native_only = NativeOnlyTable()
        self.failures = []
        self.counts = {'logicals': 0, 'trees': 0, 'nodes': 0, 'calls': 0, 'unparsed': 0}

    def CallsFor(self, node):
        calls = []
        for cls, methods in self.table:
            if isinstance(node, cls):
                calls.extend(methods)
        return calls

    def Fail(self, where, node, what, exc):
        if len(self.failures) < 40:
            self.failures.append('%s: %r.%s -> %s: %s' % (where, node, what, type(exc).__name__, exc))

    def CheckNode(self, where, node):
        counts = self.counts
        cls = type(node)
        calls = self.cache.get(cls)
        if calls is None:
            calls = self.cache[cls] = self.CallsFor(node)
        for name, args in calls:
            counts['calls'] += 1
            try:
                getattr(node, name)(*args)
            except Exception as exc:
                self.Fail(where, node, name, exc)
        if isinstance(node, (tl.CExpression, tl.CListmakerNode)):
            self.CheckSubExprs(where, node)
        if isinstance(node, tl.CAtom):
            for func in (tl.IsSetLiteral, tl.IsGenExpression, tl.IsTupleExpression, tl.DropSimpleParens):
                counts['calls'] += 1
                try:
                    func(node)
                except Exception as exc:
                    self.Fail(where, node, func.__name__, exc)
        counts['calls'] += 2
        try:
            end = tl.GetTokenEndIndex(node)
            expected = node.fContext + 1 if not node.fChildren else tl.GetTokenEndIndex(node.fChildren[-1])
            if end != expected or end <= 0:
                self.Fail(where, node, 'GetTokenEndIndex', ValueError(end))
        except Exception as exc:
            self.Fail(where, node, 'GetTokenEndIndex', exc)
        if node.fText is not None and node.fText[:1] in (b'"', b"'") or isinstance(node, tl.CStringLiteral):
            try:
                stripped, prefix, suffix = tl.StripPyQuotes(node.fText)
                if prefix + stripped + suffix != node.fText:
                    self.Fail(where, node, 'StripPyQuotes', ValueError(node.fText))
            except Exception as exc:
                self.Fail(where, node, 'StripPyQuotes', exc)

    def CheckSubExprs(self, where, node):
        """GetSubExpr for every index below the count, and one past it."""
        count = node.GetSubExprCount()
        self.counts['calls'] += count + 2
        for i in range(count + 1):
            try:
                sub = node.GetSubExpr(i)
                if i < count and not isinstance(sub, tl.CExpression) and sub is not None:
                    self.Fail(where, node, 'GetSubExpr(%d)' % i, TypeError(sub))
            except ValueError as exc:
                # Past the end of a list is the documented error for an index
                # the caller did not check against the count.
                if i < count or str(exc) not in self.kExpected:
                    self.Fail(where, node, 'GetSubExpr(%d)' % i, exc)
            except Exception as exc:
                self.Fail(where, node, 'GetSubExpr(%d)' % i, exc)

    def CheckArgLists(self, where, node):
        if isinstance(node, (tl.CFuncdefStmt, tl.CLambdaExpr)):
            args = node.GetChild(2) if isinstance(node, tl.CFuncdefStmt) else node.GetChild(1)
            if args is not None and args.fText != b':':
                self.Call(where, node, tl.GetDefiningArgInfoList, args)
        elif isinstance(node, tl.CTrailer) and node.GetInitialToken() == b'(':
            nested = node.GetNestedNode()
            if nested is not None:
                self.Call(where, node, tl.GetUsedArgInfoList, nested)
        elif isinstance(node, (tl.CClassdefStmt, tl.CSingleDecorator)):
            texts = [c.fText for c in node.fChildren]
            if b'(' in texts and texts[texts.index(b'(') + 1] != b')':
                self.Call(where, node, tl.GetUsedArgInfoList, node.fChildren[texts.index(b'(') + 1])
        for op in self.native_only.get(type(node), ()):
            self.Call(where, node, lambda n: tl._CallNativeNodeOp(n, op), node)
        if isinstance(node, tl.CExprStmt):
            for i in range(tl._CallNativeNodeOp(node, 'GetEqualCount')):
                self.Call(where, node, lambda n: n.GetPostEqualsTestExpr(i), node)
        if isinstance(node, tl.CLambdaExpr):
            for op in ('GetArgumentsNode', 'GetBodyExpr'):
                self.Call(where, node, lambda n: tl._CallNativeNodeOp(n, op), node)
        elif isinstance(node, tl.CAtom):
            self.Call(where, node, lambda n: tl._NativeOnly('ExpandSeqLiteral', n, 1), node)
            self.Call(where, node, lambda n: tl._NativeOnly('ExpandSeqLiteral', n, 0, False), node)

    def Call(self, where, node, func, arg):
        self.counts['calls'] += 1
        try:
            func(arg)
        except Exception as exc:
            self.Fail(where, node, func.__name__, exc)

    def Run(self, parser, files):
        self.cache = {}
        for path in files:
            for logical in GetLogicalsFromText(support.ReadBytes(path)):
                if logical.fKind in (21, 22):
                    continue
                self.counts['logicals'] += 1
                try:
                    tree = parser.ParseToNode(logical, self.version != '2.7' and support.InAsyncDef(logical))
                except (SyntaxError, optpgen.ParseError):
                    self.counts['unparsed'] += 1
                    continue
                if tree is None:
                    continue
                self.counts['trees'] += 1
                for i in range(-1, logical.fTokenCount):
                    tl._NativeOnly('NextNonRemovedTokenInLogical', logical, i)
                self.token_count = logical.fTokenCount
                where = '%s:%d' % (path, logical.fFirstLine + 1)
                for node in Nodes(tree):
                    self.counts['nodes'] += 1
                    self.CheckNode(where, node)
                    self.CheckArgLists(where, node)
                parser.DiscardNode(tree)


class SweepTest(unittest.TestCase):

    def Sweep(self, version, grammar, py3):
        files = support.CorpusFiles(version)
        if not files:
            self.skipTest('no Python %s standard library' % version)
        parser = tl.CPGenParserImpl(tuple(int(p) for p in version.split('.')) + (0,), grammar, None, py3)
        sweep = Sweep(version)
        sweep.Run(parser, files)
        counts = dict(sweep.counts)
        # The free lists now hold enough nodes: sweeping again allocates nothing that stays.
        again = files[:20]
        gc.collect()
        before = len(gc.get_objects())
        sweep.Run(parser, again)
        gc.collect()
        grown = len(gc.get_objects()) - before
        sys.stderr.write('\n%s sweep: %d files, %d logical lines (%d unparsed), %d nodes, %d accessor calls\n'
                         % (version, len(files), counts['logicals'], counts['unparsed'], counts['nodes'],
                            counts['calls']))
        self.assertEqual(sweep.failures, [])
        self.assertLess(grown, 50, 'objects grew by %d' % grown)

    def testStdlib27(self):
        self.Sweep('2.7', 'Python-Grammar-2.7', False)

    def testStdlib36(self):
        self.Sweep('3.6', 'Python-Grammar-3.6', True)


if __name__ == '__main__':
    unittest.main()
