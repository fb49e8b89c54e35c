"""Analysing Python source: texts, files and folders, per language version.

    from pysource import analysis

    result = analysis.AnalyzeText(b'x = y\\n', version='3.6')
    for line in result.Lines():
        print(line['line'], line['defines'], line['reads'])   # 1 ['x'] ['y']

    for result in analysis.AnalyzeFolder('src'):              # 'auto' by default
        print(result.path, result.version, result.status, len(result.SyntaxErrors()))

A version is '2.7', '3.5' to '3.13' or 'auto'. Each version has one
analyzer with its grammar, keyword list and the Python 3 hint grammar; a 2.7
module that imports print_function from __future__ gets the 2.7 grammar
variant without the print statement. 'auto' picks, per file, the newest version under which no
line has a syntax error; a file that fails under every version keeps the
errors of the version with the fewest lines in error (the newest on a tie).

The analyzers may be used from several threads: each version's analyzer
serves one line at a time (a lock), so every thread gets the result it would
get alone. An unexpected failure inside the analyzer raises AnalysisFailure
from AnalyzeText; AnalyzeFile and AnalyzeFolder report it as status kFailed.

Results keep the logical-line records (pysource._fastaccess.CLogicalLine) with
the derived info the analyzer recorded; LineView turns one record into plain
data. Texts are bytes throughout, exactly as in the source.
"""

import os
import re
import stat
import sys
import threading

from pysource import _fastaccess
from pysource import filechecks
from pysource import symbolinfo
from pysource import utils

kVersions = ('2.7', '3.5', '3.6', '3.7', '3.8', '3.9', '3.10', '3.11', '3.12', '3.13')
kAuto = 'auto'
# The order in which 'auto' tries the versions: the newest first.
kAutoOrder = ('3.13', '3.12', '3.11', '3.10', '3.9', '3.8', '3.7', '3.6', '3.5', '2.7')
kSourceSuffixes = ('.py', '.pyi')

# The grammar of type hints is a Python 3 one whatever the version of the code.
# 3.6's: a type holds no syntax that 3.7 or 3.8 added, and the hints of the
# older versions stay as they were.
kHintGrammar = 'Python-Grammar-3.6'
kPrintFunctionGrammar = 'Python-Grammar-2.7-print-function'

# Keywords of Python 3.5 and 3.6 (the parser handles async and await).
kPy3Keywords = (
    'False', 'None', 'True', 'and', 'as', 'assert', 'break', 'class', 'continue',
    'def', 'del', 'elif', 'else', 'except', 'finally', 'for', 'from', 'global',
    'if', 'import', 'in', 'is', 'lambda', 'nonlocal', 'not', 'or', 'pass',
    'raise', 'return', 'try', 'while', 'with', 'yield')
# From 3.7 on async and await are keywords everywhere.
kPy37Keywords = tuple(sorted(kPy3Keywords + ('async', 'await')))

# Version -> (version triple, grammar file, Python 3 grammar).
kGrammars = {
    '2.7': ((2, 7, 0), 'Python-Grammar-2.7', False),
    '3.5': ((3, 5, 0), 'Python-Grammar-3.5', True),
    '3.6': ((3, 6, 0), 'Python-Grammar-3.6', True),
    '3.7': ((3, 7, 0), 'Python-Grammar-3.7', True),
    '3.8': ((3, 8, 0), 'Python-Grammar-3.8', True),
    '3.9': ((3, 9, 0), 'Python-Grammar-3.9', True),
    '3.10': ((3, 10, 0), 'Python-Grammar-3.10', True),
    '3.11': ((3, 11, 0), 'Python-Grammar-3.11', True),
    '3.12': ((3, 12, 0), 'Python-Grammar-3.12', True),
    '3.13': ((3, 13, 0), 'Python-Grammar-3.13', True),
}

# Version -> keyword list of a Python 3 version.
kKeywords = {'3.5': kPy3Keywords, '3.6': kPy3Keywords,
             '3.7': kPy37Keywords, '3.8': kPy37Keywords, '3.9': kPy37Keywords,
             '3.10': kPy37Keywords, '3.11': kPy37Keywords, '3.12': kPy37Keywords,
             '3.13': kPy37Keywords}

# Version -> soft keywords: names that are keywords only where the grammar
# places them (the parser retypes match and case at the start of a line and
# type before a name; _ is the wildcard pattern), names everywhere else.
kSoftKeywords = {'3.10': ('_', 'case', 'match'), '3.11': ('_', 'case', 'match'),
                 '3.12': ('_', 'case', 'match', 'type'), '3.13': ('_', 'case', 'match', 'type')}

kKindNames = {0: 'stmt', 1: 'class', 2: 'def', 11: 'try', 21: 'comment', 22: 'blank'}

# Status of one file's analysis, from best to worst.
kOk = 'ok'
kSkipped = 'skipped'            # a folder met again through a symlink loop
kSyntaxError = 'syntax-error'   # some line has a syntax error
kUnreadable = 'unreadable'      # not read or not Python source: nothing analyzed
kFailed = 'failed'              # the analysis itself failed (see AnalysisFailure)

kStatusRank = {kOk: 0, kSkipped: 0, kSyntaxError: 1, kUnreadable: 2, kFailed: 2}

# Files larger than this are not read (reported as kUnreadable): a source
# file that large is generated data, and reading it whole could exhaust memory.
kMaxSourceBytes = 32 * 1024 * 1024


