"""Seeded text edits: what people (and editors) do to source text, with the
corners of the reader's line states brought in on purpose: strings of every
quote kind opened and closed, brackets, backslashes at line ends, CR, tabs
and form feeds, the first two lines and the end of the text."""

from dockit.textedits import ApplyRange, CharStart, Op, RangeBetween, kPy2

_kIdentChars = 'abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ_0123456789'
_kTyped = _kIdentChars + '    ()[]{}:.,=+-*/%<>#\'"\\@`;!~&|^'
_kPrefixes = ('', '', 'u', 'b', 'r', 'ur', 'U', 'B', 'R', 'uR', 'Ur', 'br', 'bR', 'Br')
_kQuotes = ("'", '"', "'''", '"""')
_kWords = ('x = 1', 'return None', 'pass', 'self.items.append(item)', 'y = f(a, b)',
           'if x:', 'else:', 'for k in range(3):', 'print(x)', 'raise ValueError("no")')
_kOpeners = '([{'
_kClosers = ')]}'


def _Text(s):
    """A snippet given as unicode, as the document's kind of text."""
    return s.encode('utf-8') if kPy2 else s


_kWide = [_Text(s) for s in (u'\U0001F600', u'\U00010348', u'\xe9', u'\u20ac', u'\U0001D11E\xe9')]


def _Indent(line):
    return len(line) - len(line.lstrip(' \t\f'))


