"""The document's outline as the protocol's hierarchical DocumentSymbol list
and its folding ranges, written straight as JSON text.

An outline of a large file is thousands of symbols, and a keystroke changes
one or two of them. So each symbol's JSON is kept as a piece: after an edit
that leaves the outline (names, kinds, header and end lines) as it was,
only the pieces that read an edited line are written again; after any
other, the symbols before and after the edited lines keep their columns
and take their new line numbers, and only those between are worked out
from their lines again.
"""

import bisect
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

# Edited lines between two answers beyond which the symbols are matched up
# rather than looked up by line.
kMaxDirtyLines = 256
# How many lines after the header's first the name is looked for (a header
# continued by a backslash before its name).
kNameSearchLines = 8

# Names as the reader takes them: ASCII letters, digits and '_' (a name
# with other letters is cut where they start, or is not a name at all).
_kFlags = 0 if _kPy2 else re.ASCII
_kNameOnLine = re.compile(r'\b(?:def|class)[ \t\f]+(\w+)', _kFlags)
_kNameAcrossLines = re.compile(r'\b(?:def|class)(?:[ \t\f]|\\\r?\n)+(\w+)', _kFlags)
# What comes before a symbol that closes n symbols before it (shared strings).
_kPrefixes = [''] + [']}' * n + ',' for n in range(1, 64)]


def BareName(scoped_name):
    """The name as written in the source: `f` of `A#0.f#1`."""
    local = scoped_name.rpartition('.')[2]
    return local.rpartition('#')[0] or local


def _JsonString(text):
    if positions.IsAscii(text) and '"' not in text and '\\' not in text:
        return '"' + text + '"'
    return json.dumps(text.decode('utf-8', 'replace') if _kPy2 else text)


def _NamePlace(doc, header_line, end_line, name, header):
    """(line, column, length) of `name` after `def`/`class` in the header,
    in the document's numbering; the header's first character and length 0
    when it is not there as written."""
    for match in _kNameOnLine.finditer(header):
        if match.group(1) == name:
            return header_line, match.start(1), len(name)
    last = min(end_line, header_line + kNameSearchLines)
    if last > header_line:
        lines = [header] + [doc.GetLine(n) for n in range(header_line + 1, last + 1)]
        text = '\n'.join(lines)
        for match in _kNameAcrossLines.finditer(text):
            if match.group(1) == name:
                before = text[:match.start(1)]
                line = header_line + before.count('\n')
                return line, match.start(1) - (before.rfind('\n') + 1), len(name)
    return header_line, len(header) - len(header.lstrip()), 0


