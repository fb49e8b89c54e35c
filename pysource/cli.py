"""treelens: what each logical line of Python source defines, reads and fails on.

    treelens [options] PATH...        (or: python2.7 -m pysource.cli ...)

Each PATH is a file, a folder (searched recursively for .py and .pyi files,
in sorted order), or - for standard input. Only regular files of at most
32 MiB are read; symlinks in a folder are followed only when they lead into
one of the folders given (--follow-external-links follows any).

Formats (--format):
  text    per analyzed file a line "path: version V", then one block per
          logical line that records something (default)
  json    one document: {"files": [{"path", "version", "status", "problem",
          "lines": [...]}, ...]}
  jsonl   one object per logical line, with its "path" and "version"; a file
          with no logical line (empty, unreadable, skipped, failed) gets one
          object {"path", "version", "status", "problem"} instead
A line has the fields line, kind, text, defines, reads, equivs, args,
arg_equivs, bases, error (null, or message, line, column and byte_column,
1-based; column counts characters as CPython does, byte_column bytes) and
truncated (true when the walk stopped at its limits: only what it recorded
before is there; a note on standard error names the line).
Texts are the source bytes decoded as UTF-8; a byte that is not valid UTF-8
appears as the lone surrogate U+DC80 + byte, so that in Python 3
text.encode('utf-8', 'surrogateescape') gives back the exact bytes.

--check reports what the resolver finds across lines, as
path:line:col: CODE message: F821 undefined name, F401 unused import, F811
redefinition of an unused name, F841 unused local variable, F403 star import,
F405 name that may come from a star import (--select and --ignore take codes;
a line's "# noqa" or "# noqa: F401" silences it); syntax errors are listed
among them. With json each file has "diagnostics"; with jsonl each is an
object with path, line, column, code and message.

--errors-only prints only the syntax errors, as path:line:col: message (the
column counts characters from 1); with json or jsonl, only the lines with one
and the records of files that were not analyzed. In the text formats a path's
backslashes and control characters are escaped (\\\\, \\n, \\t, \\xNN).

Exit status: 0 when every file was analyzed and no line has a syntax error,
1 when some line has one (or --check found something), 2 for a usage error, a path that cannot be read, a
file whose analysis failed (the other paths are still analyzed) or output
that cannot be written, 130 when interrupted. Problems go to standard error.
"""

from __future__ import print_function

import argparse
import errno
import json
import os
import re
import select
import signal
import sys
import time

from pysource import analysis
from pysource import resolver

kFormats = ('text', 'json', 'jsonl')
kExitOk, kExitSyntax, kExitProblem = 0, 1, 2
kExitInterrupted = 130
kExitForStatus = {analysis.kOk: kExitOk, analysis.kSkipped: kExitOk,
                  analysis.kSyntaxError: kExitSyntax, analysis.kUnreadable: kExitProblem,
                  analysis.kFailed: kExitProblem}
# More worker processes than this only cost memory.
kMaxJobs = 64

# ---- JSON: bytes as strings, losslessly

# One or more characters of strictly valid UTF-8 (no surrogates, no overlongs).
_kValidUtf8 = re.compile(br'(?:[\x00-\x7f]|[\xc2-\xdf][\x80-\xbf]|\xe0[\xa0-\xbf][\x80-\xbf]'
                         br'|[\xe1-\xec\xee\xef][\x80-\xbf]{2}|\xed[\x80-\x9f][\x80-\xbf]'
                         br'|\xf0[\x90-\xbf][\x80-\xbf]{2}|[\xf1-\xf3][\x80-\xbf]{3}'
                         br'|\xf4[\x80-\x8f][\x80-\xbf]{2})+')
_EncodeString = json.encoder.encode_basestring_ascii


def DecodeLossless(data):
    """Unicode for bytes: strict UTF-8, each other byte as U+DC80 + byte."""
    parts = []
    pos, end = 0, len(data)
    while pos < end:
        m = _kValidUtf8.match(data, pos)
        if m:
            parts.append(m.group().decode('utf-8'))
            pos = m.end()
        else:
            parts.append(unichr(0xDC00 + ord(data[pos])))
            pos += 1
    return u''.join(parts)


