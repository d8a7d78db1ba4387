"""Columns between the client's position encoding and the document's.

The client counts a line's characters in UTF-16 code units (the protocol's
default), UTF-8 bytes or code points (UTF-32), as negotiated. The document
counts them in its own characters: code points on 3.x, bytes on 2.7.

Lines: the document splits its text at '\\n' only, so a line of a '\\r\\n'
text ends with '\\r'. The client does not count that '\\r' as part of the
line: a column past the line's content is taken back to its end (as the
protocol says for any column past the end), so no edit ever separates the
'\\r' from its '\\n'. A '\\r' that no '\\n' follows is a character of its
line, as the reader and editors that keep such files in one line (neovim
among them) take it; a client that splits lines there sees other line
numbers (see the README).
"""

import sys

_kPy2 = sys.version_info[0] == 2

kUtf8 = 'utf-8'
kUtf16 = 'utf-16'
kUtf32 = 'utf-32'
kEncodings = (kUtf8, kUtf16, kUtf32)

if _kPy2:
    def IsAscii(line):
        try:
            line.decode('ascii')
        except UnicodeDecodeError:
            return False
        return True

    def _Chars(line):
        # A byte that is not UTF-8 is one character, as U+FFFD.
        return line.decode('utf-8', 'replace')
else:
    def IsAscii(line):
        return line.isascii()


def Content(line, is_last):
    """The line as the client sees it: without the '\\r' of a '\\r\\n'."""
    if not is_last and line.endswith('\r'):
        return line[:-1]
    return line


def DocColumn(content, character, encoding):
    """The document's column for the client's `character` in `content` (a
    line without its line end): past the end means the end, inside a
    character means that character's start."""
    if IsAscii(content):
        return min(character, len(content))
    if _kPy2:
        if encoding == kUtf8:
            # Back to the start of a character cut in two.
            column = min(character, len(content))
            while 0 < column < len(content) and 0x80 <= ord(content[column]) < 0xC0:
                column -= 1
            return column
        chars = _Chars(content)
        if encoding == kUtf16:
            prefix = chars.encode('utf-16-le')[:2 * character].decode('utf-16-le', 'ignore')
        else:
            prefix = _CodePointPrefix(chars, character)
        return len(prefix.encode('utf-8'))
    if encoding == kUtf32:
        return min(character, len(content))
    if encoding == kUtf16:
        units = content.encode('utf-16-le', 'surrogatepass')[:2 * character]
        prefix = units.decode('utf-16-le', 'surrogatepass')
        if prefix and prefix[-1] != content[len(prefix) - 1]:
            return len(prefix) - 1  # half of a pair
        return len(prefix)
    return len(content.encode('utf-8', 'surrogatepass')[:character].decode('utf-8', 'ignore'))


def ClientColumn(line, column, encoding):
    """The client's character for the document's `column` of `line`."""
    if column == 0 or IsAscii(line):
        return column
    if _kPy2:
        if encoding == kUtf8:
            return column
        chars = _Chars(line[:column])
        if encoding == kUtf16:
            return len(chars.encode('utf-16-le')) // 2
        return _CodePointCount(chars)
    if encoding == kUtf32:
        return column
    if encoding == kUtf16:
        return len(line[:column].encode('utf-16-le', 'surrogatepass')) // 2
    return len(line[:column].encode('utf-8', 'surrogatepass'))


def ClientLength(line, encoding):
    return ClientColumn(line, len(line), encoding)


if _kPy2:
    def _CodePointCount(chars):
        # A narrow 2.7 build holds a character outside the BMP as a pair.
        pairs = sum(1 for c in chars if u'\udc00' <= c <= u'\udfff')
        return len(chars) - pairs if sys.maxunicode == 0xFFFF else len(chars)

    def _CodePointPrefix(chars, count):
        if sys.maxunicode != 0xFFFF:
            return chars[:count]
        out = 0
        for _ in range(count):
            if out >= len(chars):
                break
            out += 2 if u'\ud800' <= chars[out] <= u'\udbff' and out + 1 < len(chars) else 1
        return chars[:out]


def ToDocumentText(text):
    """Text from the client (JSON) as the document takes it in edits."""
    if _kPy2 and not isinstance(text, str):
        return text.encode('utf-8')
    return text
