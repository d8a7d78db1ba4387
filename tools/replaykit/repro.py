"""Reproducers of a failing edit: shrunk, then written as a short script that
replays it through the same helpers."""

from __future__ import print_function

import os

from pysource.scopebodycache import CChangeFinder

from replaykit.checks import RunScenario
from replaykit.editor import JoinLines, Read, ReplayError, SourceRejected, Splice, SplitLines

kToolsDir = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
kDefaultReproDir = '/tmp/replay-repros'


def _OriginalStarts(splices):
    starts, shift = [], 0
    for s in splices:
        starts.append(s.start - shift)
        shift += s.delta
    return starts


def _FromOriginalStarts(splices, starts):
    out, shift = [], 0
    for s, start in zip(splices, starts):
        out.append(s.Moved(start + shift))
        shift += s.delta
    return out


def _DeleteLines(old_lines, splices, x, y):
    """Drops original lines [x, y), which no splice touches."""
    starts = _OriginalStarts(splices)
    moved = []
    for s, start in zip(splices, starts):
        if start >= y:
            moved.append(start - (y - x))
        elif start + s.count <= x:
            moved.append(start)
        else:
            return None
    return old_lines[:x] + old_lines[y:], _FromOriginalStarts(splices, moved)


def _Units(old_lines, splices):
    """Line spans [x, y) of the old logicals that no splice touches, with their
    distance to the nearest splice."""
    try:
        logicals = Read(JoinLines(old_lines))
    except SourceRejected:
        return []
    bounds = [l.fLineno - 1 for l in logicals] + [len(old_lines)]
    regions = [(start, start + s.count) for s, start in zip(splices, _OriginalStarts(splices))]
    units = []
    for x, y in zip(bounds, bounds[1:]):
        if x >= y:
            continue
        if any((a < y and x < b) or (a == b and x < a < y) for a, b in regions):
            continue
        distance = min(min(abs(x - a), abs(y - b)) for a, b in regions)
        units.append((x, y, distance))
    return units


