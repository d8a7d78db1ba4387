#!/usr/bin/env python2.7
"""Cost of reading text into logicals: the native reader beside the reference.

    bench_reader.py [--root DIR] [--rounds N]

Every figure is process CPU time, side by side in one run:

  library    every .py file of DIR (default: the 2.7 standard library,
             site-packages left out) read from text already in memory, in
             us per physical line: the native reader (median of the rounds,
             10th-90th percentile), the scan alone (no objects made), and
             the reference reader (one round). What the native read costs
             beyond its scan is the making of the token strings and records.
  outline    decimal.py of that library read and passed whole by a new
             change finder (FindChanges(lst, [])), in ms.
  100k       the library's files joined into a module of about 100,000
             lines, read and passed the same way; and the native cost per
             line of its first 1k lines, of them repeated 10 and 100 times,
             and of its first 10k and 100k lines.
"""

from __future__ import print_function

import argparse
import os
import sys

import benchkit
from toolpath import PyenvRoot
from benchkit import CChangeFinder, Clock, FormatSpread, LogicalLineType, ReadLogicals

from pysource import _reader, logicals


def DefaultRoot():
    return os.path.join(PyenvRoot(), 'versions', '2.7.18', 'lib', 'python2.7')


def LoadTexts(root):
    """(path, text) of every file under `root` that reads, as the reader
    takes it (newlines normalised, decoded on 3.x, no BOM)."""
    found = []
    for dirpath, dirnames, filenames in os.walk(root):
        dirnames[:] = sorted(d for d in dirnames if d != 'site-packages')
        for name in sorted(filenames):
            if not name.endswith('.py'):
                continue
            path = os.path.join(dirpath, name)
            try:
                text = logicals._SourceText(logicals._SourceOfFile(path), path)
                ReadLogicals(text, path)
            except (SyntaxError, IOError):
                continue
            found.append((path, text))
    return found


def Rows(text):
    return text.count('\n') + (1 if text and not text.endswith('\n') else 0)


def TimeOnce(run):
    start = Clock()
    run()
    return Clock() - start


def Library(texts, rounds):
    rows = sum(Rows(t) for _, t in texts)

    def Native():
        for path, text in texts:
            ReadLogicals(text, path)

    def ScanOnly():
        for _, text in texts:
            _reader.Scan(text)

    def Reference():
        for path, text in texts:
            ReadLogicals(text, path, reference=True)
    native = [TimeOnce(Native) / rows * 1e6 for _ in range(rounds)]
    scan = [TimeOnce(ScanOnly) / rows * 1e6 for _ in range(rounds)]
    reference = TimeOnce(Reference) / rows * 1e6
    median = benchkit.Spread(native)[0]
    scan_median = benchkit.Spread(scan)[0]
    print('library: %d files, %d lines, %d logicals' % (
        len(texts), rows, sum(len(ReadLogicals(t)) for _, t in texts)))
    print('  native      %s us/line' % FormatSpread(native, '', 3))
    print('  scan alone  %s us/line (token strings and records: %.0f%% of the read)' % (
        FormatSpread(scan, '', 3), 100.0 * (median - scan_median) / median))
    print('  reference   %.2f us/line (%.0fx the native)' % (reference, reference / median))


def ReadAndPass(text, reference=False):
    lst = ReadLogicals(text, '<bench>', reference=reference)
    CChangeFinder(lst).FindChanges(lst, [])
    return lst


def Outline(name, text, rounds, reference_rounds):
    native = [TimeOnce(lambda: ReadAndPass(text)) * 1e3 for _ in range(rounds)]
    read = [TimeOnce(lambda: ReadLogicals(text)) * 1e3 for _ in range(rounds)]
    reference = [TimeOnce(lambda: ReadAndPass(text, True)) * 1e3 for _ in range(reference_rounds)]
    print('outline of %s (%d lines): native %s ms (read %s ms), reference %.1f ms' % (
        name, Rows(text), FormatSpread(native), FormatSpread(read), benchkit.Spread(reference)[0]))


def Joined(texts, lines):
    """The texts joined (each ending in a newline) up to about `lines` lines."""
    joined = benchkit.JoinLines((text for _, text in texts), lines)
    _reader.Scan(joined)
    return joined


def Flatness(texts, rounds):
    """The native read of the library's first 1k lines, of them repeated
    10 and 100 times, and of the first 10k and 100k lines as they come."""
    base = Joined(texts, 1000)
    cases = [('the first %d lines' % Rows(base), base),
             ('them 10 times', base * 10), ('them 100 times', base * 100),
             ('the first 10k', Joined(texts, 10000)), ('the first 100k', Joined(texts, 100000))]
    for label, text in cases:
        rows = Rows(text)
        # Batches of about 200k lines, so that each timing is long enough.
        repeat = max(1, 200000 // rows)

        def Run():
            for _ in range(repeat):
                ReadLogicals(text)
        samples = [TimeOnce(Run) / repeat / rows * 1e6 for _ in range(rounds)]
        print('  %-20s %6d lines: %s us/line' % (label, rows, FormatSpread(samples, '', 3)))


def Main(argv):
    parser = argparse.ArgumentParser(description=__doc__.split('\n')[0])
    parser.add_argument('--root', default=DefaultRoot(), help='source tree (default: the 2.7 library)')
    parser.add_argument('--rounds', type=int, default=7)
    args = parser.parse_args(argv)
    print('Python %s, reading %s' % (sys.version.split()[0], args.root))
    texts = LoadTexts(args.root)
    Library(texts, args.rounds)
    decimal = [text for path, text in texts if os.path.basename(path) == 'decimal.py']
    if decimal:
        Outline('decimal.py', decimal[0], args.rounds * 3, 3)
    big = Joined(texts, 100000)
    Outline('the joined module', big, args.rounds, 1)
    print('native cost per line by size:')
    Flatness(texts, args.rounds)
    return 0


if __name__ == '__main__':
    sys.exit(Main(sys.argv[1:]))
