"""The symbol-info vocabulary: what the analyzer records about a logical line.

An info string is a byte string appended to a logical-line record. An info
that carries a kind begins with one of the prefixes below; every prefix is
":" + its kind byte + ":" (so kPrefixLen bytes long), and the payload follows
it. An info that does not begin with ":" is a plain equivalence: the source
text of an expression (a name, a dotted name, a call) to be resolved later.

Examples of infos::

    :g:                  the name is read
    :w:12                the name is bound inside a sub-expression at token 12
    :r:(1,x)             the name was called with the arguments 1 and x
    :l:int: 42           an int literal (BuildLiteralInfo)
    :l:string: 'a%20b'   a string literal (EncodeStringLiteral)
    :h:List[int]         a type hint
    :A:0                 the key of the hint for parameter 0 (BuildArgInfo)

Scope names are dotted ("C.method"); the module scope is the empty name, and
kModuleScopeName is how it is displayed.
"""

import re

# -- Kinds (one byte each) and their prefixes ---------------------------------


def _Prefix(kind):
    return b':' + kind + b':'


kSetKind = b's'                     # the name is assigned
kGetKind = b'g'                     # the name is read
kSetTypeHintKind = b'S'             # the name is assigned with an annotation
kNonlocalKind = b'n'                # the name is declared nonlocal
kGlobalKind = b'G'                  # the name is declared global
kWithinExprKind = b'w'              # bound inside a sub-expression (token index follows)
kImportKind = b'i'                  # import a.b
kFromImportKind = b'f'              # from a import b
kImportAsNameKind = b'a'            # import a as b / from a import b as c
kDecoratorKind = b'd'               # a decorator applied to the name
kSpecificScopeKind = b'p'           # the name resolves in the given scope
kSpecificUrlKind = b'u'             # the name resolves to the given location
kBuiltinModuleKind = b'B'           # a builtin module
kTypingModuleKind = b'T'            # a symbol of the typing module
kBuiltinClassKind = b'b'            # a builtin class
kTypedLiteralKind = b'l'            # a literal of a known type
kArgKind = b'A'                     # a parameter, by position
kTypeHintKind = b'h'                # a type hint
kMethodKind = b'm'                  # a method bound to its instance
kUnboundMethodKind = b'M'           # a method taken from its class
kFunctionKind = b'F'                # a function
kClassKind = b'c'                   # a class
kSelfKind = b'e'                    # the instance a method is called on
kInstanceKind = b'I'                # an instance of a class
kModuleKind = b'o'                  # a module
kInferredTypeHintKind = b'y'        # a type inferred from the code, not declared
kCalledKind = b'r'                  # the result of calling the name
kTypeParamKind = b't'               # a type parameter of a def, class or type statement ('*' or '**' follows for *Ts, **P)
kPlainEquivKind = b'='              # a plain equivalence (no prefix)

kSetPrefix = _Prefix(kSetKind)
kGetPrefix = _Prefix(kGetKind)
kSetTypeHintPrefix = _Prefix(kSetTypeHintKind)
kNonlocalPrefix = _Prefix(kNonlocalKind)
kGlobalPrefix = _Prefix(kGlobalKind)
kWithinExprPrefix = _Prefix(kWithinExprKind)
kImportPrefix = _Prefix(kImportKind)
kFromImportPrefix = _Prefix(kFromImportKind)
kImportAsNamePrefix = _Prefix(kImportAsNameKind)
kDecoratorPrefix = _Prefix(kDecoratorKind)
kSpecificScopePrefix = _Prefix(kSpecificScopeKind)
kSpecificUrlPrefix = _Prefix(kSpecificUrlKind)
kBuiltinModulePrefix = _Prefix(kBuiltinModuleKind)
kTypingModulePrefix = _Prefix(kTypingModuleKind)
kBuiltinClassPrefix = _Prefix(kBuiltinClassKind)
kTypedLiteralPrefix = _Prefix(kTypedLiteralKind)
kArgPrefix = _Prefix(kArgKind)
kTypeHintPrefix = _Prefix(kTypeHintKind)
kMethodPrefix = _Prefix(kMethodKind)
kUnboundMethodPrefix = _Prefix(kUnboundMethodKind)
kFunctionPrefix = _Prefix(kFunctionKind)
kClassPrefix = _Prefix(kClassKind)
kSelfPrefix = _Prefix(kSelfKind)
kInstancePrefix = _Prefix(kInstanceKind)
kModulePrefix = _Prefix(kModuleKind)
kInferredTypeHintPrefix = _Prefix(kInferredTypeHintKind)
kCalledPrefix = _Prefix(kCalledKind)
kTypeParamPrefix = _Prefix(kTypeParamKind)
# Marks an explicit plain equivalence whose text itself begins with ":".
kPlainEquivSpec = _Prefix(kPlainEquivKind)

