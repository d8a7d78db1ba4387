"""What a document is held against after every call.

The replay keeps the text itself (a Python string edited by
textedits.ApplyRange) and, for each call, asks a fresh read of that text
by the reader written in Python (pysource.logicals, reference=True) and a
whole-file pass by a new CChangeFinder what the document should hold:

  text      GetText, GetLineCount and the edited lines equal the kept text;
  logicals  tokens, line numbers, indents, kinds and both names equal the
            fresh read's (or, for text that does not read, the last
            readable text's: the baseline);
  error     for text that does not read, GetError and fError equal the
            reader's error (type, msg, lineno, offset, text, filename);
  result    fReadable, fAdded/fRemoved empty without a FindChanges call;
  identity  the logicals outside fAdded/fRemoved are the same objects;
  cache     a warm CScopeBodyCache over the document's logicals, cleared
            with the call's change sets, answers like a fresh one;
  doccache  the document's own GetScopeDef/GetBodyOfScope do too;
  outline   GetOutline and GetScopeAtLine equal the reference answers;
  region    fRegion is a replacement of whole rows: first line >= 1, inside
            the new text, and, when the text reads, its rows differ by the
            line delta since the text last read;
  selfcheck SelfCheck (with self_check) does not raise.
"""

import traceback

from pysource.scopebodycache import CChangeFinder, CScopeBodyCache

from dockit.reference import ErrorFields, Fields, Outline, ReferenceRead, ScopeAtLine
from replaykit.checks import CacheDiffs, KindLabel, ScopeNames, WarmCache, _Ask, _SameAnswer

kInvariants = ('exception', 'text', 'result', 'error', 'logicals', 'identity', 'cache',
               'doccache', 'outline', 'region', 'stats', 'selfcheck')


def NamedRead(text, filename):
    """(fresh named logicals, None), or (None, the reader's error)."""
    try:
        lst = ReferenceRead(text, filename)
    except SyntaxError as exc:
        return None, exc
    CChangeFinder(lst).FindChanges(lst, [])
    return lst, None


class Problems(object):
    """What one call got wrong, by invariant, in the order found."""

    def __init__(self, ignore=()):
        self.found = []   # (invariant, line)
        self.ignore = ignore

    def Add(self, invariant, line):
        if invariant not in self.ignore:
            self.found.append((invariant, line))

    @property
    def invariant(self):
        return min((kInvariants.index(i), i) for i, _ in self.found)[1] if self.found else None

    def Lines(self, limit=6):
        out, seen = [], {}
        for invariant, line in self.found:
            seen[invariant] = seen.get(invariant, 0) + 1
            if seen[invariant] <= limit:
                out.extend(('[%s] ' % invariant + line).splitlines())
            elif seen[invariant] == limit + 1:
                out.append('[%s] ...' % invariant)
        return out


def _Show(fields):
    tokens, lineno, indent, kind, scope, local = fields
    text = ' '.join(tokens)
    text = text if len(text) <= 40 else text[:37] + '...'
    return 'L%d %s indent %d %r names (%r, %r)' % (lineno, KindLabel(kind), indent, text, scope,
                                                  local)


def _ListDiffs(got, want, problems):
    got, want = [Fields(l) for l in got], [Fields(l) for l in want]
    if len(got) != len(want):
        problems.Add('logicals', '%d logicals, expected %d' % (len(got), len(want)))
    for i, (g, w) in enumerate(zip(got, want)):
        if g != w:
            problems.Add('logicals', '[%d] expected %s\n     got %s' % (i, _Show(w), _Show(g)))


