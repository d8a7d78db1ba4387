#!/usr/bin/env python2.7
"""Cost of one edit through a document, by file size, beside the pipelines
it replaces.

    bench_document.py [--sizes 1k,10k,100k] [--batches N] [--positions N]
                      [--no-reference] [--no-parso] [--no-memory]

Files: ftplib.py (~1k lines), decimal.py on 2.7 / _pydecimal.py on 3.x
(~6k), and standard library modules concatenated to ~100k lines, all of
the running interpreter. Edits, each made at many places of the file and
undone again (the undo is an edit of the same size):

  typed char   a character typed after the first name of a body line
               (and deleted), then the same at the next place;
  typing       ten characters typed there one by one, then deleted one
               by one (two at the slow pipelines): one cursor at work;
  Enter        Enter at the end of a body line (its indentation typed too);
  Backspace    Backspace at the start of a body line, joining it to the
               line above;
  def line     a method header typed in above a method;
  paste 20     20 lines (whole statements of the file) pasted in place;
  open/close   `\"\"\"` typed at the start of a top-level line near the top,
               which turns the rest of the file inside out (the reader
               then stops at the first line that does not read), then the
               closing `\"\"\"` typed right after it (then both removed);
  open/close ( the same with `(` and `)`: until the `)` the rest of the
               file is one statement, which fails only at the end.

Pipelines, side by side in one run:

  document     pysource.scopedocument.CScopeDocument, from Python: Edit()
               per call, streams of edits and undos timed as a whole
               (process CPU time per call, median over batches with the
               10th-90th percentile spread); open and close each timed;
  whole text   CReferenceDocument (tools/dockit/reference.py): the whole
               text read again with ReadLogicals' reader written in Python,
               the list kept by common prefix and suffix, one FindChanges,
               as callers do today; fewer places at 100k (about a second
               per edit); and the same with ReadLogicals' native reader
               (pysource._reader) where it is built;
  parso        parso's diff parser (parse with diff_cache) under the
               system's /usr/bin/python3, in a child process, on the same
               text and edits; skipped where parso is missing.

Then creating a document (per line) and the memory a document keeps beyond
its logicals, in bytes per line: the RSS a child process gains by making
the document, less the RSS another child gains by reading the same text
into named logicals (freed memory handed back with malloc_trim before each
reading; copies of the smaller files held at once, ~100k lines in all, and
three of the largest).
The text the document keeps is shown apart. Targets are printed
beside the figures.
"""

from __future__ import print_function

import argparse
import gc
import json
import os
import random
import subprocess
import sys
import tempfile

import benchkit
from benchkit import CChangeFinder, Clock, FormatSpread, ReadLogicals, Spread

import toolpath
from dockit.reference import CNativeReadDocument, CReferenceDocument, ReferenceRead

try:
    from pysource.scopedocument import CScopeDocument
except ImportError:
    CScopeDocument = None

kPy2 = sys.version_info[0] == 2
kParsoPython = '/usr/bin/python3'
kHere = os.path.dirname(os.path.abspath(__file__))
kKinds = ('typed char', 'typing', 'Enter', 'Backspace', 'def line', 'paste 20', 'open """', 'close """',
          'open (', 'close )')
# Kinds timed call by call (each takes long enough for the clock); the
# closing ones are made by the stream of the opening one.
kEachTimed = ('open """', 'close """', 'open (', 'close )')
kClosing = ('close """', 'close )')

# (kind, size label) -> target text; a size of None: every size.
kTargets = {
    ('typed char', None): '<= 5 us', ('typing', None): '<= 5 us',
    ('Enter', '10k'): '<= 30 us', ('Enter', '100k'): '<= 250 us',
    ('Backspace', '10k'): '<= 30 us', ('Backspace', '100k'): '<= 250 us',
    ('def line', '10k'): '<= 30 us', ('def line', '100k'): '<= 250 us',
    ('paste 20', '10k'): '<= 50 us',
    ('open """', '100k'): '<= 5 ms',
    ('create', None): '<= 1 us/line',
    ('memory', None): '<= 16 B/line',
}


# --- Files ------------------------------------------------------------------------

def StdlibPath(name):
    return os.path.join(toolpath.StdlibDir(), name)