def Shrink(old_text, splices, invariant, cache_check, max_attempts=150,
           finder_class=CChangeFinder):
    """Smaller (old_text, splices) that still fail with `invariant`: drops the
    batch's other splices, then old lines far from the edit."""
    old_lines = SplitLines(old_text)
    attempts = [0]

    def Fails(lines, splices):
        if attempts[0] >= max_attempts:
            return False
        attempts[0] += 1
        try:
            got = RunScenario(JoinLines(lines), splices, cache_check, finder_class)
        except ReplayError:
            return False
        return got is not None and got[0].problems.invariant == invariant

    k = 0
    while len(splices) > 1 and k < len(splices):
        starts = _OriginalStarts(splices)
        rest = [s for j, s in enumerate(splices) if j != k]
        candidate = _FromOriginalStarts(rest, starts[:k] + starts[k + 1:])
        if Fails(old_lines, candidate):
            splices = candidate
        else:
            k += 1

    units = _Units(old_lines, splices)
    size = max(1, len(units) // 2)
    while units and attempts[0] < max_attempts:
        # Groups of adjacent units, so that one deletion covers a group; the
        # farthest from the edit go first.
        runs, groups = [[units[0]]], []
        for unit in units[1:]:
            if unit[0] == runs[-1][-1][1]:
                runs[-1].append(unit)
            else:
                runs.append([unit])
        for run in runs:
            groups.extend(run[i:i + size] for i in range(0, len(run), size))
        groups.sort(key=lambda g: -min(u[2] for u in g))
        progress = False
        for group in groups:
            if attempts[0] >= max_attempts:
                break
            cut = _DeleteLines(old_lines, splices, group[0][0], group[-1][1])
            if cut is not None and Fails(*cut):
                old_lines, splices = cut
                progress = True
                break
        if progress:
            units = _Units(old_lines, splices)
            size = min(size, max(1, len(units) // 2))
        elif size == 1:
            break
        else:
            size //= 2

    # Last, thin the edited lines themselves, one at a time.
    changed = True
    while changed and attempts[0] < max_attempts:
        changed = False
        for candidate in _ThinnerEdits(old_lines, splices):
            if attempts[0] >= max_attempts:
                break
            if Fails(*candidate):
                old_lines, splices = candidate
                changed = True
                break
    return JoinLines(old_lines), splices, attempts[0]


def _ThinnerEdits(old_lines, splices):
    """(old_lines, splices) with one line fewer inside one splice: a line and its
    counterpart when the splice rewrites line for line, else one old or one new
    line."""
    starts = _OriginalStarts(splices)
    for k, (splice, start) in enumerate(zip(splices, starts)):
        new = splice.new_lines
        options = []
        if splice.count == len(new):
            options.extend((j, j) for j in range(len(new)))
        else:
            options.extend((j, None) for j in range(splice.count))
            options.extend((None, j) for j in range(len(new)))
        for old_j, new_j in options:
            if len(splices) == 1 and splice.count + len(new) <= 1:
                continue
            lines = list(old_lines)
            count = splice.count
            if old_j is not None:
                del lines[start + old_j]
                count -= 1
            kept = [l for j, l in enumerate(new) if j != new_j]
            if count == 0 and not kept:
                continue
            moved = [st - (1 if old_j is not None and j > k else 0)
                     for j, st in enumerate(starts)]
            edited = list(splices)
            edited[k] = Splice(start, count, kept, splice.kind)
            yield lines, _FromOriginalStarts(edited, moved)



def _TextLiteral(name, text, indent='    '):
    lines = text.splitlines(True)
    if not lines:
        return "%s = ''\n" % name
    return '%s = (\n%s)\n' % (name, ''.join('%s%r\n' % (indent, l) for l in lines))


_kTemplate = '''\
# Reproducer written by tools/replay.py: %(title)s
# %(where)s
# Run: python2.7 %(path)s
# Exit status: 0 agrees, 1 disagrees, 2 the splices do not give NEW.
import sys

sys.path.insert(0, %(tools)r)
from replaykit.editor import Splice  # noqa: E402
from replaykit.repro import Reproduce  # noqa: E402

%(old)s
%(new)s
# Applied top to bottom, each to the text the one before left; all of them
# go to ONE FindChanges call.
SPLICES = [
%(splices)s]

if __name__ == '__main__':
    sys.exit(Reproduce(OLD, SPLICES, NEW, check_cache=%(check_cache)r))
'''


def FormatReproducer(old_text, splices, new_text, title, where, path, check_cache):
    return _kTemplate % dict(
        title=title, where=where, path=path, tools=kToolsDir,
        old=_TextLiteral('OLD', old_text), new=_TextLiteral('NEW', new_text),
        splices=''.join('    %r,\n' % s for s in splices), check_cache=bool(check_cache))


def Reproduce(old_text, splices, new_text, check_cache=False):
    """A reproducer's body: replays the edit and prints what disagrees;
    returns its exit status."""
    replayed = RunScenario(old_text, splices, check_cache)
    if replayed is None or replayed[1] != new_text:
        print('the splices do not give NEW')
        return 2
    outcome = replayed[0]
    print('FindChanges(added=%d, removed=%d)' % (len(outcome.added), len(outcome.removed)))
    if outcome.changes is not None:
        print('changes: %s' % sorted(outcome.changes))
    problems = outcome.problems.Lines(limit=20)
    for line in problems or ['no disagreements']:
        print(line)
    return 1 if problems else 0


def WriteReproducer(repro_dir, stem, old_text, splices, invariant, cache_check, where,
                    finder_class=CChangeFinder):
    """Shrinks the failing edit and writes a reproducer (which uses
    CChangeFinder itself). Returns (path, note)."""
    replayed = RunScenario(old_text, splices, cache_check, finder_class)
    if replayed is None or replayed[0].problems.invariant != invariant:
        note = 'does not fail from a fresh pass of the old text (history-dependent)'
        small_old, small_splices = old_text, splices
    else:
        small_old, small_splices, attempts = Shrink(old_text, splices, invariant, cache_check,
                                                    finder_class=finder_class)
        note = 'shrunk in %d tries' % attempts
    replayed = RunScenario(small_old, small_splices, cache_check, finder_class)
    if replayed is None:
        return None, 'the edit does not read again'
    new_text = replayed[1]
    if not os.path.isdir(repro_dir):
        os.makedirs(repro_dir)
    path = os.path.join(repro_dir, stem + '.py')
    title = '%s, %s' % (', '.join(s.Describe() for s in small_splices),
                        {'names': 'scope names differ from a fresh pass',
                         'cache': 'change sets miss a scope',
                         'error': 'an exception (see the traceback)'}[invariant])
    with open(path, 'w') as f:
        f.write(FormatReproducer(small_old, small_splices, new_text, title, where, path,
                                 cache_check and invariant == 'cache'))
    note += ', %d -> %d lines' % (len(SplitLines(small_old)), len(SplitLines(new_text)))
    return path, note


class Tracer(object):
    """Writes the pending edit before the call, so a crash leaves it behind."""

    def __init__(self, repro_dir, old_text, splices, new_lines, path):
        self.repro_dir = repro_dir or kDefaultReproDir
        self.args = (old_text, splices, JoinLines(new_lines), 'the last edit before the call',
                     path)

    def __call__(self, outcome):
        if not os.path.isdir(self.repro_dir):
            os.makedirs(self.repro_dir)
        target = os.path.join(self.repro_dir, 'last_edit.py')
        with open(target, 'w') as f:
            f.write(FormatReproducer(*self.args + (target, False)))