class AnalysisFailure(RuntimeError):
    """The analyzer failed unexpectedly on a line (it reported the traceback);
    the line's result would be wrong, so none is given."""


def UsesPrintFunction(logicals):
    """True when a module imports print_function from __future__.

    Python 2.7 then parses the whole module without the print statement.
    """
    for logical in logicals:
        if logical.fKind in (21, 22) or logical.fTokenCount < 4:
            continue
        if (logical.GetTokenString(0) == b'from' and logical.GetTokenString(1) == b'__future__'
                and b'print_function' in logical.fLineText):
            texts = [logical.GetTokenString(i) for i in range(logical.fTokenCount)]
            if b'print_function' in texts:
                return True
    return False


# ---- Tokens that a version's lexer rejects but its grammar cannot tell apart

_kNumber, _kString = 2, 3
_kCheckedKinds = (_kNumber, _kString, 29)   # 29: '<>' and '!='
_kTripleQuotes = (b'"' * 3, b"'" * 3)
_kNonAscii = re.compile(br'[\x80-\xff]')
# A character that Python 3 passes to the escape decoder as a \U escape of ten
# bytes: a UTF-8 sequence (or a byte that starts none), or a backslash before one.
_kUtf8Char = re.compile(br'\\(?=[\x80-\xff])|[\xc0-\xdf][\x80-\xbf]|[\xe0-\xef][\x80-\xbf]{2}|'
                        br'[\xf0-\xf7][\x80-\xbf]{3}|[\x80-\xff]')
# Messages of string decoding, which CPython reports once the line has parsed.
_kDecodingMessages = ('(unicode error)', '(value error)', 'bytes can only contain ASCII')


def _StringParts(text):
    """(lower-cased prefix, body between the quotes) of a string token."""
    quote = len(text) - len(text.lstrip(b'bBuUrRfF'))
    q = 3 if text[quote:quote + 3] in _kTripleQuotes else 1
    return text[:quote].lower(), text[quote + q:len(text) - q]


def _DecodeError(codec, buf, start, end, reason):
    """A decoder's message for the bytes buf[start:end]."""
    if end - start == 1:
        where = "byte 0x%02x in position %d" % (ord(buf[start:end]), start)
    else:
        where = 'bytes in position %d-%d' % (start, end - 1)
    return "(unicode error) '%s' codec can't decode %s: %s" % (codec, where, reason)


def _HexRun(buf, i, count):
    """The end of the run of at most count hex digits at buf[i:]."""
    end = i
    while end < len(buf) and end - i < count and buf[end:end + 1] in _kHexDigits:
        end += 1
    return end


def _TextEscapeError(body, python3):
    """The message for the first escape of a text string body that the
    unicodeescape decoder rejects, or None. Python 3 hands it each non-ASCII
    character as a \\U escape, which moves the positions it reports; 2.7
    (u'') hands it the bytes and also looks names up (its own Unicode data).
    """
    if python3 and _kNonAscii.search(body):
        body = _kUtf8Char.sub(lambda m: b'\\u005c' if m.group() == b'\\' else b'\\U00000000', body)
    n, i = len(body), body.find(b'\\')
    while 0 <= i < n - 1:
        start, c = i, body[i + 1:i + 2]
        i += 2
        count = {b'x': 2, b'u': 4, b'U': 8}.get(c)
        if count:
            end = _HexRun(body, i, count)
            if end - i < count:
                names = {2: 'xXX', 4: 'uXXXX', 8: 'UXXXXXXXX'}
                return _DecodeError('unicodeescape', body, start, end,
                                    'truncated \\%s escape' % names[count])
            if count == 8 and int(body[i:end], 16) > 0x10FFFF:
                return _DecodeError('unicodeescape', body, start, end, 'illegal Unicode character')
            i = end
        elif c == b'N':
            # \N{name}: without the braces or a name, the escape ends where that is found missing.
            close = body.find(b'}', i + 1) if body[i:i + 1] == b'{' else i
            if close <= i + 1:
                end = n if close < 0 else close
                return _DecodeError('unicodeescape', body, start, end, 'malformed \\N character escape')
            if not python3 and not _UnicodeNameExists(body[i + 1:close]):
                return _DecodeError('unicodeescape', body, start, close + 1,
                                    'unknown Unicode character name')
            i = close + 1
        i = body.find(b'\\', i)
    return None


def _UnicodeNameExists(name):
    """Whether 2.7's Unicode data (the judge's own) names a character so."""
    import unicodedata
    try:
        unicodedata.lookup(name)
        return True
    except (KeyError, UnicodeDecodeError):
        return False


def _RawUnicodeEscapeError(body):
    """2.7's rawunicodeescape decoder (ur''): an odd run of backslashes before
    u or U starts an escape of four or eight hex digits."""
    n, i = len(body), body.find(b'\\')
    while 0 <= i < n:
        start = i
        while body[i:i + 1] == b'\\':
            i += 1
        c = body[i:i + 1]
        if (i - start) % 2 and c in (b'u', b'U'):
            count = 4 if c == b'u' else 8
            end = _HexRun(body, i + 1, count)
            if end - i - 1 < count:
                return _DecodeError('rawunicodeescape', body, start, end, 'truncated \\uXXXX')
            if count == 8 and int(body[i + 1:end], 16) > 0x10FFFF:
                return _DecodeError('rawunicodeescape', body, start, end, '\\Uxxxxxxxx out of range')
            i = end
        i = body.find(b'\\', i)
    return None


