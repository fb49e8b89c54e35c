"""Names across lines: scopes, bindings, references and diagnostics of one file.

    from pysource import analysis, resolver

    result = analysis.AnalyzeText(b'import os\\ndef f(x):\\n    return os.sep + y\\n')
    module = resolver.Resolve(result)
    module.Outline()                 # [('def', 'f', 2, 3, [])]
    module.DefinitionsAt(3, 12)      # [<Binding import os 1:8>]
    module.Diagnostics()             # [(3, 21, 'F821', "undefined name 'y'")]

Resolve reads the records of a FileAnalysis: their kind, their enclosing
def or class record (fParentScope) and their tokens with positions. Each
line's tokens are read once more here to place every name: which scope it
belongs to (lambdas and comprehensions open scopes inside a line), whether it
is bound, read or deleted, and at which column (f-string fields, string
annotations and type comments included). A read the analyzer recorded that
the token reading did not place is added at the string that holds it. Lines
with a syntax error contribute nothing.

The scope rules are Python's: class bodies are not visible from their
methods, comprehensions have their own scope (Python 2's list
comprehensions excepted) but for their first iterable and the target of an
assignment expression, global and nonlocal redirect, a name bound anywhere in
a function is local throughout it. Symbols() gives each scope's parameters,
locals, globals, free and cell names as CPython's compiler computes them.

References resolve to a binding, to a builtin of the language version, to
nothing known after a star import ('unknown') or to nothing ('undefined').
At module and class level, and for the function's own names, a binding
counts only once it has happened (in line order); names read in a function
body from enclosing scopes see every binding there, since the body runs later.
"""

import bisect
import operator
import os
import re

from pysource import _fastaccess, utils

# ---- Builtins per language version

_kBuiltins3 = frozenset((
    'ArithmeticError AssertionError AttributeError BaseException BlockingIOError '
    'BrokenPipeError BufferError BytesWarning ChildProcessError ConnectionAbortedError '
    'ConnectionError ConnectionRefusedError ConnectionResetError DeprecationWarning EOFError '
    'Ellipsis EnvironmentError Exception False FileExistsError FileNotFoundError '
    'FloatingPointError FutureWarning GeneratorExit IOError ImportError ImportWarning '
    'IndentationError IndexError InterruptedError IsADirectoryError KeyError KeyboardInterrupt '
    'LookupError MemoryError ModuleNotFoundError NameError None NotADirectoryError '
    'NotImplemented NotImplementedError OSError OverflowError PendingDeprecationWarning '
    'PermissionError ProcessLookupError RecursionError ReferenceError ResourceWarning '
    'RuntimeError RuntimeWarning StopAsyncIteration StopIteration SyntaxError SyntaxWarning '
    'SystemError SystemExit TabError TimeoutError True TypeError UnboundLocalError '
    'UnicodeDecodeError UnicodeEncodeError UnicodeError UnicodeTranslateError UnicodeWarning '
    'UserWarning ValueError Warning ZeroDivisionError __build_class__ __debug__ __doc__ '
    '__import__ __loader__ __name__ __package__ __spec__ abs all any ascii bin bool '
    'breakpoint bytearray bytes callable chr classmethod compile complex copyright credits '
    'delattr dict dir divmod enumerate eval exec exit filter float format frozenset getattr '
    'globals hasattr hash help hex id input int isinstance issubclass iter len license list '
    'locals map max memoryview min next object oct open ord pow print property quit range '
    'repr reversed round set setattr slice sorted staticmethod str sum super tuple type vars '
    'zip').split())
_kBuiltins27 = frozenset((
    'ArithmeticError AssertionError AttributeError BaseException BufferError BytesWarning '
    'DeprecationWarning EOFError Ellipsis EnvironmentError Exception False FloatingPointError '
    'FutureWarning GeneratorExit IOError ImportError ImportWarning IndentationError IndexError '
    'KeyError KeyboardInterrupt LookupError MemoryError NameError None NotImplemented '
    'NotImplementedError OSError OverflowError PendingDeprecationWarning ReferenceError '
    'RuntimeError RuntimeWarning StandardError StopIteration SyntaxError SyntaxWarning '
    'SystemError SystemExit TabError True TypeError UnboundLocalError UnicodeDecodeError '
    'UnicodeEncodeError UnicodeError UnicodeTranslateError UnicodeWarning UserWarning '
    'ValueError Warning ZeroDivisionError __debug__ __doc__ __import__ __name__ __package__ '
    'abs all any apply basestring bin bool buffer bytearray bytes callable chr classmethod cmp '
    'coerce compile complex copyright credits delattr dict dir divmod enumerate eval execfile '
    'exit file filter float format frozenset getattr globals hasattr hash help hex id input '
    'int intern isinstance issubclass iter len license list locals long map max memoryview '
    'min next object oct open ord pow print property quit range raw_input reduce reload repr '
    'reversed round set setattr slice sorted staticmethod str sum super tuple type unichr '
    'unicode vars xrange zip').split())
# What every module has besides the builtins module's names.
_kModuleDunders = frozenset(['__file__', '__builtins__', '__annotations__', 'WindowsError'])

kBuiltins = {
    '2.7': _kBuiltins27 | _kModuleDunders,
    '3.5': (_kBuiltins3 - frozenset(['ModuleNotFoundError', 'breakpoint'])) | _kModuleDunders,
    '3.6': (_kBuiltins3 - frozenset(['breakpoint'])) | _kModuleDunders,
    '3.7': _kBuiltins3 | _kModuleDunders,
    '3.8': _kBuiltins3 | _kModuleDunders,
    '3.9': _kBuiltins3 | _kModuleDunders,
}
kBuiltins['3.10'] = kBuiltins['3.9'] | frozenset(['EncodingWarning', 'aiter', 'anext'])
kBuiltins['3.11'] = kBuiltins['3.10'] | frozenset(['BaseExceptionGroup', 'ExceptionGroup'])
kBuiltins['3.12'] = kBuiltins['3.11']
kBuiltins['3.13'] = kBuiltins['3.12'] | frozenset(['PythonFinalizationError'])
# Names a class body has before its first line, and a package's __init__.
kClassNames = frozenset(['__module__', '__qualname__'])
kPackageNames = frozenset(['__path__'])

# ---- Keywords

_kPy3Keywords = frozenset((
    'False None True and as assert async await break class continue def del elif else except '
    'finally for from global if import in is lambda nonlocal not or pass raise return try '
    'while with yield').split())
_kPy2Keywords = frozenset((
    'and as assert break class continue def del elif else except exec finally for from global '
    'if import in is lambda not or pass print raise return try while with yield').split())
_kPy2PrintFunctionKeywords = _kPy2Keywords - frozenset(['print'])

# ---- Symbol flags, as CPython's compiler keeps them

DEF_GLOBAL, DEF_LOCAL, DEF_PARAM, DEF_NONLOCAL, USE, DEF_IMPORT = 1, 2, 4, 8, 16, 32
DEF_BOUND = DEF_LOCAL | DEF_PARAM | DEF_IMPORT
# Scope of a name in its scope.
LOCAL, GLOBAL_EXPLICIT, GLOBAL_IMPLICIT, FREE, CELL = 1, 2, 3, 4, 5

# ---- Binding kinds

kImport, kFromImport, kStarImport = 'import', 'from-import', 'star-import'
kAssignment, kUnpacking, kAugmented = 'assignment', 'unpacking', 'augmented'
kAnnotated, kAnnotationOnly = 'annotated', 'annotation-only'
kParameter, kDef, kClass = 'parameter', 'def', 'class'
kForTarget, kWithTarget, kExceptTarget = 'for', 'with', 'except'
kComprehensionTarget, kWalrus = 'comprehension', 'walrus'
kGlobalDecl, kNonlocalDecl, kDel = 'global', 'nonlocal', 'del'
kMatchTarget, kTypeParameter, kTypeAlias = 'match', 'type-parameter', 'type-alias'

_kImportKinds = (kImport, kFromImport)
_kDefinitionKinds = (kImport, kFromImport, kDef, kClass)

# Resolutions of a reference.
kBound, kBuiltin, kUnknown, kUndefined = 'binding', 'builtin', 'unknown', 'undefined'

_kName = re.compile(br'[A-Za-z_\x80-\xff][A-Za-z0-9_\x80-\xff]*\Z')
_kAugOps = frozenset(['+=', '-=', '*=', '/=', '//=', '%=', '**=', '>>=', '<<=', '&=', '^=',
                      '|=', '@='])
_kAssignOps = frozenset(['=', ':']) | _kAugOps
_kOpen = {'(': ')', '[': ']', '{': '}'}
_kClose = frozenset([')', ']', '}'])
_TokenTable = _fastaccess.GetLogicalTokenTable
_LineTable = _fastaccess.GetLogicalLineTable
_kOrder = operator.attrgetter('order')
_kFString = re.compile(br'(?<![A-Za-z0-9_])[rR]?[fF][rR]?[\'"]')
_kCompoundHeads = frozenset(['if', 'elif', 'while', 'for', 'with', 'try', 'except', 'else',
                             'finally', 'def', 'class'])
