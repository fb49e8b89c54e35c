"""Command line: analyse Python files and folders one logical line at a time.

    python2.7 -m pysource.cli [--lang 2.7|3.5|3.6] [--split-only] PATH...

Each PATH is a .py file or a folder searched recursively for .py files. For
every logical line the output gives its first line number, kind and text, and
what the analyzer recorded: names defined, type equivalences, argument names,
base classes, or the syntax error. With --split-only, or when the analyzer
module is not built, it prints the logical lines with their kinds and tokens.
"""

from __future__ import print_function

import argparse
import os
import sys

from pysource import utils

kKindNames = {0: 'stmt', 1: 'class', 2: 'def', 11: 'try', 21: 'comment', 22: 'blank'}

# Keywords of Python 3.5 and 3.6 (async and await are handled by the parser).
kPy3Keywords = (
    'False', 'None', 'True', 'and', 'as', 'assert', 'break', 'class', 'continue',
    'def', 'del', 'elif', 'else', 'except', 'finally', 'for', 'from', 'global',
    'if', 'import', 'in', 'is', 'lambda', 'nonlocal', 'not', 'or', 'pass',
    'raise', 'return', 'try', 'while', 'with', 'yield')

# Language version -> (version triple, grammar file, is a Python 3 grammar,
# keywords; None for the interpreter's own list).
kPrintFunctionGrammar = 'Python-Grammar-2.7-print-function'

kLanguages = {
    '2.7': ((2, 7, 0), 'Python-Grammar-2.7', False, None),
    '3.5': ((3, 5, 0), 'Python-Grammar-3.5', True, kPy3Keywords),
    '3.6': ((3, 6, 0), 'Python-Grammar-3.6', True, kPy3Keywords),
}


def IterSourceFiles(paths):
    """Yields the .py files named by paths, folders searched in sorted order."""
    for path in paths:
        if os.path.isdir(path):
            found = []
            for dirpath, dirnames, filenames in os.walk(path):
                found.extend(os.path.join(dirpath, name) for name in filenames
                             if name.endswith('.py'))
            for name in sorted(found, key=lambda p: p.split(os.sep)):
                yield name
        else:
            yield path


def UsesPrintFunction(logicals):
    """True when a module imports print_function from __future__.

    Python 2.7 then parses the whole module without the print statement; the
    analyzer needs the grammar variant that has none.
    """
    for logical in logicals:
        if logical.fKind in (21, 22) or logical.fTokenCount < 4:
            continue
        texts = [logical.GetTokenString(i) for i in range(logical.fTokenCount)]
        if texts[:3] == [b'from', b'__future__', b'import'] and b'print_function' in texts:
            return True
    return False


def InAsyncDef(logical):
    """True when the nearest enclosing def of a logical is an async def."""
    scope = logical.fParentScope
    while scope is not None:
        if scope.fKind == 2:
            return scope.fTokenCount > 0 and scope.GetTokenString(0) == b'async'
        if scope.fKind == 1:
            return False
        scope = scope.fParentScope
    return False


def _Text(logical):
    return logical.fLineText.rstrip(b'\r\n').split(b'\n')[0].rstrip(b'\r')


def _Show(values):
    out = []
    for v in values:
        if isinstance(v, tuple):
            out.append(b'='.join(x if isinstance(x, bytes) else repr(x) for x in v))
        else:
            out.append(v if isinstance(v, bytes) else repr(v))
    return b', '.join(out)


def PrintSplit(logical, out):
    print('%5d  %-7s %s' % (logical.fFirstLine + 1, kKindNames.get(logical.fKind, logical.fKind),
                            _Text(logical)), file=out)
    if logical.fTokenCount:
        print('       tokens: %s' % ' '.join(repr(t) for t, _ in logical.fTokens), file=out)


def PrintAnalysis(logical, error, out):
    PrintSplit(logical, out)
    if error is not None:
        print('       error: %s (line %s, column %s)' % (error.msg, error.lineno, error.offset),
              file=out)
        return
    for label, attr in (('defines', 'fNamesDefined'), ('equivs', 'fTypeEquivs'),
                        ('args', 'fArgNames'), ('arg equivs', 'fArgTypeEquivs'),
                        ('bases', 'fBaseClassNames')):
        values = getattr(logical, attr)
        if values:
            print('       %s: %s' % (label, _Show(values)), file=out)


def MakeAnalyzer(lang, print_function=False):
    """The analyzer for a language version, or None when the module is not built.

    With print_function (2.7 only), the analyzer for modules that import it.
    """
    try:
        from pysource import treelens
    except ImportError:
        return None
    triple, grammar, py3, keywords = kLanguages[lang]
    if print_function and not py3:
        import keyword
        grammar = kPrintFunctionGrammar
        keywords = [k for k in keyword.kwlist if k != 'print']
    return treelens.CPGenAnalyzerImpl(triple, grammar, keywords, py3, grammar)


class Analyzers(object):
    """The analyzers of one language version, made when first needed."""

    def __init__(self, lang):
        self._lang = lang
        self._made = {}

    def ForModule(self, logicals):
        """The analyzer for a module's logicals; None when the module is not built."""
        key = self._lang == '2.7' and UsesPrintFunction(logicals)
        if key not in self._made:
            self._made[key] = MakeAnalyzer(self._lang, key)
        return self._made[key]


def Main(argv=None):
    parser = argparse.ArgumentParser(description=__doc__.split('\n\n')[0])
    parser.add_argument('paths', nargs='+', metavar='PATH')
    parser.add_argument('--lang', choices=sorted(kLanguages), default='2.7',
                        help='language version of the sources (default 2.7)')
    parser.add_argument('--split-only', action='store_true',
                        help='only split into logical lines and tokens')
    args = parser.parse_args(argv)
    analyzers = None if args.split_only else Analyzers(args.lang)
    out = sys.stdout
    status = 0
    for path in IterSourceFiles(args.paths):
        try:
            with open(path, 'rb') as f:
                text = f.read()
        except (IOError, OSError) as e:
            print('%s: cannot read: %s' % (path, e), file=sys.stderr)
            status = 1
            continue
        print('== %s' % path, file=out)
        logicals = utils.GetLogicalsFromText(text)
        analyzer = analyzers.ForModule(logicals) if analyzers else None
        for logical in logicals:
            if analyzer is None:
                PrintSplit(logical, out)
            elif logical.fKind == 22:
                continue
            else:
                PrintAnalysis(logical, analyzer.AnalyzeSingleLogical(logical, InAsyncDef(logical)),
                              out)
    return status


if __name__ == '__main__':
    sys.exit(Main())
