"""F-strings: part lists, expressions in logical lines, and the analyzer's inspection of them."""

import gc
import pickle
import sys
import unittest

try:
    from pysource import treelens as tl
    from pysource import logicalinspect, symbolinfo, utils
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)

E, S, F, C = 1, 2, 3, 4  # expression, string, format and conversion parts


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


def First(source):
    return utils.GetLogicalsFromText(source)[0]


def Analyze(source, analyzer=None):
    logical = First(source)
    return logical, (analyzer or tl.CPGenAnalyzerImpl((3, 6, 0))).AnalyzeSingleLogical(logical, False)


def WithSupport(support):
    """A 3.6 analyzer whose f-string support is `support` (set through its pickled state)."""
    func, args, state = tl.CPGenAnalyzerImpl((3, 6, 0)).__reduce__()
    analyzer = func(*args)
    analyzer.__setstate__(tuple(support if isinstance(v, tl.CFStringSupport) else v for v in state))
    return analyzer


def Tokens(logical):
    return [t for t, _ in logical.fTokens]


class PartListTest(unittest.TestCase):

    def testRawParts(self):
        sup = tl.CFStringSupport()
        cases = [
            (b"f'a{b}c'", [(S, b'a', 2), (E, b'b', 4), (S, b'c', 6)]),
            (b"f'{x!r:>10}'", [(E, b'x', 3), (C, b'r', 5), (F, b'>10', 7)]),
            (b"f'{a != b}'", [(E, b'a != b', 3)]),
            (b"f'{a!=b!s}'", [(E, b'a!=b', 3), (C, b's', 8)]),
            (b"f'{{x}}'", [(S, b'{{x}}', 2)]),
            (b"f'{d[0]}'", [(E, b'd[0]', 3)]),
            (b"f'{x:{w}>{y}}z'", [(E, b'x', 3), (E, b'w', 6), (F, b'>', 8), (E, b'y', 10), (S, b'z', 13)]),
            (b"F'{x}'", [(E, b'x', 3)]),
            (b"Rf'{x}'", [(E, b'x', 4)]),
            (b"fR'''{x}'''", [(E, b'x', 6)]),
            (b"'a{b}'", [(S, b'a', 1), (E, b'b', 3)]),  # the caller checks the prefix
            # A nested string's brackets and other quotes are its text.
            (b"""f'{d["]"]}'""", [(E, b'd["]"]', 3)]),
            (b"""f'{s.split("(")}{y}'""", [(E, b's.split("(")', 3), (E, b'y', 17)]),
            (b"""f'''{d["it's"]:>3}'''""", [(E, b'd["it\'s"]', 5), (F, b'>3', 15)]),
            (b"""f'{f"{a}"}'""", [(E, b'f"{a}"', 3)]),
            # A named character escape is text unless the string is raw.
            (b"f'\\N{DASH}{x}'", [(S, b'\\N{DASH}', 2), (E, b'x', 11)]),
            (b"rf'\\N{x}'", [(S, b'\\N', 3), (E, b'x', 6)]),
            (b"f'\\\\N{x}'", [(S, b'\\\\N', 2), (E, b'x', 6)]),
            (b"f'{a:\\N{DASH}>{w}}'", [(E, b'a', 3), (F, b'\\N{DASH}>', 5), (E, b'w', 15)]),
            # Unbalanced fields end with the token; what is not a literal gives nothing.
            (b"f'{a)}b'", [(E, b'a)}b', 3)]),
            (b"f'{x'", [(E, b'x', 3)]),
            (b"f'{x", []),
            (b"f''", []),
        ]
        for token, expected in cases:
            self.assertEqual(sup._RawPartList(token), expected, token)
            self.assertEqual(sup._RawPartList(token, True), [p for p in expected if p[0] == E], token)
        self.assertEqual(sup._GetFragmentList(b"x!=y!r"), [(0, b'x'), (1, b'!='), (3, b'y'), (4, b'!'), (5, b'r')])
        self.assertEqual(sup._GetFragmentList(b"{'''s'''}"),
                         [(0, b'{'), (1, b"'''"), (4, b's'), (5, b"'''"), (8, b'}')])

    def testPartLists(self):
        sup = tl.CFStringSupport()

        def Items(token, exp_only=False):
            out = []
            for text, pos, logical in sup.GetPartList(token, exp_only):
                self.assertTrue(token[pos:].startswith(text), (token, text, pos))
                out.append((text, pos, logical and Tokens(logical)))
            return out

        self.assertEqual(Items(b"f'a{b.c}'"), [(b'a', 2, None), (b'b.c', 4, [b'b', b'.', b'c'])])
        # A nested f-string is one expression, then its own expressions follow, placed in the outer token.
        self.assertEqual(Items(b"""f'{f"{a}" + g}'"""),
                         [(b'f"{a}" + g', 3, [b'f"{a}"', b'+', b'g']), (b'a', 6, [b'a'])])
        self.assertEqual(Items(b'''f"{f'{x:{f"{w}"}}'}"''', True),
                         [(b'''f'{x:{f"{w}"}}\'''', 3, [b'''f'{x:{f"{w}"}}\'''']), (b'x', 6, [b'x']),
                          (b'f"{w}"', 9, [b'f"{w}"']), (b'w', 12, [b'w'])])
        # An expression over several lines is one logical; text that is not one stays split.
        self.assertEqual(Items(b"f'''{3+\n4}'''"), [(b'3+\n4', 5, [b'3', b'+', b'4'])])
        self.assertEqual(Items(b"f'''{a)\n(b}'''"), [(b'a)\n(b', 5, [b'a', b')']), (b'a)\n(b', 5, [b'(', b'b'])])
        self.assertEqual(sup.GetPartList(u"f'{\xe9}'")[0][:2], (b'\xc3\xa9', 3))
        self.assertEqual([(t, p, Tokens(l)) for t, p, l in sup.GetExpressionPartList(b"f'{x!r}'")],
                         [(b'x', 3, [b'x'])])

    def testExpressionsInLogical(self):
        sup = tl.CFStringSupport()
        logical = First(b"s = 'a{b}' + b'{c}' + u'{d}'\n")
        self.assertEqual((sup._FStringTokenList(logical), sup.GetExpressionsInLogical(logical)), ([], []))
        # The first line is 10 bytes long with its line end.
        logical = First(b"xyz = (1,\n    f'{a}' rf'{b!r}' Fr'''{c}''' fR\"{d}\")\n")
        self.assertEqual([t for t, _ in sup._FStringTokenList(logical)],
                         [b"f'{a}'", b"rf'{b!r}'", b"Fr'''{c}'''", b'fR"{d}"'])
        found = sup.GetExpressionsInLogical(logical)
        self.assertEqual([(t, p) for t, p, _ in found], [(b'a', 17), (b'b', 25), (b'c', 37), (b'd', 47)])
        for text, pos, sub in found:
            self.assertEqual(logical.fLineText[pos:pos + len(text)], text)
            self.assertEqual(Tokens(sub), [text])
        nested = sup.GetExpressionsInLogical(First(b"""x = f'{f"{a}"}'\n"""))
        self.assertEqual([(t, p) for t, p, _ in nested], [(b'f"{a}"', 7), (b'a', 10)])

    def testOverridesAreHonoured(self):
        class Upper(tl.CFStringSupport):
            def _GetFragmentList(self, contents):
                return [(o, t.upper()) for o, t in tl.CFStringSupport._GetFragmentList(self, contents)]

        class Planted(tl.CFStringSupport):
            def _FStringTokenList(self, logical):
                return [(b"f'{q}'", (0, 2))] if Tokens(logical) == [b'x'] else []

            def _RawPartList(self, s, exp_only=False):
                return [(E, s[3:-2], 3)]

        self.assertEqual([Tokens(l) for _, _, l in Upper().GetPartList(b"f'{b}'")], [[b'B']])
        self.assertEqual([(t, p) for t, p, _ in Planted().GetExpressionsInLogical(First(b'x\n'))], [(b'q', 5)])
        endless = type('Endless', (tl.CFStringSupport,), {'_FStringTokenList': lambda self, l: [(b"f'{q}'", (0, 0))]})
        self.assertRaises(RuntimeError, endless().GetExpressionsInLogical, First(b'x\n'))  # bounded, no crash
        bad = [
            ('_GetFragmentList', 5, TypeError, 'Expected list, got int'),
            ('_GetFragmentList', [(0,)], ValueError, 'need more than 1 value to unpack'),
            ('_GetFragmentList', [(0, u'a')], TypeError, 'Expected bytes, got unicode'),
            ('GetPartList', [None], TypeError, "'NoneType' object is not iterable"),
            ('GetExpressionPartList', [(b'a', 1, None, 2)], ValueError, 'too many values to unpack (expected 3)'),
            ('_FStringTokenList', [(b"f'{a}'", 3)], TypeError, "'int' object is not iterable"),
        ]
        for name, value, error, message in bad:
            sup = type('Bad', (tl.CFStringSupport,), {name: lambda self, *args: value})()
            with self.assertRaises(error) as ctx:
                sup.GetExpressionsInLogical(First(b"x = f'{a}'\n"))
            self.assertEqual(str(ctx.exception), message, name)

    def testClass(self):
        sup = tl.CFStringSupport()
        self.assertEqual((sup.kExpressionPart, sup.kStringPart, sup.kFormatPart, sup.kConversionPart), (E, S, F, C))
        self.assertRaises(TypeError, tl.CFStringSupport, 1)
        self.assertEqual(pickle.loads(pickle.dumps(sup, 2)).kConversionPart, C)
        self.assertRaises(TypeError, sup.GetExpressionsInLogical, None)


