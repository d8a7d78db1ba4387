#!/usr/bin/env python2.7
"""Replays realistic edits through CChangeFinder and checks every result
against a fresh whole-file pass.

    replay.py [FILE ...] [--stdlib] [--sample N] [--seed S] [--edits N]
              [--edits-per-file N] [--batch-fraction F] [--no-cache-check]
              [--stop-on-failure] [--repro-dir DIR] [--max-repros N]
              [--trace] [--quiet] [--check-index]

Each file is edited as an editor would edit it (replaykit/editor.py), then
one FindChanges(added, removed) call is checked: every logical must have the
names a whole-file pass over a fresh read of the text gives, and a warm
CScopeBodyCache cleared of the returned changes must answer like a fresh one
(off with --no-cache-check).

A disagreement is printed with the first differing logicals, and a shrunken
reproducer is written to --repro-dir. The exit status is 1 when any edit
disagreed or raised.

--edits is the number of edits replayed on each file; --edits-per-file is
how many of them run before the document goes back to the file's original
text. Without FILE the bundled sample samples/outline_sample.py is used.
With --edits-per-file 0 one finder takes every edit of a file, so its
definition index lives across all of them; --check-index has the module
compare that index with the list after every call (SBC_CHECK_INDEX=1), a
difference being an error of that call.
"""

import os
import sys

if '--check-index' in sys.argv and os.environ.get('SBC_CHECK_INDEX') != '1':
    # The module reads the switch when it is imported.
    os.environ['SBC_CHECK_INDEX'] = '1'
    os.execv(sys.executable, [sys.executable] + sys.argv)

import toolpath  # noqa: E402
from replaykit.cli import main  # noqa: E402

if __name__ == '__main__':
    toolpath.RunMain(main)