def Concatenated(lines_wanted):
    """Top-level standard library modules, each readable alone, joined until
    they hold `lines_wanted` lines."""
    def Readable():
        for name in sorted(os.listdir(toolpath.StdlibDir())):
            if not name.endswith('.py'):
                continue
            try:
                text = toolpath.ReadSource(StdlibPath(name))
                ReadLogicals(text)
            except (SyntaxError, ValueError, IOError):
                continue
            yield text
    return benchkit.JoinLines(Readable(), lines_wanted)


def Files(sizes):
    out = []
    for size in sizes:
        if size == '1k':
            out.append((size, 'ftplib.py', toolpath.ReadSource(StdlibPath('ftplib.py'))))
        elif size == '10k':
            name = 'decimal.py' if kPy2 else '_pydecimal.py'
            out.append((size, name, toolpath.ReadSource(StdlibPath(name))))
        elif size == '100k':
            out.append((size, 'stdlib modules joined', Concatenated(100000)))
        else:
            raise SystemExit('unknown size %r (1k, 10k or 100k)' % size)
    return out


# --- Edit streams -------------------------------------------------------------------
# A stream is a list of (label or None, (start line, start col, end line,
# end col, text)); it leaves the text as it found it. Columns are in
# characters of the text (bytes on 2.7).

class Places(object):
    """Where the edits go, from one named reading of the text."""

    def __init__(self, text):
        self.lines = text.split('\n')
        lst = ReadLogicals(text)
        CChangeFinder(lst).FindChanges(lst, [])
        self.logicals = lst
        nexts = [l.fLineno for l in lst[1:]] + [len(self.lines) + 1]
        self.single = [(l, n) for l, n in zip(lst, nexts)]

    def Body(self):
        """Logicals of one line in a def's body, each followed by another."""
        out = []
        for (l, n), (m, _) in zip(self.single, self.single[1:]):
            line = self.lines[l.fLineno - 1]
            if (l.fKind == 0 and l.fIndent >= 8 and n == l.fLineno + 1 and m.fKind == 0 and
                    m.fIndent == l.fIndent and m.fLineno == n and l.fScopeName and
                    l.fTokens[0][:1].isalpha() and '\t' not in line and
                    not line.rstrip().endswith(('\\', ':'))):
                out.append(l)
        return out

    def Methods(self):
        return [l for l in self.logicals if l.fKind == 2 and l.fIndent == 4 and
                '\t' not in self.lines[l.fLineno - 1]]

    def Pastes(self):
        """First lines of 20-line runs of whole statements that stay inside
        the indentation of their first line."""
        starts = set(l.fLineno for l in self.logicals)
        out = []
        for i, l in enumerate(self.logicals):
            if l.fKind not in (0, 1, 2) or l.fIndent == 0 or l.fLineno + 20 not in starts:
                continue
            inside = True
            for m in self.logicals[i:]:
                if m.fLineno >= l.fLineno + 20:
                    break
                if m.fKind in (0, 1, 2) and m.fIndent < l.fIndent:
                    inside = False
                    break
            if inside and not any('\t' in self.lines[k] for k in range(l.fLineno - 1, l.fLineno + 19)):
                out.append(l)
        return out

    def TopLine(self):
        for l, n in self.single:
            if l.fLineno >= 5 and l.fKind == 0 and l.fIndent == 0 and n == l.fLineno + 1:
                return l.fLineno
        raise SystemExit('no top-level statement near the top')


def Spread_(items, count, rng):
    if len(items) <= count:
        return list(items)
    step = len(items) / float(count)
    return [items[int(k * step + rng.random() * step)] for k in range(count)]