class InspectionTest(unittest.TestCase):

    def testErrorsAreLocatedInTheOuterLine(self):
        kEnd = 'unexpected EOF while parsing'
        cases = [
            (b"x = f'{a b}'\n", 1, 10),
            (b"x = rf'{a b}'\n", 1, 11),
            (b"x = (1,\n    f'{a b}')\n", 2, 10),
            (b"x = f'''\n  {a b}'''\n", 2, 6),
            (b"x = f'''{\na b}'''\n", 2, 3),
            (b"x = f'{a}' f'{b +}'\n", 1, 18, kEnd),  # at the end of the field's parentheses
            (b"""x = f'{f"{a b}"}'\n""", 1, 13),
            (b"x = f'{a)}b'\n", 1, 9),
            # The grammar parses a field as a whole line; statements are errors there.
            (b"x = f'{y = 1}'\n", 1, 10),
            (b"x = f'{y += 1}'\n", 1, 10),
            (b"x = f'{del y}'\n", 1, 8),
            (b"x = f'{a; b}'\n", 1, 9),
        ]
        for case in cases:
            source, line, column = case[:3]
            logical, result = Analyze(source)
            self.assertIsInstance(result, SyntaxError, source)
            self.assertEqual((result.msg, result.filename, result.lineno, result.offset),
                             (case[3] if len(case) > 3 else 'invalid syntax', '<string>', line, column), source)
            self.assertEqual(result.text, logicalinspect.TextFromTokens(logical))
            self.assertEqual((logical.fNamesDefined, logical.fTypeEquivs), ([], []), source)
        analyzer = tl.CPGenAnalyzerImpl((3, 6, 0))
        self.assertRaises(SyntaxError, analyzer._InspectSingleLogical, First(b"f'{a b}'\n"), False)
        self.assertTrue(analyzer._InspectSingleLogical(First(b"f'{a b}'\n"), False, True))
        self.assertRaises(SyntaxError, analyzer._InspectFStringTokens, First(b"f'{a b}'\n"), False)
        self.assertRaises(SyntaxError, analyzer._InspectSingleFStringToken, First(b"f'{a b}'\n"), 0,
                          b"f'{a b}'", False)

    def testValidLines(self):
        for source in [b"f'{x!r:>{width}} {a != b} { {1: 2}[1] } {(lambda y=1: y)()}'\n",
                       b"""f'{d["]"]} {s.split("(")} {f"{g}"} {x:%H:%M}'\n""",
                       b"f'''{3+\n4} \\N{DASH}'''\n", b"rf'{x}' 'a{b c}' b'{b c}'\n",
                       b"f'{a for a in b}'\n"]:  # read in parentheses, as the language reads a field
            self.assertIsNone(Analyze(source)[1], source)
        # 3.6 reads a field without the keywords of the async def around it; 3.7 has them everywhere.
        source = b"x = f'{await y}'\n"
        self.assertIsInstance(tl.CPGenAnalyzerImpl((3, 6, 0)).AnalyzeSingleLogical(First(source), True), SyntaxError)
        self.assertIsNone(tl.CPGenAnalyzerImpl((3, 7, 0)).AnalyzeSingleLogical(First(source), True))

    def testFindingsAreCopied(self):
        class Planted(tl.CFStringSupport):
            def GetExpressionPartList(self, tok_str):
                subs = [First(b'q\n'), First(b'q\n')]
                for sub in subs:
                    sub.AppendTypeEquiv(b'q', b'info')
                    sub.AppendNameDefined(b'n')
                    sub.AppendArgName(b'not copied')
                return [(b'q', 3, sub) for sub in subs]

        logical, result = Analyze(b"x = f'{q}'\n", WithSupport(Planted()))
        self.assertIsNone(result)
        self.assertEqual([p for p in logical.fTypeEquivs if p == (b'q', b'info')], [(b'q', b'info')] * 2)
        self.assertEqual([n for n in logical.fNamesDefined if n == b'n'], [b'n'] * 2)
        self.assertEqual(logical.fArgNames, [])
        lost = type('Lost', (tl.CFStringSupport,), {'GetExpressionPartList': lambda self, t: [(b'q', 3, None)]})
        self.assertRaises(TypeError, WithSupport(lost())._InspectFStringTokens, First(b"f'{q}'\n"), False)

    def testNamesReadInsideFStrings(self):
        logical, result = Analyze(b"""x = f'{a.b} {c!r:{w}} {f"{d}"} {[i for i in z]}'\n""")
        self.assertIsNone(result)
        reads = [n for n, info in logical.fTypeEquivs if info == symbolinfo.kGetPrefix]
        for name in [b'a', b'c', b'w', b'd', b'z']:
            self.assertIn(name, reads)
        self.assertEqual(reads.count(b'd'), 1)  # the nested field is analyzed once
        self.assertIn(b'x', logical.fNamesDefined)
        # A binding within the comprehension names the f-string token (index 2) that holds it.
        self.assertIn((b'i', symbolinfo.kWithinExprPrefix + b'2'), logical.fTypeEquivs)

    def testNoLeaks(self):
        analyzer = tl.CPGenAnalyzerImpl((3, 6, 0))
        sup = tl.CFStringSupport()
        token = b"""f'{a!r:>{w}} {f"{b c}"}'"""
        lines = [b'x = %s\n' % token, b"y = f'{q}' f'''{3+\n4}'''\n", b"z = f'{y = 1}'\n"] * 20
        counts = []
        for _ in range(10):
            for source in lines:
                Analyze(source, analyzer)
                sup.GetPartList(token)
            gc.collect()
            counts.append((len(gc.get_objects()), sys.getrefcount(token)))
        self.assertLessEqual(counts[-1][0], counts[1][0] + 20)
        self.assertEqual(counts[-1][1], counts[1][1])


