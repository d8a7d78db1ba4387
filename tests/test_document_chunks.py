"""The document's text and row table are kept in chunks: edits that meet a
chunk's edge, rows too long for a chunk's offsets, text that widens, and a
whole new text compared chunk by chunk."""

import os
import subprocess
import sys
import unittest

from support import SANITIZED
from docsupport import CScopeDocument, ErrorFields, Fields, Fresh, Place, Random, RandomEdit, kSample

kHere = os.path.dirname(os.path.abspath(__file__))
kRoot = os.path.dirname(kHere)
kPy3 = sys.version_info[0] >= 3


def Agrees(test, doc, text):
    test.assertEqual(doc.GetText(), text)
    fresh = Fresh(text, 'c.py')
    if isinstance(fresh, SyntaxError):
        test.assertFalse(doc.IsReadable())
        test.assertEqual(ErrorFields(doc.GetError()), ErrorFields(fresh))
    else:
        test.assertTrue(doc.IsReadable(), doc.GetError())
        test.assertEqual([Fields(l) for l in doc.GetLogicals()], [Fields(l) for l in fresh])
    doc.SelfCheck()


class TinyChunksTest(unittest.TestCase):
    """The random-edit suite and a replay sample again, with chunks of a few
    characters and rows, so that nearly every edit crosses or splits one."""

    def RunChild(self, args, chunks):
        env = dict(os.environ, SBC_DOCUMENT_CHUNKS=chunks, SBC_CHECK_DOCUMENT='1')
        child = subprocess.Popen([sys.executable] + args, cwd=kRoot, env=env, stdout=subprocess.PIPE,
                                 stderr=subprocess.STDOUT)
        out = child.communicate()[0]
        self.assertEqual(child.returncode, 0, out.decode('utf-8', 'replace')[-3000:])

    def testRandomEditsSuite(self):
        for chunks in ('3,2', '17,5'):
            self.RunChild([os.path.join(kHere, 'test_document_random.py')], chunks)

    def testReplaySample(self):
        edits = '40' if SANITIZED else '150'
        self.RunChild([os.path.join(kRoot, 'tools', 'doc_replay.py'), '--stdlib', '--sample', '4', '--seed', '5',
                       '--edits', edits, '--quiet'], '64,8')


class LongRowsTest(unittest.TestCase):
    """Rows longer than a chunk's 16-bit offsets reach, among short ones."""

    def testEditsAroundLongRows(self):
        rng = Random(3)
        long_row = 'x = [' + ', '.join(['1'] * 24000) + ']\n'  # about 72k characters
        text = 'def f():\n    pass\n' + long_row + 'y = 2\n' * 40 + long_row + 'class C:\n    z = 3\n'
        doc = CScopeDocument(text, 'c.py')
        Agrees(self, doc, text)
        for step in range(120):
            start, end, new = RandomEdit(rng, text)
            if step % 3 == 0:
                # Newlines put in and taken out inside the long rows.
                start = rng.randrange(len(text))
                end = min(len(text), start + rng.choice([0, 1, 2]))
                new = rng.choice(['\n', '', 'ab', '\n\n', ')\n'])
            doc.Edit(*(Place(text, start) + Place(text, end) + (new,)))
            text = text[:start] + new + text[end:]
            Agrees(self, doc, text)

    def testJoiningRowsPastTheOffsetRange(self):
        rows = ['a%d = %d\n' % (k, k) for k in range(9000)]  # about 90k characters
        text = ''.join(rows)
        doc = CScopeDocument(text, 'c.py')
        # Backspace after backspace: rows join until one is longer than the
        # offsets of its chunk reach.
        for k in range(40):
            line = 1 + k * 200
            end = len(text.split('\n')[line - 1])
            doc.Edit(line, end, line + 1, 0, '')
            lines = text.split('\n')
            text = '\n'.join(lines[:line - 1] + [lines[line - 1] + lines[line]] + lines[line + 1:])
        Agrees(self, doc, text)
        joined = text.replace('\n', ' ; ', 8000)
        doc.SetText(joined)
        Agrees(self, doc, joined)
        doc.SetText(text)
        Agrees(self, doc, text)


class LongReadsTest(unittest.TestCase):
    """A bracket opened near the top runs the read through megabytes of
    text, window after window, to its end and back."""

    def testBracketOpenedAndClosedOverALargeText(self):
        body = ''.join('def f%d(a, b):\n    return a + b * %d\n\n' % (i, i) for i in range(30000))
        text = 'import os\n' + body + 'x = 1\n'  # over a megabyte
        doc = CScopeDocument(text, 'c.py')
        for _ in range(2):
            opened = doc.Edit(2, 0, 2, 0, '(')
            self.assertFalse(opened.fReadable)
            text = text[:10] + '(' + text[10:]
            Agrees(self, doc, text)
            lines = doc.GetLineCount()
            closed = doc.Edit(lines - 1, 5, lines - 1, 5, ')')
            text = text[:-1] + ')\n'
            self.assertTrue(closed.fReadable)
            Agrees(self, doc, text)
            doc.Edit(lines - 1, 5, lines - 1, 6, '')
            doc.Edit(2, 0, 2, 1, '')
            text = text[:10] + text[11:-2] + '\n'
            Agrees(self, doc, text)


