#!/usr/bin/env python2.7
"""Cost of one FindChanges call for common edits, by file size and place.

    bench_edits.py [--sizes 1000,10000,100000] [--reps N]

Files of about 1k, 10k and 100k logicals are synthesised (classes with
methods, module functions, comments, blank lines; names unique per scope,
as in real code). At the start, middle and end of each file the bench
times: typing a character into a statement (and deleting it), inserting a
method header and removing it again, a comment line typed above a method
header (and deleted), and a batch of three typed lines and such a comment
(and its undo). Each edit is undone after it is timed, so the list keeps
its size. The medians are printed, with the 100k/1k ratio for typing and
the peak memory.
"""

import argparse
import os
import resource
import sys
import time

_kRepoDir = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
sys.path.insert(0, os.path.join(_kRepoDir, 'tools'))

import toolpath  # noqa: E402
from progress import Progress  # noqa: E402
from replaykit.checks import Names, WholePass  # noqa: E402  (imports the built packages)
from replaykit.editor import Clone  # noqa: E402
from pysource._fastaccess import LogicalLineType  # noqa: E402
from pysource.logicals import ReadLogicals, kDefKind  # noqa: E402
from pysource.scopebodycache import CChangeFinder  # noqa: E402

kPlaces = (('start', 0.02), ('middle', 0.5), ('end', 0.98))
kEdits = ('typing', 'insert def', 'remove def', 'comment', 'batch')

_kUnit = '''\
# Part %(k)d: a small widget and its helpers.


class Widget%(k)d(object):
    """Collects numbers and reports on them."""

    kLimit = %(k)d

    def __init__(self, name, items=None):
        self.name = name
        self.items = list(items or [])
        self._cache = None

    def add(self, item):
        # Keep the cache honest.
        self._cache = None
        if item not in self.items:
            self.items.append(item)
        return self

    def total(self):
        if self._cache is None:
            result = 0
            for item in self.items:
                if item > self.kLimit:
                    continue
                result += item
            self._cache = result
        return self._cache

    @property
    def size(self):
        return len(self.items)

    def __repr__(self):
        return 'Widget%(k)d(%%r, %%r)' %% (self.name, self.items)


def make_widget%(k)d(name, *items):
    widget = Widget%(k)d(name)
    for item in items:
        widget.add(item)
# Dedented note inside the function body.
    return widget


def report%(k)d(widgets):
    lines = []
    for w in widgets:
        lines.append('%%s: %%d' %% (w.name, w.total()))

    return '\\n'.join(lines)
'''


def Synthesise(logicals):
    """Source text of about `logicals` logicals."""
    per_unit = len(ReadLogicals(_kUnit % {'k': 0}))
    units = max(1, int(round(float(logicals) / per_unit)))
    return ''.join(_kUnit % {'k': k} for k in range(units))


def Shift(lst, start, delta):
    for l in lst[start:]:
        l.fLineno += delta


def Find(lst, start, want):
    """Index of the first logical at or after `start` that satisfies `want`."""
    start = min(start, len(lst))
    for i in range(start, len(lst)):
        if want(lst[i]):
            return i
    for i in range(start - 1, -1, -1):
        if want(lst[i]):
            return i
    raise ValueError('no logical to edit')


def IsBodyStatement(l):
    return l.fKind == 0 and l.fIndent >= 8 and l.fTokens[0] not in ('return', 'for', 'if')


def IsMethodHeader(l):
    return l.fKind == kDefKind and l.fIndent == 4


def Typed(l):
    tokens = (l.fTokens[0] + 'x',) + l.fTokens[1:]
    return LogicalLineType(tokens, l.fLineno, l.fIndent, l.fKind)


def Untyped(l):
    tokens = (l.fTokens[0][:-1],) + l.fTokens[1:]
    return LogicalLineType(tokens, l.fLineno, l.fIndent, l.fKind)


class Timer(object):
    def __init__(self, finder):
        self.finder = finder

    def __call__(self, added, removed):
        start = time.time()
        self.finder.FindChanges(added, removed)
        return (time.time() - start) * 1e6


def TimeTyping(lst, call, at, reps):
    i = Find(lst, at, IsBodyStatement)
    samples = []
    for _ in range(reps):
        old = lst[i]
        new = lst[i] = Typed(old)
        samples.append(call([new], [old]))
        back = lst[i] = Untyped(new)
        samples.append(call([back], [new]))
    return samples


def InsertAndRemove(lst, i, logical, call):
    """Inserts a logical before index i, then removes it again: the costs of
    both FindChanges calls."""
    Shift(lst, i, 1)
    lst.insert(i, logical)
    inserted = call([logical], [])
    del lst[i]
    Shift(lst, i, -1)
    return inserted, call([], [logical])