class COutlineJson(object):
    """The JSON text of one document's symbols, kept piece by piece.

    Between two builds the edits are summed up as the lines they left alone:
    the first `_same_top` lines of the text and its last `_same_bottom`
    lines are what they were at the build (the bottom ones shifted by the
    change in the line count). Each symbol's piece is a template holding
    its columns, filled with its line numbers: a symbol whose lines are all
    in the untouched parts keeps its template and only takes its new line
    numbers.
    """

    def __init__(self, encoding):
        self._encoding = encoding
        self._outline = None
        self._headers = []      # the header line of each symbol, for bisect
        self._count = 0         # the line count at the build, then after each edit
        self._built_count = 0
        self._same_top = 0
        self._same_bottom = 0
        self._templates = []    # per symbol: (template, name line - header line)
        self._prefixes = []     # per symbol: what closes the symbols before it
        self._in_class = []     # per symbol: whether its parent is a class
        self._pieces = []
        self._by_end = None     # (end lines sorted, their symbols), made when needed
        self._tail = ''
        self._fresh = False     # no edit since the pieces were made
        self.stats = dict(built=0, aligned=0, rewritten=0)

    def NoteEdit(self, first, last, new_count):
        """Lines `first`..`last` (numbered as before the edit) were replaced
        by `new_count` lines."""
        self._fresh = False
        self._count += new_count - (last - first + 1)
        self._same_top = min(self._same_top, first - 1)
        self._same_bottom = min(self._same_bottom, self._count - (first + new_count - 1))

    def Current(self):
        """The JSON of the last answer when no edit came since, else None."""
        return self._Joined() if self._fresh else None

    def _Joined(self):
        return '[' + ''.join(self._pieces) + self._tail + ']'

    def Json(self, doc, outline):
        """The symbols of `outline` (doc.GetOutline() of a text that reads)."""
        if self._fresh:
            return self._Joined()
        count = doc.GetLineCount()
        if self._outline is None or count != self._count:
            self._Build(doc, outline, count)
        elif count == self._built_count and (outline is self._outline or outline == self._outline) and \
                count - self._same_bottom - self._same_top <= kMaxDirtyLines:
            self._Rewrite(doc, outline, count)
        else:
            self._Update(doc, outline, count)
        self._same_top = self._same_bottom = self._built_count = self._count = count
        self._fresh = True
        return self._Joined()

    def _Rewrite(self, doc, outline, count):
        """The outline and the line count are as built: only the symbols
        that read an edited line are written again."""
        if self._by_end is None:
            order = sorted(range(len(outline)), key=lambda i: outline[i][3])
            self._by_end = [outline[i][3] for i in order], order
        first, last = self._same_top + 1, count - self._same_bottom
        templates = self._templates
        redo = set()
        # Symbols that read an edited line: in their header through their name, or at their end.
        for i in range(bisect.bisect_left(self._headers, first - kNameSearchLines),
                       bisect.bisect_right(self._headers, last)):
            header = outline[i][2]
            if header + templates[i][1] >= first:
                redo.add(i)
        ends, order = self._by_end
        redo.update(order[bisect.bisect_left(ends, first):bisect.bisect_right(ends, last)])
        for i in redo:
            self._templates[i] = self._Template(doc, outline[i], count, self._in_class[i])
            self._pieces[i] = self._prefixes[i] + _Fill(self._templates[i], outline[i])
        self.stats['rewritten'] += len(redo)

    def _Update(self, doc, outline, count):
        """After edits that moved lines or changed the outline: the symbols
        whose header lines lie above the edited lines keep their pieces (an
        enclosing one whose end moved takes its new end), those below keep
        their templates and take their new line numbers, and those between
        are worked out from their lines."""
        old = self._outline
        templates, prefixes, in_classes, pieces = (
            self._templates, self._prefixes, self._in_class, self._pieces)
        top = self._same_top
        shift = count - self._built_count
        changed_to = self._built_count - self._same_bottom  # old lines after it are untouched
        n_old, n_new = len(old), len(outline)
        lead = bisect.bisect_right(self._headers, top)
        while lead and old[lead - 1][2] + templates[lead - 1][1] > top:
            lead -= 1
        trail = n_old - bisect.bisect_right(self._headers, changed_to)
        if lead + trail > n_new or (lead and outline[lead - 1][0] != old[lead - 1][0]) or \
                (trail and outline[n_new - trail][2] != old[n_old - trail][2] + shift):
            self._Build(doc, outline, count)  # not as the edits' places say: all afresh
            return
        made = 0
        new_templates, new_prefixes = templates[:lead], prefixes[:lead]
        new_in_class, new_pieces = in_classes[:lead], pieces[:lead]
        # Those around the edits: their end is below the untouched top.
        for k in [k for k in range(lead) if old[k][3] > top or outline[k] != old[k]]:
            entry, end = outline[k], old[k][3]
            if not (end > changed_to and entry[3] == end + shift and entry[0] == old[k][0]):
                new_templates[k] = self._Template(doc, entry, count, new_in_class[k])
                made += 1
            new_pieces[k] = new_prefixes[k] + _Fill(new_templates[k], entry)
        # Those after, walked as a whole build walks them from the scopes
        # open after the lead; those below the edits keep their templates
        # when they keep their name, kind and class.
        stack = _OpenAfter(outline, lead - 1)
        first_trail = n_new - trail
        below = n_old - n_new
        stop = n_new
        if trail > 1 and self._SameBelow(outline, first_trail, lead, shift):
            stop = first_trail + 1  # the rest, below, in bulk
        for k in range(lead, stop):
            entry = outline[k]
            name = entry[0]
            parent = name.rpartition('.')[0]
            closed = 0
            while stack and stack[-1][0] != parent:
                stack.pop()
                closed += 1
            prefix = _kPrefixes[closed] if closed < 64 else ']}' * closed + ','
            in_class = bool(stack) and stack[-1][1] == kClassKind
            stack.append((name, entry[1]))
            if k >= first_trail:
                o = k + below
                was = old[o]
                if name == was[0] and entry[1] == was[1] and in_class == in_classes[o] and \
                        entry[3] == was[3] + shift:
                    new_templates.append(templates[o])
                    new_prefixes.append(prefix)
                    new_in_class.append(in_class)
                    if shift == 0 and prefix is prefixes[o]:
                        new_pieces.append(pieces[o])
                    else:
                        new_pieces.append(prefix + _Fill(templates[o], entry))
                    continue
            template = self._Template(doc, entry, count, in_class)
            made += 1
            new_templates.append(template)
            new_prefixes.append(prefix)
            new_in_class.append(in_class)
            new_pieces.append(prefix + _Fill(template, entry))
        if stop < n_new:
            # Below the edits every symbol keeps its name, kind, class and
            # place among the others: its prefix and template, new numbers.
            rest = slice(stop + below, n_old)
            new_templates.extend(templates[rest])
            new_prefixes.extend(prefixes[rest])
            new_in_class.extend(in_classes[rest])
            if shift:
                new_pieces.extend([prefix + template % (entry[2] - 1, entry[3] - 1, entry[2] - 1 + span,
                                                        entry[2] - 1 + span)
                                   for prefix, (template, span), entry in
                                   zip(prefixes[rest], templates[rest], outline[stop:])])
            else:
                new_pieces.extend(pieces[rest])
            stack = _OpenAfter(outline, n_new - 1)
        self._tail = ']}' * len(stack)
        self._outline = outline
        self._headers = [entry[2] for entry in outline]
        self._templates, self._prefixes = new_templates, new_prefixes
        self._in_class, self._pieces = new_in_class, new_pieces
        self._by_end = None
        self.stats['aligned'] += 1
        self.stats['rewritten'] += made

    def _SameBelow(self, outline, first_trail, lead, shift):
        """Whether the symbols after the first one below the edits are those
        of the build, each moved by `shift`, and the ones between the lead
        and them too, as (name, kind): then no symbol below changed its
        name, kind, parent's kind or place among the others."""
        old = self._outline
        first_old = first_trail + len(old) - len(outline)
        if [e[:2] for e in outline[lead:first_trail]] != [e[:2] for e in old[lead:first_old]]:
            return False
        return all(a[0] == b[0] and a[1] == b[1] and a[3] == b[3] + shift
                   for a, b in zip(outline[first_trail + 1:], old[first_old + 1:]))

    def _Build(self, doc, outline, count):
        self._outline = outline
        self._headers = [entry[2] for entry in outline]
        self._templates = templates = []
        self._prefixes = prefixes = []
        self._in_class = in_classes = []
        self._pieces = pieces = []
        self._by_end = None
        kinds = {}
        stack = []
        for i, entry in enumerate(outline):
            name, kind, header, end = entry
            parent = name.rpartition('.')[0]
            closed = 0
            while stack and stack[-1] != parent:
                stack.pop()
                closed += 1
            prefix = _kPrefixes[closed] if closed < 64 else ']}' * closed + ','
            in_class = kinds.get(parent) == kClassKind if stack else False
            kinds[name] = kind
            stack.append(name)
            template = self._Template(doc, entry, count, in_class)
            templates.append(template)
            prefixes.append(prefix)
            in_classes.append(in_class)
            pieces.append(prefix + _Fill(template, entry))
        self._tail = ']}' * len(stack)
        self.stats['built'] += 1
        self.stats['rewritten'] += len(outline)


    def _Template(self, doc, entry, count, in_class):
        """(the symbol's JSON with its line numbers left as %d, where its
        name's line is after its header's)."""
        name, kind, header_line, end_line = entry
        header = doc.GetLine(header_line)
        bare = BareName(name)
        name_line, name_col, name_len = _NamePlace(doc, header_line, end_line, bare, header)
        name_text = header if name_line == header_line else doc.GetLine(name_line)
        end_text = doc.GetLine(end_line)
        if end_line != count and end_text.endswith('\r'):
            end_text = end_text[:-1]
        if kind == kClassKind:
            symbol_kind = kSymbolClass
        else:
            symbol_kind = kSymbolMethod if in_class else kSymbolFunction
        indent = len(header) - len(header.lstrip())
        enc = self._encoding
        if positions.IsAscii(name_text):
            start, stop = name_col, name_col + name_len
        else:
            start = positions.ClientColumn(name_text, name_col, enc)
            stop = positions.ClientColumn(name_text, name_col + name_len, enc)
        if not positions.IsAscii(header):
            indent = positions.ClientColumn(header, indent, enc)
        end_col = len(end_text) if positions.IsAscii(end_text) else positions.ClientLength(end_text, enc)
        template = ('{"name":%s,"detail":%s,"kind":%d,'
                    '"range":{"start":{"line":%%d,"character":%d},"end":{"line":%%d,"character":%d}},'
                    '"selectionRange":{"start":{"line":%%d,"character":%d},'
                    '"end":{"line":%%d,"character":%d}},"children":[') % (
            _JsonString(bare).replace('%', '%%'), _JsonString(name).replace('%', '%%'), symbol_kind,
            indent, end_col, start, stop)
        return template, name_line - header_line


def _Fill(template, entry):
    """A symbol's piece: its template with the line numbers of `entry`."""
    line = entry[2] - 1
    name_line = line + template[1]
    return template[0] % (line, entry[3] - 1, name_line, name_line)


def _OpenAfter(outline, k):
    """The (name, kind) of the symbols still open after outline[k]: it and
    its enclosing ones, found back up the list."""
    if k < 0:
        return []
    name, kind = outline[k][0], outline[k][1]
    chain = [(name, kind)]
    want = name.rpartition('.')[0]
    k -= 1
    while want and k >= 0:
        if outline[k][0] == want:
            chain.append((want, outline[k][1]))
            want = want.rpartition('.')[0]
        k -= 1
    chain.reverse()
    return chain


def FoldingJson(outline):
    """The bodies of classes and functions as folding ranges (JSON text)."""
    return '[' + ','.join(['{"startLine":%d,"endLine":%d}' % (header - 1, end - 1)
                           for _, _, header, end in outline if end > header]) + ']'
