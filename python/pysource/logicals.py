"""Reads Python source into its list of logical lines.

One logical per logical line, in line order: a statement (however many
physical lines its brackets, backslashes or triple-quoted strings take), a
line holding only a comment, or a blank line outside brackets.

The same text gives the same logicals on 2.7 and on 3.x, Python 2 source
included. On 2.7 the tokens come from the tokenize module. On 3.x they come
from a scanner here that applies 2.7's token rules to text: 3.x's tokenize
reads backticks, `<>`, `0777L` and the like otherwise than 2.7, and not alike
on every 3.x version. Tokens are byte strings on 2.7 and str on 3.x.
tools/reader_parity.py compares the two over a source tree.

ReadLogicals reads with the native reader (pysource._reader, built from
src/pysource/reader/) by default. The code here is the reference it
follows rule for rule: ReadLogicals(..., reference=True) or ReadReference
runs it, and tools/reader_parity.py --native holds the two against each
other.

What still differs on 3.x, for the same file or the same bytes:

- Bytes are decoded as the source declares: a UTF-8 BOM, else a coding line
  among the first two lines, else UTF-8, by tokenize.detect_encoding. An
  unknown codec, a BOM with a coding line other than utf-8 (even `utf8`), a
  line that must be read for a coding line but is not UTF-8, or bytes the
  codec cannot decode raise SyntaxError at the line of the declaration or of
  the first bad byte. 2.7 reads any bytes.
- A character outside ASCII outside strings and comments is one error token
  on 3.x; on 2.7 each of its bytes is one.
- In a codec whose multi-byte characters can hold ASCII bytes (shift_jis,
  big5, gbk, ...), 2.7 takes such a byte for that ASCII character, so a quote
  or backslash inside a character can end or continue a string there.
- 2.7 reads unicode as its UTF-8 bytes, whatever its coding line says; 3.x
  reads str as it is.
- The `text` of a SyntaxError is str on 3.x.
"""

import re
import sys
import tokenize

_kPy2 = sys.version_info[0] == 2
if _kPy2:
    from cStringIO import StringIO
else:
    import io

kOtherKind = 0
kClassKind = 1
kDefKind = 2
kCommentKind = 21
kBlankKind = 22

_kTabSize = 8
_kUtf8Bom = '\xef\xbb\xbf'

_NEWLINE = tokenize.NEWLINE
_NL = tokenize.NL
_OP = tokenize.OP
_kNoText = frozenset([tokenize.INDENT, tokenize.DEDENT, tokenize.ENDMARKER])
_kDepthChange = {'(': 1, '[': 1, '{': 1, ')': -1, ']': -1, '}': -1}
_kLineBreak = re.compile(r'\r\n|\r|\n')


# --- 2.7's token rules, for text ---------------------------------------------
# The patterns and the line loop below are what 2.7's tokenize.generate_tokens
# does, so that 3.x reads Python 2 source (and Python 3 source) into the very
# tokens 2.7 does. Regular expressions try alternatives in order, so the order
# of every alternation matters.

def _Either(*choices):
    return '(' + '|'.join(choices) + ')'


_kAscii = getattr(re, 'ASCII', 0)  # \w and \d as on 2.7's byte strings
_kStrPrefix = '[uUbB]?[rR]?'
_kExponent = r'[eE][-+]?\d+'
_kFloat = _Either(_Either(r'\d+\.\d*', r'\.\d+') + '(' + _kExponent + ')?', r'\d+' + _kExponent)
_kNumber = _Either(_Either(r'\d+[jJ]', _kFloat + '[jJ]'), _kFloat,
                   _Either(r'0[xX][\da-fA-F]+[lL]?', r'0[bB][01]+[lL]?', r'0[oO][0-7]+',
                           r'0[0-7]*[lL]?', r'[1-9]\d*[lL]?'))
_kOperator = _Either(r'\*\*=?', r'>>=?', r'<<=?', r'<>', r'!=', r'//=?', r'[+\-*/%&|^=<>]=?', r'~',
                     r'[][(){}]', r'\r?\n', r'[:;.,`@]')
# A string on one line, or its start up to a backslash that continues it.
_kLineString = _Either(_kStrPrefix + r"'[^\n'\\]*(?:\\.[^\n'\\]*)*" + _Either("'", r'\\\r?\n'),
                       _kStrPrefix + r'"[^\n"\\]*(?:\\.[^\n"\\]*)*' + _Either('"', r'\\\r?\n'))