def JsonString(data):
    """The JSON string (ASCII) for bytes or unicode."""
    try:
        encoded = _EncodeString(data)
    except UnicodeDecodeError:
        return _EncodeString(DecodeLossless(data))
    # The interpreter's UTF-8 decoder lets encoded surrogates through.
    if '\\ud' in encoded and isinstance(data, bytes):
        return _EncodeString(DecodeLossless(data))
    return encoded


def _JsonStrings(items):
    return '[' + ', '.join([JsonString(t) for t in items]) + ']'


def _JsonPairs(pairs):
    return '[' + ', '.join(['[%s, %s]' % (JsonString(n), JsonString(i)) for n, i in pairs]) + ']'


kJsonNothingRecorded = (', "defines": [], "defines_at": [], "reads": [], "reads_at": [], '
                        '"equivs": [], "args": [], "arg_equivs": [], "bases": [], "error": null, '
                        '"truncated": false}')


def JsonLine(logical, error, prefix=''):
    """One analyzed record as a JSON object (the fields of analysis.LineView);
    prefix holds leading fields."""
    head = '{%s"line": %d, "kind": "%s", "text": %s' % (
        prefix, logical.fFirstLine + 1, analysis.KindName(logical.fKind),
        JsonString(logical.fLineText))
    info = logical.GetDerivedInfo()
    truncated = logical.fTruncated
    if info is None and error is None and not truncated and logical.fKind not in (1, 2):
        return head + kJsonNothingRecorded
    names, type_equivs, args, arg_equivs, bases = info or analysis.kNoDerivedInfo
    reads, equivs = analysis.SplitReads(type_equivs)
    if error is None:
        error_json = 'null'
        names, defines_at, reads_at = resolver.LineNames(logical, names, reads)
    else:
        error_json = ('{"message": %s, "line": %d, "column": %d, "byte_column": %d}'
                      % _ErrorFields(logical, error))
        defines_at, reads_at = [None] * len(names), [None] * len(reads)
    return '%s, "defines": %s, "defines_at": %s, "reads": %s, "reads_at": %s, "equivs": %s, ' \
        '"args": %s, "arg_equivs": %s, "bases": %s, "error": %s, "truncated": %s}' % (
            head, _JsonStrings(names), _JsonPositions(defines_at), _JsonStrings(reads),
            _JsonPositions(reads_at), _JsonPairs(equivs), _JsonStrings(args),
            _JsonPairs(arg_equivs), _JsonStrings(bases), error_json, 'true' if truncated else 'false')


def _JsonPositions(positions):
    return '[' + ', '.join(['null' if p is None else '[%d, %d]' % p for p in positions]) + ']'


def _ErrorFields(logical, error):
    line, column, byte_column, message = analysis.ErrorPosition(logical, error)
    return JsonString(message), line, column, byte_column


def _Null(value):
    return 'null' if value is None else JsonString(value)


# ---- text

_kPathEscapes = re.compile(br'[\x00-\x1f\x7f\\]')
_kNamedEscapes = {b'\n': b'\\n', b'\r': b'\\r', b'\t': b'\\t', b'\\': b'\\\\'}


def EscapePath(path):
    """A path for the line formats: backslashes and control characters
    escaped, so that one path stays on one line."""
    return _kPathEscapes.sub(
        lambda m: _kNamedEscapes.get(m.group()) or b'\\x%02x' % ord(m.group()), path)


def _ErrorText(logical, error):
    line, column, _, message = analysis.ErrorPosition(logical, error)
    return b'%d:%d: %s' % (line, column, message)


def _FirstLine(text):
    return text.split(b'\n', 1)[0].rstrip(b'\r\n').split(b'\r', 1)[0]


def _Pairs(pairs):
    return b', '.join(n + b' = ' + i for n, i in pairs)


kTruncatedText = b'    truncated: the walk stopped at its limits; only what it recorded before is shown\n'
kTruncatedNote = ('%s:%d: note: the walk stopped at its limits (10000 visits, nesting depth 40); '
                  'only what it recorded before is reported\n')


