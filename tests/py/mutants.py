"""Mutated real statements judged by CPython: the analyzer's syntax verdicts against compile().

One-line statements of a standard library are mutated once or twice (a token
deleted, inserted from a pool, swapped with its neighbour or replaced, or an
operator such as '->' or '@=' inserted; f-string literals damaged inside their
quotes), put in a random enclosing block (module, def, class, loop, async def),
a quarter of them damaged as only the whole file shows (indentation, a stray
decorator, a late future import, a header with no body, a break or continue on
a line of its own) and compiled by the CPython of the same version. Run as a
script to print the disagreements:

    python2.7 -m tests.py.mutants 3.6 [count]
"""

import json
import random
import sys

from pysource import _fastaccess
from pysource import utils
from tests.py import support

kComment = 202
# Lines a line-by-line analyzer cannot judge alone: clauses that continue a
# statement above them, and decorators, which need the def below; from 3.10
# also a match statement's header and case clauses (the names match and case
# lead ordinary statements too; those are left out with them).
kContinuations = (b'else', b'elif', b'except', b'finally', b'try', b'@')
kSoftKeywordHeads = (b'match', b'case')
kPool = (b'=', b'(', b')', b'[', b']', b',', b'*', b'**', b'.', b':', b'+', b'-', b'==', b'<>', b'+=',
         b'lambda', b'yield', b'return', b'None', b'True', b'False', b'__debug__', b'not', b'in', b'if',
         b'else', b'for', b'del', b'await', b'async', b'global', b'nonlocal', b'break', b'continue',
         b'1', b"'s'", b'x', b'f', b'...', b'is', b'and', b'as', b'from', b'import', b'print',
         b'pass', b'with', b'{', b'}', b';')
# Operators inserted anywhere: tokens that only the lexer tells from their
# neighbours ('->' from '@=', ':=' before 3.8, '**' beside '*').
kOperators = (b'->', b'@=', b':=', b'**')
kContexts = {
    'module': (b'', b''),
    'def': (b'def f():\n', b'    '),
    'class': (b'class C:\n', b'    '),
    'loop': (b'def f():\n    for _ in _it:\n', b'        '),
    'while': (b'while _c:\n', b'    '),
    'finally': (b'for _ in _it:\n    try:\n        pass\n    finally:\n', b'        '),
    'async': (b'async def f():\n', b'    '),
}


def Statements(version, files):
    """Token lists of the one-line statements of some files (comments dropped)."""
    found = []
    heads = kContinuations
    if version not in ('2.7', '3.5', '3.6', '3.7', '3.8', '3.9'):
        heads += kSoftKeywordHeads
    for path in files:
        for logical in utils.GetLogicalsFromText(support.ReadBytes(path)):
            if logical.fLineText.count(b'\n') != 1 or logical.fTokenCount == 0:
                continue
            toks = [logical.GetTokenString(i) for i in range(logical.fTokenCount)]
            toks = [t for t in toks if _fastaccess.GetTokenType(t) != kComment]
            if toks and not toks[0].startswith(heads) and len(toks) < 40:
                found.append(toks)
    return found


# F-string damage: edits inside the literal of an f-string token.
kFStringPool = (b'{', b'}', b'{}', b'!x', b'!', b'!r', b'#', b'\\', b':', b':{a:{b}}', b'{a', b'a}', b' ', b'=',
                b'*', b'(', b')', b'[', b'yield', b'await x', b'"', b"'", b'{{', b'}}')


def IsFString(tok):
    prefix = tok[:len(tok) - len(tok.lstrip(b'fFrR'))]
    return len(prefix) <= 2 and b'f' in prefix.lower() and tok[len(prefix):len(prefix) + 1] in (b'"', b"'")


def MutateFString(tok, rnd):
    """tok with a byte range inside its quotes dropped, doubled or replaced from the pool."""
    start = len(tok) - len(tok.lstrip(b'fFrRbBuU'))
    quote = 3 if tok[start:start + 3] in (b'"""', b"'''") else 1
    lo, hi = start + quote, len(tok) - quote
    if hi <= lo:
        return tok
    i = rnd.randrange(lo, hi + 1)
    j = min(hi, i + rnd.choice((0, 1, 1, 2)))
    op = rnd.randrange(3)
    if op == 0:
        return tok[:i] + tok[j:]
    if op == 1:
        return tok[:i] + tok[i:j] + tok[i:j] + tok[j:]
    return tok[:i] + rnd.choice(kFStringPool) + tok[j:]


