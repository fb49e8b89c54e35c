"""Syntax errors that only the whole file shows.

Each logical line is parsed and checked on its own; what CPython finds by
reading the file as a whole is checked here, over the records of one file:

- the source encoding: an unknown coding cookie, a byte-order mark with a
  cookie of another encoding, bytes the file's encoding does not decode
  (Python 3 reads a file without a cookie as UTF-8, Python 2 as ASCII);
- indentation, as CPython's tokenizer tracks it: "unexpected indent",
  "unindent does not match any outer indentation level", "expected an
  indented block", and under Python 3 the TabError of tabs and spaces that
  give different indentation at tab sizes 8 and 1;
- characters that cannot be in an identifier;
- a decorator that no def or class follows (at the end of the file too), and
  a block header that ends the file;
- with the checks after parsing: `from __future__` imports after other
  statements, `break` and `continue` with no loop around them in the file.

CPython stops at the first error of a file; here each record gets at most one
error, the one CPython would report first for that line: the file's encoding
and the tokenizer's errors before the line's own, a decorator's follower
before its parse error, and the compiler's errors only on lines with none.
"""

import codecs
import re
import unicodedata

from pysource import _fastaccess

kCommentKind, kBlankKind = 21, 22
_kName, _kString, _kComment, _kContinuation = 1, 3, 202, 203

_kCookie = re.compile(br'^[ \t\f]*#.*?coding[:=][ \t]*([-\w.]+)')
_kCommentOrBlank = re.compile(br'^[ \t\f]*(?:#.*)?(?:\r\n|\r|\n)?\Z')
_kBom = b'\xef\xbb\xbf'
_kNonAscii = re.compile(br'[\x80-\xff]')
_kPep263 = 'see http://python.org/dev/peps/pep-0263/ for details'

kFutureLate = 'from __future__ imports must occur at the beginning of the file'
kEof = 'unexpected EOF while parsing'

# Error ranks: an earlier phase of CPython wins on a line.
_kEncoding, _kIndent, _kLexer, _kParse, _kCompile = range(5)


class _Found(object):
    """The errors found so far, one per record, with their rank."""

    def __init__(self, logicals, errors):
        self.logicals = logicals
        self.errors = errors
        self.ranks = {}

    def Add(self, rank, index, error, before=None):
        """Gives record `index` the error unless it has one of an earlier phase.

        An error the analyzer found stays when rank is _kCompile; a lexer
        error replaces it only when it lies before it (`before`: (row, col)).
        """
        old = self.ranks.get(index)
        if old is not None and old <= rank:
            return
        current = self.errors[index]
        if old is None and current is not None:
            # The parser's and lexer's own errors on the line come first,
            # but for a lexer error further left.
            if rank == _kCompile:
                return
            if rank == _kParse and not _AfterParsing(current) and (before is None
                                                                   or _Where(current) <= before):
                return
            if rank == _kLexer and before is not None and _Where(current) < before:
                return
        self.ranks[index] = rank
        self.errors[index] = error
        _fastaccess.ClearLogicalDerivedInfo(self.logicals[index])


def _AfterParsing(error):
    """Whether an analyzer's error is one of the checks after parsing (they carry a column)."""
    return hasattr(error, 'column')


def _Where(error):
    return (error.lineno or 1, getattr(error, 'column', None) or error.offset or 1)


def MakeError(logical, message, row, col, offset, cls=SyntaxError):
    """A SyntaxError (or subclass) at row (0-based, in the record) and byte
    column col (0-based) of a record; offset is CPython's."""
    lines = logical.fLineText.splitlines(True)
    text = lines[row] if 0 <= row < len(lines) else None
    error = cls(message, ('<string>', row + 1, offset, text))
    error.column = col + 1
    return error


def Check(version, logicals, errors, text, path=None, checks=True):
    """Sets errors[i] (None or a SyntaxError per record) where the file shows
    one; the records given an error lose their derived info, as a record
    with a syntax error does."""
    if not logicals:
        return
    found = _Found(logicals, errors)
    py3 = version != '2.7'
    encoding = _Encoding(version, logicals, text, path, found)
    statements = [i for i, l in enumerate(logicals) if l.fKind not in (kCommentKind, kBlankKind)]
    _Indentation(py3, logicals, statements, found)
    _Identifiers(py3, logicals, encoding, found)
    _Decorators(py3, logicals, statements, found)
    if checks:
        _FutureImports(version, logicals, statements, found)
        _Loops(version, logicals, statements, errors, found)
        # Two more passes over the statements only for a text that may need them.
        if _Triple(version) >= (3, 10) and (text is None or _kCaseLine.search(text) and _kMatchLine.search(text)):
            _MatchCases(version, logicals, statements, errors, found)
        if _Triple(version) >= (3, 11) and (text is None or _kExceptStar.search(text)):
            _ExceptStars(logicals, statements, errors, found)


