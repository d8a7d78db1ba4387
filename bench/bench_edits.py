#!/usr/bin/env python2.7
"""Cost of one FindChanges call for common edits, by file size and place.

    bench_edits.py [--sizes 1000,10000,100000] [--batches N] [--calls N]

Files of about 1k, 10k and 100k logicals are synthesised (classes with
methods, module functions, comments, blank lines; names unique per scope,
as in real code) and named once. At the start, middle and end of each file
these edits are made and undone, many times in a batch, and the batch's
process CPU time divided by its FindChanges calls:

  typing       a statement replaced by a typed variant, and back;
  in a header  a parameter typed into a method header, and back;
  def          a method header with a name new to its class, inserted and
               removed again (the list keeps its size);
  repeated def a header named like a later method of its class, which
               renumbers that method and renames its body, in and out;
  comment      a comment line above a method header, in and out;
  batch        three typed statements and such a comment in one call, and
               the undo in one call.

A second table takes the shape where a definition edit renumbers many
namesakes: a module of nothing but `def f` (a third of its logicals), one
more `def f` inserted near the top and taken out again, on the native path
and through the overrides (a subclass that overrides `_Clear`), in
milliseconds per call. The native path must stay within a small factor of
the routed one: both renumber every later `def f`.

The caller's own work in each batch (the list assignments, inserts and
deletes) is timed alone just before it and taken off, so the figures are the calls,
including the Python call itself. Each cell is the median over batches with
the 10th-90th percentile spread; the 100k/1k ratio of each edit follows.
"""

from __future__ import print_function

import argparse
import sys

import benchkit
from benchkit import CChangeFinder, FormatSpread, LogicalLineType, Spread, TimeBatches

from pysource.logicals import kBlankKind, kCommentKind, kDefKind

try:
    xrange
except NameError:
    xrange = range

kPlaces = (('start', 0.02), ('middle', 0.5), ('end', 0.98))
kEdits = ('typing', 'in a header', 'def', 'repeated def', 'comment', 'batch')


def Find(lst, start, want):
    """Index of the first logical at or after `start` that satisfies `want`."""
    for i in list(range(min(start, len(lst)), len(lst))) + list(range(min(start, len(lst)) - 1, -1, -1)):
        if want(lst[i]):
            return i
    raise ValueError('no logical to edit')


def IsBodyStatement(l):
    return l.fKind == 0 and l.fIndent >= 8 and l.fTokens[0] not in ('return', 'for', 'if')


def IsHeader(name):
    return lambda l: l.fKind == kDefKind and l.fIndent == 4 and l.fTokens[1] == name


def Typed(l):
    return LogicalLineType((l.fTokens[0] + 'x',) + tuple(l.fTokens[1:]), l.fLineno, l.fIndent, l.fKind)


