"""Random Python 2 source, random editor edits, and the live logical list the
way an editor keeps it: the logicals outside an edited region stay (the same
objects, line numbers moved), the region is read again and replaced."""

from pysource._fastaccess import LogicalLineType
from pysource.logicals import ReadLogicals

kNames = ('f', 'g', 'h', 'A', 'B', '__init__', 'run', 'f1', 'f10')
kWords = ('todo', 'XXX', 'see above', 'was: return None', 'fast path')


class Rejected(Exception):
    """The text does not read as logicals; the edit is dropped."""


def Read(text):
    try:
        return ReadLogicals(text)
    except Exception as exc:  # SyntaxError, IndentationError and a few others
        raise Rejected('%s: %s' % (type(exc).__name__, exc))


def Lines(text):
    return text.split('\n')[:-1] if text.endswith('\n') else text.split('\n')


def Text(lines):
    return ''.join(l + '\n' for l in lines)


def Signature(l):
    return (tuple(l.fTokens), l.fKind, l.fIndent)


def Indent(line):
    return len(line) - len(line.lstrip(' \t'))


def IsCode(line):
    s = line.strip()
    return bool(s) and not s.startswith('#')


# ---------------------------------------------------------------------------
# Source

class SourceMaker(object):
    """Small files with nested scopes, repeated names, decorators, comments at
    odd indents, blank lines and statements over several lines. `max_repeats`
    caps the run of same-named definitions made in one place."""

    def __init__(self, rng, max_repeats=14):
        self.rng = rng
        self.max_repeats = max_repeats

    def Make(self):
        rng = self.rng
        lines = []
        self._Block(lines, 0, 0, rng.randint(3, 12))
        if rng.random() < 0.15:
            self._Repeats(lines, 0)
        if rng.random() < 0.1:
            lines.append(rng.choice(['', '    ', '# trailing']))
        return Text(lines)

    def Header(self, indent, kind=None):
        rng = self.rng
        kind = kind or rng.choice(['def', 'def', 'class'])
        name = rng.choice(kNames)
        if kind == 'def':
            head = rng.choice(['def %s(self):', 'def %s(a, b=1):', 'async def %s():',
                               'def %s(x,\n%s        y):' % ('%s', ' ' * indent)]) % name
        else:
            head = rng.choice(['class %s:', 'class %s(object):', 'class %s(A,\n%s    B):'
                               % ('%s', ' ' * indent)]) % name
        return ' ' * indent + head

    def Statement(self, indent):
        rng = self.rng
        pad = ' ' * indent
        r = rng.random()
        if r < 0.1:
            return pad + 'x = (1,\n%s     2)' % pad
        if r < 0.15:
            return pad + 's = """doc\n  inside\n"""'
        if r < 0.2:
            return pad + 'y = 1 + \\\n%s    2' % pad
        return pad + rng.choice(['pass', 'x = 1', 'return None', 'print x', 'import os',
                                 'f(g)', 'z += 2', 'del y', 'global q'])

    def Comment(self, indent):
        return ' ' * max(0, indent) + '# ' + self.rng.choice(kWords)

    def _Repeats(self, lines, indent):
        for _ in range(self.rng.randint(2, self.max_repeats)):
            lines.append(' ' * indent + 'def f():')
            lines.append(' ' * (indent + 4) + 'pass')

    def _Block(self, lines, indent, depth, count):
        rng = self.rng
        step = rng.choice([4, 4, 4, 2, 8])
        for _ in range(count):
            r = rng.random()
            if depth < 4 and r < 0.3:
                if rng.random() < 0.1:
                    lines.append(' ' * indent + '@deco')
                lines.append(self.Header(indent))
                self._Block(lines, indent + step, depth + 1, rng.randint(1, 5))
            elif depth < 4 and r < 0.38:
                lines.append(' ' * indent + rng.choice(['if x:', 'for i in y:', 'while 1:',
                                                        'try:', 'with m:']))
                self._Block(lines, indent + step, depth + 1, rng.randint(1, 3))
                if rng.random() < 0.3:
                    lines.append(' ' * indent + 'else:' if rng.random() < 0.5 else
                                 ' ' * indent + 'except:')
                    self._Block(lines, indent + step, depth + 1, 1)
            elif r < 0.5:
                lines.append(self.Comment(rng.choice([0, indent, indent - 4, indent + 4])))
            elif r < 0.56:
                lines.append(rng.choice(['', '', ' ' * indent, '  ']))
            elif r < 0.58 and depth < 3:
                self._Repeats(lines, indent)
            else:
                lines.append(self.Statement(indent))