# ---- encoding

def _NormalName(name):
    """CPython's tokenizer's normal name of a cookie's encoding."""
    low = name[:12].lower().replace(b'_', b'-')
    if low == b'utf-8' or low.startswith(b'utf-8-'):
        return b'utf-8'
    for latin in (b'latin-1', b'iso-8859-1', b'iso-latin-1'):
        if low == latin or low.startswith(latin + b'-'):
            return b'iso-8859-1'
    return name


def _Cookie(text):
    """(line index 0 or 1, encoding name as written) of a coding cookie, or None."""
    lines = text.split(b'\n', 2)
    m = _kCookie.match(lines[0])
    if m:
        return 0, m.group(1)
    if len(lines) > 1 and _kCommentOrBlank.match(lines[0] + b'\n'):
        m = _kCookie.match(lines[1])
        if m:
            return 1, m.group(1)
    return None


class _Lines(object):
    """Maps physical lines and text offsets of the file to records."""

    def __init__(self, logicals, start):
        self.logicals = logicals
        self.starts = []
        pos = start
        for logical in logicals:
            self.starts.append(pos)
            pos += len(logical.fLineText)

    def AtLine(self, line):
        """Index of the record that holds physical line `line` (0-based)."""
        best = 0
        for i, logical in enumerate(self.logicals):
            if logical.fFirstLine > line:
                break
            best = i
        return best

    def AtOffset(self, offset):
        import bisect
        return max(0, bisect.bisect_right(self.starts, offset) - 1)


def _Encoding(version, logicals, text, path, found):
    """The file's encoding (normal name) when it decodes, else None; reports the errors."""
    if text is None:
        return b'utf-8'
    bom = text.startswith(_kBom)
    body = text[len(_kBom):] if bom else text
    cookie = _Cookie(body)
    lines = _Lines(logicals, len(_kBom) if bom else 0)
    if cookie is not None:
        row, name = cookie
        index = lines.AtLine(row)
        logical = logicals[index]
        where = row - logical.fFirstLine
        normal = _NormalName(name)
        try:
            codecs.lookup(normal.decode('latin-1'))
        except LookupError:
            found.Add(_kEncoding, index, MakeError(logical, 'unknown encoding: %s' % name,
                                                   where, 0, 0))
            return None
        if bom and normal != b'utf-8':
            found.Add(_kEncoding, index, MakeError(logical, 'encoding problem: %s with BOM' % normal,
                                                   where, 0, 0))
            return None
        if normal == b'utf-8':
            return normal
        try:
            text.decode(normal.decode('latin-1'))
        except UnicodeDecodeError as e:
            index = lines.AtOffset(e.start)
            message = str(e).replace("'utf8' codec", "'utf-8' codec")
            found.Add(_kEncoding, index, MakeError(logicals[index], message, 0, 0, 0))
            return None
        except Exception:       # a codec that fails otherwise: read as written
            return normal
        return normal
    if bom or not _kNonAscii.search(body):
        return b'utf-8'
    py3 = version != '2.7'
    bad = _FirstBadByte(body, py3)
    if bad is None:
        return b'utf-8'
    index = lines.AtOffset(bad + (len(_kBom) if bom else 0))
    logical = logicals[index]
    line = body.count(b'\n', 0, bad) + 1
    name = path if path is not None else '<string>'
    if isinstance(name, unicode):
        name = name.encode('utf-8', 'replace')
    if py3:
        message = ("Non-UTF-8 code starting with '\\x%02x' in file %s on line %d, "
                   "but no encoding declared; %s" % (ord(body[bad]), name, line, _kPep263))
    else:
        message = ("Non-ASCII character '\\x%02x' in file %s on line %d, "
                   "but no encoding declared; %s" % (ord(body[bad]), name, line, _kPep263))
    row = line - 1 - logical.fFirstLine
    found.Add(_kEncoding, index, MakeError(logical, message, row, 0, None))
    return None


def _FirstBadByte(body, py3):
    """Offset of the first byte that is not ASCII (Python 2) or not UTF-8 (Python 3)."""
    if not py3:
        return _kNonAscii.search(body).start()
    try:
        body.decode('utf-8')
        return None
    except UnicodeDecodeError as e:
        return e.start


# ---- indentation

