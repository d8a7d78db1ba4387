#!/usr/bin/env python2.7
"""Prints the scope outline of a Python file as the change finder names it.

    outline.py [FILE] [--logicals] [--scope NAME]... [--reference]
    outline.py --replay [ARGS...]

Without FILE, the bundled sample samples/outline_sample.py is outlined.
--logicals also lists every logical with its kind and scope names;
--scope NAME shows the defining line and the body of one scope, as the
scope body cache resolves it; --replay hands the rest of the command line
to tools/replay.py. The file is read by the native reader; --reference reads
it with the reference reader in pysource/logicals.py instead (the same
logicals, at 20-40 times the cost).
"""

import argparse
import keyword
import os
import sys

import toolpath

_kRepoDir = toolpath.setup()
_kToolsDir = toolpath.kToolsDir
kSamplePath = os.path.join(_kRepoDir, 'samples', 'outline_sample.py')

from pysource import symbolinfo  # noqa: E402
from pysource.logicals import ReadLogicals  # noqa: E402
from pysource.scopebodycache import (CChangeFinder, CScopeBodyCache,  # noqa: E402
                                     GetFullNameForScopeDef)

kKindLabels = {1: 'class', 2: 'def', 21: 'comment', 22: 'blank', 0: 'code'}
_kPreviewWidth = 48


class UsageError(Exception):
    """A failure reported as one `error:` line and exit status 1."""


def Depth(scope_name):
    if not scope_name:
        return 0
    return len(symbolinfo.SplitScopeNames(scope_name))


_kNoSpaceBefore = frozenset([')', ']', '}', ',', ':', '.', ';'])
_kNoSpaceAfter = frozenset(['(', '[', '{', '.', '@'])
_kKeywords = frozenset(keyword.kwlist)


def JoinTokens(tokens):
    """The tokens back as source text, spaced roughly as people write it."""
    parts = []
    depth = 0
    for i, tok in enumerate(tokens):
        if i:
            prev = tokens[i - 1]
            if depth and '=' in (tok, prev):
                glued = True  # keyword arguments and defaults: f(x=1)
            elif prev in ('*', '**'):
                # Glued only as `*args`/`**kw`: after an opening bracket, a comma or lambda.
                glued = i < 2 or tokens[i - 2] in ('(', '[', ',', 'lambda')
            else:
                glued = prev in _kNoSpaceAfter
            glued = glued or tok in _kNoSpaceBefore or (
                tok in ('(', '[') and prev not in _kKeywords
                and (prev[-1:].isalnum() or prev[-1:] in ('_', ')', ']', '"', "'")))
            if not glued:
                parts.append(' ')
        parts.append(tok)
        if tok in ('(', '[', '{'):
            depth += 1
        elif tok in (')', ']', '}') and depth:
            depth -= 1
    return ''.join(parts)


def Text(logical, width=_kPreviewWidth):
    """The logical's tokens joined back, cut to `width` characters."""
    text = JoinTokens(logical.fTokens)
    if len(text) > width:
        text = text[:width - 3] + '...'
    return text


def FullName(logical):
    # A def line whose name could not be read opens no named scope.
    if logical.fLocalScopeName is None:
        return '?'
    return GetFullNameForScopeDef(logical)


def ReadScopes(path, reference=False):
    """The logical list of the file at `path`, after a whole-file pass."""
    try:
        source = toolpath.ReadSource(path)
    except IOError as exc:
        raise UsageError('%s: %s' % (path, exc.strerror or exc))
    except (SyntaxError, ValueError) as exc:  # 3.x: not decodable as declared
        raise UsageError('%s: %s' % (path, exc))
    try:
        lst = ReadLogicals(source, path, reference=reference)
    except SyntaxError as exc:
        raise UsageError('%s:%s: %s' % (path, exc.lineno, exc.msg))
    CChangeFinder(lst).FindChanges(lst, [])
    return lst


