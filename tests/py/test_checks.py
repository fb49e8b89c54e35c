"""Syntax checks after parsing: CPython's verdict on lines the grammar accepts.

Each case holds what CPython 2.7 and 3.6 say of a source (message, line,
offset), or None when they compile it; kNo marks a case that is not for that
version. The mutant test judges mutated standard-library lines by compile().
"""

import sys
import unittest

from pysource import analysis
from tests.py import mutants
from tests.py import support

kNo = 'not for this version'
# Mutants per version (the owner asks for at least 20,000).
kMutants = 2000 if support.kSanitized else 20000

kCases = [
    ('print x', None, ("Missing parentheses in call to 'print'. Did you mean print(x)?", 1, 7)),
    ('if x: print y,', None, ('Missing parentheses in call to \'print\'. Did you mean print(y, end=" ")?', 1, 13)),
    ('x = b"a" "b"', None, ('cannot mix bytes and nonbytes literals', 1, 4)),
    ('[-1] = x', ("can't assign to literal", 1, None), ("can't assign to operator", 1, 0)),
    ('x = f(a,\n  b', ('invalid syntax', 2, 4), ('unexpected EOF while parsing', 2, 4)),
    ('f() = 1', ("can't assign to function call", 1, None), ("can't assign to function call", 1, 0)),
    ('a, (b, g(x)) = 1', ("can't assign to function call", 1, None), ("can't assign to function call", 1, 0)),
    ('None = 1', ('cannot assign to None', 1, None), ("can't assign to keyword", 1, 0)),
    ('x.__debug__ = 1', ('cannot assign to __debug__', 1, None), ('assignment to keyword', 1, 0)),
    ('x.None = 1', ('cannot assign to None', 1, None), kNo),
    ('lambda: 1 = 2', ("can't assign to lambda", 1, None), ("can't assign to lambda", 1, 0)),
    ('(x for x in y) = 1', ("can't assign to generator expression", 1, None), ("can't assign to generator expression", 1, 0)),
    ('[x for x in y] = 1', ("can't assign to list comprehension", 1, None), ("can't assign to list comprehension", 1, 0)),
    ('{x: 1 for x in y} = 1', ("can't assign to dict comprehension", 1, None), ("can't assign to dict comprehension", 1, 0)),
    ('{1} = 1', ("can't assign to literal", 1, None), ("can't assign to literal", 1, 0)),
    ('... = 1', kNo, ("can't assign to Ellipsis", 1, 0)),
    ("f'{x}' = 1", kNo, ("can't assign to literal", 1, 0)),
    ('x = 1 if 2 else 3 = 4', ("can't assign to conditional expression", 1, None), ("can't assign to conditional expression", 1, 4)),
    ('a < b = 1', ("can't assign to comparison", 1, None), ("can't assign to comparison", 1, 0)),
    ('-a = 1', ("can't assign to operator", 1, None), ("can't assign to operator", 1, 0)),
    ('x = yield = 1', ('assignment to yield expression not possible', 1, None), ('assignment to yield expression not possible', 1, 4)),
    ('x = (yield) = 1', ("can't assign to yield expression", 1, None), ("can't assign to yield expression", 1, 4)),
    ('`a` = 1', ("can't assign to repr", 1, None), kNo),
    ('() = 1', ("can't assign to ()", 1, None), None),
    ('del f(), g()', ("can't delete function call", 1, None), ("can't delete function call", 1, 4)),
    ('del (a, f())', ("can't delete function call", 1, None), ("can't delete function call", 1, 4)),
    ('for f() in x: pass', ("can't assign to function call", 1, None), ("can't assign to function call", 1, 4)),
    ('[1 for f() in x]', ("can't assign to function call", 1, None), ("can't assign to function call", 1, 7)),
    ('with a as (b, f()): pass', ("can't assign to function call", 1, None), ("can't assign to function call", 1, 5)),
    ('(a, b) += 1', ('illegal expression for augmented assignment', 1, None), ('illegal expression for augmented assignment', 1, 0)),
    ('f() += 1', ("can't assign to function call", 1, None), ("can't assign to function call", 1, 0)),
    ('True += 1', kNo, ("can't assign to keyword", 1, 0)),
    ('*a += 1', kNo, ('illegal expression for augmented assignment', 1, 0)),
    ('[a]: int', kNo, ('only single target (not list) can be annotated', 1, 0)),
    ('a, b: int', kNo, ('only single target (not tuple) can be annotated', 1, 0)),
    ('f(): int', kNo, ('illegal target for annotation', 1, 0)),
    ('(a): int', kNo, None),
    ('import a.b as __debug__', ('cannot assign to __debug__', 1, None), ('assignment to keyword', 1, 14)),
    ('from a import b as __debug__, c', ('cannot assign to __debug__', 1, None), ('assignment to keyword', 1, 19)),
    ('def __debug__(): pass', ('cannot assign to __debug__', 1, None), ('assignment to keyword', 1, 4)),
    ('class __debug__: pass', ('cannot assign to __debug__', 1, None), ('assignment to keyword', 1, 17)),
    ('try: pass\nexcept E as __debug__: pass', kNo, ('assignment to keyword', 2, 12)),
    ('try: pass\nexcept E, f(): pass', ("can't assign to function call", 2, None), kNo),
    ('f(__debug__=1)', ('cannot assign to __debug__', 1, None), ('assignment to keyword', 1, 2)),
    ('f(a=1, a=2)', ('keyword argument repeated', 1, None), ('keyword argument repeated', 1, 7)),
    ('f(a.b=1)', ("keyword can't be an expression", 1, None), ("keyword can't be an expression", 1, 2)),
    ('f(lambda: 1 = 2)', ('lambda cannot contain assignment', 1, None), ('lambda cannot contain assignment', 1, 2)),
    ('f(a, *b, c=1, d)', ('non-keyword arg after keyword arg', 1, None), ('positional argument follows keyword argument', 1, 14)),
    ('f(**a, b)', kNo, ('positional argument follows keyword argument unpacking', 1, 7)),
    ('f(**a, *b)', kNo, ('iterable argument unpacking follows keyword argument unpacking', 1, 7)),
    ('f(*a, b)', ('only named arguments may follow *expression', 1, None), kNo),
    ('f(a for a in b, c)', ('Generator expression must be parenthesized if not sole argument', 1, None), ('Generator expression must be parenthesized if not sole argument', 1, 2)),
    ('f(a)(b for b in c, d)', ('Generator expression must be parenthesized if not sole argument', 1, None), ('Generator expression must be parenthesized if not sole argument', 1, 5)),
    ('f(a=1, *b)', None, None),
    ('f(a, *b, *c, d=1, **e, **f)', kNo, None),
    ('g(a=1, b)[0] = f()', ('non-keyword arg after keyword arg', 1, None), ('positional argument follows keyword argument', 1, 7)),
    ('x = *a', kNo, ("can't use starred expression here", 1, 4)),
    ('*a = 1', kNo, ('starred assignment target must be in a list or tuple', 1, 0)),
    ('a, *b, *c = 1', kNo, ('two starred expressions in assignment', 1, 0)),
    ('for *a in x: pass', kNo, ('starred assignment target must be in a list or tuple', 1, 4)),
    ('del a, *b', kNo, ("can't use starred expression here", 1, 7)),
    ('x = (*a)', kNo, ("can't use starred expression here", 1, 5)),
    ('a, *b = c', kNo, None),
    ('a, (*b)', kNo, None),
    ('x = [(*b)] + [a, ((*b))]', kNo, None),
    ('f(a, (*b))', kNo, None),
    ('x[a, (*b)]', kNo, None),
    ('x[a:b, (*c)]', kNo, ("can't use starred expression here", 1, 8)),
    ('[(*a) for a in b]', kNo, ('iterable unpacking cannot be used in comprehension', 1, 1)),
    ('a, *(*b) = c', kNo, ('starred assignment target must be in a list or tuple', 1, 5)),
    ('[*a] = b', kNo, None),
    ('x = *a, *b', kNo, None),
    ('print(*a, *b)', kNo, None),
    ('x = [*a for a in b]', kNo, ('iterable unpacking cannot be used in comprehension', 1, 5)),
    ('x = {**a for a in b}', kNo, ('dict unpacking cannot be used in dict comprehension', 1, 4)),
    ('def f(a=1, b): pass', ('non-default argument follows default argument', 1, None), ('non-default argument follows default argument', 1, 6)),
    ('lambda x=1, y: 0', ('non-default argument follows default argument', 1, None), ('non-default argument follows default argument', 1, 7)),
    ('def f(*): pass', kNo, ('named arguments must follow bare *', 1, 6)),
    ('def f(*, **k): pass', kNo, ('named arguments must follow bare *', 1, 9)),
    ('def f(*, a=1, b): pass', kNo, None),
    ('def f(a, b, a): pass', ("duplicate argument 'a' in function definition", 1, None), ("duplicate argument 'a' in function definition", 1, 0)),
    ('lambda a, a: 0', ("duplicate argument 'a' in function definition", 1, None), ("duplicate argument 'a' in function definition", 1, 0)),
    ('def f(a, (b, a)): pass', ("duplicate argument 'a' in function definition", 1, None), kNo),
    ('def f(x, __debug__): pass', ('cannot assign to __debug__', 1, None), ('assignment to keyword', 1, 9)),
    ('return 1', ("'return' outside function", 1, None), ("'return' outside function", 1, 0)),
    ('class C: return', ("'return' outside function", 1, None), ("'return' outside function", 1, 9)),
    ('x = (yield)', ("'yield' outside function", 1, None), ("'yield' outside function", 1, 5)),
    ('class C: yield', ("'yield' outside function", 1, None), ("'yield' outside function", 1, 9)),
    ('lambda: (yield)', None, None),
    ('[(yield) for x in y]', ("'yield' outside function", 1, None), None),
    ('[x for x in (yield)]', ("'yield' outside function", 1, None), ("'yield' outside function", 1, 13)),
    ('break', ("'break' outside loop", 1, None), ("'break' outside loop", 1, 0)),
    ('continue', ("'continue' not properly in loop", 1, None), ("'continue' not properly in loop", 1, 0)),
    ('for x in y: break', None, None),
    ('while x: continue', None, None),
    ('def f(): break', ("'break' outside loop", 1, None), ("'break' outside loop", 1, 9)),
    ('def f(): return', None, None),
    ('for x in y:\n    try: pass\n    finally: continue', ("'continue' not supported inside 'finally' clause", 3, None), ("'continue' not supported inside 'finally' clause", 3, 13)),
    ('nonlocal x', kNo, ('nonlocal declaration not allowed at module level', 1, 0)),
    ('class C:\n    nonlocal x', kNo, ("no binding for nonlocal 'x' found", 2, 4)),
    ('def f():\n    nonlocal x', kNo, ("no binding for nonlocal 'x' found", 2, 4)),
    ('def f():\n    x = 1\n    def g():\n        nonlocal x', kNo, None),
    ('def g(x): global x', ("name 'x' is local and global", 1, None), ("name 'x' is parameter and global", 1, 10)),
    ('def g(x): nonlocal x', kNo, ("name 'x' is parameter and nonlocal", 1, 10)),
    ('def f():\n    from os import *', kNo, ('import * only allowed at module level', 2, 4)),
    ('async def f():\n    def g(): await x', kNo, ("'await' outside async function", 2, 13)),
    ('async def f():\n    lambda: await x', kNo, ("'await' outside async function", 2, 12)),
    ('async def f():\n    class C: await x', kNo, ("'await' outside function", 2, 13)),
    ('async def f(): yield from x', kNo, ("'yield from' inside async function", 1, 15)),
    ('async def f(): await x', kNo, None),
    ('async def f():\n    x = [await a for a in b]', kNo, None),
    ('async def f():\n    def g(): x = [a async for a in b]', kNo, ('asynchronous comprehension outside of an asynchronous function', 2, 0)),
    ('async def f():\n    return [[x async for x in y] for z in w]', kNo, ('asynchronous comprehension outside of an asynchronous function', 2, 0)),
    ('async def f():\n    return [x for z in w if [a async for a in z]]', kNo, ('asynchronous comprehension outside of an asynchronous function', 2, 0)),
    ('async def f():\n    return [(x async for x in y) for z in w]', kNo, ('asynchronous comprehension outside of an asynchronous function', 2, 0)),
    ('async def f():\n    return [[x async for x in y] async for z in w]', kNo, None),
    ('async def f():\n    return [x for x in [a async for a in z]]', kNo, None),
    ('def f():\n    from __future__ import division', ('from __future__ imports must occur at the beginning of the file', 2, None), ('from __future__ imports must occur at the beginning of the file', 2, 4)),
    ('from __future__ import braces', ('not a chance', 1, None), ('not a chance', 1, 0)),
    ('from __future__ import nope', ('future feature nope is not defined', 1, None), ('future feature nope is not defined', 1, 0)),
    ('from __future__ import division', None, None),
    ('from a import b, c,', ('trailing comma not allowed without surrounding parentheses', 1, None), ('trailing comma not allowed without surrounding parentheses', 1, 14)),
    ('a <> b', kNo, ('invalid syntax', 1, 4)),
    ('f(a,\n  b', ('invalid syntax', 2, 4), ('unexpected EOF while parsing', 2, 4)),
    ('x = 1; return', ("'return' outside function", 1, None), ("'return' outside function", 1, 7)),
    ('if x: f() = 1', ("can't assign to function call", 1, None), ("can't assign to function call", 1, 6)),
]