_kClauseHeads = frozenset(['elif', 'else', 'except', 'finally'])
_kNoqa = re.compile(br'#\s*noqa(?::\s?(?P<codes>[A-Z][0-9]+(?:[,\s]+[A-Z][0-9]+)*))?',
                    re.IGNORECASE)
_kCodes = re.compile(br'[A-Z][0-9]+', re.IGNORECASE)
_kTypeComment = re.compile(br'#\s*type:\s*(.*)')


class Scope(object):
    """A scope: kind ('module', 'class', 'function', 'lambda', 'comprehension',
    'annotation' for the type parameters of a def, class or type alias,
    'alias' for what is evaluated lazily there: a type alias's value, a type
    parameter's bound or default), name (CPython's: 'top', the def or class
    name, 'lambda', 'listcomp', 'setcomp', 'dictcomp', 'genexpr'; the alias or
    type parameter name), line and end_line (1-based, inclusive), its first
    decorator's line (decorated_line), parent, children, bindings and
    references in source order, and the CPython symbol flags of its names."""

    __slots__ = ('kind', 'name', 'line', 'col', 'end_line', 'decorated_line', 'parent',
                 'children', 'bindings', 'references', 'flags', 'scopes', 'binding',
                 'star_imports', 'uses_locals', 'in_string', '_by_name', '_candidates')

    def __init__(self, kind, name, line, col, parent):
        self.kind = kind
        self.name = name
        self.line = self.end_line = self.decorated_line = line
        self.col = col
        self.parent = parent
        self.children = []
        self.bindings = []
        self.references = []
        self.flags = {}
        self.scopes = None          # name -> LOCAL, GLOBAL_EXPLICIT, ... once analysed
        self.binding = None         # the def or class binding that names the scope
        self.star_imports = []
        self.uses_locals = False
        self.in_string = False      # opened in an f-string's replacement field
        self._by_name = None
        self._candidates = None
        if parent is not None:
            parent.children.append(self)

    def AddFlag(self, name, flag):
        if name[:2] == '__':
            name = self.Mangle(name)
        self.flags[name] = self.flags.get(name, 0) | flag

    def Mangle(self, name):
        """The name as the compiler keys it: a private name (__x) within a class
        is prefixed with the class name."""
        if name.endswith('__') or '.' in name:
            return name
        scope = self
        while scope is not None and scope.kind != 'class':
            scope = scope.parent
        if scope is None:
            return name
        owner = scope.name.lstrip('_')
        return '_%s%s' % (owner, name) if owner else name

    def Candidates(self, name):
        """(bindings, their orders, those that are not a del, their orders) of a
        name, in flow order, declarations left out."""
        if self._candidates is None:
            self._candidates = {}
        found = self._candidates.get(name)
        if found is None:
            bindings = sorted((b for b in self.BindingsNamed(name)
                               if b.kind not in (kGlobalDecl, kNonlocalDecl, kStarImport)),
                              key=_kOrder)
            live = [b for b in bindings if b.kind != kDel] or bindings
            found = self._candidates[name] = (bindings, [b.order for b in bindings], live,
                                              [b.order for b in live])
        return found

    def BindingsNamed(self, name):
        if self._by_name is None:
            by_name = {}
            for b in self.bindings:
                by_name.setdefault(b.name, []).append(b)
            self._by_name = by_name
        return self._by_name.get(name, ())

    def __repr__(self):
        return '<Scope %s %s %d-%d>' % (self.kind, self.name, self.line, self.end_line)


class Binding(object):
    """A name bound: kind (see the k* constants), line and col (1-based), scope,
    order (for flow comparisons), references resolved to it, and for imports
    the qualified name ('os.path', 'a.b.c' for from a.b import c)."""

    __slots__ = ('name', 'kind', 'line', 'col', 'scope', 'order', 'references', 'qualified',
                 'record', 'clauses', 'decorators', 'aliased', 'statement')

    def __init__(self, name, kind, line, col, scope, order, record, clauses):
        self.name = name
        self.kind = kind
        self.line = line
        self.col = col
        self.scope = scope
        self.order = order
        self.references = []
        self.qualified = None
        self.record = record
        self.clauses = clauses
        self.decorators = ()
        self.aliased = False        # import ... as name
        self.statement = None       # (line, col) of the import statement

    def __repr__(self):
        return '<Binding %s %s %d:%d>' % (self.kind, self.name, self.line, self.col)


class Reference(object):
    """A name read: line and col (1-based), scope, what it resolves to
    (resolution: kBound, kBuiltin, kUnknown, kUndefined; binding for kBound),
    early when a module or class level read comes before any binding of its
    name there, annotation when it is in an annotation (deferred with
    `from __future__ import annotations`, in stubs and in strings), string when
    it was read from a string annotation or type comment, deleting when it is
    the target of a del, exported when it is an entry of __all__."""

    __slots__ = ('name', 'line', 'col', 'scope', 'order', 'resolution', 'binding', 'early',
                 'annotation', 'string', 'clauses', 'deleting', 'exported')

    def __init__(self, name, line, col, scope, order, clauses):
        self.name = name
        self.line = line
        self.col = col
        self.scope = scope
        self.order = order
        self.resolution = None
        self.binding = None
        self.early = False
        self.annotation = False
        self.string = False
        self.clauses = clauses
        self.deleting = False
        self.exported = False       # an entry of __all__

    def __repr__(self):
        return '<Reference %s %d:%d %s>' % (self.name, self.line, self.col, self.resolution)


# ---- Reading one line's tokens


class _Line(object):
    """The significant tokens of one record: texts, 1-based positions, bracket matches."""

    __slots__ = ('texts', 'pos', 'match', 'n', 'comments', 'ascii', 'kinds')

    def __init__(self, logical):
        texts, lines, cols, self.comments, self.match, self.ascii = _LineTable(logical)
        self.texts = texts
        self.kinds = frozenset(texts)   # to skip searches for what a line lacks
        self.pos = _Positions(lines, cols)
        self.n = len(texts)


class _Positions(object):
    """The (line, column) of each token, 1-based, paired when asked."""

    __slots__ = ('lines', 'cols')

    def __init__(self, lines, cols):
        self.lines = lines
        self.cols = cols

    def __getitem__(self, i):
        return self.lines[i], self.cols[i]


class _NameTest(dict):
    """Token text -> whether it is a name (not a keyword), remembered."""

    def __init__(self, keywords):
        dict.__init__(self)
        self.keywords = keywords

    def __missing__(self, t):
        found = self[t] = _kName.match(t) is not None and t not in self.keywords
        return found