# ---------------------------------------------------------------------------
# Edits: each kind makes a splice (start, count, new lines) of the current lines

class Splice(object):
    __slots__ = ('start', 'count', 'new', 'kind')

    def __init__(self, start, count, new, kind):
        self.start, self.count, self.new, self.kind = start, count, list(new), kind

    def Apply(self, lines):
        out = list(lines)
        out[self.start:self.start + self.count] = self.new
        return out

    def __repr__(self):
        return '%s@%d(-%d+%r)' % (self.kind, self.start + 1, self.count, self.new)


class EditMaker(object):
    kKinds = (('type', 14), ('insert_lines', 10), ('insert_header', 8), ('insert_comment', 10),
              ('insert_blank', 5), ('delete_lines', 9), ('reindent', 8), ('reindent_block', 4),
              ('duplicate_block', 4), ('comment_out', 4), ('rename', 6), ('split_join', 3),
              ('stray_bracket', 4), ('missing_bracket', 3), ('delete_from_blank', 3))

    def __init__(self, rng, source_maker):
        self.rng = rng
        self.src = source_maker
        self.table = [k for k, w in self.kKinds for _ in range(w)]

    def One(self, lines, lo=0, kind=None):
        """A splice at or below line `lo`, or None."""
        kind = kind or self.rng.choice(self.table)
        if lo > len(lines):
            return None
        made = getattr(self, '_' + kind)(lines, lo)
        if made is not None:
            made.kind = kind
        return made

    def _At(self, lines, lo):
        return self.rng.randint(lo, len(lines))

    def _Line(self, lines, lo, want=None):
        if lo >= len(lines):
            return None
        for _ in range(6):
            i = self.rng.randrange(lo, len(lines))
            if want is None or want(lines[i]):
                return i
        return None

    def _NearIndent(self, lines, at):
        above = Indent(lines[at - 1]) if 0 < at <= len(lines) else 0
        below = Indent(lines[at]) if at < len(lines) else 0
        extra = 4 if 0 < at <= len(lines) and lines[at - 1].rstrip().endswith(':') else 0
        return self.rng.choice([above + extra, below, 0, max(0, above - 4)])

    def _type(self, lines, lo):
        i = self._Line(lines, lo)
        if i is None:
            return None
        line = lines[i]
        col = self.rng.randint(0, len(line))
        if self.rng.random() < 0.3 and line:
            col = min(col, len(line) - 1)
            new = line[:col] + line[col + 1:]
        else:
            new = line[:col] + self.rng.choice('abcxyz_19 :()#\t') + line[col:]
        return Splice(i, 1, [new], '')

    def _insert_lines(self, lines, lo):
        at = self._At(lines, lo)
        indent = self._NearIndent(lines, at)
        new = [self.src.Statement(indent) for _ in range(self.rng.randint(1, 3))]
        return Splice(at, 0, '\n'.join(new).split('\n'), '')

    def _insert_header(self, lines, lo):
        at = self._At(lines, lo)
        indent = self._NearIndent(lines, at)
        new = self.src.Header(indent).split('\n')
        if self.rng.random() < 0.6:
            new.extend(self.src.Statement(indent + 4).split('\n'))
        return Splice(at, 0, new, '')

    def _insert_comment(self, lines, lo):
        at = self._At(lines, lo)
        new = [self.src.Comment(self._NearIndent(lines, at) + self.rng.choice([0, 0, 4, -4]))
               for _ in range(self.rng.choice([1, 1, 1, 2, 3]))]
        return Splice(at, 0, new, '')

    def _insert_blank(self, lines, lo):
        new = [self.rng.choice(['', '', '    ', '\t', '  ']) for _ in range(self.rng.randint(1, 3))]
        return Splice(self._At(lines, lo), 0, new, '')

    def _stray_bracket(self, lines, lo):
        # A closing bracket with no opener, as text being typed holds: the
        # reader makes no logical of the blank lines after it, which a later
        # deletion may take out with the lines under them.
        i = self._Line(lines, lo, lambda line: line.strip() and not line.strip().startswith('#'))
        if i is None:
            return None
        new = [lines[i].rstrip() + self.rng.choice(')]}')]
        new.extend([''] * self.rng.choice([0, 1, 1, 2]))
        return Splice(i, 1, new, '')

    def _missing_bracket(self, lines, lo):
        # A bracket typed away, or an opener typed in: a closer later on may
        # then be a stray one, or the text no longer reads.
        i = self._Line(lines, lo, lambda line: any(c in line for c in '()[]{}'))
        if i is None:
            return None
        line = lines[i]
        at = [k for k, c in enumerate(line) if c in '()[]{}']
        if self.rng.random() < 0.3:
            k = self.rng.randint(0, len(line))
            return Splice(i, 1, [line[:k] + self.rng.choice('([{') + line[k:]], '')
        k = self.rng.choice(at)
        return Splice(i, 1, [line[:k] + line[k + 1:]], '')

    def _delete_from_blank(self, lines, lo):
        # A span that starts at a blank line and takes the lines under it,
        # headers included.
        i = self._Line(lines, lo, lambda line: not line.strip())
        if i is None:
            return None
        return Splice(i, min(len(lines) - i, self.rng.choice([2, 2, 3, 4, 6])), [], '')

    def _delete_lines(self, lines, lo):
        i = self._Line(lines, lo)
        if i is None:
            return None
        return Splice(i, min(len(lines) - i, self.rng.choice([1, 1, 2, 3, 6, 12])), [], '')

    def _reindent(self, lines, lo):
        i = self._Line(lines, lo, lambda l: l.strip())
        if i is None:
            return None
        cur = Indent(lines[i])
        new = self.rng.choice([cur + 4, max(0, cur - 4), 0, cur + 2])
        return Splice(i, 1, [' ' * new + lines[i].lstrip(' \t')], '')

    def _BlockEnd(self, lines, start):
        indent, end = Indent(lines[start]), start + 1
        while end < len(lines) and (not IsCode(lines[end]) or Indent(lines[end]) > indent):
            end += 1
        return end

    def _reindent_block(self, lines, lo):
        i = self._Line(lines, lo, IsCode)
        if i is None:
            return None
        end = self._BlockEnd(lines, i)
        block = lines[i:end]
        if self.rng.random() < 0.5:
            new = ['    ' + l if l.strip() else l for l in block]
        else:
            new = [l[4:] if l.startswith('    ') else l for l in block]
        return Splice(i, len(block), new, '')

    def _duplicate_block(self, lines, lo):
        heads = [k for k in range(len(lines)) if lines[k].lstrip().startswith(('def ', 'class '))]
        if not heads:
            return None
        src = self.rng.choice(heads)
        block = lines[src:self._BlockEnd(lines, src)]
        if len(block) > 40:
            return None
        at = self._At(lines, lo)
        return Splice(at, 0, block, '')

    def _comment_out(self, lines, lo):
        i = self._Line(lines, lo, lambda l: l.strip())
        if i is None:
            return None
        end = min(len(lines), i + self.rng.randint(1, 4))
        block = lines[i:end]
        if all(l.lstrip().startswith('#') or not l.strip() for l in block):
            new = [l.replace('# ', '', 1) if l.lstrip().startswith('# ') else l for l in block]
        else:
            new = ['# ' + l if self.rng.random() < 0.5 else
                   ' ' * Indent(l) + '# ' + l.lstrip() for l in block]
        return Splice(i, len(block), new, '')

    def _rename(self, lines, lo):
        i = self._Line(lines, lo, lambda l: l.lstrip().startswith(('def ', 'class ')))
        if i is None:
            return None
        line = lines[i]
        words = line.split(None, 2)
        if len(words) < 2:
            return None
        old = words[1].split('(')[0].split(':')[0]
        if not old:
            return None
        new_name = self.rng.choice(kNames)
        return Splice(i, 1, [line.replace(old, new_name, 1)], '')

    def _split_join(self, lines, lo):
        i = self._Line(lines, lo, IsCode)
        if i is None:
            return None
        if i + 1 < len(lines) and self.rng.random() < 0.5:
            return Splice(i, 2, [lines[i] + ' ' + lines[i + 1].strip()], '')
        line = lines[i]
        cut = self.rng.randint(Indent(line), len(line))
        return Splice(i, 1, [line[:cut], ' ' * Indent(line) + line[cut:].lstrip()], '')


