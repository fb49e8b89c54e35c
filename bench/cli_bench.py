"""The command line over the 3.6 standard library, beside pyflakes3 on the same folder.

Runs `python2.7 -m pysource.cli --lang 3.6 --format jsonl -q -j N LIB` with its
output to /dev/null, for -j 1 and -j 2, and `pyflakes3 LIB` (which parses and
resolves the names of the same files), interleaved, best of `repeat` each;
prints source lines per second of each. Then, in this process, the analysis
of every file and the JSONL formatting of the results, timed apart, so that
formatting can be seen not to dominate.

Usage: TREELENS_BUILD_DIR=<build> python2.7 bench/cli_bench.py [repeat]
pyflakes3 is the Debian package of that name; without it only treelens'
figures are printed.
"""

import distutils.spawn
import os
import subprocess
import sys
import time

kRoot = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
sys.path.insert(0, kRoot)

from tests.py import support  # noqa: E402
from pysource import analysis, cli  # noqa: E402


def Wall(argv):
    env = dict(os.environ, PYTHONPATH=kRoot)
    if 'TREELENS_BUILD_DIR' in env:
        env['TREELENS_BUILD_DIR'] = os.path.abspath(env['TREELENS_BUILD_DIR'])
    with open(os.devnull, 'wb') as null:
        start = time.time()
        status = subprocess.call(argv, stdout=null, stderr=null, env=env)
        return time.time() - start, status


def _Spin(_):
    total = 0
    for i in xrange(10000000):
        total += i
    return total


def ParallelHeadroom():
    """How much faster two processes run four busy loops than one does: what
    -j 2 can gain on this machine at this moment."""
    import multiprocessing
    walls = []
    for n in (1, 2):
        pool = multiprocessing.Pool(n)
        start = time.time()
        pool.map(_Spin, range(4), 1)
        walls.append(time.time() - start)
        pool.close()
        pool.join()
    return walls[0] / walls[1]


def main():
    repeat = int(sys.argv[1]) if len(sys.argv) > 1 else 2
    lib = support.StdlibDir('3.6')
    if lib is None:
        sys.exit('no Python 3.6 standard library under pyenv')
    files = [p for p, _, problem in analysis.IterSourcePaths([lib]) if problem is None]
    texts = [support.ReadBytes(p) for p in files]
    lines = sum(t.count(b'\n') for t in texts)
    ours = [sys.executable, '-m', 'pysource.cli', '--lang', '3.6', '--format', 'jsonl', '-q']
    runs = [('treelens -j 1', ours + ['-j', '1', lib]), ('treelens -j 2', ours + ['-j', '2', lib])]
    peer = distutils.spawn.find_executable('pyflakes3')
    if peer:
        runs.append(('pyflakes3', [peer, lib]))
    else:
        print('pyflakes3 not found (Debian package pyflakes3): its figures are missing')
    best = dict((name, float('inf')) for name, _ in runs)
    for _ in range(repeat):
        for name, argv in runs:
            best[name] = min(best[name], Wall(argv)[0])
    print('%d files, %d lines, %.1f MB, best of %d' % (len(files), lines,
                                                       sum(map(len, texts)) / 1e6, repeat))
    print('%-16s %10s %12s' % ('', 'seconds', 'lines/s'))
    for name, _ in runs:
        print('%-16s %10.2f %12.0f' % (name, best[name], lines / best[name]))
    one, two = best['treelens -j 1'], best['treelens -j 2']
    print('-j 2 over -j 1: %.2fx (two busy loops over one on this machine now: %.2fx)'
          % (one / two, ParallelHeadroom()))
    if peer:
        print('treelens -j 1 over pyflakes3: %.2fx' % (best['pyflakes3'] / one))

    # Analysis and formatting apart, in this process.
    start = time.time()
    results = [analysis.AnalyzeText(t, '3.6', p) for p, t in zip(files, texts)]
    analysed = time.time() - start
    options = cli.Options('3.6', 'jsonl', False)
    start = time.time()
    size = sum(len(cli.Report(r, options)[0]) for r in results)
    formatted = time.time() - start
    print('in process: analysis %.2f s, JSONL formatting %.2f s (%.0f%% of analysis, %.1f MB)'
          % (analysed, formatted, 100 * formatted / analysed, size / 1e6))


if __name__ == '__main__':
    main()