class _Reader(object):
    """Places the names of one file's lines into scopes (see Resolve)."""

    def __init__(self, module, version, keywords, stub):
        self.module = module
        self.version = version
        self.keywords = keywords
        self.py2 = version == '2.7'
        numbers = tuple(int(x) for x in version.split('.') if x.isdigit())
        self.match_statements = numbers >= (3, 10)
        self.type_parameters = numbers >= (3, 12)
        self.matches = []           # [indent of an open match statement, of its cases]
        self.stub = stub
        self.future_annotations = False
        self.all_names = []          # (name, line, col) of __all__ entries
        self.record_index = 0
        self.clauses = ()
        self.line = None
        self.in_string = False      # reading a string annotation: the compiler sees no names
        self.normalize = not self.py2   # Python 3 identifiers are NFKC-normalized
        self.foreign = {}           # name -> bindings of module names made in functions
        self.IsName = _NameTest(keywords).__getitem__

    # -- helpers

    def Bind(self, scope, name, i, kind, order=None, flag=DEF_LOCAL):
        if self.normalize and not self.line.ascii and max(name) >= '\x80':
            name = _Normalize(name)
        line, col = self.line.pos[i] if i < self.line.n else self.line.pos[-1]
        b = Binding(name, kind, line, col, scope,
                    (self.record_index, i if order is None else order), self.record_index,
                    self.clauses)
        scope.bindings.append(b)
        if flag:
            scope.AddFlag(name, flag)
        if scope.kind != 'module' and \
                scope.flags.get(scope.Mangle(name) if name[:2] == '__' else name, 0) & DEF_GLOBAL:
            # A module name bound (or declared) by a function: known to the
            # reads that run after the module's top level.
            self.foreign.setdefault(name, []).append(b)
        return b

    def Use(self, scope, name, i, annotation=False):
        if self.normalize and not self.line.ascii and max(name) >= '\x80':
            name = _Normalize(name)
        pos = self.line.pos
        r = Reference(name, pos.lines[i], pos.cols[i], scope, (self.record_index, i),
                      self.clauses)
        r.annotation = annotation
        scope.references.append(r)
        if self.in_string:
            return r
        key = scope.Mangle(name) if name[:2] == '__' else name
        flags = scope.flags
        flags[key] = flags.get(key, 0) | USE
        if name == 'super' and scope.kind == 'function' and not self.py2:
            scope.AddFlag('__class__', USE)
        elif name == 'locals':
            scope.uses_locals = True
        return r

    def FindAtDepth0(self, a, b, wanted):
        """Index of the first token in wanted at bracket depth 0 in [a, b), lambdas
        skipped, or b."""
        line = self.line
        if line.kinds.isdisjoint(wanted):
            return b
        texts, match = line.texts, line.match
        lambdas = 0
        i = a
        while i < b:
            t = texts[i]
            if t in _kOpen:
                i = match[i] + 1
                continue
            if t == 'lambda':
                lambdas += 1
            elif lambdas and t == ':':
                lambdas -= 1
            elif not lambdas and t in wanted:
                return i
            i += 1
        return b

    def Split(self, a, b, sep):
        """[(start, end)] of the parts of [a, b) between sep at depth 0."""
        if self.line.kinds.isdisjoint(sep):
            return [(a, b)] if a <= b else []
        parts = []
        while a <= b:
            j = self.FindAtDepth0(a, b, sep)
            parts.append((a, j))
            a = j + 1
        return parts

    # -- expressions

    def Expr(self, a, b, scope, annotation=False):
        """Reads the names of an expression in [a, b) as loads in scope."""
        texts, match = self.line.texts, self.line.match
        i = a
        while i < b:
            t = texts[i]
            c = t[:1]
            if t in _kOpen:
                close = match[i]
                prev = texts[i - 1] if i > 0 else None
                trailer = prev is not None and (prev in _kClose or self.IsName(prev)
                                                or prev[-1:] in '\'"')
                if t == '(' and trailer:
                    self.Args(i + 1, min(close, b), scope, annotation)
                    if prev == 'cast' and i + 1 < close and texts[i + 1][-1:] in '\'"' and \
                            (texts[i - 2] != '.' or texts[i - 3] == 'typing'):
                        # typing.cast's type may be a string
                        self.StringAnnotation(texts[i + 1], i + 1, scope)
                elif t == '[' and trailer:
                    if annotation and prev == 'Literal':
                        pass
                    else:
                        self.Expr(i + 1, min(close, b), scope, annotation)
                        if self.py2 and ':' in texts[i + 1:close]:
                            self.EmptySteps(i + 1, min(close, b), scope)
                else:
                    self.Display(i, min(close, b), scope, annotation)
                i = close + 1
                continue
            if t == 'lambda':
                i = self.Lambda(i, b, scope)
                continue
            if c == '.' and t == '.':
                i += 2 if i + 1 < b and self.IsName(texts[i + 1]) else 1
                continue
            if self.IsName(t):
                if i + 1 < b and texts[i + 1] == ':=':
                    self.Walrus(scope, t, i)
                else:
                    self.Use(scope, t, i, annotation)
            elif t[-1:] in '\'"':
                if c in 'fFrR' and 'f' in t[:len(t) - len(t.lstrip('rRfF'))].lower():
                    self.FString(t, i, scope)
                elif annotation:
                    self.StringAnnotation(t, i, scope)
            i += 1

    def EmptySteps(self, a, b, scope):
        """Python 2 reads None for the empty step of a slice (a[x:y:])."""
        for s, e in self.Split(a, b, (',',)):
            colon = self.FindAtDepth0(s, e, (':',))
            if colon < e:
                second = self.FindAtDepth0(colon + 1, e, (':',))
                if second == e - 1:
                    self.Use(scope, 'None', second)

    def Args(self, a, b, scope, annotation=False):
        """Call arguments in [a, b): keyword names are not read; a lone
        generator expression is a comprehension."""
        texts = self.line.texts
        if 'for' in self.line.kinds and self.FindAtDepth0(a, b, ('for',)) < b:
            self.Comprehension(a - 1, b, scope, 'genexpr')
            return
        for s, e in self.Split(a, b, (',',)):
            if e - s >= 2 and texts[s + 1] == '=' and self.IsName(texts[s]):
                s += 2
            self.Expr(s, e, scope, annotation)

    def Display(self, i, close, scope, annotation=False):
        """A parenthesized expression, list, tuple, set or dict display or a
        comprehension; i is the opening bracket."""
        if self.FindAtDepth0(i + 1, close, ('for',)) < close:
            t = self.line.texts[i]
            if t == '[':
                name = 'listcomp'
            elif t == '(':
                name = 'genexpr'
            else:
                first = self.FindAtDepth0(i + 1, close, ('for',))
                name = 'dictcomp' if self.FindAtDepth0(i + 1, first, (':',)) < first \
                    else 'setcomp'
            self.Comprehension(i, close, scope, name)
        else:
            self.Expr(i + 1, close, scope, annotation)

    def Comprehension(self, i, close, scope, name):
        """The comprehension between the bracket at i and close."""
        texts = self.line.texts
        clauses = []
        start = i + 1
        j = self.FindAtDepth0(start, close, ('for',))
        elt = (start, j - 1 if texts[j - 1] == 'async' else j)
        while j < close:
            k = self.FindAtDepth0(j + 1, close, ('for', 'if'))
            end = k - 1 if k < close and texts[k - 1] == 'async' else k
            clauses.append((texts[j], j + 1, end))
            j = k
        if self.py2 and name == 'listcomp':
            inner = scope
        else:
            line, col = self.line.pos[i]
            inner = Scope('comprehension', name, line, col, scope)
            inner.AddFlag('.0', DEF_PARAM)
        first = True
        for kind, s, e in clauses:
            if kind == 'for':
                at = self.FindAtDepth0(s, e, ('in',))
                self.Expr(at + 1, e, scope if first else inner)
                self.Target(s, at, inner, kComprehensionTarget, order=s)
                first = False
            else:
                self.Expr(s, e, inner)
        self.Expr(elt[0], elt[1], inner)
        if inner is not scope:
            inner.end_line = self.line.pos[min(close, self.line.n - 1)][0]

    def Lambda(self, i, b, scope):
        """The lambda at i; returns the index past its body."""
        texts = self.line.texts
        colon = self.FindAtDepth0(i + 1, b, (':',))
        line, col = self.line.pos[i]
        inner = Scope('lambda', 'lambda', line, col, scope)
        self.Params(i + 1, colon, scope, inner, annotations=False)
        # The body ends at a comma, a colon, a semicolon or a comprehension's for
        # at its depth.
        end = colon + 1
        match = self.line.match
        lambdas = 0
        while end < b:
            t = texts[end]
            if t in _kOpen:
                end = match[end] + 1
                continue
            if t == 'lambda':
                lambdas += 1
            elif t == ':':
                if not lambdas:
                    break
                lambdas -= 1
            elif lambdas:
                pass        # a nested lambda's parameters
            elif t in (',', ';', 'for') or t == 'async' and end + 1 < b and \
                    texts[end + 1] == 'for':
                break
            elif t == '=' and not lambdas:
                break
            end += 1
        self.Expr(colon + 1, end, inner)
        inner.end_line = self.line.pos[min(end, self.line.n) - 1][0]
        return end

    def Walrus(self, scope, name, i):
        """An assignment expression's target: bound in the nearest scope that is
        not a comprehension."""
        target = scope
        while target.kind == 'comprehension' and target.parent is not None:
            target = target.parent
        if target is scope:
            self.Bind(scope, name, i, kWalrus)
            return
        if target.kind == 'module':
            scope.AddFlag(name, DEF_GLOBAL)
            self.Bind(target, name, i, kWalrus, flag=DEF_GLOBAL | DEF_LOCAL)
        else:
            # A name the function declares global stays global.
            declared = target.flags.get(target.Mangle(name) if name[:2] == '__' else name, 0)
            scope.AddFlag(name, DEF_GLOBAL if declared & DEF_GLOBAL else DEF_NONLOCAL)
            self.Bind(target, name, i, kWalrus)

    def Params(self, a, b, outer, inner, annotations=True, annotation_scope=None):
        """Parameters in [a, b): names bound in inner, defaults read in outer,
        annotations in annotation_scope (the type parameters' scope) or outer."""
        texts = self.line.texts
        annotation_scope = annotation_scope or outer
        for position, (s, e) in enumerate(self.Split(a, b, (',',))):
            while s < e and texts[s] in ('*', '**'):
                s += 1
            if s >= e or texts[s] == '/':
                continue
            eq = self.FindAtDepth0(s, e, ('=',))
            if eq < e:
                self.Expr(eq + 1, e, outer)
            while texts[s] == '(' and self.line.match.get(s) == s + 2:
                s += 1          # a parenthesized name: (x)
            if texts[s] == '(':
                # Python 2 tuple parameter: an implicit parameter unpacked into
                # parameters.
                inner.AddFlag('.%d' % (position,), DEF_PARAM)
                self.Target(s, eq, inner, kParameter, flag=DEF_PARAM)
                continue
            if self.IsName(texts[s]):
                self.Bind(inner, texts[s], s, kParameter, flag=DEF_PARAM)
            if annotations and s + 1 < eq and texts[s + 1] == ':':
                self.Expr(s + 2, eq, annotation_scope, annotation=True)

    # -- targets

    def Target(self, a, b, scope, kind, order=None, flag=DEF_LOCAL):
        """Names bound by the target list in [a, b); what subscripts and
        attributes read is read."""
        texts, match = self.line.texts, self.line.match
        i = a
        bound = []
        while i < b:
            t = texts[i]
            if t in ('(', '['):
                close = match[i]
                if close + 1 < b and texts[close + 1] in ('.', '(', '['):
                    # (expression).attribute = ...: what it reads
                    end = self.FindAtDepth0(close + 1, b, (',',))
                    self.Expr(i, end, scope)
                    i = end
                    continue
                self.Target(i + 1, min(close, b), scope, kind, order, flag)
                i = close + 1
                continue
            if t == '.':
                i += 2
                continue
            if self.IsName(t):
                j = i + 1
                if j < b and texts[j] in ('.', '(', '['):
                    self.Use(scope, t, i)
                    # The trailers: attributes, calls and subscripts.
                    while j < b and texts[j] in ('.', '(', '['):
                        if texts[j] == '.':
                            j += 2
                        else:
                            close = match[j]
                            if texts[j] == '(':
                                self.Args(j + 1, min(close, b), scope)
                            else:
                                self.Expr(j + 1, min(close, b), scope)
                                if self.py2:
                                    self.EmptySteps(j + 1, min(close, b), scope)
                            j = close + 1
                    i = j
                    continue
                if kind == kDel:
                    r = self.Use(scope, t, i)
                    r.deleting = True
                    bound.append(self.Bind(scope, t, i, kDel, order))
                else:
                    bound.append(self.Bind(scope, t, i, kind, order, flag))
            i += 1
        return bound

    # -- statements

    def Record(self, logical, scope, record_scope):
        """Reads one record's line; record_scope is the scope a def or class
        line opens (None for other lines)."""
        line = self.line = _Line(logical)
        texts, n = line.texts, line.n
        if not n:
            return
        i = 1 if texts[0] == 'async' and n > 1 else 0
        head = texts[i]
        if self.match_statements and (self.matches or head == 'match') and \
                self.MatchClause(logical, head, scope):
            return
        if head == '@':
            self.Expr(1, n, scope)
            return
        if head not in _kCompoundHeads:
            if ';' not in line.kinds:
                self.Simple(0, n, scope)
                return
            for s, e in self.Split(0, n, (';',)):
                if s < e:
                    self.Simple(s, e, scope)
            return
        body_scope = scope
        if head in ('def', 'class'):
            colon = self.Header(i, head, scope, record_scope)
            body_scope = record_scope
        else:
            colon = self.FindAtDepth0(i + 1, n, (':',))
            if head in ('if', 'elif', 'while'):
                self.Expr(i + 1, colon, scope)
            elif head == 'for':
                at = self.FindAtDepth0(i + 1, colon, ('in',))
                self.Expr(at + 1, colon, scope)
                self.Target(i + 1, at, scope, kForTarget, order=colon)
            elif head == 'with':
                a, b = i + 1, colon
                if texts[a] == '(' and line.match.get(a) == b - 1 and \
                        self.FindAtDepth0(a + 1, b - 1, ('as',)) < b - 1:
                    a, b = a + 1, b - 1     # parenthesized items: with (x as y, z):
                for s, e in self.Split(a, b, (',',)):
                    at = self.FindAtDepth0(s, e, ('as',))
                    self.Expr(s, at, scope)
                    if at < e:
                        self.Target(at + 1, e, scope, kWithTarget, order=e)
            elif head == 'except':
                at = self.FindAtDepth0(i + 1, colon, ('as',) if not self.py2 else ('as', ','))
                self.Expr(i + 1, at, scope)
                if at < colon:
                    self.Target(at + 1, colon, scope, kExceptTarget, order=colon)
        for s, e in self.Split(colon + 1, n, (';',)):
            if s < e:
                self.Simple(s, e, body_scope)

    def MatchClause(self, logical, head, scope):
        """Reads a match statement's header or one of its case clauses; False
        for other lines (match and case are names elsewhere)."""
        texts, n = self.line.texts, self.line.n
        indent = logical.fIndent
        matches = self.matches
        while matches and matches[-1][0] >= indent:
            matches.pop()
        if head == 'match':
            # match <subject>: ends its line; match[x]: int and match(x) do not.
            colon = self.FindAtDepth0(1, n, (':',))
            if colon != n - 1 or colon < 2 or texts[1] in ('=', '.') or texts[1] in _kAugOps:
                return False
            self.Expr(1, colon, scope)
            matches.append([indent, None])
            return True
        if head != 'case' or not matches or matches[-1][1] not in (None, indent) or n < 3:
            return False
        matches[-1][1] = indent
        colon = self.FindAtDepth0(1, n, (':',))
        guard = self.FindAtDepth0(1, colon, ('if',))
        self.Pattern(1, guard, scope)
        if guard < colon:
            self.Expr(guard + 1, colon, scope)
        for s, e in self.Split(colon + 1, n, (';',)):
            if s < e:
                self.Simple(s, e, scope)
        return True

    def IsCase(self, indent):
        """Whether a case line at indent is a clause of an open match statement."""
        for match_indent, case_indent in reversed(self.matches):
            if match_indent < indent:
                return case_indent in (None, indent)
        return False

    def Pattern(self, a, b, scope):
        """A case pattern in [a, b): captures, as and star names bind (_ binds
        nothing); value patterns, class names and mapping keys are read; the
        keyword names of class patterns are not names."""
        texts, match = self.line.texts, self.line.match
        i = a
        while i < b:
            t = texts[i]
            if t in _kOpen:
                close = min(match[i], b)
                if t == '{':
                    for s, e in self.Split(i + 1, close, (',',)):
                        if s < e and texts[s] == '**':
                            self.Pattern(s + 1, e, scope)
                        elif s < e:
                            key = self.FindAtDepth0(s, e, (':',))
                            self.Expr(s, key, scope)
                            self.Pattern(key + 1, e, scope)
                else:
                    self.Pattern(i + 1, close, scope)
                i = close + 1
                continue
            if not self.IsName(t):
                i += 1
                continue
            j = i + 1
            while j + 1 < b and texts[j] == '.':
                j += 2
            if j < b and texts[j] == '(':
                # A class pattern: the class is read, keyword names skipped.
                self.Use(scope, t, i)
                close = min(match[j], b)
                for s, e in self.Split(j + 1, close, (',',)):
                    if e - s >= 2 and texts[s + 1] == '=' and self.IsName(texts[s]):
                        s += 2
                    self.Pattern(s, e, scope)
                i = close + 1
                continue
            if j > i + 1:
                self.Use(scope, t, i)       # a value pattern: a dotted name
            elif t != '_':
                self.Bind(scope, t, i, kMatchTarget)
            i = j

    def TypeParameters(self, a, b, holder):
        """A type parameter list in [a, b): the names bind in holder, the
        bounds and defaults are read lazily in a scope of their own."""
        texts = self.line.texts
        for s, e in self.Split(a, b, (',',)):
            while s < e and texts[s] in ('*', '**'):
                s += 1
            if s >= e or not self.IsName(texts[s]):
                continue
            self.Bind(holder, texts[s], s, kTypeParameter)
            k = s + 1
            while k < e and texts[k] in (':', '='):
                end = self.FindAtDepth0(k + 1, e, ('=',))
                line, col = self.line.pos[s]
                self.Expr(k + 1, end, Scope('alias', texts[s], line, col, holder))
                k = end

    def AnnotationScope(self, scope, inner, name_at):
        """The scope of a type parameter list, put between scope and the def
        or class scope inner (None for a type alias)."""
        line, col = self.line.pos[name_at]
        holder = Scope('annotation', self.line.texts[name_at], line, col, None)
        holder.parent = scope
        if inner is None:
            scope.children.append(holder)
            return holder
        scope.children[scope.children.index(inner)] = holder
        holder.line, holder.end_line = inner.line, inner.end_line
        holder.decorated_line = inner.decorated_line
        inner.parent = holder
        holder.children.append(inner)
        return holder

    def TypeAlias(self, a, b, scope):
        """type X[T] = value: X binds in scope, T in the alias's type parameter
        scope, the value is read lazily in a scope of its own."""
        texts = self.line.texts
        name_at = a + 1
        holder = scope
        eq = a + 2
        if texts[eq] == '[':
            close = self.line.match[eq]
            holder = self.AnnotationScope(scope, None, name_at)
            self.TypeParameters(eq + 1, close, holder)
            eq = close + 1
        line, col = self.line.pos[name_at]
        self.Expr(eq + 1, b, Scope('alias', texts[name_at], line, col, holder))
        self.Bind(scope, texts[name_at], name_at, kTypeAlias, order=b)

    def Header(self, i, head, scope, inner):
        """A def or class header from token i; returns the index of its colon."""
        texts, n = self.line.texts, self.line.n
        name_at = i + 1
        after = name_at + 1
        holder = scope
        if after < n and texts[after] == '[' and self.type_parameters:
            holder = self.AnnotationScope(scope, inner, name_at)
            close = self.line.match[after]
            self.TypeParameters(after + 1, close, holder)
            after = close + 1
        if head == 'def':
            open_ = after
            close = self.line.match.get(open_, n)
            self.Params(open_ + 1, close, scope, inner, annotation_scope=holder)
            colon = self.FindAtDepth0(close + 1, n, (':',))
            if close + 1 < colon and texts[close + 1] == '->':
                self.Expr(close + 2, colon, holder, annotation=True)
            kind = kDef
        else:
            colon = self.FindAtDepth0(after, n, (':',))
            if after < colon and texts[after] == '(':
                self.Args(after + 1, self.line.match[after], holder)
            kind = kClass
        b = self.Bind(scope, texts[name_at], name_at, kind, order=colon)
        inner.binding = b
        return colon

    def Simple(self, a, b, scope):
        """One simple statement in [a, b)."""
        texts = self.line.texts
        head = texts[a]
        if head == 'import':
            for s, e in self.Split(a + 1, b, (',',)):
                at = self.FindAtDepth0(s, e, ('as',))
                dotted = b''.join(texts[s:at])
                if at < e:
                    bd = self.Bind(scope, texts[at + 1], at + 1, kImport, order=b,
                                   flag=DEF_IMPORT)
                    bd.aliased = texts[at - 1] != texts[at + 1]
                else:
                    bd = self.Bind(scope, texts[s], s, kImport, order=b, flag=DEF_IMPORT)
                bd.qualified = dotted
                bd.statement = self.line.pos[a]
            return
        if head == 'from':
            at = a + 1
            while at < b and texts[at] != 'import':
                at += 1
            module = b''.join(texts[a + 1:at])
            s, e = at + 1, b
            if s < e and texts[s] == '(':
                s, e = s + 1, min(self.line.match[s], b)
            for s2, e2 in self.Split(s, e, (',',)):
                if s2 >= e2:
                    continue
                if texts[s2] == '*':
                    bd = self.Bind(scope, '*', s2, kStarImport, order=b, flag=0)
                    bd.qualified = module
                    bd.statement = self.line.pos[a]
                    scope.star_imports.append(bd)
                    continue
                if module == '__future__' and texts[s2] == 'annotations':
                    self.future_annotations = True
                kw = s2 + 2 if e2 - s2 >= 3 and texts[s2 + 1] == 'as' else s2
                bd = self.Bind(scope, texts[kw], kw, kFromImport, order=b, flag=DEF_IMPORT)
                bd.qualified = module + (b'' if module.endswith(b'.') else b'.') + texts[s2]
                bd.aliased = texts[kw] != texts[s2]
                bd.statement = self.line.pos[a]
            return
        if head == 'type' and self.type_parameters and b - a >= 4 and \
                texts[a + 2] in ('=', '[') and self.IsName(texts[a + 1]):
            self.TypeAlias(a, b, scope)
            return
        if head in ('global', 'nonlocal'):
            kind = kGlobalDecl if head == 'global' else kNonlocalDecl
            flag = DEF_GLOBAL if head == 'global' else DEF_NONLOCAL
            for k in range(a + 1, b):
                if self.IsName(texts[k]):
                    self.Bind(scope, texts[k], k, kind, flag=flag)
                    if flag == DEF_GLOBAL and scope.kind != 'module':
                        # The compiler marks the module's symbol too.
                        self.module.AddFlag(texts[k], DEF_GLOBAL)
            return
        if head == 'del':
            self.Target(a + 1, b, scope, kDel, order=b)
            return
        if head in self.keywords and head not in ('lambda', 'not', 'None', 'True', 'False',
                                                  'await', 'yield'):
            self.Expr(a + 1, b, scope)
            return
        eq = b if self.line.kinds.isdisjoint(_kAssignOps) else \
            self.FindAtDepth0(a, b, _kAssignOps)
        if eq == b:
            self.Expr(a, b, scope)
            return
        op = texts[eq]
        if op in _kAugOps:
            self.Expr(eq + 1, b, scope)
            if head == '__all__' and op == '+=' and scope.kind == 'module':
                self.AllNames(eq + 1, b)
            if eq == a + 1 and self.IsName(head):
                self.Use(scope, head, a)
                self.Bind(scope, head, a, kAugmented, order=b)
            else:
                self.Target(a, eq, scope, kAugmented, order=b)
            return
        if op == ':':
            value = self.FindAtDepth0(eq + 1, b, ('=',))
            self.Expr(eq + 1, value, scope, annotation=True)
            if value < b:
                self.Expr(value + 1, b, scope)
            simple = eq == a + 1 and self.IsName(head)
            if simple:
                self.Bind(scope, head, a, kAnnotated if value < b else kAnnotationOnly, order=b)
                return
            inner = a
            while texts[inner] == '(' and texts[eq - 1 - (inner - a)] == ')':
                inner += 1
            if eq - (inner - a) == inner + 1 and self.IsName(texts[inner]):
                # A parenthesized name: bound when a value is given, else nothing.
                if value < b:
                    self.Bind(scope, texts[inner], inner, kAnnotated, order=b)
            else:
                self.Expr(a, eq, scope)
            return
        parts = self.Split(a, b, ('=',))
        value = parts[-1]
        self.Expr(value[0], value[1], scope)
        # a, b = 1, 2 assigns each name as plainly as a = 1 does.
        literal = all(self.IsDisplay(s, e) for s, e in parts)
        for s, e in parts[:-1]:
            if e == s + 1 and self.IsName(texts[s]):
                self.Bind(scope, texts[s], s, kAssignment, order=b)
                if texts[s] == '__all__' and scope.kind == 'module':
                    self.AllNames(value[0], value[1])
            else:
                self.Target(s, e, scope, kAssignment if literal else kUnpacking, order=b)

    def IsDisplay(self, s, e):
        """Whether [s, e) is a tuple or list display (a, b / (a, b) / [a])."""
        if self.FindAtDepth0(s, e, (',',)) < e:
            return True
        return e > s and self.line.texts[s] in ('(', '[') and self.line.match.get(s) == e - 1 \
            and (self.line.texts[s] == '[' or self.FindAtDepth0(s + 1, e - 1, (',',)) < e - 1)

    def AllNames(self, a, b):
        """The string entries of an __all__ list or tuple in [a, b)."""
        texts = self.line.texts
        for k in range(a, b):
            t = texts[k]
            if t[:1] in '\'"' or (t[:1] in 'bBuU' and t[1:2] in '\'"'):
                body = t.lstrip('bBuU')[1:-1]
                if _kName.match(body):
                    self.all_names.append((body, self.line.pos[k]))

    def StringAnnotation(self, text, i, scope):
        """Reads the names of a string annotation, placed at the string."""
        body = text.lstrip('rRuUbB')
        q = 3 if body[:3] in ('"""', "'''") else 1
        body = body[q:len(body) - q]
        if not body.strip() or '\\' in body:
            return
        self.ParsedNames(body.strip(), i, scope)

    def FString(self, text, i, scope):
        """Reads the expressions of an f-string's replacement fields, each name
        placed where it is in the string."""
        quote = len(text) - len(text.lstrip('rRfFbBuU'))
        q = 3 if text[quote:quote + 3] in ('\'\'\'', '"""') else 1
        raw = 'r' in text[:quote].lower()
        for start, expr in _FStringFields(text, quote + q, len(text) - q, raw):
            self.ParsedNames(expr, i, scope, False, text[:start])

    def ParsedNames(self, source, i, scope, annotation=True, before_text=None):
        """Reads the names of an expression held in a string token at i: placed at
        the string, or where they are in it when before_text is the token's text
        up to the expression."""
        logicals = utils.GetLogicalsFromText(b'(' + source + b'\n)\n')
        if not logicals:
            return
        saved = self.line
        line0, col0 = saved.pos[i]
        try:
            sub = _Line(logicals[0])
            if before_text is None:
                sub.pos = _Positions([line0] * sub.n, [col0] * sub.n)
            else:
                rows = before_text.count(b'\n')
                base_line = line0 + rows
                base_col = col0 + len(before_text) if not rows else \
                    len(before_text) - before_text.rfind(b'\n')
                lines, cols = sub.pos.lines, sub.pos.cols
                sub.pos = _Positions([base_line + l - 1 for l in lines],
                                     [base_col + c - 2 if l == 1 else c
                                      for l, c in zip(lines, cols)])
            if annotation and not _LooksLikeExpression(sub.texts, self.keywords):
                return
            self.line = sub
            first = len(scope.references)
            self.in_string = annotation
            children = len(scope.children)
            self.Expr(0, sub.n, scope, annotation=annotation)
            for child in scope.children[children:]:
                child.in_string = True
            for r in scope.references[first:]:
                r.string = annotation
                r.order = (self.record_index, i)
        except (IndexError, KeyError):   # a string that is not an expression reads nothing
            pass
        finally:
            self.line = saved
            self.in_string = False