def _BytesEscapeError(body):
    """Python 3's message for a \\x escape of a bytes body without two hex digits."""
    i = body.find(b'\\')
    while 0 <= i < len(body) - 1:
        if body[i + 1:i + 2] == b'x' and _HexRun(body, i + 2, 2) < i + 4:
            return '(value error) invalid \\x escape at position %d' % i
        i = body.find(b'\\', i + 2)
    return None


_kDigits = frozenset(b'0123456789')
_kHexDigits = frozenset(b'0123456789abcdefABCDEF')
_kOctDigits = frozenset(b'01234567')
_kBinDigits = frozenset(b'01')
# Messages of 3.8's number lexer; the older ones say 'invalid token' for each.
_kLeadingZeros = ('leading zeros in decimal integer literals are not permitted; '
                  'use an 0o prefix for octal integers')


def _NumberEnd(version, text):
    """Where the version's lexer ends the number that `text` (a NUMBER token and
    what follows it on its line) begins with: (end, None), or (None, message)
    when the lexer rejects it."""
    py3, underscores = version != '2.7', version not in ('2.7', '3.5')
    new_messages = version >= '3.8'
    n = len(text)

    def At(i):
        return text[i:i + 1]

    def Fail(message):
        return None, message if new_messages else 'invalid token'

    def BadDigit(i, name):
        # 3.8 names a decimal digit that an octal or binary literal cannot hold.
        if new_messages and name in ('octal', 'binary') and i < n and At(i) in _kDigits:
            return Fail("invalid digit '%s' in %s literal" % (At(i), name))
        return Fail('invalid %s literal' % name)

    def Digits(i, digits, name='decimal'):
        # i is at a first digit; returns the end of the digit run, or a failure.
        while True:
            while i < n and At(i) in digits:
                i += 1
            if not (underscores and At(i) == b'_'):
                return i, None
            i += 1
            if not (i < n and At(i) in digits):
                return BadDigit(i, name)

    def Tail(i):
        # After the integer part: a fraction, an exponent, an imaginary suffix.
        if At(i) == b'.':
            i += 1
            if i < n and At(i) in _kDigits:
                i, failed = Digits(i, _kDigits)
                if failed:
                    return None, failed
        if At(i) in (b'e', b'E'):
            j = i + 1
            sign = At(j) in (b'+', b'-')
            if sign:
                j += 1
            if not (j < n and At(j) in _kDigits):
                if sign:
                    return Fail('invalid decimal literal')
                return i, None            # '1e' is the number 1 and the name e
            i, failed = Digits(j, _kDigits)
            if failed:
                return None, failed
        if At(i) in (b'j', b'J'):
            i += 1
        return i, None

    def Long(i):
        return i + 1 if not py3 and At(i) in (b'l', b'L') else i

    if At(0) == b'.':
        return Tail(0)
    if At(0) != b'0':
        i, failed = Digits(0, _kDigits)
        if failed:
            return None, failed
        if not py3 and At(i) in (b'l', b'L'):
            return i + 1, None
        return Tail(i)
    prefix = At(1).lower()
    for letter, digits, name in ((b'x', _kHexDigits, 'hexadecimal'), (b'o', _kOctDigits, 'octal'),
                                 (b'b', _kBinDigits, 'binary')):
        if prefix != letter:
            continue
        i = 2
        if underscores and At(i) == b'_':
            i += 1
        if not (i < n and At(i) in digits):
            return BadDigit(i, name)
        i, failed = Digits(i, digits, name)
        if failed:
            return None, failed
        if new_messages and name != 'hexadecimal' and i < n and At(i) in _kDigits:
            return BadDigit(i, name)
        return Long(i), None
    # A decimal number with a leading zero: zeros only, or a float.
    i = 1
    if py3:
        while True:
            if underscores and At(i) == b'_':
                i += 1
                if not (i < n and At(i) in _kDigits):
                    return Fail('invalid decimal literal')
            if At(i) != b'0':
                break
            i += 1
        nonzero = i < n and At(i) in _kDigits
        if nonzero:
            i, failed = Digits(i, _kDigits)
            if failed:
                return None, failed
    else:
        while i < n and At(i) in _kOctDigits:
            i += 1
        nonzero = i < n and At(i) in _kDigits
        while i < n and At(i) in _kDigits:
            i += 1
    if At(i) in (b'.', b'e', b'E', b'j', b'J'):
        return Tail(i)
    if nonzero:
        return Fail(_kLeadingZeros)
    return Long(i), None


def _NumberError(version, position, text, lines):
    """The message for a number token at position (row, col) of lines (the
    physical lines of its record) that the version's lexer rejects or ends
    early (the rest is then a name the grammar does not take), or None."""
    row, col = position
    end, message = _NumberEnd(version, lines[row][col:])
    if message is None and end < len(text):
        message = 'invalid syntax'
    return message


def _Py3TokenError(text, kind, version):
    if kind == _kString:
        prefix, body = _StringParts(text)
        if b'u' in prefix and b'r' in prefix:
            return 'invalid syntax'
        if version == '3.5' and b'f' in prefix:
            return 'invalid syntax'
        if b'b' in prefix:
            if _kNonAscii.search(body):
                return 'bytes can only contain ASCII literal characters.'
            if b'r' not in prefix and b'\\' in body:
                return _BytesEscapeError(body)
        elif b'r' not in prefix and b'\\' in body:
            return _TextEscapeError(body, True)
    elif text == b'<>':
        return 'invalid syntax'
    return None