_kTokenRe = re.compile(
    r'[ \f\t]*' + _Either(
        _Either(r'\\\r?\n|\Z', r'#[^\r\n]*', _kStrPrefix + "'''", _kStrPrefix + '"""'),
        _kNumber, _kOperator, _kLineString, r'[a-zA-Z_]\w*'),
    _kAscii)
_kTripleStart = re.compile(_kStrPrefix + '(\'\'\'|""")\\Z')
_kLineStringStart = re.compile(_kStrPrefix + '[\'"]')
# The rest of a string, from where its text goes on, by the quote that opened it.
_kStringEnd = dict((quote, re.compile(pattern, _kAscii)) for quote, pattern in [
    ("'", r"[^'\\]*(?:\\.[^'\\]*)*'"),
    ('"', r'[^"\\]*(?:\\.[^"\\]*)*"'),
    ("'''", r"[^'\\]*(?:(?:\\.|'(?!''))[^'\\]*)*'''"),
    ('"""', r'[^"\\]*(?:(?:\\.|"(?!""))[^"\\]*)*"""')])
_kNameStart = frozenset('abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ_')
_kDigits = frozenset('0123456789')


def _PhysicalLines(source):
    """The lines of `source` split at '\\n' only, as 2.7's readline gives them."""
    start, end = 0, len(source)
    while start < end:
        stop = source.find('\n', start) + 1 or end
        yield source[start:stop]
        start = stop