def Pair(finder, first, second):
    """A batch runner alternating two edits, each followed by its call
    FindChanges(added, removed), and the same edits without the calls.
    first, second: (edit, added, removed)."""
    fc = finder.FindChanges
    (edit1, added1, removed1), (edit2, added2, removed2) = first, second

    def Run(calls):
        for _ in xrange(calls // 2):
            edit1()
            fc(added1, removed1)
            edit2()
            fc(added2, removed2)

    def Bare(calls):
        for _ in xrange(calls // 2):
            edit1()
            edit2()
    return Run, Bare


def Replaced(lst, finder, i, new):
    """lst[i] replaced by `new` and put back, as typing does."""
    old = lst[i]

    def Put(logical):
        def Do():
            lst[i] = logical
        return Do
    return Pair(finder, (Put(new), [new], [old]), (Put(old), [old], [new]))


def Typing(lst, finder, at):
    i = Find(lst, at, IsBodyStatement)
    return Replaced(lst, finder, i, Typed(lst[i]))


def InHeader(lst, finder, at):
    # A parameter typed into a method header: the method keeps its name.
    i = Find(lst, at, IsHeader('total'))
    old = lst[i]
    tokens = tuple(old.fTokens)
    return Replaced(lst, finder, i, LogicalLineType(tokens[:-2] + (',', 'q') + tokens[-2:], old.fLineno,
                                                    old.fIndent, old.fKind))


def InAndOut(lst, finder, i, logical):
    def Insert():
        lst.insert(i, logical)

    def Delete():
        del lst[i]
    return Pair(finder, (Insert, [logical], []), (Delete, [], [logical]))


def Header(lst, i, name):
    ref = lst[i]
    # The line number before the next line's is free (see benchkit).
    return LogicalLineType(('def', name, '(', 'self', ')', ':'), ref.fLineno - 1, ref.fIndent, kDefKind)


def DefLine(lst, finder, at):
    i = Find(lst, at, IsHeader('add'))
    return InAndOut(lst, finder, i, Header(lst, i, 'zz_bench'))


def RepeatedDef(lst, finder, at):
    # Named like the class's `total`, which follows: that method becomes
    # total#1 and its body is renamed, then back.
    i = Find(lst, at, IsHeader('add'))
    return InAndOut(lst, finder, i, Header(lst, i, 'total'))


def Comment(lst, finder, at):
    i = Find(lst, at, IsHeader('add'))
    ref = lst[i]
    return InAndOut(lst, finder, i, LogicalLineType(('# note',), ref.fLineno - 1, ref.fIndent, kCommentKind))


def Batch(lst, finder, at):
    targets = [Find(lst, at, IsBodyStatement)]
    while len(targets) < 3:
        targets.append(Find(lst, targets[-1] + 6, IsBodyStatement))
    where = Find(lst, targets[-1] + 1, IsHeader('total'))
    olds = [lst[i] for i in targets]
    news = [Typed(l) for l in olds]
    ref = lst[where]
    comment = LogicalLineType(('# batch',), ref.fLineno - 1, ref.fIndent, kCommentKind)

    def Apply():
        for i, l in zip(targets, news):
            lst[i] = l
        lst.insert(where, comment)

    def Undo():
        del lst[where]
        for i, l in zip(targets, olds):
            lst[i] = l
    return Pair(finder, (Apply, news + [comment], olds), (Undo, olds, news + [comment]))


kMakers = {'typing': Typing, 'in a header': InHeader, 'def': DefLine, 'repeated def': RepeatedDef, 'comment': Comment, 'batch': Batch}


def TimeEdit(maker, lst, finder, at, batches, calls):
    run, bare = maker(lst, finder, at)
    run(calls)  # warm up
    # Each batch against the caller's work timed just before it: at 100k
    # that work (moving the list's pointers) dwarfs the calls, and the
    # machine's drift between two distant timings would swamp them.
    figures = []
    for _ in range(batches):
        caller = TimeBatches(bare, 1, calls)[0]
        figures.append((TimeBatches(run, 1, calls)[0] - caller) * 1e6)
    return figures


def NamesAgree(lst):
    fresh = [LogicalLineType(l.fTokens, l.fLineno, l.fIndent, l.fKind) for l in lst]
    CChangeFinder(fresh).FindChanges(fresh, [])
    return all((a.fScopeName, a.fLocalScopeName) == (b.fScopeName, b.fLocalScopeName)
               for a, b in zip(lst, fresh))


def Bench(size, batches, calls):
    lst, finder = benchkit.NamedList(size)
    rows = {}
    for place, fraction in kPlaces:
        at = max(0, min(int(len(lst) * fraction), len(lst) - 80))
        for edit in kEdits:
            rows[place, edit] = TimeEdit(kMakers[edit], lst, finder, at, batches, calls)
    return len(lst), rows, NamesAgree(lst)


class Routed(CChangeFinder):
    """Every step through the overrides' route."""

    def _Clear(self):
        CChangeFinder._Clear(self)


def NamesakeList(size, finder_class):
    """`def f():`, its body and a blank line, size // 3 times, named."""
    lst = []
    for k in xrange(max(1, size // 3)):
        line = 3 * k * benchkit.kLineStep + 1
        lst.append(LogicalLineType(('def', 'f', '(', ')', ':'), line, 0, kDefKind))
        lst.append(LogicalLineType(('x', '=', '1'), line + benchkit.kLineStep, 4, 0))
        lst.append(LogicalLineType((), line + 2 * benchkit.kLineStep, 0, kBlankKind))
    finder = finder_class(lst)
    finder.FindChanges(lst, [])
    return lst, finder


def BenchNamesakes(size, batches):
    """ms per call of a `def f` in and out near the top, native and routed."""
    row = {}
    for label, finder_class in (('native', CChangeFinder), ('routed', Routed)):
        lst, finder = NamesakeList(size, finder_class)
        i = 30
        new = LogicalLineType(('def', 'f', '(', ')', ':'), lst[i].fLineno - 1, 0, kDefKind)
        run, bare = InAndOut(lst, finder, i, new)
        run(2)  # warm up
        figures = []
        for _ in range(batches):
            caller = TimeBatches(bare, 1, 2)[0]
            figures.append((TimeBatches(run, 1, 2)[0] - caller) * 1e3)
        row[label] = figures
        row[label + ' agree'] = NamesAgree(lst)
    return len(lst), row


def main(argv=None):
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument('--sizes', default='1000,10000,100000',
                        help='approximate logicals per file, comma separated')
    parser.add_argument('--batches', type=int, default=15, help='batches per cell')
    parser.add_argument('--calls', type=int, default=2000, help='FindChanges calls per batch')
    args = parser.parse_args(argv)
    results = [Bench(int(s), args.batches, args.calls) for s in args.sizes.split(',')]

    print('Microseconds per FindChanges call, median [10th-90th percentile] over %d batches of %d calls'
          % (args.batches, args.calls))
    print('%-9s %-7s' % ('logicals', 'place') + ''.join('%-22s' % e for e in kEdits))
    for count, rows, agree in results:
        for place, _ in kPlaces:
            print('%-9d %-7s' % (count, place) + ''.join(
                '%-22s' % FormatSpread(rows[place, e]) for e in kEdits))
    if len(results) > 1:
        small, large = results[0], results[-1]
        print('\nratio of medians, %d vs %d logicals:' % (large[0], small[0]))
        for place, _ in kPlaces:
            print('  %-7s ' % place + ', '.join(
                '%s %.2fx' % (e, Spread(large[1][place, e])[0] / max(Spread(small[1][place, e])[0], 1e-3))
                for e in kEdits))
    for count, rows, agree in results:
        print('%d logicals: names after the edits %s a fresh pass' % (count, 'agree with' if agree else
                                                                        'DISAGREE with'))
    namesakes = [BenchNamesakes(int(s), max(3, args.batches // 3)) for s in args.sizes.split(',')]
    print('\nMilliseconds per call, a `def f` in and out near the top of a module of `def f` only,'
          ' median [10th-90th percentile]')
    print('%-9s %-9s %-22s %-22s %s' % ('logicals', 'namesakes', 'native', 'routed', 'native/routed'))
    agree = True
    for count, row in namesakes:
        print('%-9d %-9d %-22s %-22s %.2fx' % (count, count // 3, FormatSpread(row['native'], digits=3),
                                                FormatSpread(row['routed'], digits=3),
                                                Spread(row['native'])[0] / max(Spread(row['routed'])[0], 1e-6)))
        agree = agree and row['native agree'] and row['routed agree']
    print('namesakes: names after the edits %s a fresh pass' % ('agree with' if agree else 'DISAGREE with'))
    print('peak memory (ru_maxrss): %.1f MiB' % benchkit.PeakRssMiB())
    return 0 if all(r[2] for r in results) and agree else 1


if __name__ == '__main__':
    sys.exit(main())
