"""The oracle behind CScopeDocument.SelfCheck: a fresh read of the document's
text and a whole-file pass by a new finder, compared with what the document
holds. Each function returns a list of readable differences (empty when
they agree)."""

from pysource.logicals import ReadLogicals
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache

_kShown = 5


def _Describe(logical):
    if logical is None:
        return 'nothing'
    return 'L%d kind %d indent %d %r' % (logical.fLineno, logical.fKind, logical.fIndent,
                                        ' '.join(logical.fTokens)[:60])


def _ErrorFields(exc):
    return (type(exc).__name__, getattr(exc, 'msg', None), getattr(exc, 'lineno', None),
            getattr(exc, 'offset', None), getattr(exc, 'text', None), getattr(exc, 'filename', None))


def _Fresh(text, filename):
    """(logicals, None) of a fresh read, or (None, the reader's SyntaxError)."""
    try:
        return ReadLogicals(text, filename), None
    except SyntaxError as exc:
        return None, exc


def CompareError(text, filename, error):
    """The document holds `error` for `text`: the reader must raise the same."""
    fresh, expected = _Fresh(text, filename)
    if expected is None:
        return ['the document says the text does not read (%s), but it reads into %d logicals'
                % (_ErrorFields(error), len(fresh))]
    if error is None or _ErrorFields(error) != _ErrorFields(expected):
        return ['the error differs: document %r, reader %r'
                % (error and _ErrorFields(error), _ErrorFields(expected))]
    return []


def CompareLogicals(text, filename, logicals):
    """The document's logicals of a readable `text` against a fresh read and
    a whole-file pass."""
    fresh, error = _Fresh(text, filename)
    if error is not None:
        return ['the document says the text reads, but the reader raises %r' % (_ErrorFields(error),)]
    problems = []
    if len(fresh) != len(logicals):
        problems.append('%d logicals, a fresh read has %d' % (len(logicals), len(fresh)))
    CChangeFinder(fresh).FindChanges(fresh, [])
    seen = set()
    for i, (mine, theirs) in enumerate(zip(logicals, fresh)):
        if id(mine) in seen:
            problems.append('[%d] the same logical object is in the list twice' % i)
        seen.add(id(mine))
        if (mine.fTokens, mine.fLineno, mine.fIndent, mine.fKind) != (
                theirs.fTokens, theirs.fLineno, theirs.fIndent, theirs.fKind):
            problems.append('[%d] %s, a fresh read has %s' % (i, _Describe(mine), _Describe(theirs)))
        elif (mine.fScopeName, mine.fLocalScopeName) != (theirs.fScopeName, theirs.fLocalScopeName):
            problems.append('[%d] %s is named %r, a whole-file pass names it %r' % (
                i, _Describe(mine), (mine.fScopeName, mine.fLocalScopeName),
                (theirs.fScopeName, theirs.fLocalScopeName)))
        if len(problems) > _kShown:
            break
    return problems


def _Answer(method, name):
    try:
        return True, method(name)
    except KeyError:
        return False, None


def _Same(a, b):
    if a[0] != b[0]:
        return False
    if isinstance(a[1], list) and isinstance(b[1], list):
        return len(a[1]) == len(b[1]) and all(x is y for x, y in zip(a[1], b[1]))
    return a[1] is b[1]


def CompareCache(cache, logicals):
    """Every answer the document's cache holds against a fresh cache over the
    same list."""
    fresh = CScopeBodyCache(logicals)
    problems = []
    names = set(cache._fScopeBodyCache) | set(cache._fScopeDefCache)
    for name in sorted(names):
        for method in ('GetScopeDef', 'GetBodyOfScope'):
            mine = _Answer(getattr(cache, method), name)
            theirs = _Answer(getattr(fresh, method), name)
            if not _Same(mine, theirs):
                problems.append('%s(%r) answers from the cache otherwise than a fresh cache' % (method, name))
        if len(problems) > _kShown:
            break
    return problems