def TextBlock(path, logical, error):
    """The text block of one analyzed record, or b'' when it records nothing."""
    info = logical.GetDerivedInfo()
    if info is None and error is None and not logical.fTruncated and logical.fKind not in (1, 2):
        return b''
    names, type_equivs, args, arg_equivs, bases = info or analysis.kNoDerivedInfo
    reads, equivs = analysis.SplitReads(type_equivs)
    defined = resolver.DefinedName(logical) if error is None else None
    if defined is not None and defined not in names:
        names = (defined,) + tuple(names)
    fields = [(b'defines', b', '.join(names)), (b'reads', b', '.join(reads)),
              (b'equivs', _Pairs(equivs)), (b'args', b', '.join(args)),
              (b'arg equivs', _Pairs(arg_equivs)), (b'bases', b', '.join(bases))]
    lines = [b'    %s: %s\n' % (label, value) for label, value in fields if value]
    if error is not None:
        lines.append(b'    error: %s\n' % _ErrorText(logical, error))
    if logical.fTruncated:
        lines.append(kTruncatedText)
    return b'%s:%d: [%s] %s\n' % (path, logical.fFirstLine + 1, analysis.KindName(logical.fKind),
                                  _FirstLine(logical.fLineText).strip()) + b''.join(lines)


# ---- one file

class Options(object):
    """What the output of a file depends on."""

    def __init__(self, version, fmt, errors_only, checks=True, check=False, select=None,
                 ignore=None):
        self.version = version
        self.fmt = fmt
        self.errors_only = errors_only
        self.checks = checks
        self.check = check          # --check: the resolver's diagnostics
        self.select = select
        self.ignore = ignore


def _PathBytes(path):
    return path.encode('utf-8') if isinstance(path, unicode) else path


kAnalyzed = (analysis.kOk, analysis.kSyntaxError)


def Report(result, options):
    """(output bytes, problem line or None, logical lines, syntax errors, status,
    diagnostics) of a FileAnalysis."""
    path = _PathBytes(result.path)
    line_path = EscapePath(path)
    problem = None
    if result.problem is not None:
        problem = '%s: %s: %s\n' % (line_path, 'note' if result.status == analysis.kSkipped
                                    else 'error', result.problem)
    notes = ''.join([kTruncatedNote % (path, l.fFirstLine + 1) for l in result.logicals
                     if l.fTruncated])
    if notes:
        problem = (problem or '') + notes
    pairs = zip(result.logicals, result.errors)
    if options.errors_only:
        pairs = [(l, e) for l, e in pairs if e is not None]
    errors = sum(1 for e in result.errors if e is not None)
    fmt = options.fmt
    diagnostics = []
    if options.check and result.status in kAnalyzed:
        diagnostics = resolver.Resolve(result).Diagnostics(options.select, options.ignore)
    if options.check and fmt == 'text':
        # A linter's output: syntax errors and diagnostics in line order.
        found = [analysis.ErrorPosition(l, e)[:2] + analysis.ErrorPosition(l, e)[3:]
                 for l, e in zip(result.logicals, result.errors) if e is not None]
        found.extend((line, col, '%s %s' % (code, message))
                     for line, col, code, message in diagnostics)
        found.sort(key=lambda d: d[:2])
        out = b''.join(b'%s:%d:%d: %s\n' % ((line_path,) + d) for d in found)
    elif options.errors_only and fmt == 'text':
        out = b''.join(b'%s:%s\n' % (line_path, _ErrorText(l, e)) for l, e in pairs)
    elif fmt == 'text':
        head = b'%s: version %s\n' % (line_path, result.version) if result.status in kAnalyzed else b''
        out = head + b''.join([TextBlock(line_path, l, e) for l, e in pairs])
    elif fmt == 'jsonl':
        prefix = '"path": %s, "version": %s, ' % (JsonString(path), _Null(result.version))
        out = b''.join([JsonLine(l, e, prefix) + '\n' for l, e in pairs])
        # A file with no logical line still gets a record, so that a reader
        # sees every file (with --errors-only, those not analyzed).
        if not result.logicals and not (options.errors_only and result.status in kAnalyzed):
            out = '{%s"status": "%s", "problem": %s}\n' % (prefix, result.status,
                                                           _Null(result.problem))
        out += b''.join(['{%s%s}\n' % (prefix, _JsonDiagnostic(d)) for d in diagnostics])
    else:
        checked = ''
        if options.check:
            checked = ', "diagnostics": [%s]' % ', '.join(
                ['{%s}' % _JsonDiagnostic(d) for d in diagnostics])
        out = '{"path": %s, "version": %s, "status": "%s", "problem": %s%s, "lines": [%s]}' % (
            JsonString(path), _Null(result.version), result.status, _Null(result.problem),
            checked, ','.join(['\n  ' + JsonLine(l, e) for l, e in pairs]))
    return out, problem, len(result.logicals), errors, result.status, len(diagnostics)