def TimeDefLine(lst, call, at, reps):
    i = Find(lst, at, IsMethodHeader)
    inserted, removed = [], []
    for _ in range(reps):
        ref = lst[i]
        header = LogicalLineType(('def', 'zz_bench', '(', 'self', ')', ':'), ref.fLineno,
                                 ref.fIndent, kDefKind)
        cost_in, cost_out = InsertAndRemove(lst, i, header, call)
        inserted.append(cost_in)
        removed.append(cost_out)
    return inserted, removed


def TimeComment(lst, call, at, reps):
    """A comment line typed above a method header, then deleted."""
    i = Find(lst, at, IsMethodHeader)
    samples = []
    for _ in range(reps):
        ref = lst[i]
        comment = LogicalLineType(('# note',), ref.fLineno, ref.fIndent, 21)
        samples.extend(InsertAndRemove(lst, i, comment, call))
    return samples


def TimeBatch(lst, call, at, reps):
    first = Find(lst, at, IsBodyStatement)
    targets = [first]
    while len(targets) < 3:
        targets.append(Find(lst, targets[-1] + 6, IsBodyStatement))
    where = Find(lst, targets[-1] + 1, IsMethodHeader)
    samples = []
    for _ in range(reps):
        olds = [lst[i] for i in targets]
        news = [Typed(l) for l in olds]
        for i, l in zip(targets, news):
            lst[i] = l
        ref = lst[where]
        comment = LogicalLineType(('# batch',), ref.fLineno, ref.fIndent, 21)
        Shift(lst, where, 1)
        lst.insert(where, comment)
        samples.append(call(news + [comment], olds))

        del lst[where]
        Shift(lst, where, -1)
        backs = [Untyped(l) for l in news]
        for i, l in zip(targets, backs):
            lst[i] = l
        samples.append(call(backs, news + [comment]))
    return samples


def Median(values):
    values = sorted(values)
    return values[len(values) // 2] if values else 0.0


def NamesAgree(lst):
    fresh = WholePass([Clone(l) for l in lst])
    return all(Names(a) == Names(b) for a, b in zip(lst, fresh))


def Bench(size, reps, progress):
    text = Synthesise(size)
    lst = ReadLogicals(text)
    finder = CChangeFinder(lst)
    start = time.time()
    finder.FindChanges(lst, [])
    whole = (time.time() - start) * 1e6
    call = Timer(finder)
    rows = {}
    for place, fraction in kPlaces:
        # The batch reaches about 30 logicals further.
        at = max(0, min(int(len(lst) * fraction), len(lst) - 60))
        inserted, removed = TimeDefLine(lst, call, at, reps)
        rows[place] = {
            'typing': Median(TimeTyping(lst, call, at, reps)),
            'insert def': Median(inserted),
            'remove def': Median(removed),
            'comment': Median(TimeComment(lst, call, at, reps)),
            'batch': Median(TimeBatch(lst, call, at, reps)),
        }
        progress.Step()
    return len(lst), whole, rows, NamesAgree(lst)


def main(argv=None):
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument('--sizes', default='1000,10000,100000',
                        help='approximate logicals per file, comma separated')
    parser.add_argument('--reps', type=int, default=31, help='repetitions per cell')
    args = parser.parse_args(argv)
    sizes = [int(s) for s in args.sizes.split(',')]

    results = []
    with Progress(len(sizes) * len(kPlaces), 'places') as progress:
        for size in sizes:
            results.append(Bench(size, args.reps, progress))

    print 'Median cost of one FindChanges call, microseconds (%d edits and %d undos each;' % (
        args.reps, args.reps)
    print 'time.time() ticks in whole microseconds, so the smallest cells are coarse)'

    header = '%-9s %-7s' % ('logicals', 'place') + ''.join('%12s' % e for e in kEdits)
    print header
    print '-' * len(header)
    for count, whole, rows, agree in results:
        for place, _ in kPlaces:
            print '%-9d %-7s' % (count, place) + ''.join(
                '%12.1f' % rows[place][e] for e in kEdits)
    print
    for count, whole, rows, agree in results:
        print '%d logicals: whole-file pass %.0f us; names after the edits %s a fresh pass' % (
            count, whole, 'agree with' if agree else 'DISAGREE with')
    if len(results) > 1:
        small, large = results[0], results[-1]
        print
        print 'typing cost ratio, %d vs %d logicals:' % (large[0], small[0]),
        print ', '.join('%s %.1fx' % (place, large[2][place]['typing'] /
                                      max(small[2][place]['typing'], 0.1))
                        for place, _ in kPlaces)
    print 'peak memory (ru_maxrss): %.1f MB' % (
        resource.getrusage(resource.RUSAGE_SELF).ru_maxrss / 1024.0)
    return 0 if all(r[3] for r in results) else 1


if __name__ == '__main__':
    toolpath.RunMain(main)
