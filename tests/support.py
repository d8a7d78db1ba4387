"""Helpers shared by the suites of pysource.scopebodycache."""

import ast
import contextlib
import io
import os
import subprocess
import sys
import textwrap

kRepoDir = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
# The tools are tested here, and the editor protocol is theirs.
sys.path.insert(0, os.path.join(kRepoDir, 'tools'))

from pysource._fastaccess import LogicalLineType  # noqa: E402
from pysource.logicals import ReadLogicals, kBlankKind, kClassKind, kCommentKind, kDefKind  # noqa: E402,F401
from pysource.scopebodycache import CChangeFinder  # noqa: E402
from replaykit.editor import Edit  # noqa: E402,F401

SANITIZED = bool(os.environ.get('SBC_SANITIZED'))
# Run with -O: the module's assertions are skipped too.
OPTIMIZED = bool(sys.flags.optimize)
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


def Code(lineno, indent, *tokens):
    return Logical(tokens or ['x'], lineno, indent)


def Def(lineno, indent, name):
    return Logical(['def', name, '(', ')', ':'], lineno, indent, kDefKind)


def Read(source):
    return ReadLogicals(textwrap.dedent(source))


def WholePass(lst, finder_class=CChangeFinder):
    """(finder, result) of a whole-list pass over `lst`."""
    finder = finder_class(lst)
    return finder, finder.FindChanges(lst, [])


def Named(source):
    """The logicals of `source`, named by a fresh whole-list pass."""
    lst = Read(source)
    WholePass(lst)
    return lst


def Names(logicals):
    return [(l.fScopeName, l.fLocalScopeName) for l in logicals]


def ScopeNames(logicals):
    return [l.fScopeName for l in logicals]


def WholeListNames(source):
    return Names(Named(source))


def FinderFields(finder):
    """The finder's fields by name, read through its pickled state."""
    keys = ('destroyed', 'signal_catchers', 'class_changes', 'contents_changes',
            'function_changes', 'end_index_for_scopes_seen', 'last_processed_index',
            'logical_list', 'next_change_index', 'scopes_seen')
    return dict(zip(keys, finder.__reduce__()[2]))


def Outcome(func, *args, **kwargs):
    """The result, or (exception type, message) of what func raises."""
    try:
        return func(*args, **kwargs)
    except Exception as e:
        return type(e), e.args[0] if isinstance(e, KeyError) else str(e)


def TextBuffer():
    """A StringIO for what the interpreter writes as `str` (bytes on 2.x)."""
    return io.BytesIO() if str is bytes else io.StringIO()


@contextlib.contextmanager
def CapturedStderr():
    """sys.stderr replaced by a buffer; unraisable reports land there."""
    saved, sys.stderr = sys.stderr, TextBuffer()
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
    if rest or count < 0:
        raise ValueError(base_size)
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


def RunPython(code, env=None):
    """Runs `code` in a fresh interpreter with this one's path and -O:
    (status, stdout, stderr)."""
    env = dict(env or os.environ, PYTHONPATH=os.pathsep.join(p for p in sys.path if p))
    proc = subprocess.Popen([sys.executable] + ['-O'] * OPTIMIZED + ['-c', textwrap.dedent(code)], env=env,
                            stdout=subprocess.PIPE, stderr=subprocess.PIPE, universal_newlines=True)
    out, err = proc.communicate()
    return proc.returncode, out, err


def ImportWith(setup, after=''):
    """In a fresh interpreter with this one's path and -O, imports the module
    after `setup` and runs `after`; returns the child's `result` dict."""
    code = kImportPrelude.replace('#SETUP', textwrap.dedent(setup)).replace('#AFTER', textwrap.dedent(after))
    status, out, err = RunPython(code)
    lines = [l for l in out.splitlines() if l.startswith('RESULT ')]
    if status != 0 or len(lines) != 1:
        raise RuntimeError('the child failed: %r' % ((status, out, err),))
    return ast.literal_eval(lines[0][len('RESULT '):])
