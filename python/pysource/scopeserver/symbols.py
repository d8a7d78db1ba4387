"""The document's outline as the protocol's hierarchical DocumentSymbol list
and its folding ranges, written straight as JSON text.

An outline of a large file is thousands of symbols, and a keystroke changes
one or two of them. So each symbol's JSON is kept as a piece, and after an
edit only the pieces whose lines were edited are written again, when the
outline itself (names, kinds, header and end lines) is unchanged; anything
else writes every piece again.
"""

import json
import re
import sys

from . import positions

_kPy2 = sys.version_info[0] == 2

kClassKind = 1
kDefKind = 2
# The protocol's SymbolKind values.
kSymbolClass = 5
kSymbolMethod = 6
kSymbolFunction = 12

# Edited lines remembered between two builds; beyond this, all are written again.
kMaxDirtyLines = 256
# How many lines after the header's first the name is looked for (a header
# continued by a backslash before its name).
kNameSearchLines = 8

_kFlags = 0 if _kPy2 else re.UNICODE
_kNameOnLine = re.compile(r'\b(?:def|class)[ \t\f]+(\w+)', _kFlags)
_kNameAcrossLines = re.compile(r'\b(?:def|class)(?:[ \t\f]|\\\r?\n)+(\w+)', _kFlags)
_kClosers = [']}' * n for n in range(64)]


def BareName(scoped_name):
    """The name as written in the source: `f` of `A#0.f#1`."""
    local = scoped_name.rpartition('.')[2]
    return local.rpartition('#')[0] or local


def _JsonString(text):
    if positions.IsAscii(text) and '"' not in text and '\\' not in text:
        return '"' + text + '"'
    return json.dumps(text.decode('utf-8', 'replace') if _kPy2 else text)


def _NamePlace(doc, header_line, end_line, name, header):
    """(line, column) of `name` after `def`/`class` in the header, in the
    document's numbering; the header's first character when not found."""
    for match in _kNameOnLine.finditer(header):
        if match.group(1) == name:
            return header_line, match.start(1)
    last = min(end_line, header_line + kNameSearchLines)
    if last > header_line:
        lines = [header] + [doc.GetLine(n) for n in range(header_line + 1, last + 1)]
        text = '\n'.join(lines)
        for match in _kNameAcrossLines.finditer(text):
            if match.group(1) == name:
                before = text[:match.start(1)]
                line = header_line + before.count('\n')
                return line, match.start(1) - (before.rfind('\n') + 1)
    return header_line, len(header) - len(header.lstrip())


class COutlineJson(object):
    """The JSON text of one document's symbols, kept piece by piece."""

    def __init__(self, encoding):
        self._encoding = encoding
        self._outline = None
        self._pieces = []      # per symbol: what comes before it, then its own fields
        self._prefixes = []
        self._deps = []        # per symbol: the lines its piece reads
        self._in_class = []    # per symbol: whether its parent is a class
        self._by_line = {}     # line -> indexes of the symbols that read it
        self._tail = ''
        self._dirty = None     # lines edited since the build (current numbering); None: all
        self._json = None
        self.stats = dict(built=0, rewritten=0)

    def NoteEdit(self, first, last, new_count):
        """Lines `first`..`last` (numbered as before the edit) were replaced
        by `new_count` lines."""
        self._json = None
        dirty = self._dirty
        if dirty is None:
            return
        delta = new_count - (last - first + 1)
        moved = set(range(first, first + new_count))
        for line in dirty:
            if line < first:
                moved.add(line)
            elif line > last:
                moved.add(line + delta)
        self._dirty = moved if len(moved) <= kMaxDirtyLines else None

    def Current(self):
        """The JSON of the last build when no edit came since, else None."""
        return self._json

    def Json(self, doc, outline):
        """The symbols of `outline` (doc.GetOutline() of a text that reads)."""
        if self._json is not None:
            return self._json
        if self._dirty is not None and outline == self._outline:
            self._Rewrite(doc, outline)
        else:
            self._Build(doc, outline)
        self._dirty = set()
        self._json = '[' + ''.join(self._pieces) + self._tail + ']'
        return self._json

    def _Rewrite(self, doc, outline):
        redo = set()
        by_line = self._by_line
        for line in self._dirty:
            redo.update(by_line.get(line, ()))
        count = doc.GetLineCount()
        for i in redo:
            for line in self._deps[i]:
                by_line[line].remove(i)
            piece, deps = self._Piece(doc, outline[i], count, self._in_class[i])
            self._pieces[i] = self._prefixes[i] + piece
            self._Index(i, deps)
        self.stats['rewritten'] += len(redo)

    def _Index(self, i, deps):
        self._deps[i] = deps
        for line in deps:
            self._by_line.setdefault(line, []).append(i)

    def _Build(self, doc, outline):
        count = doc.GetLineCount()
        self._outline = outline
        self._pieces = pieces = []
        self._prefixes = prefixes = []
        self._deps = [()] * len(outline)
        self._in_class = in_class = []
        self._by_line = {}
        kinds = {}
        stack = []
        for i, entry in enumerate(outline):
            name = entry[0]
            parent = name.rpartition('.')[0]
            closed = 0
            while stack and stack[-1] != parent:
                stack.pop()
                closed += 1
            prefix = _kClosers[closed] + ',' if closed else ''
            if not stack and parent and parent in kinds:
                # Its parent was closed already (not the list order the
                # document promises): listed at the top level.
                parent = ''
            in_class.append(kinds.get(parent) == kClassKind)
            piece, deps = self._Piece(doc, entry, count, in_class[-1])
            kinds[name] = entry[1]
            stack.append(name)
            prefixes.append(prefix)
            pieces.append(prefix + piece)
            self._Index(i, deps)
        self._tail = ']}' * len(stack)
        self.stats['built'] += 1

    def _Piece(self, doc, entry, count, in_class):
        name, kind, header_line, end_line = entry
        header = doc.GetLine(header_line)
        bare = BareName(name)
        name_line, name_col = _NamePlace(doc, header_line, end_line, bare, header)
        name_text = header if name_line == header_line else doc.GetLine(name_line)
        end_text = positions.Content(doc.GetLine(end_line), end_line == count)
        enc = self._encoding
        if kind == kClassKind:
            symbol_kind = kSymbolClass
        else:
            symbol_kind = kSymbolMethod if in_class else kSymbolFunction
        indent = len(header) - len(header.lstrip())
        if positions.IsAscii(name_text):
            start, stop = name_col, name_col + len(bare)
        else:
            start = positions.ClientColumn(name_text, name_col, enc)
            stop = positions.ClientColumn(name_text, name_col + len(bare), enc)
        piece = ('{"name":%s,"detail":%s,"kind":%d,'
                 '"range":{"start":{"line":%d,"character":%d},"end":{"line":%d,"character":%d}},'
                 '"selectionRange":{"start":{"line":%d,"character":%d},'
                 '"end":{"line":%d,"character":%d}},"children":[') % (
            _JsonString(bare), _JsonString(name), symbol_kind,
            header_line - 1, positions.ClientColumn(header, indent, enc),
            end_line - 1, positions.ClientLength(end_text, enc),
            name_line - 1, start, name_line - 1, stop)
        deps = tuple(range(header_line, name_line + 1))
        if end_line > name_line:
            deps += (end_line,)
        return piece, deps


def FoldingJson(outline):
    """The bodies of classes and functions as folding ranges (JSON text)."""
    return '[' + ','.join(['{"startLine":%d,"endLine":%d}' % (header - 1, end - 1)
                           for _, _, header, end in outline if end > header]) + ']'
