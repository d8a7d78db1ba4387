"""One open text: its document, version, outline answers and diagnostics.

While the text does not read, the document answers from the last text
that did (its baseline). The outline's line numbers are the baseline's
then, and so must its columns be: the symbols are kept as they were for
the baseline. They usually are already (the client asked for them before
the edit); when not, the edit that broke the text is undone, the symbols
written, and the edit made again.
"""

from . import positions, symbols
from .protocol import CRequestError, kInvalidParams


class CChange(object):
    """A content change in the client's terms: `start`/`end` are (line,
    character) pairs, or None for a whole new text."""

    __slots__ = ('start', 'end', 'text')

    def __init__(self, start, end, text):
        self.start, self.end, self.text = start, end, text


def _LineCountOf(text):
    return text.count('\n') + 1


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
        """Applies checked changes in order."""
        doc = self.doc
        for n, change in enumerate(changes):
            readable = doc.IsReadable()
            kept = self._symbols.Current() if readable else None
            edit = self._DocEdit(change)
            undo = self._Undo(edit) if readable and kept is None else None
            self._Edit(edit)
            if readable and not doc.IsReadable():
                if kept is None:
                    # Back to the baseline for its symbols, then on again.
                    self._Edit(undo)
                    kept = self._symbols.Json(doc, doc.GetOutline())
                    self._Edit(edit)
                self._kept = kept
        if doc.IsReadable():
            self._kept = None
        self.version = version

    def _DocEdit(self, change):
        """(start line, start col, end line, end col, text) in the document's
        terms, or (None, text) for a whole text."""
        text = positions.ToDocumentText(change.text)
        if change.start is None:
            return None, text
        return self._DocPlace(change.start) + self._DocPlace(change.end) + (text,)

    def _DocPlace(self, place):
        line, character = place
        count = self.doc.GetLineCount()
        if line == count:  # just past the last line: the end of the text
            return count, len(self.doc.GetLine(count))
        content = positions.Content(self.doc.GetLine(line + 1), line + 1 == count)
        return line + 1, positions.DocColumn(content, character, self.encoding)

    def _Undo(self, edit):
        """The edit that takes `edit` back (made before it is applied)."""
        doc = self.doc
        if edit[0] is None:
            return None, doc.GetText()
        start_line, start_col, end_line, end_col, text = edit
        if start_line == end_line:
            old = doc.GetLine(start_line)[start_col:end_col]
        else:
            lines = [doc.GetLine(start_line)[start_col:]]
            lines.extend(doc.GetLine(n) for n in range(start_line + 1, end_line))
            lines.append(doc.GetLine(end_line)[:end_col])
            old = '\n'.join(lines)
        last = text.rfind('\n')
        if last < 0:
            new_end = start_line, start_col + len(text)
        else:
            new_end = start_line + text.count('\n'), len(text) - last - 1
        return (start_line, start_col) + new_end + (old,)

    def _Edit(self, edit):
        doc = self.doc
        if edit[0] is None:
            old_count = doc.GetLineCount()
            doc.SetText(edit[1])
            self._symbols.NoteEdit(1, old_count, doc.GetLineCount())
        else:
            doc.Edit(*edit)
            self._symbols.NoteEdit(edit[0], edit[2], edit[4].count('\n') + 1)
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
