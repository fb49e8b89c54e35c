"""pysource.treelens: module surface, record operations, parser, factory, node base, analyzer."""

import gc
import math
import pickle
import StringIO
import subprocess
import sys
import unittest

from tests.py import support

try:
    from pysource import treelens as tl
    from pysource import _fastaccess, symbolinfo, logicalinspect, utils
    from pysource import optpgen
    from loomutils import reflect
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


_kParsers = {}


def Parser(version):
    """A shared CPGenParserImpl per language version ('2.7', '3.6', '3.7')."""
    if version not in _kParsers:
        triple = tuple(int(p) for p in version.split('.')) + (0,)
        grammar = 'Python-Grammar-%s' % ('2.7' if version == '2.7' else '3.6')
        _kParsers[version] = tl.CPGenParserImpl(triple, grammar, None, version != '2.7')
    return _kParsers[version]


def Logical(source, kind=None):
    """The first logical line of source (a record from the host's splitter)."""
    logical = utils.GetLogicalsFromText(source)[0]
    if kind is not None:
        logical = _fastaccess.CLogicalLine(logical.fTokens, kind, logical.fFirstLine, logical.fLineText)
    return logical


def Record(pairs, kind=0):
    return _fastaccess.CLogicalLine(pairs, kind)


def Leaves(node):
    if node.fChildren is None:
        return [node.fText]
    out = []
    for child in node.fChildren:
        out.extend(Leaves(child))
    return out


def Nodes(node):
    out = [node]
    for child in node.fChildren or ():
        out.extend(Nodes(child))
    return out


def Parse(version, source, in_async_def=False, kind=None):
    return Parser(version).ParseToNode(Logical(source, kind), in_async_def)


class SurfaceTest(unittest.TestCase):

    def testConstants(self):
        prefix = symbolinfo.kTypedLiteralPrefix
        self.assertEqual(tl.kListInstanceName, prefix + b'list:')
        self.assertEqual(tl.kTupleInstanceName, prefix + b'tuple:')
        self.assertEqual(tl.kIntLiteralName, prefix + b'int' + symbolinfo.kClassInstanceSuffix)
        self.assertFalse(tl.kIntLiteralName.endswith(b':'))
        self.assertEqual(tl.kLiteralPrefix, prefix)
        self.assertEqual((tl.kPy2DefaultGrammar, tl.kPy3DefaultGrammar),
                         (b'Python-Grammar-2.7', b'Python-Grammar-3.6'))
        self.assertIs(tl.kMimicAstInspectBugs, True)
        self.assertTrue(tl.__doc__.startswith(' treelens -- pgen based inspection of Python source code'))

    def testPublicNames(self):
        names = ('CNodeClassInfo CNode CExpression CStmt CAtom CBinaryExpression CStarExpression CAsName '
                 'CImportNamesStmt CFromImportStmt CArgInfo CSingleUsedArgumentNode CFunctionParameterDef '
                 'CDefiningArglistNode CUsedArglistNode CParametersNode CClassdefStmt CFuncdefStmt '
                 'CSingleDecorator CDottedName CMultipleDecorators CLambdaExpr CGlobalStmt CNonlocalStmt '
                 'CForStmt CWithStmt CWithItem CPassStmt CExceptClause CExprStmt CAnnotatedAssignNode '
                 'CBinaryOp CTestExpr CReturnStmt CYieldExpr CYieldArg CTestListStarExpr CNameLiteral '
                 'CKeywordLiteral CCompForNode CListmakerNode CTrailer CAtomExpr CPower CNumberLiteral '
                 'CStringLiteral CFactorExpr CNodeToTextConverter CNodeWalker CDispatchWalker CPGenAnalyzer '
                 'CPGenParserImpl CTypeHintWalker CPGenAnalyzerImpl CFStringSupport CreateSyntaxError '
                 'LogicalCheck RaiseIfNotLogical IsWhitespaceLogical IsScopeStartLogical '
                 'GetLocalScopeDefined SetLogicalLocalScopeDefined PySet_InplaceOr '
                 'ULongLongValueForDoubleBits DoubleValueForULongLongBits DoubleValueForPyIntBits GetNowTime '
                 'OutOfTime LocationsEqual IsDefKind GetInfoBytesKind IsTopLevelModuleScope').split()
        for name in names:
            self.assertTrue(hasattr(tl, name), name)
            self.assertTrue(getattr(tl, name).__doc__, name)

    def testClassTree(self):
        cases = [(tl.CStmt, tl.CNode), (tl.CExpression, tl.CNode), (tl.CPassStmt, tl.CStmt),
                 (tl.CAtom, tl.CExpression), (tl.CDottedName, tl.CExpression),
                 (tl.CImportNamesStmt, tl.CNode), (tl.CTrailer, tl.CNode),
                 (tl.CPGenParserImpl, tl.CPGenAnalyzer), (tl.CPGenAnalyzerImpl, tl.CPGenAnalyzer),
                 (tl.CPGenAnalyzer, optpgen.NodeConverter), (tl.CTypeHintWalker, tl.CDispatchWalker)]
        for cls, base in cases:
            self.assertIs(cls.__base__, base, cls)
        self.assertFalse(issubclass(tl.CImportNamesStmt, tl.CStmt))

    def testFinalClasses(self):
        for cls in (tl.CPGenAnalyzerImpl, tl.CPGenParserImpl, tl.CNodeWalker, tl.CTypeHintWalker, tl.CPower):
            self.assertRaises(TypeError, type, 'Sub', (cls,), {})
        for cls in (tl.CNode, tl.CAtom, tl.CPGenAnalyzer, tl.CDispatchWalker, tl.CArgInfo, tl.CNodeFactory):
            type('Sub', (cls,), {})

    def testSupportedRules(self):
        self.assertEqual(tl.CNode.kSupportedRules, [])
        self.assertEqual(tl.CExpression.kSupportedRules, [])
        self.assertIs(tl.CStmt.kSupportedRules, tl.CNode.kSupportedRules)
        self.assertIs(tl.CAtom.kSupportedRules, tl.CExpression.kSupportedRules)
        self.assertEqual(tl.CStarExpression.kSupportedRules, ["star_expr: '*' expr"])
        self.assertEqual(len(tl.CBinaryExpression.kSupportedRules), 11)
        self.assertEqual(tl.CPower.kSupportedRules,
                         ["power: atom trailer* ['**' factor]", "power: atom_expr ['**' factor]"])

    def testClsForState(self):
        table = tl.CPGenParserImpl.kClsForState
        for name, cls in [('NAME', tl.CNameLiteral), ('atom', tl.CAtom), ('list_for', tl.CCompForNode),
                          ('varargslist', tl.CDefiningArglistNode), ('factor', tl.CFactorExpr)]:
            self.assertIs(table[name], cls, name)
        parser = Parser('3.6')
        states = parser._BuildClsForStateList()
        self.assertIs(table['star_expr'], tl.CStarExpression)  # merged from kSupportedRules
        self.assertIs(table['atom_expr'], tl.CAtomExpr)
        self.assertIs(states[0], tl.CNode)     # ENDMARKER
        self.assertIs(states[1], tl.CNameLiteral)
        self.assertIs(states[100], tl.CNode)   # no grammar symbol, no token name

    def testImportWithoutHostFails(self):
        # A failed import leaves no half-made module: importing again fails the same way.
        script = ('import sys; sys.modules["pysource.symbolinfo"] = None\n'
                  'for _ in range(2):\n'
                  '  try:\n    import pysource.treelens\n  except ImportError as e:\n    print("ImportError")\n'
                  'print("pysource.treelens" in sys.modules)\n')
        out = subprocess.check_output([sys.executable, '-c', script], cwd=support.kRoot)
        self.assertEqual(out.split(), [b'ImportError', b'ImportError', b'False'])


