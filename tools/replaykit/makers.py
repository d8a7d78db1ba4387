"""Seeded, realistic edits of a text: what people do to source while typing."""

import re

from replaykit.editor import ReadSteps, SourceRejected, Splice

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