def Mutate(toks, rnd):
    """A copy of toks with one or two random edits; a line with an f-string
    gets one of them inside an f-string half of the time."""
    toks = list(toks)
    fstrings = [i for i, t in enumerate(toks) if IsFString(t)]
    if fstrings and rnd.random() < 0.5:
        i = rnd.choice(fstrings)
        toks[i] = MutateFString(toks[i], rnd)
        return toks
    for _ in range(rnd.choice((1, 1, 2))):
        op = rnd.randrange(5)
        i = rnd.randrange(len(toks) + (op in (1, 4)))
        if op == 0 and len(toks) > 1:
            del toks[i]
        elif op == 1:
            toks.insert(i, rnd.choice(kPool))
        elif op == 4:
            toks.insert(i, rnd.choice(kOperators))
        elif op == 2 and i + 1 < len(toks):
            toks[i], toks[i + 1] = toks[i + 1], toks[i]
        elif i < len(toks):
            toks[i] = rnd.choice(kPool)
    return toks


def Damage(head, indent, line, rnd):
    """The lines of a source (head, then line at indent) with one whole-file damage."""
    kind = rnd.randrange(5)
    if kind == 0:       # the line's indentation
        indent = rnd.choice((indent + b' ', indent[:-1], indent.replace(b'    ', b'\t', 1),
                             b'\t' + indent, indent + b'  '))
        return head + indent + line
    if kind == 1:       # a decorator that no def or class may follow
        return head + indent + b'@d\n' + indent + line
    if kind == 2:       # a future import after other statements
        return head + indent + line + b'from __future__ import division\n'
    if kind == 3:       # a header that ends the file
        return head + indent + line + indent + b'if _c:\n'
    return head + indent + line + indent + rnd.choice((b'break\n', b'continue\n'))


def Sources(version, count, seed=4321, files=None):
    """(source, context) of `count` distinct mutated statements in random blocks."""
    rnd = random.Random(seed)
    damage = random.Random(seed + 1)
    statements = Statements(version, files if files is not None else support.CorpusFiles(version, 400, seed))
    contexts = sorted(k for k in kContexts if version != '2.7' or k != 'async')
    # Lines with f-strings are rare: they are drawn for a tenth of the mutants.
    fstrings = [t for t in statements if any(IsFString(x) for x in t)]
    seen, out = set(), []
    while len(out) < count and statements:
        toks = Mutate(rnd.choice(fstrings if fstrings and rnd.random() < 0.1 else statements), rnd)
        if not toks or toks[0].startswith(kContinuations):
            continue
        line = b' '.join(toks)
        if line in seen:
            continue
        seen.add(line)
        context = rnd.choice(contexts)
        head, indent = kContexts[context]
        line += b'\n'
        if toks[-1] == b':':
            line += indent + b'    pass\n'
        if damage.random() < 0.25:
            source, context = Damage(head, indent, line, damage), context + '+file'
        else:
            source = head + indent + line
        out.append((source, context))
    return out


# CPython reads a file before it compiles it: without a coding cookie,
# Python 2's reader rejects bytes that are not ASCII and Python 3's bytes that
# are not UTF-8, where compile() of the same bytes may let them through.
kOracle = r'''
import json, re, sys, warnings
warnings.simplefilter('ignore')
PEP263 = 'but no encoding declared; see http://python.org/dev/peps/pep-0263/ for details'

def Unread(data):
    if re.match(br'(?:[ \t\f]*(?:#[^\n]*)?\n)?[ \t\f]*#.*?coding[:=]', data):
        return None
    if sys.version_info[0] == 2:
        bad = re.search(br'[\x80-\xff]', data)
        if bad:
            return 'Non-ASCII character %r in file <string> on line %d, ' % (data[bad.start()], data.count(b'\n', 0, bad.start()) + 1) + PEP263
        return None
    try:
        data.decode('utf-8')
    except UnicodeDecodeError as e:
        return "Non-UTF-8 code starting with '\\x%02x' in file <string> on line %d, " % (data[e.start], data.count(b'\n', 0, e.start) + 1) + PEP263
    return None

out = []
for text in json.load(sys.stdin):
    data = text.encode('latin-1')
    unread = Unread(data)
    if unread:
        out.append([unread, int(unread.split(' on line ')[1].split(',')[0]), None])
        continue
    try:
        compile(data, '<string>', 'exec')
        out.append(None)
    except SyntaxError as e:
        out.append([str(e.msg), e.lineno, e.offset])
    except (ValueError, TypeError) as e:
        out.append(['%s: %s' % (type(e).__name__, e), 0, 0])
sys.stdout.write(json.dumps(out))
'''


