#!/usr/bin/env python
"""Compares the whole-file names of the 2.7 build with those of a 3.x build.

    names_parity.py --python3 PATH [ROOT] [--show K]
    names_parity.py --dump [ROOT]

Run under 2.7 (scripts/python.sh) with the interpreter of a 3.x build
(scripts/build.sh --python PATH): each interpreter reads every .py file
under ROOT (default: the 2.7 standard library) into logicals, makes a
whole-file pass and writes, per file, every logical's (fScopeName,
fLocalScopeName) and the three change sets as a JSON line (--dump). The
files both read are compared name by name; a file only one of them reads
(3.x refuses bytes its declared coding cannot decode) is counted apart.
Exits 1 when any file read by both differs.
"""

import argparse
import json
import os
import subprocess
import sys

import toolpath
from progress import Progress

toolpath.setup()

from pysource.logicals import ReadLogicalsFromFile  # noqa: E402
from pysource.scopebodycache import CChangeFinder  # noqa: E402

kPy2 = sys.version_info[0] == 2


def _Text(name):
    """A name as JSON holds it: 2.7's bytes read as UTF-8 (never failing)."""
    if name is None or not kPy2:
        return name
    return name.decode('utf-8', 'replace')


def Record(path):
    """The JSON-ready names of the file at `path`, or why it was not read."""
    try:
        lst = ReadLogicalsFromFile(path)
    except (SyntaxError, IOError, ValueError) as exc:
        return {'unread': '%s: %s' % (type(exc).__name__, exc)}
    changes = CChangeFinder(lst).FindChanges(lst, [])
    return {'names': [[_Text(l.fScopeName), _Text(l.fLocalScopeName)] for l in lst],
            'changes': [sorted(_Text(n) for n in s) for s in changes]}


def Dump(root):
    for path in toolpath.StdlibFiles(root):
        record = Record(path)
        record['path'] = os.path.relpath(path, root)
        sys.stdout.write(json.dumps(record, sort_keys=True) + '\n')
    sys.stdout.flush()
    return 0


def _Dumper(python, root):
    """A child dumping `root` under `python`, with the build that
    scripts/build.sh made for that interpreter first on its path."""
    version = subprocess.check_output(
        [python, '-c', 'import sys; print("%d.%d" % sys.version_info[:2])']).decode('ascii').strip()
    build = 'build' if version == '2.7' else 'build-py' + version
    env = dict(os.environ, PYTHONPATH=os.path.join(toolpath.kRepoDir, build, 'python'))
    return subprocess.Popen([python, os.path.abspath(__file__), '--dump', root], env=env,
                            stdout=subprocess.PIPE)


def Compare(python3, root, show):
    workers = [_Dumper(sys.executable, root), _Dumper(python3, root)]
    totals = {'files': 0, 'both': 0, 'only27': 0, 'only3': 0, 'neither': 0, 'logicals': 0,
              'differ': 0}
    shown = []
    progress = Progress(len(toolpath.StdlibFiles(root)))
    while True:
        lines = [w.stdout.readline() for w in workers]
        if not all(lines):
            break
        r27, r3 = [json.loads(line.decode('utf-8')) for line in lines]
        assert r27['path'] == r3['path'], (r27['path'], r3['path'])
        progress.Show(totals['files'])
        totals['files'] += 1
        unread = ('unread' in r27, 'unread' in r3)
        if unread != (False, False):
            totals[{(True, True): 'neither', (True, False): 'only3', (False, True): 'only27'}[unread]] += 1
            if unread == (False, True) and len(shown) < show:
                shown.append('%s: read by 2.7 only (%s)' % (r27['path'], r3['unread']))
            continue
        totals['both'] += 1
        totals['logicals'] += len(r27['names'])
        if (r27['names'], r27['changes']) != (r3['names'], r3['changes']):
            totals['differ'] += 1
            if len(shown) < show:
                shown.append('%s: %s' % (r27['path'], _FirstDifference(r27, r3)))
    progress.Close()
    for w in workers:
        w.stdout.close()
        w.wait()
    for line in shown:
        print(line)
    print('files: %(files)d; read by both: %(both)d (%(logicals)d logicals); by 2.7 only: %(only27)d; '
          'by 3.x only: %(only3)d; by neither: %(neither)d' % totals)
    print('files whose names differ: %d' % totals['differ'])
    return 1 if totals['differ'] else 0


def _FirstDifference(r27, r3):
    if len(r27['names']) != len(r3['names']):
        return '%d logicals on 2.7, %d on 3.x' % (len(r27['names']), len(r3['names']))
    for k, (a, b) in enumerate(zip(r27['names'], r3['names'])):
        if a != b:
            return 'logical %d: %r on 2.7, %r on 3.x' % (k, a, b)
    return 'change sets %r on 2.7, %r on 3.x' % (r27['changes'], r3['changes'])


def main(argv=None):
    p = argparse.ArgumentParser(description=__doc__.split('\n')[0])
    p.add_argument('root', nargs='?', help='source tree (default: the 2.7 standard library)')
    p.add_argument('--python3', help='the interpreter of a 3.x build to compare with')
    p.add_argument('--dump', action='store_true', help='write this interpreter\'s records')
    p.add_argument('--show', type=int, default=20, help='differences to show')
    args = p.parse_args(argv)
    root = args.root
    if args.dump:
        return Dump(root or toolpath.StdlibDir())
    if not kPy2 or not args.python3:
        p.error('run under 2.7 with --python3 PATH')
    return Compare(args.python3, root or toolpath.StdlibDir(), args.show)


if __name__ == '__main__':
    toolpath.RunMain(main)