def _JsonDiagnostic(diagnostic):
    line, col, code, message = diagnostic
    return '"line": %d, "column": %d, "code": "%s", "message": %s' % (
        line, col, code, JsonString(message))


def ReportTask(task, options):
    """Analyzes one task of the run and reports it (see Report); a failure of
    the analysis is that file's status kFailed, not the run's end."""
    path, status, problem, text = task
    try:
        if problem is not None:
            result = analysis.FileAnalysis(path, status=status, problem=problem)
        elif text is not None:
            result = analysis.AnalyzeText(text, options.version, path, options.checks)
        else:
            result = analysis.AnalyzeFile(path, options.version, options.checks)
        return Report(result, options)
    except analysis.AnalysisFailure as e:
        why = str(e)
    except MemoryError:
        why = 'out of memory'
    return Report(analysis.FileAnalysis(path, status=analysis.kFailed, problem=why), options)


def _Worker(tasks, results, options):
    """A worker process: reports the (index, task) pairs it receives until None."""
    signal.signal(signal.SIGINT, signal.SIG_IGN)
    while True:
        item = tasks.recv()
        if item is None:
            return
        index, task = item
        results.send((index, ReportTask(task, options)))


class WorkerPool(object):
    """Reports tasks in worker processes, one task per worker at a time.

    A worker that dies (killed for memory, say) is noticed by the end of its
    result pipe; the task it held is reported as failed and a new worker
    takes its place.
    """

    def __init__(self, count, options):
        import multiprocessing
        self._mp = multiprocessing
        self.options = options
        self.count = count
        self.workers = []       # [process, task pipe, result pipe, index held or None]

    def _Start(self):
        tasks_out, tasks_in = self._mp.Pipe(False)
        results_out, results_in = self._mp.Pipe(False)
        process = self._mp.Process(target=_Worker, args=(tasks_out, results_in, self.options))
        process.daemon = True
        process.start()
        # Only the worker holds these ends: its death closes the result pipe.
        tasks_out.close()
        results_in.close()
        worker = [process, tasks_in, results_out, None]
        self.workers.append(worker)
        return worker

    def Reports(self, tasks):
        """Yields the report of each task, in the order of tasks."""
        pending = iter(enumerate(tasks))
        done = {}
        following = 0
        for _ in range(self.count):
            self._Start()
        busy = 0
        for worker in self.workers:
            busy += self._Give(worker, pending)
        while True:
            while following in done:
                yield done.pop(following)
                following += 1
            if not busy:
                break
            ready = select.select([w[2] for w in self.workers if w[3] is not None], [], [])[0]
            for worker in [w for w in self.workers if w[2] in ready]:
                index = worker[3]
                try:
                    got, report = worker[2].recv()
                except (EOFError, IOError, OSError):
                    done[index] = self._Died(worker, tasks[index])
                    worker = self._Start()
                else:
                    done[got] = report
                worker[3] = None
                busy -= 1
                busy += self._Give(worker, pending)

    def _Give(self, worker, pending):
        """Sends the next task to an idle worker (to a new one if it has died
        meanwhile); 1 when there was one, else 0."""
        for index, task in pending:
            for _ in range(3):
                try:
                    worker[1].send((index, task))
                    break
                except (IOError, OSError):
                    self._Discard(worker)
                    worker = self._Start()
            else:
                raise RuntimeError('worker processes die as soon as they start')
            worker[3] = index
            return 1
        return 0

    def _Discard(self, worker):
        """Forgets a dead worker; its exit code."""
        process = worker[0]
        self.workers.remove(worker)
        worker[1].close()
        worker[2].close()
        process.join(1)
        if process.is_alive():
            process.terminate()
            process.join()
        return process.exitcode

    def _Died(self, worker, task):
        code = self._Discard(worker)
        how = ('killed by signal %d' % -code if code is not None and code < 0
               else 'exited with status %s' % code)
        result = analysis.FileAnalysis(task[0], status=analysis.kFailed,
                                       problem='the worker process analyzing it died (%s)' % how)
        return Report(result, self.options)

    def Close(self):
        for worker in self.workers:
            try:
                worker[1].send(None)
            except (IOError, OSError):
                pass
        for worker in self.workers:
            worker[0].join()

    def Kill(self):
        for worker in self.workers:
            if worker[0].is_alive():
                worker[0].terminate()