def _Py2TokenError(text, kind, version):
    if kind == _kString:
        prefix, body = _StringParts(text)
        if b'f' in prefix or prefix.startswith(b'r') and b'b' in prefix:
            return 'invalid syntax'
        if b'u' in prefix and b'\\' in body:
            return _RawUnicodeEscapeError(body) if b'r' in prefix else _TextEscapeError(body, False)
    return None


# Version -> (cheap test of a line's text, test of one token). The grammars
# see these tokens as plain numbers, strings and the not-equal operator.
# Numbers are checked on lines where one may be malformed: a leading zero
# before a digit, '_' or a prefix; an underscore or a long suffix; an exponent
# without digits. The first digit or '.' of the number (not inside a name or
# another number, but right after a j, which ends a number) leads, which is
# the fastest form for the regular expression engine.
_kNumberHint = (br'[0-9.](?<![A-IK-Za-ik-z_0-9.][0-9.])(?:'
                br'(?<=0)[0-9_xXoObBlL]|'
                br'(?:(?<=\.)[0-9]|(?<=[0-9]))[0-9._]*(?:[eE][+-]?[0-9._]*)?[_lL]|'
                br'(?:(?<=\.)[0-9]|(?<=[0-9]))[0-9.]*[eE][+-]?(?![0-9]))')
_kPy3Hint = _kNumberHint + br'|<>|[uU][rR][\'"]|\\[xuUN]|[\x80-\xff]'
_kTokenChecks = {
    '2.7': (re.compile(_kNumberHint + br'|[fF][rR]?[\'"]|[rR][fFbB][\'"]|[uU][rR]?[\'"][\s\S]*\\[xuUN]'),
            _Py2TokenError),
    '3.5': (re.compile(_kPy3Hint + br'|[fF][rRbB]?[\'"]'), _Py3TokenError),
    '3.6': (re.compile(_kPy3Hint), _Py3TokenError),
    '3.7': (re.compile(_kPy3Hint), _Py3TokenError),
    '3.8': (re.compile(_kPy3Hint), _Py3TokenError),
    '3.9': (re.compile(_kPy3Hint), _Py3TokenError),
    '3.10': (re.compile(_kPy3Hint), _Py3TokenError),
    '3.11': (re.compile(_kPy3Hint), _Py3TokenError),
    '3.12': (re.compile(_kPy3Hint), _Py3TokenError),
    '3.13': (re.compile(_kPy3Hint), _Py3TokenError),
}


def TokenError(version, logical):
    """(token index, message) of the first token the version's lexer or string
    decoding rejects, or None.

    Python 3 rejects long literals (10L), ur'' strings, <>, bytes that are not
    ASCII and escapes its decoders cannot decode; 3.5 also f-strings and
    underscores in numbers; 2.7 rejects those two, rb'' and bad escapes of u''
    strings. Number literals are read as each version's lexer reads them.
    """
    found = None
    hint, check = _kTokenChecks[version]
    if hint.search(logical.fLineText):
        lines = None
        for i in range(logical.fTokenCount):
            kind = _fastaccess.GetLogicalTokenType(logical, i)
            if kind not in _kCheckedKinds:
                continue
            text = logical.GetTokenString(i)
            message = check(text, kind, version)
            if message is None and kind == _kNumber:
                if lines is None:
                    lines = logical.fLineText.splitlines(True)
                message = _NumberError(version, logical.fTokens[i][1], text, lines)
            if message is not None:
                found = i, message
                break
    if version in _kBracketsChecked:
        bracket = _BracketError(logical, found[0] if found else logical.fTokenCount)
        found = bracket or found
    return found


kCommentKind, kBlankKind = 21, 22
_kOpening = (7, 9, 26)   # ( [ {
_kClosing = (8, 10, 27)
# Versions whose lexer matches brackets and says which do not pair.
_kBracketsChecked = ('3.8', '3.9', '3.10', '3.11', '3.12', '3.13')


def _BracketError(logical, end):
    """(token index, message) of the first closing bracket before token `end`
    that does not close the last open one, or None."""
    if not any(c in logical.fLineText for c in b')]}'):
        return None
    stack = []
    for i in range(end):
        code = _fastaccess.GetLogicalTokenType(logical, i)
        if code in _kOpening:
            stack.append(i)
        elif code in _kClosing:
            close = logical.GetTokenString(i)
            if not stack:
                return i, "unmatched '%s'" % close
            j = stack.pop()
            if _kOpening.index(_fastaccess.GetLogicalTokenType(logical, j)) != _kClosing.index(code):
                open_, row = logical.GetTokenString(j), logical.fTokens[j][1][0]
                where = '' if row == logical.fTokens[i][1][0] else ' on line %d' % (logical.fFirstLine + row + 1)
                return i, ("closing parenthesis '%s' does not match opening parenthesis '%s'%s"
                           % (close, open_, where))
    return None


def _LegacyStatementError(version, logical, error):
    """The error with CPython 3's message for a line that uses print or exec as
    a statement: CPython rewrites any syntax error on a line with no '(' that
    starts with 'print ' or 'exec ' (or has it after its first colon)."""
    lines = logical.fLineText.splitlines(True)
    row = (error.lineno or 1) - 1
    line = lines[row] if 0 <= row < len(lines) else b''
    if b'(' in line:
        return error
    message = _LegacyMessage(version, line, 0)
    if message is None and b':' in line:
        message = _LegacyMessage(version, line, line.index(b':') + 1)
    if message is None:
        return error
    rewritten = SyntaxError(message, (error.filename, error.lineno, error.offset, error.text))
    if hasattr(error, 'column'):
        rewritten.column = error.column
    return rewritten