class DeepBracketsTest(unittest.TestCase):
    """Rows deeper in brackets than a row's state holds, and rows after more
    stray closers than it holds: read again, never taken as unchanged."""

    def Replay(self, text, rng, steps):
        doc = CScopeDocument(text, 'c.py')
        Agrees(self, doc, text)
        for _ in range(steps):
            start, end, new = RandomEdit(rng, text)
            if rng.random() < 0.3:
                new = rng.choice(['(', ')', ')' * 3, '(' * 3, '\n'])
            doc.Edit(*(Place(text, start) + Place(text, end) + (new,)))
            text = text[:start] + new + text[end:]
            Agrees(self, doc, text)

    def testDeepOpenBrackets(self):
        text = ('def f():\n    x = ' + '(' * 700 + '\n' + '        1,\n' * 30 + ')' * 700 + '\n'
                'class C:\n    y = [\n' + '[' * 600 + '\n' + ']' * 600 + '\n]\n')
        self.Replay(text, Random(7), 60)

    def testManyStrayClosers(self):
        text = 'a = 1\n' + ')' * 800 + '\n' + 'def g():\n    return 2\n' * 20
        self.Replay(text, Random(8), 40)
        doc = CScopeDocument(text, 'c.py')
        line = 2
        doc.Edit(line, 0, line, 800, '')  # the closers taken out: the text reads
        fixed = text.replace(')' * 800, '')
        Agrees(self, doc, fixed)


class WholeTextTest(unittest.TestCase):

    def Big(self):
        return kSample * 60  # a few hundred rows, several chunks

    def testSetTextFindsTheEditAcrossChunks(self):
        text = self.Big()
        doc = CScopeDocument(text, 'c.py')
        for at, new in ((0, '#'), (len(text) // 2, 'pass\n'), (len(text), '\n# end\n'),
                        (len(text) // 3, '')):
            changed = text[:at] + new + text[at + (1 if not new else 0):]
            result = doc.SetText(changed)
            Agrees(self, doc, changed)
            if new == '#':
                self.assertEqual(result.fRegion[0], 1)
            text = changed

    @unittest.skipUnless(kPy3, 'characters wider than a byte are 3.x text')
    def testWiderCharactersWidenEveryChunk(self):
        text = self.Big()
        doc = CScopeDocument(text, 'c.py')
        middle = text.index('\n', len(text) // 2) + 1
        for new in (u'\u00e9 = 1\n', u'\u4e2d = 2\n', u's = "\U0001F600"\n'):
            text = text[:middle] + new + text[middle:]
            line, column = Place(text, middle)
            doc.Edit(line, column, line, column, new)
            Agrees(self, doc, text)
        # A whole text of a narrower kind compared with the wide one.
        narrow = self.Big()
        doc.SetText(narrow)
        Agrees(self, doc, narrow)
        self.assertEqual(doc.GetLine(1), narrow.split('\n')[0])


class RoomTest(unittest.TestCase):
    """A chunk keeps room where it was last edited: edits that take it from
    place to place within a chunk, and reads, lines, whole texts, wider
    characters and pickles that meet it there."""

    def testRoomMovesWithTheEdits(self):
        import pickle
        rng = Random(11)
        text = ''.join('def f%d(a):\n    return a + %d\n' % (i, i) for i in range(60))
        doc = CScopeDocument(text, 'c.py')
        places = [text.index('return', k * len(text) // 6) for k in range(6)]
        for step in range(200):
            at = places[rng.randrange(len(places))] + rng.randrange(3)
            if rng.random() < 0.5:
                new, cut = rng.choice(['x', ' ', '\n', '(', ')', '"""', '#', '  ']), 0
            else:
                new, cut = '', rng.randrange(1, 3)
            cut = min(cut, len(text) - at)
            line, column = Place(text, at)
            end_line, end_column = Place(text, at + cut)
            doc.Edit(line, column, end_line, end_column, new)
            text = text[:at] + new + text[at + cut:]
            places = [p + len(new) - cut if p > at else p for p in places]
            if step % 20 == 0:
                Agrees(self, doc, text)
                self.assertEqual([doc.GetLine(n) for n in range(1, doc.GetLineCount() + 1)], text.split('\n'))
                self.assertEqual(pickle.loads(pickle.dumps(doc)).GetText(), text)
        Agrees(self, doc, text)
        if kPy3:
            text = text[:40] + u'\u4e2d' + text[40:]
            doc.SetText(text)
            Agrees(self, doc, text)
        text = text.replace('return', 'yield')
        doc.SetText(text)
        Agrees(self, doc, text)


if __name__ == '__main__':
    unittest.main()
