"""The scope server in a real editor: neovim's built-in LSP client, headless,
driven by tests/lsp_neovim_driver.lua, edits a sample and a standard library
file through its own buffer calls; every outline it gets back is held
against a fresh read of the buffer's text at that step."""

import json
import os
import shutil
import subprocess
import sys
import sysconfig
import tempfile
import unittest

import lsp_support
from lsp_support import ExpectedFolding, ExpectedSymbols, Reads

kDriver = os.path.join(os.path.dirname(os.path.abspath(__file__)), 'lsp_neovim_driver.lua')
kNvim = lsp_support.Which('nvim')
kStdlibFile = os.path.join(sysconfig.get_paths()['stdlib'], 'textwrap.py')
kSteps = 18


def SkipReason():
    if lsp_support.kSkipReason:
        return lsp_support.kSkipReason
    if not kNvim:
        return 'nvim is not installed (CI installs Debian\'s neovim with apt-get)'
    return None


@unittest.skipIf(SkipReason(), SkipReason())
class NeovimTest(unittest.TestCase):

    def Drive(self, path, debounce):
        """The record the driver writes for a copy of `path`."""
        work = tempfile.mkdtemp(prefix='scope-nvim-')
        self.addCleanup(shutil.rmtree, work, True)
        copy = os.path.join(work, os.path.basename(path))
        shutil.copyfile(path, copy)
        env = lsp_support.ServerEnvironment()
        server_env = env.copy()
        env.update(SCOPE_NVIM_OUT=os.path.join(work, 'record.json'), SCOPE_NVIM_FILE=copy,
                   SCOPE_NVIM_PYTHON=sys.executable, SCOPE_NVIM_PYTHONPATH=server_env['PYTHONPATH'],
                   SCOPE_NVIM_DOCUMENT=server_env.get('SCOPESERVER_DOCUMENT', ''),
                   SCOPE_NVIM_DEBOUNCE=str(debounce),
                   XDG_CACHE_HOME=work, XDG_STATE_HOME=work, XDG_DATA_HOME=work, XDG_CONFIG_HOME=work)
        # The editor runs without the sanitizer's runtime; the server it starts gets it back.
        env['SCOPE_NVIM_PRELOAD'] = env.pop('LD_PRELOAD', '')
        with open(os.devnull) as null:
            nvim = subprocess.Popen([kNvim, '--headless', '--clean', '-n', '-c', 'luafile ' + kDriver],
                                    cwd=work, env=env, stdin=null, stdout=subprocess.PIPE,
                                    stderr=subprocess.STDOUT)
            output = nvim.communicate()[0]
        out = os.path.join(work, 'record.json')
        self.assertTrue(os.path.exists(out), output.decode('utf-8', 'replace')[-2000:])
        with open(out) as f:
            record = json.load(f)
        self.assertNotIn('error', record, record.get('error'))
        with open(path) as f, open(copy) as g:
            self.assertEqual(f.read(), g.read())  # nothing written back
        return record

    def CheckSteps(self, record, every_change):
        """Holds each step's answers against a fresh read of the buffer, or
        while it does not read, of the last version sent that did: with
        `every_change` each buffer change was a version."""
        self.assertEqual(len(record['steps']), kSteps)
        eol = '\n' if record['steps'][0]['eol'] else ''
        expected = None
        unreadable = 0
        for step in record['steps']:
            text = '\n'.join(step['lines']) + eol
            if every_change and not Reads(text):
                for lines in reversed(step['between']):
                    if Reads('\n'.join(lines) + eol):
                        expected = ExpectedSymbols('\n'.join(lines) + eol), ExpectedFolding('\n'.join(lines) + eol)
                        break
            if Reads(text):
                expected = ExpectedSymbols(text), ExpectedFolding(text)
            else:
                unreadable += 1
            self.assertEqual(step['symbols'], expected[0], step['step'])
            self.assertEqual(step['folding'], expected[1], step['step'])
        return unreadable

    def CheckSession(self, record):
        self.assertEqual(record['exit'], {'code': 0, 'signal': 0})
        # (the client's JSON drops a null field)
        self.assertEqual(record['scope_at'], {'scope': 'Top#0.top#0', 'readable': True})
        self.assertEqual(record['hover']['contents']['value'], 'scope: Top#0.top#0')

    def testSampleChangeByChange(self):
        record = self.Drive(lsp_support.kSamplePath, debounce=0)
        self.assertGreaterEqual(self.CheckSteps(record, every_change=True), 1)
        self.CheckSession(record)
        self.assertEqual(record['capabilities']['textDocumentSync'], {'openClose': True, 'change': 2})

    @unittest.skipUnless(os.path.exists(kStdlibFile), 'no %s here' % kStdlibFile)
    def testStandardLibraryFileStepByStep(self):
        # The client holds a step's changes back until its request: several
        # changes in one didChange.
        record = self.Drive(kStdlibFile, debounce=60000)
        self.assertGreaterEqual(self.CheckSteps(record, every_change=False), 1)
        self.CheckSession(record)


if __name__ == '__main__':
    unittest.main()