# ---- the run

class Progress(object):
    """A progress bar on a stream (standard error), drawn only when it is a
    terminal and the run has lasted more than a moment."""

    kDelay = 0.5
    kInterval = 0.1
    kWidth = 30

    def __init__(self, total, stream, clock=time.time):
        self.total = total
        self.stream = stream
        self.enabled = total > 0 and stream.isatty()
        self.clock = clock
        self.start = self.last = clock()
        self.drawn = False

    def Update(self, done):
        if not self.enabled:
            return
        now = self.clock()
        if now - self.start < self.kDelay or now - self.last < self.kInterval:
            return
        self.last = now
        filled = self.kWidth * done // self.total
        self.stream.write('\r[%s%s] %d/%d files' % ('#' * filled, '.' * (self.kWidth - filled),
                                                    done, self.total))
        self.stream.flush()
        self.drawn = True

    def Close(self):
        if self.drawn:
            self.stream.write('\r' + ' ' * (self.kWidth + 30) + '\r')
            self.stream.flush()
            self.drawn = False


class _Discard(object):
    def write(self, text):
        pass

    def flush(self):
        pass


class _Silent(object):
    def isatty(self):
        return False


class _OutputError(Exception):
    """Standard output cannot be written (closed or full)."""


def _Exit(pool, status, err=None, message=None):
    """Ends the run at once with status: the workers, then this process,
    after one line of message on standard error (if it can be written).
    Nothing that remains is worth flushing."""
    if pool is not None:
        pool.Kill()
    if message is not None:
        try:
            err.write('treelens: %s\n' % message)
            err.flush()
        except Exception:
            pass
    os._exit(status)


def _ReadStdin(stdin):
    """(bytes, None) or (None, why not) for standard input."""
    if stdin is None:
        return None, 'cannot read standard input: it is closed'
    try:
        return analysis.ReadBounded(stdin)
    except (IOError, OSError) as e:
        return None, 'cannot read standard input: %s' % (e.strerror or e)
    except ValueError as e:         # a closed file object
        return None, 'cannot read standard input: %s' % e


def _Tasks(args, stdin):
    """The tasks of a run in output order: (path, status, problem, text or None)."""
    tasks = []
    folders = [p for p in args.paths if p != '-' and os.path.isdir(p)]
    for path in args.paths:
        if path == '-':
            text, problem = _ReadStdin(stdin)
            tasks.append((args.stdin_filename, analysis.kOk if problem is None
                          else analysis.kUnreadable, problem, text))
            continue
        if not os.path.lexists(path):
            tasks.append((path, analysis.kUnreadable, 'cannot read: No such file or directory',
                          None))
            continue
        for found, status, problem in analysis.IterSourcePaths([path], args.follow_links,
                                                               roots=folders):
            tasks.append((found, status, problem, None))
    return tasks


