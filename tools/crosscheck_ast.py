#!/usr/bin/env python2.7
"""Checks the change finder's whole-file pass against the `ast` module.

    crosscheck_ast.py [PATH...] [--sample N] [--seed S] [--show K] [--whitespace]

Without PATHs, every .py file of the standard library (outside
site-packages) is checked; --sample checks N of them chosen with seed S.
A file is checked when both ReadLogicals and ast.parse accept it. On every
code logical (not comment or blank; those too with --whitespace) the scope
names that the whole-file pass stored must match what the syntax tree
implies:

- fScopeName is the full dotted name of the innermost enclosing class or
  def ("" at module level);
- a class/def line's fLocalScopeName is "NAME#k", k counting the earlier
  classes and defs of the same name in the same enclosing scope, and
  GetFullNameForScopeDef gives the two joined.

Exits 1 when any logical disagrees.
"""

import argparse
import ast
import bisect
import random
import sys

import toolpath
from progress import Progress

toolpath.setup()

from pysource.logicals import ReadLogicals  # noqa: E402
from pysource.scopebodycache import CChangeFinder, GetFullNameForScopeDef  # noqa: E402

kWhitespaceKinds = (21, 22)
kScopeStartKinds = (1, 2)
# `async def` (3.x) opens a function scope as `def` does.
_kScopeNodes = (ast.FunctionDef, ast.ClassDef) + tuple(
    getattr(ast, name) for name in ('AsyncFunctionDef',) if hasattr(ast, name))


class Disagreement(object):
    __slots__ = ('path', 'lineno', 'field', 'expected', 'actual')

    def __init__(self, path, lineno, field, expected, actual):
        self.path, self.lineno, self.field = path, lineno, field
        self.expected, self.actual = expected, actual

    def __repr__(self):
        return '%s:%d: %s: expected %r, got %r' % (self.path, self.lineno, self.field,
                                                   self.expected, self.actual)


def _Join(scope, local):
    return scope + '.' + local if scope else local


class _ExpectedScopes(object):
    """What the syntax tree says about each logical of one file.

    `claimed[i]` is (scope, local name or None) for the logical at index i
    that starts a statement (or is a decorator line). A compound statement
    also covers the logicals after its first one up to its last nested
    statement's; an unclaimed logical there (`else:`, `except:`,
    `finally:`) takes the scope that the innermost covering statement gives
    its header's continuation lines: the body scope for a class or def, the
    statement's own scope otherwise.
    """

    def __init__(self, tree, lst):
        self._lst = lst
        self._linenos = [l.fLineno for l in lst]
        self.claimed = {}
        self.covered = [''] * len(lst)
        self.problems = []  # mapping failures: a checker limitation, not a finder fault
        self._counts = {}
        self._covers = []
        for node in tree.body:
            self._Visit(node, '')
        # _Visit records covers after the nested ones; apply the outer ones
        # first so that the innermost covering statement decides.
        for first, last, scope in reversed(self._covers):
            for i in range(first + 1, last + 1):
                self.covered[i] = scope

    def _Index(self, lineno):
        # A statement's line may be inside its logical: 2.7 gives a statement
        # that starts with a multi-line string the string's last line.
        return bisect.bisect_right(self._linenos, lineno) - 1

    def _Claim(self, index, scope, local=None):
        if index not in self.claimed:
            self.claimed[index] = (scope, local)

    def _Visit(self, node, scope):
        """Claims the lines of `node` (in `scope`); returns its last logical index."""
        first = self._Index(node.lineno)
        if isinstance(node, _kScopeNodes):
            header = first
            if node.decorator_list:
                # 2.7 dates a decorated definition from its first decorator.
                while header < len(self._lst) and self._lst[header].fKind not in kScopeStartKinds:
                    if self._lst[header].fKind not in kWhitespaceKinds:
                        self._Claim(header, scope)
                    header += 1
            # The name follows `def`/`class`, and `async def` (3.x).
            at = 2 if header < len(self._lst) and self._TokenAt(header, 0) == 'async' else 1
            if header >= len(self._lst) or self._TokenAt(header, at) != node.name:
                self.problems.append((node.lineno, 'no %s line for %r after the decorators'
                                      % (type(node).__name__, node.name)))
                return first
            key = (scope, node.name)
            k = self._counts.get(key, 0)
            self._counts[key] = k + 1
            local = '%s#%d' % (node.name, k)
            self._Claim(header, scope, local)
            inner = _Join(scope, local)
            last = header
            for child in node.body:
                last = max(last, self._Visit(child, inner))
            self._Cover(header, last, inner)
            return last
        self._Claim(first, scope)
        last = first
        # Source order; `cases` are 3.10's match.
        for field in ('body', 'handlers', 'orelse', 'finalbody', 'cases'):
            children = getattr(node, field, None)
            if not isinstance(children, list):
                continue  # `exec`'s body is an expression
            for child in children:
                if isinstance(child, ast.excepthandler):
                    # An except clause is not a statement but holds statements.
                    self._Claim(self._Index(child.lineno), scope)
                    for grandchild in child.body:
                        last = max(last, self._Visit(grandchild, scope))
                elif type(child).__name__ == 'match_case':
                    # Nor is a case clause; its line is its pattern's.
                    self._Claim(self._Index(child.pattern.lineno), scope)
                    for grandchild in child.body:
                        last = max(last, self._Visit(grandchild, scope))
                else:
                    last = max(last, self._Visit(child, scope))
        self._Cover(first, last, scope)
        return last

    def _Cover(self, first, last, scope):
        if last > first:
            self._covers.append((first, last, scope))

    def _TokenAt(self, index, at):
        tokens = self._lst[index].fTokens
        return tokens[at] if len(tokens) > at else None

    def Expected(self, index):
        if index in self.claimed:
            return self.claimed[index]
        return (self.covered[index], None)

    def ExpectedWhitespace(self, index):
        """The documented scope of the comment or blank logical at `index`.

        It takes the next code line's scope when indented no deeper than
        that line (with no code after it, as if a module-level line
        followed); otherwise the first code line above decides: the scope
        it opens if it is a class/def header indented less than the
        comment, else its own scope.
        """
        lst = self._lst
        indent = lst[index].fIndent
        j = index + 1
        while j < len(lst) and lst[j].fKind in kWhitespaceKinds:
            j += 1
        if j == len(lst):
            if indent <= 0:
                return ''
        elif indent <= lst[j].fIndent:
            return self.Expected(j)[0]
        k = index - 1
        while k >= 0 and lst[k].fKind in kWhitespaceKinds:
            k -= 1
        if k < 0:
            return ''
        scope, local = self.Expected(k)
        if lst[k].fKind in kScopeStartKinds and indent > lst[k].fIndent and local is not None:
            return _Join(scope, local)
        return scope


