"""Syntax errors only the whole file shows (pysource.filechecks), judged by CPython.

Each case is a small file; CPython's compile() of the same version gives the
expected message, line and offset. Encoding errors CPython places on line 0
(the file as a whole) and the file runner's messages are written out here.
"""

import unittest

from tests.py import mutants
from tests.py import support

try:
    from pysource import analysis
except ImportError as _exc:  # native modules not built
    analysis = None
    _kImportError = str(_exc)


def setUpModule():
    if analysis is None:
        raise unittest.SkipTest('pysource not importable: %s' % _kImportError)


kJudged = [
    # decorators with no def or class after them
    b'@dec\n', b'@dec\nx = 1\n', b'@dec\n\n# c\nx = 1\n', b'@a\n@b\ndef f(): pass\n',
    b'@a\nclass C: pass\n', b'@dec\n# c\n', b'x = 1\n@dec\n', b'class C:\n    @d\n    x = 1\n',
    b'@d\n    def f(): pass\n',
    # future imports after other statements
    b'import os\nfrom __future__ import division\n', b'"doc"\nfrom __future__ import division\n',
    b'"doc"\n"doc2"\nfrom __future__ import division\n', b"b'doc'\nfrom __future__ import division\n",
    b'from __future__ import division\nfrom __future__ import print_function\n',
    b'# c\n\n"""doc"""\nfrom __future__ import division\n',
    b'if x:\n    pass\nfrom __future__ import division\n',
    # break and continue with their loop on other lines, or none
    b'if x:\n    break\n', b'if x:\n    continue\n', b'for x in y:\n    def f():\n        break\n',
    b'for x in y:\n    if x:\n        break\n', b'for x in y:\n    pass\nelse:\n    break\n',
    b'for x in y:\n    try:\n        pass\n    finally:\n        continue\n',
    b'try:\n    pass\nfinally:\n    for x in y:\n        continue\n', b'if x:\n    pass; break\n',
    b'if x:\n    if y: break\n', b'while 1:\n    for x in y:\n        pass\n    else:\n        break\n',
    b'for x in y:\n    class A:\n        break\n', b'for x in y:\n    with a:\n        if b:\n            continue\n',
    b'while x:\n    try:\n        pass\n    except E:\n        continue\n',
    # indentation
    b'x = 1\n    y = 2\n', b'if x:\ny = 2\n', b'if x:\n', b'if x:\n# c\n', b'x = 1\nif x:\n',
    b'if x:\n        a\n    b\n', b'if x:\n\ta\n        b\n', b'if x:\n        a\n\tb\n',
    b'if x:\n    \ta\n\tb\n', b'x = (1,\n  2)\n    \n', b'if x:\n# c\ny = 1\n',
    b'class A:\n    x = 1\n      y = 2\n', b'if x:\n\x0c    y = 1\n', b'def f():\n    if x:\n',
    b'if x:\n\tif y:\n\t\tpass\n\telse:\n\t    pass\n',
    # identifiers (the file is UTF-8: a cookie for Python 2)
    b'# coding: utf-8\nx\xe2\x82\xac = 1\n', b'# coding: utf-8\ny = 1 + \xe2\x82\xac\n',
    b'# coding: utf-8\nab\xe2\x82\xacc = 1\n', b'# coding: utf-8\nx = (1,\n  ab\xe2\x82\xac)\n',
    b'# coding: utf-8\n\xd9\xa1x = 1\n', b'# coding: utf-8\n\xc3\xa9t\xc3\xa9 = 1\n',
    b'# coding: utf-8\nx = "\xe2\x82\xac"  # \xe2\x82\xac\n',
]

# 3.10 and 3.11: what only the whole match statement or try statement shows.
kJudgedNew = [
    b'match x:\n    case a: pass\n    case 1: pass\n', b'match x:\n    case _:\n        pass\n    case 1: pass\n',
    b'match x:\n    case a if a: pass\n    case 1: pass\n', b'match x:\n    case 1: pass\n    case a: pass\n',
    b'match x:\n    case a:\n        match y:\n            case 1: pass\nz = 1\n',
    b'try:\n    pass\nexcept* E:\n    pass\nexcept F:\n    pass\n',
    b'try:\n    pass\nexcept E:\n    pass\nexcept* F:\n    pass\n',
    b'try:\n    try: pass\n    except E: pass\nexcept* F:\n    pass\n',
]

