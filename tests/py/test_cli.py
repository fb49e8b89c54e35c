"""The command line, run as a new user runs it: a subprocess over files, folders and stdin."""

import json
import os
import re
import shutil
import signal
import subprocess
import sys
import tempfile
import threading
import time
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
        self.assertEqual(out, good + b': version 3.13\n' + good + b':1: [stmt] import os\n    defines: os\n    equivs: os = '
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
                 'mixed.py': b'if x:\r\ty = (1,\\\n 2)\r# c\n\n'}
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
                             [dict(l, path=paths[name], version='3.13') for l in entry['lines']]
                             or [{'path': paths[name], 'version': '3.13', 'status': 'ok',
                                  'problem': None}])
        line = [f for f in files if f['path'] == paths['latin1.py']][0]['lines'][1]
        self.assertEqual((line['defines'], line['reads'], line['equivs'], line['error']),
                         (['s'], [], [['s', u':l:string: \'caf\udce9\'']], None))
        self.assertEqual(sorted(line), ['arg_equivs', 'args', 'bases', 'defines', 'defines_at',
                                        'equivs', 'error', 'kind', 'line', 'reads', 'reads_at',
                                        'text', 'truncated'])

    def testSymlinkLoopAndMixedVersions(self):
        self.Write('pkg/old.py', b'print "x"\n')
        self.Write('pkg/new.py', b'print(f"{x}")\n')
        self.Write('pkg/new36.py', b'async = 1\n')
        self.Write('pkg/new38.py', b'def f(a, /):\n    if (n := a): return n\n')
        self.Write('pkg/sub/notes.txt', b'')
        os.symlink('..', os.path.join(self.tmp, 'pkg', 'sub', 'up'))
        os.symlink('..', os.path.join(self.tmp, 'pkg', 'up'))
        status, out, err = Treelens('--format', 'jsonl', '-q', 'pkg', cwd=self.tmp)
        self.assertEqual(status, 0, err)
        self.assertEqual([(l['path'], l['version']) for l in map(json.loads, out.splitlines())],
                         [('pkg/new.py', '3.13'), ('pkg/new36.py', '3.6'), ('pkg/new38.py', '3.13'),
                          ('pkg/new38.py', '3.13'), ('pkg/old.py', '2.7'), ('pkg/sub/up', None),
                          ('pkg/up', None)])
        for lang, status_wanted in (('3.7', 1), ('3.8', 0)):
            self.assertEqual(Treelens('-q', '--lang', lang, 'pkg/new38.py', cwd=self.tmp)[0], status_wanted, lang)
        self.assertEqual(err, b'pkg/sub/up: note: symlink loop: folder already being searched, '
                         b'not followed\npkg/up: note: symlink to outside the folders searched, '
                         b'not followed\n')
        status, out, err = Treelens('--format', 'jsonl', '-q', '--follow-external-links', 'pkg',
                                    cwd=self.tmp)
        self.assertIn(b'{"path": "pkg/up/pkg", "version": null, "status": "skipped", ', out)

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

    def testEveryFileHasARecordOnItsOwnLines(self):
        self.Write('empty.py', b'')
        self.Write('bin.py', b'\0')
        self.Write('new\nline.py', b'x = 1\ns = "\xc3\xa9\xc3\xa9" +  = 2\n')
        self.Write('old.py', b'print "x"\ny = 1\nx = (\n')
        names = ['bin.py', 'empty.py', 'new\nline.py', 'old.py']
        paths = [os.path.join(self.tmp, n) for n in names]
        escaped = [p.replace(b'\n', b'\\n') for p in paths]
        # --format, --errors-only: what the output holds
        cases = [('jsonl', False, [
                     {'path': paths[0], 'version': None, 'status': 'unreadable',
                      'problem': 'not Python source: NUL byte at line 1, column 1'},
                     {'path': paths[1], 'version': '3.13', 'status': 'ok', 'problem': None},
                     (paths[2], 1, None), (paths[2], 2, (13, 15)),
                     (paths[3], 1, None), (paths[3], 2, None), (paths[3], 3, (6, 6))]),
                 ('jsonl', True, [{'path': paths[0], 'version': None, 'status': 'unreadable',
                                   'problem': 'not Python source: NUL byte at line 1, column 1'},
                                  (paths[2], 2, (13, 15)), (paths[3], 3, (6, 6))]),
                 ('text', True, [escaped[2] + b':2:13: invalid syntax', escaped[3] + b':3:6: invalid syntax']),
                 ('text', False, [escaped[1] + b': version 3.13', escaped[2] + b': version 3.13',
                                  escaped[2] + b':1: [stmt] x = 1', b'    defines: x',
                                  b'    equivs: x = :l:int: 1',
                                  escaped[2] + b':2: [stmt] s = "\xc3\xa9\xc3\xa9" +  = 2',
                                  b'    error: 2:13: invalid syntax', escaped[3] + b': version 2.7',
                                  escaped[3] + b':2: [stmt] y = 1', b'    defines: y',
                                  b'    equivs: y = :l:int: 1', escaped[3] + b':3: [stmt] x = (',
                                  b'    error: 3:6: invalid syntax'])]
        for fmt, errors_only, wanted in cases:
            status, out, err = Treelens('-q', '--format', fmt, self.tmp,
                                        *(['--errors-only'] if errors_only else []))
            self.assertEqual(status, 2, err)
            self.assertEqual(err, escaped[0] + b': error: not Python source: NUL byte at line 1, column 1\n')
            if fmt == 'text':
                self.assertEqual(out.splitlines(), wanted)
                continue
            got = []
            for record in map(json.loads, out.splitlines()):
                if 'line' not in record:
                    got.append(record)
                    continue
                error = record['error'] and (record['error']['column'], record['error']['byte_column'])
                got.append((record['path'], record['line'], error))
            self.assertEqual(got, wanted, (fmt, errors_only))

    def testDeadWorkersFilesFailTheRestIsDone(self):
        for name in ('a.py', 'die.py', 'm.py', 'oom.py', 'z.py'):
            self.Write('src/' + name, b'x = 1\n')
        script = self.Write('run.py', b"""
import os, signal, sys
from pysource import analysis, cli
report, analyze = cli.ReportTask, analysis.AnalyzeText
def Dying(task, options):
    if task[0].endswith('die.py'):
        os.kill(os.getpid(), signal.SIGKILL)
    return report(task, options)
def Exhausted(text, version, path, checks):
    if path.endswith('oom.py'):
        raise MemoryError
    return analyze(text, version, path, checks)
cli.ReportTask, analysis.AnalyzeText = Dying, Exhausted
sys.exit(cli.Main(sys.argv[1:]))
""")
        env = dict(os.environ, PYTHONPATH=support.kRoot)
        proc = subprocess.Popen([sys.executable, script, '-q', '-j', '2', '--format', 'jsonl',
                                 os.path.join(self.tmp, 'src')], stdout=subprocess.PIPE, stderr=subprocess.PIPE, env=env)
        watchdog = threading.Timer(120, proc.kill)      # a hung run fails, not hangs the suite
        watchdog.start()
        out, err = proc.communicate()
        watchdog.cancel()
        self.assertEqual(proc.returncode, 2, err)
        got = [(os.path.basename(r['path']), r.get('status', 'line')) for r in map(json.loads, out.splitlines())]
        self.assertEqual(got, [('a.py', 'line'), ('die.py', 'failed'), ('m.py', 'line'),
                               ('oom.py', 'failed'), ('z.py', 'line')])
        self.assertEqual([line.split(b': ', 1)[1] for line in err.splitlines()],
                         [b'error: the worker process analyzing it died (killed by signal 9)',
                          b'error: out of memory'])

    def testBrokenStreamsEndWithOneLineAndStatus2(self):
        big = self.Write('big.py', b'x = y\n' * 20000)
        good = self.Write('good.py', b'x = 1\n')
        cli_ = '"%s" -m pysource.cli' % sys.executable
        # shell command, exit status, standard error
        cases = [('%s -q %s > /dev/full' % (cli_, big), 2,
                  b'treelens: cannot write the output: No space left on device\n'),
                 ('%s -q %s >&-' % (cli_, good), 2,
                  b'treelens: cannot write the output: Bad file descriptor\n'),
                 ('%s -q - <&-' % cli_, 2, b'-: error: cannot read standard input: Bad file descriptor\n'),
                 ('%s %s 2>/dev/full' % (cli_, good), 2, None),
                 ('%s %s 2>&-' % (cli_, good), 2, None),
                 ('%s -q %s 2>&- && echo clean >&2' % (cli_, good), 0, b'clean\n'),
                 # The reader went away: quietly.
                 ('%s -q -j 2 %s %s | head -c 10 > /dev/null; exit ${PIPESTATUS[0]}' % (cli_, big, big),
                  2, b'')]
        env = dict(os.environ, PYTHONPATH=support.kRoot)
        for command, wanted, wanted_err in cases:
            proc = subprocess.Popen(['bash', '-c', '( %s ) 2>&1 >/dev/null' % command if wanted_err is None
                                     else command], stdout=subprocess.PIPE,
                                    stderr=subprocess.PIPE, env=env)
            out, err = proc.communicate()
            self.assertEqual(proc.returncode, wanted, (command, err))
            if wanted_err is not None:
                self.assertEqual(err, wanted_err, command)
            self.assertNotIn(b'Traceback', out + err)
        # An interrupt while standard input is read.
        proc = subprocess.Popen([sys.executable, '-m', 'pysource.cli', '-q', '-'], env=env,
                                stdin=subprocess.PIPE, stdout=subprocess.PIPE, stderr=subprocess.PIPE)
        proc.stdin.write(b'x = 1\n')
        proc.stdin.flush()
        time.sleep(3)           # (until it reads: the interpreter has started)
        proc.send_signal(signal.SIGINT)
        out, err = proc.communicate()
        self.assertEqual((proc.returncode, err), (130, b'treelens: interrupted\n'))

    def CheckRoundTrip(self, jsonl):
        """Every file's line texts, in order, give back the file."""
        texts = {}
        for line in jsonl.splitlines():
            entry = json.loads(line)
            texts.setdefault(entry['path'], [])
            if 'line' in entry:         # not the record of a file with no line
                texts[entry['path']].append(Lossless(entry['text']))
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
