"""Generated texts that stress the reader where it carries state, and the
comparison of the native reader with the reference on them.

Texts(seed, count) yields texts (the interpreter's str) built from the
pieces that carry state across a line break or decide a logical's shape:
quotes of every kind and prefix, opened and left open; backslashes at line
ends inside and outside strings; LF, CRLF and lone CR; brackets opened and
closed in the wrong order; tabs and form feeds in indentation and dedents
to columns not on the stack; comments with CRs inside; a missing or
whitespace-only last line. Outcome(text, reference) is what ReadLogicals
gives: the records or the error, as plain data.
"""

import random
import sys

kPy2 = sys.version_info[0] == 2

kPrefixes = ['', '', '', 'u', 'U', 'b', 'B', 'r', 'R', 'ur', 'Ur', 'uR', 'UR', 'br', 'bR', 'Br', 'BR',
             'rb', 'f', 'bu', 'rf']
kQuotes = ["'", '"', "'''", '"""']
kNewlines = ['\n'] * 8 + ['\r\n'] * 3 + ['\r']
kIndents = ['', '', '', ' ', '  ', '    ', '        ', '\t', '\t ', ' \t', '\f', '  \f ', '\f\t', '   ']
kWords = ['x', 'self', 'def', 'class', 'async', 'if', 'else', 'pass', 'return', 'print', 'lambda', 'f',
          'ab_1', '_', 'u', 'r', 'b', 'ur', 'br', 'rb', 'U', 'R']
kNumbers = ['0', '1', '09', '0777', '0777L', '10L', '0xffL', '0x', '0o17', '0o8', '0b1L', '0b2', '1e5j',
            '1.5e+3', '1.e', '.5', '5.', '1_000', '3j', '0XaBl', '1E-2J', '00']
kOperators = ['(', ')', '[', ']', '{', '}', ':', ';', ',', '.', '...', '`', '@', '@=', '->', '<>', '!=',
              '!', '**=', '**', '//=', '>>=', '<<', '<=', '==', '=', '+', '-', '~', '%', '^', '|', '&',
              '$', '?', ':=']
kNonAscii = [u'\xe9', u'\u20ac', u'\U0001d11e', u'\xa0', u'\u3000']


def _NonAscii(rng):
    ch = rng.choice(kNonAscii)
    # 2.7 reads bytes: the character's UTF-8 bytes, or a stray byte.
    if kPy2:
        return rng.choice([ch.encode('utf-8'), '\x80', '\xff'])
    return ch


def _StringPiece(rng, tame):
    prefix = rng.choice(kPrefixes)
    quote = rng.choice(kQuotes)
    inner = ['a', ' ', '\\', "'", '"', '\\n', '#', '\r', '\t', quote[0], '\\\n', '\\\r\n']
    if len(quote) == 3:
        inner += ['\n', '\r\n', '\n\n']
    body = ''.join(rng.choice(inner) for _ in range(rng.randint(0, 4)))
    if tame and rng.random() < 0.85:
        body = body.replace('\\', '').replace(quote[0], '')
        if len(quote) == 1:
            body = body.replace('\n', '').replace('\r', '')
        ending = quote
    else:
        ending = rng.choice([quote, quote, '', '\\', quote[0], quote * 2])
    return prefix + quote + body + ending


def _Piece(rng, tame, depth):
    roll = rng.random()
    if roll < 0.2:
        return _StringPiece(rng, tame)
    if roll < 0.45:
        return rng.choice(kWords)
    if roll < 0.55:
        return rng.choice(kNumbers)
    if roll < 0.8:
        if tame and rng.random() < 0.5:
            # Brackets mostly in order.
            if depth[0] > 0 and rng.random() < 0.5:
                depth[0] -= 1
                return rng.choice(')]}')
            depth[0] += 1
            return rng.choice('([{')
        return rng.choice(kOperators)
    if roll < 0.86:
        return '#' + rng.choice(['', ' c', ' c\r', '\r x', ' """', " '"])
    if roll < 0.9 and not tame:
        return '\\'
    if roll < 0.96:
        return _NonAscii(rng)
    return rng.choice(['\t', '\f', '\r', '\x00', '\x0b', '$', '?'])