class TextEditMaker(object):
    """Next(text, readable) gives the next Op for `text`, or None."""

    kKinds = (
        ('type', 16), ('delete_char', 6), ('enter', 6), ('backspace_join', 5),
        ('delete_range', 4), ('replace_range', 3), ('paste', 4), ('indent_block', 3),
        ('dedent_block', 3), ('open_quote', 5), ('close_quote', 4), ('bracket', 4),
        ('backslash', 4), ('crlf', 2), ('tabs', 3), ('form_feed', 1), ('lone_cr', 2),
        ('top', 4), ('end', 3), ('def_line', 4), ('comment', 2), ('wide', 2),
        ('bom', 1), ('undo', 4), ('set_text', 2), ('many', 6),
    )
    # Kinds that are one range each, for a batch of several edits in one call.
    kSimple = ('type', 'delete_char', 'enter', 'backspace_join', 'delete_range', 'replace_range',
               'paste', 'open_quote', 'close_quote', 'bracket', 'backslash', 'crlf', 'tabs',
               'form_feed', 'lone_cr', 'top', 'end', 'def_line', 'comment', 'wide')

    def __init__(self, rng, utf16_fraction=0.2):
        self.rng = rng
        self.utf16_fraction = utf16_fraction
        self._table = []
        for name, weight in self.kKinds:
            self._table.extend([name] * weight)
        self.Reset()

    def Reset(self, text=None):
        self._typing = None        # (line, col, characters left) of a typing run
        self._quote = None         # the quote last opened, to close later
        self._texts = [text] if text is not None else []
        self._readable = [text] if text is not None else []
        self._unreadable_run = 0

    def Next(self, text, readable):
        """An Op for `text` (which reads or not), or None when none applied."""
        self._texts.append(text)
        del self._texts[:-30]
        if readable:
            self._readable.append(text)
            del self._readable[:-10]
            self._unreadable_run = 0
        else:
            self._unreadable_run += 1
        lines = text.split('\n')
        op = self._ContinueTyping(lines)
        if op is None and self._unreadable_run > 1 and self.rng.random() < 0.6:
            op = self._undo(lines, text, readable_only=True)
        if op is None:
            kind = self.rng.choice(self._table)
            op = getattr(self, '_' + kind)(lines, text) if kind in (
                'undo', 'set_text', 'many', 'bom', 'indent_block', 'dedent_block') else self._One(kind, lines)
        if op is None:
            return None
        if not op.utf16 and op.method != 'SetText' and self.rng.random() < self.utf16_fraction \
                and op.Utf16Possible(text):
            op.utf16 = True
        return op

    def _One(self, kind, lines):
        r = getattr(self, '_' + kind)(lines)
        if r is None:
            return None
        return Op('Edit', [r], kind=kind)

    # Places.

    def _LineIndex(self, lines):
        rng, n = self.rng, len(lines)
        pick = rng.random()
        if pick < 0.12:
            return rng.randrange(min(2, n))
        if pick < 0.22:
            return max(0, n - 1 - rng.randrange(min(3, n)))
        return rng.randrange(n)

    def _Col(self, line, lo=0):
        return CharStart(line, self.rng.randint(min(lo, len(line)), len(line)))

    # Typing and deleting.

    def _ContinueTyping(self, lines):
        if self._typing is None:
            return None
        i, col, left = self._typing
        self._typing = None
        if left <= 0 or i >= len(lines) or col > len(lines[i]):
            return None
        self._typing = (i, col + 1, left - 1)
        return Op('Edit', [(i + 1, col, i + 1, col, self.rng.choice(_kIdentChars + ' '))],
                  kind='type')

    def _type(self, lines):
        i = self._LineIndex(lines)
        line = lines[i]
        col = self._Col(line, _Indent(line) if self.rng.random() < 0.8 else 0)
        ch = self.rng.choice(_kTyped if self.rng.random() < 0.3 else _kIdentChars + '  ')
        self._typing = (i, col + 1, self.rng.randint(0, 5))
        return (i + 1, col, i + 1, col, ch)

    def _delete_char(self, lines):
        i = self._LineIndex(lines)
        line = lines[i]
        if not line:
            return None
        col = CharStart(line, self.rng.randrange(len(line)))
        end = col + 1
        if kPy2:
            while end < len(line) and (ord(line[end]) & 0xC0) == 0x80:
                end += 1
        return (i + 1, col, i + 1, end, '')

    def _enter(self, lines):
        i = self._LineIndex(lines)
        line = lines[i]
        col = self._Col(line)
        indent = line[:_Indent(line)]
        if line[:col].rstrip().endswith(':'):
            indent += '    '
        return (i + 1, col, i + 1, col, '\n' + (indent if self.rng.random() < 0.8 else ''))

    def _backspace_join(self, lines):
        i = self._LineIndex(lines)
        if i + 1 >= len(lines):
            return None
        after = _Indent(lines[i + 1]) if self.rng.random() < 0.5 else 0
        return (i + 1, len(lines[i]), i + 2, after, '')

    def _delete_range(self, lines, new=''):
        i = self._LineIndex(lines)
        j = min(len(lines) - 1, i + self.rng.choice([0, 1, 1, 2, 3, 5, 12]))
        a = self._Col(lines[i])
        b = self._Col(lines[j], a if i == j else 0)
        return (i + 1, a, j + 1, b, new)

    def _replace_range(self, lines):
        new = self.rng.choice(_kWords)
        if self.rng.random() < 0.5:
            new = new + '\n' + ' ' * self.rng.choice([0, 4, 8]) + self.rng.choice(_kWords)
        return self._delete_range(lines, new)

    def _paste(self, lines):
        rng = self.rng
        count = rng.choice([1, 2, 3, 5, 20])
        src = rng.randrange(len(lines))
        block = lines[src:src + count]
        at = self._LineIndex(lines)
        if rng.random() < 0.7:
            return (at + 1, 0, at + 1, 0, '\n'.join(block) + '\n')
        col = self._Col(lines[at])
        return (at + 1, col, at + 1, col, '\n'.join(block))

    # Blocks.

    def _Block(self, lines):
        i = self._LineIndex(lines)
        return i, min(len(lines), i + self.rng.randint(1, 12))

    def _indent_block(self, lines, text):
        i, j = self._Block(lines)
        unit = self.rng.choice(['    ', '    ', '\t', '  '])
        if self.rng.random() < 0.5:
            ranges = [(k + 1, 0, k + 1, 0, unit) for k in range(i, j) if lines[k].strip()]
            return Op('EditMany', ranges, kind='indent_block') if ranges else None
        new = '\n'.join(unit + l if l.strip() else l for l in lines[i:j])
        return Op('Edit', [(i + 1, 0, j, len(lines[j - 1]), new)], kind='indent_block')

    def _dedent_block(self, lines, text):
        i, j = self._Block(lines)
        ranges = []
        for k in range(i, j):
            line = lines[k]
            cut = 1 if line.startswith(('\t', '\f')) else min(4, len(line) - len(line.lstrip(' ')))
            if cut:
                ranges.append((k + 1, 0, k + 1, cut, ''))
        return Op('EditMany', ranges, kind='dedent_block') if ranges else None

    # The reader's line states.

    def _open_quote(self, lines):
        rng = self.rng
        quote = rng.choice(_kQuotes)
        self._quote = quote
        i = self._LineIndex(lines)
        line = lines[i]
        col = self._Col(line, _Indent(line)) if rng.random() < 0.7 else self._Col(line)
        text = rng.choice(_kPrefixes) + quote
        if rng.random() < 0.3:
            text += rng.choice(['text', 'a\\', '\\', ' ', quote[0]])
        return (i + 1, col, i + 1, col, text)

    def _close_quote(self, lines):
        quote = self._quote or self.rng.choice(_kQuotes)
        if self.rng.random() < 0.7:
            self._quote = None
        i = self._LineIndex(lines)
        col = self._Col(lines[i])
        return (i + 1, col, i + 1, col, quote)

    def _bracket(self, lines):
        i = self._LineIndex(lines)
        col = self._Col(lines[i])
        ch = self.rng.choice(_kOpeners + _kClosers + _kOpeners)
        if self.rng.random() < 0.2:
            ch += '\n' + ' ' * self.rng.choice([0, 1, 4, 8])
        return (i + 1, col, i + 1, col, ch)

    def _backslash(self, lines):
        i = self._LineIndex(lines)
        line = lines[i]
        end = len(line) - 1 if line.endswith('\r') else len(line)
        pick = self.rng.random()
        if line[:end].endswith('\\') and pick < 0.3:
            return (i + 1, end - 1, i + 1, end, '')
        if pick < 0.6:
            return (i + 1, end, i + 1, end, '\\')
        if pick < 0.8:
            return (i + 1, end, i + 1, len(line), '\\\r')
        col = self._Col(line)
        return (i + 1, col, i + 1, col, self.rng.choice(['\\', ' \\', '\\\n', '"\\\n', "'a\\\n"]))

    def _crlf(self, lines):
        i = self._LineIndex(lines)
        line = lines[i]
        if line.endswith('\r'):
            return (i + 1, len(line) - 1, i + 1, len(line), '')
        return (i + 1, len(line), i + 1, len(line), '\r')

    def _tabs(self, lines):
        i = self._LineIndex(lines)
        line = lines[i]
        indent = _Indent(line)
        new = self.rng.choice(['\t', '\t\t', '    \t', '\t    ', ' ' * 8, '\t  ', ''])
        return (i + 1, 0, i + 1, indent, new)

    def _form_feed(self, lines):
        i = self._LineIndex(lines)
        col = self.rng.randint(0, _Indent(lines[i]))
        return (i + 1, col, i + 1, col, '\f')

    def _lone_cr(self, lines):
        i = self._LineIndex(lines)
        line = lines[i]
        pick = self.rng.random()
        col = _Indent(line) if pick < 0.4 else self._Col(line)
        return (i + 1, col, i + 1, col, self.rng.choice(['\r', '\r', '# a\rb', '\rx = 1']))

    def _top(self, lines):
        rng = self.rng
        i = rng.randrange(min(2, len(lines)))
        line = lines[i]
        pick = rng.random()
        if pick < 0.3:
            new = rng.choice(['# -*- coding: latin-1 -*-\n', '# coding=utf-8\n', '#!/usr/bin/env python\n',
                              'import os\n', '"""Doc.\n', '\n', '  \n', 'x = (\n'])
            return (i + 1, 0, i + 1, 0, new)
        if pick < 0.5 and line:
            return (i + 1, 0, i + 1, self._Col(line), '')
        col = self._Col(line)
        return (i + 1, col, i + 1, col, rng.choice(_kTyped))

    def _end(self, lines):
        rng = self.rng
        n = len(lines)
        last = lines[-1]
        pick = rng.random()
        if pick < 0.3 and n > 1 and not last:
            # Drop the final newline.
            return (n - 1, len(lines[-2]), n, 0, '')
        if pick < 0.6:
            return (n, len(last), n, len(last), rng.choice(
                ['x = 1', '    ', '\t', '# end', 'def f():', '\n', ' \\', '(', '"""', 'y = 2\n']))
        if n > 1:
            return (n - 1, 0, n, len(last), rng.choice(['', 'pass', '  ', 'class C:\n  pass']))
        return None

    def _def_line(self, lines):
        rng = self.rng
        i = self._LineIndex(lines)
        indent = ' ' * rng.choice([0, 4, 4, 8])
        name = rng.choice(['f', 'g', '__init__', 'run', 'helper', 'A', 'Widget'])
        header = rng.choice(['def %s(self):', 'class %s:', 'def %s(a, b=1):', 'async def %s():'])
        new = indent + header % name + '\n'
        if rng.random() < 0.5:
            new += indent + '    ' + rng.choice(_kWords) + '\n'
        return (i + 1, 0, i + 1, 0, new)

    def _comment(self, lines):
        i = self._LineIndex(lines)
        line = lines[i]
        if self.rng.random() < 0.5:
            return (i + 1, 0, i + 1, 0, ' ' * self.rng.choice([0, 4, 8, 2]) + '# note\n')
        col = self._Col(line)
        return (i + 1, col, i + 1, col, ' # ' + self.rng.choice(['x', '"', "'''", '\\']))

    def _wide(self, lines):
        i = self._LineIndex(lines)
        line = lines[i]
        col = self._Col(line)
        wide = self.rng.choice(_kWide)
        return (i + 1, col, i + 1, col, self.rng.choice([wide, '"%s"' % wide, '# %s' % wide]))

    # Whole texts and batches.

    def _bom(self, lines, text):
        bom = _Text(u'\ufeff')
        if text.startswith(bom):
            return Op('Edit', [(1, 0, 1, len(bom), '')], kind='bom')
        return Op('Edit', [(1, 0, 1, 0, bom)], kind='bom')

    def _undo(self, lines, text, readable_only=False):
        pool = self._readable if readable_only or self.rng.random() < 0.5 else self._texts
        olds = [t for t in pool[-8:] if t != text]
        if not olds:
            return None
        old = self.rng.choice(olds)
        if self.rng.random() < 0.3:
            return Op('SetText', [RangeBetween(text, old)], kind='undo')
        return Op('Edit', [RangeBetween(text, old)], kind='undo')

    def _set_text(self, lines, text):
        rng = self.rng
        pick = rng.random()
        if pick < 0.4 and self._texts:
            new = self._texts[0]
        elif pick < 0.7:
            new = '\n'.join(l for l in lines if rng.random() < 0.97)
        else:
            new = rng.choice(['', '\n', 'x', 'def f():\n    pass', '"""', text + text[:200]])
        if new == text:
            return None
        return Op('SetText', [RangeBetween(text, new)], kind='set_text')

    def _many(self, lines, text):
        ranges = []
        for _ in range(self.rng.randint(2, 5)):
            kind = self.rng.choice(self.kSimple)
            self._typing = None
            r = getattr(self, '_' + kind)(lines)
            if r is None:
                continue
            ranges.append(r)
            text = ApplyRange(text, r)
            lines = text.split('\n')
        self._typing = None
        return Op('EditMany', ranges, kind='many') if ranges else None