# Length of every prefix above.
kPrefixLen = 3

# -- Other vocabulary ----------------------------------------------------------

# Subscript text that stands for an element of an iteration (`for x in y`
# records y + kIterationSubscript for x).
kIterationSubscript = b'[*]'
# Suffix of a literal type's name when it names an instance of the class
# (int and float literals).
kClassInstanceSuffix = b'()'
# Separates a scope name from the index that tells same-named scopes apart.
kScopeIndexSep = b'#'
# Display name of the module scope (whose scope name is empty).
kModuleScopeName = b'<module>'
kTypingModuleSymbol = b'typing'
kTypingModuleSymbolDot = kTypingModuleSymbol + b'.'
kTypingModuleSymbolDotAny = kTypingModuleSymbolDot + b'Any'


def _CheckBytes(value, what=b'bytes'):
    if isinstance(value, bytes):
        return value
    if isinstance(value, unicode):
        return value.encode('utf-8')
    raise TypeError('Expected %.16s, got %.200s' % (what, type(value).__name__))


def GetInfoKind(info):
    """Kind byte of an info string; kPlainEquivKind for a plain info."""
    info = _CheckBytes(info)
    if len(info) < 2 or info[0:1] != b':':
        return kPlainEquivKind
    return info[1:2]


# -- Literal infos ---------------------------------------------------------------

# The order prefix letters are written in by EncodeStringLiteral.
_kPrefixOrder = b'ubfr'
_kStringToken = re.compile(br'([A-Za-z]*)(\'\'\'|"""|\'|")', re.S)
# Body bytes kept as they are; every other ASCII byte becomes %XX.
_kBodySafe = frozenset(
    b'abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_.')
_kEscape = dict((chr(i), chr(i) if chr(i) in _kBodySafe or i >= 0x80
                 else '%%%02X' % i) for i in range(256))


def _EncodeStringLiteralPy(text):
    """Compact, unambiguous form of a string literal token, for info strings.

    The result is the literal's prefix letters, lower-cased and in the order
    u, b, f, r, then "'", the body and "'". Body bytes other than ASCII
    letters, digits, "_" and "." are written %XX (two upper-case hex digits);
    bytes from 0x80 up are kept. The quote style does not matter: 'a', "a"
    and '''a''' encode the same; escape sequences stay as written, so r'\\n'
    and '\\n' differ by the "r". An unterminated literal has no closing "'".
    The result never holds a blank, ":", ",", a bracket or a quote other than
    the two delimiters. Text that is not a string literal is encoded like a
    body, without quotes.
    """
    text = _CheckBytes(text)
    m = _kStringToken.match(text)
    if m is None or len(m.group(1)) > 2 or \
            m.group(1).strip(b'uUbBfFrR'):
        return _EncodeBody(text)
    letters = m.group(1).lower()
    prefix = b''.join(c for c in _kPrefixOrder if c in letters)
    quote = m.group(2)
    body = text[m.end():]
    if body.endswith(quote) and len(body) >= len(quote) and \
            not _EndsInEscape(body[:-len(quote)]):
        return prefix + b"'" + _EncodeBody(body[:-len(quote)]) + b"'"
    return prefix + b"'" + _EncodeBody(body)