# Errors CPython gives for the whole file (line 0), or only when it runs a
# file: (source, version or None for all, message, line).
kWritten = [
    (b'# coding: foobar\nx = 1\n', None, 'unknown encoding: foobar', 1),
    (b'#!/usr/bin/python\n# vim: set fileencoding=foobar :\nx = 1\n', None, 'unknown encoding: foobar', 2),
    (b'x = 1\n# coding: foobar\n', None, None, None),
    (b'\xef\xbb\xbf# coding: latin-1\nx = 1\n', None, 'encoding problem: iso-8859-1 with BOM', 1),
    (b'\xef\xbb\xbf# coding: UTF8\nx = 1\n', None, 'encoding problem: UTF8 with BOM', 1),
    (b'\xef\xbb\xbf# coding: utf-8\nx = 1\n', None, None, None),
    (b'# -*- coding: Latin-1 -*-\ny = "\xe9"\n', None, None, None),
    (b'# coding: ascii\nx = 1\ny = "\xc3\xa9"\n', None,
     "'ascii' codec can't decode byte 0xc3 in position 27: ordinal not in range(128)", 3),
    (b'x = 1\ny = "\xe9"\n', '3.6', "Non-UTF-8 code starting with '\\xe9' in file t.py on line 2, "
     "but no encoding declared; see http://python.org/dev/peps/pep-0263/ for details", 2),
    (b'x = 1\n# \xe9\n', '3.8', "Non-UTF-8 code starting with '\\xe9' in file t.py on line 2, "
     "but no encoding declared; see http://python.org/dev/peps/pep-0263/ for details", 2),
    (b'x = "\xc3\xa9"\n', '3.8', None, None),
    (b'x = "\xc3\xa9"\n', '2.7', "Non-ASCII character '\\xc3' in file t.py on line 1, "
     "but no encoding declared; see http://python.org/dev/peps/pep-0263/ for details", 1),
]


def FirstError(version, source, checks=True):
    """[message, line, offset] of the first error of a file, and its class name."""
    result = analysis.AnalyzeText(source, version, path='t.py', checks=checks)
    for logical, error in zip(result.logicals, result.errors):
        if error is not None:
            return [error.msg, error.lineno, error.offset], type(error).__name__
    return None, None


class FileChecksTest(unittest.TestCase):

    def testAgainstCPython(self):
        for version in ('2.7', '3.6', '3.7', '3.8'):
            theirs = mutants.Verdicts(version, kJudged)
            if theirs is None:
                continue
            wrong = [(version, source, want, FirstError(version, source)[0])
                     for source, want in zip(kJudged, theirs)
                     if FirstError(version, source)[0] != want]
            self.assertEqual(wrong, [])

    def testMatchAndExceptStarAgainstCPython(self):
        for version in ('3.10', '3.11', '3.12', '3.13'):
            sources = [s for s in kJudgedNew if b'except*' not in s or version != '3.10']
            theirs = mutants.Verdicts(version, sources)
            if theirs is None:
                continue
            wrong = [(version, source, want, FirstError(version, source)[0])
                     for source, want in zip(sources, theirs)
                     if FirstError(version, source)[0] != want]
            self.assertEqual(wrong, [])

    def testEncodings(self):
        wrong = []
        for source, only, message, line in kWritten:
            for version in ([only] if only else analysis.kVersions):
                got = FirstError(version, source)[0]
                if (got and got[:2]) != (message and [message, line]):
                    wrong.append((version, source, got))
        self.assertEqual(wrong, [])

    def testErrorClassesAndWhatTheLineKeeps(self):
        self.assertEqual(FirstError('3.8', b'if x:\n\ta\n        b\n')[1], 'TabError')
        self.assertEqual(FirstError('2.7', b'if x:\n\ta\n        b\n'), (None, None))
        self.assertEqual(FirstError('3.8', b'x = 1\n    y = 2\n')[1], 'IndentationError')
        result = analysis.AnalyzeText(b'x = 1\n    y = z\n', '3.8')
        self.assertEqual([l['defines'] for l in result.Lines()], [['x'], []])
        self.assertEqual(result.status, analysis.kSyntaxError)

    def testChecksOptionAndAuto(self):
        # Lexer and parser errors stay without the checks; the compiler's go.
        late = b'import os\nfrom __future__ import division\nif x:\n    break\n'
        self.assertEqual(len(analysis.AnalyzeText(late, '3.8').SyntaxErrors()), 2)
        self.assertEqual(analysis.AnalyzeText(late, '3.8', checks=False).SyntaxErrors(), [])
        self.assertEqual(FirstError('3.8', b'@d\nx = 1\n', checks=False)[0][0], 'invalid syntax')
        # Tabs that Python 3 rejects: auto falls back to 2.7; a Latin-1 file
        # without a cookie is no Python 3 and no Python 2.
        result = analysis.AnalyzeText(b'if x:\n\ta = 1\n        b = 2\n')
        self.assertEqual((result.version, result.status), ('2.7', analysis.kOk))
        result = analysis.AnalyzeText(b'x = 1\ny = "\xe9"\n')
        self.assertEqual(result.status, analysis.kSyntaxError)


if __name__ == '__main__':
    unittest.main()