# ---------------------------------------------------------------------------
# The live list

class Edit(object):
    """One FindChanges worth of change to the live list."""

    def __init__(self, kind, text_before, text_after, added, removed, splices):
        self.kind = kind
        self.text_before = text_before
        self.text_after = text_after
        self.added = added
        self.removed = removed
        self.splices = splices


def Clone(l):
    return LogicalLineType(list(l.fTokens), l.fLineno, l.fIndent, l.fKind)


def UpdateLive(lst, fresh, start, count, delta, nlines_before):
    """Brings `lst` (the logicals of the text before a splice of `count` lines
    at 0-based `start`, `delta` lines longer after) to `fresh` (those of the
    text after) in place. Returns (added, removed)."""
    first, after = start + 1, start + count + 1
    nold, nfresh = len(lst), len(fresh)
    limit = min(nold, nfresh)
    head = 0
    while head < limit:
        old, new = lst[head], fresh[head]
        last_line = lst[head + 1].fLineno - 1 if head + 1 < nold else nlines_before
        if last_line >= first or old.fLineno != new.fLineno or Signature(old) != Signature(new):
            break
        head += 1
    tail = 0
    while tail < limit - head:
        old, new = lst[nold - 1 - tail], fresh[nfresh - 1 - tail]
        if old.fLineno < after or new.fLineno != old.fLineno + delta or \
                Signature(old) != Signature(new):
            break
        tail += 1
    removed = lst[head:nold - tail]
    added = [Clone(l) for l in fresh[head:nfresh - tail]]
    lst[head:nold - tail] = added
    for k in range(nfresh - tail, nfresh):   # the kept suffix now stands where fresh has it
        lst[k].fLineno = fresh[k].fLineno
    return added, removed


