"""The CLogicalLine record, the record operations and the rest of pysource._fastaccess."""

import gc
import logging
import sys
import unittest
import weakref

from tests.py import support
from pysource import _fastaccess as fa
from pysource.utils import GetLogicalsFromText


def MakeLogical(tokens=((b'def', (0, 0)), (b'f', (0, 4))), **kw):
    return fa.CLogicalLine(list(tokens), **kw)


class RecordTest(unittest.TestCase):

    def testConstructorAndViews(self):
        toks = [(b'def', (0, 4)), (b'f', (0, 8)), (b'(', (0, 9)), (b')', (0, 10)),
                (b':', (0, 11)), (b'# c', (1, 0))]
        L = fa.CLogicalLine(toks, 2, 7, b'    def f():\n# c\n')
        self.assertIs(fa.LogicalLineType, fa.CLogicalLine)
        self.assertEqual(L.fTokens, tuple(toks))
        self.assertIs(L.fTokens, L.fTokens)
        self.assertEqual((L.fTokenCount, L.fKind, L.fFirstLine, L.fIndent),
                         (6, 2, 7, 4))
        self.assertEqual(L.fLineText, b'    def f():\n# c\n')
        self.assertEqual([fa.GetLogicalTokenType(L, i) for i in range(6)],
                         [1, 1, 7, 8, 11, 202])
        self.assertEqual(L.GetTokenString(1), b'f')
        self.assertEqual((L.fInspected, L.fParentScope, L.fLocalScopeDefined), (False, None, None))
        defaults = fa.CLogicalLine([])
        self.assertEqual((defaults.fTokens, defaults.fKind, defaults.fFirstLine,
                          defaults.fLineText, defaults.fIndent), ((), 0, 0, b'', 0))
        kw = fa.CLogicalLine(tokens=[], kind=1, first_line=3, line_text=b'\tx')
        lists = fa.CLogicalLine(([b'x', [1, 2]],))
        self.assertEqual(lists.fTokens, ((b'x', (1, 2)),))
        self.assertEqual((kw.fKind, kw.fFirstLine, kw.fIndent), (1, 3, 8))

    def testConstructorErrors(self):
        cases = [
            ((5,), TypeError, 'tokens must be a sequence of (text, (row, col)) pairs'),
            (([b'x'],), TypeError, 'tokens must be a sequence of (text, (row, col)) pairs'),
            (([(b'x', 1)],), TypeError, 'tokens must be a sequence of (text, (row, col)) pairs'),
            (([(b'x', (0,))],), TypeError,
             'tokens must be a sequence of (text, (row, col)) pairs'),
            (([(u'x', (0, 0))],), TypeError, 'token text must be bytes, not unicode'),
            (([(b'x', (0, 2 ** 40))],), OverflowError, 'token position out of range'),
            (([(b'x', (0, 'a'))],), TypeError, 'an integer is required'),
            (([], 0, 0, u'x'), TypeError, 'CLogicalLine() argument 4 must be string, not unicode'),
        ]
        for args, exc, message in cases:
            with self.assertRaises(exc) as cm:
                fa.CLogicalLine(*args)
            self.assertEqual(str(cm.exception), message, repr(args))
        # A failed re-initialisation leaves the record as it was.
        L = MakeLogical()
        with self.assertRaises(TypeError):
            L.__init__([(1, (0, 0))])
        self.assertEqual(L.fTokens, ((b'def', (0, 0)), (b'f', (0, 4))))
        L.__init__([(b'x', (0, 0))])
        self.assertEqual(L.fTokens, ((b'x', (0, 0)),))

    def testPositionConversionThatMutatesTheInput(self):
        toks = []

        class Shrinker(object):
            def __int__(self):
                del toks[:]
                return 3

        toks.extend([(b'a', (0, Shrinker())), (b'b', (0, 1))])
        L = fa.CLogicalLine(toks)
        self.assertEqual(L.fTokens, ((b'a', (0, 3)), (b'b', (0, 1))))

    def testIndexErrors(self):
        L = MakeLogical()
        for i in (-1, 2, 10 ** 6):
            for call in (lambda: L.GetTokenString(i), lambda: fa.GetLogicalTokenType(L, i)):
                with self.assertRaises(IndexError) as cm:
                    call()
                self.assertEqual(str(cm.exception), 'Index not in range', i)
        with self.assertRaises(IndexError):
            L.GetTokenString(10 ** 30)

    def testWritableFields(self):
        L, P = MakeLogical(), MakeLogical()
        L.fInspected = 1
        self.assertIs(L.fInspected, True)
        L.fInspected = []
        self.assertIs(L.fInspected, False)
        L.fParentScope = P
        self.assertIs(L.fParentScope, P)
        L.fParentScope = None
        self.assertIsNone(L.fParentScope)
        L.fLocalScopeDefined = b'a.f'
        self.assertEqual(L.fLocalScopeDefined, b'a.f')
        del L.fLocalScopeDefined
        self.assertIsNone(L.fLocalScopeDefined)
        with self.assertRaises(TypeError) as cm:
            L.fParentScope = 5
        self.assertEqual(str(cm.exception), 'fParentScope must be a logical or None')
        with self.assertRaises(TypeError) as cm:
            del L.fInspected
        self.assertEqual(str(cm.exception), "can't delete attribute")
        for name in ('fTokens', 'fTokenCount', 'fKind', 'fFirstLine', 'fLineText', 'fIndent'):
            with self.assertRaises(AttributeError):
                setattr(L, name, 1)

    def testDerivedInfo(self):
        L = MakeLogical()
        L.AppendNameDefined(b'a')
        fa.AppendLogicalAttrib(L, b'b')
        fa.AppendLogicalAttrib(L, (b'os', b':m os'))
        fa.AppendLogicalTypeEquiv(L, b'x', b':t int')
        L.AppendTypeEquiv(b'y', b':t str')
        L.AppendArgName(b'self')
        L.AppendArgTypeEquiv(b'self', b':c A')
        L.AppendBaseClassName(b'object')
        self.assertEqual(L.fNamesDefined, [b'a', b'b', b'os'])
        # The info of an attrib pair is not recorded: its caller records it once.
        self.assertEqual(L.fTypeEquivs, [(b'x', b':t int'), (b'y', b':t str')])
        self.assertEqual(L.fArgNames, [b'self'])
        self.assertEqual(L.fArgTypeEquivs, [(b'self', b':c A')])
        self.assertEqual(L.fBaseClassNames, [b'object'])
        self.assertEqual(L.GetDerivedInfo(), ((b'a', b'b', b'os'), tuple(L.fTypeEquivs),
                                              (b'self',), ((b'self', b':c A'),), (b'object',)))
        names = L.fNamesDefined       # a copy: the record's own lists stay private
        names.append(L)
        self.assertIsNone(fa.ClearLogicalDerivedInfo(L))
        for attr in ('fNamesDefined', 'fTypeEquivs', 'fArgNames', 'fArgTypeEquivs',
                     'fBaseClassNames'):
            self.assertEqual(getattr(L, attr), [], attr)
        self.assertEqual(names, [b'a', b'b', b'os', L])
        self.assertIsNone(L.GetDerivedInfo())
        fa.ClearLogicalDerivedInfo(L)

    def testOperationErrors(self):
        L = MakeLogical()
        cases = [
            (lambda: fa.ClearLogicalDerivedInfo(5), TypeError, 'Argument must be a logical'),
            (lambda: fa.AppendLogicalAttrib(None, b'x'), TypeError, 'Argument must be a logical'),
            (lambda: fa.AppendLogicalTypeEquiv(1, b'x', b'y'), TypeError,
             'Argument must be a logical'),
            (lambda: fa.GetLogicalTokenType([], 0), TypeError, 'Argument must be a logical'),
            (lambda: fa.AppendLogicalAttrib(L, 5), TypeError,
             'attrib must be bytes or a (name, info) pair, not int'),
            (lambda: fa.AppendLogicalAttrib(L, (b'x',)), TypeError,
             'attrib must be bytes or a (name, info) pair, not tuple'),
            (lambda: fa.AppendLogicalAttrib(L, (b'x', None)), TypeError,
             'Expected bytes, got NoneType'),
            (lambda: fa.AppendLogicalTypeEquiv(L, u'x', b'y'), TypeError,
             'Expected bytes, got unicode'),
            (lambda: L.AppendTypeEquiv(b'x', 1), TypeError, 'Expected bytes, got int'),
            (lambda: L.AppendArgName(None), TypeError, 'Expected bytes, got NoneType'),
            (lambda: L.AppendArgTypeEquiv(b'x', None), TypeError, 'Expected bytes, got NoneType'),
            (lambda: L.AppendBaseClassName(3), TypeError, 'Expected bytes, got int'),
            (lambda: L.AppendNameDefined(()), TypeError, 'Expected bytes, got tuple'),
        ]
        for n, (call, exc, message) in enumerate(cases):
            with self.assertRaises(exc) as cm:
                call()
            self.assertEqual(str(cm.exception), message, 'case %d' % n)
        # A failed append records nothing.
        self.assertEqual((L.fNamesDefined, L.fTypeEquivs, L.fArgTypeEquivs), ([], [], []))

    def testSubclass(self):
        class Sub(fa.CLogicalLine):
            def __init__(self, tokens, extra):
                fa.CLogicalLine.__init__(self, tokens, 1)
                self.extra = extra

        s = Sub([(b'class', (0, 0))], 'x')
        self.assertEqual((s.extra, s.fKind, s.fTokens), ('x', 1, ((b'class', (0, 0)),)))
        fa.AppendLogicalAttrib(s, b'A')
        self.assertEqual(s.fNamesDefined, [b'A'])
        self.assertIsNot(type(s), fa.LogicalLineType)
        ref = weakref.ref(s)
        del s
        self.assertIsNone(ref())

    def testCyclesAreCollected(self):
        gc.collect()
        a, b = MakeLogical(), MakeLogical()
        a.fParentScope, b.fParentScope = b, a
        a.AppendNameDefined(b'x')
        a.fNamesDefined.append(a)
        ref = weakref.ref(a)
        del a, b
        gc.collect()
        self.assertIsNone(ref())

    def testLongParentChainDeallocates(self):
        last = None
        for _ in range(100000):
            L = MakeLogical()
            L.fParentScope = last
            last = L
        del L, last  # must not overflow the C stack

    def testRecycledRecordsStartClean(self):
        text = b'class A:\n    def f(self): pass\n'
        for L in GetLogicalsFromText(text):
            L.fInspected = True
            L.fLocalScopeDefined = b'x'
            L.AppendNameDefined(b'n')
            L.AppendArgTypeEquiv(b'a', b'i')
            L.fTokens
        self.assertGreater(fa._ClearLogicalFreeList() + 1, 0)
        first = GetLogicalsFromText(text)
        del first
        again = GetLogicalsFromText(text)
        for L in again:
            self.assertEqual((L.fInspected, L.fLocalScopeDefined, L.fNamesDefined,
                              L.fArgTypeEquivs, L.fTokenCount > 0), (False, None, [], [], True))
        self.assertIs(again[1].fParentScope, again[0])
        self.assertIsNone(again[0].fParentScope)
        del again
        self.assertEqual(fa._ClearLogicalFreeList(), 2)
        self.assertEqual(fa._ClearLogicalFreeList(), 0)

    def testRepr(self):
        L = fa.CLogicalLine([(b'x', (0, 0))], 2, 5)
        self.assertEqual(repr(L), '<pysource._fastaccess.CLogicalLine kind=2 line=5 tokens=1>')


