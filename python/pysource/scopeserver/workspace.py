"""One open text: its document, version, outline answers and diagnostics.

While the text does not read, the document answers from the last text
that did (its baseline). The outline's line numbers are the baseline's
then, and so must its columns be: the symbols are kept as they were for
the baseline. They usually are already (the client asked for them before
the edit); when not, the edit that broke the text is undone, the symbols
written, and the edit made again.

The changes of one notification are one edit of the document (one
EditMany), so the last text that read is always a version the client
numbered. Their places are worked out in the text the changes before them
leave, simulated over the document's lines (_CBatchLines).
"""

from . import positions, symbols
from .protocol import CRequestError, kInvalidParams


class CChange(object):
    """A content change in the client's terms: `start`/`end` are (line,
    character) pairs, or None for a whole new text."""

    __slots__ = ('start', 'end', 'text')

    def __init__(self, start, end, text):
        self.start, self.end, self.text = start, end, text


def _OutlineKept(result):
    """Whether an edit of a text that read left the outline as it was: the
    text reads, no line came or went, and every logical put in stands where
    the one taken out stood, of its kind and in its scope, none a class or
    a def (so no scope starts, ends or is named otherwise)."""
    added, removed = result.fAdded, result.fRemoved
    if not result.fReadable or result.fRegion[1] != result.fRegion[2] or len(added) != len(removed):
        return False
    for new, old in zip(added, removed):
        if new.fLineno != old.fLineno or new.fKind != old.fKind or new.fKind in _kScopeKinds or \
                new.fScopeName != old.fScopeName:
            return False
    return True


_kScopeKinds = (symbols.kClassKind, symbols.kDefKind)


def _LineCountOf(text):
    return text.count('\n') + 1


class _CBatchLines(object):
    """The document's lines as the changes so far would leave them: pieces
    that are either a (first, last) range of the document's lines or a list
    of new lines."""

    def __init__(self, doc):
        self._doc = doc
        self.count = doc.GetLineCount()
        self._pieces = [(1, self.count)]

    @staticmethod
    def _Size(piece):
        return piece[1] - piece[0] + 1 if isinstance(piece, tuple) else len(piece)

    def Line(self, lineno):
        for piece in self._pieces:
            size = self._Size(piece)
            if lineno <= size:
                if isinstance(piece, tuple):
                    return self._doc.GetLine(piece[0] + lineno - 1)
                return piece[lineno - 1]
            lineno -= size
        raise IndexError(lineno)

    def Replace(self, first, last, new_lines):
        """Lines `first`..`last` become `new_lines`."""
        heads, tails = [], []
        before = 0
        for piece in self._pieces:
            size = self._Size(piece)
            low, high = before + 1, before + size
            before = high
            if low < first:
                heads.append(self._Part(piece, 0, min(high, first - 1) - low + 1))
            if high > last:
                tails.append(self._Part(piece, max(low, last + 1) - low, size))
        self._pieces = [p for p in heads + [new_lines] + tails if self._Size(p)]
        self.count += len(new_lines) - (last - first + 1)

    @staticmethod
    def _Part(piece, start, stop):
        if isinstance(piece, tuple):
            return piece[0] + start, piece[0] + stop - 1
        return piece[start:stop]


