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
errors of the newest one.

Results keep the logical-line records (pysource._fastaccess.CLogicalLine) with
the derived info the analyzer recorded; LineView turns one record into plain
data. Texts are bytes throughout, exactly as in the source.
"""

import os
import re

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

kStatusRank = {kOk: 0, kSkipped: 0, kSyntaxError: 1, kUnreadable: 2}


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
_kPy2Long = re.compile(br'(?:0[xX][0-9a-fA-F]+|0[oObB]?[0-9]+|[0-9]+)[lL]\Z')
_kPy2Octal = re.compile(br'0[0-9]*[1-9][0-9]*\Z')
_kEscape = re.compile(br'\\(.)', re.S)
_kHex4, _kHex8 = re.compile(br'[0-9a-fA-F]{4}'), re.compile(br'[0-9a-fA-F]{8}')
_kNamedEscape = re.compile(br'\{[^{}\\\'"]+\}')
_kTripleQuotes = (b'"' * 3, b"'" * 3)


def _StringParts(text):
    """(lower-cased prefix, body between the quotes) of a string token."""
    quote = len(text) - len(text.lstrip(b'bBuUrRfF'))
    q = 3 if text[quote:quote + 3] in _kTripleQuotes else 1
    return text[:quote].lower(), text[quote + q:len(text) - q]


def _BadUnicodeEscape(body):
    """The message for the first \\u, \\U or \\N escape Python 3 cannot decode, or None."""
    for m in _kEscape.finditer(body):
        c, end = m.group(1), m.end()
        if c == b'u' and not _kHex4.match(body, end):
            return "(unicode error) 'unicodeescape' codec can't decode: truncated \\uXXXX escape"
        if c == b'U' and not _kHex8.match(body, end):
            return ("(unicode error) 'unicodeescape' codec can't decode: "
                    "truncated \\UXXXXXXXX escape")
        if c == b'N' and not _kNamedEscape.match(body, end):
            return ("(unicode error) 'unicodeescape' codec can't decode: "
                    "malformed \\N character escape")
    return None


def _Py3TokenError(text, kind, version):
    if kind == _kNumber:
        if _kPy2Long.match(text):
            return 'invalid syntax'
        if _kPy2Octal.match(text):
            return 'invalid token'
        if version == '3.5' and b'_' in text:
            return 'invalid syntax'
    elif kind == _kString:
        prefix, body = _StringParts(text)
        if b'u' in prefix and b'r' in prefix:
            return 'invalid syntax'
        if version == '3.5' and b'f' in prefix:
            return 'invalid syntax'
        if b'b' not in prefix and b'r' not in prefix and b'\\' in body:
            return _BadUnicodeEscape(body)
    elif text == b'<>':
        return 'invalid syntax'
    return None


def _Py2TokenError(text, kind, version):
    if kind == _kNumber:
        if b'_' in text:
            return 'invalid syntax'
    elif kind == _kString:
        prefix = _StringParts(text)[0]
        if b'f' in prefix or prefix.startswith(b'r') and b'b' in prefix:
            return 'invalid syntax'
    return None


# Version -> (cheap test of a line's text, test of one token). The grammars
# see these tokens as plain numbers, strings and the not-equal operator.
_kPy3Hint = (br'<>|[0-9][lL]|0[xX][0-9a-fA-F]*[lL]|(?<![0-9A-Za-z_.])0[0-9]|'
             br'[uU][rR][\'"]|\\[uUN]')
_kTokenChecks = {
    '2.7': (re.compile(br'[0-9]_|[fF][rR]?[\'"]|[rR][fFbB][\'"]'), _Py2TokenError),
    '3.5': (re.compile(_kPy3Hint + br'|[0-9]_|[fF][rRbB]?[\'"]'), _Py3TokenError),
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
    """(token index, message) of the first token the version's lexer rejects, or None.

    Python 3 rejects long literals (10L), old octals (0777), ur'' strings, <>
    and \\u escapes that are not four hex digits in text strings; 3.5 also
    f-strings and underscores in numbers; 2.7 rejects those two and rb''.
    """
    found = None
    hint, check = _kTokenChecks[version]
    if hint.search(logical.fLineText):
        for i in range(logical.fTokenCount):
            text = logical.GetTokenString(i)
            message = check(text, _fastaccess.GetTokenType(text), version)
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
    if found[1].startswith('(unicode error)'):
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
            self._impls[key] = impl
        return impl

    def ImplFor(self, logicals):
        """The treelens analyzer for the logical lines of one module."""
        return self.Impl(not self._py3 and UsesPrintFunction(logicals))

    def AnalyzeLogical(self, impl, logical):
        """Analyzes one record (again, if it was already); returns None or a SyntaxError."""
        if logical.fInspected:
            logical.fInspected = False
        # From 3.7 on async and await are keywords everywhere: no scope to look up.
        in_async_def = self._py3 and self._triple < (3, 7) and utils.InAsyncDef(logical)
        error = impl.AnalyzeSingleLogical(logical, in_async_def)
        if error is None or self.checks:
            found = TokenError(self.version, logical)
            if found is not None and (error is None or _LexedFirst(logical, found, error)):
                from pysource import treelens
                _fastaccess.ClearLogicalDerivedInfo(logical)
                error = treelens.CreateSyntaxError(found[1], logical, found[0])
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
    """(version, errors) for 'auto': the newest version with no syntax error."""
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
    errors = GetAnalyzer(kAutoOrder[0], checks).Analyze(logicals)
    filechecks.Check(kAutoOrder[0], logicals, errors, text, path, checks)
    return kAutoOrder[0], errors


class FileAnalysis(object):
    """The analysis of one source text.

    path: as given (bytes or str); version: the version used, None when
    nothing was analyzed; logicals: the records; errors: None or a
    SyntaxError per record; status: one of kOk, kSyntaxError, kUnreadable,
    kSkipped; problem: why a file was not analyzed (kUnreadable, kSkipped).
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
    row = error.lineno or 1
    # The syntax checks give CPython's offset (0-based or None) and the
    # 1-based column apart.
    column = getattr(error, 'column', None) or error.offset or 1
    return logical.fFirstLine + row, column, error.msg


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
    defines (names defined), reads (names read), equivs ((name, info) type
    equivalences other than reads), args (argument names), arg_equivs ((name,
    info) pairs of the arguments), bases (base-class texts), error (None, or
    a dict of message, line and column, 1-based). Texts are bytes.
    """
    info = logical.GetDerivedInfo() or kNoDerivedInfo
    names, type_equivs, args, arg_equivs, bases = info
    reads, equivs = SplitReads(type_equivs)
    view = {
        'line': logical.fFirstLine + 1,
        'kind': KindName(logical.fKind),
        'text': logical.fLineText,
        'defines': list(names),
        'reads': reads,
        'equivs': equivs,
        'args': list(args),
        'arg_equivs': list(arg_equivs),
        'bases': list(bases),
        'error': None,
    }
    if error is not None:
        line, column, message = ErrorLocation(logical, error)
        view['error'] = {'message': message, 'line': line, 'column': column}
    return view


def AnalyzeText(text, version=kAuto, path=None, checks=True):
    """Splits and analyzes a source text (bytes; unicode is encoded as UTF-8).

    Returns a FileAnalysis. A text with a NUL byte is not Python source: it is
    not analyzed and its status is kUnreadable. checks: as for GetAnalyzer.
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
    return FileAnalysis(path, version, logicals, errors, kSyntaxError if failed else kOk)


