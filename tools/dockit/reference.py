"""CReferenceDocument: a document that follows text edits the way callers
work today.

Every edit re-reads the whole text with ReadLogicals (the reader written in
Python, whatever ReadLogicals reads with by default), and the live list
follows the fresh reading by its common prefix and suffix
(replaykit.editor.FollowOneChange) before one FindChanges call. It has the
interface of pysource.scopedocument.CScopeDocument, so it is the whole-text
pipeline the benchmark puts beside the native document, a stand-in to
develop against, and a second, independent answer to the queries.

Text, lines and columns:

- The text is `str`: bytes on 2.7 (unicode given is taken as its UTF-8),
  code points on 3.x (bytes given are decoded as the source declares). A
  leading BOM stays in the text; the reader skips it.
- Lines are split at '\\n' only and numbered from 1; a text of N newlines
  has N + 1 lines. Columns are 0-based, in characters of the text (bytes on
  2.7), or with utf16=True in UTF-16 code units (2.7 takes its bytes as
  UTF-8). A '\\r' before a '\\n' belongs to its line.
- Text that does not read leaves the logicals and names of the last text
  that did (the baseline); queries answer from it, the text queries from
  the current text.
"""

import bisect
import operator
import sys

from pysource._fastaccess import LogicalLineType
from pysource.logicals import ReadLogicals, kBlankKind, kClassKind, kCommentKind, kDefKind
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache, GetFullNameForScopeDef

from replaykit.editor import FollowOneChange

_kPy2 = sys.version_info[0] == 2
if _kPy2:
    _kOtherText = unicode  # noqa: F821 (2.7 only)
    _kIntTypes = (int, long)  # noqa: F821
else:
    _kOtherText = bytes
    _kIntTypes = (int,)

_kUtf8Bom = b'\xef\xbb\xbf'


def _HasReferenceReader():
    code = ReadLogicals.__code__
    return 'reference' in code.co_varnames[:code.co_argcount]


if _HasReferenceReader():
    def ReferenceRead(text, filename='<string>'):
        """The logicals of `text` by the reader written in Python, whatever
        ReadLogicals reads with by default."""
        return ReadLogicals(text, filename, reference=True)
else:
    ReferenceRead = ReadLogicals


# --- Text ----------------------------------------------------------------------

def _Decoded(data, filename):
    """3.x bytes as the reader decodes them, a BOM kept as U+FEFF; the
    reader's SyntaxError when they cannot be decoded."""
    import io
    import tokenize
    try:
        encoding = tokenize.detect_encoding(io.BytesIO(data).readline)[0]
        text = data.decode(encoding)
    except (SyntaxError, LookupError, UnicodeDecodeError):
        # The reader words the error: it fails the same way on the same bytes.
        ReferenceRead(data, filename)
        raise SyntaxError('cannot decode the text', (filename, 1, None, None))
    if data.startswith(_kUtf8Bom) and not text.startswith(u'\ufeff'):
        text = u'\ufeff' + text
    return text


def SourceText(text, filename='<string>'):
    """`text` as a document holds it (see the module's docstring)."""
    if _kPy2:
        if isinstance(text, unicode):  # noqa: F821
            return text.encode('utf-8')
        if isinstance(text, str):
            return str(text)
    else:
        if isinstance(text, str):
            return str(text)
        if isinstance(text, (bytes, bytearray)):
            return _Decoded(bytes(text), filename)
    raise TypeError('text must be %s, not %s' % (
        'str or unicode' if _kPy2 else 'str or bytes', type(text).__name__))


def _LineStarts(text):
    starts = [0]
    find = text.find
    at = find('\n')
    while at >= 0:
        starts.append(at + 1)
        at = find('\n', at + 1)
    return starts


def _Index(value, what):
    if isinstance(value, bool) or not isinstance(value, _kIntTypes):
        try:
            value = operator.index(value)
        except TypeError:
            raise TypeError('%s must be an integer, not %s' % (what, type(value).__name__))
    return value


def _Utf16Units(line):
    """The UTF-16 length of each character of `line` (a 2.7 line: its UTF-8
    characters, a byte that is not UTF-8 one unit), as (units, chars) pairs."""
    if _kPy2:
        try:
            chars = line.decode('utf-8')
        except UnicodeDecodeError:
            return [(1, 1)] * len(line)
        return [(2 if len(c.encode('utf-16-le')) == 4 else 1, len(c.encode('utf-8')))
                for c in _CodePoints(chars)]
    return [(2 if c > u'\uffff' else 1, 1) for c in line]