kCrash = 'CPython crashed'


def Verdicts(version, sources):
    """CPython's verdict on each source: None, [message, line, offset], or kCrash
    for a source that brings CPython down (3.8.18 aborts on a few mutants);
    None if there is no CPython of that version."""
    data = json.dumps([s.decode('latin-1') for s in sources])
    try:
        out = support.RunOracle(version, kOracle, data)
    except AssertionError:
        if len(sources) == 1:
            return [kCrash]
        half = len(sources) // 2
        return Verdicts(version, sources[:half]) + Verdicts(version, sources[half:])
    return None if out is None else json.loads(out)


def Ours(version, source, checks=True):
    """The analyzer's first error in a source: None or [message, line, column]."""
    from pysource import analysis
    result = analysis.AnalyzeText(source, version, checks=checks)
    for error in result.errors:
        if error is not None:       # located in the source as CPython locates it
            return [error.msg, error.lineno, error.offset]
    return None


def Compare(version, count, seed=4321, checks=True):
    """(sources, cpython verdicts, our verdicts) of `count` mutants; None without CPython."""
    items = Sources(version, count, seed)
    sources = [s for s, _ in items]
    theirs = Verdicts(version, sources)
    if theirs is None:
        return None
    kept = [i for i, t in enumerate(theirs) if t != kCrash]
    items, theirs = [items[i] for i in kept], [theirs[i] for i in kept]
    return items, theirs, [Ours(version, s, checks) for s, _ in items]


class Judgement(object):
    """The analyzer's verdicts against CPython's: rejected (how many CPython
    rejects), false_rejects and false_accepts and other_message (lists of
    (context, source, cpython's, ours)), same_message and same_place (counts)."""

    def __init__(self, items, theirs, ours):
        cases = [(ctx, src, t, o) for (src, ctx), t, o in zip(items, theirs, ours)]
        self.count = len(cases)
        self.rejected = sum(1 for _, _, t, _ in cases if t is not None)
        self.false_rejects = [c for c in cases if c[2] is None and c[3] is not None]
        self.false_accepts = [c for c in cases if c[2] is not None and c[3] is None]
        agree = [(t, o) for _, _, t, o in cases if t is not None and o is not None]
        self.other_message = [c for c in cases if c[2] is not None and c[3] is not None and c[2][0] != c[3][0]]
        self.same_message = sum(1 for t, o in agree if t[0] == o[0])
        self.same_place = sum(1 for t, o in agree if t == o)


def Main(argv):
    version = argv[1]
    count = int(argv[2]) if len(argv) > 2 else 20000
    found = Compare(version, count)
    if found is None:
        print('no CPython %s' % version)
        return 1
    j = Judgement(*found)
    for kind, cases in (('ACCEPTED BY CPYTHON, REJECTED', j.false_rejects),
                        ('REJECTED BY CPYTHON, ACCEPTED', j.false_accepts),
                        ('OTHER MESSAGE', j.other_message)):
        print('== %s: %d' % (kind, len(cases)))
        for ctx, src, t, o in cases:
            print('%-8s %r\n         cpython %r ours %r' % (ctx, src, t, o))
    rejected = max(j.rejected, 1)
    print('%d mutants, %d rejected by CPython; false rejects %d, false accepts %d (%.3f%%), '
          'same message %d (%.1f%%), same message and place %d'
          % (j.count, j.rejected, len(j.false_rejects), len(j.false_accepts),
             100.0 * len(j.false_accepts) / rejected, j.same_message,
             100.0 * j.same_message / rejected, j.same_place))
    return 0


if __name__ == '__main__':
    sys.exit(Main(sys.argv))
