#!/usr/bin/env python2.7
"""Replays realistic edits through CChangeFinder and checks every result
against a fresh whole-file pass.

    replay.py [FILE ...] [--stdlib] [--sample N] [--seed S] [--edits N]
              [--edits-per-file N] [--batch-fraction F] [--no-cache-check]
              [--stop-on-failure] [--repro-dir DIR] [--max-repros N]
              [--trace] [--quiet]

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
"""

import toolpath
from replaykit.cli import main

if __name__ == '__main__':
    toolpath.RunMain(main)