class ModuleTest(unittest.TestCase):

    def testExports(self):
        import time
        self.assertIs(getattr(fa, '__TimeFunc'), time.time)
        self.assertEqual(type(fa._C_API).__name__, 'PyCapsule')
        for name in ('ClearLogicalDerivedInfo', 'AppendLogicalAttrib', 'AppendLogicalTypeEquiv',
                     'GetLogicalTokenType', 'GetTokenType', 'Tokenize',
                     '_FindStringEndNonNested', 'CBytesTokenizer', 'CLogger'):
            self.assertTrue(hasattr(fa, name), name)

    def testCapsuleTable(self):
        import ctypes
        api = ctypes.pythonapi
        api.PyCapsule_GetPointer.restype = ctypes.c_void_p
        api.PyCapsule_GetPointer.argtypes = [ctypes.py_object, ctypes.c_char_p]
        ptr = api.PyCapsule_GetPointer(fa._C_API, b'pysource._fastaccess._C_API')

        class Api(ctypes.Structure):
            _fields_ = [('Version', ctypes.c_int), ('LogicalLineType', ctypes.c_void_p),
                        ('TokenTypeOfText', ctypes.c_void_p), ('ClearDerivedInfo', ctypes.c_void_p),
                        ('AppendAttrib', ctypes.c_void_p), ('AppendTypeEquiv', ctypes.c_void_p),
                        ('Tokenize', ctypes.c_void_p), ('SplitLogicals', ctypes.c_void_p)]

        table = Api.from_address(ptr)
        self.assertEqual(table.Version, 1)
        self.assertEqual(table.LogicalLineType, id(fa.CLogicalLine))
        for name, _ in Api._fields_[2:]:
            self.assertTrue(getattr(table, name), name)
        type_of = ctypes.CFUNCTYPE(ctypes.c_int, ctypes.c_char_p, ctypes.c_ssize_t)(
            table.TokenTypeOfText)
        self.assertEqual(type_of(b'->', 2), 51)
        split = ctypes.PYFUNCTYPE(ctypes.py_object, ctypes.c_char_p, ctypes.c_ssize_t)(
            table.SplitLogicals)
        self.assertEqual([L.fKind for L in split(b'def f(): pass\n\n', 15)], [2, 22])
        append = ctypes.PYFUNCTYPE(ctypes.c_int, ctypes.py_object, ctypes.py_object)(
            table.AppendAttrib)
        L = MakeLogical()
        self.assertEqual(append(L, b'x'), 0)
        self.assertEqual(L.fNamesDefined, [b'x'])

    def testLogger(self):
        records = []

        class Catch(logging.Handler):
            def emit(self, record):
                records.append((record.name, record.levelname, record.getMessage()))

        handler = Catch()
        logger = logging.getLogger('pysource')
        logger.addHandler(handler)
        old = logger.level
        logger.setLevel(logging.DEBUG)
        try:
            log = fa.CLogger()
            log.info('a %d', 1)
            log.warning('b')
            fa.CLogger('sub').error('c %s', 'x')
            log.log(logging.DEBUG, 'd')
        finally:
            logger.removeHandler(handler)
            logger.setLevel(old)
        self.assertEqual(records, [('pysource', 'INFO', 'a 1'), ('pysource', 'WARNING', 'b'),
                                   ('pysource.sub', 'ERROR', 'c x'), ('pysource', 'DEBUG', 'd')])
        self.assertIs(fa.CLogger().logger, logger)


