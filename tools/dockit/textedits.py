"""Text edits as the replay keeps them, apart from any document: a range
(start line, start col, end line, end col, new text) in characters of the
text (bytes on 2.7), lines 1-based and split at '\\n' only.

An Op is one call on a document: Edit, EditMany or SetText. Its ranges are
kept in characters whatever the call uses, so that a reproducer can drop
lines of the text without touching the ranges of other lines; with utf16
the columns are turned into UTF-16 code units when the call is made.
"""

import sys

kPy2 = sys.version_info[0] == 2


def ApplyRange(text, edit):
    """`text` with the range of `edit` replaced by its text."""
    start_line, start_col, end_line, end_col, new = edit
    lines = text.split('\n')
    middle = lines[start_line - 1][:start_col] + new + lines[end_line - 1][end_col:]
    return '\n'.join(lines[:start_line - 1] + [middle] + lines[end_line:])


def Place(text, offset):
    """(line, column) of a character offset."""
    line = text.count('\n', 0, offset) + 1
    return line, offset - (text.rfind('\n', 0, offset) + 1)


def RangeBetween(old, new):
    """The one range that turns `old` into `new` (common prefix and suffix kept)."""
    limit = min(len(old), len(new))
    head = 0
    while head < limit and old[head] == new[head]:
        head += 1
    tail = 0
    while tail < limit - head and old[-1 - tail] == new[-1 - tail]:
        tail += 1
    start, end = Place(old, head), Place(old, len(old) - tail)
    return start + end + (new[head:len(new) - tail],)


# --- UTF-16 columns -------------------------------------------------------------

def _Chars(line):
    """The characters of a line: code points on 3.x; on 2.7 its UTF-8
    characters, or None when the line is not UTF-8."""
    if not kPy2:
        return line
    try:
        chars = line.decode('utf-8')
    except UnicodeDecodeError:
        return None
    out, i = [], 0
    while i < len(chars):  # a narrow 2.7 build holds pairs
        pair = u'\ud800' <= chars[i] <= u'\udbff' and i + 1 < len(chars)
        out.append(chars[i:i + 2] if pair else chars[i])
        i += 2 if pair else 1
    return out


def _Units(char):
    return 2 if (len(char) == 2 or char > u'\uffff') else 1


def Utf16Ready(line):
    return _Chars(line) is not None


def Utf16Column(line, col):
    """A column in characters of `line` (bytes on 2.7, at a character's start)
    in UTF-16 code units."""
    if not kPy2:
        return col + sum(1 for c in line[:col] if c > u'\uffff')
    return sum(_Units(c) for c in _Chars(line[:col]))


def CharStart(line, col):
    """`col` moved back to the start of the character it is inside (2.7 bytes)."""
    if kPy2:
        while 0 < col < len(line) and (ord(line[col]) & 0xC0) == 0x80:
            col -= 1
    return col


# --- Calls -------------------------------------------------------------------------

class Op(object):
    """One call on a document. `ranges` are in characters; SetText holds the
    one range that makes its text from the text before."""

    __slots__ = ('method', 'ranges', 'utf16', 'kind')

    def __init__(self, method, ranges, utf16=False, kind=''):
        self.method = method
        self.ranges = [tuple(r) for r in ranges]
        self.utf16 = utf16
        self.kind = kind

    def Result(self, text):
        for r in self.ranges:
            text = ApplyRange(text, r)
        return text

    def Utf16Possible(self, text):
        """Whether every column can be given in UTF-16 units: on 2.7 its line
        is UTF-8 and the column at a character's start."""
        for r in self.ranges:
            lines = text.split('\n')
            for line, col in ((lines[r[0] - 1], r[1]), (lines[r[2] - 1], r[3])):
                if not Utf16Ready(line) or CharStart(line, col) != col:
                    return False
            text = ApplyRange(text, r)
        return True

    def Args(self, text):
        """The positional arguments of the call on a document holding `text`."""
        if self.method == 'SetText':
            return (self.Result(text),)
        ranges = []
        for r in self.ranges:
            if self.utf16:
                lines = text.split('\n')
                ranges.append((r[0], Utf16Column(lines[r[0] - 1], r[1]),
                               r[2], Utf16Column(lines[r[2] - 1], r[3]), r[4]))
            else:
                ranges.append(r)
            text = ApplyRange(text, r)
        return tuple(ranges[0]) if self.method == 'Edit' else (ranges,)

    def Call(self, doc, text):
        args = self.Args(text)
        if self.method == 'SetText':
            return doc.SetText(*args)
        return getattr(doc, self.method)(*args, utf16=self.utf16)

    def Describe(self):
        where = ','.join('L%d' % r[0] + ('-%d' % r[2] if r[2] != r[0] else '') for r in self.ranges)
        return '%s:%s@%s%s' % (self.method, self.kind or 'edit', where, '/utf16' if self.utf16 else '')

    def __repr__(self):
        return 'Op(%r, %r, %r, %r)' % (self.method, self.ranges, self.utf16, self.kind)
