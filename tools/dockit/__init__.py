"""A document that follows text edits, in Python, and the replay of random
text edits through a document (tools/doc_replay.py is its command line).

reference  CReferenceDocument: every edit re-reads the whole text
textedits  ranges and texts: how an edit turns one text into the next
makers     seeded text edits; checks  what one edit is held against;
repro      shrunk reproducers; cli  the run over many files.
"""

import toolpath

toolpath.setup()