class LeakTest(unittest.TestCase):

    def testArgumentRefcountsStayPut(self):
        text = b'def f(x):\n    return x  # c\n'
        name, info = b'nm-%d' % 7, b'info-%d' % 7
        quoted = b"'%d' + x" % 7
        L = MakeLogical()
        P = MakeLogical()
        calls = [
            lambda: GetLogicalsFromText(text),
            lambda: fa.Tokenize(text),
            lambda: fa.GetTokenType(text),
            lambda: list(fa.CBytesTokenizer(text)),
            lambda: fa._FindStringEndNonNested(quoted, 0),
            lambda: fa.GetLogicalTokenType(L, 1),
            lambda: fa.AppendLogicalAttrib(L, (name, info)),
            lambda: fa.AppendLogicalTypeEquiv(L, name, info),
            lambda: L.AppendArgTypeEquiv(name, info),
            lambda: fa.ClearLogicalDerivedInfo(L),
            lambda: setattr(L, 'fParentScope', P),
            lambda: setattr(L, 'fLocalScopeDefined', name),
            lambda: L.fTokens,
            lambda: fa.CLogicalLine([(name, (0, 0))], 0, 0, info),
        ]
        for n, call in enumerate(calls):
            call()
            fa.ClearLogicalDerivedInfo(L)
            before = [sys.getrefcount(o) for o in (text, name, info, quoted, L, P)]
            for _ in range(100):
                call()
            fa.ClearLogicalDerivedInfo(L)
            after = [sys.getrefcount(o) for o in (text, name, info, quoted, L, P)]
            self.assertEqual(before, after, 'call %d' % n)

    def testMemoryIsFlatOverRepeatedSplits(self):
        files = support.CorpusFiles('2.7', limit=40 if support.kSanitized else None, seed=3)
        texts = [support.ReadBytes(p) for p in files]

        def Pass():
            for t in texts:
                for L in GetLogicalsFromText(t):
                    L.fTokens
                    L.AppendNameDefined(b'x')
            gc.collect()
            return Rss()

        Pass()
        first = Pass()
        for _ in range(3):
            last = Pass()
        if support.kSanitized:
            return  # the sanitizer's quarantine holds freed memory
        self.assertLess(last - first, 4 << 20, 'resident memory grew by %d bytes' % (last - first))


