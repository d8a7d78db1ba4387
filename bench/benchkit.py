"""What the benchmarks share: the built packages, process CPU time taken in
batches, medians with their spread, and synthesised files of a given size.

Times are process CPU time (time.clock on 2.7, time.process_time on 3.x):
the machine is shared, and wall-clock time would count the others' work.
A call that takes well under a microsecond is timed in batches of many
calls, and each figure is the median over batches, printed with the 10th
and 90th percentiles as its spread.
"""

import os
import sys
import time

_kRepoDir = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
sys.path.insert(0, os.path.join(_kRepoDir, 'tools'))

import toolpath  # noqa: E402

toolpath.setup()

from pysource._fastaccess import LogicalLineType  # noqa: E402,F401
from pysource.logicals import ReadLogicals, ReadLogicalsFromFile  # noqa: E402,F401
from pysource.scopebodycache import CChangeFinder  # noqa: E402

Clock = getattr(time, 'process_time', None) or time.clock

# Line numbers in the synthesised lists step by this much, so that a line
# inserted by a benchmark takes a free number. An editor renumbers the
# lines after an insertion itself; that walk of the list is the caller's
# cost, and it would also flush the caches the timed call then runs in.
kLineStep = 10

_kUnit = '''\
# Section %(k)d: a small widget and its helpers.


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
    """Source text of about `logicals` logicals, names unique per scope as in
    real code."""
    per_unit = len(ReadLogicals(_kUnit % {'k': 0}))
    units = max(1, int(round(float(logicals) / per_unit)))
    return ''.join(_kUnit % {'k': k} for k in range(units))


def JoinLines(texts, lines):
    """The texts joined, each ending in a newline, until they hold `lines`
    lines (an iterable is read no further than that)."""
    parts, total = [], 0
    for text in texts:
        if not text.endswith('\n'):
            text += '\n'
        parts.append(text)
        total += text.count('\n')
        if total >= lines:
            break
    return ''.join(parts)


def NamedList(logicals):
    """A synthesised file read into logicals (line numbers spread out by
    kLineStep) and named by a whole-list pass, with its finder."""
    lst = ReadLogicals(Synthesise(logicals))
    for l in lst:
        l.fLineno *= kLineStep
    finder = CChangeFinder(lst)
    finder.FindChanges(lst, [])
    return lst, finder


def Percentile(values, fraction):
    values = sorted(values)
    return values[min(len(values) - 1, int(fraction * len(values)))]


def Spread(values):
    """(median, 10th percentile, 90th percentile)."""
    return Percentile(values, 0.5), Percentile(values, 0.1), Percentile(values, 0.9)


def FormatSpread(values, unit='', digits=2):
    median, low, high = Spread(values)
    return '%.*f%s [%.*f-%.*f]' % (digits, median, unit, digits, low, digits, high)


def TimeBatches(run, batches, calls):
    """Per-call CPU seconds of `run(calls)` (which makes `calls` calls), one
    figure per batch."""
    samples = []
    for _ in range(batches):
        start = Clock()
        run(calls)
        samples.append((Clock() - start) / calls)
    return samples


def PeakRssMiB():
    import resource
    return resource.getrusage(resource.RUSAGE_SELF).ru_maxrss / 1024.0


def MallocInUse():
    """Bytes the C allocator has handed out and not taken back (glibc's
    mallinfo2): native structures show here, Python's small objects do not."""
    import ctypes

    class MallInfo2(ctypes.Structure):
        _fields_ = [(name, ctypes.c_size_t) for name in (
            'arena', 'ordblks', 'smblks', 'hblks', 'hblkhd', 'usmblks', 'fsmblks', 'uordblks',
            'fordblks', 'keepcost')]
    libc = ctypes.CDLL(None)
    libc.mallinfo2.restype = MallInfo2
    info = libc.mallinfo2()
    return info.uordblks + info.hblkhd
