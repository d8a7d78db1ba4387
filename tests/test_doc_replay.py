"""The replay of text edits through a document (tools/doc_replay.py): it
catches documents that go wrong, its reproducers shrink and replay, and a
short sample of it agrees on the native document."""

import os
import random
import subprocess
import sys
import tempfile
import unittest

from support import PY3, SANITIZED, kDefKind
from dockit import checks, cli, repro, textedits
from dockit.makers import TextEditMaker
from dockit.reference import CReferenceDocument
from dockit.textedits import Op

try:
    from pysource.scopedocument import CScopeDocument
except ImportError as exc:
    CScopeDocument, kMissingReason = None, 'pysource.scopedocument cannot be imported (%s)' % exc

kText = '''\
class A:
    def f(self):
        x = 1
        return x

    def g(self):
        pass


def h():
    return 2
'''


class LateNames(CReferenceDocument):
    """Leaves a new def line without its names."""

    def _Take(self, text, whole=False):
        result = CReferenceDocument._Take(self, text, whole)
        for l in result.fAdded:
            if l.fKind == kDefKind and not whole:
                l.fScopeName = l.fLocalScopeName = None
        return result


class NoChangeSets(CReferenceDocument):
    """Names everything right, but reports no changed scopes (and so its own
    cache stays stale too)."""

    def _Take(self, text, whole=False):
        result = CReferenceDocument._Take(self, text, whole)
        if whole:
            return result
        fields = dict(result._fields, fContentsChanges=set(), fClassChanges=set(),
                      fFunctionChanges=set())
        return type(result)(**fields)


class StaleCache(CReferenceDocument):
    """Forgets to clear its own body cache."""

    class Forgetful(object):
        def Clear(self, names):
            pass

    def _Take(self, text, whole=False):
        real, self._cache = self._cache, self.Forgetful()
        try:
            return CReferenceDocument._Take(self, text, whole)
        finally:
            self._cache = real


class WrongErrorLine(CReferenceDocument):
    def GetError(self):
        exc = CReferenceDocument.GetError(self)
        if exc is not None:
            exc = SyntaxError(exc.msg, (exc.filename, exc.lineno + 1, exc.offset, exc.text))
        return exc


class FreshObjects(CReferenceDocument):
    """Reports the changed logicals but hands out new objects for all of them."""

    def _Take(self, text, whole=False):
        result = CReferenceDocument._Take(self, text, whole)
        from dockit.reference import _Rebuilt
        if not whole and result.fReadable:
            self._lst[:] = _Rebuilt(self._text, self._filename, self._text, [
                checks.Fields(l) for l in self._lst])._lst
        return result


class Utf16AsChars(CReferenceDocument):
    def Edit(self, start_line, start_col, end_line, end_col, text, utf16=False):
        return CReferenceDocument.Edit(self, start_line, start_col, end_line, end_col, text)

    def EditMany(self, edits, utf16=False):
        return CReferenceDocument.EditMany(self, edits)


def Run(document_class, ops, text=kText):
    return repro.RunOps(document_class, text, ops)


class TextEditsTest(unittest.TestCase):

    def testRangesAndTheirInverse(self):
        rng = random.Random(5)
        texts = ['', '\n', 'a\r\nb', kText, kText.replace('\n', '\r\n')]
        for _ in range(300):
            old, new = rng.choice(texts), rng.choice(texts)
            new = new[:rng.randint(0, len(new))] + rng.choice(['', 'x\n', '\n\n']) + old[-3:]
            edit = textedits.RangeBetween(old, new)
            self.assertEqual(textedits.ApplyRange(old, edit), new)
        self.assertEqual(textedits.RangeBetween('ab\ncd\n', 'ab\nxd\n'), (2, 0, 2, 1, 'x'))

    def testUtf16Columns(self):
        line = u'a\U0001F600b\xe9c'
        if not PY3:
            line = line.encode('utf-8')
        ends = [textedits.Utf16Column(line, c) for c in range(len(line) + 1)
                if textedits.CharStart(line, c) == c]
        self.assertEqual(ends, [0, 1, 3, 4, 5, 6])
        op = Op('EditMany', [(1, 1, 1, 1, 'x'), (1, len(line) + 1, 1, len(line) + 1, 'y')],
                utf16=True)
        self.assertEqual(op.Args(line), ([(1, 1, 1, 1, 'x'), (1, 7, 1, 7, 'y')],))
        # On 2.7 a column inside a character's bytes has no UTF-16 column.
        self.assertEqual(Op('Edit', [(1, 2, 1, 3, '')]).Utf16Possible(line), PY3)
        self.assertTrue(Op('Edit', [(1, 1, 1, 1, 'x')]).Utf16Possible(line))

    def testDroppedLinesMoveTheRangesBelowThem(self):
        ops = [Op('Edit', [(3, 0, 4, 2, 'a\nb\nc')]), Op('EditMany', [(2, 0, 2, 0, 'z'),
                                                                     (9, 1, 9, 1, 'w')])]
        self.assertEqual(repro._DropLine(kText, ops, 3), None)
        text, moved = repro._DropLine(kText, ops, 0)
        self.assertEqual(text, kText.split('\n', 1)[1])
        self.assertEqual([op.ranges for op in moved],
                         [[(2, 0, 3, 2, 'a\nb\nc')], [(1, 0, 1, 0, 'z'), (8, 1, 8, 1, 'w')]])
        # Below the first edit, the line has moved down by the one it added.
        text, moved = repro._DropLine(kText, ops, 4)
        self.assertEqual([op.ranges for op in moved],
                         [[(3, 0, 4, 2, 'a\nb\nc')], [(2, 0, 2, 0, 'z'), (8, 1, 8, 1, 'w')]])
        self.assertEqual(repro._DropLine(kText, ops, 7), None)


