"""Helpers shared by the suites of pysource.scopebodycache."""

import ast
import contextlib
import io
import os
import pickle
import subprocess
import sys
import textwrap

try:
    import __builtin__ as builtins  # noqa: F401
except ImportError:
    import builtins  # noqa: F401

kRepoDir = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
# The tools are tested here, and the editor protocol is theirs.
sys.path.insert(0, os.path.join(kRepoDir, 'tools'))

from pysource._fastaccess import LogicalLineType  # noqa: E402
from pysource.logicals import ReadLogicals, kBlankKind, kClassKind, kCommentKind, kDefKind  # noqa: E402,F401
from pysource.scopebodycache import CChangeFinder  # noqa: E402
from replaykit.editor import Edit  # noqa: E402,F401

SANITIZED = bool(os.environ.get('SBC_SANITIZED'))
PY3 = sys.version_info[0] >= 3
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


# --- What differs on 3.x ---------------------------------------------------------
# Every message of the module (or of the interpreter, where a test checks
# one) that 3.x words otherwise: the 2.7 text, the 3.x text. Text() gives
# the one this interpreter uses; the README's "Python 3" section lists them.
kPy3Messages = [
    # A name must be the interpreter's str: 2.7 calls it bytes.
    ('Expected bytes, got %s', 'Expected str, got %s'),
    ('expected bytes, %s found', 'expected str, %s found'),
    # The interpreter's own texts of a failed `a, b = seq`.
    ('need more than %d values to unpack', 'not enough values to unpack (expected 2, got %d)'),
    ('need more than %d value to unpack', 'not enough values to unpack (expected 2, got %d)'),
    # 3.x's text (later 3.x versions check keyword names before the module does).
    ('%(function)s() keywords must be strings', 'keywords must be strings'),
    # What 2.7's PyNumber_Index says, and 3.x's.
    ("'%s' object cannot be interpreted as an index", "'%s' object cannot be interpreted as an integer"),
    # An unbound method checks its instance in 2.7; 3.x has no unbound methods,
    # and the module's own method checks it.
    ('unbound method %(what)s must be called with %(cls)s instance as first argument (got %(got)s instance instead)',
     "descriptor '%(name)s' requires a '%(module)s.%(cls)s' object but received a '%(got)s'"),
    # Attribute errors of modules and None.
    ("'module' object has no attribute '%(attr)s'", "module '%(module)s' has no attribute '%(attr)s'"),
]
kPy3MessageOf = dict(kPy3Messages)


def Text(message, *values, **named):
    """`message` (a 2.7 text of kPy3Messages, or one that does not differ) as
    this interpreter words it, filled with `values` (or `named`)."""
    if PY3:
        message = kPy3MessageOf.get(message, message)
    return message % (values or named) if values or named else message


# A type name in messages: the type a name must not be (2.7's unicode,
# 3.x's bytes), and what 3.x calls 2.7's long.
kOtherText = b''.__class__ if PY3 else u''.__class__
kOtherTextName = kOtherText.__name__
kLongName = 'int' if PY3 else 'long'


def OtherText(text):
    """`text` as the other kind of text than str: unicode on 2.7, bytes on 3.x."""
    return text.encode('utf-8') if PY3 else text.decode('utf-8')


def Picklers():
    """(label, dumps, loads) of every pickling route: each protocol of the
    native pickler and of the one written in Python (2.7's cPickle and
    pickle; 3.x's pickle and its pure-Python classes)."""
    if PY3:
        modules = [('pickle', pickle._dumps, pickle._loads), ('cPickle', pickle.dumps, pickle.loads)]
    else:
        import cPickle
        modules = [('pickle', pickle.dumps, pickle.loads), ('cPickle', cPickle.dumps, cPickle.loads)]
    for name, dumps, loads in modules:
        for proto in range(pickle.HIGHEST_PROTOCOL + 1):
            yield '%s/%d' % (name, proto), lambda o, d=dumps, p=proto: d(o, p), loads


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
import ctypes, sys, types, warnings
import pysource._fastaccess, pysource.symbolinfo, tallowkit.destroyable
FA, SI, TD = [sys.modules[n] for n in
              ('pysource._fastaccess', 'pysource.symbolinfo', 'tallowkit.destroyable')]
_GetName, _New = ctypes.pythonapi.PyCapsule_GetName, ctypes.pythonapi.PyCapsule_New
_GetName.restype, _GetName.argtypes = ctypes.c_char_p, [ctypes.py_object]
_New.restype, _New.argtypes = ctypes.py_object, [ctypes.c_void_p] * 3
_keep, v, result = [], {}, {}

def Signature(module, name):
    signature = _GetName(module._capi[name])  # bytes on 3.x
    return signature if isinstance(signature, str) else signature.decode('ascii')

def Capsule(signature):
    # A capsule holds bare pointers: its name and target must outlive it.
    if not isinstance(signature, bytes):
        signature = signature.encode('ascii')
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
        # The traceback is walked, not formatted: a setup may have broken
        # builtins that formatting uses. 3.x drops a module that failed to
        # load; its namespace is the globals of the init function's entry.
        tb, namespace, result['init_in_tb'] = sys.exc_info()[2], None, False
        while tb is not None:
            if tb.tb_frame.f_code.co_name == 'init pysource.scopebodycache':
                namespace, result['init_in_tb'] = tb.tb_frame.f_globals, True
            tb = tb.tb_next
result['warnings'] = [str(w.message) for w in caught]
mod = sys.modules.get('pysource.scopebodycache')
if mod is None and result.get('error') and namespace is not None:
    mod = types.ModuleType('pysource.scopebodycache')
    mod.__dict__.clear()
    mod.__dict__.update(namespace)
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
