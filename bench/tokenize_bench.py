"""Splitting the 2.7 standard library into logical lines: GetLogicalsFromText vs tokenize.

Both sides run in this process over the same files. The peer is the standard
library's tokenize.generate_tokens with its tokens grouped into logical lines
(a new group after each NEWLINE, and after each NL that ends a comment-only or
blank line). Prints MB/s and logical lines/s of each and the ratio.

Usage: TREELENS_BUILD_DIR=<build> python2.7 bench/tokenize_bench.py [repeat]
"""

import gc
import os
import StringIO
import sys
import time
import tokenize

sys.path.insert(0, os.path.dirname(os.path.dirname(os.path.abspath(__file__))))

from tests.py import support  # noqa: E402
from pysource.utils import GetLogicalsFromText  # noqa: E402


def StdlibLogicals(text):
    """Logical lines of text as lists of (type, text) pairs, through the stdlib tokenizer."""
    logicals, current = [], []
    try:
        for typ, s, _, _, _ in tokenize.generate_tokens(StringIO.StringIO(text).readline):
            if typ in (tokenize.NEWLINE, tokenize.NL):
                comment_only = len(current) == 1 and current[0][0] == tokenize.COMMENT
                if typ == tokenize.NEWLINE or not current or comment_only:
                    logicals.append(current)
                    current = []
            elif typ not in (tokenize.INDENT, tokenize.DEDENT, tokenize.ENDMARKER):
                current.append((typ, s))
    except tokenize.TokenError:
        pass
    if current:
        logicals.append(current)
    return logicals


def TimeOnce(func, texts):
    gc.collect()
    start = time.time()
    count = 0
    for t in texts:
        count += len(func(t))
    return time.time() - start, count


def main():
    repeat = int(sys.argv[1]) if len(sys.argv) > 1 else 3
    files = support.CorpusFiles('2.7')
    texts = []
    for p in files:
        t = support.ReadBytes(p)
        texts.append(t[3:] if t.startswith(b'\xef\xbb\xbf') else t)
    size = sum(len(t) for t in texts) / 1e6
    # Interleaved, best of `repeat` each, so a busy machine weighs on both alike.
    ours_t = peer_t = float('inf')
    for _ in range(repeat):
        for _ in range(5):  # a pass of ours is short: take more samples
            t, ours_n = TimeOnce(GetLogicalsFromText, texts)
            ours_t = min(ours_t, t)
        t, peer_n = TimeOnce(StdlibLogicals, texts)
        peer_t = min(peer_t, t)
    print('%d files, %.1f MB, best of %d (peer) and %d (ours)' % (len(texts), size, repeat,
                                                                5 * repeat))
    print('%-28s %10s %14s %12s' % ('', 'MB/s', 'logicals/s', 'logicals'))
    print('%-28s %10.1f %14.0f %12d' % ('GetLogicalsFromText', size / ours_t, ours_n / ours_t,
                                        ours_n))
    print('%-28s %10.2f %14.0f %12d' % ('tokenize + grouping', size / peer_t, peer_n / peer_t,
                                        peer_n))
    print('ratio (MB/s): %.1fx' % (peer_t / ours_t))


if __name__ == '__main__':
    main()