class Module(object):
    """The resolved names of one file: scopes (module is the root), every
    binding and reference, and the queries and diagnostics over them."""

    def __init__(self, path, version, stub=False):
        self.path = path
        self.version = version
        self.stub = stub
        self.module = Scope('module', 'top', 1, 1, None)
        self.builtins = kBuiltins.get(version, kBuiltins['3.8'])
        if path and str(path).replace('\\', '/').endswith('/__init__.py') or path == '__init__.py':
            self.builtins = self.builtins | kPackageNames
        self.all_names = []
        self.noqa = {}
        self.future_annotations = False
        self._symbols_done = False
        self._at = None
        self._star_used = False
        self.foreign = {}
        self.statements = {}        # if/try statement id -> (head, line, handler names)

    # -- the tree

    def Scopes(self):
        """Every scope, the module first, in preorder."""
        out = []
        stack = [self.module]
        while stack:
            scope = stack.pop()
            out.append(scope)
            stack.extend(reversed(scope.children))
        return out

    def Bindings(self, scope=None):
        """The bindings of a scope (the module by default), in source order."""
        return list((scope or self.module).bindings)

    def References(self):
        return [r for s in self.Scopes() for r in s.references]

    def Outline(self):
        """[(kind, name, line, end_line, children)] of the defs and classes, nested."""
        def Walk(scope):
            out = []
            for child in scope.children:
                if child.kind in ('function', 'class'):
                    out.append(('def' if child.kind == 'function' else 'class', child.name,
                                child.line, child.end_line, Walk(child)))
                else:
                    out.extend(Walk(child))
            return out
        return Walk(self.module)

    def ScopeAt(self, line):
        """The innermost def or class scope (or the module) whose lines hold line."""
        scope = self.module
        while True:
            for child in scope.children:
                if child.kind == 'annotation' and child.children and \
                        child.children[0].kind in ('function', 'class'):
                    child = child.children[0]       # a def or class's type parameters
                if child.kind in ('function', 'class') and \
                        child.decorated_line <= line <= child.end_line:
                    scope = child
                    break
            else:
                return scope

    def NameAt(self, line, col):
        """The binding or reference whose name covers (line, col), 1-based, or None."""
        if self._at is None:
            at = self._at = {}
            for scope in self.Scopes():
                for item in scope.bindings + scope.references:
                    if not (isinstance(item, Reference) and item.string):
                        at.setdefault(item.line, []).append(item)
        for item in self._at.get(line, ()):
            if item.col <= col < item.col + len(item.name):
                return item
        return None

    def DefinitionsAt(self, line, col):
        """The bindings that the name at (line, col) refers to: for a read, the
        binding it resolves to (every binding of its name in that scope when
        the read comes before all of them); for a binding, itself; [] for a
        builtin, an unknown or undefined name, or no name there."""
        item = self.NameAt(line, col)
        if item is None:
            return []
        if isinstance(item, Binding):
            if item.kind in (kGlobalDecl, kNonlocalDecl):
                found = [r for r in item.scope.references if r.name == item.name and r.binding]
                return [found[0].binding] if found else []
            return [item]
        return [item.binding] if item.binding is not None else []

    def ReferencesOf(self, binding):
        """The reads resolved to a binding, in source order."""
        return sorted(binding.references, key=lambda r: r.order)

    # -- symbols as CPython computes them

    def Symbols(self, scope):
        """{'parameters', 'locals', 'globals_explicit', 'globals_implicit', 'free',
        'cell'}: sets of the scope's names (locals include cells)."""
        self._AnalyzeSymbols()
        out = dict((k, set()) for k in ('parameters', 'locals', 'globals_explicit',
                                         'globals_implicit', 'free', 'cell'))
        for name, flags in scope.flags.items():
            if flags & DEF_PARAM:
                out['parameters'].add(name)
            where = scope.scopes.get(name)
            if where in (LOCAL, CELL):
                out['locals'].add(name)
                if where == CELL:
                    out['cell'].add(name)
            elif where == GLOBAL_EXPLICIT:
                out['globals_explicit'].add(name)
            elif where == GLOBAL_IMPLICIT:
                out['globals_implicit'].add(name)
            elif where == FREE:
                out['free'].add(name)
        return out

    def _AnalyzeSymbols(self):
        if self._symbols_done:
            return
        self._symbols_done = True
        _AnalyzeBlock(self.module, None, set(), self.version == '2.7')

    # -- references

    def _Resolve(self):
        self._AnalyzeSymbols()
        deferred_annotations = self.future_annotations or self.stub
        for scope in self.Scopes():
            for r in scope.references:
                self._ResolveOne(r, deferred_annotations)
        for name, (line, col) in self.all_names:
            r = Reference(name, line, col, self.module, (1 << 30, 0), ())
            r.string = r.exported = True
            self._ResolveOne(r, True)
            self.module.references.append(r)

    def _ResolveOne(self, r, deferred_annotations):
        name = r.name
        scope = r.scope
        deferred = r.string or (r.annotation and deferred_annotations)
        first = True
        while scope is not None:
            if scope.kind == 'class' and not first:
                scope = scope.parent
                continue
            flags = scope.flags.get(name, 0)
            if scope.kind != 'module' and flags & DEF_GLOBAL:
                scope, first, deferred = self.module, False, True
                continue
            if flags & DEF_NONLOCAL:
                scope = scope.parent
                while scope is not None and scope.kind == 'class':
                    scope = scope.parent
                first, deferred = False, True
                continue
            by_name = scope._by_name
            if by_name is not None and name not in by_name:
                candidates = None       # nothing of that name bound here
            else:
                candidates, orders, live, live_orders = scope.Candidates(name)
            if candidates:
                if deferred or scope.kind in ('lambda', 'comprehension', 'annotation', 'alias'):
                    if deferred and candidates[-1].kind == kDel and not candidates[-1].clauses \
                            and scope.kind == 'module':
                        # Deleted at the top level: gone once the module has run.
                        r.resolution = kUndefined
                        return
                    at = bisect.bisect_left(live_orders, r.order)
                    r.binding = live[at - 1] if at else live[-1]
                else:
                    # The latest binding that has happened: a del unbinds unless it
                    # is in a block the read is not in.
                    found = None
                    j = bisect.bisect_left(orders, r.order) - 1
                    while j >= 0:
                        b = candidates[j]
                        j -= 1
                        if b.kind == kAnnotationOnly:
                            continue
                        if b.kind == kDel:
                            if found is None and not _Conditional(b, r):
                                found = False
                                break
                            continue
                        found = b
                        break
                    if found is False:
                        r.resolution = kUndefined
                        return
                    if found is not None:
                        r.binding = found
                    elif scope.kind == 'function':
                        # Read before any binding in its own function: the local it
                        # will be, reported only when nothing outside has the name.
                        r.binding = live[0]
                        r.early = not self._VisibleOutside(scope, name)
                    elif scope.kind == 'module' and name not in self.builtins and \
                            not self.module.star_imports:
                        r.binding = live[0]
                        r.early = True
                if r.binding is not None:
                    r.resolution = kBound
                    r.binding.references.append(r)
                    return
            if scope.kind == 'module':
                foreign = self.foreign.get(name)
                if foreign and deferred:
                    real = [b for b in foreign if b.kind != kGlobalDecl]
                    r.binding = (real or foreign)[-1]
                    r.resolution = kBound
                    r.binding.references.append(r)
                    return
                break
            if first and scope.kind == 'class' and name in kClassNames:
                r.resolution = kBuiltin
                return
            if name == '__class__' and scope.kind == 'function' and self.version != '2.7' and \
                    _InClass(scope):
                # The implicit cell of the class a function is defined in.
                r.resolution = kBuiltin
                return
            if scope.kind in ('function', 'lambda', 'alias'):
                deferred = True
            first = False
            scope = scope.parent
        if name in self.builtins:
            r.resolution = kBuiltin
        elif self.module.star_imports:
            r.resolution = kUnknown
            self._star_used = True
        else:
            r.resolution = kUndefined

    def _VisibleOutside(self, scope, name):
        """Whether a name is bound in a scope around a function (classes
        skipped), a builtin, or may come from a star import."""
        if name in self.builtins or self.module.star_imports:
            return True
        scope = scope.parent
        while scope is not None:
            if scope.kind != 'class' and any(
                    b.kind not in (kGlobalDecl, kNonlocalDecl, kStarImport, kDel)
                    for b in scope.BindingsNamed(name)):
                return True
            scope = scope.parent
        return False

    # -- diagnostics

    def Diagnostics(self, select=None, ignore=None, noqa=True):
        """[(line, col, code, message)] sorted, 1-based: F821 undefined name, F401
        unused import, F811 redefinition of an unused name, F841 unused local,
        F403 star import, F405 name maybe from a star import. select and ignore
        are code prefixes; a line's `# noqa` (or `# noqa: CODE,...`) silences it
        unless noqa is False."""
        out = []
        for scope in self.Scopes():
            for r in scope.references:
                if r.exported:
                    # Packages' __init__ often list submodules.
                    if r.resolution == kUndefined and not (self.path and os.path.basename(
                            self.path) == '__init__.py'):
                        out.append((r.line, r.col, 'F822',
                                    "undefined name '%s' in __all__" % r.name))
                elif r.resolution == kUndefined or r.early:
                    if not self._GuardedByNameError(r):
                        out.append((r.line, r.col, 'F821', "undefined name '%s'" % r.name))
                elif r.resolution == kUnknown:
                    modules = ', '.join(b.qualified for b in self.module.star_imports)
                    out.append((r.line, r.col, 'F405',
                                "'%s' may be undefined, or defined from star imports: %s"
                                % (r.name, modules)))
            for b in scope.star_imports:
                line, col = b.statement
                out.append((line, col, 'F403',
                            "'from %s import *' used; unable to detect undefined names"
                            % b.qualified))
                if not self._star_used and not self.stub and scope.kind != 'class':
                    out.append((line, col, 'F401', "'%s.*' imported but unused" % b.qualified))
            out.extend(self._ScopeDiagnostics(scope))
        out = [d for d in out if _Selected(d[2], select, ignore) and
               not (noqa and self._Silenced(d))]
        out.sort()
        return out

    def _ScopeDiagnostics(self, scope):
        out = []
        exported = set(n for n, _ in self.all_names) if scope is self.module else ()
        by_name = {}
        for b in scope.bindings:
            if b.kind in (kGlobalDecl, kNonlocalDecl, kStarImport):
                continue
            by_name.setdefault(b.name, []).append(b)
        declared = set(b.name for b in scope.bindings if b.kind in (kGlobalDecl, kNonlocalDecl))
        for name, bindings in by_name.items():
            used_any = any(b.references for b in bindings)
            # Redefinitions of an import, def or class not used in between.
            current = None
            for b in bindings:
                if b.kind == kAnnotationOnly:
                    continue
                if current is not None and current.kind in _kDefinitionKinds and \
                        b.kind not in (kDel, kAugmented) and \
                        not any(r.order < b.order for r in current.references) and \
                        not _DifferentForks(current, b) and _Redefines(b, current) and \
                        (name != '_' or current.kind in _kImportKinds) and \
                        not _IsOverload(current) and \
                        not (current.kind in (kDef, kClass) and b.kind not in _kDefinitionKinds):
                    out.append((b.line, b.col, 'F811', "redefinition of unused '%s' from line %d"
                                % (name, current.line)))
                current = b
            last = current
            if last is None:
                continue
            # Imports in a class body are its members.
            if last.kind in _kImportKinds and not used_any and name not in exported and \
                    name not in declared and not self._SubmoduleOfUsed(scope, last) and \
                    not self.stub and not (last.qualified or '').startswith('__future__.') and \
                    scope.kind != 'class':
                shown = last.qualified or name
                if last.aliased:
                    shown = '%s as %s' % (last.qualified, name)
                line, col = last.statement or (last.line, last.col)
                out.append((line, col, 'F401', "'%s' imported but unused" % shown))
            if scope.kind == 'function' and last.kind in (kAssignment, kAnnotated) and \
                    not used_any and name != '_' and name not in declared and \
                    not scope.uses_locals and name != '__tracebackhide__':
                out.append((last.line, last.col, 'F841',
                            "local variable '%s' is assigned to but never used" % name))
            for b in bindings:
                if b.kind == kExceptTarget and not b.references and \
                        not (scope.kind == 'function' and scope.uses_locals):
                    out.append((b.line, b.col, 'F841',
                                "local variable '%s' is assigned to but never used" % name))
        return out

    def _SubmoduleOfUsed(self, scope, binding):
        """Whether `import a.b` loads a submodule of a package that the scope
        imports under another name and uses (import a as x; x.b)."""
        if binding.kind != kImport or binding.aliased or b'.' not in (binding.qualified or ''):
            return False
        package = binding.qualified.split(b'.')[0]
        return any(b.kind == kImport and b.qualified == package and b.references
                   for b in scope.bindings)

    def _GuardedByNameError(self, r):
        """Whether a read is in the body of a try statement (of its own function)
        that handles NameError."""
        owner = r.scope
        while owner.kind not in ('module', 'function', 'lambda'):
            owner = owner.parent
        for sid, group in reversed(r.clauses):
            statement = self.statements.get(sid)
            if statement is None or statement[0] != 'try':
                continue
            if group != 0 or statement[1] < owner.line:
                return False
            return 'NameError' in statement[2]
        return False

    def _Silenced(self, diagnostic):
        codes = self.noqa.get(diagnostic[0], False)
        if codes is False:
            return False
        return codes is None or any(diagnostic[2].startswith(c) for c in codes)


