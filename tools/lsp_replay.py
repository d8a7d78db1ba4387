#!/usr/bin/env python
"""Random edits through the scope server, each answer held against a fresh
document of the text.

    scripts/python.sh --python PY tools/lsp_replay.py [FILE...] [--edits N] [--seed S]

Without FILE, the bundled sample and a few standard library modules. Each
edit (typing, Enter, deleting ranges, joining lines, headers and whole
methods typed in, brackets and docstrings opened, some notifications with
two changes) goes to an in-process server as didChange; then its document
symbols and folding ranges must be those of a fresh document of the text,
or while the text does not read, those of the last text that did. An edit
that breaks the text is usually taken back (by a range edit) so that the
run spends most of its time on text that reads. Prints one line per file;
exits 1 at the first difference, with the edit that made it.
"""

import argparse
import os
import random
import sys
import sysconfig

import toolpath

_kRepoDir = toolpath.setup()
sys.path.insert(0, os.path.join(_kRepoDir, 'tests'))

from lsp_support import CClient, Change, ExpectedFolding, ExpectedSymbols, Reads  # noqa: E402

kSnippets = ['x', '\n', '\n    ', '\n        ', 'def q(self):\n        pass\n', 'class Z:\n    pass\n',
             '    def w(self): pass\n', '#', ' '] * 5 + ['(', ')', '"""', '\\\n']
kLineStarts = ['    ', 'def f():\n', '@dec\n', 'if x:\n']


def Place(text, offset):
    line = text.count('\n', 0, offset)
    return line, offset - (text.rfind('\n', 0, offset) + 1)


def Back(before, after):
    """The change that turns `after` into `before` (their common ends kept)."""
    p = 0
    while p < min(len(after), len(before)) and after[p] == before[p]:
        p += 1
    q = 0
    while q < min(len(after), len(before)) - p and after[-1 - q] == before[-1 - q]:
        q += 1
    (l1, c1), (l2, c2) = Place(after, p), Place(after, len(after) - q)
    return Change(l1, c1, l2, c2, before[p:len(before) - q])


def RandomChanges(rng, text):
    lines = text.split('\n')
    l1 = rng.randrange(len(lines))
    c1 = rng.randint(0, len(lines[l1]))
    r = rng.random()
    if r < 0.5:
        change = Change(l1, c1, l1, c1, rng.choice(kSnippets))
    elif r < 0.8:
        l2 = min(len(lines) - 1, l1 + rng.choice([0, 0, 1, 2, 5]))
        c2 = rng.randint(0, len(lines[l2])) if l2 > l1 else rng.randint(c1, len(lines[l1]))
        change = Change(l1, c1, l2, c2, '')
    else:
        change = Change(l1, 0, l1, 0, rng.choice(kLineStarts))
    if rng.random() < 0.2:
        return [change, Change(0, 0, 0, 0, '#')]
    return [change]


def Replay(path, edits, seed):
    """None, or a description of the first difference."""
    with open(path) as f:
        text = f.read()
    if not Reads(text) or '\r' in text:
        return None
    rng = random.Random(seed)
    client = CClient()
    client.Open(text)
    expected = ExpectedSymbols(text), ExpectedFolding(text)
    for step in range(edits):
        before = client.Text()
        changes = RandomChanges(rng, before)
        client.Change(changes)
        after = client.Text()
        if Reads(after):
            expected = ExpectedSymbols(after), ExpectedFolding(after)
        if client.Symbols() != expected[0] or client.Folding() != expected[1]:
            return 'edit %d: %r' % (step, changes)
        if not Reads(after) and rng.random() < 0.9:
            client.Change([Back(before, after)])
            if client.Text() != before:
                return 'edit %d: taking back %r left another text' % (step, changes)
    return None


def Main():
    parser = argparse.ArgumentParser(description=__doc__.split('\n')[0])
    parser.add_argument('files', nargs='*')
    parser.add_argument('--edits', type=int, default=300)
    parser.add_argument('--seed', type=int, default=1)
    args = parser.parse_args()
    stdlib = sysconfig.get_paths()['stdlib']
    files = args.files or [os.path.join(_kRepoDir, 'samples', 'outline_sample.py')] + [
        os.path.join(stdlib, name) for name in ('textwrap.py', 'argparse.py', 'string.py')]
    failed = False
    for path in files:
        problem = Replay(path, args.edits, args.seed)
        print('%s: %s' % (path, problem or 'ok, %d edits' % args.edits))
        failed = failed or problem is not None
    return 1 if failed else 0


if __name__ == '__main__':
    sys.exit(Main())