def _IndentColumns(line):
    """(columns at tab size 8, columns at tab size 1, bytes) of a line's indentation."""
    col = alt = 0
    n = 0
    for c in line:
        if c == b' ':
            col += 1
            alt += 1
        elif c == b'\t':
            col = (col // 8 + 1) * 8
            alt += 1
        elif c == b'\x0c':
            col = alt = 0
        else:
            break
        n += 1
    return col, alt, n


def _SignificantTokens(logical):
    """Indexes of the tokens other than comments and line-continuation backslashes."""
    return [i for i in range(logical.fTokenCount)
            if _fastaccess.GetLogicalTokenType(logical, i) not in (_kComment, _kContinuation)]


def _IsHeader(logical):
    """Whether a record is a block header whose body is on the lines after it."""
    for i in range(logical.fTokenCount - 1, -1, -1):
        code = _fastaccess.GetLogicalTokenType(logical, i)
        if code in (_kComment, _kContinuation):
            continue
        return logical.GetTokenString(i) == b':'
    return False


def _FirstLine(logical):
    return logical.fLineText.splitlines(True)[0] if logical.fLineText else b''


def _EndOfFile(py3, logicals, index, comment_message, found):
    """The error of a header or decorator that ends the file (comments aside)."""
    last = len(logicals) - 1
    while last > index and logicals[last].fKind == kBlankKind:
        last -= 1
    logical = logicals[last]
    if last == index:
        text, (row, col) = logical.fTokens[-1]
        end = col + len(text)
        message, cls = kEof, SyntaxError
        if not py3 and sum(l.fLineText.count(b'\n') for l in logicals) > 1:
            # CPython 2 says so only for a one-line file.
            message, cls = comment_message
        found.Add(_kParse, index, MakeError(logical, message, row, end, end + 1, cls),
                  (row + 1, end + 1))
        return
    # CPython reaches the end of the file past the comments after it.
    comment = logical.GetTokenString(0) if logical.fTokenCount else b''
    col = len(logical.fLineText) - len(logical.fLineText.lstrip(b' \t\x0c')) + len(comment.rstrip(b'\r\n'))
    message, cls = (kEof, SyntaxError) if py3 else comment_message
    found.Add(_kParse, last, MakeError(logical, message, 0, col, col + 1, cls))


def _Indentation(py3, logicals, statements, found):
    stack = [(0, 0)]
    header = None
    for index in statements:
        logical = logicals[index]
        line = _FirstLine(logical)
        col, alt, n = _IndentColumns(line)
        error = None
        if header is not None and col <= stack[-1][0]:
            first = _SignificantTokens(logical)
            c = logical.fTokens[first[0]][1][1] if first else n
            error = MakeError(logical, 'expected an indented block', 0, c, c + 1, IndentationError)
        if col == stack[-1][0]:
            if py3 and alt != stack[-1][1]:
                error = error or _TabError(logical, line)
        elif col > stack[-1][0]:
            if header is None:
                error = MakeError(logical, 'unexpected indent', 0, max(n - 1, 0), n, IndentationError)
            elif py3 and alt <= stack[-1][1]:
                error = _TabError(logical, line)
            stack.append((col, alt))
        else:
            while len(stack) > 1 and col < stack[-1][0]:
                stack.pop()
            if col != stack[-1][0]:
                length = len(line.rstrip(b'\r\n')) + 1
                error = MakeError(logical, 'unindent does not match any outer indentation level',
                                  0, length - 1, length, IndentationError)
                stack.append((col, alt))
            elif py3 and alt != stack[-1][1]:
                error = _TabError(logical, line)
        if error is not None:
            found.Add(_kIndent, index, error)
        header = index if _IsHeader(logical) else None
    if header is not None:
        _EndOfFile(py3, logicals, header, ('expected an indented block', IndentationError), found)


def _TabError(logical, line):
    length = len(line.rstrip(b'\r\n')) + 1
    return MakeError(logical, 'inconsistent use of tabs and spaces in indentation', 0, length - 1,
                     length, TabError)


# ---- identifiers

_kIdStart = frozenset(('Lu', 'Ll', 'Lt', 'Lm', 'Lo', 'Nl'))
_kIdContinue = _kIdStart | frozenset(('Mn', 'Mc', 'Nd', 'Pc'))
_kOtherStart = frozenset(u'\u2118\u212e\u309b\u309c')
_kOtherContinue = frozenset(u'\u00b7\u0387\u1369\u136a\u136b\u136c\u136d\u136e\u136f\u1370'
                            u'\u1371\u19da')


def _IdentifierChar(c, first):
    if c == u'_' or c in _kOtherStart:
        return True
    category = unicodedata.category(c)
    # Characters this interpreter's Unicode tables do not know may be letters
    # of a newer standard: never reject them.
    if category == 'Cn':
        return True
    if first:
        return category in _kIdStart
    return category in _kIdContinue or c in _kOtherContinue


def _BadIdentifier(name, encoding):
    """Whether a NAME token's text is not a valid Python 3 identifier."""
    try:
        chars = name.decode(encoding.decode('latin-1'))
    except (UnicodeDecodeError, LookupError):
        return False       # the encoding check reports it
    return not all(_IdentifierChar(c, i == 0) for i, c in enumerate(chars))


def _Identifiers(py3, logicals, encoding, found):
    if encoding is None:
        return
    for index, logical in enumerate(logicals):
        if logical.fKind in (kCommentKind, kBlankKind) or not _kNonAscii.search(logical.fLineText):
            continue
        for i, (name, (row, col)) in enumerate(logical.fTokens):
            if _fastaccess.GetLogicalTokenType(logical, i) != _kName or not _kNonAscii.search(name):
                continue
            if not py3:
                c = col + _kNonAscii.search(name).start()
                found.Add(_kLexer, index, MakeError(logical, 'invalid syntax', row, c, c + 1),
                          (row + 1, c + 1))
                break
            if not _BadIdentifier(name, encoding):
                continue
            # CPython 3 places the error at the token's last character.
            last = len(name) - 1
            while last > 0 and 0x80 <= ord(name[last]) < 0xc0:
                last -= 1
            line = logical.fLineText.splitlines(True)[row]
            chars = len(line[:col + len(name)].decode('utf-8', 'replace'))
            found.Add(_kLexer, index,
                      MakeError(logical, 'invalid character in identifier', row, col + last, chars),
                      (row + 1, col + 1))
            break


# ---- decorators

def _Decorators(py3, logicals, statements, found):
    for k, index in enumerate(statements):
        logical = logicals[index]
        first = _SignificantTokens(logical)
        if not first or logical.GetTokenString(first[0]) != b'@':
            continue
        if k + 1 == len(statements):
            _EndOfFile(py3, logicals, index, ('invalid syntax', SyntaxError), found)
            continue
        after = logicals[statements[k + 1]]
        words = [after.GetTokenString(i) for i in _SignificantTokens(after)[:2]]
        if words[:1] in ([b'@'], [b'def'], [b'class']) or (py3 and words == [b'async', b'def']):
            continue
        row, col = after.fTokens[_SignificantTokens(after)[0]][1] if words else (0, 0)
        found.Add(_kParse, statements[k + 1], MakeError(after, 'invalid syntax', row, col, col + 1),
                  (row + 1, col + 1))


# ---- after parsing

def _Triple(version):
    return tuple(int(p) for p in version.split('.'))


def _CompileOffset(version, col):
    """CPython's offset of an error of its compiler at a statement's 0-based column."""
    if version == '2.7':
        return None
    return col + 1 if _Triple(version) >= (3, 8) else col


def _Words(logical):
    return [logical.GetTokenString(i) for i in _SignificantTokens(logical)]


def _IsDocString(words, py3):
    if not words or any(w[:1] not in b'\'"bBuUrRfF' for w in words):
        return False
    for w in words:
        prefix = w[:len(w) - len(w.lstrip(b'bBuUrRfF'))].lower()
        if prefix == w or (py3 and (b'b' in prefix or b'f' in prefix)):
            return False
    return True


def _FutureImports(version, logicals, statements, found):
    """CPython's rule: a module may start with a docstring and `from __future__`
    imports; a future import after anything else is an error."""
    py3 = version != '2.7'
    done = False
    seen_doc = False
    for k, index in enumerate(statements):
        logical = logicals[index]
        if logical.fIndent != 0:
            continue
        words = _Words(logical)
        if words[:3] == [b'from', b'__future__', b'import']:
            if done:
                col = logical.fTokens[_SignificantTokens(logical)[0]][1][1]
                found.Add(_kCompile, index, MakeError(logical, kFutureLate, 0, col,
                                                      _CompileOffset(version, col)))
            elif b';' in words:
                done = True
            continue
        if not seen_doc and (k == 0 or not py3) and _IsDocString(words, py3):
            seen_doc = True
            continue
        done = True


_kLoopHeads = ([b'for'], [b'while'])


def _Head(words):
    """The leading keyword(s) of a record: ['async', 'for'] counts as 'for'."""
    if words[:1] == [b'async'] and len(words) > 1:
        return words[1]
    return words[0] if words else b''


def _Loops(version, logicals, statements, errors, found):
    """break and continue whose loop is not on their line and not around them."""
    py3 = version != '2.7'
    stack = []      # (indent, head) of the headers around the current record
    for index in statements:
        logical = logicals[index]
        indent = _IndentColumns(_FirstLine(logical))[0]
        while stack and stack[-1][0] >= indent:
            stack.pop()
        words = None
        if indent and errors[index] is None and (b'break' in logical.fLineText
                                                 or b'continue' in logical.fLineText):
            words = _Words(logical)
            _CheckLoop(version, logical, index, words, stack, found)
        if _IsHeader(logical):
            stack.append((indent, _Head(words if words is not None else _Words(logical))))


def _CheckLoop(version, logical, index, words, stack, found):
    head = _Head(words)
    if head in (b'for', b'while', b'def', b'class'):
        return      # the line's own loop, or its own def: the line's checks judge it
    for i in _SignificantTokens(logical):
        word = logical.GetTokenString(i)
        if word in (b'break', b'continue') and _fastaccess.GetLogicalTokenType(logical, i) == _kName:
            break
    else:
        return
    message = None
    for _, outer in reversed(stack):
        if outer in (b'for', b'while'):
            return
        if outer == b'finally' and word == b'continue' and _Triple(version) < (3, 8):
            message = "'continue' not supported inside 'finally' clause"
            break
        if outer in (b'def', b'class'):
            break
    if message is None:
        message = "'break' outside loop" if word == b'break' else "'continue' not properly in loop"
    row, col = logical.fTokens[i][1]
    found.Add(_kCompile, index, MakeError(logical, message, row, col, _CompileOffset(version, col)))


# ---- match statements and except* (3.10, 3.11)

_kKeywordWords = frozenset([b'None', b'True', b'False'])
_kExceptStar = re.compile(br'except[ \t\f\\\r\n]*\*')
_kCaseLine = re.compile(br'(?m)^[ \t\f]*case\b')
_kMatchLine = re.compile(br'(?m)^[ \t\f]*match\b')


def _MatchCases(version, logicals, statements, errors, found):
    """A case whose pattern is a lone capture or `_` and has no guard matches
    everything: CPython rejects it when another case of its match follows."""
    stack = []      # [match indent, case indent, (index, error) of an irrefutable case]
    for index in statements:
        logical = logicals[index]
        indent = logical.fIndent
        while stack and stack[-1][0] >= indent:
            stack.pop()
        first = logical.GetTokenString(0) if logical.fTokenCount else b''
        if first not in (b'match', b'case') or errors[index] is not None:
            continue
        words = _Words(logical)
        if first == b'case' and stack and stack[-1][1] in (None, indent):
            top = stack[-1]
            top[1] = indent
            if top[2] is not None:
                found.Add(_kCompile, *top[2])
                top[2] = None
            if (len(words) > 2 and words[2] == b':' and words[1] not in _kKeywordWords
                    and re.match(br'[A-Za-z_][A-Za-z_0-9]*\Z', words[1])):
                i = _SignificantTokens(logical)[1]
                row, col = logical.fTokens[i][1]
                message = ('wildcard makes remaining patterns unreachable' if words[1] == b'_' else
                           "name capture '%s' makes remaining patterns unreachable" % words[1])
                top[2] = (index, MakeError(logical, message, row, col, _CompileOffset(version, col)))
        elif first == b'match' and words[-1:] == [b':'] and len(words) > 2 and words[1] not in (b'=', b'.'):
            stack.append([indent, None, None])


def _ExceptStars(logicals, statements, errors, found):
    """One try statement may not have both except and except* clauses."""
    stack = []      # [indent of a try, b'*' or b'' once a clause says which]
    for index in statements:
        logical = logicals[index]
        indent = logical.fIndent
        words = None
        first = logical.GetTokenString(0) if logical.fTokenCount else b''
        while stack and (stack[-1][0] > indent or (stack[-1][0] == indent and first not in (
                b'except', b'else', b'finally'))):
            stack.pop()
        if first == b'try':
            stack.append([indent, None])
        elif first == b'except' and stack and stack[-1][0] == indent and errors[index] is None:
            words = _Words(logical)
            star = b'*' if words[1:2] == [b'*'] else b''
            if stack[-1][1] is None:
                stack[-1][1] = star
            elif stack[-1][1] != star:
                row, col = logical.fTokens[0][1]
                found.Add(_kParse, index, MakeError(
                    logical, "cannot have both 'except' and 'except*' on the same 'try'", row, col, col + 1))
