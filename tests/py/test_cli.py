"""The command line, run as a new user runs it: a subprocess over files, folders and stdin."""

import json
import os
import re
import shutil
import subprocess
import sys
import tempfile
import unittest

from tests.py import support

try:
    from pysource import cli
except ImportError as _exc:  # native modules not built
    cli = None
    _kImportError = str(_exc)


def setUpModule():
    if cli is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)


def Treelens(*argv, **kw):
    """(exit status, stdout, stderr) of the command line."""
    env = dict(os.environ, PYTHONPATH=support.kRoot)
    if 'TREELENS_BUILD_DIR' in env:
        env['TREELENS_BUILD_DIR'] = os.path.abspath(env['TREELENS_BUILD_DIR'])
    proc = subprocess.Popen([sys.executable, '-m', 'pysource.cli'] + list(argv),
                            stdin=subprocess.PIPE, stdout=subprocess.PIPE,
                            stderr=subprocess.PIPE, cwd=kw.get('cwd'), env=env)
    out, err = proc.communicate(kw.get('stdin', b''))
    return proc.returncode, out, err


def Lossless(text):
    """The bytes of a JSON text: lone U+DC80..U+DCFF are the bytes that were not UTF-8."""
    parts = re.split(u'((?<![\ud800-\udbff])[\udc80-\udcff])', text)
    return b''.join(chr(ord(p) - 0xDC00) if i % 2 else p.encode('utf-8')
                    for i, p in enumerate(parts))