def _ReadSource(path):
    return toolpath.ReadSource(path)


def ParseBoth(path, source=None):
    """(logical list, ast tree), or None when either reader refuses the file."""
    try:
        if source is None:
            source = _ReadSource(path)  # 3.x: SyntaxError when not decodable as declared
        lst = ReadLogicals(source, path)
        tree = ast.parse(source, path)
    except (SyntaxError, TypeError, ValueError):
        return None
    return lst, tree


def CheckLogicals(lst, tree, path='<string>', whitespace=False):
    """Runs the whole-file pass on `lst`; returns (logicals checked, disagreements)."""
    CChangeFinder(lst).FindChanges(lst, [])
    return CompareWithAst(lst, tree, path, whitespace)


def CompareWithAst(lst, tree, path='<string>', whitespace=False):
    """(logicals checked, disagreements) of the names already stored in `lst`.

    Comment and blank logicals are checked only with `whitespace`, against
    their documented placement.
    """
    expected = _ExpectedScopes(tree, lst)
    found = [Disagreement(path, lineno, 'mapping', message, None)
             for lineno, message in expected.problems]
    checked = 0
    for i, l in enumerate(lst):
        if l.fKind in kWhitespaceKinds:
            if whitespace:
                checked += 1
                scope = expected.ExpectedWhitespace(i)
                if l.fScopeName != scope:
                    found.append(Disagreement(path, l.fLineno, 'fScopeName (%s)'
                                              % ('comment' if l.fKind == 21 else 'blank'),
                                              scope, l.fScopeName))
            continue
        checked += 1
        scope, local = expected.Expected(i)
        if l.fScopeName != scope:
            found.append(Disagreement(path, l.fLineno, 'fScopeName', scope, l.fScopeName))
        if l.fKind in kScopeStartKinds:
            if l.fLocalScopeName != local:
                found.append(Disagreement(path, l.fLineno, 'fLocalScopeName', local,
                                          l.fLocalScopeName))
            elif local is not None:
                full = GetFullNameForScopeDef(l)
                if full != _Join(scope, local):
                    found.append(Disagreement(path, l.fLineno, 'GetFullNameForScopeDef',
                                              _Join(scope, local), full))
    return checked, found


def CheckFile(path, whitespace=False):
    """(logicals checked, disagreements) for the file at `path`.

    A file that ReadLogicals or ast.parse refuses gives (0, []).
    """
    parsed = ParseBoth(path)
    if parsed is None:
        return 0, []
    return CheckLogicals(parsed[0], parsed[1], path, whitespace)


def CheckSource(source, path='<string>', whitespace=False):
    """CheckFile for a source string; it must be accepted by both readers."""
    lst, tree = ReadLogicals(source, path), ast.parse(source, path)
    return CheckLogicals(lst, tree, path, whitespace)


StdlibDir = toolpath.StdlibDir
StdlibFiles = toolpath.StdlibFiles


def main(argv=None):
    parser = argparse.ArgumentParser(prog='crosscheck_ast.py', description=__doc__.split('\n')[0])
    parser.add_argument('paths', nargs='*', help='files to check (default: the standard library)')
    parser.add_argument('--sample', type=int, metavar='N', help='check N files chosen at random')
    parser.add_argument('--seed', type=int, default=0, metavar='S')
    parser.add_argument('--show', type=int, default=20, metavar='K',
                        help='disagreements to print (default 20)')
    parser.add_argument('--whitespace', action='store_true',
                        help='also check comment and blank lines against their documented '
                        'placement')
    args = parser.parse_args(sys.argv[1:] if argv is None else argv)

    paths = args.paths or StdlibFiles()
    if args.sample is not None and args.sample < len(paths):
        paths = sorted(random.Random(args.seed).sample(paths, args.sample))
    files = skipped = logicals = 0
    found = []
    with Progress(len(paths)) as progress:
        for done, path in enumerate(paths):
            progress.Show(done, note='%d disagreements' % len(found))
            parsed = ParseBoth(path)
            if parsed is None:
                skipped += 1
                continue
            checked, disagreements = CheckLogicals(parsed[0], parsed[1], path, args.whitespace)
            files += 1
            logicals += checked
            found.extend(disagreements)
    print('files checked: %d (skipped, not accepted by both readers: %d)' % (files, skipped))
    print('logicals checked: %d' % logicals)
    print('disagreements: %d in %d files' % (len(found), len(set(d.path for d in found))))
    for d in found[:args.show]:
        print('  %r' % d)
    return 1 if found else 0


if __name__ == '__main__':
    toolpath.RunMain(main)