def _Selected(code, select, ignore):
    if select and not any(code.startswith(s) for s in select):
        return False
    return not (ignore and any(code.startswith(s) for s in ignore))


def _InClass(scope):
    while scope is not None:
        if scope.kind == 'class':
            return True
        scope = scope.parent
    return False


def _IsOverload(binding):
    return any(d in ('overload', 'typing.overload') for d in binding.decorators)


def _Redefines(new, old):
    if new.kind == kImport and old.kind == kImport and new.qualified and old.qualified:
        if b'.' in new.qualified or b'.' in old.qualified:
            return new.qualified == old.qualified
    if old.kind == kImport and old.qualified and b'.' in old.qualified and \
            new.kind in _kImportKinds:
        return new.qualified == old.qualified
    return True


def _Conditional(binding, reference):
    """Whether a del may not have happened before a read: the del is in a
    block the read is not in."""
    return len(binding.clauses) > len(_CommonPrefix(binding.clauses, reference.clauses))


def _CommonPrefix(a, b):
    n = 0
    for x, y in zip(a, b):
        if x != y:
            break
        n += 1
    return a[:n]


def _DifferentForks(a, b):
    """Whether two bindings are in different branches of one if or try statement."""
    n = len(_CommonPrefix(a.clauses, b.clauses))
    if n >= len(a.clauses) or n >= len(b.clauses):
        return False
    (sa, ga), (sb, gb) = a.clauses[n], b.clauses[n]
    return sa == sb and ga != gb


