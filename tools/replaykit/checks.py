"""What one FindChanges call is held against after an edit:

  1. names: every logical has the fScopeName and fLocalScopeName that a
     whole-file pass over a fresh read of the same text gives;
  2. change sets: a warm CScopeBodyCache, cleared of the returned changes
     only, answers GetScopeDef / GetBodyOfScope like a fresh cache does.
"""

import difflib
import time
import traceback

from pysource._fastaccess import LogicalLineType
from pysource.logicals import kClassKind, kDefKind
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache, GetFullNameForScopeDef

from replaykit.editor import (Clone, FollowChanges, JoinLines, Read, ReadSteps, ReplayError,
                              SourceRejected, Splice, SplitLines)


def Names(logical):
    return (logical.fScopeName, logical.fLocalScopeName)


def WholePass(logicals):
    CChangeFinder(logicals).FindChanges(logicals, [])
    return logicals


def ScopeNames(lst):
    """'' and the full name of every scope a class/def logical opens, in order."""
    names = ['']
    seen = set(names)
    for l in lst:
        # A bare `def` being typed defines no scope.
        if l.fKind in (kClassKind, kDefKind) and l.fLocalScopeName is not None:
            name = GetFullNameForScopeDef(l)
            if name not in seen:
                seen.add(name)
                names.append(name)
    return names


def NameDiffs(lst, oracle):
    """(index, logical, expected names, actual names) of every logical whose
    names differ from the fresh pass."""
    return [(i, got, Names(want), Names(got))
            for i, (got, want) in enumerate(zip(lst, oracle)) if Names(got) != Names(want)]


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
        return 'L%d %s' % (value.fLineno, Preview(value, 30))
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
        missed = '' if name in changes else ' (not in the returned changes)'
        for method in ('GetScopeDef', 'GetBodyOfScope'):
            w = _Ask(getattr(warm, method), name)
            f = _Ask(getattr(fresh, method), name)
            if not _SameAnswer(w, f):
                problems.append('%s(%r): warm %s, fresh %s%s' % (
                    method, name, _Answer(w), _Answer(f), missed))
            elif name not in new_set and w != (False, None):
                problems.append('%s(%r) of a scope that is gone: %s%s' % (
                    method, name, _Answer(w), missed))
    return problems


def KindLabel(kind):
    return {0: 'code', 1: 'class', 2: 'def', 21: 'comment', 22: 'blank'}.get(kind, str(kind))


def Preview(logical, width=50):
    text = ' '.join(logical.fTokens)
    return repr(text if len(text) <= width else text[:width - 3] + '...')


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
            lines = self.error.rstrip().splitlines()
            return ['exception ' + l for l in lines[:1]] + ['    ' + l for l in lines[1:]]
        if self.names:
            out = ['%d logicals differ from a fresh pass; first %d:' % (
                len(self.names), min(limit, len(self.names)))]
            for i, l, want, got in self.names[:limit]:
                out.append('  [%d] L%d %s %s' % (i, l.fLineno, KindLabel(l.fKind), Preview(l)))
                out.append('      expected %r, got %r' % (want, got))
            return out
        out = ['%d cache answers differ after Clear(changes); first %d:' % (
            len(self.cache), min(limit, len(self.cache)))]
        out.extend('  ' + p for p in self.cache[:limit])
        return out


class EditOutcome(object):
    __slots__ = ('seconds', 'added', 'removed', 'changes', 'problems', 'compared', 'splices')


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
        outcome.changes, outcome.compared, outcome.splices = None, 0, splices
        old_names = None
        if self.cache is not None:
            try:
                old_names = ScopeNames(self.lst)
                WarmCache(self.cache, old_names)
            except Exception:
                # Checked after the previous edit, so this is the cache's own fault.
                problems.error = 'warming the cache before the edit:\n' + traceback.format_exc()

        # The live list takes the fresh logicals themselves; the oracle is a copy.
        oracle = [Clone(l) for l in reads[-1][1]]
        outcome.added, outcome.removed = FollowChanges(self.lst, [fresh for _, fresh in reads])
        self.lines = reads[-1][0]
        if before_call is not None:
            before_call(outcome)
        start = time.time()
        try:
            result = self.finder.FindChanges(outcome.added, outcome.removed)
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
                problems.error = 'checking the cache after the edit:\n' + traceback.format_exc()
        return outcome


def RunScenario(old_text, splices, cache_check=False, finder_class=CChangeFinder):
    """Replays one edit from a whole-file pass of `old_text`. Returns
    (outcome, new_text), or None when some text on the way does not read."""
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
    return replayed[0]
