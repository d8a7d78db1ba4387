#!/usr/bin/env python2.7
"""Replays realistic edits through CChangeFinder and checks every result
against a fresh whole-file pass.

    replay.py [FILE ...] [--stdlib] [--sample N] [--seed S] [--edits N]
              [--edits-per-file N] [--batch-fraction F] [--no-cache-check]
              [--stop-on-failure] [--repro-dir DIR] [--max-repros N]
              [--trace] [--quiet]

Each file is edited as an editor would edit it: the text changes, the
changed region is read again, the logicals outside it are kept (same
objects, line numbers updated) and the others are replaced; then one
FindChanges(added, removed) call. After every call:

  1. names: every logical has the fScopeName and fLocalScopeName that a
     whole-file pass over a fresh read of the same text gives;
  2. change sets: a warm CScopeBodyCache, cleared of the returned changes
     only, answers GetScopeDef / GetBodyOfScope like a fresh cache does
     (off with --no-cache-check; skipped while the cache is a stub).

A disagreement is printed with the first differing logicals, and a
shrunken, self-contained reproducer is written to --repro-dir. The exit
status is 1 when any edit disagreed or raised.

--edits is the number of edits replayed on each file; --edits-per-file is
how many of them run before the document goes back to the file's original
text. Without FILE the bundled sample samples/outline_sample.py is used.
"""

import argparse
import difflib
import hashlib
import os
import random
import re
import sys
import time
import traceback

import toolpath

_kRepoDir = toolpath.setup()
kSamplePath = os.path.join(_kRepoDir, 'samples', 'outline_sample.py')
kStdlibDir = toolpath.StdlibDir()
kDefaultReproDir = '/tmp/replay-repros'

from pysource._fastaccess import LogicalLineType  # noqa: E402
from pysource.logicals import ReadLogicals  # noqa: E402
from pysource.scopebodycache import (CChangeFinder, CScopeBodyCache,  # noqa: E402
                                     GetFullNameForScopeDef)

kClassKind = 1
kDefKind = 2
_kScopeKinds = (kClassKind, kDefKind)


class SourceRejected(Exception):
    """The text does not read as logicals (the edit is undone and skipped)."""


class ReplayError(Exception):
    """The replay machinery itself went wrong (not a product disagreement)."""


# ---------------------------------------------------------------------------
# Text and logicals

def SplitLines(text):
    """Physical lines without their newlines; the text is taken to end with one."""
    if not text:
        return []
    if text.endswith('\n'):
        text = text[:-1]
    return text.split('\n')


def JoinLines(lines):
    return ''.join(line + '\n' for line in lines)


def Read(text):
    try:
        return ReadLogicals(text)
    except (SyntaxError, IndentationError) as exc:
        raise SourceRejected(str(exc))
    except Exception as exc:  # the tokenizer has a few other ways to give up
        raise SourceRejected('%s: %s' % (type(exc).__name__, exc))


def Signature(logical):
    return (logical.fTokens, logical.fKind, logical.fIndent)


def Clone(logical):
    return LogicalLineType(logical.fTokens, logical.fLineno, logical.fIndent, logical.fKind)


def Names(logical):
    return (logical.fScopeName, logical.fLocalScopeName)


def WholePass(logicals):
    CChangeFinder(logicals).FindChanges(logicals, [])
    return logicals


class Splice(object):
    """Replace `count` lines at 0-based `start` by `new_lines`."""

    __slots__ = ('start', 'count', 'new_lines', 'kind')

    def __init__(self, start, count, new_lines, kind=''):
        self.start = start
        self.count = count
        self.new_lines = list(new_lines)
        self.kind = kind

    @property
    def delta(self):
        return len(self.new_lines) - self.count

    def Apply(self, lines):
        lines[self.start:self.start + self.count] = self.new_lines

    def Moved(self, start):
        return Splice(start, self.count, self.new_lines, self.kind)

    def Describe(self):
        where = 'L%d' % (self.start + 1)
        if self.count > 1:
            where += '-%d' % (self.start + self.count)
        return '%s@%s(-%d+%d)' % (self.kind or 'edit', where, self.count, len(self.new_lines))

    def __repr__(self):
        return 'Splice(%d, %d, %r, %r)' % (self.start, self.count, self.new_lines, self.kind)


def ReadSteps(lines, splices):
    """The text after each splice and its fresh logicals; SourceRejected if any
    intermediate text does not read."""
    lines = list(lines)
    out = []
    for splice in splices:
        if not 0 <= splice.start <= len(lines) or splice.start + splice.count > len(lines):
            raise ReplayError('splice out of range: %r on %d lines' % (splice, len(lines)))
        splice.Apply(lines)
        out.append((list(lines), Read(JoinLines(lines))))
    return out


# ---------------------------------------------------------------------------
# The editor's update of the live list

class Step(object):
    """One replacement in the live list: lst[start:stop] became `new`, and the
    logicals after them moved by `delta` lines."""

    __slots__ = ('start', 'stop', 'new', 'delta')

    def __init__(self, start, stop, new, delta):
        self.start = start
        self.stop = stop
        self.new = new
        self.delta = delta

    def Literal(self):
        return (self.start, self.stop,
                [(l.fTokens, l.fLineno, l.fIndent, l.fKind) for l in self.new], self.delta)


def UpdateLive(lst, fresh, splice, nlines_before):
    """Brings `lst` (the logicals of the text before `splice`) to `fresh` (those
    after it) in place. Logicals wholly outside the spliced lines that read the
    same are kept; the rest are replaced by copies of the fresh ones. Returns
    (step, removed)."""
    first = splice.start + 1                 # 1-based first line of the region
    after = first + splice.count             # first old line past the region
    delta = splice.delta
    nold, nfresh = len(lst), len(fresh)
    limit = min(nold, nfresh)

    head = 0
    while head < limit:
        old = lst[head]
        last_line = lst[head + 1].fLineno - 1 if head + 1 < nold else nlines_before
        if last_line >= first:
            break
        new = fresh[head]
        if old.fLineno != new.fLineno or Signature(old) != Signature(new):
            break
        head += 1

    tail = 0
    while tail < limit - head:
        old = lst[nold - 1 - tail]
        if old.fLineno < after:
            break
        new = fresh[nfresh - 1 - tail]
        if new.fLineno != old.fLineno + delta or Signature(old) != Signature(new):
            break
        tail += 1

    stop = nold - tail
    removed = lst[head:stop]
    new = [Clone(l) for l in fresh[head:nfresh - tail]]
    lst[head:stop] = new
    if delta:
        for l in lst[head + len(new):]:
            l.fLineno += delta
    return Step(head, stop, new, delta), removed


