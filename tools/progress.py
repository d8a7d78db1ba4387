"""Progress of a long run, on one line of stderr, redrawn in place.

Shown only when stderr is a terminal, so logs and pipes get nothing of it.
"""

import sys
import time


def _Duration(seconds):
    seconds = int(seconds)
    if seconds >= 3600:
        return '%dh%02dm' % (seconds // 3600, seconds % 3600 // 60)
    return '%dm%02ds' % (seconds // 60, seconds % 60) if seconds >= 60 else '%ds' % seconds


class Progress(object):
    """`with Progress(total, 'files') as progress: ... progress.Step(note='3 edits')`"""

    kInterval = 0.25  # seconds between redraws: drawing is not free on a slow terminal

    def __init__(self, total, unit='files', stream=None):
        self.stream = stream or sys.stderr
        isatty = getattr(self.stream, 'isatty', None)
        self.shown = bool(isatty and isatty())
        self.total, self.unit, self.done = total, unit, 0
        self.start = self._drawn = time.time()
        self._width = 0

    def Step(self, count=1, note=''):
        self.Show(self.done + count, note)

    def Show(self, done, note=''):
        self.done = done
        now = time.time()
        if not self.shown or (now - self._drawn < self.kInterval and self.done < self.total):
            return
        self._drawn = now
        elapsed = now - self.start
        line = '%d/%d %s%s, %s elapsed' % (self.done, self.total, self.unit,
                                           ', ' + note if note else '', _Duration(elapsed))
        if 0 < self.done < self.total:
            line += ', about %s left' % _Duration(elapsed * (self.total - self.done) / self.done)
        self._Draw(line)

    def _Draw(self, line):
        self.stream.write('\r' + line.ljust(self._width))
        self.stream.flush()
        self._width = len(line)

    def Close(self):
        if self.shown and self._width:
            self._Draw('')
            self.stream.write('\r')
            self.stream.flush()

    def __enter__(self):
        return self

    def __exit__(self, *exc_info):
        self.Close()