def _Codes(text):
    codes = [c.strip().upper() for c in text.split(',') if c.strip()]
    for code in codes:
        if not re.match(r'[A-Z][0-9]*\Z', code):
            raise argparse.ArgumentTypeError('not a diagnostic code: %r' % code)
    return codes


def _ParseArgs(argv):
    parser = argparse.ArgumentParser(
        prog='treelens', description=__doc__.split('\n\n')[0],
        epilog='Exit status: 0 no syntax error, 1 syntax errors, 2 usage error, unreadable path, '
        'failed analysis or output that cannot be written, 130 interrupted.')
    parser.add_argument('paths', nargs='+', metavar='PATH',
                        help='file or folder to analyse, or - for standard input')
    parser.add_argument('--lang', choices=analysis.kVersions + (analysis.kAuto,),
                        default=analysis.kAuto,
                        help='language version of the sources; auto (default) picks per file '
                        'the newest version with no syntax error, else the one with the fewest '
                        'lines in error')
    parser.add_argument('--format', choices=kFormats, default='text',
                        help='output format (default text)')
    parser.add_argument('--errors-only', action='store_true',
                        help='report only syntax errors (text: path:line:col: message)')
    parser.add_argument('--no-checks', dest='checks', action='store_false',
                        help='report only what the grammar rejects, not the errors CPython finds '
                        'after parsing (targets that cannot be assigned, misplaced arguments, '
                        'return outside a function, ...)')
    parser.add_argument('--follow-external-links', dest='follow_links', action='store_true',
                        help='in folders, also follow symlinks that lead outside the folders '
                        'given (by default they are reported as skipped)')
    parser.add_argument('--stdin-filename', default='-', metavar='NAME',
                        help='the path to report for standard input')
    parser.add_argument('-j', '--jobs', type=int, default=1, metavar='N',
                        help='analyse files in N processes (output is the same; at most one per '
                        'file and %d)' % kMaxJobs)
    parser.add_argument('-q', '--quiet', action='store_true',
                        help='no progress bar and no closing summary')
    parser.add_argument('--check', action='store_true',
                        help='report undefined names (F821), unused imports (F401), '
                        'redefinitions of unused names (F811), unused locals (F841) and star '
                        'imports (F403, F405) as path:line:col: CODE message')
    parser.add_argument('--select', type=_Codes, metavar='CODES',
                        help='with --check, only these codes (comma-separated prefixes)')
    parser.add_argument('--ignore', type=_Codes, metavar='CODES',
                        help='with --check, not these codes (comma-separated prefixes)')
    # Paths may follow options too (treelens a.py --format json b.py).
    args, extra = parser.parse_known_args(argv)
    unknown = [a for a in extra if a.startswith('-') and a != '-']
    if unknown:
        parser.error('unrecognized arguments: %s' % ' '.join(unknown))
    args.paths.extend(extra)
    if args.jobs < 1:
        parser.error('-j must be at least 1')
    return args


def _StandardStream(name):
    stream = getattr(sys, name)
    if stream is None:
        return None
    return getattr(stream, 'buffer', stream)


def Main(argv=None, stdin=None, stdout=None, stderr=None):
    args = _ParseArgs(argv)
    stdin = stdin or _StandardStream('stdin')
    out = stdout or _StandardStream('stdout')
    err = _Errors(stderr or sys.stderr)
    # The analyzer writes a line to sys.stdout when a walk hits its limits;
    # Report notes those lines on standard error with their path and line,
    # so that line is dropped and the output stays parseable.
    saved_stdout, sys.stdout = sys.stdout, _Discard()
    try:
        return _Run(args, stdin, out, err)
    finally:
        sys.stdout = saved_stdout


class _Output(object):
    """Standard output; a failure to write is _OutputError."""

    def __init__(self, stream):
        self.stream = stream

    def write(self, data):
        try:
            self.stream.write(data)
        except (IOError, OSError, ValueError) as e:
            raise _OutputError(e)

    def flush(self):
        try:
            self.stream.flush()
        except (IOError, OSError, ValueError) as e:
            raise _OutputError(e)