def _LegacyMessage(version, line, start):
    rest = line[start:].lstrip(b' \t\r\n\x0b\x0c')
    if rest.startswith(b'print '):
        if version == '3.5':
            return "Missing parentheses in call to 'print'"
        data = rest[6:].strip(b' \t\r\n')
        return ("Missing parentheses in call to 'print'. Did you mean print(%s%s)?"
                % (data, ' end=" "' if data.endswith(b',') else ''))
    if rest.startswith(b'exec '):
        return "Missing parentheses in call to 'exec'"
    return None


def _LexedFirst(logical, found, error):
    """Whether CPython reports the lexer's error found = (token index, message)
    before the analyzer's error: the lexer's come while parsing, so before the
    errors of the checks after parsing and before a parse error further on;
    a bad escape in a string comes once the line has parsed.
    """
    row, col = logical.fTokens[found[0]][1]
    if hasattr(error, 'column'):          # an error of the checks after parsing
        # but for '<>' under 3.x, which they place past the token as CPython does
        return error.msg != 'invalid syntax' or (row + 1, col + 1) < (error.lineno, error.column - 1)
    if found[1].startswith(_kDecodingMessages):
        return False
    return (row + 1, col + 1) <= (error.lineno, error.offset)


class VersionAnalyzer(object):
    """Analyzes the logical lines of modules in one language version."""

    def __init__(self, version, checks=True):
        if version not in kGrammars:
            raise ValueError('unknown version %r (expected one of %s)'
                             % (version, ', '.join(kVersions)))
        self.version = version
        self.checks = bool(checks)
        self._triple, self._grammar, self._py3 = kGrammars[version]
        self._impls = {}
        # The native analyzers hold the state of one line at a time.
        self._lock = threading.RLock()

    def Impl(self, print_function=False):
        """The treelens analyzer (CPGenAnalyzerImpl); print_function picks the 2.7 variant."""
        key = bool(print_function) and not self._py3
        impl = self._impls.get(key)
        if impl is None:
            from pysource import treelens
            if self._py3:
                grammar, keywords = self._grammar, list(kKeywords[self.version])
            elif key:
                import keyword
                grammar = kPrintFunctionGrammar
                keywords = [k for k in keyword.kwlist if k != 'print']
            else:
                grammar, keywords = self._grammar, None
            impl = treelens.CPGenAnalyzerImpl(self._triple, grammar, keywords, self._py3,
                                              kHintGrammar, self.checks)
            impl = self._impls.setdefault(key, impl)
        return impl

    def ImplFor(self, logicals):
        """The treelens analyzer for the logical lines of one module."""
        return self.Impl(not self._py3 and UsesPrintFunction(logicals))

    def AnalyzeLogical(self, impl, logical):
        """Analyzes one record (again, if it was already); returns None or a SyntaxError.

        Raises AnalysisFailure when the analyzer failed unexpectedly.
        """
        if logical.fInspected:
            logical.fInspected = False
        # From 3.7 on async and await are keywords everywhere: no scope to look up.
        in_async_def = self._py3 and self._triple < (3, 7) and utils.InAsyncDef(logical)
        with self._lock:
            failures = impl.fFailures
            error = impl.AnalyzeSingleLogical(logical, in_async_def)
            if error is None and impl.fFailures != failures:
                raise AnalysisFailure('analysis failed on line %d: %s'
                                      % (logical.fFirstLine + 1, impl.fLastFailure))
        if error is None or self.checks:
            found = TokenError(self.version, logical)
            if found is not None and (error is None or _LexedFirst(logical, found, error)):
                from pysource import treelens
                _fastaccess.ClearLogicalDerivedInfo(logical)
                error = treelens.CreateSyntaxError(found[1], logical, found[0])
                if found[1].startswith(_kDecodingMessages):
                    # Found once the line has parsed: CPython gives the string's
                    # offset as for the checks after parsing.
                    error.column = error.offset
                    error.offset = (None if not self._py3 else
                                    error.offset - 1 if self._triple < (3, 8) else error.offset)
        if error is not None and self.checks and self._py3:
            error = _LegacyStatementError(self.version, logical, error)
        return error

    def Analyze(self, logicals, stop_at_error=False, impl=None):
        """The result of each record: None or a SyntaxError.

        With stop_at_error the list ends at the first error.
        """
        impl = impl or self.ImplFor(logicals)
        errors = []
        for logical in logicals:
            error = self.AnalyzeLogical(impl, logical)
            errors.append(error)
            if error is not None and stop_at_error:
                break
        if self.checks and errors and errors[-1] is not None:
            self._EndOfFile(logicals, errors)
        return errors

    def _EndOfFile(self, logicals, errors):
        """CPython's message for a file that ends inside brackets.

        The last line with tokens failed at its end with brackets open: the
        language's tokenizer reached the end of the file there. (CPython 2
        only says so when the file is that one physical line.)
        """
        last = len(logicals) - 1
        while last >= 0 and logicals[last].fKind in (kCommentKind, kBlankKind):
            last -= 1
        if not 0 <= last < len(errors) or errors[last] is None or errors[last].msg != 'invalid syntax':
            return
        logical, error = logicals[last], errors[last]
        (text, (row, col)) = logical.fTokens[-1]
        if (error.lineno, error.offset) != (row + 1, col + len(text) + 1):
            return
        if not self._py3 and (logical.fFirstLine != 0 or row != 0 or last != len(logicals) - 1
                              or logical.fLineText.count(b'\n') > 1):
            return
        depth = 0
        for i in range(logical.fTokenCount):
            code = _fastaccess.GetLogicalTokenType(logical, i)
            if code in _kOpening:
                depth += 1
            elif code in _kClosing and depth:
                depth -= 1
        if depth:
            from pysource import treelens
            errors[last] = treelens.CreateSyntaxError('unexpected EOF while parsing', logical,
                                                      logical.fTokenCount)


