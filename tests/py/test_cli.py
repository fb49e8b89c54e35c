"""The command line: files and folders, both modes, errors."""

import io
import os
import shutil
import sys
import tempfile
import unittest

from pysource import cli
from tests.py import support


class CliTest(unittest.TestCase):

    def setUp(self):
        self.tmp = tempfile.mkdtemp()

    def tearDown(self):
        shutil.rmtree(self.tmp)

    def Run(self, *argv):
        out = io.BytesIO()
        old = sys.stdout
        sys.stdout = out
        try:
            status = cli.Main(list(argv))
        finally:
            sys.stdout = old
        return status, out.getvalue()

    def Write(self, rel, text):
        path = os.path.join(self.tmp, rel)
        if not os.path.isdir(os.path.dirname(path)):
            os.makedirs(os.path.dirname(path))
        with open(path, 'wb') as f:
            f.write(text)
        return path

    def testExampleAnalysedLineByLine(self):
        example = os.path.join(support.kRoot, 'examples', 'sample.py')
        for lang in ('2.7', '3.6'):
            status, out = self.Run('--lang', lang, example)
            self.assertEqual(status, 0, lang)
            self.assertIn('== ' + example, out)
            for expected in ('class   class Point(object):', 'def     def load(',
                             'try         try:', "tokens: 'import' 'os' '.' 'path' 'as' 'osp'"):
                self.assertIn(expected, out, (lang, expected))

    def testFolderSearchedRecursivelyInOrder(self):
        self.Write('b.py', b'y = 2\n')
        self.Write('a/inner.py', b'x = 1\n')
        self.Write('a/notes.txt', b'not python\n')
        status, out = self.Run('--split-only', self.tmp)
        self.assertEqual(status, 0)
        headers = [line for line in out.splitlines() if line.startswith('== ')]
        self.assertEqual(headers, ['== ' + os.path.join(self.tmp, 'a', 'inner.py'),
                                   '== ' + os.path.join(self.tmp, 'b.py')])

    def testSyntaxErrorReportedWithLocation(self):
        path = self.Write('bad.py', b'x = 1\nif x\n')
        status, out = self.Run(path)
        self.assertEqual(status, 0)
        self.assertIn('error: invalid syntax (line 1, column 5)', out)

    def testMissingFileFailsButOthersRun(self):
        good = self.Write('ok.py', b'z = 3\n')
        err = io.BytesIO()
        old = sys.stderr
        sys.stderr = err
        try:
            status, out = self.Run(os.path.join(self.tmp, 'missing.py'), good)
        finally:
            sys.stderr = old
        self.assertEqual(status, 1)
        self.assertIn('cannot read', err.getvalue())
        self.assertIn('== ' + good, out)

    def testPrintFunctionModulesUseTheVariantGrammar(self):
        body = b'print(x, file=f)\nprint >>f, x\n'
        path = self.Write('future.py', b'from __future__ import print_function\n' + body)
        status, out = self.Run(path)
        lines = [l for l in out.splitlines() if l.startswith('       error')]
        self.assertEqual(lines, [], out)      # `print >>f, x` is a shift expression there
        path = self.Write('plain.py', body)
        status, out = self.Run(path)
        lines = [l for l in out.splitlines() if l.startswith('       error')]
        self.assertEqual(len(lines), 1, out)      # only the print call with a keyword fails
        status, out = self.Run('--lang', '3.6', path)
        self.assertNotIn('error:', out)       # both are expressions in Python 3

    def testAsyncDefScopeFromParents(self):
        from pysource import utils
        logicals = utils.GetLogicalsFromText(
            b'async def f():\n    await g()\n    def h():\n        await k()\n')
        self.assertEqual([cli.InAsyncDef(l) for l in logicals], [False, True, True, False])


if __name__ == '__main__':
    unittest.main()