class _Errors(object):
    """Standard error: a failure to write it is remembered, not raised (the
    run goes on; its exit status says so)."""

    def __init__(self, stream):
        self.stream = stream
        self.failed = False

    def write(self, data):
        try:
            self.stream.write(data)
            self.stream.flush()
        except Exception:
            self.failed = True

    def flush(self):
        pass

    def isatty(self):
        try:
            return self.stream.isatty()
        except Exception:
            return False


def _Run(args, stdin, out, err):
    started = time.time()
    pool = None
    out = _Output(out)
    try:
        options = Options(args.lang, args.format, args.errors_only, args.checks, args.check,
                          args.select, args.ignore)
        tasks = _Tasks(args, stdin)
        progress = Progress(len(tasks), _Silent() if args.quiet else err)
        jobs = min(args.jobs, len(tasks), kMaxJobs)
        if jobs > 1:
            pool = WorkerPool(jobs, options)
            reports = pool.Reports(tasks)
        else:
            reports = (ReportTask(task, options) for task in tasks)
        exit_status, lines, errors, files, found = kExitOk, 0, 0, 0, 0
        if args.format == 'json':
            out.write('{"files": [')
        for i, (text, problem, count, error_count, status, diagnostics) in enumerate(reports):
            if args.format == 'json':
                out.write(('\n' if i == 0 else ',\n') + text)
            else:
                out.write(text)
            if problem is not None:
                progress.Close()
                err.write(problem)
            exit_status = max(exit_status, kExitForStatus[status],
                              kExitSyntax if diagnostics else kExitOk)
            found += diagnostics
            lines += count
            errors += error_count
            files += status in kAnalyzed
            progress.Update(i + 1)
        if args.format == 'json':
            out.write('\n]}\n')
        out.flush()
        if pool is not None:
            pool.Close()
        progress.Close()
        if not args.quiet:
            checked = ', %d diagnostics' % found if args.check else ''
            err.write('%d files, %d logical lines, %d syntax errors%s, %.2f seconds\n'
                      % (files, lines, errors, checked, time.time() - started))
    except KeyboardInterrupt:
        _Exit(pool, kExitInterrupted, err, 'interrupted')
    except _OutputError as e:
        e = e.args[0]
        if getattr(e, 'errno', None) == errno.EPIPE:
            _Exit(pool, kExitProblem)      # the reader has gone (a pager quit, | head)
        _Exit(pool, kExitProblem, err, 'cannot write the output: %s'
              % (getattr(e, 'strerror', None) or e))
    except MemoryError:
        _Exit(pool, kExitProblem, err, 'out of memory')
    if err.failed:
        return max(exit_status, kExitProblem)
    return exit_status


class _ClosedStream(object):
    """A standard stream whose descriptor was closed when the run began."""

    def _Fail(self, *args):
        raise IOError(errno.EBADF, 'Bad file descriptor')

    read = write = flush = _Fail

    def isatty(self):
        return False


def _ClosedStandardStreams():
    """Standard descriptors that are closed, each then opened on the null
    device so that no file the run opens takes its number."""
    closed = []
    for fd in (0, 1, 2):
        try:
            os.fstat(fd)
        except OSError:
            closed.append(fd)
    for fd in closed:
        if os.open(os.devnull, os.O_RDWR) != fd:
            break
    return closed


def Run():
    """The command line's entry: Main, and an exit that flushes nothing more
    (what could not be written has already been reported)."""
    closed = _ClosedStandardStreams()
    streams = [_ClosedStream() if fd in closed else None for fd in (0, 1, 2)]
    try:
        status = Main(None, *streams)
    except KeyboardInterrupt:
        _Exit(None, kExitInterrupted, sys.stderr, 'interrupted')
    except MemoryError:
        _Exit(None, kExitProblem, sys.stderr, 'out of memory')
    try:
        sys.stdout.flush()
    except Exception:
        status = max(status, kExitProblem)
    os._exit(status)


if __name__ == '__main__':
    Run()