def SameReading(lst, fresh):
    if len(lst) != len(fresh):
        return False
    for a, b in zip(lst, fresh):
        if a.fLineno != b.fLineno or Signature(a) != Signature(b):
            return False
    return True


# ---------------------------------------------------------------------------
# The checks

def ScopeNames(lst):
    """'' and the full name of every scope a class/def logical opens, in order."""
    names = ['']
    seen = set(names)
    for l in lst:
        # A bare `def` being typed defines no scope.
        if l.fKind in _kScopeKinds and l.fLocalScopeName is not None:
            name = GetFullNameForScopeDef(l)
            if name not in seen:
                seen.add(name)
                names.append(name)
    return names


def NameDiffs(lst, oracle):
    """(index, logical, expected names, actual names) of every logical whose
    names differ from the fresh pass."""
    diffs = []
    for i, (got, want) in enumerate(zip(lst, oracle)):
        a, b = Names(got), Names(want)
        if a != b:
            diffs.append((i, got, b, a))
    return diffs


def _Ask(method, name):
    """(True, answer), (False, None) for KeyError, or (False, 'Type: message')
    for any other exception, which a stale cache entry can cause."""
    try:
        return True, method(name)
    except KeyError:
        return False, None
    except Exception as exc:
        return False, '%s: %s' % (type(exc).__name__, exc)


def _SameAnswer(a, b):
    (aok, avalue), (bok, bvalue) = a, b
    if aok != bok:
        return False
    if not aok:
        return avalue is None and bvalue is None
    if isinstance(avalue, list) and isinstance(bvalue, list):
        return avalue is bvalue or (len(avalue) == len(bvalue) and
                                    all(x is y for x, y in zip(avalue, bvalue)))
    return avalue is bvalue


def CacheCheckAvailable():
    """None when CScopeBodyCache can be checked, else why not."""
    if not hasattr(CScopeBodyCache, 'GetScopeDef') or \
            not hasattr(CScopeBodyCache, 'GetBodyOfScope') or \
            not hasattr(CScopeBodyCache, 'Clear'):
        return 'CScopeBodyCache has no GetScopeDef/GetBodyOfScope/Clear yet'
    try:
        cache = CScopeBodyCache([])
        cache.GetScopeDef('')
    except Exception as exc:
        return 'CScopeBodyCache does not work yet (%s: %s)' % (type(exc).__name__, exc)
    return None


def WarmCache(cache, names):
    for name in names:
        for method in (cache.GetScopeDef, cache.GetBodyOfScope):
            ok, value = _Ask(method, name)
            if not ok and value is not None:
                raise ReplayError('%s(%r) raised %s' % (method.__name__, name, value))


def _Answer(answer):
    ok, value = answer
    if not ok:
        return 'raised ' + value if value else 'KeyError'
    if isinstance(value, list):
        return 'body of %d' % len(value)
    if isinstance(value, LogicalLineType):
        return 'L%d %s' % (value.fLineno, _Preview(value, 30))
    return repr(value)


def CacheDiffs(warm, lst, old_names, changes):
    """Clears the warm cache of `changes` and lists how its answers differ from
    a fresh cache's over the old and the new scope names."""
    warm.Clear(sorted(changes))
    fresh = CScopeBodyCache(lst)
    new_names = ScopeNames(lst)
    new_set = set(new_names)
    problems = []
    for name in new_names + [n for n in old_names if n not in new_set]:
        for method in ('GetScopeDef', 'GetBodyOfScope'):
            w = _Ask(getattr(warm, method), name)
            f = _Ask(getattr(fresh, method), name)
            if not _SameAnswer(w, f):
                problems.append('%s(%r): warm %s, fresh %s%s' % (
                    method, name, _Answer(w), _Answer(f), _NotInChanges(name, changes)))
            elif name not in new_set and w != (False, None):
                problems.append('%s(%r) of a scope that is gone: %s%s' % (
                    method, name, _Answer(w), _NotInChanges(name, changes)))
    return problems


def _NotInChanges(name, changes):
    return '' if name in changes else ' (not in the returned changes)'


# ---------------------------------------------------------------------------
# A document being edited

class Problems(object):
    """What one FindChanges call got wrong."""

    def __init__(self):
        self.names = []      # NameDiffs
        self.cache = []      # CacheDiffs
        self.error = None    # traceback text of an exception from the product

    @property
    def invariant(self):
        if self.error is not None:
            return 'error'
        if self.names:
            return 'names'
        if self.cache:
            return 'cache'
        return None

    def Lines(self, limit=5):
        if self.invariant is None:
            return []
        if self.error is not None:
            return ['exception ' + l for l in self.error.rstrip().splitlines()[:1]] + \
                ['    ' + l for l in self.error.rstrip().splitlines()[1:]]
        if self.names:
            out = ['%d logicals differ from a fresh pass; first %d:' % (
                len(self.names), min(limit, len(self.names)))]
            for i, l, want, got in self.names[:limit]:
                out.append('  [%d] L%d %s %s' % (i, l.fLineno, _KindLabel(l.fKind), _Preview(l)))
                out.append('      expected %r, got %r' % (want, got))
            return out
        out = ['%d cache answers differ after Clear(changes); first %d:' % (
            len(self.cache), min(limit, len(self.cache)))]
        out.extend('  ' + p for p in self.cache[:limit])
        return out