def _Scan(source):
    """Yields the 5-tuples 2.7's tokenize.generate_tokens gives for `source`.

    Raises tokenize.TokenError and IndentationError where it does.
    """
    lines = _PhysicalLines(source)
    lnum = depth = 0
    continued = False
    indents = [0]
    string = string_line = string_start = string_end = None
    needs_backslash = False
    while True:
        line = next(lines, '')
        lnum += 1
        pos, end = 0, len(line)

        if string is not None:
            if not line:
                raise tokenize.TokenError('EOF in multi-line string', string_start)
            match = string_end.match(line)
            if match:
                pos = match.end()
                yield (tokenize.STRING, string + line[:pos], string_start, (lnum, pos),
                       string_line + line)
                string = string_line = None
                needs_backslash = False
            elif needs_backslash and not line.endswith(('\\\n', '\\\r\n')):
                # A one-line string whose next line does not continue it. As on
                # 2.7, needs_backslash stays set: a later triple-quoted string
                # that spans lines then ends the same way.
                yield (tokenize.ERRORTOKEN, string + line, string_start, (lnum, len(line)),
                       string_line)
                string = string_line = None
                continue
            else:
                string += line
                string_line += line
                continue

        elif depth == 0 and not continued:
            if not line:
                break
            column = 0
            while pos < end:
                ch = line[pos]
                if ch == ' ':
                    column += 1
                elif ch == '\t':
                    column = (column // _kTabSize + 1) * _kTabSize
                elif ch == '\f':
                    column = 0
                else:
                    break
                pos += 1
            if pos == end:
                # A last line of only whitespace ends the text.
                break
            ch = line[pos]
            if ch == '#':
                comment = line[pos:].rstrip('\r\n')
                after = pos + len(comment)
                yield tokenize.COMMENT, comment, (lnum, pos), (lnum, after), line
                yield _NL, line[after:], (lnum, after), (lnum, end), line
                continue
            if ch in '\r\n':
                yield _NL, line[pos:], (lnum, pos), (lnum, end), line
                continue
            if column > indents[-1]:
                indents.append(column)
                yield tokenize.INDENT, line[:pos], (lnum, 0), (lnum, pos), line
            while column < indents[-1]:
                if column not in indents:
                    raise IndentationError(
                        'unindent does not match any outer indentation level',
                        ('<tokenize>', lnum, pos, line))
                indents.pop()
                yield tokenize.DEDENT, '', (lnum, pos), (lnum, pos), line

        else:
            if not line:
                raise tokenize.TokenError('EOF in multi-line statement', (lnum, 0))
            continued = False

        while pos < end:
            match = _kTokenRe.match(line, pos)
            if not match:
                # Whitespace before a character no rule takes is its own error token.
                yield tokenize.ERRORTOKEN, line[pos], (lnum, pos), (lnum, pos + 1), line
                pos += 1
                continue
            first, pos = match.span(1)
            if first == pos:
                continue
            token = line[first:pos]
            initial = token[0]
            start = (lnum, first)
            if initial in _kDigits or (initial == '.' and token != '.'):
                yield tokenize.NUMBER, token, start, (lnum, pos), line
            elif initial in '\r\n':
                yield _NL if depth > 0 else _NEWLINE, token, start, (lnum, pos), line
            elif initial == '#':
                yield tokenize.COMMENT, token, start, (lnum, pos), line
            elif _kTripleStart.match(token):
                match = _kStringEnd[token[-3:]].match(line, pos)
                if match:
                    pos = match.end()
                    yield tokenize.STRING, line[first:pos], start, (lnum, pos), line
                else:
                    string, string_line, string_start = line[first:], line, start
                    string_end = _kStringEnd[token[-3:]]
                    break
            elif _kLineStringStart.match(token):
                if token.endswith('\n'):
                    string, string_line, string_start = line[first:], line, start
                    string_end = _kStringEnd[_kLineStringStart.match(token).group()[-1]]
                    needs_backslash = True
                    break
                yield tokenize.STRING, token, start, (lnum, pos), line
            elif initial in _kNameStart:
                yield tokenize.NAME, token, start, (lnum, pos), line
            elif initial == '\\':
                continued = True
            else:
                if initial in '([{':
                    depth += 1
                elif initial in ')]}':
                    depth -= 1
                yield _OP, token, start, (lnum, pos), line

    for _ in indents[1:]:
        yield tokenize.DEDENT, '', (lnum, 0), (lnum, 0), ''
    yield tokenize.ENDMARKER, '', (lnum, 0), (lnum, 0), ''


# --- Source text ---------------------------------------------------------------

_kCodingLine = re.compile(br'^[ \t\f]*#.*?coding[:=]')


def _DeclarationLineno(data):
    """The line, 1 or 2, that declares the encoding of `data` or that cannot
    be read to look for a declaration."""
    for lineno, line in enumerate(data.split(b'\n', 2)[:2], 1):
        try:
            line.decode('utf-8')
        except UnicodeDecodeError:
            return lineno
        if _kCodingLine.match(line):
            return lineno
    return 1


def _Decoded(data, filename):
    """`data` decoded as it declares; SyntaxError when it cannot be."""
    encoding, offset = 'utf-8', None
    try:
        encoding = tokenize.detect_encoding(io.BytesIO(data).readline)[0]
        return data.decode(encoding)
    except SyntaxError as exc:
        lineno, msg = _DeclarationLineno(data), exc.msg
    except LookupError as exc:  # a codec that is not a text encoding
        lineno, msg, encoding = _DeclarationLineno(data), str(exc), 'utf-8'
    except UnicodeDecodeError as exc:
        line_start = data.rfind(b'\n', 0, exc.start) + 1
        lineno = data.count(b'\n', 0, line_start) + 1
        offset = exc.start - line_start + 1
        msg = 'cannot decode as %s: %s' % (encoding, exc.reason)
    text = data.split(b'\n')[lineno - 1].decode(encoding, 'replace')
    raise SyntaxError(msg, (filename, lineno, offset, text))


def _SourceText(source, filename):
    """`source` as the text the tokens are read from, without a BOM."""
    if _kPy2:
        if isinstance(source, unicode):  # noqa: F821 (2.7 only)
            source = source.encode('utf-8')
        if source.startswith(_kUtf8Bom):
            source = source[len(_kUtf8Bom):]
        return source
    if isinstance(source, (bytes, bytearray)):
        # The utf-8-sig codec that a BOM selects drops the BOM.
        return _Decoded(bytes(source), filename)
    if not isinstance(source, str):
        raise TypeError('source must be str or bytes, not %s' % type(source).__name__)
    return source[1:] if source.startswith('\ufeff') else source


def _SourceOfFile(path):
    """The contents of the file at `path` with newlines made '\\n', as 2.7's
    universal-newline read gives them (bytes on 3.x, decoded later)."""
    if _kPy2:
        with open(path, 'rU') as f:
            return f.read()
    with open(path, 'rb') as f:
        data = f.read()
    return data.replace(b'\r\n', b'\n').replace(b'\r', b'\n')


# --- Logicals ------------------------------------------------------------------

def _IndentWidth(line, col):
    """Width of line[:col], tabs to the next multiple of 8, as the tokenizer counts."""
    prefix = line[:col]
    if '\t' not in prefix and '\f' not in prefix:
        return col
    width = 0
    for ch in prefix:
        if ch == '\t':
            width = (width // _kTabSize + 1) * _kTabSize
        elif ch == '\f':
            width = 0
        else:
            width += 1
    return width


def _StatementKind(tokens):
    first = tokens[0]
    if first == 'def':
        return kDefKind
    if first == 'class':
        return kClassKind
    if first == 'async' and len(tokens) > 1 and tokens[1] == 'def':
        return kDefKind
    if len(tokens) == 1 and first.startswith('#'):
        return kCommentKind
    return kOtherKind


def _Statement(tokens, start, line):
    """The record of a statement or comment line from its first token's place."""
    tokens = tuple(tokens)
    return tokens, start[0], _IndentWidth(line, start[1]), _StatementKind(tokens)


def _SyntaxErrorFromTokenError(exc, source, filename):
    msg, (lineno, offset) = exc.args
    # Split as 2.7's str.splitlines splits: at '\r\n', '\r' and '\n' only.
    lines = _kLineBreak.split(source)
    if lines and not lines[-1]:
        lines.pop()
    text = lines[lineno - 1] if 0 < lineno <= len(lines) else None
    return SyntaxError(msg, (filename, lineno, offset, text))


def _Tokens(source):
    if _kPy2:
        return tokenize.generate_tokens(StringIO(source).readline)
    return _Scan(source)


def _Records(source, filename='<string>'):
    """Yields the (tokens, line number, indent, kind) record of each logical
    of `source`, as ReadLogicals reads them."""
    source = _SourceText(source, filename)
    tokens = []
    first_start = first_line = None
    depth = 0
    try:
        for type_, text, start, _, line in _Tokens(source):
            if type_ == _NEWLINE or type_ == _NL:
                # Mirrors the tokenizer: NL within brackets only continues a statement.
                if type_ == _NL and depth > 0:
                    continue
                if tokens:
                    yield _Statement(tokens, first_start, first_line)
                    tokens = []
                elif type_ == _NL:
                    yield (), start[0], _IndentWidth(line, start[1]), kBlankKind
            elif type_ not in _kNoText:
                if not tokens:
                    first_start, first_line = start, line
                tokens.append(text)
                if type_ == _OP:
                    depth += _kDepthChange.get(text, 0)
    except tokenize.TokenError as exc:
        raise _SyntaxErrorFromTokenError(exc, source, filename)
    except IndentationError as exc:
        # The tokenizer names no file.
        raise IndentationError(exc.msg, (filename, exc.lineno, exc.offset, exc.text))

    # 2.7's tokenizer ends the last line without a NEWLINE when the text has
    # no final newline, and stops silently at a last line of only whitespace.
    if tokens:
        yield _Statement(tokens, first_start, first_line)
    elif source and not source.endswith('\n'):
        last = source[source.rfind('\n') + 1:]
        if not last.strip(' \t\f'):
            yield (), source.count('\n') + 1, _IndentWidth(last, len(last)), kBlankKind


def ReadLogicals(source, filename='<string>', reference=False):
    """The list of logicals of `source`.

    On 2.7 `source` is a str, or unicode taken as UTF-8. On 3.x it is a str,
    or bytes decoded as the source declares. Raises SyntaxError, with the
    line number, for source that does not tokenize or decode
    (IndentationError for an inconsistent dedent).

    The native reader (pysource._reader) reads by default; `reference`
    reads with the rules written out in this module instead. Both give the
    same logicals and the same errors.
    """
    # Imported here so that the records can be read where the record type
    # is not built.
    from pysource._fastaccess import LogicalLineType
    if not reference:
        text = _SourceText(source, filename)
        if type(text) is str:
            from pysource import _reader
            return _reader.Read(text, filename, LogicalLineType)
        # A str subclass or another buffer: read as the reference reads it.
    return ReadReference(source, filename)


def ReadReference(source, filename='<string>'):
    """ReadLogicals(source, filename, reference=True)."""
    from pysource._fastaccess import LogicalLineType
    return [LogicalLineType(*record) for record in _Records(source, filename)]


def ReadLogicalsFromFile(path, reference=False):
    """The list of logicals of the file at `path` (newlines normalised)."""
    return ReadLogicals(_SourceOfFile(path), path, reference)
