"""Helpers shared by the tests of pysource.scopebodycache."""

import ast
import contextlib
import os
import subprocess
import sys
import textwrap
from cStringIO import StringIO

from pysource._fastaccess import LogicalLineType
from pysource.logicals import ReadLogicals
from pysource.scopebodycache import CChangeFinder

kClassKind, kDefKind, kCommentKind, kBlankKind = 1, 2, 21, 22
SANITIZED = bool(os.environ.get('SBC_SANITIZED'))
kMissing = object()
# A small file with a nested scope, a repeated name and a dedented comment.
kSampleSource = '''\
class A:
    def f(self):
        pass
# comment
    def f(self):
        x = 1
def g():
    return 2
'''


def Logical(tokens, lineno=1, indent=0, kind=0):
    return LogicalLineType(list(tokens), lineno, indent, kind)


def Read(source):
    return ReadLogicals(textwrap.dedent(source))


def Named(source):
    """The logicals of `source`, named by a fresh whole-list pass."""
    lst = Read(source)
    CChangeFinder(lst).FindChanges(lst, [])
    return lst


def Names(logicals):
    return [(l.fScopeName, l.fLocalScopeName) for l in logicals]


def WholeListNames(source):
    return Names(Named(source))


def Outcome(func, *args, **kwargs):
    """The result, or (exception type, message) of what func raises."""
    try:
        return func(*args, **kwargs)
    except Exception as e:
        return type(e), e.args[0] if isinstance(e, KeyError) else str(e)


def Edit(lst, new_source):
    """Turns `lst` into the logicals of `new_source` as an editor would; returns (added, removed)."""
    new = Read(new_source)
    key = lambda l: (l.fTokens, l.fIndent, l.fKind)  # noqa: E731
    limit = min(len(lst), len(new))
    head = tail = 0
    while head < limit and key(lst[head]) == key(new[head]):
        head += 1
    while tail < limit - head and key(lst[-1 - tail]) == key(new[-1 - tail]):
        tail += 1
    for k in range(1, tail + 1):
        lst[-k].fLineno = new[-k].fLineno
    removed, added = lst[head:len(lst) - tail], new[head:len(new) - tail]
    lst[head:len(lst) - tail] = added
    return added, removed


def RunPython(code, *flags):
    """Runs `code` in a fresh interpreter with this environment: (status, stdout, stderr)."""
    env = dict(os.environ)
    env.setdefault('PYTHONPATH', os.pathsep.join(p for p in sys.path if p))
    proc = subprocess.Popen([sys.executable] + list(flags) + ['-c', textwrap.dedent(code)],
                            stdout=subprocess.PIPE, stderr=subprocess.PIPE, env=env)
    out, err = proc.communicate()
    return proc.returncode, out, err


# Run in a fresh interpreter: `setup` puts substitutes for the sibling modules
# (copies with a change) in sys.modules, then the module is imported.
kImportPrelude = r'''
import ctypes, sys, traceback, types, warnings
import pysource._fastaccess, pysource.symbolinfo, tallowkit.destroyable
FA, SI, TD = [sys.modules[n] for n in
              ('pysource._fastaccess', 'pysource.symbolinfo', 'tallowkit.destroyable')]
_GetName, _New = ctypes.pythonapi.PyCapsule_GetName, ctypes.pythonapi.PyCapsule_New
_GetName.restype, _GetName.argtypes = ctypes.c_char_p, [ctypes.py_object]
_New.restype, _New.argtypes = ctypes.py_object, [ctypes.c_void_p] * 3
_keep, v, result = [], {}, {}

def Signature(module, name):
    return _GetName(module._capi[name])

def Capsule(signature):
    # A capsule holds bare pointers: its name and target must outlive it.
    name, target = ctypes.create_string_buffer(signature), ctypes.c_long(0)
    _keep.extend([name, target])
    return _New(ctypes.addressof(target), ctypes.addressof(name), None)

def Substitute(real, drop_capi=(), capi={}, drop=(), **attrs):
    sub = types.ModuleType(real.__name__)
    sub.__dict__.update(real.__dict__)
    sub._capi = dict((k, c) for k, c in real._capi.items() if k not in drop_capi)
    sub._capi.update(capi)
    for name in drop:
        delattr(sub, name)
    sub.__dict__.update(attrs)
    sys.modules[real.__name__] = sub

def Slotted(base_size, name='CDestroyable', **extra):
    count, rest = divmod(base_size - object.__basicsize__, ctypes.sizeof(ctypes.c_void_p))
    assert rest == 0 and count >= 0, base_size
    extra['__slots__'] = tuple('s%d' % k for k in range(count))
    return type(name, (object,), extra)

#SETUP
with warnings.catch_warnings(record=True) as caught:
    warnings.simplefilter('always')
    try:
        import pysource.scopebodycache
    except Exception as e:
        result['error'] = (type(e).__name__, str(e))
        result['init_in_tb'] = 'init pysource.scopebodycache' in traceback.format_exc()
result['warnings'] = [str(w.message) for w in caught]
mod = sys.modules.get('pysource.scopebodycache')
result['names'] = sorted(mod.__dict__) if mod else []
if 'FindChanges' in getattr(mod, 'CChangeFinder', object).__dict__:
    result['names'].append('CChangeFinder.FindChanges')
#AFTER
result['v'] = v
sys.stdout.write('RESULT %r\n' % (result,))
'''


def ImportWith(setup, after=''):
    """Imports the module after `setup`, runs `after`; returns the child's `result` dict."""
    status, out, err = RunPython(kImportPrelude.replace('#SETUP', textwrap.dedent(setup))
                                 .replace('#AFTER', textwrap.dedent(after)))
    lines = [l for l in out.splitlines() if l.startswith('RESULT ')]
    assert status == 0 and len(lines) == 1, (status, out, err)
    return ast.literal_eval(lines[0][len('RESULT '):])


@contextlib.contextmanager
def CapturedStderr():
    """sys.stderr replaced by a StringIO; unraisable reports land there."""
    saved, sys.stderr = sys.stderr, StringIO()
    try:
        yield sys.stderr
    finally:
        sys.stderr = saved


@contextlib.contextmanager
def ModuleGlobal(module, name, value=kMissing):
    """Rebinds (or, without a value, removes) a module global for the block."""
    saved = module.__dict__.pop(name)
    if value is not kMissing:
        module.__dict__[name] = value
    try:
        yield
    finally:
        module.__dict__[name] = saved
