"""treelens: what each logical line of Python source defines, reads and fails on.

    treelens [options] PATH...        (or: python2.7 -m pysource.cli ...)

Each PATH is a file, a folder (searched recursively for .py and .pyi files,
in sorted order), or - for standard input.

Formats (--format):
  text    one block per logical line that records something (default)
  json    one document: {"files": [{"path", "version", "status", "problem",
          "lines": [...]}, ...]}
  jsonl   one object per logical line, with its "path" and "version"
A line has the fields line, kind, text, defines, reads, equivs, args,
arg_equivs, bases and error (null, or message, line and column, 1-based).
Texts are the source bytes decoded as UTF-8; a byte that is not valid UTF-8
appears as the lone surrogate U+DC80 + byte, so that in Python 3
text.encode('utf-8', 'surrogateescape') gives back the exact bytes.

--errors-only prints only the syntax errors, as path:line:col: message (the
column counts bytes from 1); with json or jsonl, only the lines with one.

--check reports what the resolver finds across lines, as
path:line:col: CODE message: F821 undefined name, F401 unused import, F811
redefinition of an unused name, F841 unused local variable, F403 star import,
F405 name that may come from a star import (--select and --ignore take codes;
a line's "# noqa" or "# noqa: F401" silences it); syntax errors are listed
among them. With json each file has "diagnostics"; with jsonl each is an
object with path, line, column, code and message.

Exit status: 0 when every file was analyzed and no line has a syntax error,
1 when some line has one (or --check found something), 2 for a usage error
or a path that cannot be read (the other paths are still analyzed). Problems
go to standard error.
"""

from __future__ import print_function

import argparse
import errno
import json
import os
import re
import sys
import time

from pysource import analysis
from pysource import resolver

kFormats = ('text', 'json', 'jsonl')
kExitOk, kExitSyntax, kExitProblem = 0, 1, 2
kExitForStatus = {analysis.kOk: kExitOk, analysis.kSkipped: kExitOk,
                  analysis.kSyntaxError: kExitSyntax, analysis.kUnreadable: kExitProblem}

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
                        '"equivs": [], "args": [], "arg_equivs": [], "bases": [], "error": null}')


def JsonLine(logical, error, prefix=''):
    """One analyzed record as a JSON object (the fields of analysis.LineView);
    prefix holds leading fields."""
    head = '{%s"line": %d, "kind": "%s", "text": %s' % (
        prefix, logical.fFirstLine + 1, analysis.KindName(logical.fKind),
        JsonString(logical.fLineText))
    info = logical.GetDerivedInfo()
    if info is None and error is None and logical.fKind not in (1, 2):
        return head + kJsonNothingRecorded
    names, type_equivs, args, arg_equivs, bases = info or analysis.kNoDerivedInfo
    reads, equivs = analysis.SplitReads(type_equivs)
    if error is None:
        error_json = 'null'
        names, defines_at, reads_at = resolver.LineNames(logical, names, reads)
    else:
        error_json = '{"message": %s, "line": %d, "column": %d}' % _ErrorFields(logical, error)
        defines_at, reads_at = [None] * len(names), [None] * len(reads)
    return '%s, "defines": %s, "defines_at": %s, "reads": %s, "reads_at": %s, "equivs": %s, ' \
        '"args": %s, "arg_equivs": %s, "bases": %s, "error": %s}' % (
            head, _JsonStrings(names), _JsonPositions(defines_at), _JsonStrings(reads),
            _JsonPositions(reads_at), _JsonPairs(equivs), _JsonStrings(args),
            _JsonPairs(arg_equivs), _JsonStrings(bases), error_json)


def _JsonPositions(positions):
    return '[' + ', '.join(['null' if p is None else '[%d, %d]' % p for p in positions]) + ']'


def _ErrorFields(logical, error):
    line, column, message = analysis.ErrorLocation(logical, error)
    return JsonString(message), line, column


def _Null(value):
    return 'null' if value is None else JsonString(value)


# ---- text

def _FirstLine(text):
    return text.split(b'\n', 1)[0].rstrip(b'\r\n').split(b'\r', 1)[0]


def _Pairs(pairs):
    return b', '.join(n + b' = ' + i for n, i in pairs)


def TextBlock(path, logical, error):
    """The text block of one analyzed record, or b'' when it records nothing."""
    info = logical.GetDerivedInfo()
    if info is None and error is None and logical.fKind not in (1, 2):
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
        lines.append(b'    error: %d:%d: %s\n' % analysis.ErrorLocation(logical, error))
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