# 3.8 only: assignment expressions, positional-only parameters.
kNewIn38 = ['(a := 1)', '(f() := 1)', '(a.b := 1)', '[x := 1 for x in y]', '[y := 1 for x in z]', 'f(a := 1)',
            'def f(a=1, /, b): pass', 'def f(a, a, /): pass', 'def f(a, /, b): pass', 'await x', 'def f(): await x',
            'class C: [(y := 1) for x in z]', '[(x := 1) for x in y]', '[i := 0 for i, j in y]', 'del (a := 1)',
            '[x for x in (y := z)]', 'def f():\n    return [i async for i in y]', 'def f():\n    return (i async for i in y)', 'f(a.b := 1)', 'f(a=1, b := 2)', 'return *a', 'f(True=1)', 'f((a)=1)', '[(yield) for x in y]', 'x = {(yield) for x in y}',
            'l = [i async for i in g]', 'class C: l = [await x for x in y]', 'l = (i async for i in g)']
# 3.9 to 3.13: the new constructs, valid and not, judged by each version's CPython. The
# checks after parsing speak CPython's messages (kOwnMessages); the grammar's errors stay
# "invalid syntax" where CPython's parser words them otherwise ("expected '('").
kNewSyntax = [
    '@a[0].b\ndef f(): pass', 'with (open(a) as f, open(b) as g,): pass', 'with (a, b) as c: pass',
    'with (a as b), c: pass', 'for x in *a, *b: pass', '{a := 1, b}', '{a := 1: 2}', 'x[a := 1]', 'x[a := 1:2]',
    'x[*a]', 'x[*a, b] = 1', 'del x[*a]', 'def f(*args: *Ts): pass', 'def f(x: *Ts): pass',
    'try: pass\nexcept* E as e: pass', 'try: pass\nexcept* (A, B): pass',
    'match x:\n case 1: pass', 'match *a, b:\n case 1: pass', 'match *a:\n case 1: pass',
    'match x:\n case [a, *rest] if rest: pass', 'match x:\n case {"k": v, **kw}: pass',
    'match x:\n case Point(x=0, y=y) | Other(y): pass', 'match x:\n case a.b as c: pass',
    'match x:\n case -1 | 2+3j | "s" "t" | None: pass', 'match x:\n case (a): pass',
    'match x:\n case [a, a]: pass', 'match x:\n case a | 1: pass', 'match x:\n case _ | 1: pass',
    'match x:\n case (a | b) as c: pass', 'match x:\n case [a] | [b]: pass', 'match x:\n case [*a, *b]: pass',
    'match x:\n case C(x=1, x=2): pass', 'match x:\n case C(x=1, 2): pass', 'match x:\n case C(a.b=1): pass',
    'match x:\n case 1 as _: pass', 'match x:\n case 1+2: pass', 'match x:\n case 1j+2j: pass',
    "match x:\n case {'a': 1, 'a': 2}: pass", 'match x:\n case {**_}: pass', 'match x:\n case {**r, "a": 1}: pass',
    'match(x)', 'match = case = _ = 1', 'case.x, match[1:2]', 'print(match, case)',
    'def f[T](x: T) -> T: pass', 'class C[T: int, *Ts, **P](B): pass', 'type X[T] = list[T]', 'type = 1',
    'def f[T, T](): pass', 'class C[T, *T]: pass', 'type X[T, T] = int', 'def f[T = int](): pass',
    'def f[T=int, U](): pass', 'def f[*Ts = *tuple[int]](): pass',
    'async def f():\n    return [[i async for i in a] for j in b]', 'x = [[i async for i in a] for j in b]']