_gAnalyzers = {}


def GetAnalyzer(version, checks=True):
    """The VersionAnalyzer of a version (one of kVersions), made once per process.

    With checks (the default) lines the grammar accepts are also checked as
    CPython checks them after parsing (assignment targets, call arguments,
    parameters, statements outside their block); without, only the grammar
    and the lexical checks judge a line.
    """
    key = (version, bool(checks))
    analyzer = _gAnalyzers.get(key)
    if analyzer is None:
        analyzer = _gAnalyzers[key] = VersionAnalyzer(version, checks)
    return analyzer


def _AnalyzeAuto(logicals, checks, text=None, path=None):
    """(version, errors) for 'auto': the newest version with no syntax error,
    else the one with the fewest lines in error, the newest on a tie."""
    failed = None
    for version in kAutoOrder:
        analyzer = GetAnalyzer(version, checks)
        impl = analyzer.ImplFor(logicals)
        # The line that stopped the newer version usually stops this one too.
        if failed is not None and analyzer.AnalyzeLogical(impl, failed) is not None:
            continue
        errors = analyzer.Analyze(logicals, True, impl)
        if errors and errors[-1] is not None:
            failed = logicals[len(errors) - 1]
            continue
        filechecks.Check(version, logicals, errors, text, path, checks)
        if any(e is not None for e in errors):
            continue
        return version, errors
    # Every version fails: count the lines in error, each version stopping
    # once it cannot do better than the best so far; the whole file's checks
    # count for the versions that get that far.
    best, fewest = None, len(logicals) + 1
    for version in kAutoOrder:
        analyzer = GetAnalyzer(version, checks)
        impl = analyzer.ImplFor(logicals)
        count = 0
        for logical in logicals:
            if analyzer.AnalyzeLogical(impl, logical) is not None:
                count += 1
                if count >= fewest:
                    break
        if count < fewest:
            errors = analyzer.Analyze(logicals, False, impl)
            filechecks.Check(version, logicals, errors, text, path, checks)
            count = sum(1 for e in errors if e is not None)
            if count < fewest:
                best, fewest = version, count
    # The records keep what the last analysis recorded: analyze them again.
    errors = GetAnalyzer(best, checks).Analyze(logicals)
    filechecks.Check(best, logicals, errors, text, path, checks)
    return best, errors


class FileAnalysis(object):
    """The analysis of one source text.

    path: as given (bytes or str); version: the version used, None when
    nothing was analyzed; logicals: the records; errors: None or a
    SyntaxError per record, located in the file as CPython locates it
    (filename the path, lineno the file's line, offset CPython's, text the
    physical line); status: one of kOk, kSyntaxError, kUnreadable, kSkipped,
    kFailed; problem: why a file was not (wholly) analyzed (kUnreadable,
    kSkipped, kFailed).
    """

    __slots__ = ('path', 'version', 'logicals', 'errors', 'status', 'problem')

    def __init__(self, path, version=None, logicals=(), errors=(), status=kOk, problem=None):
        self.path = path
        self.version = version
        self.logicals = list(logicals)
        self.errors = list(errors)
        self.status = status
        self.problem = problem

    def Lines(self):
        """The plain-data view (LineView) of every logical line, in order."""
        return [LineView(l, e) for l, e in zip(self.logicals, self.errors)]

    def SyntaxErrors(self):
        """(line, column, message) of every syntax error, 1-based, in order."""
        return [ErrorLocation(l, e) for l, e in zip(self.logicals, self.errors) if e is not None]

    def __repr__(self):
        return '<FileAnalysis %s %s %s, %d lines>' % (self.path, self.version, self.status,
                                                      len(self.logicals))


def ErrorLocation(logical, error):
    """(line, column, message) of a record's SyntaxError: the line in the file, 1-based,
    and the byte column in that line, 1-based."""
    if getattr(error, 'in_file', False):
        return error.lineno, error.column, error.msg
    row = error.lineno or 1
    # The syntax checks give CPython's offset (0-based or None) and the
    # 1-based column apart.
    column = getattr(error, 'column', None) or error.offset or 1
    return logical.fFirstLine + row, column, error.msg


def _PhysicalLine(logical, line):
    """The physical line `line` (1-based, in the file) of a record, line end included."""
    lines = logical.fLineText.splitlines(True)
    row = line - logical.fFirstLine - 1
    return lines[row] if 0 <= row < len(lines) else b''


def CharColumn(text, column):
    """The 1-based column in characters, as CPython 3 counts, of the 1-based
    byte column in a physical line (UTF-8; a byte that is not counts one)."""
    head = text[:column - 1]
    return len(head.decode('utf-8', 'replace')) + (column - 1 - len(head)) + 1


def ErrorPosition(logical, error):
    """(line, column, byte column, message) of a record's SyntaxError: column
    counts characters as CPython 3 does, byte column bytes; both 1-based."""
    line, column, message = ErrorLocation(logical, error)
    return line, CharColumn(_PhysicalLine(logical, line), column), column, message