class RecordTest(unittest.TestCase):

    def testExactTypeTests(self):
        class Sub(_fastaccess.CLogicalLine):
            pass
        real, sub = Record([(b'x', (0, 0))]), Sub([(b'x', (0, 0))])
        self.assertTrue(tl.LogicalCheck(real))
        for obj in (sub, None, (b'x', (0, 0))):
            self.assertFalse(tl.LogicalCheck(obj), obj)
            with self.assertRaises(TypeError) as cm:
                tl.RaiseIfNotLogical(obj)
            self.assertEqual(str(cm.exception), 'Argument must be a logical')
        self.assertIs(tl.RaiseIfNotLogical(real), False)
        analyzer = _Analyzer('2.7')
        with self.assertRaises(TypeError) as cm:
            analyzer.AnalyzeSingleLogical(sub, False)
        self.assertEqual(str(cm.exception), 'logical not a CLogicalLine')
        self.assertRaises(TypeError, Parser('2.7').ParseToNode, sub, False)
        self.assertRaises(TypeError, tl.IsWhitespaceLogical, sub)

    def testKinds(self):
        for kind, white, scope in [(0, False, False), (1, False, True), (2, False, True), (11, False, False),
                                   (21, True, False), (22, True, False)]:
            record = Record([], kind)
            self.assertEqual(tl.IsWhitespaceLogical(record), white, kind)
            self.assertEqual(tl.IsScopeStartLogical(record), scope, kind)

    def testTokenText(self):
        record = Record([(b'a', (0, 0)), (b'b', (0, 2))])
        self.assertEqual(tl.GetLogicalTokenText(record, 1), b'b')
        for i in (-1, 2):
            with self.assertRaises(IndexError) as cm:
                tl.GetLogicalTokenText(record, i)
            self.assertEqual(str(cm.exception), 'Index not in range')

    def testLocalScopeDefined(self):
        cases = [(b'async def f(x): pass\n', None, b'f'),
                 (b'def g(): pass\n', None, b'g'),
                 (b'class C(B): pass\n', None, b'C'),
                 (b'x = 1\n', None, None),
                 (b'def g(): pass\n', b'cached', b'cached')]
        for source, cached, expected in cases:
            logical = Logical(source)
            if cached is not None:
                tl.SetLogicalLocalScopeDefined(logical, cached)
            self.assertEqual(tl.GetLocalScopeDefined(logical), expected, source)
        self.assertIsNone(tl.GetLocalScopeDefined(Record([(b'\\', (0, 0)), (b'class', (1, 0))], 1)))
        logical = Logical(b'def g(): pass\n')
        tl.SetLogicalLocalScopeDefined(logical, 5)
        with self.assertRaises(TypeError) as cm:
            tl.GetLocalScopeDefined(logical)
        self.assertEqual(str(cm.exception), 'Expected bytes, got int')
        self.assertRaises(TypeError, tl.SetLogicalLocalScopeDefined, None, b'x')

    def testParentScope(self):
        for scope, expected in [(b'a.b.c', b'a.b'), (b'a', b''), (b'', None), (b'.a', b'')]:
            self.assertEqual(tl.GetParentScope(scope), expected, scope)
        with self.assertRaises(TypeError) as cm:
            tl.GetParentScope(None)
        self.assertEqual(str(cm.exception), 'expected bytes, NoneType found')
        outer, inner = utils.GetLogicalsFromText(b'def f():\n    x = 1\n')
        self.assertIs(tl.GetParentScopeLogical(inner), outer)
        self.assertIsNone(tl.GetParentScopeLogical(outer))

    def testSetInplaceOr(self):
        s = set([1])
        self.assertIs(tl.PySet_InplaceOr(s, set([1, 2])), True)
        self.assertEqual(s, set([1, 2]))
        self.assertIs(tl.PySet_InplaceOr(s, frozenset([2])), False)
        with self.assertRaises(TypeError) as cm:
            tl.PySet_InplaceOr(None, set())
        self.assertEqual(str(cm.exception), "object of type 'NoneType' has no len()")
        with self.assertRaises(TypeError) as cm:
            tl.PySet_InplaceOr(frozenset([1]), set([2]))
        self.assertEqual(str(cm.exception), 'Expected set, got frozenset')
        self.assertRaises(TypeError, tl.PySet_InplaceOr, set(), [1])

    def testBitPatterns(self):
        self.assertEqual(tl.ULongLongValueForDoubleBits(1.0), 0x3FF0000000000000)
        self.assertEqual(tl.DoubleValueForULongLongBits(0x3FF0000000000000), 1.0)
        nan = tl.DoubleValueForPyIntBits(-1)
        self.assertTrue(math.isnan(nan))
        self.assertEqual(tl.ULongLongValueForDoubleBits(nan), 2 ** 64 - 1)
        self.assertEqual(tl.DoubleValueForPyIntBits(2 ** 64 + 0x3FF0000000000000), 1.0)
        self.assertEqual(tl.DoubleValueForPyIntBits(b'x'), -1.0)
        self.assertRaises(OverflowError, tl.DoubleValueForULongLongBits, -1)

    def testTimeAndLocations(self):
        now = tl.GetNowTime()
        self.assertGreater(now, 1e9)
        self.assertTrue(tl.OutOfTime(now))
        self.assertFalse(tl.OutOfTime(now + 3600))
        a = (1, 2)
        self.assertTrue(tl.LocationsEqual(a, a))
        self.assertFalse(tl.LocationsEqual(a, tuple([1, 2])))
        self.assertRaises(TypeError, tl.LocationsEqual, a)

    def testSymbolInfoFunctions(self):
        cases = [(symbolinfo.kGetPrefix + b'x', symbolinfo.kGetKind), (b'x', symbolinfo.kPlainEquivKind),
                 (b':', symbolinfo.kPlainEquivKind), (b'', symbolinfo.kPlainEquivKind)]
        for ibytes, kind in cases:
            self.assertEqual(tl.GetInfoBytesKind(ibytes), kind, ibytes)
        self.assertRaises(TypeError, tl.GetInfoBytesKind, None)
        for kind in (symbolinfo.kFunctionKind, symbolinfo.kMethodKind, symbolinfo.kUnboundMethodKind):
            self.assertTrue(tl.IsDefKind(kind), kind)
        self.assertFalse(tl.IsDefKind(symbolinfo.kClassKind))
        self.assertTrue(tl.IsTopLevelModuleScope(b''))
        self.assertFalse(tl.IsTopLevelModuleScope(b'f'))
        self.assertRaises(TypeError, tl.IsTopLevelModuleScope, None)