class ReplayCatchesFaultsTest(unittest.TestCase):
    """A clean replay proves something only if it catches documents that go wrong."""

    def Invariant(self, document_class, ops, text=kText):
        got = Run(document_class, ops, text)
        return got and got[1].invariant

    def testTheReferenceDocumentAgrees(self):
        ops = [Op('Edit', [(10, 0, 10, 0, '    def q(self):\n        pass\n')]),
               Op('Edit', [(1, 0, 1, 0, 'u"""')]), Op('SetText', [(1, 0, 1, 4, '')]),
               Op('Edit', [(3, 8, 3, 9, 'y')], utf16=True)]
        self.assertEqual(Run(CReferenceDocument, ops), None)

    def testEachFaultIsCaught(self):
        typed = [Op('Edit', [(3, 12, 3, 13, '2')])]
        header = [Op('Edit', [(6, 0, 6, 0, '    def q(self):\n        pass\n')])]
        self.assertEqual(self.Invariant(LateNames, header), 'logicals')
        self.assertEqual(self.Invariant(NoChangeSets, typed), 'cache')
        self.assertEqual(self.Invariant(StaleCache, header), 'doccache')
        self.assertEqual(self.Invariant(WrongErrorLine, [Op('Edit', [(1, 0, 1, 0, '(')])]), 'error')
        self.assertEqual(self.Invariant(FreshObjects, typed), 'identity')
        wide, col = u'# \U0001F600 abc\n' + kText, u'# \U0001F600 a'
        if not PY3:
            wide, col = wide.encode('utf-8'), col.encode('utf-8')
        self.assertEqual(self.Invariant(Utf16AsChars, [Op('Edit', [(1, len(col), 1, len(col), 'x')],
                                                          utf16=True)], wide), 'text')

    def testReproducersShrinkAndReplay(self):
        maker = TextEditMaker(random.Random(3))
        text, history = kText * 6, []
        for _ in range(12):
            op = maker.Next(text, True)
            if op is not None:
                history.append((text, op))
                text = op.Result(text)
        op = Op('Edit', [(3, 0, 3, 0, '    def q(self):\n        pass\n')])
        history.append((text, op))
        self.assertEqual(Run(LateNames, [op for _, op in history], history[0][0])[1].invariant,
                         'logicals')
        where = tempfile.mkdtemp()
        path, script, note = repro.WriteReproducer(where, 'r', LateNames, 'reference', history,
                                                   'logicals', 'here')
        start = script.split('START = ', 1)[1]
        self.assertLess(start.count('\n'), 14, script)
        self.assertIn('1 calls', note)
        # The script replays through CReferenceDocument itself, which agrees.
        proc = subprocess.Popen([sys.executable, path], stdout=subprocess.PIPE,
                                env=dict(os.environ))
        out = proc.communicate()[0]
        self.assertEqual((out.splitlines()[-1:], proc.returncode), ([b'no disagreements'], 0))
        os.remove(path)
        os.rmdir(where)

    def testTheRunThroughTheReferenceDocumentAgrees(self):
        paths = cli.SampleFiles(cli.StdlibFiles(), 2, 'test_doc_replay', max_lines=400)
        log = tempfile.TemporaryFile('w+')
        summary = cli.RunReplay(paths, document='reference', seed='t', edits_per_file=40,
                                repro_dir=None, quiet=True, out=log)
        log.seek(0)
        self.assertEqual(summary['edits'], 80)
        self.assertGreater(summary['unreadable'], 0)
        self.assertFalse(cli.Failed(summary), log.read()[:4000])


@unittest.skipIf(CScopeDocument is None, 'skipped: ' + ('' if CScopeDocument else kMissingReason))
class NativeDocumentSampleTest(unittest.TestCase):

    def testSeededEditsOnAFixedSampleAgree(self):
        files, edits = (3, 80) if SANITIZED else (6, 100)
        paths = cli.SampleFiles(cli.StdlibFiles(), files, 'test_doc_replay', max_lines=1200)
        log = tempfile.TemporaryFile('w+')
        summary = cli.RunReplay(paths, document='native', seed='test_doc_replay',
                                edits_per_file=edits, self_check=True, repro_dir=None,
                                quiet=True, out=log)
        log.seek(0)
        self.assertEqual(summary['edits'], files * edits)
        self.assertFalse(cli.Failed(summary), log.read()[:6000])


if __name__ == '__main__':
    unittest.main()