def _InFile(path, logical, error, py3):
    """The error located in the file: lineno the file's line, filename the
    path, text the physical line and offset as CPython's (characters under
    Python 3, bytes under 2; the checks after parsing already give CPython's)."""
    line, column, message = ErrorLocation(logical, error)
    text = _PhysicalLine(logical, line)
    offset = error.offset
    if not hasattr(error, 'column') and py3:
        offset = CharColumn(text, column)
    filename = '<string>' if path is None else path
    # IndentationError and TabError stay what they are.
    located = type(error)(message, (filename, line, offset, text))
    located.column = column
    located.in_file = True
    return located


kNoDerivedInfo = ((), (), (), (), ())


def KindName(kind):
    """The name of a record's kind code ('stmt', 'def', ...; 'kindN' for others)."""
    return kKindNames.get(kind) or 'kind%d' % kind


def SplitReads(type_equivs):
    """(names read, other pairs) of a record's (name, info) type equivalences."""
    get = symbolinfo.kGetPrefix
    reads = [name for name, info in type_equivs if info == get]
    if not reads:
        return reads, list(type_equivs)
    return reads, [pair for pair in type_equivs if pair[1] != get]


def LineView(logical, error=None):
    """Plain data of one analyzed record (error: what the analyzer returned for it).

    A dict: line (first line, 1-based), kind ('stmt', 'class', 'def', 'try',
    'comment', 'blank'), text (the whole physical lines, line ends included),
    defines (names defined, a def or class line's name first), reads (names
    read), defines_at and reads_at (the (line, column) of each, 1-based, or
    None), equivs ((name, info) type
    equivalences other than reads), args (argument names), arg_equivs ((name,
    info) pairs of the arguments), bases (base-class texts), error (None, or
    a dict of message, line, column and byte_column, 1-based; column counts
    characters as CPython 3 does), truncated (whether the walk stopped at its
    limits, so that only what it recorded before is there). Texts are bytes.
    """
    info = logical.GetDerivedInfo() or kNoDerivedInfo
    names, type_equivs, args, arg_equivs, bases = info
    reads, equivs = SplitReads(type_equivs)
    defines, defines_at, reads_at = list(names), [None] * len(names), [None] * len(reads)
    if error is None:
        from pysource import resolver
        defines, defines_at, reads_at = resolver.LineNames(logical, names, reads)
    view = {
        'line': logical.fFirstLine + 1,
        'kind': KindName(logical.fKind),
        'text': logical.fLineText,
        'defines': defines,
        'defines_at': defines_at,
        'reads': reads,
        'reads_at': reads_at,
        'equivs': equivs,
        'args': list(args),
        'arg_equivs': list(arg_equivs),
        'bases': list(bases),
        'error': None,
        'truncated': bool(getattr(logical, 'fTruncated', False)),
    }
    if error is not None:
        line, column, byte_column, message = ErrorPosition(logical, error)
        view['error'] = {'message': message, 'line': line, 'column': column,
                         'byte_column': byte_column}
    return view


def AnalyzeText(text, version=kAuto, path=None, checks=True):
    """Splits and analyzes a source text (bytes; unicode is encoded as UTF-8).

    Returns a FileAnalysis. A text with a NUL byte is not Python source: it is
    not analyzed and its status is kUnreadable. checks: as for GetAnalyzer.
    path names the text in its syntax errors ('<string>' when None). Raises
    AnalysisFailure when the analyzer fails unexpectedly.
    """
    if isinstance(text, unicode):
        text = text.encode('utf-8')
    nul = text.find(b'\0')
    if nul >= 0:
        line = text.count(b'\n', 0, nul) + 1
        column = nul - (text.rfind(b'\n', 0, nul) + 1) + 1
        return FileAnalysis(path, status=kUnreadable,
                            problem='not Python source: NUL byte at line %d, column %d'
                            % (line, column))
    logicals = utils.GetLogicalsFromText(text)
    if version == kAuto:
        version, errors = _AnalyzeAuto(logicals, checks, text, path)
    else:
        errors = GetAnalyzer(version, checks).Analyze(logicals)
        filechecks.Check(version, logicals, errors, text, path, checks)
    failed = any(e is not None for e in errors)
    if failed:
        py3 = kGrammars[version][2]
        errors = [e if e is None else _InFile(path, l, e, py3) for l, e in zip(logicals, errors)]
    return FileAnalysis(path, version, logicals, errors, kSyntaxError if failed else kOk)


_kFileKinds = ((stat.S_ISDIR, 'Is a directory'), (stat.S_ISFIFO, 'a FIFO'),
               (stat.S_ISCHR, 'a character device'), (stat.S_ISBLK, 'a block device'),
               (stat.S_ISSOCK, 'a socket'))


def _TooLarge(size):
    return 'too large: %d bytes or more (the limit is %d bytes)' % (size, kMaxSourceBytes)


def ReadBounded(stream, limit=None):
    """(bytes, None) or (None, why not) for a stream read to its end, at most
    limit bytes (kMaxSourceBytes by default)."""
    limit = kMaxSourceBytes if limit is None else limit
    data = stream.read(limit + 1)
    if len(data) > limit:
        return None, _TooLarge(len(data))
    return data, None