def _KindLabel(kind):
    return {0: 'code', 1: 'class', 2: 'def', 21: 'comment', 22: 'blank'}.get(kind, str(kind))


def _Preview(logical, width=50):
    text = ' '.join(logical.fTokens)
    return repr(text if len(text) <= width else text[:width - 3] + '...')


class EditOutcome(object):
    __slots__ = ('seconds', 'steps', 'added', 'removed', 'changes', 'problems', 'compared',
                 'splices')


class LiveDocument(object):
    """The text, its live logical list with a finder, and a warm body cache."""

    def __init__(self, text, cache_check=False, finder_class=CChangeFinder):
        self.lines = SplitLines(text)
        self.lst = Read(JoinLines(self.lines))
        self.finder = finder_class(self.lst)
        self.finder.FindChanges(self.lst, [])
        self.cache = CScopeBodyCache(self.lst) if cache_check else None

    @property
    def text(self):
        return JoinLines(self.lines)

    def Edit(self, splices, reads, before_call=None):
        """Applies `splices` (already read by ReadSteps) to the text and the
        live list, makes one FindChanges call and checks it."""
        outcome = EditOutcome()
        outcome.problems = problems = Problems()
        outcome.changes = None
        outcome.compared = 0
        old_names = None
        if self.cache is not None:
            try:
                old_names = ScopeNames(self.lst)
                WarmCache(self.cache, old_names)
            except Exception:
                # Checked after the previous edit, so this is the cache's own fault.
                problems.error = 'warming the cache before the edit:\n' + traceback.format_exc()

        steps, added, removed = [], [], []
        added_ids, dropped = set(), set()
        nlines = len(self.lines)
        for splice, (lines_after, fresh) in zip(splices, reads):
            step, gone = UpdateLive(self.lst, fresh, splice, nlines)
            steps.append(step)
            for l in gone:
                # Added by an earlier splice of the batch: never existed for the finder.
                if id(l) in added_ids:
                    dropped.add(id(l))
                else:
                    removed.append(l)
            added.extend(step.new)
            added_ids.update(id(l) for l in step.new)
            nlines = len(lines_after)
        if dropped:
            added = [l for l in added if id(l) not in dropped]
        oracle = reads[-1][1]
        self.lines = reads[-1][0]
        if not SameReading(self.lst, oracle):
            raise ReplayError('live list does not read like the new text after %s' % (
                ', '.join(s.Describe() for s in splices)))

        outcome.steps, outcome.added, outcome.removed = steps, added, removed
        if before_call is not None:
            before_call(outcome)
        start = time.time()
        try:
            result = self.finder.FindChanges(added, removed)
        except Exception:
            outcome.seconds = time.time() - start
            problems.error = 'FindChanges raised:\n' + traceback.format_exc()
            return outcome
        outcome.seconds = time.time() - start
        if problems.error is not None:
            return outcome
        try:
            contents, classes, functions = result
            outcome.changes = set(contents) | set(classes) | set(functions)
        except Exception:
            problems.error = 'FindChanges returned %r\n' % (result,)
            return outcome

        WholePass(oracle)
        outcome.compared = len(oracle)
        problems.names = NameDiffs(self.lst, oracle)
        if not problems.names and self.cache is not None:
            try:
                problems.cache = CacheDiffs(self.cache, self.lst, old_names, outcome.changes)
            except Exception:
                problems.error = 'checking the cache after the edit:\n' + \
                    traceback.format_exc()
        return outcome


# ---------------------------------------------------------------------------
# Edits

_kDefinedName = re.compile(r'^\s*(?:def|class)\s+([A-Za-z_]\w*)')
_kHeader = re.compile(r'^(\s*)(?:def|class)\s')
_kIdentChars = 'abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ_0123456789'
_kWords = ('todo', 'note', 'see above', 'keep in sync', 'fast path', 'XXX', 'why?',
           'the caller owns this', 'was: return None')


def _Indent(line):
    return len(line) - len(line.lstrip(' \t'))


def _Blank(line):
    return not line.strip()


def _NearestCode(lines, i, step):
    """Index of the nearest non-blank, non-comment line from i in direction step."""
    while 0 <= i < len(lines):
        s = lines[i].strip()
        if s and not s.startswith('#'):
            return i
        i += step
    return None


def _BlockEnd(lines, header):
    """One past the last line of the block a def/class header at `header` opens
    (trailing blank and comment lines left out)."""
    indent = _Indent(lines[header])
    end = header + 1
    last = header + 1
    while end < len(lines):
        s = lines[end].strip()
        if s and not s.startswith('#'):
            if _Indent(lines[end]) <= indent:
                break
            last = end + 1
        end += 1
    return last