# Sources judged by CPython 3.6, 3.7 and 3.8: the fields' own errors, placed at
# the string, and the checks after parsing run on the fields' expressions in
# the scope around them.
kFieldCases = [
    'x = f"{a"', 'x = f"{a:{b}"', 'x = f"}"', 'x = f"{a}}"', 'x = f"{}"', 'x = f"{ }"', 'x = f"{!r}"', 'x = f"{:}"',
    'x = f"{a!x}"', 'x = f"{a!}"', 'x = f"{a!rr}"', 'x = f"{#}"', 'x = f"{a:{#}}"', "x = f'{\"\\n\"}'",
    'x = rf"{a\\b}"', 'x = f"{a:{b:{c}}}"', 'x = f"{a:{b!r:{c}}}"', 'x = f"{a:{b}}}"', 'x = f"{{a}"',
    'x = f"{\'a}"', 'x = f"{a(b}"', 'x = f"{a[}"', 'x = f"{a)}"', 'x = f"{a[)]}"', 'x = f"{a=b}"', 'x = f"{a=!x}"',
    'x = f"{*a}"', 'x = f"{a:{*b}}"', 'x = f"{yield}"', 'x = f"{f(a=1, b)}"', 'x = f"{ *a}"',
    'x = 1 + f"{a!x}" + f"{"', 'x = (1,\n  f"{a!x}")', "x = f'''\n{a!x}'''",
    "x = f'{a!x}' b''", "x = b'' f'{a!x}'", "x = f'{*a}' + f'{a!x}'", """x = f'{f"{a!x}"}'""",
    'def f():\n    x = f"{yield}"', 'def f():\n    x = f"{await x}"', 'async def f():\n    x = f"{await x}"',
    'x = [f"{(y := 1)}" for y in z]', 'class C: [f"{(y := 1)}" for x in z]',
    # Parse errors: placed in the line, where CPython counts in the parenthesized expression.
    'x = f"{a b}"', 'x = f"{lambda x: 1}"', 'x = f"{a}" f"{b +}"', 'x = f"{(x := 1)}"',
    # Valid fields.
    'x = f"{a=}"', 'x = f"{a = !r:>10}"', 'x = f"{{}} {a:{{}}}"', 'x = f"{a!r:{b!r}}"', 'x = f"{a!r:{b}!x}"',
    'x = f"{a for a in b}"', 'x = f"{a!=b} {a<b} {a>=b} {a==b}"', "x = f'{\"#\"} {\"a\" \"b\"}'", 'x = f"{*a, b}"',
    'x = f"\\N{EM DASH} {a:\\N{EM DASH}}"', 'x = f"\\{a}"',
]
kParseErrors = ('invalid syntax', 'unexpected EOF while parsing')


