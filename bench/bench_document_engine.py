"""The document's own costs, edit by edit: a typed character, Enter and
Backspace, a def line typed in, a 20-line paste, opening and closing a
triple quote near the top, creating a document, and what it holds per line.

Each figure is process CPU time per call, Python call included, median over
batches (10th-90th percentile in brackets). Edits are made at places spread
over the file and undone by the next edit, so that the text stays the same
size.

    scripts/python.sh bench/bench_document_engine.py [--lines 1000,10000,100000]
"""

import argparse
import sys

import benchkit
from benchkit import Clock, FormatSpread, Synthesise, TimeBatches

from pysource.scopedocument import CScopeDocument


def TextOfLines(lines):
    text = Synthesise(max(1, lines * 2 // 3))
    while text.count('\n') < lines:
        text += text
    cut = 0
    for _ in range(lines):
        cut = text.index('\n', cut) + 1
    return text[:cut]


def BodyPlaces(text, marker, count=64):
    """(line, column) just after `marker` on lines spread over the text."""
    lines = text.split('\n')
    found = [(n + 1, line.index(marker) + len(marker)) for n, line in enumerate(lines) if marker in line]
    step = max(1, len(found) // count)
    return found[::step][:count]


def Cycle(doc, places, do, undo, burst=10):
    """Edits at each place in turn, `burst` times (an editor's edits come in
    runs at one place), each undone at once."""
    state = {'k': 0}

    def Run(calls):
        k = state['k']
        for _ in range(calls // 2):
            line, col = places[(k // burst) % len(places)]
            do(doc, line, col)
            undo(doc, line, col)
            k += 1
        state['k'] = k
    return Run


def Typing(doc, text):
    places = BodyPlaces(text, 'result += ')
    return Cycle(doc, places, lambda d, l, c: d.Edit(l, c, l, c, 'x'), lambda d, l, c: d.Edit(l, c, l, c + 1, ''))


def EnterBackspace(doc, text):
    places = BodyPlaces(text, 'self._cache = None')
    return Cycle(doc, places, lambda d, l, c: d.Edit(l, c, l, c, '\n        '),
                 lambda d, l, c: d.Edit(l, c, l + 1, 8, ''))


def DefLine(doc, text):
    places = [(l, 0) for l, _ in BodyPlaces(text, '    def total(self):')]
    line = '    def added(self, k):\n'
    return Cycle(doc, places, lambda d, l, c: d.Edit(l, 0, l, 0, line), lambda d, l, c: d.Edit(l, 0, l + 1, 0, ''))


def Paste(doc, text):
    chunk = ''.join(l + '\n' for l in text.split('\n')[40:60])
    places = [(l, 0) for l, _ in BodyPlaces(text, 'def report')]
    return Cycle(doc, places, lambda d, l, c: d.Edit(l, 0, l, 0, chunk), lambda d, l, c: d.Edit(l, 0, l + 20, 0, ''))


def Cursors(doc, text, count=10):
    """A character typed at `count` places spread over the file in one call
    (bottom first, as an editor sends several cursors' edits), then taken out."""
    places = sorted(BodyPlaces(text, 'result += ', count), reverse=True)
    typed = [(l, c, l, c, 'x') for l, c in places]
    erased = [(l, c, l, c + 1, '') for l, c in places]

    def Run(calls):
        for _ in range(calls // 2):
            doc.EditMany(typed)
            doc.EditMany(erased)
    return Run


def Measure(label, run, calls, batches=15):
    samples = [s * 1e6 for s in TimeBatches(run, batches, calls)]
    print('  %-36s %s' % (label, FormatSpread(samples, ' us')))


def Main(argv):
    parser = argparse.ArgumentParser(description=__doc__.split('\n')[0])
    parser.add_argument('--lines', default='1000,10000,100000')
    args = parser.parse_args(argv)
    print('Python %d.%d' % sys.version_info[:2])
    for lines in [int(n) for n in args.lines.split(',')]:
        text = TextOfLines(lines)
        start = Clock()
        doc = CScopeDocument(text, 'bench.py')
        made = Clock() - start
        use = doc._MemoryUse()
        print('%d lines, %d logicals' % (doc.GetLineCount(), len(doc.GetLogicals())))
        print('  %-36s %.2f us per line' % ('creating (read + whole pass)', made * 1e6 / lines))
        print('  %-36s %.1f bytes per line (text %.1f)' % (
            'held besides the logicals: rows', float(use['rows']) / lines, float(use['text']) / lines))
        Measure('typing a character (or Backspace)', Typing(doc, text), 200)
        Measure('Enter, and Backspace joining lines', EnterBackspace(doc, text), 40 if lines > 20000 else 200)
        Measure('a def line typed in, and taken out', DefLine(doc, text), 40 if lines > 20000 else 200)
        Measure('a 20-line paste, and taken out', Paste(doc, text), 20 if lines > 20000 else 100)
        Measure('10 cursors typing (EditMany), per call', Cursors(doc, text), 40)
        if lines >= 10000:
            opened, closed = [], []
            for _ in range(5):
                start = Clock()
                r = doc.Edit(3, 0, 3, 0, '"""')
                opened.append((Clock() - start) * 1e3)
                assert not r.fReadable
                start = Clock()
                r = doc.Edit(3, 0, 3, 3, '')
                closed.append((Clock() - start) * 1e3)
                assert r.fReadable and not (r.fContentsChanges or r.fClassChanges or r.fFunctionChanges)
            print('  %-36s %s' % ('opening a """ at line 3', FormatSpread(opened, ' ms')))
            print('  %-36s %s (rows read again: %d)' % (
                'closing it again', FormatSpread(closed, ' ms'), doc.GetLastEditStats()['rows_scanned']))
        assert doc.GetText() == text
    return 0


if __name__ == '__main__':
    sys.exit(Main(sys.argv[1:]))
