"""The editor's side of an edit: the text changes, and the live logical list
follows it in place before one FindChanges(added, removed) call.

The protocol, the same for the tests, the replay and its reproducers:

- one change: the logicals of the new text are read afresh; the common prefix
  of the live list (same tokens, kind, indent and line number) and its common
  suffix (same tokens, kind and indent) stay, as the same objects, and the
  suffix logicals take their new line numbers; the middle is replaced by the
  fresh logicals;
- several changes in one call: they are applied top to bottom, each to the
  text the one before left. A removed logical keeps the line number it had
  just before its own change; a logical added by one change and removed by a
  later one was never seen by the finder and is in neither list.
"""

from pysource._fastaccess import LogicalLineType
from pysource.logicals import ReadLogicals


class SourceRejected(Exception):
    """The text does not read as logicals."""


class ReplayError(Exception):
    """The replay machinery itself went wrong (not a fault of the finder)."""


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
    except Exception as exc:  # SyntaxError, and a few other ways the tokenizer gives up
        raise SourceRejected('%s: %s' % (type(exc).__name__, exc))


def Signature(logical):
    return (logical.fTokens, logical.fKind, logical.fIndent)


def Clone(logical):
    return LogicalLineType(logical.fTokens, logical.fLineno, logical.fIndent, logical.fKind)


def FollowOneChange(lst, fresh):
    """Brings `lst` to the reading `fresh` of the changed text; returns (added, removed)."""
    limit = min(len(lst), len(fresh))
    head = 0
    while (head < limit and Signature(lst[head]) == Signature(fresh[head])
           and lst[head].fLineno == fresh[head].fLineno):
        head += 1
    tail = 0
    while tail < limit - head and Signature(lst[-1 - tail]) == Signature(fresh[-1 - tail]):
        tail += 1
    for k in range(1, tail + 1):
        lst[-k].fLineno = fresh[-k].fLineno
    stop = len(lst) - tail
    removed, added = lst[head:stop], fresh[head:len(fresh) - tail]
    lst[head:stop] = added
    return added, removed


def FollowChanges(lst, readings):
    """Applies the readings of a batch of changes in order; returns the
    (added, removed) of the one FindChanges call that reports them all."""
    added, removed = [], []
    for fresh in readings:
        new, gone = FollowOneChange(lst, fresh)
        born = set(map(id, added))
        removed.extend(l for l in gone if id(l) not in born)
        dropped = set(map(id, gone)) & born
        added = [l for l in added if id(l) not in dropped] + new
    return added, removed


def Edit(lst, *sources):
    """Turns `lst` into the logicals of the last source, through the others in
    turn (a batch), as an editor does; returns (added, removed)."""
    return FollowChanges(lst, [ReadLogicals(s) for s in sources])


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
    """(lines, fresh logicals) after each splice in turn; SourceRejected when
    some text on the way does not read."""
    lines = list(lines)
    out = []
    for splice in splices:
        if not 0 <= splice.start <= len(lines) or splice.start + splice.count > len(lines):
            raise ReplayError('splice out of range: %r on %d lines' % (splice, len(lines)))
        splice.Apply(lines)
        out.append((list(lines), Read(JoinLines(lines))))
    return out
