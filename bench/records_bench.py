"""Logical-line records: the cost of keeping them, and splitting time against input size.

1. Splitting the 2.7 standard library with GetLogicalsFromText, dropping each
   file's records before the next, against keeping every record alive (as a
   host that holds its open files does), with the cyclic collector on: MB/s
   of each and their ratio. Split records are not tracked by the collector,
   so keeping them costs their memory, not repeated traversals; a third run
   keeps them tracked (an attribute set on one record of each file does
   that) to show what the collector would cost.
2. Splitting time of texts of n (1 MB) and 8n bytes made of one repeated
   piece (blank lines, \\r line ends, comments, backslash continuations,
   open brackets, an unterminated string): a linear splitter takes about 8
   times as long for the larger one; above 10 is reported as not linear.
   This part runs in a child process whose allocator keeps freed memory
   (glibc's MALLOC_MMAP_THRESHOLD_ and MALLOC_TRIM_THRESHOLD_), best of
   `repeat`: on a virtual machine a page fault of fresh memory can cost more
   than splitting the bytes it holds, and would be measured instead.

3. Memory of a kept analysis: the resident bytes per logical line of the 2.7
   standard library held in memory as split records, and as analysed
   (AnalyzeText results, derived info included), each measured in a child
   process as the growth of its resident set. Recorded names and infos are
   interned and equal (name, info) pairs shared; before that the analysed
   figure was 891 bytes per logical line (488 for the split records).

Usage: TREELENS_BUILD_DIR=<build> python2.7 bench/records_bench.py [repeat]
"""

import gc
import os
import subprocess
import sys
import time

sys.path.insert(0, os.path.dirname(os.path.dirname(os.path.abspath(__file__))))

from tests.py import support  # noqa: E402
from pysource.utils import GetLogicalsFromText  # noqa: E402

kPieces = [('blank lines', b'\n'), ('\\r line ends', b'x = 1\r'), ('comments', b'# note\n'),
           ('backslashes', b'x = \\\n'), ('open brackets', b'f(a,\n'), ('nested brackets', b'(['),
           ('open string', b'"""x\n')]
kLarge = 1 << 20


def SplitTime(texts, keep, tracked=False):
    gc.collect()
    kept = []
    start = time.time()
    for text in texts:
        records = GetLogicalsFromText(text)
        if keep:
            kept.append(records)
            if tracked and records:
                records[0].fHostNote = None    # the collector then tracks them all
    elapsed = time.time() - start
    del kept
    return elapsed


def Resident():
    with open('/proc/self/status') as f:
        for line in f:
            if line.startswith('VmRSS:'):
                return int(line.split()[1]) * 1024
    return 0


def KeptBytes(mode):
    """Prints the resident bytes per logical line of the 2.7 standard library kept in memory."""
    from pysource import analysis
    texts = [support.ReadBytes(p) for p in support.CorpusFiles('2.7')]
    analysis.GetAnalyzer('2.7').Impl()
    saved, sys.stdout = sys.stdout, open(os.devnull, 'w')  # the walker's notes
    gc.collect()
    base = Resident()
    kept, lines = [], 0
    for text in texts:
        if mode == 'split':
            records = GetLogicalsFromText(text)
        else:
            records = analysis.AnalyzeText(text, '2.7').logicals
        lines += len(records)
        kept.append(records)
    gc.collect()
    used = Resident() - base
    sys.stdout = saved
    print('%-40s %10d %10.1f' % ('records kept' if mode == 'split' else 'analysis kept',
                                 used // max(lines, 1), used / 1e6))


def main():
    if sys.argv[1:2] == ['--linearity']:
        return Linearity(int(sys.argv[2]))
    if sys.argv[1:2] == ['--kept']:
        return KeptBytes(sys.argv[2])
    repeat = int(sys.argv[1]) if len(sys.argv) > 1 else 3
    texts = [support.ReadBytes(p) for p in support.CorpusFiles('2.7')]
    size = sum(map(len, texts)) / 1e6
    drop = keep = tracked = float('inf')
    for _ in range(repeat):
        drop = min(drop, SplitTime(texts, False))
        keep = min(keep, SplitTime(texts, True))
        tracked = min(tracked, SplitTime(texts, True, True))
    print('%d files, %.1f MB, best of %d, collector on' % (len(texts), size, repeat))
    print('%-40s %10s' % ('', 'MB/s'))
    print('%-40s %10.1f' % ('split, records dropped', size / drop))
    print('%-40s %10.1f' % ('split, every record kept', size / keep))
    print('%-40s %10.1f' % ('split, every record kept and tracked', size / tracked))
    print('kept over dropped: %.0f%%; kept and tracked over dropped: %.0f%%'
          % (100 * drop / keep, 100 * drop / tracked))
    print('')
    sys.stdout.flush()
    env = dict(os.environ, MALLOC_MMAP_THRESHOLD_=str(1 << 30), MALLOC_TRIM_THRESHOLD_=str(1 << 31))
    subprocess.check_call([sys.executable, __file__, '--linearity', str(repeat)], env=env)
    print('')
    print('2.7 standard library kept in memory (before interning and shared pairs: 488 and 891)')
    print('%-40s %10s %10s' % ('', 'B/line', 'MB'))
    sys.stdout.flush()
    for mode in ('split', 'analysed'):
        subprocess.check_call([sys.executable, __file__, '--kept', mode])


def Linearity(repeat):
    print('%-18s %10s %10s %8s' % ('n = 1 MB of', 'n (ms)', '8n (ms)', 'ratio'))
    for name, piece in kPieces:
        small = piece * (kLarge // len(piece))
        large = small * 8
        t_small = min(SplitTime([small], False) for _ in range(repeat))
        t_large = min(SplitTime([large], False) for _ in range(repeat))
        ratio = t_large / max(t_small, 1e-6)
        print('%-18s %10.1f %10.1f %8.1f%s' % (name, 1e3 * t_small, 1e3 * t_large, ratio,
                                              '' if ratio <= 10 else '  NOT LINEAR'))


if __name__ == '__main__':
    main()
