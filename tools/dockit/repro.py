"""Reproducers of a failing call: the calls since the document was made,
shrunk (fewer calls first, then lines of the starting text that no call
touches), written as a short script that replays them through the same
helpers."""

from __future__ import print_function

import os
import sys

from dockit.checks import Problems, Session
from dockit.textedits import Op

kToolsDir = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
kDefaultReproDir = '/tmp/doc-replay-repros'


def DocumentClass(name):
    if name == 'reference':
        from dockit.reference import CReferenceDocument
        return CReferenceDocument
    from pysource.scopedocument import CScopeDocument
    return CScopeDocument


def RunOps(document_class, start_text, ops, filename='<string>', self_check=False,
           cache_check=True, ignore=()):
    """(index of the failing call, -1 for the creation, Problems), or None
    when every call agrees."""
    try:
        session = Session(document_class, start_text, filename, self_check, cache_check, ignore)
    except Exception:
        import traceback
        problems = Problems()
        problems.Add('exception', 'creating the document raised:\n' + traceback.format_exc())
        return -1, problems
    if session.problems.found:
        return -1, session.problems
    for k, op in enumerate(ops):
        problems = session.Step(op)
        if problems.found:
            return k, problems
    return None


def _DropLine(text, ops, j):
    """`text` without its 0-based line j (not the last) and `ops` moved to
    match, or None when a call touches that line."""
    lines = text.split('\n')
    if j >= len(lines) - 1:
        return None
    at = j + 1
    moved = []
    for op in ops:
        ranges = []
        for start_line, start_col, end_line, end_col, new in op.ranges:
            if start_line <= at <= end_line:
                return None
            if at < start_line:
                ranges.append((start_line - 1, start_col, end_line - 1, end_col, new))
            else:
                ranges.append((start_line, start_col, end_line, end_col, new))
                at += new.count('\n') - (end_line - start_line)
        moved.append(Op(op.method, ranges, op.utf16, op.kind))
    return '\n'.join(lines[:j] + lines[j + 1:]), moved


def Shrink(document_class, history, invariant, filename='<string>', self_check=False,
           cache_check=True, ignore=(), max_attempts=250):
    """A smaller (start text, ops) that still fails with `invariant`, from
    `history`: the (text before, op) of each call up to the failing one."""
    attempts = [0]

    def Fails(text, ops):
        if attempts[0] >= max_attempts:
            return None
        attempts[0] += 1
        got = RunOps(document_class, text, ops, filename, self_check, cache_check, ignore)
        if got is None or got[1].invariant != invariant:
            return None
        return ops[:got[0] + 1]

    n = len(history) - 1
    start, ops = history[0][0], [op for _, op in history]
    for k in sorted(set([n, n - 1, n - 2, n - 4, n - 8, n - 16, 0]), reverse=True):
        if k < 0:
            continue
        got = Fails(history[k][0], [op for _, op in history[k:]])
        if got is not None:
            start, ops = history[k][0], got
            break

    size = max(1, start.count('\n') // 2)
    while size >= 1 and attempts[0] < max_attempts:
        j, progress = 0, False
        while j < start.count('\n') and attempts[0] < max_attempts:
            cut = (start, ops)
            for _ in range(size):
                cut = _DropLine(cut[0], cut[1], j) if cut is not None else None
            got = Fails(*cut) if cut is not None else None
            if got is not None:
                start, ops, progress = cut[0], got, True
            else:
                j += size
        if not progress:
            size //= 2
    return start, ops, attempts[0]


def _TextLiteral(name, text, indent='    '):
    lines = text.splitlines(True)
    if not lines:
        return '%s = %r\n' % (name, text)
    return '%s = (\n%s)\n' % (name, ''.join('%s%r\n' % (indent, l) for l in lines))


_kTemplate = '''\
# Reproducer written by tools/doc_replay.py: %(title)s
# %(where)s
# Run: python%(version)s %(path)s
# Exit status: 0 agrees, 1 disagrees.
import sys

sys.path.insert(0, %(tools)r)
from dockit.textedits import Op  # noqa: E402
from dockit.repro import Reproduce  # noqa: E402

%(start)s
# Calls on a document made from START, in order.
OPS = [
%(ops)s]

if __name__ == '__main__':
    sys.exit(Reproduce(START, OPS, %(document)r, self_check=%(self_check)r, ignore=%(ignore)r))
'''


def FormatReproducer(start, ops, title, where, path, document, self_check, ignore=()):
    return _kTemplate % dict(
        title=title, where=where, path=path, tools=kToolsDir, document=document,
        version='%d.%d' % sys.version_info[:2], start=_TextLiteral('START', start),
        ops=''.join('    %r,\n' % op for op in ops), self_check=bool(self_check),
        ignore=sorted(ignore))


def Reproduce(start, ops, document='native', self_check=False, ignore=()):
    """A reproducer's body: replays the calls and prints what disagrees;
    returns its exit status."""
    got = RunOps(DocumentClass(document), start, ops, self_check=self_check, ignore=ignore)
    if got is None:
        print('no disagreements')
        return 0
    k, problems = got
    print('call %d of %d (%s):' % (k + 1, len(ops), ops[k].Describe() if k >= 0 else 'creation'))
    for line in problems.Lines(limit=20):
        print('  ' + line)
    return 1


def WriteReproducer(repro_dir, stem, document_class, document, history, invariant, where,
                    filename='<string>', self_check=False, cache_check=True, ignore=()):
    """Shrinks the failing calls and writes a reproducer. Returns (path,
    its text, a note)."""
    start, ops, attempts = Shrink(document_class, history, invariant, filename, self_check,
                                  cache_check, ignore)
    note = 'shrunk in %d tries to %d calls on %d lines' % (attempts, len(ops),
                                                           start.count('\n') + 1)
    if not os.path.isdir(repro_dir):
        os.makedirs(repro_dir)
    path = os.path.join(repro_dir, stem + '.py')
    title = '%s: %s' % (', '.join(op.Describe() for op in ops[-3:]), invariant)
    text = FormatReproducer(start, ops, title, where, path, document, self_check, ignore)
    with open(path, 'w') as f:
        f.write(text)
    return path, text, note