class COpenDocument(object):

    def __init__(self, uri, document, version, encoding):
        self.uri = uri
        self.doc = document
        self.version = version
        self.encoding = encoding
        self._outline = None
        self._symbols = symbols.COutlineJson(encoding)
        self._folding = (None, None)
        # The symbols' JSON of the baseline while the text does not read.
        self._kept = None if document.IsReadable() else '[]'
        self.published = None  # the error last published as a diagnostic

    # --- Edits -------------------------------------------------------------------

    def CheckChanges(self, changes):
        """Raises CRequestError when a change's range is outside the text it
        applies to (the texts before it included) or reversed."""
        count = self.doc.GetLineCount()
        for i, change in enumerate(changes):
            if change.start is not None:
                for line, character in (change.start, change.end):
                    if line > count or (line == count and character):
                        raise CRequestError(kInvalidParams, (
                            'change %d: line %d is outside the text (%d lines)' % (i, line, count)))
                if change.end < change.start:
                    raise CRequestError(kInvalidParams, 'change %d: the range ends before it starts' % i)
                count += change.text.count('\n') - (change.end[0] - change.start[0])
            else:
                count = _LineCountOf(change.text)

    def Apply(self, changes, version):
        """Applies checked changes, in order, as one edit of the document:
        when the text does not read after them, the last text that did is
        the one before the notification, whatever the texts in between."""
        doc = self.doc
        self.version = version
        if not changes:
            return
        readable = doc.IsReadable()
        kept = self._symbols.Current() if readable else None
        edits, undos = self._DocEdits(changes, readable and kept is None)
        self._EditAll(edits)
        if doc.IsReadable():
            self._kept = None
        elif readable:
            if kept is None:
                # Back to the text that read for its symbols, then on again.
                self._EditAll(undos)
                kept = self._symbols.Json(doc, doc.GetOutline())
                self._EditAll(edits)
            self._kept = kept

    def _DocEdits(self, changes, undo):
        """The changes as the document's edits, each in the text the ones
        before it leave, and (when `undo`) the edits that take them back."""
        doc = self.doc
        if len(changes) == 1 and changes[0].start is None:
            text = positions.ToDocumentText(changes[0].text)
            return [(None, text)], [(None, doc.GetText())] if undo else None
        lines = _CBatchLines(doc)
        edits, undos = [], []
        for n, change in enumerate(changes):
            text = positions.ToDocumentText(change.text)
            if change.start is None:
                start, end = (1, 0), (lines.count, len(lines.Line(lines.count)))
            else:
                start, end = self._DocPlace(lines, change.start), self._DocPlace(lines, change.end)
            edits.append(start + end + (text,))
            if undo or n < len(changes) - 1:
                first, last = lines.Line(start[0]), lines.Line(end[0])
                new = text.split('\n')
                added_end = (start[0] + len(new) - 1,
                             len(new[-1]) + (start[1] if len(new) == 1 else 0))
                if undo:
                    if start[0] == end[0]:
                        old = first[start[1]:end[1]]
                    else:
                        old = '\n'.join([first[start[1]:]] +
                                        [lines.Line(k) for k in range(start[0] + 1, end[0])] +
                                        [last[:end[1]]])
                    undos.append(start + added_end + (old,))
                new[0] = first[:start[1]] + new[0]
                new[-1] += last[end[1]:]
                lines.Replace(start[0], end[0], new)
        undos.reverse()
        return edits, undos

    def _DocPlace(self, lines, place):
        line, character = place
        count = lines.count
        if line == count:  # just past the last line: the end of the text
            return count, len(lines.Line(count))
        content = positions.Content(lines.Line(line + 1), line + 1 == count)
        return line + 1, positions.DocColumn(content, character, self.encoding)

    def _EditAll(self, edits):
        doc = self.doc
        readable = doc.IsReadable()
        if edits[0][0] is None:
            old_count = doc.GetLineCount()
            result = doc.SetText(edits[0][1])
            self._symbols.NoteEdit(1, old_count, doc.GetLineCount())
        else:
            if len(edits) == 1:
                result = doc.Edit(*edits[0])
            else:
                result = doc.EditMany(edits)
            for edit in edits:
                self._symbols.NoteEdit(edit[0], edit[2], edit[4].count('\n') + 1)
        if not (readable and _OutlineKept(result)):
            self._outline = None

    # --- Answers -----------------------------------------------------------------

    def Outline(self):
        if self._outline is None:
            self._outline = self.doc.GetOutline()
        return self._outline

    def SymbolsJson(self):
        if self._kept is not None:
            return self._kept
        return self._symbols.Json(self.doc, self.Outline())

    def FoldingJson(self):
        outline = self.Outline()
        if self._folding[0] is not outline:
            self._folding = outline, symbols.FoldingJson(outline)
        return self._folding[1]

    def ScopeAt(self, line):
        """The scoped name at the client's `line` ('' for the module)."""
        if line >= self.doc.GetLineCount():
            raise CRequestError(kInvalidParams, 'line %d is outside the text (%d lines)' % (
                line, self.doc.GetLineCount()))
        return self.doc.GetScopeAtLine(line + 1)

    def Error(self):
        """(type name, message, line, column) of the reader's error, or None."""
        if self.doc.IsReadable():
            return None
        exc = self.doc.GetError()
        msg = getattr(exc, 'msg', None) or str(exc)
        lineno = getattr(exc, 'lineno', None)
        offset = getattr(exc, 'offset', None)
        return type(exc).__name__, msg, lineno, offset

    def Diagnostics(self, error):
        """The diagnostics of `error` (as Error() gives it)."""
        if error is None:
            return []
        name, msg, lineno, offset = error
        count = self.doc.GetLineCount()
        line = min(max((lineno or 1), 1), count)
        text = positions.Content(self.doc.GetLine(line), line == count)
        column = min(max((offset or 1) - 1, 0), len(text))
        start = positions.ClientColumn(text, column, self.encoding)
        end = positions.ClientLength(text, self.encoding)
        return [{'range': {'start': {'line': line - 1, 'character': start},
                           'end': {'line': line - 1, 'character': max(start, end)}},
                 'severity': 1, 'source': 'scopeserver',
                 'message': '%s: %s' % (name, msg)}]