def _CodePoints(chars):
    """A 2.7 unicode split into code points (a narrow build holds pairs)."""
    out, i = [], 0
    while i < len(chars):
        if u'\ud800' <= chars[i] <= u'\udbff' and i + 1 < len(chars) and \
                u'\udc00' <= chars[i + 1] <= u'\udfff':
            out.append(chars[i:i + 2])
            i += 2
        else:
            out.append(chars[i])
            i += 1
    return out


def _CharColumn(line, col, lineno):
    """A UTF-16 column of `line` as a column in its characters."""
    units = chars = 0
    for unit, size in _Utf16Units(line):
        if units >= col:
            break
        units += unit
        chars += size
    if units != col:
        if units > col:
            raise ValueError('column %d of line %d is inside a character' % (col, lineno))
        raise ValueError('column %d is past the end of line %d (%d UTF-16 units)' % (
            col, lineno, units))
    return chars


class TextRanges(object):
    """Offsets of (line, column) places in one text, checked."""

    def __init__(self, text):
        self.text = text
        self.starts = _LineStarts(text)

    def LineCount(self):
        return len(self.starts)

    def Line(self, lineno):
        start = self.starts[lineno - 1]
        end = self.starts[lineno] - 1 if lineno < len(self.starts) else len(self.text)
        return self.text[start:end]

    def Offset(self, lineno, col, utf16):
        lineno, col = _Index(lineno, 'a line'), _Index(col, 'a column')
        if not 1 <= lineno <= len(self.starts):
            raise ValueError('line %d is outside the text (lines 1 to %d)' % (
                lineno, len(self.starts)))
        line = self.Line(lineno)
        if col < 0:
            raise ValueError('column %d of line %d is negative' % (col, lineno))
        if utf16:
            col = _CharColumn(line, col, lineno)
        elif col > len(line):
            raise ValueError('column %d is past the end of line %d (%d characters)' % (
                col, lineno, len(line)))
        return self.starts[lineno - 1] + col

    def Apply(self, edit, utf16):
        """The text with `edit`, a (start line, start col, end line, end col,
        text) range, replaced; ValueError or TypeError for a bad one."""
        try:
            start_line, start_col, end_line, end_col, new = edit
        except (TypeError, ValueError):
            raise TypeError('an edit is (start_line, start_col, end_line, end_col, text), not %r'
                            % (edit,))
        if not isinstance(new, str):
            raise TypeError('the new text must be str, not %s' % type(new).__name__)
        start = self.Offset(start_line, start_col, utf16)
        end = self.Offset(end_line, end_col, utf16)
        if end < start:
            raise ValueError('the range ends (%d, %d) before it starts (%d, %d)' % (
                end_line, end_col, start_line, start_col))
        return self.text[:start] + new + self.text[end:]


# --- The edit's result --------------------------------------------------------------

class CEditResult(object):
    """What one edit call did (read-only)."""

    __slots__ = ('_fields',)
    kFields = ('fAdded', 'fRemoved', 'fContentsChanges', 'fClassChanges', 'fFunctionChanges',
               'fRegion', 'fReadable', 'fError')

    def __init__(self, **fields):
        object.__setattr__(self, '_fields', fields)

    def __getattr__(self, name):
        try:
            return self._fields[name]
        except KeyError:
            raise AttributeError(name)

    def __setattr__(self, name, value):
        raise AttributeError('CEditResult is read-only')

    def __repr__(self):
        return '<CEditResult +%d -%d region=%r readable=%r>' % (
            len(self.fAdded), len(self.fRemoved), self.fRegion, self.fReadable)


# --- Queries over a named list --------------------------------------------------------

def _LastTextLine(text):
    count = text.count('\n') + 1
    return count - 1 if text.endswith('\n') else count