def _AnalyzeBlock(scope, bound, global_, py2):
    """CPython's analysis of one block's names (symtable.c, analyze_block):
    fills scope.scopes and returns the names free in it."""
    scopes = {}
    local = set()
    free = set()
    newglobal, newbound, newfree = set(), set(), set()
    if scope.kind == 'class':
        newglobal |= global_
        if bound is not None:
            newbound |= bound
    for name, flags in scope.flags.items():
        if flags & DEF_GLOBAL:
            scopes[name] = GLOBAL_EXPLICIT
            global_.add(name)
            if bound is not None:
                bound.discard(name)
        elif flags & DEF_NONLOCAL:
            scopes[name] = FREE
            free.add(name)
        elif flags & DEF_BOUND:
            scopes[name] = LOCAL
            local.add(name)
            global_.discard(name)
        elif bound is not None and name in bound:
            scopes[name] = FREE
            free.add(name)
        else:
            scopes[name] = GLOBAL_IMPLICIT
    if scope.kind != 'class':
        if scope.kind != 'module':
            newbound |= local
        if bound is not None:
            newbound |= bound
        newglobal |= global_
    elif not py2:
        newbound.add('__class__')
    for child in scope.children:
        child_free = _AnalyzeBlock(child, set(newbound), set(newglobal), py2)
        newfree |= child_free
    if scope.kind not in ('module', 'class'):
        for name in list(newfree):
            if scopes.get(name) == LOCAL:
                scopes[name] = CELL
                newfree.discard(name)
    elif scope.kind == 'class':
        newfree.discard('__class__')
    for name in newfree:
        if name in scope.flags:
            continue
        if bound is not None and name not in bound:
            continue
        scope.flags[name] = 0
        scopes[name] = FREE
    scope.scopes = scopes
    free |= newfree
    return free


