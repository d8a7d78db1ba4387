#!/usr/bin/env python2.7
"""Replays seeded text edits through a document and checks it after every call.

    doc_replay.py [FILE ...] [--files FILE ...] [--stdlib] [--sample N] [--seed S]
                  [--edits N] [--reset-every N] [--utf16-fraction F] [--reference]
                  [--self-check] [--no-cache-check] [--stop-on-failure]
                  [--repro-dir DIR] [--max-repros N] [--quiet]

The document is pysource.scopedocument.CScopeDocument, or with --reference
the one in Python that re-reads its whole text (dockit/reference.py), which
tests the replay itself. Each file's text is edited by seeded calls (Edit,
EditMany, SetText; typing, Enter and Backspace, pastes, blocks indented and
dedented, strings of every quote kind opened and closed, brackets,
backslashes, CR and CRLF, tabs and form feeds, the first two lines and the
end of the text, undo, UTF-16 columns), and after each call the document is
held against a fresh read of the text the replay keeps and a whole-file
pass (see dockit/checks.py). A disagreement is printed with a shrunk
reproducer (also written to --repro-dir); the exit status is 1 when any
call disagreed or raised.
"""

import toolpath
from dockit.cli import main

if __name__ == '__main__':
    toolpath.RunMain(main)
