"""Times edits through parso's diff parser; run by bench_document.py under an
interpreter that has parso (the system's python3).

    python3 parso_diff.py JOB.json

The job names a text file, its encoding, and edit streams: lists of
[label or null, [start line, start col, end line, end col, new text]], the
columns in characters of the decoded text. Each step's new text is parsed
with diff_cache=True on the same path, so parso reuses the tree of the
text before; the process CPU time of each labelled step's parse() is
collected. Prints one JSON object: label -> seconds per call, plus
'create' (the first parse of the text) and 'version'.
"""

import json
import sys
import time

import parso

kPath = '/nonexistent/bench_document_parso.py'


def ApplyRange(text, edit):
    start_line, start_col, end_line, end_col, new = edit
    lines = text.split('\n')
    middle = lines[start_line - 1][:start_col] + new + lines[end_line - 1][end_col:]
    return '\n'.join(lines[:start_line - 1] + [middle] + lines[end_line:])


def main(argv):
    with open(argv[1]) as f:
        job = json.load(f)
    with open(job['text'], 'rb') as f:
        text = f.read().decode(job['encoding'])
    grammar = parso.load_grammar()
    start = time.process_time()
    grammar.parse(text, diff_cache=True, path=kPath)
    out = {'create': [time.process_time() - start], 'version': parso.__version__}
    for stream in job['streams']:
        for label, edit in stream:
            text = ApplyRange(text, edit)
            start = time.process_time()
            grammar.parse(text, diff_cache=True, path=kPath)
            seconds = time.process_time() - start
            if label:
                out.setdefault(label, []).append(seconds)
    sys.stdout.write(json.dumps(out) + '\n')
    return 0


if __name__ == '__main__':
    sys.exit(main(sys.argv))
