"""Hostile values, hostile subclasses of both classes, and stand-ins for the
module globals the classes look up at each use."""

import gc
import sys
import threading
import types

from pysource._fastaccess import LogicalLineType
import pysource.scopebodycache as sbc
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache

# Raises again what sys.exc_info() gave, with its traceback.
if sys.version_info[0] >= 3:
    def _Reraise(info):
        raise info[1].with_traceback(info[2])
else:
    exec('def _Reraise(info):\n    raise info[0], info[1], info[2]\n')

# How often threads switch, in 2.7's unit (bytecodes; 100 by default). 3.x
# switches after a time instead: 100 is its default 5 ms.
if hasattr(sys, 'setcheckinterval') and sys.version_info[0] == 2:
    GetSwitchInterval, SetSwitchInterval = sys.getcheckinterval, sys.setcheckinterval
else:
    def GetSwitchInterval():
        return sys.getswitchinterval() / 5e-5

    def SetSwitchInterval(interval):
        sys.setswitchinterval(interval * 5e-5)

# The other kind of text than str: 2.7's unicode, 3.x's bytes.
kOtherText = type(u'') if str is bytes else bytes


def Other(text):
    return kOtherText(text) if str is bytes else text.encode('utf-8')


kFinderSteps = ('_Clear', '_PrepareForFind', '_FindChangesEntireListAdded',
                '_GetLeafScopeWithIndex', '_ProcessRemovedLogicals', '_ProcessAddedLogicals',
                '_ProcessDedentedComments', '_LogicalInScopeChanged', '_SetLogicalScopeNames',
                '_UpdateLogicalScopeName', '_UpdateContainingScope',
                '_PropagateScopeIndexChangeForward', '_FindScopeIndexForLogical',
                '_FindScopeNameContainingLogical')
kCacheSteps = ('GetScopeDef', 'GetBodyOfScope', '_FindScopeDef', '_FindBodyOfScopeDef')
kGlobals = ('_fastaccess', 'symbolinfo', 'GetFullNameForScopeDef')


class HostileError(Exception):
    pass


class HostileBase(BaseException):
    """Not an Exception: code that catches only Exception lets it through."""


class StrSub(str):
    pass


class ListSub(list):
    pass


class SetSub(set):
    pass


class DictSub(dict):
    pass


class TupleSub(tuple):
    pass


class LogicalSub(LogicalLineType):
    pass


class Evil(object):
    """Every protocol the module might use on it raises."""

    def _Raise(self, *args):
        raise HostileError('evil')
    __index__ = __int__ = __long__ = __len__ = __iter__ = __hash__ = __eq__ = __ne__ = _Raise
    __nonzero__ = __bool__ = __getitem__ = __lt__ = __gt__ = __float__ = __str__ = _Raise

    def __repr__(self):
        return 'Evil()'


class Trap(object):
    """Runs `action` whenever the module converts, hashes, compares, sizes or
    tests it, then answers like `value`."""

    def __init__(self, action, value=0):
        self.action = action
        self.value = value

    def _Hit(self):
        self.action()
        return self.value

    def __index__(self):
        return int(self._Hit())
    __int__ = __long__ = __index__

    def __hash__(self):
        return hash(self._Hit())

    def __eq__(self, other):
        return self._Hit() == other

    def __ne__(self, other):
        return self._Hit() != other

    def __nonzero__(self):
        return bool(self._Hit())
    __bool__ = __nonzero__

    def __len__(self):
        self._Hit()
        return 1

    def __repr__(self):
        return 'Trap(%r)' % (self.value,)


def Logical(tokens, lineno=1, indent=0, kind=0):
    return LogicalLineType(list(tokens), lineno, indent, kind)


def OddLogical(rng):
    """A logical with odd but storable fields."""
    l = Logical(rng.choice([[], ['def'], ['class'], ['\\', 'def'], ['async', 'def', 'g'],
                            ['def', 'f#3'], ['x'], ['# c'], ['def', 'f', '('], ['class', 'A']]),
                rng.choice([-5, 0, 1, 10 ** 6]), rng.choice([-4, -1, 0, 4, 32767, -32768]),
                rng.choice([0, 1, 2, 21, 22, 3, 255]))
    if rng.random() < 0.6:
        l.fScopeName = rng.choice([None, '', 'A#0', 5, Other(u'x'), StrSub('A#0'), 'f#1.g#0', '.'])
    if rng.random() < 0.6:
        l.fLocalScopeName = rng.choice([None, 'f', 'f#0', 7, Other(u'g#1'), StrSub('f#2'), 'f#x', '#'])
    return l