def Outline(lst, text):
    """(scoped name, kind, header line, end line) of every class/def logical
    that defines a scope, in list order; `text` is the text `lst` was read from."""
    quiet = (kCommentKind, kBlankKind)
    # The last code logical inside each scope, nested scopes included.
    last = {}
    for i, l in enumerate(lst):
        if l.fKind in quiet or not l.fScopeName:
            continue
        name = l.fScopeName
        last[name] = i
        at = name.rfind('.')
        while at >= 0:
            name = name[:at]
            last[name] = i
            at = name.rfind('.')
    out = []
    for i, l in enumerate(lst):
        if l.fKind not in (kClassKind, kDefKind) or l.fLocalScopeName is None:
            continue
        name = GetFullNameForScopeDef(l)
        end = max(i, last.get(name, i))
        end_line = lst[end + 1].fLineno - 1 if end + 1 < len(lst) else _LastTextLine(text)
        out.append((name, l.fKind, l.fLineno, end_line))
    return out


def ScopeAtLine(lst, lineno, linenos=None):
    """fScopeName of the last logical at or above `lineno`; '' when none is."""
    lineno = _Index(lineno, 'a line')
    if linenos is None:
        linenos = [l.fLineno for l in lst]
    k = bisect.bisect_right(linenos, lineno)
    return lst[k - 1].fScopeName if k else ''


def Fields(l):
    return (l.fTokens, l.fLineno, l.fIndent, l.fKind, l.fScopeName, l.fLocalScopeName)


def ErrorFields(exc):
    if exc is None:
        return None
    return (type(exc), getattr(exc, 'msg', None), getattr(exc, 'lineno', None),
            getattr(exc, 'offset', None), getattr(exc, 'text', None),
            getattr(exc, 'filename', None))


def Differences(lst, text, filename, error, limit=5):
    """How (lst, error) differ from a fresh read of `text` and a whole-file
    pass, as lines; [] when they agree. `error` is what the document reports."""
    try:
        fresh = ReferenceRead(text, filename)
    except SyntaxError as exc:
        if ErrorFields(error) != ErrorFields(exc):
            return ['the text does not read: expected %r, got %r' % (
                ErrorFields(exc)[:5], ErrorFields(error) and ErrorFields(error)[:5])]
        return []
    if error is not None:
        return ['the text reads, but the document reports %r' % (error,)]
    CChangeFinder(fresh).FindChanges(fresh, [])
    out = []
    if len(fresh) != len(lst):
        out.append('%d logicals, a fresh read has %d' % (len(lst), len(fresh)))
    for i, (got, want) in enumerate(zip(lst, fresh)):
        if Fields(got) != Fields(want):
            out.append('[%d] expected %r, got %r' % (i, Fields(want), Fields(got)))
            if len(out) >= limit:
                break
    return out


# --- The document ---------------------------------------------------------------------