class _Clauses(object):
    """The if/try clauses enclosing each line, from the indentation of the records."""

    def __init__(self, statements):
        self.stack = []          # (indent, statement id, clause group)
        self.last_at = {}        # indent -> (statement id, head, clauses) of the last header
        self.next_id = 0
        self.statements = statements    # statement id -> (head, line, handler names)
        self.current = ()               # the clauses of the stack

    def Enter(self, logical, head):
        indent = logical.fIndent
        stack = self.stack
        if stack and stack[-1][0] >= indent:
            while stack and stack[-1][0] >= indent:
                stack.pop()
            for k in [k for k in self.last_at if k > indent]:
                del self.last_at[k]
            self.current = None
        if head == 'async' and logical.fTokenCount > 1:
            head = logical.GetTokenString(1)
        if head in _kCompoundHeads:
            if head in _kClauseHeads and indent in self.last_at:
                sid, first, count = self.last_at[indent]
                count += 1
                # A try statement's else runs with its body.
                g = 0 if first == 'try' and head == 'else' else count
                if head == 'except' and first == 'try':
                    names = self.statements[sid][2]
                    for i in range(1, logical.fTokenCount):
                        t = logical.GetTokenString(i)
                        if t in (b':', b'as'):
                            break
                        names.add(t)
            else:
                sid, first, count, g = self.next_id, head, 0, 0
                self.next_id += 1
                if head == 'try':
                    self.statements[sid] = ('try', logical.fFirstLine + 1, set())
            self.last_at[indent] = (sid, first, count)
            self.stack.append((indent, sid, g))
            self.current = None
        elif indent in self.last_at:
            del self.last_at[indent]
        # A header's own names (an except clause's target, a body on the same
        # line) are inside its clause.
        if self.current is None:
            self.current = tuple((s, g) for _, s, g in self.stack)
        return self.current