class ParserTest(unittest.TestCase):

    def testCompletion(self):
        # source, kind, state of the result, its leaf texts
        cases = [
            (b'else:\n', None, b'if_stmt', b'if 0 : pass else : pass'),
            (b'elif x:\n', None, b'if_stmt', b'if x : pass'),
            (b'except ValueError:\n', None, b'try_stmt', b'try : pass except ValueError : pass'),
            (b'except ValueError, e:\n', None, b'try_stmt', b'try : pass except ValueError , e : pass'),
            (b'finally:\n', None, b'try_stmt', b'try : pass finally : pass'),
            (b'try:\n', 11, b'try_stmt', b'try : pass finally : pass'),
            (b'try: x\n', 11, b'try_stmt', b'try : x finally : pass'),
            (b'if x:\n', None, b'if_stmt', b'if x : pass'),
            (b'if x:  # note\n', None, b'if_stmt', b'if x : pass'),
            (b'while x: y = 1\n', None, b'while_stmt', b'while x : y = 1'),
            (b'def f(a):\n', None, b'funcdef', b'def f ( a ) : pass'),
            (b'@dec(a)\n', None, b'decorator', b'@ dec ( a ) \n'),
            (b'@a.b\n', None, b'decorator', b'@ a . b \n'),
            (b'x = 1; y = 2\n', None, b'simple_stmt', b'x = 1 ; y = 2 \n'),
        ]
        for source, kind, state, leaves in cases:
            node = Parse('2.7', source, kind=kind)
            self.assertEqual(node.GetStateName(), state, source)
            self.assertEqual(b' '.join(Leaves(node)), leaves, source)
            Parser('2.7').DiscardNode(node)

    def testSyntheticContexts(self):
        node = Parse('2.7', b'else:\n')
        leaves = [n for n in Nodes(node) if n.fChildren is None]
        self.assertEqual([n.fContext for n in leaves], [0, 0, 0, 0, 0, 1, 2])
        self.assertIsInstance(node.GetChild(0), tl.CKeywordLiteral)
        self.assertIsInstance(Parse('2.7', b'@dec\n'), tl.CSingleDecorator)

    def testShapes(self):
        # Single children are promoted; a simple statement's NEWLINE is removed.
        cases = [(b'x = 1\n', tl.CExprStmt, 3), (b'x\n', tl.CNameLiteral, 0), (b'pass\n', tl.CKeywordLiteral, 0),
                 (b'(x)\n', tl.CAtom, 3), (b'f(x)\n', tl.CPower, 2), (b'a + b\n', tl.CBinaryExpression, 3),
                 (b'-x\n', tl.CFactorExpr, 2), (b'x, y\n', tl.CTestListStarExpr, 3)]
        for source, cls, count in cases:
            node = Parse('2.7', source)
            self.assertIs(type(node), cls, source)
            self.assertEqual(node.GetChildCount(), count, source)
        self.assertIs(type(Parse('3.6', b'f(x)\n')), tl.CAtomExpr)
        self.assertIs(type(Parse('3.6', b'f(x) ** 2\n')), tl.CPower)
        self.assertIs(type(Parse('2.7', b'f(x) ** 2\n')), tl.CPower)

    def testKeywordLeaves(self):
        node = Parse('3.6', b'async def f(): await x\n', in_async_def=True)
        keywords = [n for n in Nodes(node) if isinstance(n, tl.CKeywordLiteral)]
        self.assertEqual([n.fText for n in keywords], [b'async', b'def', b'await'])
        self.assertEqual(set(n.GetStateName() for n in keywords), set([b'KEYWORD']))
        self.assertEqual(keywords[0].fClsInfo.fNodeType, 1)
        self.assertIs(keywords[0].fClsInfo, keywords[2].fClsInfo)

    def testAsyncByVersion(self):
        # version, source, in_async_def, parses
        cases = [('3.6', b'async def f(): pass\n', False, True),
                 ('3.6', b'async = 1\n', False, True),
                 ('3.6', b'await x\n', False, False),
                 ('3.6', b'await x\n', True, True),
                 ('3.6', b'async = 1\n', True, False),
                 ('3.6', b'async  \\\n def f(): pass\n', False, True),
                 ('3.6', b'async def f(): return await x\n', False, True),
                 ('3.6', b'def f(): return await x\n', False, False),
                 ('3.7', b'await x\n', False, True),
                 ('3.7', b'async = 1\n', False, False),
                 ('3.7', b'async def f(): pass\n', False, True)]
        for version, source, in_async_def, parses in cases:
            try:
                node = Parse(version, source, in_async_def)
                self.assertTrue(parses, (version, source, in_async_def))
                self.assertIsNotNone(node)
            except optpgen.ParseError:
                self.assertFalse(parses, (version, source, in_async_def))
        self.assertFalse(Parser('3.6')._fAsyncAlwaysKeyword)
        self.assertTrue(Parser('3.7')._fAsyncAlwaysKeyword)
        self.assertEqual(Parser('3.7')._fVersionTriple, (3, 7, 0))
        self.assertRaises(AttributeError, setattr, Parser('3.7'), '_fVersionTriple', (3, 8, 0))

    def testBackslashes(self):
        parser = Parser('2.7')
        continued = Record([(b'x', (0, 0)), (b'=', (0, 2)), (b'\\', (0, 4)), (b'1', (1, 2))])
        self.assertEqual(Leaves(parser.ParseToNode(continued, False)), [b'x', b'=', b'1'])
        self.assertTrue(parser._ShouldSkipSlash(2))
        self.assertFalse(parser._ShouldSkipSlash(1))
        trailing = Record([(b'x', (0, 0)), (b'\\', (0, 2))])
        self.assertEqual(Leaves(parser.ParseToNode(trailing, False)), [b'x'])
        same_row = Record([(b'x', (0, 0)), (b'=', (0, 2)), (b'\\', (0, 4)), (b'1', (0, 6))])
        with self.assertRaises(optpgen.ParseError) as cm:
            parser.ParseToNode(same_row, False)
        self.assertEqual(cm.exception.context, 2)
        # A token list has no positions: its backslashes are line continuations.
        node = parser.ParseTokenListToNode([b'x', b'=', b'\\', b'1'], False)
        self.assertEqual(Leaves(node), [b'x', b'=', b'1'])
        self.assertRaises(AttributeError, parser._ShouldSkipSlash, 0)

    def testEllipsis(self):
        node = Parse('2.7', b'x[...] = 1\n')
        self.assertEqual(Leaves(node), [b'x', b'[', b'.', b'.', b'.', b']', b'=', b'1'])
        self.assertEqual([n.fContext for n in Nodes(node) if n.fText == b'.'], [2, 2, 2])
        self.assertEqual(Leaves(Parse('3.6', b'x[...] = 1\n')), [b'x', b'[', b'...', b']', b'=', b'1'])

    def testTokenLists(self):
        parser = Parser('2.7')
        cases = [([b'x', b'=', b'1'], b'x = 1'), ([b'try', b':'], b'try : pass finally : pass'),
                 ([b'x', b'# c'], b'x'), ([b'else', b':'], b'if 0 : pass else : pass'), ([], b'\n')]
        for tokens, leaves in cases:
            node = parser.ParseTokenListToNode(tokens, False)
            self.assertEqual(node and b' '.join(Leaves(node)), leaves, tokens)
        node = Parser('3.6').ParseTokenListToNode([b'async', b'def', b'f', b'(', b')', b':'], False)
        self.assertEqual([type(n) for n in node.fChildren], [tl.CKeywordLiteral, tl.CFuncdefStmt])
        # The 3.7 rule does not apply to token lists: only in_async_def makes await a keyword.
        self.assertRaises(optpgen.ParseError, Parser('3.7').ParseTokenListToNode, [b'await', b'x'], False)
        for bad, message in [((b'x',), 'Expected list, got tuple'), ([b'x', 1], 'Expected bytes, got int')]:
            with self.assertRaises(TypeError) as cm:
                parser.ParseTokenListToNode(bad, False)
            self.assertEqual(str(cm.exception), message)

    def testParseErrorContexts(self):
        for source, context in [(b'x = = 1\n', 2), (b'f(x\n', 3), (b'x +\n', 2)]:
            with self.assertRaises(optpgen.ParseError) as cm:
                Parse('2.7', source)
            self.assertEqual(cm.exception.context, context, source)
        # The parser is usable again after an error.
        self.assertEqual(Leaves(Parse('2.7', b'y\n')), [b'y'])

    def testConvertAndCollection(self):
        parser = Parser('2.7')
        leaf = parser.convert(None, 1, b'x', 4, None)
        self.assertEqual((type(leaf), leaf.fText, leaf.fContext), (tl.CNameLiteral, b'x', 4))
        # Analyzers, parsers and factories hold cycles through the engine: the collector frees them.
        kinds = (tl.CPGenAnalyzerImpl, tl.CPGenParserImpl, tl.CNodeFactory)

        def Count():
            gc.collect()
            return sum(1 for o in gc.get_objects() if type(o) in kinds)
        before = Count()
        for _ in range(3):
            tl.CPGenAnalyzerImpl((3, 6, 0)).AnalyzeSingleLogical(Logical(b'x = 1\n'), False)
        self.assertEqual(Count(), before)

    def testConstructorChecks(self):
        with self.assertRaises(TypeError) as cm:
            tl.CPGenParserImpl([3, 6, 0], 'Python-Grammar-3.6')
        self.assertEqual(str(cm.exception), 'Expected tuple, got list')
        self.assertRaises(IOError, tl.CPGenParserImpl, (3, 6, 0), 'No-Such-Grammar')
        self.assertRaises(NotImplementedError, tl.CPGenAnalyzer().AnalyzeSingleLogical, None, False)


