#!/usr/bin/env python2.7
"""Cost of the change finder's whole-file pass over the standard library.

    bench_whole_pass.py [--repeat N] [ROOT]

Reads every file's logicals first, then times only the FindChanges(lst, [])
calls, and prints ns per logical next to the cost of a bare Python loop that
reads one field of each logical: the floor that touching those logicals from
Python costs. Takes the best of N rounds (default 3).
"""

import argparse
import gc
import os
import resource
import sys
import time

sys.path.insert(0, os.path.join(os.path.dirname(os.path.dirname(os.path.abspath(__file__))), 'tools'))
import toolpath  # noqa: E402
from progress import Progress  # noqa: E402

toolpath.setup()

from pysource.logicals import ReadLogicals  # noqa: E402
from pysource.scopebodycache import CChangeFinder  # noqa: E402

StdlibFiles = toolpath.StdlibFiles


def ReadAll(paths):
    lists = []
    with Progress(len(paths), 'files read') as progress:
        for done, path in enumerate(paths):
            progress.Show(done)
            try:
                with open(path, 'rU') as f:
                    lists.append(ReadLogicals(f.read(), path))
            except (SyntaxError, IOError):
                pass
    return lists


def TimePass(lists):
    # A fresh finder per file, as a caller that has just read the file would.
    finders = [CChangeFinder(lst) for lst in lists]
    start = time.time()
    for cf, lst in zip(finders, lists):
        cf.FindChanges(lst, [])
    return time.time() - start


def TimeTouch(lists):
    start = time.time()
    for lst in lists:
        for l in lst:
            l.fIndent
    return time.time() - start


def Counted(count, progress):
    for k in range(count):
        yield k
        progress.Step()


def main(argv=None):
    parser = argparse.ArgumentParser(prog='bench_whole_pass.py')
    parser.add_argument('root', nargs='?', default=toolpath.StdlibDir(),
                        help='directory of .py files (default: the standard library)')
    parser.add_argument('--repeat', type=int, default=3, metavar='N')
    args = parser.parse_args(argv)

    lists = ReadAll(StdlibFiles(args.root))
    count = sum(len(lst) for lst in lists)
    if not count:
        print('no logicals under %s' % args.root)
        return 1
    gc.disable()  # collections would land in whichever loop triggers them
    try:
        with Progress(2 * args.repeat, 'rounds') as progress:
            passes = min(TimePass(lists) for _ in Counted(args.repeat, progress))
            touches = min(TimeTouch(lists) for _ in Counted(args.repeat, progress))
    finally:
        gc.enable()
    rss = resource.getrusage(resource.RUSAGE_SELF).ru_maxrss / 1024.0  # KiB on Linux

    print('files:              %d (%s)' % (len(lists), args.root))
    print('logicals:           %d' % count)
    print('whole-file pass:    %.3f s  %7.1f ns/logical  (best of %d)'
          % (passes, passes * 1e9 / count, args.repeat))
    print('touch-each loop:    %.3f s  %7.1f ns/logical' % (touches, touches * 1e9 / count))
    print('ratio pass/touch:   %.2f' % (passes / touches if touches else float('inf')))
    print('peak memory (RSS):  %.1f MiB' % rss)
    return 0


if __name__ == '__main__':
    toolpath.RunMain(main)
