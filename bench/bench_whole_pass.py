#!/usr/bin/env python2.7
"""Cost of the change finder's whole-file pass over the standard library.

    bench_whole_pass.py [--rounds N] [ROOT]

Every file is read into logicals first; then only the FindChanges(lst, [])
calls are timed, with a new finder for each file as a caller that has just
read it would have. Two cases, reported separately:

  cold  freshly read logicals that carry no names yet (copies made for each
        round);
  warm  logicals that already carry the names of an earlier pass.

Beside them, a Python loop that only reads one field of each logical: the
floor that touching those logicals from Python costs. Each is measured in
two layouts: batch by batch of files (about 2,000 logicals each, copied just
before they are timed, so they sit in the caches as the logicals of a file
that was just read do), and over the whole library at once (copied before
the round, so most of it has left the caches). Figures are ns per logical,
medians over rounds with the 10th-90th percentile spread. Then the
memory the definition index keeps per logical (measured in two child
processes that read the same files and keep their finders, one with the
index and one whose finder takes the table walk instead) and the peak RSS.
"""

from __future__ import print_function

import argparse
import gc
import json
import os
import subprocess
import sys

import benchkit
from benchkit import CChangeFinder, Clock, FormatSpread, LogicalLineType, ReadLogicals, ReadLogicalsFromFile

from progress import Progress
import toolpath


# About a large module's worth: small enough for the caches to hold it.
kBatchLogicals = 2000


def ReadAll(paths):
    lists = []
    with Progress(len(paths)) as progress:
        for path in paths:
            try:
                lists.append(ReadLogicalsFromFile(path))
            except (SyntaxError, IOError):
                pass
            progress.Step()
    return lists


def Fresh(lst):
    return [LogicalLineType(l.fTokens, l.fLineno, l.fIndent, l.fKind) for l in lst]


def TimePass(lists):
    finders = [CChangeFinder(lst) for lst in lists]
    start = Clock()
    for finder, lst in zip(finders, lists):
        finder.FindChanges(lst, [])
    return Clock() - start


def TimeRound(lists):
    """Copies the lists afresh, then times the cold pass, the warm pass and
    the touch loop over the copies, in that order."""
    fresh = [Fresh(lst) for lst in lists]
    return TimePass(fresh), TimePass(fresh), TimeTouch(fresh)


def Batches(lists, size):
    """Consecutive files grouped until a group holds `size` logicals."""
    batches, current, held = [], [], 0
    for lst in lists:
        current.append(lst)
        held += len(lst)
        if held >= size:
            batches.append(current)
            current, held = [], 0
    if current:
        batches.append(current)
    return batches


def TimeTouch(lists):
    start = Clock()
    for lst in lists:
        for l in lst:
            l.fIndent
    return Clock() - start


class TableWalk(CChangeFinder):
    """Overrides a step, so it takes the table walk and keeps no index."""

    def _Clear(self):
        CChangeFinder._Clear(self)


def MemoryChild(root, finder_class):
    """Run in a child: the native memory (bytes) that keeping a named finder
    per file adds."""
    lists = ReadAll(toolpath.StdlibFiles(root))
    for lst in lists:
        TableWalk(lst).FindChanges(lst, [])  # every name made before measuring
    gc.collect()
    before = benchkit.MallocInUse()
    finders = []
    for lst in lists:
        finder = finder_class(lst)
        finder.FindChanges(lst, [])
        finders.append(finder)
    gc.collect()
    return {'grown': benchkit.MallocInUse() - before, 'logicals': sum(len(l) for l in lists)}


def IndexBytesPerLogical(root):
    figures = {}
    for name in ('CChangeFinder', 'TableWalk'):
        out = subprocess.check_output([sys.executable, os.path.abspath(__file__), '--memory-child', name, root])
        figures[name] = json.loads(out.decode('ascii').strip().splitlines()[-1])
    extra = figures['CChangeFinder']['grown'] - figures['TableWalk']['grown']
    return float(extra) / figures['CChangeFinder']['logicals']


def main(argv=None):
    parser = argparse.ArgumentParser(prog='bench_whole_pass.py')
    parser.add_argument('root', nargs='?', default=toolpath.StdlibDir(),
                        help='directory of .py files (default: the standard library)')
    parser.add_argument('--rounds', type=int, default=7, metavar='N')
    parser.add_argument('--memory-child', metavar='CLASS', help=argparse.SUPPRESS)
    args = parser.parse_args(argv)
    if args.memory_child:
        finder_class = TableWalk if args.memory_child == 'TableWalk' else CChangeFinder
        print(json.dumps(MemoryChild(args.root, finder_class)))
        return 0

    lists = ReadAll(toolpath.StdlibFiles(args.root))
    count = sum(len(lst) for lst in lists)
    if not count:
        print('no logicals under %s' % args.root)
        return 1
    batches = Batches(lists, kBatchLogicals)
    figures = {'batch': ([], [], []), 'whole': ([], [], [])}
    gc.disable()  # collections would land in whichever loop triggers them
    try:
        with Progress(args.rounds, 'rounds') as progress:
            for _ in range(args.rounds):
                times = [0.0, 0.0, 0.0]
                for batch in batches:
                    for k, t in enumerate(TimeRound(batch)):
                        times[k] += t
                for k, t in enumerate(times):
                    figures['batch'][k].append(t * 1e9 / count)
                for k, t in enumerate(TimeRound(lists)):
                    figures['whole'][k].append(t * 1e9 / count)
                progress.Step()
    finally:
        gc.enable()

    print('files:              %d (%s)' % (len(lists), args.root))
    print('logicals:           %d' % count)
    print('ns per logical, median [10th-90th percentile] over %d rounds:' % args.rounds)
    for layout, title in (('batch', 'batch by batch of ~%d logicals, just read' % kBatchLogicals),
                          ('whole', 'the whole library at once, out of the caches')):
        cold, warm, touch = figures[layout]
        print('  %s:' % title)
        print('    whole-file pass, cold (fresh logicals):  %s' % FormatSpread(cold, digits=1))
        print('    whole-file pass, warm (named logicals):  %s' % FormatSpread(warm, digits=1))
        print('    touch-each Python loop:                  %s' % FormatSpread(touch, digits=1))
    print('definition index:   %.1f bytes per logical' % IndexBytesPerLogical(args.root))
    print('peak memory (RSS):  %.1f MiB' % benchkit.PeakRssMiB())
    return 0


if __name__ == '__main__':
    sys.exit(main())
