"""What CPython's own ast says a completed logical line binds, reads and declares.

Runs unchanged under Python 2.7 and 3.x: the 2.7 corpus test imports it, the
3.x corpus tests run it in the 3.x interpreter (Main reads a JSON list of
[key, source] pairs on stdin and prints {key: facts}).

The facts follow what the symbol walker is meant to record, not everything
CPython knows: the bodies of def and class are other logical lines, class
bases and keywords are not read, the target of an augmented assignment is
neither read nor bound, and names inside f-strings are another component's
(Main(fstring_reads=True) counts the names f-strings read all the same). An
assignment expression binds its name on the line, also inside a
comprehension, where CPython binds it in the enclosing scope.
"""

import ast
import json
import sys

kLiteralNames = ('None', 'True', 'False')


def Dotted(node):
    """'a.b.c' for a chain of attributes on a name, else None."""
    parts = []
    while isinstance(node, ast.Attribute):
        parts.append(node.attr)
        node = node.value
    if not isinstance(node, ast.Name):
        return None
    parts.append(node.id)
    return '.'.join(reversed(parts))


def TargetNames(node, out):
    """Names a target binds: plain names and dotted names, through tuples, lists and stars."""
    if isinstance(node, (ast.Tuple, ast.List)):
        for elt in node.elts:
            TargetNames(elt, out)
    elif getattr(ast, 'Starred', None) and isinstance(node, ast.Starred):
        TargetNames(node.value, out)
    else:
        name = Dotted(node)
        if name is not None:
            out.append(name)


def ParamNames(args):
    """Parameter names of an ast.arguments, in source order, nested tuples flattened."""
    names = []

    def Add(a):
        if isinstance(a, ast.Tuple):
            for elt in a.elts:
                Add(elt)
        elif isinstance(a, ast.Name):
            names.append(a.id)
        elif a is not None:
            names.append(getattr(a, 'arg', a))
    for a in list(getattr(args, 'posonlyargs', [])) + list(args.args):
        Add(a)
    Add(args.vararg)
    for a in getattr(args, 'kwonlyargs', []):
        Add(a)
    Add(args.kwarg)
    return names


class Collector(ast.NodeVisitor):

    def __init__(self, fstring_reads=False):
        self.fstring_reads = fstring_reads
        self.bound, self.loads, self.within = [], set(), []
        self.globals, self.nonlocals = [], []
        self.args = self.bases = None
        self.typeparams = []

    def visit_Name(self, node):
        if isinstance(node.ctx, ast.Load) and node.id not in kLiteralNames:
            self.loads.add(node.id)

    def TypeParams(self, node):
        """Type parameters (3.12) bind in the definition's own scope: they are
        their own fact; their bounds and defaults are read."""
        for param in getattr(node, 'type_params', None) or []:
            self.typeparams.append(param.name)
            self.generic_visit(param)

    def visit_FunctionDef(self, node):
        self.TypeParams(node)
        self.args = ParamNames(node.args)
        for sub in node.decorator_list + node.args.defaults + list(getattr(node.args, 'kw_defaults', [])):
            if sub is not None:
                self.visit(sub)
        args = node.args
        for a in (list(getattr(args, 'posonlyargs', [])) + list(args.args) + list(getattr(args, 'kwonlyargs', []))
                  + [args.vararg, args.kwarg]):
            if getattr(a, 'annotation', None) is not None:
                self.visit(a.annotation)
        if getattr(node, 'returns', None) is not None:
            self.visit(node.returns)

    visit_AsyncFunctionDef = visit_FunctionDef

    def visit_ClassDef(self, node):
        self.TypeParams(node)
        bases = [b for b in node.bases if not (getattr(ast, 'Starred', None) and isinstance(b, ast.Starred))]
        self.bases = [d for d in (Dotted(b) for b in bases) if d is not None]
        for sub in node.decorator_list:
            self.visit(sub)

    def visit_Lambda(self, node):
        self.within.extend(ParamNames(node.args))
        for sub in node.args.defaults + list(getattr(node.args, 'kw_defaults', [])):
            if sub is not None:
                self.visit(sub)
        self.visit(node.body)

    def visit_comprehension(self, node):
        names = []
        TargetNames(node.target, names)
        self.within.extend(n for n in names if '.' not in n)
        self.generic_visit(node)

    def visit_Assign(self, node):
        for target in node.targets:
            TargetNames(target, self.bound)
        self.generic_visit(node)

    def visit_AnnAssign(self, node):
        if node.value is not None:
            TargetNames(node.target, self.bound)
        self.generic_visit(node)

    def visit_NamedExpr(self, node):
        TargetNames(node.target, self.bound)
        self.visit(node.value)

    def visit_AugAssign(self, node):
        self.visit(node.value)

    def visit_For(self, node):
        TargetNames(node.target, self.bound)
        self.generic_visit(node)

    visit_AsyncFor = visit_For

    def visit_With(self, node):
        items = getattr(node, 'items', None)
        if items is None:  # Python 2: one item per With node
            items = [node]
        for item in items:
            if item.optional_vars is not None:
                TargetNames(item.optional_vars, self.bound)
        self.generic_visit(node)

    visit_AsyncWith = visit_With

    def visit_ExceptHandler(self, node):
        if isinstance(node.name, str):
            self.bound.append(node.name)
        elif node.name is not None:
            TargetNames(node.name, self.bound)
        self.generic_visit(node)

    def visit_Import(self, node):
        for alias in node.names:
            self.bound.append(alias.asname or alias.name.split('.')[0])

    def visit_ImportFrom(self, node):
        for alias in node.names:
            if alias.name != '*':
                self.bound.append(alias.asname or alias.name)

    def visit_TypeAlias(self, node):
        TargetNames(node.name, self.bound)
        self.TypeParams(node)
        self.visit(node.value)

    # Patterns: captures, star captures and mapping rests bind (the wildcard
    # has no name); value and class patterns read through their Name nodes.
    def visit_MatchAs(self, node):
        if node.name is not None:
            self.bound.append(node.name)
        self.generic_visit(node)

    def visit_MatchStar(self, node):
        if node.name is not None:
            self.bound.append(node.name)

    def visit_MatchMapping(self, node):
        if node.rest is not None:
            self.bound.append(node.rest)
        self.generic_visit(node)

    def visit_Global(self, node):
        self.globals.extend(node.names)

    def visit_Nonlocal(self, node):
        self.nonlocals.extend(node.names)

    def visit_JoinedStr(self, node):
        if self.fstring_reads:
            self.generic_visit(node)


def Facts(source, fstring_reads=False):
    """The facts of one completed logical line, or None when CPython cannot parse it."""
    try:
        tree = ast.parse(source)
    except (SyntaxError, ValueError, TypeError):
        return None
    c = Collector(fstring_reads)
    c.visit(tree)
    return {'bound': c.bound, 'loads': sorted(c.loads), 'within': c.within, 'globals': c.globals,
            'nonlocals': c.nonlocals, 'args': c.args, 'bases': c.bases, 'typeparams': c.typeparams}


def Main(fstring_reads=False):
    items = json.loads(sys.stdin.read())
    out = {}
    for key, src in items:
        out[key] = Facts(src.encode('latin-1'), fstring_reads)
    sys.stdout.write(json.dumps(out))


if __name__ == '__main__':
    Main()