def ReadSource(path):
    """(bytes, None) or (None, why the file cannot be read).

    Only a regular file of at most kMaxSourceBytes is read; a FIFO, a device
    or a socket is not, and opening one never blocks.
    """
    try:
        fd = os.open(path, os.O_RDONLY | getattr(os, 'O_NONBLOCK', 0) | getattr(os, 'O_NOCTTY', 0))
    except (IOError, OSError) as e:
        return None, 'cannot read: %s' % (e.strerror or e)
    try:
        st = os.fstat(fd)
        if not stat.S_ISREG(st.st_mode):
            kind = [name for test, name in _kFileKinds if test(st.st_mode)]
            if kind == ['Is a directory']:
                return None, 'cannot read: Is a directory'
            return None, 'cannot read: not a regular file (%s)' % (kind[0] if kind else 'special')
        if st.st_size > kMaxSourceBytes:
            return None, _TooLarge(st.st_size)
        with os.fdopen(os.dup(fd), 'rb') as f:
            return ReadBounded(f)    # the file may have grown since
    except (IOError, OSError) as e:
        return None, 'cannot read: %s' % (e.strerror or e)
    except MemoryError:
        return None, 'cannot read: out of memory'
    finally:
        os.close(fd)


def AnalyzeFile(path, version=kAuto, checks=True):
    """Reads and analyzes one file; never raises for I/O errors (status
    kUnreadable) nor for an analyzer failure (status kFailed)."""
    text, problem = ReadSource(path)
    if problem is not None:
        return FileAnalysis(path, status=kUnreadable, problem=problem)
    try:
        return AnalyzeText(text, version, path, checks)
    except AnalysisFailure as e:
        return FileAnalysis(path, status=kFailed, problem=str(e))


def IterSourcePaths(paths, follow_links=False, roots=None):
    """Yields (path, status, problem) for the files and folders named by paths.

    A folder is searched for .py and .pyi files, each folder's entries in
    sorted order, depth first, hidden ones (.git, .tox) skipped. Symlinks are
    followed when they lead into one of the folders named by paths (or by
    roots when given; anywhere with follow_links); one that leads elsewhere
    is yielded with kSkipped. A folder met again (through a symlink loop or a second path to
    it) is not searched twice: a loop is yielded with status kSkipped. A
    folder that cannot be listed is yielded with kUnreadable. Files named
    directly are yielded whatever their suffix, with status kOk (reading them
    is the caller's task). Names need not decode: a unicode folder is
    searched as bytes, and a found path that does not decode with the file
    system's encoding is yielded as bytes.
    """
    seen = set()
    if roots is None:
        roots = [p for p in paths if os.path.isdir(p)]
    roots = [os.path.realpath(_FsBytes(p)) for p in roots]
    for path in paths:
        if os.path.isdir(path):
            for item in _WalkFolder(path, seen, None if follow_links else roots):
                yield item
        else:
            yield path, kOk, None


def _FsEncoding():
    return sys.getfilesystemencoding() or 'utf-8'


def _FsBytes(path):
    if not isinstance(path, unicode):
        return path
    try:
        return path.encode(_FsEncoding())
    except UnicodeError:
        return path.encode('utf-8')


def _FsText(path):
    try:
        return path.decode(_FsEncoding())
    except UnicodeError:
        return path


def _Within(path, roots):
    for root in roots:
        if path == root or path.startswith(root.rstrip(os.sep) + os.sep):
            return True
    return False


def _WalkFolder(top, seen, roots):
    """The walk of IterSourcePaths under one folder, without recursion (a tree
    may be deeper than the interpreter's stack); roots None follows every link."""
    as_text = isinstance(top, unicode)
    stack = []      # (folder, its names still to visit, last first, (device, inode))

    def Enter(folder):
        try:
            st = os.stat(folder)
            names = sorted(os.listdir(folder), reverse=True)
        except (OSError, IOError) as e:
            return folder, kUnreadable, 'cannot list folder: %s' % (e.strerror or e)
        key = (st.st_dev, st.st_ino)
        if key in seen:
            if any(key == k for _, _, k in stack):
                return folder, kSkipped, 'symlink loop: folder already being searched, not followed'
            return None
        seen.add(key)
        stack.append((folder, names, key))
        return None

    def Out(item):
        return (_FsText(item[0]),) + item[1:] if as_text else item

    item = Enter(_FsBytes(top))
    if item is not None:
        yield Out(item)
    while stack:
        folder, names = stack[-1][:2]
        if not names:
            stack.pop()
            continue
        name = names.pop()
        if name.startswith(b'.'):
            continue
        path = os.path.join(folder, name)
        source = name.endswith(kSourceSuffixes)
        if roots is not None and os.path.islink(path) and not _Within(os.path.realpath(path), roots):
            if source or os.path.isdir(path):
                yield Out((path, kSkipped, 'symlink to outside the folders searched, not followed'))
            continue
        if os.path.isdir(path):
            item = Enter(path)
            if item is not None:
                yield Out(item)
        elif source:
            yield Out((path, kOk, None))    # also a dangling link: reading it reports the problem


def AnalyzeFolder(path, version=kAuto, checks=True, follow_links=False):
    """Yields the FileAnalysis of every source file under a folder (or of a file), in order.

    Unreadable files and folders, symlinks not followed and symlink loops are
    yielded too, with their status and problem; nothing stops the search.
    follow_links: as for IterSourcePaths.
    """
    for found, status, problem in IterSourcePaths([path], follow_links):
        if problem is not None:
            yield FileAnalysis(found, status=status, problem=problem)
        else:
            yield AnalyzeFile(found, version, checks)


def WorstStatus(statuses):
    """The worst of some statuses (kOk for none)."""
    worst = kOk
    for status in statuses:
        if kStatusRank[status] > kStatusRank[worst]:
            worst = status
    return worst