def _EndsInEscape(body):
    """True when the body ends in an odd number of backslashes."""
    return (len(body) - len(body.rstrip(b'\\'))) % 2 == 1


def _EncodeBody(body):
    return b''.join(_kEscape[c] for c in body)


_kPercent = re.compile(br'%([0-9A-F]{2})')


def DecodeStringLiteral(encoded):
    """Inverse of EncodeStringLiteral: (prefix, body, terminated)."""
    encoded = _CheckBytes(encoded)
    quote = encoded.find(b"'")
    if quote < 0:
        raise ValueError('not an encoded string literal: %r' % (encoded,))
    prefix, rest = encoded[:quote], encoded[quote + 1:]
    terminated = rest.endswith(b"'")
    if terminated:
        rest = rest[:-1]
    body = _kPercent.sub(lambda m: chr(int(m.group(1), 16)), rest)
    return prefix, body, terminated


def BuildLiteralInfo(kind, text):
    """Info for a literal: kTypedLiteralPrefix + kind + ":", then " " + text.

    kind is the literal's type name ("int", "float", "set", "dict", ...);
    text, the literal's source text, is left out when None.
    """
    info = kTypedLiteralPrefix + _CheckBytes(kind) + b':'
    if text is None:
        return info
    return info + b' ' + _CheckBytes(text)


def BuildArgInfo(index, name):
    """Key of the parameter at position index (0 for the first): ":A:<index>".

    With a name, ":" and the name follow, for a key that also names the
    parameter.
    """
    if isinstance(index, bool) or not isinstance(index, (int, long)):
        raise TypeError('Expected %.16s, got %.200s' % ('int', type(index).__name__))
    if index < 0:
        raise ValueError('parameter position must not be negative: %d' % index)
    key = kArgPrefix + (b'%d' % index)
    if name is not None:
        key += b':' + _CheckBytes(name)
    return key


# -- Joining token texts -------------------------------------------------------

_kOperators = [
    '**=', '//=', '>>=', '<<=', '...', '->', '**', '//', '<<', '>>', '<=',
    '>=', '==', '!=', '<>', '+=', '-=', '*=', '/=', '%=', '&=', '|=', '^=',
    '@=', ':=']
# One token at the start of a text (after blanks). "..." is lexed as three
# "." so that a run of dots lexes the same however it is split.
_kLex = re.compile(br'''[ \t\f\r\n]*(
    (?:[uUbBrRfF]{1,2})?(?:\'\'\'(?:[^\\]|\\.)*?(?:\'\'\'|\Z)
                          |"""(?:[^\\]|\\.)*?(?:"""|\Z)
                          |\'(?:[^\\\'\n]|\\.)*(?:\'|(?=\n)|\Z)
                          |"(?:[^\\"\n]|\\.)*(?:"|(?=\n)|\Z))
  | [A-Za-z_\x80-\xff][A-Za-z0-9_\x80-\xff]*
  | (?:0[xXoObB][0-9a-fA-F_]+[lL]?
     |(?:[0-9][0-9_]*\.?[0-9_]*|\.[0-9][0-9_]*)(?:[eE][-+]?[0-9][0-9_]*)?[lLjJ]?)
  | \#[^\r\n]*
  | %s
  | \\\r?\n
  | [^ \t\f\r\n])''' % b'|'.join(re.escape(op) for op in _kOperators if op != '...'),
    re.S | re.X)

_kKeywords = frozenset([
    'and', 'as', 'assert', 'async', 'await', 'break', 'class', 'continue',
    'def', 'del', 'elif', 'else', 'except', 'finally', 'for', 'from',
    'global', 'if', 'import', 'in', 'is', 'lambda', 'nonlocal', 'not', 'or',
    'pass', 'raise', 'return', 'try', 'while', 'with', 'yield'])