class CReferenceDocument(object):
    """Logicals, scope names and a body cache that follow a text through
    edits; every edit re-reads the whole text (see the module's docstring)
    with the reader written in Python."""

    Read = staticmethod(ReferenceRead)

    def __init__(self, text, filename='<string>'):
        if not isinstance(filename, str) and not (_kPy2 and isinstance(filename, _kOtherText)):
            raise TypeError('filename must be str, not %s' % type(filename).__name__)
        self._Start(SourceText(text, filename), filename, [], '')
        self._stats = dict(rows_scanned=0, logicals_made=0)
        self._Take(self._text, whole=True)

    def _Start(self, text, filename, logicals, baseline_text):
        self._text, self._filename = text, filename
        self._ranges = None
        self._lst = logicals
        self._baseline_text = baseline_text
        self._error = None
        self._finder = CChangeFinder(self._lst)
        self._finder.FindChanges(self._lst, [])
        self._cache = CScopeBodyCache(self._lst)
        self._linenos = None

    # Edits.

    def Edit(self, start_line, start_col, end_line, end_col, text, utf16=False):
        """Replaces the range by `text`; columns in characters (bytes on 2.7),
        or UTF-16 code units with utf16=True."""
        return self._Take(self._Ranges().Apply(
            (start_line, start_col, end_line, end_col, text), utf16))

    def EditMany(self, edits, utf16=False):
        """Applies the (start line, start col, end line, end col, text) edits
        in order, each in the text the ones before left; one FindChanges."""
        try:
            edits = list(edits)
        except TypeError:
            raise TypeError('edits must be a sequence of 5-tuples, not %s' % type(edits).__name__)
        ranges = self._Ranges()
        for edit in edits:
            ranges = TextRanges(ranges.Apply(edit, utf16))
        return self._Take(ranges.text)

    def SetText(self, text):
        """Makes `text` the whole text."""
        if not isinstance(text, str):
            raise TypeError('text must be str, not %s' % type(text).__name__)
        return self._Take(str(text))

    def _Ranges(self):
        if self._ranges is None:
            self._ranges = TextRanges(self._text)
        return self._ranges

    def _Take(self, text, whole=False):
        # The list follows the last text that read: the region replaces all of it.
        old_lines = self._baseline_text.count('\n') + 1
        new_lines = text.count('\n') + 1
        self._text, self._ranges = text, None
        self._stats = dict(rows_scanned=new_lines, logicals_made=0)
        try:
            fresh = self.Read(text, self._filename)
        except SyntaxError as exc:
            self._error = exc
            return CEditResult(fAdded=[], fRemoved=[], fContentsChanges=set(),
                               fClassChanges=set(), fFunctionChanges=set(),
                               fRegion=(1, old_lines, new_lines), fReadable=False, fError=exc)
        self._stats['logicals_made'] = len(fresh)
        self._error = None
        self._baseline_text = text
        self._linenos = None
        if whole:
            self._lst[:] = fresh
            added, removed = list(fresh), []
        else:
            added, removed = FollowOneChange(self._lst, fresh)
        contents, classes, functions = self._finder.FindChanges(added, removed)
        changes = set(contents) | set(classes) | set(functions)
        if changes:
            self._cache.Clear(sorted(changes))
        return CEditResult(fAdded=list(added), fRemoved=list(removed),
                           fContentsChanges=set(contents), fClassChanges=set(classes),
                           fFunctionChanges=set(functions), fRegion=(1, old_lines, new_lines),
                           fReadable=True, fError=None)

    # Queries.

    def GetText(self):
        return self._text

    def GetLine(self, lineno):
        lineno = _Index(lineno, 'a line')
        ranges = self._Ranges()
        if not 1 <= lineno <= ranges.LineCount():
            raise ValueError('line %d is outside the text (lines 1 to %d)' % (
                lineno, ranges.LineCount()))
        return ranges.Line(lineno)

    def GetLineCount(self):
        return self._text.count('\n') + 1

    def GetFilename(self):
        return self._filename

    def IsReadable(self):
        return self._error is None

    def GetError(self):
        return self._error

    def GetLogicals(self):
        return list(self._lst)

    def GetScopeAtLine(self, lineno):
        if self._linenos is None:
            self._linenos = [l.fLineno for l in self._lst]
        return ScopeAtLine(self._lst, lineno, self._linenos)

    def GetOutline(self):
        return Outline(self._lst, self._baseline_text)

    def GetBodyOfScope(self, scoped_name):
        return self._cache.GetBodyOfScope(scoped_name)

    def GetScopeDef(self, scoped_name):
        return self._cache.GetScopeDef(scoped_name)

    def SelfCheck(self):
        problems = Differences(self._lst, self._text, self._filename, self._error)
        if problems:
            raise AssertionError('the document differs from a fresh read:\n  ' +
                                 '\n  '.join(problems))

    def GetLastEditStats(self):
        return dict(self._stats)

    # Pickling and copying.

    def __reduce__(self):
        return (_Rebuilt, (self._text, self._filename, self._baseline_text,
                           [Fields(l) for l in self._lst], type(self)))

    def __copy__(self):
        return _Rebuilt(*self.__reduce__()[1])

    def __deepcopy__(self, memo):
        return self.__copy__()


def _Rebuilt(text, filename, baseline_text, fields, cls=None):
    cls = cls or CReferenceDocument
    doc = cls.__new__(cls)
    lst = []
    for tokens, lineno, indent, kind, scope, local in fields:
        l = LogicalLineType(tokens, lineno, indent, kind)
        l.fScopeName, l.fLocalScopeName = scope, local
        lst.append(l)
    doc._Start(baseline_text, filename, lst, baseline_text)
    doc._stats = dict(rows_scanned=0, logicals_made=0)
    if text != baseline_text:
        doc._Take(text)
    return doc


class CNativeReadDocument(CReferenceDocument):
    """The same pipeline with ReadLogicals as it reads by default (natively
    where pysource._reader is built)."""

    Read = staticmethod(ReadLogicals)