def ReadSource(path):
    """(bytes, None) or (None, why the file cannot be read)."""
    try:
        with open(path, 'rb') as f:
            return f.read(), None
    except (IOError, OSError) as e:
        return None, 'cannot read: %s' % (e.strerror or e)


def AnalyzeFile(path, version=kAuto, checks=True):
    """Reads and analyzes one file; never raises for I/O errors (status kUnreadable)."""
    if os.path.isdir(path):
        return FileAnalysis(path, status=kUnreadable, problem='cannot read: Is a directory')
    text, problem = ReadSource(path)
    if problem is not None:
        return FileAnalysis(path, status=kUnreadable, problem=problem)
    return AnalyzeText(text, version, path, checks)


def IterSourcePaths(paths):
    """Yields (path, status, problem) for the files and folders named by paths.

    A folder is searched recursively for .py and .pyi files, each folder's
    entries in sorted order, hidden ones (.git, .tox) skipped, symlinks
    followed; a folder met again (through a
    symlink loop or a second path to it) is not searched twice: a loop is
    yielded with status kSkipped. A folder that cannot be listed is yielded
    with kUnreadable. Files named directly are yielded whatever their suffix,
    with status kOk (reading them is the caller's task).
    """
    seen = set()
    for path in paths:
        if os.path.isdir(path):
            for item in _WalkFolder(path, seen, []):
                yield item
        else:
            yield path, kOk, None


def _WalkFolder(folder, seen, ancestors):
    try:
        st = os.stat(folder)
        names = sorted(os.listdir(folder))
    except OSError as e:
        yield folder, kUnreadable, 'cannot list folder: %s' % (e.strerror or e)
        return
    key = (st.st_dev, st.st_ino)
    if key in seen:
        if key in ancestors:
            yield folder, kSkipped, 'symlink loop: folder already being searched, not followed'
        return
    seen.add(key)
    ancestors.append(key)
    for name in names:
        if name.startswith('.'):
            continue
        path = os.path.join(folder, name)
        if os.path.isdir(path):
            for item in _WalkFolder(path, seen, ancestors):
                yield item
        elif name.endswith(kSourceSuffixes):
            yield path, kOk, None     # also a dangling link: reading it reports the problem
    ancestors.pop()


def AnalyzeFolder(path, version=kAuto, checks=True):
    """Yields the FileAnalysis of every source file under a folder (or of a file), in order.

    Unreadable files and folders and symlink loops are yielded too, with
    their status and problem; nothing stops the search.
    """
    for found, status, problem in IterSourcePaths([path]):
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