kOwnMessages = ('multiple assignments to name', 'makes remaining patterns unreachable', 'alternative patterns',
                'multiple starred names', 'attribute name repeated', 'positional patterns follow',
                "cannot use '_' as a target", 'number required in complex literal', 'mapping pattern checks',
                'duplicate type parameter', 'non-default type parameter')
# Placed where CPython does not put them: `import *` in a def (CPython points at the
# def, another record) and 3.8's asynchronous comprehension (CPython says line 0).
kPlacedElsewhere = ('def f():\n    from os import *\n', 'async def f():\n    def g(): x = [a async for a in b]\n',
                    'def f():\n    return [i async for i in y]\n',
                    'async def f():\n    return [[x async for x in y] for z in w]\n',
                    'async def f():\n    return [x for z in w if [a async for a in z]]\n',
                    'l = [i async for i in g]\n', 'class C: l = [await x for x in y]\n')

# Tokens the lexer must tell apart for the grammar: (source, versions that accept it);
# the others say 'invalid syntax'.
kPy3Versions = ('3.5', '3.6', '3.7', '3.8', '3.9', '3.10', '3.11', '3.12', '3.13')
kTokenCases = [
    ('x -> y', ()),
    ('lambda: x -> y', ()),
    ('def f() @= int: pass', ()),
    ('x @= y', kPy3Versions),
    ('a.b[0] @= c', kPy3Versions),
    ('def f() -> int: pass', kPy3Versions),
]