_kMaybeUnary = frozenset(['-', '+', '~', '*', '**', '@'])
_kOpenFor = {')': '(', ']': '[', '}': '{'}
_kOpChars = frozenset('=<>!*/%&|^+-.~@:')

# Token classes.
_OPERAND, _KEYWORD, _OPEN, _CLOSE, _COMMA, _COLON, _DOT, _OP = range(8)


def _Lex(text):
    """Token texts of a text; blanks dropped."""
    toks = []
    pos, end = 0, len(text)
    while pos < end:
        m = _kLex.match(text, pos)
        if m is None:        # trailing blanks
            break
        toks.append(m.group(1))
        pos = m.end()
    return toks


def _Class(tok):
    c = tok[0]
    if c.isalpha() or c == '_' or c >= '\x80':
        return _KEYWORD if tok in _kKeywords else _OPERAND
    if c.isdigit() or c in '\'"' or (c == '.' and len(tok) > 1):
        return _OPERAND
    if c in '([{':
        return _OPEN
    if c in ')]}':
        return _CLOSE
    if tok == ',' or tok == ';':
        return _COMMA
    if tok == ':':
        return _COLON
    if tok == '.':
        return _DOT
    return _OP


def _WouldMerge(left, right):
    """True when left + right does not lex as the two tokens."""
    if not ((left[-1] in _kOpChars and right[0] in _kOpChars)
            or (left[0].isdigit() and right[0] == '.')
            or (left[-1] == '.' and right[0].isdigit())):
        return False
    return _Lex(left + right) != [left, right]


def _JoinTokensPy(texts):
    """Source text from token texts, with conventional spacing.

    f(x, 1), a.b[i], x + 1, -x, f(*a, **kw), lambda x: x, a[1:2], {a: b},
    f(a=1), not x, x if y else z. A text may hold several tokens (for example
    an earlier result): texts are split into tokens again, so joining a
    sequence at once or in pieces gives the same text.
    """
    toks = []
    for text in texts:
        text = _CheckBytes(text)
        m = _kLex.match(text)
        if m is not None and m.end() == len(text) and m.start(1) == 0:
            toks.append(text)      # a single token
        else:
            toks.extend(_Lex(text))
    out = []
    # Per open bracket: [bracket, pending lambdas].
    stack = [[None, 0]]
    prev = None
    prev_cls = None
    prev_unary = False       # prev is a unary operator
    prev_tight = False       # prev is a ":" or "=" written without blanks
    dots = 0                 # length of the run of "." ending at prev
    for tok in toks:
        cls = _Class(tok)
        if tok == '`':
            cls = _CLOSE if stack[-1][0] == '`' else _OPEN
        prev_operand = prev_cls in (_OPERAND, _CLOSE) or (
            prev_cls == _DOT and dots >= 3)
        unary = cls == _OP and tok in _kMaybeUnary and not prev_operand
        tight = False
        if tok == ':':
            top = stack[-1]
            if top[1]:
                top[1] -= 1
            elif top[0] == '[':
                tight = True
        elif tok == '=' and (stack[-1][0] == '(' or stack[-1][1]):
            tight = True
        # Blank before tok?
        if prev is None or cls == _CLOSE or prev_cls == _OPEN:
            space = False
        elif cls in (_COMMA, _COLON):
            space = False
        elif prev_cls in (_COMMA,):
            space = True
        elif prev_cls == _COLON:
            space = not prev_tight
        elif prev_unary:
            space = False
        elif prev_cls == _OP:
            space = not prev_tight
        elif tight:
            space = False
        elif cls == _DOT:
            space = prev_cls == _KEYWORD
        elif prev_cls == _DOT:
            space = cls == _KEYWORD or (dots >= 3 and cls != _OPEN)
        elif cls == _OPEN and tok in '([':
            space = not prev_operand
        else:
            space = True
        if not space and prev is not None and _WouldMerge(prev, tok):
            space = True
        if space:
            out.append(' ')
        out.append(tok)
        # State after tok.
        if cls == _OPEN:
            stack.append([tok, 0])
        elif cls == _CLOSE and len(stack) > 1 and (
                stack[-1][0] == tok or stack[-1][0] == _kOpenFor.get(tok)):
            stack.pop()
        elif tok == 'lambda':
            stack[-1][1] += 1
        dots = dots + 1 if cls == _DOT else 0
        prev, prev_cls, prev_unary, prev_tight = tok, cls, unary, tight
    return ''.join(out)


