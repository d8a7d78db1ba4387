#!/usr/bin/env python2.7
"""Cross-checks the scope body cache against the `ast` module on real code.

    crosscheck_bodies.py [DIR] [--verbose]

For every .py file under DIR (default: the running interpreter's standard
library) the whole file is named with one CChangeFinder pass; then

- every class/def full name must resolve with GetScopeDef to its own
  defining logical, and
- the body that GetBodyOfScope gives for every scope (and the module) must
  hold exactly the logicals of the statements that `ast` puts directly in
  that scope, nested if/for/while/try/with blocks included and nested
  class/def bodies excluded. Logicals that only head a block (`else:`,
  `except:`, `finally:`, `elif`) and decorator lines have no statement of
  their own and may appear in a body unmatched.

Prints the number of files checked and skipped, scopes and disagreements.
"""

import ast
import bisect
import os
import sys

import toolpath
from progress import Progress

toolpath.setup()

from pysource.logicals import ReadLogicals  # noqa: E402
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache, GetFullNameForScopeDef  # noqa: E402

# `async def` (3.x) opens a function scope as `def` does.
kScopeNodes = (ast.FunctionDef, ast.ClassDef) + tuple(
    getattr(ast, name) for name in ('AsyncFunctionDef',) if hasattr(ast, name))

_kScopeKinds = (1, 2)
# A `case` line (3.10's match) stands first in its logical, as `except` does.
_kHeaderOnly = frozenset(['else', 'elif', 'except', 'finally', '@', 'case'])
# Blocks whose statements stay in the enclosing scope (`cases`: 3.10's match).
_kBlockFields = ('body', 'orelse', 'finalbody', 'handlers', 'cases')


def _DirectStatements(body):
    """Statements directly in a scope: through compound blocks, not into defs."""
    for node in body:
        yield node
        if isinstance(node, kScopeNodes):
            continue
        for field in _kBlockFields:
            inner = getattr(node, field, None)
            if not isinstance(inner, list):
                continue  # Exec's `body` is an expression
            for child in inner:
                if isinstance(child, ast.ExceptHandler) or type(child).__name__ == 'match_case':
                    for stmt in _DirectStatements(child.body):
                        yield stmt
                else:
                    for stmt in _DirectStatements([child]):
                        yield stmt


class _File(object):

    def __init__(self, source, tree):
        self.tree = tree
        self.logicals = ReadLogicals(source)
        CChangeFinder(self.logicals).FindChanges(self.logicals, [])
        self.cache = CScopeBodyCache(self.logicals)
        self.starts = [l.fLineno for l in self.logicals]
        self.index = dict((id(l), i) for i, l in enumerate(self.logicals))

    def IndexOfLine(self, lineno):
        """Index of the logical that holds source line `lineno`."""
        return bisect.bisect_right(self.starts, lineno) - 1

    def IndexOfStatement(self, node):
        i = self.IndexOfLine(node.lineno)
        if isinstance(node, kScopeNodes) and node.decorator_list:
            # The node's line is its first decorator's; the def line follows.
            while self.logicals[i].fKind not in _kScopeKinds:
                i += 1
        return i

    def Scopes(self):
        """(full name, header index or None, ast body) of every scope."""
        pending = [(None, self.tree.body)]
        while pending:
            header, body = pending.pop()
            if header is None:
                yield '', None, body
            else:
                yield GetFullNameForScopeDef(self.logicals[header]), header, body
            for node in _DirectStatements(body):
                if isinstance(node, kScopeNodes):
                    pending.append((self.IndexOfStatement(node), node.body))

    def Disagreements(self, name, header, body):
        """Descriptions of what the cache gets wrong for one scope."""
        found = []
        if header is not None:
            scope_def = self.cache.GetScopeDef(name)
            if scope_def is not self.logicals[header]:
                found.append('%r resolves to %r, not %r' % (name, scope_def, self.logicals[header]))
        expected = set(self.IndexOfStatement(node) for node in _DirectStatements(body))
        # A one-line compound (`def f(): return 1`) keeps its body on its header.
        expected.discard(header)
        got = [self.index.get(id(l)) for l in self.cache.GetBodyOfScope(name)]
        if None in got:
            found.append('body of %r holds a logical not in the list' % name)
        missing = sorted(expected - set(got))
        extra = sorted(i for i in set(got) - expected
                       if self.logicals[i].fTokens[0] not in _kHeaderOnly)
        if missing:
            found.append('body of %r lacks lines %s' % (name, [self.starts[i] for i in missing]))
        if extra:
            found.append('body of %r has extra lines %s' % (name, [self.starts[i] for i in extra]))
        if got != sorted(got):
            found.append('body of %r is out of order' % name)
        return found


def Parse(source):
    """The ast of `source`, or None for source that Python 2.7 cannot compile."""
    try:
        return ast.parse(source)
    except (SyntaxError, TypeError):  # TypeError: NUL bytes
        return None


def CheckSource(source, tree=None):
    """(number of scopes, list of disagreements) for one module's source."""
    f = _File(source, tree if tree is not None else ast.parse(source))
    scopes = 0
    disagreements = []
    for name, header, body in f.Scopes():
        scopes += 1
        try:
            disagreements.extend(f.Disagreements(name, header, body))
        except (KeyError, ValueError, IndexError) as e:
            disagreements.append('%r: %s: %s' % (name, type(e).__name__, e))
    return scopes, disagreements


def CheckFiles(paths):
    """Totals over `paths`: dict of files, skipped, scopes, disagreements, details."""
    totals = {'files': 0, 'skipped': 0, 'scopes': 0, 'disagreements': 0, 'details': []}
    progress = Progress(len(paths))
    for done, path in enumerate(paths):
        progress.Show(done, note='%d disagreements' % totals['disagreements'])
        with open(path, 'rb') as fp:
            source = fp.read()
        tree = Parse(source)
        if tree is None:
            # Deliberately broken samples, Python 3 only code.
            totals['skipped'] += 1
            continue
        scopes, disagreements = CheckSource(source, tree)
        totals['files'] += 1
        totals['scopes'] += scopes
        totals['disagreements'] += len(disagreements)
        totals['details'].extend('%s: %s' % (path, d) for d in disagreements)
    progress.Close()
    return totals


PythonFiles = toolpath.StdlibFiles
StdlibDir = toolpath.StdlibDir


def main(argv=None):
    argv = list(sys.argv[1:] if argv is None else argv)
    verbose = '--verbose' in argv
    args = [a for a in argv if a != '--verbose']
    root = args[0] if args else StdlibDir()
    totals = CheckFiles(PythonFiles(root))
    if verbose:
        for line in totals['details']:
            print(line)
    print('files: %d (skipped %d)' % (totals['files'], totals['skipped']))
    print('scopes: %d' % totals['scopes'])
    print('disagreements: %d' % totals['disagreements'])
    return 1 if totals['disagreements'] else 0


if __name__ == '__main__':
    toolpath.RunMain(main)
