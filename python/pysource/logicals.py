"""Reads Python 2 source into its list of logical lines.

One logical per logical line, in line order: a statement (however many
physical lines its brackets, backslashes or triple-quoted strings take), a
line holding only a comment, or a blank line outside brackets.
"""

import tokenize
from cStringIO import StringIO

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
    lines = source.splitlines()
    text = lines[lineno - 1] if 0 < lineno <= len(lines) else None
    return SyntaxError(msg, (filename, lineno, offset, text))


def _Records(source, filename='<string>'):
    """Yields the (tokens, line number, indent, kind) record of each logical
    of `source`, as ReadLogicals reads them."""
    if isinstance(source, unicode):
        source = source.encode('utf-8')
    if source.startswith(_kUtf8Bom):
        source = source[len(_kUtf8Bom):]

    tokens = []
    first_start = first_line = None
    depth = 0
    try:
        for type_, text, start, _, line in tokenize.generate_tokens(StringIO(source).readline):
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


def ReadLogicals(source, filename='<string>'):
    """The list of logicals of `source` (a str; unicode is taken as UTF-8).

    Raises SyntaxError, with the line number, for source that does not
    tokenize (IndentationError for an inconsistent dedent).
    """
    # Imported here so that the records can be read where the record type
    # is not built.
    from pysource._fastaccess import LogicalLineType
    return [LogicalLineType(*record) for record in _Records(source, filename)]


def ReadLogicalsFromFile(path):
    """The list of logicals of the file at `path` (newlines normalised)."""
    with open(path, 'rU') as f:
        source = f.read()
    return ReadLogicals(source, path)