def Stream(kind, places, count, rng, run=10):
    lines = places.lines
    out = []
    if kind == 'typing':
        for l in Spread_(places.Body(), count, rng):
            col = l.fIndent + len(l.fTokens[0])
            out += [(kind, (l.fLineno, col + k, l.fLineno, col + k, 'x')) for k in range(run)]
            out += [(kind, (l.fLineno, col + k - 1, l.fLineno, col + k, ''))
                    for k in range(run, 0, -1)]
    elif kind == 'typed char':
        for l in Spread_(places.Body(), count, rng):
            col = l.fIndent + len(l.fTokens[0])
            out += [(kind, (l.fLineno, col, l.fLineno, col, 'x')),
                    (kind, (l.fLineno, col, l.fLineno, col + 1, ''))]
    elif kind == 'Enter':
        for l in Spread_(places.Body(), count, rng):
            n, end = l.fLineno, len(lines[l.fLineno - 1])
            out += [(kind, (n, end, n, end, '\n' + ' ' * l.fIndent)),
                    (kind, (n, end, n + 1, l.fIndent, ''))]
    elif kind == 'Backspace':
        for l in Spread_(places.Body(), count, rng):
            n, end = l.fLineno, len(lines[l.fLineno - 1])
            out += [(kind, (n, end, n + 1, 0, '')), (kind, (n, end, n, end, '\n'))]
    elif kind == 'def line':
        for l in Spread_(places.Methods(), count, rng):
            n = l.fLineno
            out += [(kind, (n, 0, n, 0, '    def added_in_bench(self, item):\n')),
                    (kind, (n, 0, n + 1, 0, ''))]
    elif kind == 'paste 20':
        for l in Spread_(places.Pastes(), count, rng):
            n = l.fLineno
            block = '\n'.join(lines[n - 1:n + 19]) + '\n'
            out += [(kind, (n, 0, n, 0, block)), (kind, (n, 0, n + 20, 0, ''))]
    elif kind == 'open """':
        n = places.TopLine()
        for _ in range(count):
            out += [('open """', (n, 0, n, 0, '"""')), ('close """', (n, 3, n, 3, '"""')),
                    (None, (n, 0, n, 6, ''))]
    elif kind == 'open (':
        n = places.TopLine()
        for _ in range(count):
            out += [('open (', (n, 0, n, 0, '(')), ('close )', (n, 1, n, 1, ')')),
                    (None, (n, 0, n, 2, ''))]
    return out


# --- Timing ---------------------------------------------------------------------

def TimeStreams(doc, stream, batches, each):
    """(label, per-call CPU seconds) pairs: one per batch (the stream timed
    whole), or with `each` one per labelled call."""
    edit = doc.Edit
    figures = []
    for _ in range(batches):
        gc.collect()
        if each:
            for label, args in stream:
                start = Clock()
                result = edit(*args)
                seconds = Clock() - start
                if label:
                    figures.append((label, seconds))
                CheckReadable(result, label)
        else:
            start = Clock()
            for _, args in stream:
                edit(*args)
            figures.append((stream[0][0], (Clock() - start) / len(stream)))
    return figures


def CheckReadable(result, label):
    if not result.fReadable and label not in ('open """', 'open ('):
        raise SystemExit('the benchmark\'s edit %s left text that does not read: %r' % (
            label, result.fError))


def BenchDocument(document_class, text, streams, batches, each_always):
    created = []
    for _ in range(batches if not each_always else 1):
        gc.collect()
        start = Clock()
        doc = document_class(text)
        created.append((Clock() - start) / (text.count('\n') + 1))
        del doc
    doc = document_class(text)
    rows = {'create': created}
    for kind in kKinds:
        stream = streams[kind]
        if not stream:
            continue
        each = each_always or kind in kEachTimed
        TimeStreams(doc, stream, 1, True)  # warm up, and every edit reads
        for label, seconds in TimeStreams(doc, stream, 1 if each_always else batches, each):
            rows.setdefault(label, []).append(seconds)
    if doc.GetText() != text:
        raise SystemExit('the edit streams did not put the text back')
    doc.SelfCheck()
    return rows


def BenchParso(text, streams_by_kind):
    """Figures of parso's diff parser, or a reason it has none."""
    if not os.path.exists(kParsoPython):
        return 'no %s' % kParsoPython
    check = subprocess.Popen([kParsoPython, '-c', 'import parso'], stdout=subprocess.PIPE,
                             stderr=subprocess.PIPE)
    check.communicate()
    if check.returncode:
        return 'parso cannot be imported by %s' % kParsoPython
    handle, text_path = tempfile.mkstemp(suffix='.py')
    with os.fdopen(handle, 'wb') as f:
        f.write(text if kPy2 else text.encode('utf-8'))
    streams = []
    for kind in kKinds:
        streams.append([(label, list(args)) for label, args in streams_by_kind[kind]])
    job = dict(text=text_path, encoding='latin-1' if kPy2 else 'utf-8', streams=streams)
    handle, job_path = tempfile.mkstemp(suffix='.json')
    with os.fdopen(handle, 'w') as f:
        json.dump(job, f)
    try:
        proc = subprocess.Popen([kParsoPython, os.path.join(kHere, 'parso_diff.py'), job_path],
                                stdout=subprocess.PIPE, stderr=subprocess.PIPE)
        out, err = proc.communicate()
    finally:
        os.remove(text_path)
        os.remove(job_path)
    if proc.returncode:
        return 'the parso child failed: %s' % err.decode('utf-8', 'replace').strip()[-300:]
    figures = json.loads(out.decode('utf-8'))
    figures['create'] = [v / (text.count('\n') + 1) for v in figures['create']]
    return figures