def Rss():
    with open('/proc/self/statm') as f:
        return int(f.read().split()[1]) * 4096


class UntrackedRecordTest(unittest.TestCase):
    """Split records are not tracked by the collector until Python code gives
    one of them a reference that could close a cycle."""

    kText = b'class A:\n    def f(self):\n        x = 1\n'

    def Collected(self, make_cycle):
        gc.collect()
        records = GetLogicalsFromText(self.kText)
        refs = map(weakref.ref, records)
        make_cycle(records)
        del records
        gc.collect()
        return [ref() is None for ref in refs]

    def testRecordsAndTheirInfoStayUntracked(self):
        records = GetLogicalsFromText(self.kText)
        L = records[2]
        L.fInspected = True
        L.fLocalScopeDefined = b'A.f'
        L.AppendNameDefined(b'x')
        L.AppendTypeEquiv(b'x', b':l:int: 1')
        fa.AppendLogicalAttrib(L, (b'os', b':m os'))
        L.fTokens
        self.assertEqual([gc.is_tracked(r) for r in records], [False] * 3)
        self.assertEqual(L.fNamesDefined, [b'x', b'os'])

    def testCyclesThroughPythonReferencesAreCollected(self):
        class Text(bytes):
            pass

        def through_subclass_text(records):
            text = Text(b'n')
            text.back = records[1]
            records[2].AppendNameDefined(text)  # stored as an exact copy
            records[2].AppendArgTypeEquiv(text, text)
            fa.AppendLogicalAttrib(records[2], (text, text))
            records[0].keep = text

        cases = [
            ('attribute', lambda rs: setattr(rs[0], 'children', rs)),
            ('parent', lambda rs: setattr(rs[0], 'fParentScope', rs[2])),
            ('scope name', lambda rs: setattr(rs[1], 'fLocalScopeDefined', [rs[2]])),
            ('subclass text', through_subclass_text),
        ]
        for name, make_cycle in cases:
            self.assertEqual(self.Collected(make_cycle), [True] * 3, name)

    def testTrackingIsNeededOnlyOnce(self):
        old = GetLogicalsFromText(self.kText)
        old[0].children = old
        self.assertEqual([gc.is_tracked(r) for r in old], [True] * 3)
        new = GetLogicalsFromText(self.kText)
        self.assertEqual([gc.is_tracked(r) for r in new], [False] * 3)
        old[0].children = None


if __name__ == '__main__':
    unittest.main()
