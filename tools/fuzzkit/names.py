"""What the oracles compare and the reproducers print: names of logicals, the
scopes of a list, and self-contained scripts of a call."""

from pysource.scopebodycache import CChangeFinder, GetFullNameForScopeDef

from fuzzkit import hostile, texts

kRecursion = 'FindChanges cannot be called recursively'


def Names(l):
    return (l.fScopeName, l.fLocalScopeName)


def FreshNames(text):
    fresh = texts.Read(text)
    CChangeFinder(fresh).FindChanges(fresh, [])
    return fresh


def ScopeNames(lst):
    names, seen = [''], set([''])
    for l in lst:
        if type(l) is hostile.LogicalLineType and l.fKind in (1, 2) and l.fLocalScopeName is not None and l.fScopeName is not None:
            try:
                name = GetFullNameForScopeDef(l)
            except Exception:
                continue
            if name not in seen:
                seen.add(name)
                names.append(name)
    return names


def _Ask(method, name):
    try:
        return ('ok', method(name))
    except KeyError:
        return ('KeyError', None)
    except Exception as e:
        return (type(e).__name__, str(e))


def _Same(a, b):
    if a[0] != b[0]:
        return False
    if a[0] != 'ok':
        return a[0] == 'KeyError' or a == b
    x, y = a[1], b[1]
    if isinstance(x, list) and isinstance(y, list):
        return len(x) == len(y) and all(p is q for p, q in zip(x, y))
    return x is y


def NameScript(before, removed, added_at, text_after, call):
    """A self-contained script: the list right before the call, the call, and
    the comparison with a whole-list pass over fresh logicals."""
    def Lit(rows):
        return '[\n' + ''.join('    Mk(%r, %d, %d, %d, %r, %r),\n' % r for r in rows) + ']'
    return '''\
# FindChanges leaves names that differ from a whole-list pass of the same text.
from pysource._fastaccess import LogicalLineType as L
from pysource.scopebodycache import CChangeFinder

try:
    long
except NameError:  # 3.x
    long = int


def Mk(tokens, lineno, indent, kind, scope, local):
    l = L(list(tokens), lineno, indent, kind)
    l.fScopeName, l.fLocalScopeName = scope, local
    return l

lst = %s
removed = %s
added = [lst[k] for k in %r]
print(CChangeFinder(lst).%s)
fresh = [L(list(l.fTokens), l.fLineno, l.fIndent, l.fKind) for l in lst]
CChangeFinder(fresh).FindChanges(fresh, [])
bad = [(k, (a.fScopeName, a.fLocalScopeName), (b.fScopeName, b.fLocalScopeName))
       for k, (a, b) in enumerate(zip(lst, fresh))
       if (a.fScopeName, a.fLocalScopeName) != (b.fScopeName, b.fLocalScopeName)]
for k, got, want in bad:
    print('lst[%%d]: got %%r, whole pass gives %%r' %% (k, got, want))
raise SystemExit(1 if bad else 0)
''' % (Lit(before), Lit(removed), added_at, call)


def Rows(logicals):
    return [(tuple(l.fTokens), l.fLineno, l.fIndent, l.fKind, l.fScopeName, l.fLocalScopeName)
            for l in logicals]