# --- Memory ------------------------------------------------------------------------

kMemoryChild = r'''
import ctypes, gc, sys
sys.path[:0] = %(path)r
import toolpath
toolpath.setup()
from pysource.logicals import ReadLogicals
from pysource.scopebodycache import CChangeFinder
libc = ctypes.CDLL(None)
def Rss():
    gc.collect()
    libc.malloc_trim(0)
    with open('/proc/self/statm') as f:
        return int(f.read().split()[1]) * 4096
with open(%(text)r, 'rb') as f:
    text = f.read()
if sys.version_info[0] > 2:
    text = text.decode('utf-8')
kind = %(kind)r
if kind == 'document':
    from pysource.scopedocument import CScopeDocument as Make
elif kind == 'reference':
    from dockit.reference import CReferenceDocument as Make
else:
    def Make(text):
        lst = ReadLogicals(text)
        finder = CChangeFinder(lst)
        finder.FindChanges(lst, [])
        return (lst, finder) if kind == 'finder' else lst
Make(text)
before = Rss()
held = [Make(text) for _ in range(%(copies)d)]
print(Rss() - before)
'''


def CharWidth(text):
    """Bytes per character of the text as the interpreter holds it."""
    if kPy2 or not text:
        return 1
    top = max(map(ord, text))
    return 1 if top < 0x100 else 2 if top < 0x10000 else 4


