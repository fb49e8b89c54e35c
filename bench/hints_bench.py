"""What the type-hint walker adds to full analysis: with and without it, side by side.

Full analysis is CPGenAnalyzerImpl.AnalyzeSingleLogical on every logical line (parse, symbol walk,
hint walk, f-strings, discard). The same lines are analyzed with the hint walker switched off
(CTypeHintWalker._SetAnalyzerWalks(False)). Two corpora: the 2.7 standard library under the 2.7
analyzer, where type comments and annotations are rare, and the typeshed stubs fetched by
tools/fetch-stubs.sh under the 3.6 analyzer, where nearly every def and many assignments are
annotated. Prints microseconds per logical line for both runs and the ratio.

Usage: TREELENS_BUILD_DIR=<build> python2.7 bench/hints_bench.py [repeat] [file_limit]
"""

import os
import sys

sys.path.insert(0, os.path.dirname(os.path.dirname(os.path.abspath(__file__))))

from tests.py import support  # noqa: E402
from pysource import analysis, treelens  # noqa: E402
from pysource.utils import GetLogicalsFromText  # noqa: E402
from treelens_bench import TimeTreelens  # noqa: E402  (bench/ is the script folder)


def Best(analyzer, logicals, repeat, hint_walker):
    treelens.CTypeHintWalker._SetAnalyzerWalks(hint_walker)
    stdout, sys.stdout = sys.stdout, open(os.devnull, 'w')  # the walkers' limit reports
    try:
        return TimeTreelens(analyzer, logicals, repeat)
    finally:
        sys.stdout.close()
        sys.stdout = stdout
        treelens.CTypeHintWalker._SetAnalyzerWalks(True)


def Report(name, analyzer, files, repeat):
    logicals = []
    for path in files:
        logicals.extend(GetLogicalsFromText(support.ReadBytes(path)))
    if not logicals:
        print('%s: no files' % name)
        return
    # Alternate the two runs so that both see the same machine load.
    without = with_ = None
    for _ in range(2):
        w = Best(analyzer, logicals, repeat, True)
        wo = Best(analyzer, logicals, repeat, False)
        with_ = w if with_ is None else min(with_, w)
        without = wo if without is None else min(without, wo)
    n = len(logicals)
    print('%s: %d files, %d logical lines (best of %d runs)' % (name, len(files), n, 2 * repeat))
    print('  full analysis with the hint walker:    %7.3f us/line' % (with_ * 1e6 / n))
    print('  full analysis without the hint walker: %7.3f us/line' % (without * 1e6 / n))
    print('  ratio with / without: %.3f (the hint walker adds %.1f%%)' % (with_ / without, (with_ / without - 1) * 100))


def main():
    repeat = int(sys.argv[1]) if len(sys.argv) > 1 else 3
    limit = int(sys.argv[2]) if len(sys.argv) > 2 else None
    Report('2.7 standard library', treelens.CPGenAnalyzerImpl((2, 7, 0), treelens.kPy2DefaultGrammar, None, False),
           support.CorpusFiles('2.7', limit=limit), repeat)
    Report('typeshed stubs', treelens.CPGenAnalyzerImpl((3, 6, 0), 'Python-Grammar-3.6', list(analysis.kPy3Keywords)),
           support.StubFiles(limit or 0), repeat)


if __name__ == '__main__':
    main()