class FieldChecksTest(unittest.TestCase):

    def testAgainstCPython(self):
        from pysource import analysis
        from tests.py import mutants
        for version in ('3.6', '3.7', '3.8'):
            sources = [c.encode('utf-8') + b'\n' for c in kFieldCases]
            theirs = mutants.Verdicts(version, sources) if version in analysis.kVersions else None
            if theirs is None:
                continue
            wrong = []
            for case, source, want in zip(kFieldCases, sources, theirs):
                got = mutants.Ours(version, source)
                if got and want and want[0] in kParseErrors:
                    got, want = got[0], want[0]
                if got != want:
                    wrong.append((version, source, want, got))
            self.assertEqual(wrong, [])
            # Without the checks only the grammar's verdict on the fields' text is left.
            self.assertIsNone(mutants.Ours(version, b'x = f"{a!x} {*b}"\n', checks=False))

    def testNoLeaks(self):
        from pysource import analysis
        sources = [c.encode('utf-8') + b'\n' for c in kFieldCases] * 3
        counts = []
        for _ in range(8):
            for source in sources:
                analysis.AnalyzeText(source, '3.8')
            gc.collect()
            counts.append(len(gc.get_objects()))
        self.assertLessEqual(counts[-1], counts[1])


if __name__ == '__main__':
    unittest.main()