def Resolve(result, stub=None):
    """The Module of a FileAnalysis (pysource.analysis): its scopes, bindings,
    resolved references and diagnostics. stub: whether the file is a stub
    (.pyi); by default from the path. Never raises for what the file holds."""
    path = result.path
    if stub is None:
        stub = bool(path) and str(path).endswith('.pyi')
    version = result.version or '3.8'
    module = Module(path, version, stub)
    if not result.logicals:
        module._Resolve()
        return module
    if version == '2.7':
        from pysource import analysis
        keywords = _kPy2PrintFunctionKeywords if analysis.UsesPrintFunction(result.logicals) \
            else _kPy2Keywords
    else:
        keywords = _kPy3Keywords
    reader = _Reader(module.module, version, keywords, stub)
    scopes = {}
    clauses = _Clauses(module.statements)
    decorated = None
    errors = result.errors or [None] * len(result.logicals)
    last_line = 1
    top = module.module
    for index, (logical, error) in enumerate(zip(result.logicals, errors)):
        kind = logical.fKind
        line_text = logical.fLineText
        last = logical.fFirstLine + line_text.count(b'\n') + \
            (0 if line_text.endswith(b'\n') else 1)
        if last > last_line:
            last_line = last
        parent = logical.fParentScope
        scope = scopes.get(id(parent), top) if parent is not None else top
        if kind == 21 or kind == 22:
            reader.record_index = index
            if b'#' in line_text:
                _Comments(module, reader, logical, scope)
            continue
        if last > scope.end_line:
            scope.end_line = last       # the enclosing scopes' ends follow below
        first_text = logical.GetTokenString(0) if logical.fTokenCount else b''
        reader.record_index = index
        record_scope = None
        if kind in (1, 2):
            name = logical.GetTokenString(2 if first_text == 'async' else 1) \
                if logical.fTokenCount > 2 else b'?'
            line = logical.fFirstLine + 1
            record_scope = Scope('class' if kind == 1 else 'function', name, line, 1, scope)
            record_scope.end_line = last
            record_scope.decorated_line = decorated[0] if decorated else line
            scopes[id(logical)] = record_scope
        if first_text == '@':
            if decorated is None:
                decorated = (logical.fFirstLine + 1, [])
            decorated[1].append(b''.join(logical.GetTokenString(i)
                                         for i in range(1, logical.fTokenCount)
                                         if logical.GetTokenString(i)[:1] != '#')
                                .split(b'(')[0])
        head = first_text
        if head == 'case' and reader.matches and reader.IsCase(logical.fIndent):
            head = 'if'     # each case's body runs or not, like an if's
        reader.clauses = clauses.Enter(logical, head)
        if error is None:
            try:
                reader.Record(logical, scope, record_scope)
            except (IndexError, KeyError):
                pass    # a line the reader cannot follow contributes what it gave
            _AddRecordedReads(reader, logical, scope)
            if record_scope is not None and record_scope.binding is not None and decorated:
                record_scope.binding.decorators = tuple(decorated[1])
        if error is None:
            if reader.line is not None:
                for line, col, text in reader.line.comments:
                    _Comment(module, reader, text, line, col, scope)
        elif b'#' in line_text:
            _Comments(module, reader, logical, None)
        if first_text != '@':
            decorated = None
    module.module.end_line = last_line
    for scope in reversed(module.Scopes()):
        if scope.parent is not None and scope.end_line > scope.parent.end_line:
            scope.parent.end_line = scope.end_line
    module.all_names = reader.all_names
    module.foreign = reader.foreign
    module.future_annotations = reader.future_annotations
    module._Resolve()
    return module


def _Normalize(name):
    """A Python 3 identifier as the compiler keys it: NFKC-normalized."""
    import unicodedata
    try:
        return unicodedata.normalize('NFKC', name.decode('utf-8')).encode('utf-8')
    except UnicodeError:
        return name


def _LooksLikeExpression(texts, keywords):
    """False for a string that is prose rather than an expression: two names
    in a row."""
    previous = False
    for t in texts:
        name = _kName.match(t) is not None and t not in keywords
        if name and previous:
            return False
        previous = name
    return True


def _FStringFields(text, start, end, raw=False):
    """[(offset, expression text)] of the replacement fields of an f-string's
    body text[start:end], nested ones in format specs included."""
    out = []
    i = start
    while i < end:
        c = text[i]
        if c == '\\' and not raw:
            if text[i + 1:i + 3] == 'N{':
                close = text.find('}', i)
                i = close + 1 if close > 0 else end
            else:
                i += 2
            continue
        if c == '{':
            if text[i + 1:i + 2] == '{':
                i += 2
                continue
            i = _FStringField(text, i + 1, end, out)
            continue
        i += 1
    return out


def _FStringField(text, i, end, out):
    """Reads one field from just past its '{'; returns the index past its '}'."""
    start = i
    depth = 0
    quote = None
    while i < end:
        c = text[i]
        if quote:
            if text.startswith(quote, i):
                i += len(quote)
                quote = None
                continue
            i += 1
            continue
        if c in '\'"':
            quote = text[i:i + 3] if text[i:i + 3] in ('\'\'\'', '"""') else c
            i += len(quote)
            continue
        if c in '([{':
            depth += 1
        elif c in ')]}':
            if depth:
                depth -= 1
            elif c == '}':
                break
        elif not depth and (c == '!' and text[i + 1:i + 2] != '=' or c == ':'):
            break
        i += 1
    expr = text[start:i].rstrip()
    if expr.endswith('=') and expr[-2:-1] not in ('=', '!', '<', '>'):
        expr = expr[:-1]
    if expr.strip():
        out.append((start, expr))
    if i < end and text[i] == '!':
        i += 2
    if i < end and text[i] == ':':
        # The format spec: literal text with nested fields.
        i += 1
        while i < end and text[i] != '}':
            if text[i] == '{':
                i = _FStringField(text, i + 1, end, out)
                continue
            i += 1
    return i + 1


def _Comment(module, reader, text, line, col, scope):
    """A comment: `# noqa` silences its line, a type comment reads names."""
    m = _kNoqa.search(text)
    if m:
        codes = m.group('codes')
        module.noqa[line] = None if codes is None else \
            [c.upper() for c in _kCodes.findall(codes)]
    if scope is not None and b'type:' in text:
        m = _kTypeComment.match(text)
        if m:
            body = m.group(1).split(b'#')[0].strip()
            if body and not body.startswith(b'ignore'):
                saved = reader.line
                reader.line = _Position(line, col)
                try:
                    reader.ParsedNames(body, 0, scope)
                finally:
                    reader.line = saved


def _Comments(module, reader, logical, scope):
    """Reads the comments of a record the token reading does not see."""
    texts, rows, cols = _TokenTable(logical)
    first = logical.fFirstLine + 1
    for i, text in enumerate(texts):
        if text[:1] == '#':
            _Comment(module, reader, text, first + rows[i], cols[i] + 1, scope)


class _Position(object):
    """Stands for a line whose only token is at (line, col)."""

    def __init__(self, line, col):
        self.pos = _Positions([line], [col])
        self.n = 1
        self.ascii = False
        self.kinds = frozenset()


def _AddRecordedReads(reader, logical, scope):
    """Reads the analyzer recorded that the token reading did not see: names in
    f-strings, placed at the string that holds them."""
    line = reader.line
    text = logical.fLineText
    if line is None or not ("f'" in text or 'f"' in text or "F'" in text or 'F"' in text) or \
            not _kFString.search(text):
        return
    info = logical.GetDerivedInfo()
    if not info:
        return
    seen = set()
    for s in _ScopesOfLine(scope, reader):
        for r in s.references:
            if r.order[0] == reader.record_index:
                seen.add(r.name)
    for name, value in info[1]:
        if value != b':g:' or name in seen or b'.' in name:
            continue
        seen.add(name)
        for i, t in enumerate(line.texts):
            if t[-1:] in '\'"' and name in t:
                reader.Use(scope, name, i)
                break


def _ScopesOfLine(scope, reader):
    """The statement's scope and the scopes opened on the line being read."""
    first = reader.line.pos[0][0] if reader.line.n else 0
    out = [scope]
    k = 0
    while k < len(out):
        for child in reversed(out[k].children):
            if child.line < first:
                break
            out.append(child)
        k += 1
    return out


# ---- Names of one line with their positions, for the line view

def DefinedName(logical):
    """The name a def or class record binds, or None."""
    if logical.fKind not in (1, 2) or logical.fTokenCount < 2:
        return None
    at = 2 if logical.GetTokenString(0) == b'async' else 1
    name = logical.GetTokenString(at) if at < logical.fTokenCount else b''
    return name if _kName.match(name) else None


def LineNames(logical, names, reads):
    """(defines, defines_at, reads_at) of one analyzed record: the names it
    defines with the def or class name first, and the (line, column) of each
    defined and each read name (1-based; None when not found).

    Found in the record's tokens natively: a defined name is at its first occurrence that
    does not follow a dot, a read name (dotted or not) at its first such
    occurrence that no defined name took, or at the f-string that holds it.
    """
    defined = DefinedName(logical)
    defines = ([defined] if defined is not None and defined not in names else []) + list(names)
    if not defines and not reads:
        return defines, [], []
    defines_at, reads_at = _fastaccess.LineNameColumns(logical, defines, reads)
    return defines, defines_at, reads_at