def _Factory(classes, keywords=None):
    class Gram(object):
        number2symbol = {256: b'file_input', 257: b'stmt'}
    names = {0: b'ENDMARKER', 1: b'NAME', 4: b'NEWLINE'}
    return tl.CNodeFactory(Gram(), classes, keywords if keywords is not None else {b'if': None}, names)


class FactoryTest(unittest.TestCase):

    def testFreeListReuse(self):
        parser = Parser('2.7')
        source = b'x = f(a, b[1]) + [c for c in d]\n'
        first = Nodes(Parse('2.7', source))
        ids = set(id(n) for n in first)
        parser.DiscardNode(first[0])
        free = parser._FreeNodeCount()
        second = Nodes(Parse('2.7', source))
        self.assertEqual(set(id(n) for n in second), ids)
        self.assertEqual(parser._FreeNodeCount(), free - len(second))
        for node in second[1:]:
            self.assertIsNone(node.fChildren if node.fText is not None else None)
        parser.DiscardNode(second[0])
        self.assertEqual(parser._FreeNodeCount(), free)

    def testDiscardTwiceKeepsFreeListsSound(self):
        parser = Parser('2.7')
        source = b'x = f(g(a), h(b)) + 1\n'
        tree = Parse('2.7', source)
        parser.DiscardNode(tree)
        free = parser._FreeNodeCount()
        parser.DiscardNode(tree)
        self.assertEqual(parser._FreeNodeCount(), free)
        first = Nodes(Parse('2.7', source))
        second = Nodes(Parse('2.7', source))
        self.assertEqual(len(set(id(n) for n in first + second)), len(first) + len(second))

    def testClassInfos(self):
        factory = _Factory([tl.CNode] * 258)
        leaf = factory.ConvertSingleNode(1, b'x', 0, None)
        self.assertEqual((leaf.fClsInfo.fNodeType, leaf.fClsInfo.fName), (1, b'NAME'))
        keyword = factory.ConvertSingleNode(1, b'if', 1, None)
        self.assertIs(type(keyword), tl.CKeywordLiteral)
        self.assertEqual(keyword.GetStateName(), b'KEYWORD')
        for token in (53, 54):
            self.assertIs(type(factory.ConvertSingleNode(token, b'await', 0, None)), tl.CKeywordLiteral)
        unnamed = factory.ConvertSingleNode(100, b'$', 0, None)
        self.assertIsNone(unnamed.fClsInfo.fName)
        self.assertEqual(factory.ConvertSingleNode(257, None, 0, [leaf, keyword]).GetStateName(), b'stmt')
        newline = factory.ConvertSingleNode(4, b'\n', 2, None)
        self.assertIs(factory.ConvertSingleNode(257, None, 0, [leaf, newline]), leaf)
        self.assertIs(newline.fClsInfo.fFirstFree, newline)
        self.assertIs(factory.ConvertSingleNode(4, b'\n', 5, None), newline)
        self.assertRaises(AssertionError, factory.ConvertSingleNode, 257, None, 0, [leaf])
        self.assertRaises(TypeError, factory.ConvertSingleNode, 1, 5, 0, None)
        with self.assertRaises(TypeError) as cm:
            tl.CNodeFactory(1, 2, 3)
        self.assertEqual(str(cm.exception), '__init__() takes exactly 4 positional arguments (3 given)')

    def testRecursiveConvert(self):
        factory = _Factory([tl.CNode] * 258)
        node = factory.RecursiveConvert((257, None, 0, [(1, b'a', 0, None), (1, b'b', 1, None)]))
        self.assertEqual(Leaves(node), [b'a', b'b'])
        for raw, message in [((1, b'x', 0), 'need more than 3 values to unpack'),
                             ((1, b'x', 0, None, 5), 'too many values to unpack (expected 4)'),
                             ((257, None, 0, ((1, b'x', 0, None),)), 'Expected list, got tuple'),
                             ((257, None, 0, [[1, b'x', 0, None]]), 'Expected tuple, got list')]:
            with self.assertRaises((ValueError, TypeError)) as cm:
                factory.RecursiveConvert(raw)
            self.assertEqual(str(cm.exception), message, raw)

    def testDepthTooGreat(self):
        factory = _Factory([tl.CNode] * 258)
        raw = (1, b'leaf', 0, None)
        for _ in range(103):
            raw = (257, None, 0, [raw, (1, b'x', 0, None)])
        root = factory.RecursiveConvert(raw)
        out, saved = StringIO.StringIO(), sys.stdout
        sys.stdout = out
        try:
            factory.DiscardNodes(root)
        finally:
            sys.stdout = saved
        # Depth 101 holds an interior node and a leaf: both subtrees are cut off.
        self.assertEqual(out.getvalue(), 'depth too great\n' * 2)
        self.assertEqual(factory._FreeNodeCount(), 101 + 100)

    def testSubclassNodesAndOverrides(self):
        class Named(tl.CNode):
            def GetStateName(self):
                return b'named'

        class Plain(tl.CNode):
            pass
        factory = _Factory([Named, Plain] + [tl.CNode] * 256)
        named, plain = factory.ConvertSingleNode(0, b'', 0, None), factory.ConvertSingleNode(1, b'x', 0, None)
        self.assertIs(type(named), Named)
        self.assertTrue(repr(named).endswith(': named'))
        self.assertTrue(repr(plain).endswith(': NAME'))
        factory.DiscardNodes(named)
        self.assertIs(factory.ConvertSingleNode(0, b'', 0, None), named)