def Report(result, options):
    """(output bytes, problem line or None, logical lines, syntax errors, status,
    diagnostics) of a FileAnalysis."""
    path = _PathBytes(result.path)
    problem = None
    if result.problem is not None:
        problem = '%s: %s: %s\n' % (path, 'note' if result.status == analysis.kSkipped
                                    else 'error', result.problem)
    pairs = zip(result.logicals, result.errors)
    if options.errors_only:
        pairs = [(l, e) for l, e in pairs if e is not None]
    errors = sum(1 for e in result.errors if e is not None)
    fmt = options.fmt
    diagnostics = []
    if options.check and result.status in (analysis.kOk, analysis.kSyntaxError):
        diagnostics = resolver.Resolve(result).Diagnostics(options.select, options.ignore)
    if options.check and fmt == 'text':
        # A linter's output: syntax errors and diagnostics in line order.
        found = [analysis.ErrorLocation(l, e) for l, e in zip(result.logicals, result.errors)
                 if e is not None]
        found.extend((line, col, '%s %s' % (code, message))
                     for line, col, code, message in diagnostics)
        found.sort(key=lambda d: d[:2])
        out = b''.join(b'%s:%d:%d: %s\n' % ((path,) + d) for d in found)
    elif options.errors_only and fmt == 'text':
        out = b''.join(b'%s:%d:%d: %s\n' % ((path,) + analysis.ErrorLocation(l, e))
                       for l, e in pairs)
    elif fmt == 'text':
        out = b''.join([TextBlock(path, l, e) for l, e in pairs])
    elif fmt == 'jsonl':
        prefix = '"path": %s, "version": %s, ' % (JsonString(path), _Null(result.version))
        out = b''.join([JsonLine(l, e, prefix) + '\n' for l, e in pairs])
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
    """Analyzes one task of the run and reports it (see Report)."""
    path, status, problem, text = task
    if problem is not None:
        result = analysis.FileAnalysis(path, status=status, problem=problem)
    elif text is not None:
        result = analysis.AnalyzeText(text, options.version, path, options.checks)
    else:
        result = analysis.AnalyzeFile(path, options.version, options.checks)
    return Report(result, options)


_gOptions = None


def _WorkerInit(options):
    global _gOptions
    _gOptions = options
    import signal
    signal.signal(signal.SIGINT, signal.SIG_IGN)


def _WorkerReport(task):
    return ReportTask(task, _gOptions)


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


class _Silent(object):
    def isatty(self):
        return False


def _Abandon(pool, status):
    """Stops the run at once: the workers, then this process, with status.

    Pool.terminate can wait forever on a result queue no one reads; nothing
    that remains is worth flushing."""
    if pool is not None:
        for worker in pool._pool:
            worker.terminate()
    os._exit(status)


def _Tasks(args, stdin):
    """The tasks of a run in output order: (path, status, problem, text or None)."""
    tasks = []
    for path in args.paths:
        if path == '-':
            tasks.append((args.stdin_filename, analysis.kOk, None, stdin.read()))
            continue
        if not os.path.lexists(path):
            tasks.append((path, analysis.kUnreadable, 'cannot read: No such file or directory',
                          None))
            continue
        for found, status, problem in analysis.IterSourcePaths([path]):
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
        epilog='Exit status: 0 no syntax error, 1 syntax errors, 2 usage error or unreadable path.')
    parser.add_argument('paths', nargs='+', metavar='PATH',
                        help='file or folder to analyse, or - for standard input')
    parser.add_argument('--lang', choices=analysis.kVersions + (analysis.kAuto,),
                        default=analysis.kAuto,
                        help='language version of the sources; auto (default) picks per file '
                        'the newest version with no syntax error')
    parser.add_argument('--format', choices=kFormats, default='text',
                        help='output format (default text)')
    parser.add_argument('--errors-only', action='store_true',
                        help='report only syntax errors (text: path:line:col: message)')
    parser.add_argument('--no-checks', dest='checks', action='store_false',
                        help='report only what the grammar rejects, not the errors CPython finds '
                        'after parsing (targets that cannot be assigned, misplaced arguments, '
                        'return outside a function, ...)')
    parser.add_argument('--stdin-filename', default='-', metavar='NAME',
                        help='the path to report for standard input')
    parser.add_argument('-j', '--jobs', type=int, default=1, metavar='N',
                        help='analyse files in N processes (output is the same)')
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


def Main(argv=None, stdin=None, stdout=None, stderr=None):
    args = _ParseArgs(argv)
    stdin = stdin or getattr(sys.stdin, 'buffer', sys.stdin)
    out = stdout or getattr(sys.stdout, 'buffer', sys.stdout)
    err = stderr or sys.stderr
    # The analyzer writes its diagnostics (a walk that hit its limits) to
    # sys.stdout; they go to standard error, the output stays parseable.
    saved_stdout, sys.stdout = sys.stdout, err
    try:
        return _Run(args, stdin, out, err)
    finally:
        sys.stdout = saved_stdout


def _Run(args, stdin, out, err):
    started = time.time()
    options = Options(args.lang, args.format, args.errors_only, args.checks, args.check,
                      args.select, args.ignore)
    tasks = _Tasks(args, stdin)
    progress = Progress(len(tasks), _Silent() if args.quiet else err)
    pool = None
    if args.jobs > 1 and len(tasks) > 1:
        import multiprocessing
        pool = multiprocessing.Pool(min(args.jobs, len(tasks)), _WorkerInit, (options,))
        reports = pool.imap(_WorkerReport, tasks, 1)
    else:
        reports = (ReportTask(task, options) for task in tasks)
    exit_status, lines, errors, files, found = kExitOk, 0, 0, 0, 0
    try:
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
            files += status in (analysis.kOk, analysis.kSyntaxError)
            progress.Update(i + 1)
        if args.format == 'json':
            out.write('\n]}\n')
        out.flush()
    except KeyboardInterrupt:
        progress.Close()
        err.write('interrupted\n')
        _Abandon(pool, 130)
    except IOError as e:
        if e.errno != errno.EPIPE:
            raise
        _Abandon(pool, kExitProblem)     # standard output was closed (a pager quit)
    if pool is not None:
        pool.close()
        pool.join()
    progress.Close()
    if not args.quiet:
        checked = ', %d diagnostics' % found if args.check else ''
        err.write('%d files, %d logical lines, %d syntax errors%s, %.2f seconds\n'
                  % (files, lines, errors, checked, time.time() - started))
    return exit_status


if __name__ == '__main__':
    sys.exit(Main())
