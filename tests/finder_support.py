"""Helpers shared by the change finder suites."""
import os
import subprocess
import sys

from pysource._fastaccess import LogicalLineType
from pysource.logicals import ReadLogicals
from pysource.scopebodycache import CChangeFinder

ROOT = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))


def logical(tokens, lineno, indent, kind=0):
    return LogicalLineType(tokens, lineno, indent, kind)


def code(lineno, indent, *tokens):
    return logical(list(tokens) or ['x'], lineno, indent, 0)


def comment(lineno, indent):
    return logical(['# c'], lineno, indent, 21)


def blank(lineno, indent=0):
    return logical([], lineno, indent, 22)


def deff(lineno, indent, name):
    return logical(['def', name, '(', ')', ':'], lineno, indent, 2)


def whole_pass(lst, finder_class=CChangeFinder):
    finder = finder_class(lst)
    return finder, finder.FindChanges(lst, [])


def read_named(source):
    lst = ReadLogicals(source)
    whole_pass(lst)
    return lst


def names(lst):
    return [(l.fScopeName, l.fLocalScopeName) for l in lst]


def scope_names(lst):
    return [l.fScopeName for l in lst]


def finder_fields(finder):
    """The finder's fields, read through its pickled state."""
    state = finder.__reduce__()[2]
    keys = ('destroyed', 'signal_catchers', 'class_changes', 'contents_changes',
            'function_changes', 'end_index_for_scopes_seen', 'last_processed_index',
            'logical_list', 'next_change_index', 'scopes_seen')
    return dict(zip(keys, state))


def signature(l):
    return (l.fTokens, l.fKind, l.fIndent)


def apply_edit(lst, finder, new_source):
    """Turns lst into the logicals of new_source the way an editor does: the
    common prefix and suffix stay (the same objects, with new line numbers),
    the middle is replaced. Returns (result of FindChanges, added, removed)."""
    fresh = ReadLogicals(new_source)
    p = 0
    while (p < len(lst) and p < len(fresh) and signature(lst[p]) == signature(fresh[p])
           and lst[p].fLineno == fresh[p].fLineno):
        p += 1
    s = 0
    while (s < len(lst) - p and s < len(fresh) - p
           and signature(lst[-1 - s]) == signature(fresh[-1 - s])):
        s += 1
    removed = lst[p:len(lst) - s]
    added = fresh[p:len(fresh) - s]
    for k in range(1, s + 1):
        lst[-k].fLineno = fresh[-k].fLineno
    lst[p:len(lst) - s] = added
    return finder.FindChanges(added, removed), added, removed


def fresh_names(source):
    return names(read_named(source))


def run_python(code_text, optimize=False):
    """Runs code in a fresh interpreter; returns (exit status, stdout, stderr)."""
    env = dict(os.environ)
    env.setdefault('PYTHONPATH', os.path.join(ROOT, 'build', 'python'))
    args = [sys.executable] + (['-O'] if optimize else []) + ['-c', code_text]
    proc = subprocess.Popen(args, stdout=subprocess.PIPE, stderr=subprocess.PIPE, env=env)
    out, err = proc.communicate()
    return proc.returncode, out, err