class NodeTest(unittest.TestCase):

    def testAccessors(self):
        atom = Parse('2.7', b'(a)\n')
        leaf = atom.GetChild(1)
        self.assertEqual((leaf.GetChildCount(), leaf.GetChild(0), leaf.GetChildText(0)), (0, None, None))
        self.assertEqual(atom.GetChildCount(), 3)
        self.assertIsNone(atom.GetChild(3))
        self.assertIs(atom.GetChild(-1), atom.fChildren[2])
        self.assertRaises(IndexError, atom.GetChild, -4)
        self.assertEqual(atom.GetChildText(0), b'(')
        self.assertIsNone(Parse('2.7', b'(a + b)\n').GetChildText(1))
        self.assertTrue(atom._DoesChildTextMatch(b'('))
        self.assertFalse(atom._DoesChildTextMatch(b'['))
        self.assertFalse(leaf._DoesChildTextMatch(b'a'))
        self.assertFalse(atom._DoesChildTextMatch(None))
        with self.assertRaises(TypeError) as cm:
            atom._DoesChildTextMatch(1)
        self.assertEqual(str(cm.exception), "Argument 'text' has incorrect type (expected str, got int)")
        self.assertRaises(TypeError, atom.GetChild, b'1')
        self.assertEqual((leaf.GetSubExprCount(), leaf.GetSubExpr(0)), (0, None))

    def testFieldsAndRepr(self):
        node = Parse('2.7', b'x = 1\n')
        self.assertTrue(repr(node).endswith(': expr_stmt'), repr(node))
        self.assertIn('pysource.treelens.CExprStmt', repr(node))
        for field in ('fChildren', 'fText', 'fContext', 'fClsInfo', 'fNextFree'):
            self.assertRaises((AttributeError, TypeError), setattr, node, field, None)
        self.assertEqual(node.GetChild(0).fContext, 0)
        self.assertIsNone(node.fText)

    def testConstructor(self):
        info = tl.CNodeClassInfo(tl.CNode, 300, b'thing')
        node = tl.CNode(info)
        self.assertEqual((node.fText, node.fChildren, node.fContext, node.fNextFree), (None,) * 4)
        self.assertIs(node.fClsInfo, info)
        self.assertIsNone(tl.CNode(cls_info=None).fClsInfo)
        with self.assertRaises(TypeError) as cm:
            tl.CNode(5)
        self.assertEqual(str(cm.exception),
                         'Cannot convert int to pysource.treelens.CNodeClassInfo')
        self.assertRaises(TypeError, tl.CNode)
        self.assertRaises(TypeError, tl.CNodeClassInfo, tl.CNode, 1, 5)