try:
    from pysource._fastaccess import JoinTokens, EncodeStringLiteral
except ImportError:
    JoinTokens, EncodeStringLiteral = _JoinTokensPy, _EncodeStringLiteralPy


# -- Value classes -------------------------------------------------------------


class _Value(object):
    """Base of the small value classes: equality, hashing, repr and pickling
    by the fields in __slots__."""
    __slots__ = ()

    def _Fields(self):
        return tuple(getattr(self, name) for name in self.__slots__)

    def __eq__(self, other):
        return type(self) is type(other) and self._Fields() == other._Fields()

    def __ne__(self, other):
        return not self == other

    def __hash__(self):
        return hash((type(self).__name__,) + self._Fields())

    def __repr__(self):
        return '%s(%s)' % (type(self).__name__,
                           ', '.join(repr(v) for v in self._Fields()))

    def __reduce__(self):
        return (type(self), self._Fields())


class CFullyScopedName(_Value):
    """A name and the dotted scope it is defined in ("" is the module)."""
    __slots__ = ('fScope', 'fName')

    def __init__(self, scope, name):
        self.fScope = _CheckBytes(scope)
        self.fName = _CheckBytes(name)

    def GetFullName(self):
        """scope.name, or the name alone in the module scope."""
        if not self.fScope:
            return self.fName
        return self.fScope + b'.' + self.fName

    def __str__(self):
        return self.GetFullName()


class CSingleResolvedInfo(_Value):
    """One info string resolved: its kind, the info and what it names.

    fTarget is the CFullyScopedName the info resolved to, or None when it did
    not resolve.
    """
    __slots__ = ('fKind', 'fInfo', 'fTarget')

    def __init__(self, kind, info, target=None):
        self.fKind = _CheckBytes(kind)
        if len(self.fKind) != 1:
            raise ValueError('a kind is one byte: %r' % (self.fKind,))
        self.fInfo = _CheckBytes(info)
        if target is not None and not isinstance(target, CFullyScopedName):
            raise TypeError('Expected %.16s, got %.200s'
                            % ('CFullyScopedName', type(target).__name__))
        self.fTarget = target

    @classmethod
    def FromInfo(cls, info, target=None):
        """The record of an info string, its kind read from its prefix."""
        return cls(GetInfoKind(info), info, target)


class CDefInfo(_Value):
    """A definition: its kind (kFunctionKind, kMethodKind, kClassKind, ...),
    its scoped name, its parameter names and the 0-based line it starts on."""
    __slots__ = ('fKind', 'fScopedName', 'fArgNames', 'fFirstLine')

    def __init__(self, kind, scoped_name, arg_names=(), first_line=0):
        self.fKind = _CheckBytes(kind)
        if len(self.fKind) != 1:
            raise ValueError('a kind is one byte: %r' % (self.fKind,))
        if not isinstance(scoped_name, CFullyScopedName):
            raise TypeError('Expected %.16s, got %.200s'
                            % ('CFullyScopedName', type(scoped_name).__name__))
        self.fScopedName = scoped_name
        self.fArgNames = tuple(_CheckBytes(a) for a in arg_names)
        self.fFirstLine = int(first_line)

    def IsDef(self):
        """True for functions and methods."""
        return self.fKind in (kFunctionKind, kMethodKind, kUnboundMethodKind)
