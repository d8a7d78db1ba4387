"""The call log and the outcome counts of one fuzzing process.

Every call into the module goes through Recorder.Call: the call is written to
the crash log (a file, unbuffered) before it is made, so a crash or a hang
leaves it behind for the supervisor; its outcome is counted by call kind."""

import os
import re

from pysource._fastaccess import LogicalLineType

kMaxRepr = 160


class Finding(Exception):
    """An oracle failed. `kind` names the oracle; `detail` says what was seen."""

    def __init__(self, kind, detail, script=None):
        Exception.__init__(self, '%s: %s' % (kind, detail))
        self.kind = kind
        self.detail = detail
        self.script = script


def Short(obj, lst=None):
    """A short, stable description: logicals by their place in `lst`."""
    if type(obj) is LogicalLineType:
        if lst is not None:
            for k, l in enumerate(lst):
                if l is obj:
                    return 'lst[%d]' % k
        return 'L(%r,%d,%d,%d)' % (list(obj.fTokens)[:3], obj.fLineno, obj.fIndent, obj.fKind)
    if isinstance(obj, list) and lst is not None and obj is lst:
        return 'lst'
    if isinstance(obj, (list, tuple)) and len(obj) <= 6:
        inner = ', '.join(Short(x, lst) for x in obj)
        return ('%s[%s]' if isinstance(obj, list) else '%s(%s,)') % (
            '' if type(obj) in (list, tuple) else type(obj).__name__, inner)
    if isinstance(obj, (list, tuple)):
        return '<%s of %d>' % (type(obj).__name__, len(obj))
    try:
        text = repr(obj)
    except BaseException as e:  # a hostile __repr__
        text = '<%s, repr raised %s>' % (type(obj).__name__, type(e).__name__)
    text = re.sub(r' at 0x[0-9a-f]+', '', text)   # addresses differ from run to run
    return text if len(text) <= kMaxRepr else text[:kMaxRepr] + '...'


class Recorder(object):

    def __init__(self, log_path=None):
        self.counts = {}          # kind -> {'returned': n, 'ExcType': n}
        self.lines = []
        self.fd = os.open(log_path, os.O_WRONLY | os.O_CREAT | os.O_TRUNC, 0o644) \
            if log_path else None
        self.calls = 0

    def Begin(self, header):
        self.lines = []
        if self.fd is not None:
            os.ftruncate(self.fd, 0)
            os.lseek(self.fd, 0, os.SEEK_SET)
        self.Note(header)

    def _Write(self, line):
        self.lines.append(line)
        if self.fd is not None:
            text = line + '\n'
            os.write(self.fd, text if isinstance(text, bytes) else text.encode('utf-8', 'backslashreplace'))

    def Note(self, text):
        self._Write('  # ' + text)

    def Count(self, kind, outcome):
        per = self.counts.setdefault(kind, {})
        per[outcome] = per.get(outcome, 0) + 1

    def Call(self, kind, text, func, *args, **kwargs):
        """(True, result) or (False, exception); KeyboardInterrupt passes."""
        return self.CallWith(kind, text, func, args, kwargs)

    def CallWith(self, kind, text, func, args, kwargs):
        """As Call; `kwargs` may hold keys that are not strings."""
        self.calls += 1
        self._Write('%s' % text)
        try:
            result = func(*args, **kwargs)
        except KeyboardInterrupt:
            raise
        except BaseException as e:
            name = type(e).__name__
            self.Count(kind, name)
            self._Write('    -> raised %s: %s' % (name, Short(str(e) if not isinstance(
                e, KeyError) else e.args)))
            return False, e
        self.Count(kind, 'returned')
        self._Write('    -> %s' % Short(result))
        return True, result

    def Tail(self, n=400):
        return self.lines[-n:]


def MergeCounts(into, counts):
    for kind, per in counts.items():
        mine = into.setdefault(kind, {})
        for outcome, n in per.items():
            mine[outcome] = mine.get(outcome, 0) + n


def FormatCounts(counts):
    out = []
    total = sum(n for per in counts.values() for n in per.values())
    out.append('calls: %d' % total)
    for kind in sorted(counts):
        per = counts[kind]
        ret = per.get('returned', 0)
        raised = ', '.join('%s %d' % (k, v) for k, v in sorted(per.items(), key=lambda kv: -kv[1])
                           if k != 'returned')
        out.append('  %-44s %7d returned%s' % (kind, ret, ('; raised: ' + raised) if raised else ''))
    return out