class PickleTest(unittest.TestCase):

    def testRoundTrips(self):
        info = tl.CNodeClassInfo(tl.CNameLiteral, 1, b'NAME')
        arg = tl.CArgInfo()
        arg.prefix = b'*'
        tree = _Factory([tl.CNode] * 258).RecursiveConvert(
            (257, None, 7, [(1, b'a', 7, None), (1, b'b', 8, None)]))
        for proto in (0, 2):
            copy = pickle.loads(pickle.dumps(info, proto))
            self.assertEqual((copy.fCls, copy.fNodeType, copy.fName, copy.fFirstFree),
                             (tl.CNameLiteral, 1, b'NAME', None))
            self.assertEqual(pickle.loads(pickle.dumps(arg, proto)).prefix, b'*')
            self.assertIsInstance(pickle.loads(pickle.dumps(tl.CAsName(), proto)), tl.CAsName)
            copy = pickle.loads(pickle.dumps(tree, proto))
            self.assertEqual(Leaves(copy), [b'a', b'b'])
            self.assertEqual(copy.fContext, 7)
            self.assertEqual(copy.GetStateName(), b'stmt')

    def testChecksum(self):
        reducer, (cls, checksum), state = tl.CNodeClassInfo(tl.CNode, 1, b'NAME').__reduce__()
        self.assertIs(reducer, tl._UnpickleFields)
        with self.assertRaises(pickle.PickleError) as cm:
            tl._UnpickleFields(cls, checksum ^ 1)
        self.assertEqual(str(cm.exception), 'Incompatible checksums (0x%x vs 0x%x = (fCls, fFirstFree, fName, '
                         'fNodeType))' % (checksum ^ 1, checksum))
        self.assertEqual(len(state), 4)
        self.assertRaises(ValueError, tl.CNodeClassInfo(tl.CNode, 1, None).__setstate__, (1, 2))