# The deepest nesting each CPython parses (its parser stack: 1500 entries, 1700 from 3.8 on),
# as measured with each version's interpreter; 3.5 has 3.6's grammar depth and stack.
kNestingForms = {
    'parens': lambda n: 'x = ' + '(' * n + '1' + ')' * n,
    'calls': lambda n: 'x = ' + 'f(' * n + '1' + ')' * n,
    'nots': lambda n: 'x = ' + 'not ' * n + '1',
    'lambdas': lambda n: 'x = ' + 'lambda: ' * n + '1',
}
kNestingLimits = {
    '2.7': {'parens': 98, 'calls': 92, 'nots': 1480, 'lambdas': 740},
    '3.5': {'parens': 92, 'calls': 87, 'nots': 1479, 'lambdas': 739},
    '3.6': {'parens': 92, 'calls': 87, 'nots': 1479, 'lambdas': 739},
    '3.7': {'parens': 92, 'calls': 87, 'nots': 1479, 'lambdas': 739},
    '3.8': {'parens': 98, 'calls': 98, 'nots': 1679, 'lambdas': 839},
}

# Number literals: the message of CPython 2.7, 3.5, 3.6 and 3.7, and 3.8 (None: accepted).
kZeros = 'leading zeros in decimal integer literals are not permitted; use an 0o prefix for octal integers'
kBad, kSyntax = 'invalid token', 'invalid syntax'
kNumberCases = [
    ('x = 0777', None, kBad, kBad, kZeros),
    ('x = 0777L', None, kBad, kBad, kZeros),
    ('x = 09', kBad, kBad, kBad, kZeros),
    ('x = 09.5 + 09e1 + 09j + 00', None, None, None, None),
    ('x = 0_7', kSyntax, kSyntax, kBad, kZeros),
    ('x = 1_000 + 0x_f + 1_0.0_1e1_0j', kSyntax, kSyntax, None, None),
    ('x = 1__0', kSyntax, kSyntax, kBad, 'invalid decimal literal'),
    ('x = 1_.0', kSyntax, kSyntax, kBad, 'invalid decimal literal'),
    ('x = 6e-', kBad, kBad, kBad, 'invalid decimal literal'),
    ('x = 1e', kSyntax, kSyntax, kSyntax, kSyntax),
    ('x = 0o8', kBad, kBad, kBad, "invalid digit '8' in octal literal"),
    ('x = 0b12', kSyntax, kSyntax, kSyntax, "invalid digit '2' in binary literal"),
    ('x = 0b1_2', kSyntax, kSyntax, kBad, "invalid digit '2' in binary literal"),
    ('x = 0xg', kBad, kBad, kBad, 'invalid hexadecimal literal'),
    ('x = 0xL', kBad, kBad, kBad, 'invalid hexadecimal literal'),
    ('x = 0or 1', kBad, kBad, kBad, 'invalid octal literal'),
    ('x = 10L + 0x1fL', None, kSyntax, kSyntax, kSyntax),
    ('x = 1.0L', kSyntax, kSyntax, kSyntax, kSyntax),
    ('x = 1._0', kSyntax, kSyntax, kSyntax, kSyntax),
    ('x = 0if 1else 2', None, None, None, None),
]