class CliTest(unittest.TestCase):

    def setUp(self):
        self.tmp = tempfile.mkdtemp()

    def tearDown(self):
        shutil.rmtree(self.tmp)

    def Write(self, rel, text):
        path = os.path.join(self.tmp, rel)
        if not os.path.isdir(os.path.dirname(path)):
            os.makedirs(os.path.dirname(path))
        with open(path, 'wb') as f:
            f.write(text)
        return path

    def testTextFormatAndExitStatuses(self):
        good = self.Write('good.py', b'import os\n\nx = y\n')
        bad = self.Write('bad.py', b'x = 1\nif x\n')
        status, out, err = Treelens(good)
        self.assertEqual(status, 0, err)
        self.assertEqual(out, good + b':1: [stmt] import os\n    defines: os\n    equivs: os = '
                         b':i:os\n' + good + b':3: [stmt] x = y\n    defines: x\n    reads: y\n'
                         b'    equivs: x = y\n')
        self.assertEqual(err, b'1 files, 3 logical lines, 0 syntax errors, %s seconds\n'
                         % re.search(br'[0-9.]+ seconds', err).group().split()[0])
        status, out, err = Treelens('-q', good, bad)
        self.assertEqual((status, err), (1, b''))
        self.assertIn(bad + b':2: [stmt] if x\n    error: 2:5: invalid syntax\n', out)
        for argv in (['--bogus', good], ['-j', '0', good], ['--lang', '3.14', good], []):
            status, out, err = Treelens(*argv)
            self.assertEqual((status, out), (2, b''), argv)
            self.assertIn(b'usage: treelens', err)

    def testErrorsOnlyStdinAndUnreadablePaths(self):
        # A missing file, a binary file and a dangling link do not stop the others.
        binary = self.Write('bin.py', b'x = 1\n\x7fELF\x00\x01\n')
        os.symlink(os.path.join(self.tmp, 'none'), os.path.join(self.tmp, 'link.py'))
        bad = self.Write('d/bad.py', b'def f(:\n    pass\n')
        status, out, err = Treelens('--errors-only', '-q', '--lang', '3.6', 'missing.py', binary,
                                    '-', self.tmp,
                                    '--stdin-filename', 'in.py', stdin=b'\n\nprint x\n')
        self.assertEqual(status, 2)
        self.assertEqual(out, b"in.py:3:7: Missing parentheses in call to 'print'. Did you mean print(x)?\n" +
                         bad + b':1:7: invalid syntax\n')
        self.assertEqual(err.splitlines(), [
            b'missing.py: error: cannot read: No such file or directory',
            binary + b': error: not Python source: NUL byte at line 2, column 5',
            binary + b': error: not Python source: NUL byte at line 2, column 5',
            os.path.join(self.tmp, 'link.py') + b': error: cannot read: No such file or directory'])
        status, out, err = Treelens('--errors-only', '--lang', '2.7', '-', stdin=b'print x\n')
        self.assertEqual((status, out), (0, b''))
        # CPython's checks after parsing, unless switched off.
        for flags, expected in (((), (1, b'-:2:1: can\'t assign to function call\n')), (('--no-checks',), (0, b''))):
            status, out, err = Treelens('--errors-only', '--lang', '3.6', '-', *flags, stdin=b'x = 1\nf() = x\n')
            self.assertEqual((status, out), expected, flags)

    def testJsonRoundTripsEveryText(self):
        texts = {'latin1.py': b'# -*- coding: latin-1 -*-\ns = "caf\xe9"\r\nt = "\xed\xa0\x80"\n',
                 'utf8.py': b'\xef\xbb\xbfs = "\xf0\x9f\x98\x80\xe2\x82\xac"\nu"\\u00e9"\n',
                 'empty.py': b'',
                 'long.py': b'x = [' + b'1, ' * 350000 + b']\n',
                 'mixed.py': b'\tif x:\r  y = (1,\\\n 2)\r# c\n\n'}
        paths = dict((name, self.Write(name, text)) for name, text in texts.items())
        status, out, err = Treelens('--format', 'json', '-q', self.tmp)
        self.assertEqual(status, 0, err)
        files = json.loads(out)['files']
        self.assertEqual([f['path'] for f in files], [paths[n] for n in sorted(texts)])
        status, jsonl, err = Treelens('--format', 'jsonl', '-q', self.tmp)
        lines = [json.loads(line) for line in jsonl.splitlines()]
        for name, text in texts.items():
            entry = [f for f in files if f['path'] == paths[name]][0]
            self.assertEqual((entry['status'], entry['version'], entry['problem']),
                             ('ok', '3.13', None), name)
            bom = 3 if text.startswith(b'\xef\xbb\xbf') else 0
            self.assertEqual(b''.join(Lossless(l['text']) for l in entry['lines']), text[bom:], name)
            self.assertEqual([l for l in lines if l['path'] == paths[name]],
                             [dict(l, path=paths[name], version='3.13') for l in entry['lines']])
        line = [f for f in files if f['path'] == paths['latin1.py']][0]['lines'][1]
        self.assertEqual((line['defines'], line['reads'], line['equivs'], line['error']),
                         (['s'], [], [['s', u':l:string: \'caf\udce9\'']], None))
        self.assertEqual(sorted(line), ['arg_equivs', 'args', 'bases', 'defines', 'equivs',
                                        'error', 'kind', 'line', 'reads', 'text'])

    def testSymlinkLoopAndMixedVersions(self):
        self.Write('pkg/old.py', b'print "x"\n')
        self.Write('pkg/new.py', b'print(f"{x}")\n')
        self.Write('pkg/new36.py', b'async = 1\n')
        self.Write('pkg/new38.py', b'def f(a, /):\n    if (n := a): return n\n')
        os.symlink('..', os.path.join(self.tmp, 'pkg', 'up'))
        status, out, err = Treelens('--format', 'jsonl', '-q', 'pkg', cwd=self.tmp)
        self.assertEqual(status, 0, err)
        self.assertEqual([(l['path'], l['version']) for l in map(json.loads, out.splitlines())],
                         [('pkg/new.py', '3.13'), ('pkg/new36.py', '3.6'), ('pkg/new38.py', '3.13'),
                          ('pkg/new38.py', '3.13'), ('pkg/old.py', '2.7')])
        for lang, status_wanted in (('3.7', 1), ('3.8', 0)):
            self.assertEqual(Treelens('-q', '--lang', lang, 'pkg/new38.py', cwd=self.tmp)[0], status_wanted, lang)
        self.assertEqual(err, b'pkg/up/pkg: note: symlink loop: folder already being searched, '
                         b'not followed\n')

    def testParallelOutputIsIdentical(self):
        lib = support.StdlibDir('2.7')
        some = [os.path.join(lib, 'json'), os.path.join(lib, 'email')]
        for fmt, paths in (('jsonl', some if support.kSanitized else [lib]), ('text', some)):
            one = Treelens('-q', '--format', fmt, *paths)
            two = Treelens('-q', '-j', '2', '--format', fmt, *paths)
            self.assertEqual(one[0], two[0], fmt)
            self.assertTrue(one[1] == two[1], fmt)   # (no diff of megabytes)
            self.assertGreater(len(one[1]), 100000, fmt)
            if fmt == 'jsonl':
                self.CheckRoundTrip(one[1])

    def CheckRoundTrip(self, jsonl):
        """Every file's line texts, in order, give back the file."""
        texts = {}
        for line in jsonl.splitlines():
            entry = json.loads(line)
            texts.setdefault(entry['path'], []).append(Lossless(entry['text']))
        for path, parts in texts.items():
            text = support.ReadBytes(path)
            self.assertEqual(b''.join(parts), text[3:] if text[:3] == b'\xef\xbb\xbf' else text,
                             path)


class ProgressTest(unittest.TestCase):

    class Terminal(object):
        def __init__(self, tty):
            self.tty, self.text = tty, ''

        def isatty(self):
            return self.tty

        def write(self, text):
            self.text += text

        def flush(self):
            pass

    def testDrawnOnlyOnATerminalAfterAMoment(self):
        now = [100.0]
        for tty, elapsed, drawn in ((True, 0.1, False), (True, 2.0, True), (False, 2.0, False)):
            stream = self.Terminal(tty)
            progress = cli.Progress(4, stream, lambda: now[0])
            now[0] += elapsed
            progress.Update(2)
            self.assertEqual(stream.text.startswith('\r[' + '#' * 15 + '.' * 15 + '] 2/4 files'),
                             drawn, (tty, elapsed))
            progress.Close()
            self.assertEqual(stream.text.endswith(' \r'), drawn)


if __name__ == '__main__':
    unittest.main()