def _Analyzer(version):
    key = 'analyzer' + version
    if key not in _kParsers:
        if version == '2.7':
            _kParsers[key] = tl.CPGenAnalyzerImpl((2, 7, 0), tl.kPy2DefaultGrammar, None, False)
        else:
            _kParsers[key] = tl.CPGenAnalyzerImpl((3, 6, 0))
    return _kParsers[key]


class AnalyzerTest(unittest.TestCase):

    def testInspectedFlag(self):
        analyzer = _Analyzer('2.7')
        for source in (b'x = 1\n', b'x = = 1\n'):
            logical = Logical(source)
            first = analyzer.AnalyzeSingleLogical(logical, False)
            self.assertTrue(logical.fInspected)
            self.assertIsNone(analyzer.AnalyzeSingleLogical(logical, False), source)
            self.assertEqual(first is None, source == b'x = 1\n')

    def testSyntaxErrors(self):
        analyzer = _Analyzer('2.7')
        logical = Logical(b'    y = (1 +\n         2 2)\n')
        logical.AppendNameDefined(b'stale')
        error = analyzer.AnalyzeSingleLogical(logical, False)
        self.assertIsInstance(error, SyntaxError)
        self.assertEqual(error.args, ('invalid syntax', ('<string>', 2, 12, logicalinspect.TextFromTokens(logical))))
        self.assertEqual(list(logical.fNamesDefined or []), [])
        # At the synthetic end of the statement: one column past the last token.
        error = analyzer.AnalyzeSingleLogical(Logical(b'x = (1,\n  2\n'), False)
        self.assertEqual((error.lineno, error.offset), (2, 4))

    def testCreateSyntaxError(self):
        record = Record([(b'a', (0, 0)), (b'bc', (9, 4))])
        cases = [(1, (10, 5)), (0, (1, 1)), (2, (10, 7)), (5, (10, 7)), (-1, (10, 5))]
        for tok_i, (line, column) in cases:
            error = tl.CreateSyntaxError('oops', record, tok_i)
            self.assertEqual((error.msg, error.filename, error.lineno, error.offset), ('oops', '<string>', line, column))
            self.assertEqual(error.text, logicalinspect.TextFromTokens(record))
        for tok_i in (0, -1):
            self.assertRaises(IndexError, tl.CreateSyntaxError, 'oops', Record([]), tok_i)
        self.assertRaises(IndexError, tl.CreateSyntaxError, 'oops', record, -3)

    def testWhitespaceAndCommentLogicals(self):
        analyzer = _Analyzer('3.6')
        for source in (b'# type: int\n', b'\n', b'   \n'):
            logical = utils.GetLogicalsFromText(source)[0]
            self.assertIsNone(analyzer.AnalyzeSingleLogical(logical, False), source)
            self.assertTrue(analyzer._InspectSingleLogical(Logical(source), False))

    def testInternalErrorsAreReported(self):
        analyzer = _Analyzer('2.7')
        reports = []

        def Report(suppress_gui=False):
            reports.append((suppress_gui, sys.exc_info()[0]))

        def Broken(tokens):
            raise RuntimeError('no text')
        saved = reflect.ReportCurrentException, logicalinspect.TextFromTokens
        reflect.ReportCurrentException, logicalinspect.TextFromTokens = Report, Broken
        try:
            logical = Logical(b'x = = 1\n')
            self.assertIsNone(analyzer.AnalyzeSingleLogical(logical, False))
        finally:
            reflect.ReportCurrentException, logicalinspect.TextFromTokens = saved
        self.assertEqual(reports, [(True, RuntimeError)])
        self.assertEqual(sys.exc_info(), (None, None, None))
        self.assertTrue(logical.fInspected)

    def testParseErrorsPropagateFromInspect(self):
        analyzer = _Analyzer('2.7')
        with self.assertRaises(optpgen.ParseError):
            analyzer._InspectSingleLogical(Logical(b'x = = 1\n'), False)
        node = analyzer.ParseTokenListToNode([b'x', b'=', b'1'], False)
        self.assertIs(type(node), tl.CExprStmt)
        self.assertIs(type(analyzer.ParseToNode(Logical(b'x = 1\n'), False)), tl.CExprStmt)
        self.assertIsInstance(analyzer._fNodeWalker, tl.CNodeWalker)
        self.assertIsInstance(analyzer._fTypeHintWalker, tl.CTypeHintWalker)

    def testNoLeakPerCall(self):
        analyzer = _Analyzer('2.7')
        sources = [b'x = f(a, *b) + [c for c in d]\n', b'x = = 1\n', b'else:\n', b'@d(x)\n']

        def Run(count):
            for _ in range(count):
                for source in sources:
                    analyzer.AnalyzeSingleLogical(Logical(source), False)
        Run(5)
        gc.collect()
        before = len(gc.get_objects())
        Run(200)
        gc.collect()
        self.assertLessEqual(len(gc.get_objects()) - before, 2)


if __name__ == '__main__':
    unittest.main()