def _Indent(rng, tame, stack):
    """An indentation: in tame texts the current one, a deeper one or one
    further out on the stack; else any."""
    if not tame or rng.random() < 0.05:
        return rng.choice(kIndents)
    roll = rng.random()
    if roll < 0.3:
        stack.append(stack[-1] + rng.choice(['    ', '\t', ' ', '  \f', '\f  ']))
    elif roll < 0.55 and len(stack) > 1:
        del stack[rng.randint(1, len(stack) - 1):]
    return stack[-1]


def _Line(rng, tame, used, depth):
    if rng.random() < 0.12:
        # Blank, whitespace-only or comment-only rows.
        return rng.choice(['', ' ', '\t', '\f', '  # c', '#', '# c\rd', '\t#x'])
    indent = _Indent(rng, tame, used)
    pieces = [_Piece(rng, tame, depth) for _ in range(rng.randint(1, 6))]
    if rng.random() < 0.15:
        pieces.insert(0, rng.choice(['def', 'class', 'async def', 'async']))
    out = indent
    for index, piece in enumerate(pieces):
        if index or not tame:
            out += rng.choice(['', ' ', ' ', '  ', '\t'])
        out += piece
    if rng.random() < 0.15:
        out += rng.choice([' \\', '\\', '\t', ' '])
    if tame and depth[0] > 0 and rng.random() < 0.5:
        out += ')]}'[rng.randint(0, 2)] * depth[0]
        depth[0] = 0
    return out


def Text(rng):
    """One generated text: tame ones (strings closed, brackets mostly in
    order, indentation from a stack) read more often, so that what follows
    the pieces is read too; wild ones rarely read."""
    tame = rng.random() < 0.7
    used = ['']
    depth = [0]
    lines = [_Line(rng, tame, used, depth) for _ in range(rng.randint(1, 9))]
    out = ''
    for line in lines:
        out += line + rng.choice(kNewlines)
    roll = rng.random()
    if roll < 0.2:
        out = out.rstrip('\r\n')  # no final newline
    elif roll < 0.3:
        out += rng.choice([' ', '\t', '  \f', '\\', 'x', '"""', "'", '\\\n'])
    return out


def Texts(seed, count):
    rng = random.Random(seed)
    for _ in range(count):
        yield Text(rng)


def Outcome(text, reference, filename='<gen>'):
    """ReadLogicals(text) as data: ('records', [...]) or ('error', type name, args)."""
    from pysource.logicals import ReadLogicals
    try:
        logicals = ReadLogicals(text, filename, reference=reference)
    except (SyntaxError, OverflowError) as exc:
        return ('error', type(exc).__name__, exc.args)
    return ('records', [(tuple(l.fTokens), l.fLineno, l.fIndent, l.fKind) for l in logicals])


def CheckText(text):
    """None when the native reader and the reference agree on `text` (and a
    scan resumed at each clean row agrees with the whole scan), else a
    description of the difference."""
    from pysource import _reader
    native = Outcome(text, False)
    ref = Outcome(text, True)
    if native != ref:
        return 'native %r\nreference %r' % (native, ref)
    try:
        _reader.CheckResume(text)
    except AssertionError as exc:
        return str(exc)
    return None


def Run(seed, count, out=None, stop_after=5):
    """Checks `count` texts from `seed`; returns the number that differ."""
    differing = 0
    for index, text in enumerate(Texts(seed, count)):
        problem = CheckText(text)
        if problem is not None:
            differing += 1
            if out is not None and differing <= stop_after:
                out.write('text %d of seed %s: %r\n%s\n' % (index, seed, text, problem))
    return differing