# String literals the decoders reject: the message of CPython 2.7 and of 3.5 to 3.8.
kDecode = "(unicode error) 'unicodeescape' codec can't decode bytes in position "
kStringCases = [
    (u"x = '\xe9\\u12'", None, kDecode + '10-13: truncated \\uXXXX escape'),
    (u"x = 'a\\\xe9\\x1'", kNo, kDecode + '17-19: truncated \\xXX escape'),
    (u"x = '\\N{'", None, kDecode + '0-2: malformed \\N character escape'),
    (u"x = '\\U00110000'", None, kDecode + '0-9: illegal Unicode character'),
    (u"x = u'\\N{EM DASH}\\N{NOPE}'", kDecode + '11-18: unknown Unicode character name', kNo),
    (u"x = u'\\N{EM DASH}' + '\\N{EM DASH}'", None, None),
    (u"x = ur'\\\\u12 \\u12'",
     "(unicode error) 'rawunicodeescape' codec can't decode bytes in position 6-9: truncated \\uXXXX", kSyntax),
    (u"x = b'\\x1g'", kNo, '(value error) invalid \\x escape at position 0'),
    (u"x = br'\xe9'", None, 'bytes can only contain ASCII literal characters.'),
    (u"x = rb'\\x' + r'\\u12' + b'\\\\x'", kSyntax, None),
]


