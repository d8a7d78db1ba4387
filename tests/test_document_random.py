"""CScopeDocument under random edits: after every edit the document agrees
with a fresh read of the edited text and a whole-file pass (names, the
outline, a warm body cache), or holds the reader's error for it."""

import os
import pickle
import unittest

from support import SANITIZED
from docsupport import (CScopeDocument, ErrorFields, Fields, Fresh, Outline, Place, Random, RandomEdit,
                        kSample)

# Fewer edits under the sanitizers, where each costs ten times as much.
kEdits = 300 if SANITIZED else 1200
kSeed = int(os.environ.get('SBC_DOCUMENT_SEED', '1'))

kTexts = [
    kSample,
    '',
    'x',
    'def f(a,\n      b):\n    """doc\n    more"""\n    return a \\\n        + b\n\nclass C:\n\tdef m(self): pass\n',
    'if 1:\n    s = \'a\\\nb\'\n    t = "x\n    y = (1,\n]\n',
    '\r\n# c\r\nclass K:\r\n    x = r"""\\\r\n"""\r\n  \r\n',
]


class RandomEditsTest(unittest.TestCase):

    def Check(self, doc, text, last_good):
        self.assertEqual(doc.GetText(), text)
        fresh = Fresh(text, 'r.py')
        if isinstance(fresh, SyntaxError):
            self.assertFalse(doc.IsReadable())
            self.assertEqual(ErrorFields(doc.GetError()), ErrorFields(fresh))
            # The names of the last text that read.
            self.assertEqual([Fields(l) for l in doc.GetLogicals()], last_good)
            return last_good
        self.assertTrue(doc.IsReadable(), doc.GetError())
        fields = [Fields(l) for l in fresh]
        self.assertEqual([Fields(l) for l in doc.GetLogicals()], fields)
        self.assertEqual(doc.GetOutline(), Outline(fresh, text))
        return fields

    def Warm(self, doc, rng):
        """Fills part of the body cache, so that clearing it is put to the test."""
        outline = doc.GetOutline()
        for name in [''] + [entry[0] for entry in rng.sample(outline, min(3, len(outline)))]:
            doc.GetBodyOfScope(name)
            try:
                doc.GetScopeDef(name)
            except KeyError:
                pass

    def Run(self, seed, batch):
        rng = Random(seed)
        for base in kTexts:
            text = base
            doc = CScopeDocument(text, 'r.py')
            fresh = Fresh(text)
            last_good = [] if isinstance(fresh, SyntaxError) else [Fields(l) for l in fresh]
            for step in range(kEdits // len(kTexts)):
                self.Warm(doc, rng)
                edits = []
                for _ in range(rng.choice([1, 1, 2, 3]) if batch else 1):
                    start, end, new = RandomEdit(rng, text)
                    edits.append(Place(text, start) + Place(text, end) + (new,))
                    text = text[:start] + new + text[end:]
                if batch:
                    doc.EditMany(edits)
                else:
                    doc.Edit(*edits[0])
                if step % 15 == 14:
                    # Go on with a copy made by pickling: the same text, and the
                    # same names of the last text that read.
                    doc = pickle.loads(pickle.dumps(doc, 2))
                try:
                    last_good = self.Check(doc, text, last_good)
                    doc.SelfCheck()
                except AssertionError as exc:
                    raise AssertionError('seed %d, base %r, step %d, edits %r: %s' % (
                        seed, base[:20], step, edits, exc))

    def testSingleEdits(self):
        self.Run(kSeed, batch=False)

    def testBatches(self):
        self.Run(kSeed + 1000, batch=True)

    def testSetTextBetweenEdits(self):
        rng = Random(kSeed + 2000)
        doc = CScopeDocument(kSample)
        texts = [t for t in kTexts if not isinstance(Fresh(t), SyntaxError)]
        for _ in range(40):
            text = rng.choice(texts)
            start, end, new = RandomEdit(rng, text)
            text = text[:start] + new + text[end:]
            doc.SetText(text)
            self.assertEqual(doc.GetText(), text)
            doc.SelfCheck()


if __name__ == '__main__':
    unittest.main()