def SameReading(lst, fresh):
    return len(lst) == len(fresh) and all(
        a.fLineno == b.fLineno and Signature(a) == Signature(b) for a, b in zip(lst, fresh))


class Document(object):
    """The text and its live logical list, edited in place."""

    def __init__(self, text):
        self.text = text
        self.lst = Read(text)
        self.undo = None       # (text, snapshot of (logical, lineno)) before the last edit

    def Apply(self, splices, kind):
        """Applies the splices top to bottom; returns the Edit, or raises
        Rejected (nothing changed) when an intermediate text does not read."""
        lines = Lines(self.text)
        steps = []
        for s in splices:
            nbefore = len(lines)
            lines = s.Apply(lines)
            steps.append((s, Read(Text(lines)), nbefore))
        snapshot = [(l, l.fLineno) for l in self.lst]
        before = self.text
        added, removed, fresh_ids = [], [], set()
        for s, fresh, nbefore in steps:
            a, r = UpdateLive(self.lst, fresh, s.start, s.count, len(s.new) - s.count, nbefore)
            for l in r:
                if id(l) in fresh_ids:
                    added.remove(l)
                else:
                    removed.append(l)
            added.extend(a)
            fresh_ids.update(id(l) for l in a)
        self.text = Text(lines)
        self.undo = (before, snapshot)
        if not SameReading(self.lst, steps[-1][1]):
            raise AssertionError('fuzzer bug: live list does not read like the text')
        return Edit(kind, before, self.text, added, removed, splices)

    def Replace(self, text, kind):
        """The whole text replaced: every logical new."""
        fresh = Read(text)
        before, removed = self.text, list(self.lst)
        self.undo = (before, [(l, l.fLineno) for l in self.lst])
        self.lst[:] = fresh
        self.text = text
        return Edit(kind, before, text, list(fresh), removed, [])

    def Undo(self):
        """Back to the text before the last edit, putting back the very
        logical objects that edit removed (with their old line numbers)."""
        if self.undo is None:
            return None
        text, snapshot = self.undo
        self.undo = None
        old = [l for l, _ in snapshot]
        cur = list(self.lst)
        head = 0
        while head < min(len(old), len(cur)) and old[head] is cur[head]:
            head += 1
        tail = 0
        while tail < min(len(old), len(cur)) - head and old[-1 - tail] is cur[-1 - tail]:
            tail += 1
        added = old[head:len(old) - tail]
        removed = cur[head:len(cur) - tail]
        self.lst[head:len(cur) - tail] = added
        for l, lineno in snapshot:
            l.fLineno = lineno
        before, self.text = self.text, text
        return Edit('undo', before, text, added, removed, [])