class ChecksTest(unittest.TestCase):

    def testStringLiterals(self):
        wrong = []
        for source, want27, want3 in kStringCases:
            for version in analysis.kVersions:
                want = want27 if version == '2.7' else want3
                if want == kNo:
                    continue
                # The cookie: Python 2 reads a file without one as ASCII.
                got = mutants.Ours(version, b'# coding: utf-8\n' + source.encode('utf-8') + b'\n')
                if (got and got[0]) != want:
                    wrong.append((version, source, want, got))
        self.assertEqual(wrong, [])
        # Found after parsing, they have CPython's offset of the string (none under 2.7).
        for version, offset in (('2.7', None), ('3.6', 4), ('3.8', 5)):
            self.assertEqual(mutants.Ours(version, b"x = u'\\u12'\n")[1:], [1, offset])

    def testNumberLiterals(self):
        wrong = []
        for source, want27, want35, want36, want38 in kNumberCases:
            for version, want in (('2.7', want27), ('3.5', want35), ('3.6', want36), ('3.7', want36),
                                  ('3.8', want38)):
                got = mutants.Ours(version, source.encode('utf-8') + b'\n')
                if (got and got[0]) != want:
                    wrong.append((version, source, want, got))
        self.assertEqual(wrong, [])

    def testNestingLimits(self):
        import StringIO
        wrong = []
        stdout, sys.stdout = sys.stdout, StringIO.StringIO()   # the walker's notes on deep trees
        try:
            for version, limits in sorted(kNestingLimits.items()):
                for form, limit in sorted(limits.items()):
                    for depth, want in ((limit, None), (limit + 1, 'invalid syntax')):
                        source = kNestingForms[form](depth).encode('utf-8') + b'\n'
                        got = mutants.Ours(version, source)
                        if (got and got[0]) != want:
                            wrong.append((version, form, depth, got))
        finally:
            sys.stdout = stdout
        self.assertEqual(wrong, [])

    def testTokensTheGrammarTellsApart(self):
        wrong = []
        for source, accepted in kTokenCases:
            for version in analysis.kVersions:
                want = None if version in accepted else 'invalid syntax'
                got = mutants.Ours(version, source.encode('utf-8') + b'\n')
                if (got and got[0]) != want:
                    wrong.append((version, source, want, got))
        self.assertEqual(wrong, [])

    def testCasesAgainstCPython(self):
        # CPython places "import *" in a def at the def; the line's own statement is all we have.
        wrong = []
        for source, want27, want36 in kCases:
            for version, want in (('2.7', want27), ('3.6', want36)):
                if want == kNo:
                    continue
                got = mutants.Ours(version, source.encode('utf-8') + b'\n')
                if (got and tuple(got)) != want:
                    wrong.append((version, source, want, got))
        self.assertEqual(wrong, [])

    def testNewerVersionsAgainstCPython(self):
        # 3.7 and 3.8 have messages and offsets of their own: CPython itself is asked.
        for version in ('3.7', '3.8'):
            if version not in analysis.kVersions:
                continue
            sources = [c[0].encode('utf-8') + b'\n' for c in kCases if c[2] != kNo]
            sources += [s + b'\n' for s in kNewIn38] if version == '3.8' else []
            theirs = mutants.Verdicts(version, sources)
            if theirs is None:
                continue
            wrong = []
            for source, want in zip(sources, theirs):
                got = mutants.Ours(version, source)
                if got != want and not (got and want and got[0] == want[0] and source in kPlacedElsewhere):
                    wrong.append((version, source, want, got))
            self.assertEqual(wrong, [])

    def testPython39To313AgainstCPython(self):
        for version in ('3.9', '3.10', '3.11', '3.12', '3.13'):
            sources = [s.encode('utf-8') + b'\n' for s in kNewSyntax]
            theirs = mutants.Verdicts(version, sources)
            if theirs is None:
                continue
            wrong = []
            for source, want in zip(sources, theirs):
                got = mutants.Ours(version, source)
                if (got is None) != (want is None):
                    wrong.append((version, source, want, got))
                elif want and want[0].startswith(kOwnMessages) and got != want:
                    wrong.append((version, source, want, got))
            self.assertEqual(wrong, [])

    def testAnOptionOfTheAnalyzer(self):
        # Off by default in the analyzer (the grammar's verdict, bindings recorded), on in the API.
        result, logical = support.AnalyzeLine('3.6', b'f(a=1, b).x = y\n')
        self.assertIsNone(result)
        self.assertEqual(logical.fNamesDefined, ['f(a=1, b).x'])
        self.assertFalse(support.Analyzer('3.6').fSyntaxChecks)
        analyzer = analysis.GetAnalyzer('3.6')
        self.assertTrue(analyzer.Impl().fSyntaxChecks)
        error = analyzer.AnalyzeLogical(analyzer.Impl(), logical)
        self.assertEqual((error.msg, error.lineno, error.offset, error.column),
                         ('positional argument follows keyword argument', 1, 7, 8))
        self.assertEqual((logical.fNamesDefined, logical.fTypeEquivs), ([], []))
        text = b'def f(x):\n    return x\nreturn 1\n'
        self.assertEqual(analysis.AnalyzeText(text, '3.6').SyntaxErrors(),
                         [(3, 1, "'return' outside function")])
        self.assertEqual(analysis.AnalyzeText(text, '3.6', checks=False).SyntaxErrors(), [])

    def testHostileChainsAndLeaks(self):
        # A parent chain that loops, or holds records of any kind, is read safely.
        from pysource import utils
        analyzer = analysis.GetAnalyzer('3.6')
        impl = analyzer.Impl()
        head, body = utils.GetLogicalsFromText(b'def f():\n    nonlocal x\n')
        head.fParentScope = body
        body.fParentScope = head
        self.assertIsNone(analyzer.AnalyzeLogical(impl, body))   # the def encloses itself
        body.fParentScope = utils.GetLogicalsFromText(b'\n')[0]
        self.assertEqual(analyzer.AnalyzeLogical(impl, body).msg, 'nonlocal declaration not allowed at module level')
        # Errors and clean lines alike keep the object count and references flat.
        import gc
        sources = [(v, c[0].encode('utf-8') + b'\n') for c in kCases for v in ('2.7', '3.6')]
        records = [(analysis.GetAnalyzer(v), utils.GetLogicalsFromText(s)) for v, s in sources]
        before = None
        for round in range(30):
            for version_analyzer, logicals in records:
                version_analyzer.Analyze(logicals)
            gc.collect()
            if round == 4:
                before = (len(gc.get_objects()), sys.getrefcount(impl), sys.getrefcount(records[0][1][0]))
        after = (len(gc.get_objects()), sys.getrefcount(impl), sys.getrefcount(records[0][1][0]))
        self.assertLessEqual(after[0], before[0])
        self.assertEqual(after[1:], before[1:])

    def testMutatedStdlibLines(self):
        for version in [v for v in ('2.7', '3.6', '3.7', '3.8', '3.12', '3.13') if v in analysis.kVersions]:
            found = mutants.Compare(version, kMutants)
            if found is None:
                continue
            judged = mutants.Judgement(*found)
            self.assertGreater(judged.rejected, kMutants // 2)
            self.assertEqual(judged.false_rejects, [], version)
            self.assertLessEqual(len(judged.false_accepts), judged.rejected // 1000,
                                 (version, judged.false_accepts))
            # From 3.9 on CPython's PEG parser words its errors its own way ("expected ':'",
            # "Perhaps you forgot a comma?"); the grammar's errors here stay "invalid syntax".
            if version in ('2.7', '3.6', '3.7', '3.8'):
                self.assertGreaterEqual(judged.same_message, 0.95 * judged.rejected, version)


if __name__ == '__main__':
    unittest.main()
