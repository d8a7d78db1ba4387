"""The fuzzer's document episodes (tools/fuzzkit/documents.py): they catch
documents that accept bad arguments or hand out shared state, and run clean
on the native document for a few seconds."""

import os
import random
import subprocess
import sys
import unittest

from support import PY3
from dockit.reference import CReferenceDocument
from fuzzkit import documents, texts
from fuzzkit.calls import Finding, Recorder

FUZZ = os.path.join(os.path.dirname(os.path.dirname(os.path.abspath(__file__))), 'tools', 'fuzz.py')


class Clamping(CReferenceDocument):
    """Takes a line past the end for the last one instead of refusing it."""

    def Edit(self, start_line, start_col, end_line, end_col, text, utf16=False):
        last = self.GetLineCount()
        if isinstance(start_line, int) and start_line > last:
            start_line = end_line = last
            start_col = end_col = 0
        return CReferenceDocument.Edit(self, start_line, start_col, end_line, end_col, text, utf16)


class SharingCopies(CReferenceDocument):
    def __copy__(self):
        other = CReferenceDocument.__copy__(self)
        other._lst[:] = self._lst
        return other

    def __deepcopy__(self, memo):
        return self.__copy__()


class HalfBatches(CReferenceDocument):
    """Applies the edits of a batch up to the bad one."""

    def EditMany(self, edits, utf16=False):
        result = None
        for edit in edits:
            result = self.Edit(*edit, utf16=utf16)
        return result


class Context(object):
    def __init__(self, seed):
        self.rng = random.Random(seed)
        self.rec = Recorder()
        self.src = texts.SourceMaker(self.rng)

    def Pick(self, table):
        return self.rng.choice([name for name, _ in table])


class DocumentOraclesTest(unittest.TestCase):

    def setUp(self):
        self.saved = documents.CScopeDocument

    def tearDown(self):
        documents.CScopeDocument = self.saved

    def Findings(self, document_class, action, tries=30):
        documents.CScopeDocument = document_class
        found = []
        for seed in range(tries):
            d = documents.DocContext(Context(seed))
            try:
                getattr(documents, action)(d)
            except Finding as f:
                found.append(f.detail)
        return found

    def testAFaithfulDocumentHasNoFindings(self):
        for action, _ in documents.kActions:
            self.assertEqual(self.Findings(CReferenceDocument, action, 8), [], action)

    def testPlantedFaultsAreFound(self):
        self.assertTrue(any('accepted bad arguments' in f
                            for f in self.Findings(Clamping, 'BadRange', 120)))
        self.assertTrue(any('shares logicals' in f
                            for f in self.Findings(SharingCopies, 'PickleMidway')))
        self.assertTrue(any('the text is' in f for f in self.Findings(HalfBatches, 'BadBatch')))


@unittest.skipIf(not documents.Available(), 'pysource.scopedocument is not built')
class NativeDocumentFuzzTest(unittest.TestCase):

    def testDocumentEpisodesRunClean(self):
        env = dict(os.environ, PYTHONHASHSEED='0') if PY3 else None
        proc = subprocess.Popen([sys.executable, FUZZ, '--profile', 'documents', '--seconds', '6',
                                 '--seed', '5', '--leak-every', '0'], stdout=subprocess.PIPE,
                                stderr=subprocess.STDOUT, universal_newlines=True, env=env)
        out = proc.communicate()[0]
        self.assertEqual(proc.returncode, 0, out[-4000:])
        self.assertIn('no findings', out)


if __name__ == '__main__':
    unittest.main()