class EditMaker(object):
    """Seeded source of realistic edits. Each kind returns a Splice for the
    current lines with its start in [lo, hi] (a compound kind: a list of them),
    or None when it does not apply."""

    kKinds = (
        ('delete_line', 10), ('copy_line', 8), ('reindent', 8), ('insert_header', 10),
        ('insert_comment', 10), ('insert_blank', 8), ('duplicate_function', 5),
        ('delete_block', 6), ('type', 15), ('join_lines', 2), ('split_line', 2),
        ('reindent_block', 4), ('move_block', 3),
    )
    # Kinds that make several splices themselves, so not part of a random batch.
    kCompound = ('move_block',)

    def __init__(self, rng, batch_fraction=0.15):
        self.rng = rng
        self.batch_fraction = batch_fraction
        self._typing = None      # (line, column, characters left) of a typing run
        self._typed_col = 0
        self._table = []
        for name, weight in self.kKinds:
            self._table.extend([name] * weight)

    def Next(self, lines):
        """(splices, reads) of the next edit, or (splices, None) when its text
        does not read (skipped), or None when nothing applied."""
        typed = self._ContinueTyping(lines)
        if typed is not None:
            return typed
        if self.rng.random() < self.batch_fraction:
            return self._Batch(lines)
        kind = self.rng.choice(self._table)
        made = self._Make(kind, lines, 0, len(lines))
        if not made:
            return None
        if isinstance(made, list):
            return self._Read(lines, made)
        if kind == 'type':
            # Later calls type the next characters right after this one.
            self._typing = (made.start, self._typed_col + 1, self.rng.randint(0, 5))
        return self._Read(lines, [made])

    def _Read(self, lines, splices):
        try:
            return splices, ReadSteps(lines, splices)
        except SourceRejected:
            return splices, None

    def _Make(self, kind, lines, lo, hi):
        """A Splice, or a list of them for a compound kind, or None."""
        hi = min(hi, len(lines))
        if lo > hi:
            return None
        made = getattr(self, '_' + kind)(lines, lo, hi)
        for splice in made if isinstance(made, list) else [made] if made else []:
            splice.kind = kind
        return made

    def _Batch(self, lines):
        rng = self.rng
        count = rng.randint(2, 5)
        lines = list(lines)
        splices, reads = [], []
        lo = 0
        for k in range(count):
            # Spread the changes over what is left of the file.
            hi = lo + max(1, (len(lines) - lo) * 2 // (count - k))
            kind = rng.choice(self._table)
            while kind in self.kCompound:
                kind = rng.choice(self._table)
            if kind == 'type':
                kind = 'type_char'
            splice = self._Make(kind, lines, lo, hi)
            if splice is None:
                continue
            try:
                read = ReadSteps(lines, [splice])[0]
            except SourceRejected:
                continue
            splice.kind = 'batch:' + kind
            splices.append(splice)
            reads.append(read)
            lines = read[0]
            lo = splice.start + len(splice.new_lines)
        if not splices:
            return None
        return splices, reads

    def _ContinueTyping(self, lines):
        if self._typing is None:
            return None
        line_index, col, left = self._typing
        self._typing = None
        if left <= 0 or line_index >= len(lines) or col > len(lines[line_index]):
            return None
        line = lines[line_index]
        splice = Splice(line_index, 1, [line[:col] + self._TypedChar() + line[col:]], 'type')
        made = self._Read(lines, [splice])
        if made[1] is not None:
            self._typing = (line_index, col + 1, left - 1)
        return made

    def Reset(self):
        self._typing = None

    def _TypedChar(self):
        return self.rng.choice(_kIdentChars + '  ')

    def _Line(self, lines, lo, hi, want=None):
        """A random existing line index in [lo, hi) satisfying `want`."""
        hi = min(hi, len(lines))
        if lo >= hi:
            return None
        for _ in range(8):
            i = self.rng.randrange(lo, hi)
            if want is None or want(lines[i]):
                return i
        return None

    # The kinds.

    def _delete_line(self, lines, lo, hi):
        i = self._Line(lines, lo, hi)
        return None if i is None else Splice(i, 1, [])

    def _copy_line(self, lines, lo, hi):
        if not lines:
            return None
        src = self.rng.randrange(len(lines))
        return Splice(self.rng.randint(lo, hi), 0, [lines[src]])

    def _reindent(self, lines, lo, hi):
        i = self._Line(lines, lo, hi, lambda l: not _Blank(l))
        if i is None:
            return None
        line = lines[i]
        cur = _Indent(line)
        choice = self.rng.random()
        if choice < 0.4:
            new = cur + 4
        elif choice < 0.8:
            new = max(0, cur - 4)
        else:
            new = _Indent(lines[self.rng.randrange(len(lines))])
        return Splice(i, 1, [' ' * new + line.lstrip(' \t')])

    def _insert_header(self, lines, lo, hi):
        rng = self.rng
        at = rng.randint(lo, hi)
        names = [m.group(1) for m in map(_kDefinedName.match, lines) if m]
        name = rng.choice(names) if names else 'f'
        near = _NearestCode(lines, at - 1, -1) if rng.random() < 0.5 else None
        if near is None:
            near = _NearestCode(lines, at, 1)
        indent = _Indent(lines[near]) if near is not None else 0
        if near is not None and near < at and lines[near].rstrip().endswith(':'):
            indent += 4
        if rng.random() < 0.5:
            header = 'def %s(self):' % name
        else:
            header = 'class %s:' % name
        new = [' ' * indent + header]
        if rng.random() < 0.5:
            new.append(' ' * (indent + 4) + rng.choice(['pass', 'return None', 'x = 1']))
        return Splice(at, 0, new)

    def _insert_comment(self, lines, lo, hi):
        rng = self.rng
        at = rng.randint(lo, hi)
        above = _Indent(lines[at - 1]) if 0 < at <= len(lines) else 0
        below = _Indent(lines[at]) if at < len(lines) else 0
        indent = rng.choice([0, above, below, max(above, below) + 4, above + 8])
        count = 1 if rng.random() < 0.7 else rng.randint(2, 3)
        new = []
        for _ in range(count):
            new.append(' ' * indent + '# ' + rng.choice(_kWords))
            if rng.random() < 0.3:
                indent = rng.choice([0, above, below])
        return Splice(at, 0, new)

    def _insert_blank(self, lines, lo, hi):
        rng = self.rng
        new = [rng.choice(['', '', ' ', '    ', '        ', '\t', '  \t'])
               for _ in range(rng.randint(1, 3))]
        return Splice(rng.randint(lo, hi), 0, new)

    def _Headers(self, lines, lo=0, hi=None):
        hi = len(lines) if hi is None else min(hi, len(lines))
        return [i for i in range(lo, hi) if _kHeader.match(lines[i])]

    def _duplicate_function(self, lines, lo, hi):
        rng = self.rng
        headers = self._Headers(lines)
        if not headers:
            return None
        src = rng.choice(headers)
        end = _BlockEnd(lines, src)
        if end - src > 80:
            return None
        block = lines[src:end]
        indent = _Indent(lines[src])
        if rng.random() < 0.3 and lo <= end <= hi:
            return Splice(end, 0, block)
        hi = min(hi, len(lines))
        starts = [i for i in range(lo, hi)
                  if not _Blank(lines[i]) and _Indent(lines[i]) == indent
                  and not lines[i].lstrip().startswith('#')]
        if not starts:
            return None
        return Splice(rng.choice(starts), 0, block)

    def _delete_block(self, lines, lo, hi):
        rng = self.rng
        if rng.random() < 0.5:
            headers = self._Headers(lines, lo, hi)
            if headers:
                src = rng.choice(headers)
                end = _BlockEnd(lines, src)
                if end - src <= 120:
                    return Splice(src, end - src, [])
        i = self._Line(lines, lo, hi)
        if i is None:
            return None
        return Splice(i, min(len(lines) - i, rng.randint(2, 8)), [])

    def _reindent_block(self, lines, lo, hi):
        rng = self.rng
        headers = self._Headers(lines, lo, hi)
        if headers and rng.random() < 0.7:
            start = rng.choice(headers)
            end = _BlockEnd(lines, start)
        else:
            start = self._Line(lines, lo, hi)
            if start is None:
                return None
            end = min(len(lines), start + rng.randint(2, 10))
        block = lines[start:end]
        if rng.random() < 0.5:
            new = [' ' * 4 + l if l.strip() else l for l in block]
        else:
            new = [l[4:] if l.startswith(' ' * 4) else l for l in block]
        return Splice(start, end - start, new)

    def _move_block(self, lines, lo, hi):
        """Cut a def/class block and paste it before another line of its indent."""
        headers = self._Headers(lines)
        if not headers:
            return None
        src = self.rng.choice(headers)
        end = _BlockEnd(lines, src)
        size = end - src
        if size > 80:
            return None
        block = lines[src:end]
        indent = _Indent(lines[src])
        targets = [i for i in range(len(lines) + 1)
                   if not src <= i <= end and (
                       i == len(lines) or (not _Blank(lines[i]) and _Indent(lines[i]) == indent
                                           and not lines[i].lstrip().startswith('#')))]
        if not targets:
            return None
        to = self.rng.choice(targets)
        if to < src:
            return [Splice(to, 0, block), Splice(src + size, size, [])]
        return [Splice(src, size, []), Splice(to - size, 0, block)]

    def _type(self, lines, lo, hi):
        return self._type_char(lines, lo, hi)

    def _type_char(self, lines, lo, hi):
        i = self._Line(lines, lo, hi)
        if i is None:
            return None
        line = lines[i]
        indent = _Indent(line)
        col = self.rng.randint(indent, len(line)) if self.rng.random() < 0.9 else \
            self.rng.randint(0, len(line))
        self._typed_col = col
        return Splice(i, 1, [line[:col] + self._TypedChar() + line[col:]])

    def _join_lines(self, lines, lo, hi):
        i = self._Line(lines, lo, min(hi, len(lines) - 1))
        if i is None:
            return None
        return Splice(i, 2, [lines[i].rstrip() + ' ' + lines[i + 1].strip()])

    def _split_line(self, lines, lo, hi):
        i = self._Line(lines, lo, hi, lambda l: ' ' in l.strip())
        if i is None:
            return None
        line = lines[i]
        indent = _Indent(line)
        spaces = [k for k in range(indent + 1, len(line)) if line[k] == ' ']
        if not spaces:
            return None
        at = self.rng.choice(spaces)
        second = ' ' * (indent + self.rng.choice([0, 0, 4])) + line[at:].lstrip()
        return Splice(i, 1, [line[:at].rstrip(), second])


# ---------------------------------------------------------------------------
# Reproducers

def RunScenario(old_text, splices, cache_check=False, finder_class=CChangeFinder):
    """Replays one edit from a whole-file pass of `old_text`. Returns
    (outcome, new_text), or None when some intermediate text does not read."""
    try:
        doc = LiveDocument(old_text, cache_check, finder_class)
        reads = ReadSteps(doc.lines, splices)
    except SourceRejected:
        return None
    outcome = doc.Edit(splices, reads)
    return outcome, doc.text


def SplicesBetween(old_text, new_text, batch=True):
    """The splices (in order, each in the coordinates the earlier ones leave)
    that turn old_text into new_text: one per differing run of lines, or a
    single one covering all of them when `batch` is false."""
    old_lines, new_lines = SplitLines(old_text), SplitLines(new_text)
    opcodes = [op for op in difflib.SequenceMatcher(None, old_lines, new_lines,
                                                    autojunk=False).get_opcodes()
               if op[0] != 'equal']
    if not opcodes:
        return []
    if not batch:
        opcodes = [('replace', opcodes[0][1], opcodes[-1][2], opcodes[0][3], opcodes[-1][4])]
    # Earlier changes are applied first, so each starts where it does in the new text.
    return [Splice(j1, i2 - i1, new_lines[j1:j2], 'diff') for _, i1, i2, j1, j2 in opcodes]


def CheckPair(old_text, new_text, cache_check=False, batch=True, finder_class=CChangeFinder):
    """Replays old_text -> new_text as one FindChanges call from a whole-file
    pass of old_text. Returns the EditOutcome; its .problems is empty when the
    incremental pass agrees. Raises SourceRejected when a text does not read."""
    splices = SplicesBetween(old_text, new_text, batch)
    if not splices:
        raise ReplayError('the two texts are the same')
    replayed = RunScenario(old_text, splices, cache_check, finder_class)
    if replayed is None and batch and len(splices) > 1:
        # Some in-between text does not read: make it one change.
        splices = SplicesBetween(old_text, new_text, False)
        replayed = RunScenario(old_text, splices, cache_check, finder_class)
    if replayed is None:
        raise SourceRejected('the edited text does not read')
    outcome = replayed[0]
    outcome.splices = splices
    return outcome


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


_kReproTemplate = '''\
# Reproducer written by tools/replay.py: %(title)s
# %(where)s
# Run: PYTHONPATH=%(pythonpath)s python2.7 %(path)s
# Exit status: 0 agrees, 1 disagrees, 2 the steps do not rebuild NEW.
import sys

from pysource._fastaccess import LogicalLineType
from pysource.logicals import ReadLogicals
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache, GetFullNameForScopeDef

%(old)s
%(new)s
# lst[start:stop] is replaced by new logicals (tokens, lineno, indent, kind), then
# the logicals after them move by delta lines, as an editor does, one splice after
# the other; everything goes to ONE FindChanges call.
STEPS = %(steps)s
CHECK_CACHE = %(check_cache)r


def Names(l):
    return (l.fScopeName, l.fLocalScopeName)


def ScopeNames(lst):
    names = ['']
    for l in lst:
        if l.fKind in (1, 2) and l.fLocalScopeName is not None:
            name = GetFullNameForScopeDef(l)
            if name not in names:
                names.append(name)
    return names


def Ask(method, name):
    try:
        return True, method(name)
    except KeyError:
        return False, None
    except Exception as exc:
        return False, repr(exc)


lst = ReadLogicals(OLD)
finder = CChangeFinder(lst)
finder.FindChanges(lst, [])
if CHECK_CACHE:
    warm = CScopeBodyCache(lst)
    old_names = ScopeNames(lst)
    for name in old_names:
        Ask(warm.GetScopeDef, name)
        Ask(warm.GetBodyOfScope, name)

added, removed = [], []
for start, stop, new, delta in STEPS:
    new = [LogicalLineType(*args) for args in new]
    removed.extend(lst[start:stop])
    lst[start:stop] = new
    added.extend(new)
    if delta:
        for l in lst[start + len(new):]:
            l.fLineno += delta
both = set(map(id, added)) & set(map(id, removed))
added = [l for l in added if id(l) not in both]
removed = [l for l in removed if id(l) not in both]
print 'FindChanges(added=%%d, removed=%%d)' %% (len(added), len(removed))
contents, classes, functions = finder.FindChanges(added, removed)
print 'changes:', sorted(contents), sorted(classes), sorted(functions)

fresh = ReadLogicals(NEW)
CChangeFinder(fresh).FindChanges(fresh, [])
if [(l.fTokens, l.fLineno) for l in lst] != [(l.fTokens, l.fLineno) for l in fresh]:
    print 'the steps do not rebuild NEW'
    sys.exit(2)
bad = 0
for i, (got, want) in enumerate(zip(lst, fresh)):
    if Names(got) != Names(want):
        bad += 1
        print 'L%%d %%r: expected %%r, got %%r' %% (got.fLineno, ' '.join(got.fTokens)[:40],
                                              Names(want), Names(got))
if CHECK_CACHE and not bad:
    changes = set(contents) | set(classes) | set(functions)
    warm.Clear(sorted(changes))
    cold = CScopeBodyCache(lst)
    new_names = ScopeNames(lst)
    for name in new_names + [n for n in old_names if n not in new_names]:
        for method in ('GetScopeDef', 'GetBodyOfScope'):
            w = Ask(getattr(warm, method), name)
            c = Ask(getattr(cold, method), name)
            same = w[0] == c[0] and (w[1] is c[1] or (
                isinstance(w[1], list) and isinstance(c[1], list) and len(w[1]) == len(c[1])
                and all(a is b for a, b in zip(w[1], c[1]))))
            if not same or (name not in new_names and w != (False, None)):
                bad += 1
                print '%%s(%%r): warm %%r, fresh %%r%%s' %% (
                    method, name, w, c, '' if name in changes else ' (not in changes)')
print '%%d disagreements' %% bad
sys.exit(1 if bad else 0)
'''


def FormatReproducer(old_text, new_text, steps, title, where, path, check_cache):
    out = []
    for step in steps:
        start, stop, new, delta = step.Literal()
        if not new:
            out.append('    (%d, %d, [], %d),\n' % (start, stop, delta))
            continue
        out.append('    (%d, %d, [\n' % (start, stop))
        out.extend('        %r,\n' % (args,) for args in new)
        out.append('    ], %d),\n' % delta)
    return _kReproTemplate % dict(
        title=title, where=where, path=path,
        pythonpath=os.path.join(_kRepoDir, 'build', 'python'),
        old=_TextLiteral('OLD', old_text), new=_TextLiteral('NEW', new_text),
        steps='[\n%s]' % ''.join(out), check_cache=bool(check_cache))


def WriteReproducer(repro_dir, stem, old_text, splices, invariant, cache_check, where,
                    finder_class=CChangeFinder):
    """Shrinks the failing edit and writes a self-contained script (which uses
    CChangeFinder itself). Returns (path, note)."""
    replayed = RunScenario(old_text, splices, cache_check, finder_class)
    if replayed is None or replayed[0].problems.invariant != invariant:
        note = 'does not fail from a fresh pass of the old text (history-dependent)'
        small_old, small_splices, attempts = old_text, splices, 0
    else:
        small_old, small_splices, attempts = Shrink(old_text, splices, invariant, cache_check,
                                                    finder_class=finder_class)
        note = 'shrunk in %d tries' % attempts
    replayed = RunScenario(small_old, small_splices, cache_check, finder_class)
    if replayed is None:
        return None, 'the edit does not read again'
    outcome, new_text = replayed
    if not os.path.isdir(repro_dir):
        os.makedirs(repro_dir)
    path = os.path.join(repro_dir, stem + '.py')
    title = '%s, %s' % (', '.join(s.Describe() for s in small_splices),
                        {'names': 'scope names differ from a fresh pass',
                         'cache': 'change sets miss a scope',
                         'error': 'an exception (see the traceback)'}[invariant])
    text = FormatReproducer(small_old, new_text, outcome.steps, title, where, path,
                            cache_check and invariant == 'cache')
    with open(path, 'w') as f:
        f.write(text)
    note += ', %d -> %d lines' % (len(SplitLines(small_old)), len(SplitLines(new_text)))
    return path, note


# ---------------------------------------------------------------------------
# Driver

def _Percentile(sorted_values, fraction):
    if not sorted_values:
        return 0.0
    k = min(len(sorted_values) - 1, int(round(fraction * (len(sorted_values) - 1))))
    return sorted_values[k]


StdlibFiles = toolpath.StdlibFiles


def SeededRandom(*parts):
    """A Random seeded the same way on every run (str hashes may be salted)."""
    key = ':'.join(str(p) for p in parts)
    return random.Random(int(hashlib.md5(key).hexdigest()[:16], 16))


def SampleFiles(paths, count, seed, max_lines=None):
    """`count` of `paths` picked by `seed`, in their given order; files longer
    than `max_lines` are passed over."""
    if max_lines is not None:
        kept = []
        for p in paths:
            try:
                with open(p, 'rU') as f:
                    if f.read().count('\n') <= max_lines:
                        kept.append(p)
            except (IOError, OSError):
                pass
        paths = kept
    if count >= len(paths):
        return list(paths)
    picked = set(SeededRandom('sample', seed).sample(range(len(paths)), count))
    return [p for i, p in enumerate(paths) if i in picked]


class _Printer(object):
    def __init__(self, out, quiet):
        self.out = out
        self.quiet = quiet

    def __call__(self, line, always=False):
        if always or not self.quiet:
            self.out.write(line + '\n')
            self.out.flush()


def run_replay(paths, seed=0, edits_per_file=150, batch_fraction=0.15, cache_check=True,
               reset_every=50, stop_on_failure=False, repro_dir=kDefaultReproDir,
               max_repros=10, quiet=False, trace=False, out=None, finder_class=CChangeFinder):
    """Replays `edits_per_file` seeded edits on each file (the text goes back to
    the file's own every `reset_every` edits) and checks each FindChanges call.
    Returns a summary dict; its 'failures' list has one entry per failing edit."""
    say = _Printer(out or sys.stdout, quiet)
    summary = dict(files=0, files_rejected=0, edits=0, batches=0, skipped=0,
                   logicals_compared=0, names_disagreements=0, cache_disagreements=0,
                   errors=0, replay_errors=0, failures=[], cache_check=False,
                   cache_notice=None)
    if cache_check:
        notice = CacheCheckAvailable()
        if notice is None:
            summary['cache_check'] = True
        else:
            summary['cache_notice'] = notice
            say('notice: change-set checks skipped: %s' % notice, always=True)
    cache_check = summary['cache_check']
    times = []
    times_by_kind = {}
    sizes = []
    repros = 0
    stop = False

    for file_number, path in enumerate(paths):
        if stop:
            break
        try:
            with open(path, 'rU') as f:
                original = JoinLines(SplitLines(f.read()))
            doc = LiveDocument(original, cache_check, finder_class)
        except (IOError, OSError, SourceRejected) as exc:
            summary['files_rejected'] += 1
            say('%s: skipped (%s)' % (path, str(exc).splitlines()[0] if str(exc) else exc))
            continue
        except Exception:
            summary['files_rejected'] += 1
            summary['errors'] += 1
            say('%s: the whole-file pass raised\n%s' % (path, traceback.format_exc()),
                always=True)
            continue
        summary['files'] += 1
        sizes.append(len(doc.lst))
        rng = SeededRandom(seed, _Short(path))
        maker = EditMaker(rng, batch_fraction)
        file_fails = file_edits = file_skipped = 0
        file_times = []
        tries = 0
        while file_edits < edits_per_file and tries < edits_per_file * 6 and not stop:
            tries += 1
            made = maker.Next(doc.lines)
            if made is None:
                continue
            splices, reads = made
            if reads is None:
                file_skipped += 1
                continue
            old_text = doc.text
            kinds = set(sp.kind for sp in splices)
            kind = kinds.pop() if len(kinds) == 1 else 'batch'
            if kind.startswith('batch:'):
                kind = 'batch'
            multi = len(splices) > 1
            before_call = None
            if trace:
                before_call = _Tracer(repro_dir, old_text, reads[-1][0], path)
            try:
                outcome = doc.Edit(splices, reads, before_call)
            except ReplayError as exc:
                # Our own fault, not the product's: say so and go on from the new text.
                summary['replay_errors'] += 1
                say('REPLAY BUG %s, edit %d: %s\n%r' % (path, file_edits + 1, exc, splices),
                    always=True)
                doc = LiveDocument(JoinLines(reads[-1][0]), cache_check, finder_class)
                continue
            file_edits += 1
            summary['edits'] += 1
            summary['batches'] += multi
            summary['logicals_compared'] += outcome.compared
            micros = outcome.seconds * 1e6
            times.append(micros)
            file_times.append(micros)
            times_by_kind.setdefault(kind, []).append(micros)
            invariant = outcome.problems.invariant
            if invariant is None:
                if reset_every and file_edits % reset_every == 0:
                    doc = LiveDocument(original, cache_check, finder_class)
                    maker.Reset()
                continue

            file_fails += 1
            summary[{'names': 'names_disagreements', 'cache': 'cache_disagreements',
                     'error': 'errors'}[invariant]] += 1
            where = '%s, edit %d (seed %s)' % (path, file_edits, seed)
            say('FAIL [%s] %s: %s' % (invariant, where,
                                      ', '.join(s.Describe() for s in splices)), always=True)
            for line in outcome.problems.Lines():
                say('    ' + line, always=True)
            failure = dict(path=path, edit=file_edits, kind=kind, invariant=invariant,
                           splices=[s.Describe() for s in splices],
                           details=outcome.problems.Lines(), repro=None)
            if repro_dir and repros < max_repros:
                repros += 1
                stem = 'repro_%03d_%s_%s' % (repros, os.path.splitext(
                    os.path.basename(path))[0], invariant)
                try:
                    repro, note = WriteReproducer(repro_dir, stem, old_text, splices,
                                                  invariant, cache_check, where, finder_class)
                except Exception:
                    repro, note = None, 'could not write: %s' % traceback.format_exc()
                failure['repro'] = repro
                say('    reproducer: %s (%s)' % (repro, note), always=True)
            summary['failures'].append(failure)
            if stop_on_failure:
                stop = True
                break
            # The names are wrong from here on: start again from a fresh pass.
            doc = LiveDocument(doc.text, cache_check, finder_class)

        summary['skipped'] += file_skipped
        file_times.sort()
        say('%-60s %6d logicals %4d edits %3d skipped %2d failed  median %6.1f us' % (
            _Short(path), sizes[-1], file_edits, file_skipped, file_fails,
            _Percentile(file_times, 0.5)))

    times.sort()
    sizes.sort()
    summary['findchanges_us_median'] = _Percentile(times, 0.5)
    summary['findchanges_us_p95'] = _Percentile(times, 0.95)
    summary['logicals_per_file_median'] = _Percentile(sizes, 0.5)
    summary['logicals_per_file_max'] = sizes[-1] if sizes else 0
    summary['by_kind'] = dict(
        (k, (len(v), _Percentile(sorted(v), 0.5), _Percentile(sorted(v), 0.95)))
        for k, v in times_by_kind.items())
    return summary


class _Tracer(object):
    """Writes the pending edit before the call, so a crash leaves it behind."""

    def __init__(self, repro_dir, old_text, new_lines, path):
        self.repro_dir = repro_dir or kDefaultReproDir
        self.old_text = old_text
        self.new_text = JoinLines(new_lines)
        self.path = path

    def __call__(self, outcome):
        if not os.path.isdir(self.repro_dir):
            os.makedirs(self.repro_dir)
        target = os.path.join(self.repro_dir, 'last_edit.py')
        text = FormatReproducer(self.old_text, self.new_text, outcome.steps,
                                'the last edit before the call', self.path, target, False)
        with open(target, 'w') as f:
            f.write(text)


def _Short(path):
    if path.startswith(kStdlibDir):
        return 'stdlib' + path[len(kStdlibDir):]
    return os.path.relpath(path) if path.startswith(os.getcwd()) else path


def FormatSummary(summary):
    lines = []
    if summary['by_kind']:
        lines.append('FindChanges time by edit kind (us):')
        lines.append('  %-20s %6s %9s %9s' % ('kind', 'edits', 'median', 'p95'))
        for kind, (n, med, p95) in sorted(summary['by_kind'].items()):
            lines.append('  %-20s %6d %9.1f %9.1f' % (kind, n, med, p95))
    lines.append('FindChanges per edit: median %.1f us, p95 %.1f us; logicals per file: '
                 'median %d, max %d' % (summary['findchanges_us_median'],
                                        summary['findchanges_us_p95'],
                                        summary['logicals_per_file_median'],
                                        summary['logicals_per_file_max']))
    cache = 'checked' if summary['cache_check'] else 'not checked'
    lines.append('files %d (rejected %d), edits %d (batches %d), skipped edits %d, logicals '
                 'compared %d' % (summary['files'], summary['files_rejected'], summary['edits'],
                                  summary['batches'], summary['skipped'],
                                  summary['logicals_compared']))
    lines.append('disagreements: names %d, change sets %d (%s), errors %d' % (
        summary['names_disagreements'], summary['cache_disagreements'], cache,
        summary['errors']))
    if summary['replay_errors']:
        lines.append('REPLAY BUGS (the tool, not the product): %d' % summary['replay_errors'])
    return lines


def Failed(summary):
    return bool(summary['names_disagreements'] or summary['cache_disagreements'] or
                summary['errors'] or summary['replay_errors'])


def _ParseArgs(argv):
    parser = argparse.ArgumentParser(
        prog='replay.py', description='Replays seeded edits through CChangeFinder and checks '
        'each call against a fresh whole-file pass.')
    parser.add_argument('files', nargs='*', metavar='FILE',
                        help='files to edit (default: the bundled sample)')
    parser.add_argument('--stdlib', action='store_true',
                        help='add every .py file of the 2.7 standard library')
    parser.add_argument('--sample', type=int, metavar='N',
                        help='replay only N of the files, picked by the seed')
    parser.add_argument('--seed', default='0', help='random seed (default 0)')
    parser.add_argument('--edits', type=int, default=150, metavar='N',
                        help='edits replayed on each file (default 150)')
    parser.add_argument('--edits-per-file', '--reset-every', dest='reset_every', type=int,
                        default=50, metavar='N',
                        help='edits before the document goes back to the original text '
                        '(default 50; 0: never)')
    parser.add_argument('--batch-fraction', type=float, default=0.15, metavar='F',
                        help='fraction of edits that are batches of 2-5 changes (default 0.15)')
    parser.add_argument('--no-cache-check', dest='cache_check', action='store_false',
                        help='do not check the change sets through CScopeBodyCache')
    parser.add_argument('--stop-on-failure', action='store_true')
    parser.add_argument('--repro-dir', default=kDefaultReproDir, metavar='DIR',
                        help='where reproducers go (default %s)' % kDefaultReproDir)
    parser.add_argument('--max-repros', type=int, default=10, metavar='N',
                        help='shrink and write at most N reproducers (default 10)')
    parser.add_argument('--trace', action='store_true',
                        help='write DIR/last_edit.py before every call (for crashes)')
    parser.add_argument('--quiet', action='store_true',
                        help='print only failures and the summary')
    return parser.parse_args(argv)


def main(argv=None):
    if argv is None:
        argv = sys.argv[1:]
    args = _ParseArgs(argv)
    paths = list(args.files)
    if args.stdlib:
        paths.extend(StdlibFiles())
    if not paths:
        paths = [kSamplePath]
    if args.sample is not None:
        paths = SampleFiles(paths, args.sample, args.seed)
    summary = run_replay(paths, seed=args.seed, edits_per_file=args.edits,
                         batch_fraction=args.batch_fraction, cache_check=args.cache_check,
                         reset_every=args.reset_every, stop_on_failure=args.stop_on_failure,
                         repro_dir=args.repro_dir, max_repros=args.max_repros,
                         quiet=args.quiet, trace=args.trace)
    sys.stdout.write('\n'.join(FormatSummary(summary)) + '\n')
    return 1 if Failed(summary) else 0


if __name__ == '__main__':
    sys.exit(main())