def FormatOutline(lst):
    defs = [l for l in lst if l.fKind in (1, 2)]
    rows = []
    for l in defs:
        local = l.fLocalScopeName if l.fLocalScopeName is not None else '?'
        rows.append((l.fLineno, '  ' * Depth(l.fScopeName) + '%s %s' % (kKindLabels[l.fKind], local),
                     FullName(l)))
    width = max([len(r[1]) for r in rows] + [len('outline')]) + 2
    out = [' line  %-*s%s' % (width, 'outline', 'full scoped name')]
    for lineno, text, full in rows:
        out.append('%5d  %-*s%s' % (lineno, width, text, full))
    return out


def FormatLogicals(lst):
    scopes = [repr(l.fScopeName) for l in lst]
    locals_ = [(l.fLocalScopeName or '?') if l.fKind in (1, 2) else '' for l in lst]
    scope_width = max([len(x) for x in scopes] + [len('scope')])
    local_width = max([len(x) for x in locals_] + [len('local name')])
    row = '%5s  %-7s  %-*s  %-*s  %s'
    out = [row % ('line', 'kind', scope_width, 'scope', local_width, 'local name', 'text')]
    for l, scope, local in zip(lst, scopes, locals_):
        text = row % (l.fLineno, kKindLabels.get(l.fKind, str(l.fKind)), scope_width, scope,
                      local_width, local, Text(l))
        out.append(text.rstrip())
    return out


def FormatScope(cache, name):
    try:
        scope_def = cache.GetScopeDef(name)
        body = cache.GetBodyOfScope(name)
    except KeyError as exc:
        raise UsageError(exc.args[0] if exc.args else repr(name))
    if scope_def is None:
        head = 'scope %r: the module (%d body logicals)' % (name, len(body))
    else:
        head = 'scope %r: defined at line %d: %s (%d body logicals)' % (
            name, scope_def.fLineno, Text(scope_def), len(body))
    out = [head]
    for l in body:
        out.append('%5d  %s%s' % (l.fLineno, ' ' * l.fIndent, Text(l, 72)))
    return out


def _Replay(argv):
    if not os.path.exists(os.path.join(_kToolsDir, 'replay.py')) and 'replay' not in sys.modules:
        sys.stderr.write('error: --replay needs tools/replay.py, which is missing\n')
        return 1
    if _kToolsDir not in sys.path:
        sys.path.insert(0, _kToolsDir)
    import replay
    return replay.main(argv)


def _ParseArgs(argv):
    parser = argparse.ArgumentParser(
        prog='outline.py', description='Scope outline of a Python 2 file, as the change '
        'finder names it. Use --replay ARGS... to run tools/replay.py instead.')
    parser.add_argument('file', nargs='?', default=kSamplePath,
                        help='the file to outline (default: the bundled sample)')
    parser.add_argument('--logicals', action='store_true',
                        help='also list every logical with its kind and scope names')
    parser.add_argument('--scope', action='append', default=[], metavar='NAME',
                        help='show the defining line and body of scope NAME (repeatable)')
    parser.add_argument('--reference', action='store_true',
                        help='read with the reference reader (pysource/logicals.py)')
    return parser.parse_args(argv)


def _Print(lines):
    sys.stdout.write('\n'.join(lines) + '\n')


def main(argv=None):
    if argv is None:
        argv = sys.argv[1:]
    if '--replay' in argv:
        at = argv.index('--replay')
        if at != 0:
            sys.stderr.write('error: --replay must come first; it takes the rest of the '
                             'command line\n')
            return 2
        return _Replay(argv[at + 1:])
    args = _ParseArgs(argv)
    try:
        lst = ReadScopes(args.file, args.reference)
        _Print(['%s: %d logicals, %d classes, %d defs' % (
            args.file, len(lst), sum(1 for l in lst if l.fKind == 1),
            sum(1 for l in lst if l.fKind == 2)), ''] + FormatOutline(lst))
        if args.logicals:
            _Print([''] + FormatLogicals(lst))
        if args.scope:
            cache = CScopeBodyCache(lst)
            for name in args.scope:
                _Print([''] + FormatScope(cache, name))
    except UsageError as exc:
        sys.stdout.flush()
        sys.stderr.write('error: %s\n' % exc)
        return 1
    return 0

if __name__ == '__main__':
    toolpath.RunMain(main)
