"""Helpers shared by the tests of pysource.scopebodycache."""

import contextlib
import os
import subprocess
import sys
import textwrap
from cStringIO import StringIO

from pysource._fastaccess import LogicalLineType
from pysource.logicals import ReadLogicals

kClassKind = 1
kDefKind = 2
kCommentKind = 21
kBlankKind = 22

SANITIZED = bool(os.environ.get('SBC_SANITIZED'))


def Logical(tokens, lineno=1, indent=0, kind=0):
    return LogicalLineType(list(tokens), lineno, indent, kind)


def Read(source):
    """Logicals of `source`, dedented so tests can indent their snippets."""
    return ReadLogicals(textwrap.dedent(source))


def Names(logicals):
    return [(l.fScopeName, l.fLocalScopeName) for l in logicals]


def RunPython(code, *flags):
    """Runs `code` in a fresh interpreter with this one's environment.

    Returns (exit status, stdout, stderr). The environment carries
    PYTHONPATH (and, in a sanitizer build, the preloaded runtime).
    """
    env = dict(os.environ)
    env.setdefault('PYTHONPATH', os.pathsep.join(p for p in sys.path if p))
    proc = subprocess.Popen([sys.executable] + list(flags) + ['-c', textwrap.dedent(code)],
                            stdout=subprocess.PIPE, stderr=subprocess.PIPE, env=env)
    out, err = proc.communicate()
    return proc.returncode, out, err


@contextlib.contextmanager
def CapturedStderr():
    """sys.stderr replaced by a StringIO; unraisable reports land there."""
    saved = sys.stderr
    sys.stderr = buf = StringIO()
    try:
        yield buf
    finally:
        sys.stderr = saved


@contextlib.contextmanager
def ModuleGlobal(module, name, value):
    """Rebinds a module global for the duration of the block."""
    saved = module.__dict__[name]
    setattr(module, name, value)
    try:
        yield
    finally:
        setattr(module, name, saved)


@contextlib.contextmanager
def RemovedModuleGlobal(module, name):
    saved = module.__dict__.pop(name)
    try:
        yield
    finally:
        module.__dict__[name] = saved


def _Key(l):
    return (l.fTokens, l.fIndent, l.fKind)


def Edit(lst, new_source):
    """Turns `lst` in place into the logicals of `new_source`, as an editor would.

    Keeps the logicals of the unchanged head and tail (the tail's line
    numbers follow the new text) and replaces the middle. Returns
    (added, removed) for FindChanges.
    """
    new = Read(new_source)
    limit = min(len(lst), len(new))
    head = 0
    while head < limit and _Key(lst[head]) == _Key(new[head]):
        head += 1
    tail = 0
    while tail < limit - head and _Key(lst[-1 - tail]) == _Key(new[-1 - tail]):
        tail += 1
    for k in range(1, tail + 1):
        lst[-k].fLineno = new[-k].fLineno
    removed = lst[head:len(lst) - tail]
    added = new[head:len(new) - tail]
    lst[head:len(lst) - tail] = added
    return added, removed


def WholeListNames(source):
    """The names a fresh finder gives the logicals of `source`."""
    from pysource.scopebodycache import CChangeFinder
    lst = Read(source)
    CChangeFinder(lst).FindChanges(lst, [])
    return Names(lst)
