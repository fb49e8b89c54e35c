"""The resolver's diagnostics over the 3.8 standard library, beside pyflakes3.

First the command line as a user runs it: `python2.7 -m pysource.cli --check -q
-j 1 LIB` (analysis, resolving and diagnostics in one process, output to
/dev/null) and `pyflakes3 LIB` over the same folder, interleaved, best of
`repeat` each, with source lines per second. Then, in this process, the CPU
time of analysing every file beside the CPU time of resolving it and of
computing its diagnostics.

Usage: TREELENS_BUILD_DIR=<build> python2.7 bench/resolver_bench.py [repeat]
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
from pysource import analysis, resolver  # noqa: E402


def Run(argv):
    """(wall seconds, CPU seconds) of a command: on a shared machine the CPU
    time is the steadier figure."""
    env = dict(os.environ, PYTHONPATH=kRoot)
    if 'TREELENS_BUILD_DIR' in env:
        env['TREELENS_BUILD_DIR'] = os.path.abspath(env['TREELENS_BUILD_DIR'])
    with open(os.devnull, 'wb') as null:
        before = os.times()
        start = time.time()
        subprocess.call(argv, stdout=null, stderr=null, env=env)
        wall = time.time() - start
        after = os.times()
    return wall, (after[2] - before[2]) + (after[3] - before[3])


def main():
    repeat = int(sys.argv[1]) if len(sys.argv) > 1 else 2
    lib = support.StdlibDir('3.8')
    if lib is None:
        sys.exit('no Python 3.8 standard library under pyenv')
    files = [p for p, _, problem in analysis.IterSourcePaths([lib]) if problem is None]
    texts = [support.ReadBytes(p) for p in files]
    lines = sum(t.count(b'\n') for t in texts)
    runs = [('treelens --check', [sys.executable, '-m', 'pysource.cli', '--check', '-q',
                                  '-j', '1', lib]),
            ('treelens (analysis only)', [sys.executable, '-m', 'pysource.cli', '--errors-only',
                                          '-q', '-j', '1', lib])]
    peer = distutils.spawn.find_executable('pyflakes3')
    if peer:
        runs.append(('pyflakes3', [peer, lib]))
    else:
        print('pyflakes3 not found (Debian package pyflakes3): its figures are missing')
    best = dict((name, (float('inf'), float('inf'))) for name, _ in runs)
    for _ in range(repeat):
        for name, argv in runs:
            wall, cpu = Run(argv)
            best[name] = (min(best[name][0], wall), min(best[name][1], cpu))
    print('%d files, %d lines, best of %d' % (len(files), lines, repeat))
    for name, _ in runs:
        wall, cpu = best[name]
        print('  %-26s %7.2f s wall %7.2f s CPU  %9.0f lines per CPU second'
              % (name, wall, cpu, lines / cpu))
    if peer:
        print('  pyflakes3 / treelens --check: %.2fx wall, %.2fx CPU' % (
            best['pyflakes3'][0] / best['treelens --check'][0],
            best['pyflakes3'][1] / best['treelens --check'][1]))

    analyse = resolve = diagnose = 0.0
    found = 0
    for path, text in zip(files, texts):
        start = time.clock()
        result = analysis.AnalyzeText(text, 'auto', path)
        analysed = time.clock()
        module = resolver.Resolve(result)
        resolved = time.clock()
        found += len(module.Diagnostics())
        diagnose += time.clock() - resolved
        resolve += resolved - analysed
        analyse += analysed - start
    print('in one process (CPU seconds): analyse %.2f, resolve %.2f (%.2fx analysing), '
          'diagnostics %.2f; %d diagnostics' % (analyse, resolve, resolve / analyse, diagnose,
                                               found))


if __name__ == '__main__':
    main()