def Value(rng, lst=None, junk_only=False):
    """A hostile value of some type."""
    pick = rng.randrange(36)
    inner = lst[rng.randrange(len(lst))] if lst else Logical(['x'])
    table = [
        None, 0, -1, 1, 2 ** 31, 2 ** 63 - 1, 2 ** 63, -2 ** 63 - 1, 2 ** 100, 1.5,
        float('nan'), True, '', 'x', '*', Other(u'\xe9'), StrSub('A#0'), bytearray(b'ab'), [],
        ListSub([inner]), [None], [1, 2], [inner], [OddLogical(rng)], (), (inner,),
        SetSub(['']), DictSub(), frozenset(['x']), object(), Evil(),
        LogicalSub(['x'], 1, 0, 0), OddLogical(rng), (x for x in [inner]), TupleSub((1, 2)),
        Trap(lambda: None, rng.choice([0, 1, -1])),
    ]
    value = table[pick]
    if junk_only and type(value) is LogicalLineType:
        return Evil()
    return value


# ---------------------------------------------------------------------------
# Overrides

class Plan(object):
    """Which hostile act runs on which call of which step. Acts run only while
    armed; `calls` counts the armed calls of each step."""

    def __init__(self):
        self.armed = False
        self.acts = {}       # step -> [(on_call, act, repeat)]
        self.calls = {}
        self.fired = []      # (step, act name) in firing order
        self.on_fire = None

    def Add(self, step, on_call, act, repeat=False):
        self.acts.setdefault(step, []).append((on_call, act, repeat))

    def Pick(self, step):
        if not self.armed:
            return None
        n = self.calls.get(step, 0) + 1
        self.calls[step] = n
        for on_call, act, repeat in self.acts.get(step, ()):
            if n == on_call or (repeat and n > on_call):
                self.fired.append((step, act.__name__))
                if self.on_fire is not None:
                    self.on_fire(step, act)
                return act
        return None


def _Override(base_class, step, plan, ctx):
    base = getattr(base_class, step)

    def override(self, *args, **kwargs):
        act = plan.Pick(step)
        try:
            if act is None:
                result = base(self, *args, **kwargs)
            else:
                result = act(ctx, self, base, args, kwargs)
        except BaseException:
            info = sys.exc_info()
            replaced = ctx.FilterResult(step, args, None, True)
            if replaced is None:
                _Reraise(info)
            return replaced
        return ctx.FilterResult(step, args, result, False)
    override.__name__ = step
    return override


def HostileClass(base_class, steps, plan, ctx):
    """A Python subclass of base_class whose `steps` consult `plan`."""
    methods = dict((s, _Override(base_class, s, plan, ctx)) for s in steps)
    return type('Hostile' + base_class.__name__, (base_class,), methods)


class Globals(object):
    """Rebinds module globals for a while; Restore puts every one back."""

    def __init__(self):
        self.saved = {}

    def Set(self, name, value):
        if name not in self.saved:
            self.saved[name] = sbc.__dict__.get(name, _kMissing)
        if value is _kMissing:
            sbc.__dict__.pop(name, None)
        else:
            sbc.__dict__[name] = value

    def Restore(self):
        for name, value in self.saved.items():
            if value is _kMissing:
                sbc.__dict__.pop(name, None)
            else:
                sbc.__dict__[name] = value
        self.saved.clear()


_kMissing = object()
Missing = _kMissing


def FakeModule(real, name, func):
    """A copy of module `real` whose attribute `name` is `func`."""
    fake = types.ModuleType(real.__name__)
    fake.__dict__.update(real.__dict__)
    if func is _kMissing:
        fake.__dict__.pop(name, None)
    else:
        setattr(fake, name, func)
    return fake


class Threads(object):
    """Threads started by hostile acts; all are joined before the step ends."""

    def __init__(self):
        self.started = []
        self.errors = []

    def Start(self, func):
        def Run():
            try:
                func()
            except BaseException as e:  # the thread's outcome is only counted
                self.errors.append(type(e).__name__)
        t = threading.Thread(target=Run)
        t.daemon = True
        t.start()
        self.started.append(t)
        return t

    def JoinAll(self, timeout):
        stuck = []
        for t in self.started:
            t.join(timeout)
            if t.is_alive():
                stuck.append(t)
        self.started = stuck
        return stuck


def Collect():
    gc.collect()
    sys.exc_clear()