def MemoryPerLine(text, kinds):
    # Many copies of a small file, so that the pools' slack is small beside
    # them; of a large one three, so that one process's own growth is too.
    copies = max(3, 100000 // (text.count('\n') + 1))
    handle, text_path = tempfile.mkstemp(suffix='.py')
    with os.fdopen(handle, 'wb') as f:
        f.write(text if kPy2 else text.encode('utf-8'))
    grown = {}
    try:
        for kind in kinds:
            code = kMemoryChild % dict(path=[os.path.join(toolpath.kRepoDir, 'tools')] + sys.path,
                                       text=text_path, kind=kind, copies=copies)
            proc = subprocess.Popen([sys.executable, '-c', code], stdout=subprocess.PIPE)
            out = proc.communicate()[0]
            grown[kind] = int(out.split()[-1]) / float(copies) if proc.returncode == 0 else None
    finally:
        os.remove(text_path)
    return grown


# --- Report ----------------------------------------------------------------------

def Cell(values, unit):
    if isinstance(values, str):
        return values
    if not values:
        return '-'
    scale, name = {'us': (1e6, 'us'), 'ms': (1e3, 'ms')}[unit]
    values = [v * scale for v in values]
    median, low, high = Spread(values)
    digits = 2 if median < 10 else 1 if median < 100 else 0
    if len(values) < 3:
        return '%.*f %s (n=%d)' % (digits, median, name, len(values))
    return '%.*f %s [%.*f-%.*f]' % (digits, median, name, digits, low, digits, high)


def Target(kind, sizes):
    found = [(s, kTargets[kind, s]) for s in [None] + sizes if (kind, s) in kTargets]
    if not found:
        return ''
    if found[0][0] is None:
        return found[0][1] + ' at every size'
    return ', '.join('%s at %s' % (t, s) for s, t in found)


def PrintTable(title, unit, sizes, rows, files, show_targets):
    print('\n' + title)
    heads = ['%s (%s lines)' % (s, format(files[s], ',')) for s in sizes]
    print('  %-12s' % 'edit' + ''.join('%-28s' % h for h in heads) + ('target' if show_targets else ''))
    for kind in kKinds + ('create',):
        cells = []
        for s in sizes:
            value = rows.get(s, {})
            value = value.get(kind) if isinstance(value, dict) else value
            cells.append(Cell(value, 'us' if kind == 'create' else unit) if value is not None else '-')
        print('  %-12s' % (kind if kind != 'create' else 'create/line') +
              ''.join('%-28s' % c for c in cells) + (Target(kind, sizes) if show_targets else ''))


def main(argv=None):
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument('--sizes', default='1k,10k,100k')
    parser.add_argument('--batches', type=int, default=15, help='batches of each stream (document)')
    parser.add_argument('--positions', type=int, default=40, help='places per edit (document)')
    parser.add_argument('--no-reference', dest='reference', action='store_false')
    parser.add_argument('--no-parso', dest='parso', action='store_false')
    parser.add_argument('--no-memory', dest='memory', action='store_false')
    args = parser.parse_args(argv)
    sizes = args.sizes.split(',')
    rng = random.Random(1)
    files = Files(sizes)
    line_counts = dict((s, t.count('\n') + 1) for s, _, t in files)
    native, reference, native_read, parso, memory = {}, {}, {}, {}, {}
    # ReadLogicals reads natively by default where it has a reference reader beside.
    has_native_reader = ReferenceRead is not ReadLogicals
    for size, name, text in files:
        sys.stderr.write('%s: %s, %d lines\n' % (size, name, line_counts[size]))
        places = Places(text)
        # Fewer places where every edit reads the whole text again.
        slow = {'1k': 6, '10k': 3, '100k': 2}.get(size, 2)
        if CScopeDocument is not None:
            streams = dict((k, Stream(k, places, args.positions if k not in kEachTimed else 10, rng))
                           for k in kKinds if k not in kClosing)
            streams.update((k, []) for k in kClosing)
            native[size] = BenchDocument(CScopeDocument, text, streams, args.batches, False)
        streams = dict((k, Stream(k, places, slow, rng, run=2)) for k in kKinds if k not in kClosing)
        streams.update((k, []) for k in kClosing)
        if args.reference:
            reference[size] = BenchDocument(CReferenceDocument, text, streams, 1, True)
            if has_native_reader:
                native_read[size] = BenchDocument(CNativeReadDocument, text, streams, 1, True)
        if args.parso:
            parso[size] = BenchParso(text, streams)
        if args.memory:
            memory[size] = MemoryPerLine(text, ['logicals', 'finder', 'reference'] +
                                         (['document'] if CScopeDocument is not None else []))

    print('Edits through a document, process CPU time per call, median [10th-90th percentile]')
    print('Python %d.%d; files: %s' % (sys.version_info[:2] + (', '.join(
        '%s %s' % (s, n) for s, n, _ in files),)))
    if CScopeDocument is not None:
        PrintTable('CScopeDocument (%d places per edit, %d batches; the opening and closing ones 10 times, '
                   'each call timed):' % (args.positions, args.batches), 'us', sizes, native,
                   line_counts, True)
    else:
        print('\nCScopeDocument: pysource.scopedocument is not built')
    if args.reference:
        PrintTable('Whole text read again by the reader in Python (CReferenceDocument), each '
                   'call timed:', 'ms', sizes, reference, line_counts, False)
        if has_native_reader:
            PrintTable('Whole text read again by the native reader (the same pipeline), each call '
                       'timed:', 'ms', sizes, native_read, line_counts, False)
    if args.parso:
        if all(isinstance(v, dict) for v in parso.values()):
            version = list(parso.values())[0].get('version', '?')
            PrintTable('parso %s diff parser (%s, a child process; its error recovery reads the '
                       'unreadable texts too), each call timed:' % (version, kParsoPython), 'ms',
                       sizes, parso, line_counts, False)
        else:
            print('\nparso: ' + '; '.join('%s: %s' % (s, v) for s, v in sorted(parso.items())
                                          if not isinstance(v, dict)))
    if args.memory:
        print('\nMemory beyond the named logicals, bytes per line (RSS a child gains holding ~100k '
              'lines of documents, less the RSS a child gains holding their logicals alone; target '
              '%s):' % kTargets['memory', None])
        for size, _, text in files:
            grown = memory[size]
            lines = float(line_counts[size])
            width = CharWidth(text)
            parts = ['logicals alone %.0f' % (grown['logicals'] / lines),
                     'a finder kept beside them %.1f' % ((grown['finder'] - grown['logicals']) / lines)]
            for kind in ('document', 'reference'):
                if grown.get(kind) is not None:
                    beyond = (grown[kind] - grown['logicals']) / lines
                    parts.append('%s %.1f (%.1f without its text of %.1f)' % (
                        kind, beyond, beyond - len(text) * width / lines, len(text) * width / lines))
            print('  %-5s %s' % (size, ', '.join(parts)))
    return 0


if __name__ == '__main__':
    sys.exit(main())
