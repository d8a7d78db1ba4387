"""Edit replay: realistic edits through CChangeFinder, each checked against a
fresh whole-file pass (tools/replay.py is its command line).

editor  the editor protocol: how the live list follows an edited text
makers  seeded edits; checks  the checks of one call; repro  reproducers;
cli     the run over many files and its command line.
"""

import toolpath

toolpath.setup()