class Session(object):
    """A document under test with the replay's own view of it."""

    def __init__(self, document_class, text, filename='<string>', self_check=False,
                 cache_check=True, ignore=()):
        self.document_class, self.filename = document_class, filename
        self.self_check, self.cache_check = self_check, cache_check
        self.ignore = frozenset(ignore)
        self.text = text
        self.baseline_text, self.baseline = None, []
        self.doc = document_class(text, filename)
        self.mine = self.doc.GetLogicals()
        self.cache = CScopeBodyCache(self.mine) if cache_check else None
        self.problems = Problems(self.ignore)
        self._Check(None, [], [], self.problems)

    def Step(self, op):
        """Makes the call `op`; returns its Problems."""
        problems = Problems(self.ignore)
        old_list = self.doc.GetLogicals()
        old_names = ScopeNames(self.mine)
        if self.cache is not None:
            WarmCache(self.cache, old_names)
        # A call whose text reads re-reads from the last text that read.
        new_text = op.Result(self.text)
        old_count = None if self.baseline_text is None else self.baseline_text.count('\n') + 1
        try:
            result = op.Call(self.doc, self.text)
        except Exception:
            problems.Add('exception', '%s raised:\n%s' % (op.method, traceback.format_exc()))
            return problems
        self.text = new_text
        try:
            self._Check(result, old_list, old_names, problems, old_count)
        except Exception:
            problems.Add('exception', 'a query raised:\n' + traceback.format_exc())
        return problems

    def _Check(self, result, old_list, old_names, problems, old_count=None):
        doc, text = self.doc, self.text
        lines = text.split('\n')
        if doc.GetText() != text:
            problems.Add('text', 'GetText() is %r, expected %r' % (doc.GetText()[:200], text[:200]))
        if doc.GetLineCount() != len(lines):
            problems.Add('text', 'GetLineCount() is %d, expected %d' % (doc.GetLineCount(), len(lines)))
        region = result.fRegion if result is not None else None
        for n in set([1, len(lines)] + ([region[0]] if region and 0 < region[0] <= len(lines) else [])):
            if doc.GetLine(n) != lines[n - 1]:
                problems.Add('text', 'GetLine(%d) is %r, expected %r' % (n, doc.GetLine(n), lines[n - 1]))

        fresh, error = NamedRead(text, self.filename)
        readable = fresh is not None
        if doc.IsReadable() != readable:
            problems.Add('result', 'IsReadable() is %r, expected %r' % (doc.IsReadable(), readable))
        if result is not None and bool(result.fReadable) != readable:
            problems.Add('result', 'fReadable is %r, expected %r' % (result.fReadable, readable))
        if readable:
            self.baseline_text, self.baseline = text, fresh
            if doc.GetError() is not None or (result is not None and result.fError is not None):
                problems.Add('error', 'the text reads, but the document reports %r' % (
                    doc.GetError() if doc.GetError() is not None else result.fError,))
        else:
            want = ErrorFields(error)
            for label, got in [('GetError()', doc.GetError())] + (
                    [('fError', result.fError)] if result is not None else []):
                if ErrorFields(got) != want:
                    problems.Add('error', '%s is %r, expected %r' % (label, ErrorFields(got), want))
            if result is not None and (result.fAdded or result.fRemoved):
                problems.Add('result', 'unreadable text, but fAdded %d, fRemoved %d' % (
                    len(result.fAdded), len(result.fRemoved)))

        new_list = doc.GetLogicals()
        _ListDiffs(new_list, self.baseline, problems)
        if result is not None:
            self._CheckIdentity(result, old_list, new_list, problems)
            self._CheckRegion(result, old_count, problems)
        changes = set()
        if result is not None:
            for name in ('fContentsChanges', 'fClassChanges', 'fFunctionChanges'):
                value = getattr(result, name)
                if not isinstance(value, (set, frozenset)):
                    problems.Add('result', '%s is %r, not a set' % (name, value))
                else:
                    changes |= value
            stats = doc.GetLastEditStats()
            if not all(k in stats for k in ('rows_scanned', 'logicals_made')):
                problems.Add('stats', 'GetLastEditStats() is %r' % (stats,))
        self.mine[:] = new_list
        if self.cache is not None and result is not None:
            # Cleared every time, so that it stays warm and exact; after other
            # faults its answers are beside the point.
            diffs = CacheDiffs(self.cache, self.mine, old_names, changes)
            if not problems.found:
                for p in diffs:
                    problems.Add('cache', p)
        self._CheckQueries(new_list, old_names, problems)
        if self.self_check:
            try:
                doc.SelfCheck()
            except AssertionError as exc:
                problems.Add('selfcheck', 'SelfCheck() raised: %s' % exc)

    def _CheckIdentity(self, result, old_list, new_list, problems):
        added, removed = set(map(id, result.fAdded)), set(map(id, result.fRemoved))
        kept_old = [l for l in old_list if id(l) not in removed]
        kept_new = [l for l in new_list if id(l) not in added]
        if len(kept_old) != len(kept_new) or any(a is not b for a, b in zip(kept_old, kept_new)):
            first = next((i for i, (a, b) in enumerate(zip(kept_old, kept_new)) if a is not b),
                         min(len(kept_old), len(kept_new)))
            problems.Add('identity', 'the logicals outside fAdded/fRemoved are not the ones '
                         'before the call (%d kept before, %d after; first apart at %d)' % (
                             len(kept_old), len(kept_new), first))
        new_ids, old_ids = set(map(id, new_list)), set(map(id, old_list))
        if not added <= new_ids:
            problems.Add('identity', 'fAdded holds logicals that are not in the document')
        if not removed <= old_ids:
            problems.Add('identity', 'fRemoved holds logicals that were not in the document')

    def _CheckRegion(self, result, old_count, problems):
        region = result.fRegion
        try:
            first, old_rows, new_rows = region
        except (TypeError, ValueError):
            problems.Add('region', 'fRegion is %r' % (region,))
            return
        count = self.text.count('\n') + 1
        delta = None if old_count is None or not result.fReadable else count - old_count
        if first < 1 or new_rows < 0 or old_rows < 0 or first - 1 + new_rows > count:
            problems.Add('region', 'fRegion %r is outside the new text of %d lines' % (region, count))
        elif delta is not None and new_rows - old_rows != delta:
            problems.Add('region', 'fRegion %r: rows differ by %d, the text by %d lines since '
                         'it last read' % (region, new_rows - old_rows, delta))

    def _CheckQueries(self, new_list, old_names, problems):
        doc = self.doc
        want = Outline(self.baseline, self.baseline_text or '')
        got = doc.GetOutline()
        if got != want:
            extra = [o for o in got if o not in want][:3]
            missing = [o for o in want if o not in got][:3]
            problems.Add('outline', 'GetOutline() differs: %d entries, expected %d; '
                         'unexpected %r, missing %r' % (len(got), len(want), extra, missing))
        linenos = [l.fLineno for l in self.baseline]
        top = max([self.text.count('\n') + 1] + linenos[-1:]) + 1
        for n in range(0, top + 1):
            w = ScopeAtLine(self.baseline, n, linenos)
            g = doc.GetScopeAtLine(n)
            if g != w:
                problems.Add('outline', 'GetScopeAtLine(%d) is %r, expected %r' % (n, g, w))
                break
        fresh = CScopeBodyCache(new_list)
        names = ScopeNames(new_list)
        names += [n for n in old_names if n not in set(names)]
        for name in names:
            for method in ('GetScopeDef', 'GetBodyOfScope'):
                g = _Ask(getattr(doc, method), name)
                w = _Ask(getattr(fresh, method), name)
                if not _SameAnswer(g, w):
                    problems.Add('doccache', 'the document\'s %s(%r) differs from a fresh cache\'s'
                                 % (method, name))
