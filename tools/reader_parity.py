"""Checks that the logical-line reader gives the same records on 2.7 and 3.x.

Reads every .py file under a directory (default: the 2.7 standard library,
site-packages left out) with pysource.logicals under both interpreters and
compares the (tokens, line number, indent, kind) records file by file: the
2.7 token bytes, decoded with the file's declared encoding, against the 3.x
token text. Prints the differences of each differing file and a summary, and
exits with 1 when any difference is not one the reader documents.

    reader_parity.py --py3 3.11
    reader_parity.py --py3 /usr/bin/python3.13 --root .../lib/python3.13 --show 5

--py2 and --py3 take a command or a version installed under pyenv. The records
are read with the source tree's python/ package, so nothing needs building.

With --native it compares instead, in the interpreter that runs it (with the
built package on the path: scripts/python.sh), the native reader with the
reference one (ReadLogicals(..., reference=True)): the same records or the
same error (type and arguments) file by file, over each --root (default:
this interpreter's standard library). With --adversarial COUNT it does so
on COUNT generated texts (tools/reader_adversarial.py, --seed), checking
too that a scan resumed at each row where no logical is open reads as the
whole scan.

    scripts/python.sh tools/reader_parity.py --native --root /usr/lib/python3/dist-packages
    scripts/python.sh tools/reader_parity.py --adversarial 100000 --seed 1
"""

from __future__ import print_function

import argparse
import codecs
import glob
import json
import os
import re
import subprocess
import sys
import tempfile

from toolpath import PyenvRoot

kToolsDir = os.path.dirname(os.path.abspath(__file__))
kPythonDir = os.path.join(os.path.dirname(kToolsDir), 'python')

# Kinds of difference, and whether the reader's docstring accounts for them.
kExplained = {
    'declared encoding': True,      # 3.x cannot decode the file; 2.7 reads bytes
    'multi-byte encoding': True,    # 2.7 reads ASCII bytes inside characters
    'records': False,
    '2.7 rejects': False,
    '3.x rejects': False,
    'both reject differently': False,
    'tokens not decodable': False,
}


# --- Worker: runs under each interpreter ------------------------------------

def Work(list_path):
    """Writes one JSON line per file named in `list_path`: its records, or
    the error that stopped the reader. 2.7 token bytes go out as latin-1 text."""
    sys.path.insert(0, kPythonDir)
    from pysource import logicals
    with open(list_path) as f:
        paths = json.load(f)
    out = sys.stdout
    for path in paths:
        try:
            records = [[[_Text(t) for t in tokens], lineno, indent, kind]
                       for tokens, lineno, indent, kind
                       in logicals._Records(logicals._SourceOfFile(path), path)]
            result = {'records': records}
        except Exception as exc:  # any failure is a finding, not a crash of the tool
            result = {'error': [type(exc).__name__, getattr(exc, 'lineno', None),
                                _Text(getattr(exc, 'msg', None) or str(exc))]}
        out.write(json.dumps(result) + '\n')
        out.flush()


def _Text(value):
    return value if isinstance(value, type(u'')) else value.decode('latin-1')


# --- Encodings -----------------------------------------------------------------

_kCoding = re.compile(br'^[ \t\f]*#.*?coding[:=][ \t]*([-\w.]+)')
_kBlankOrComment = re.compile(br'^[ \t\f]*(?:[#\r\n]|$)')


def DeclaredEncoding(data):
    """The codec name `data` declares (BOM, or a coding line in the first two
    lines; default utf-8), or None when the declaration names no codec."""
    bom = data.startswith(codecs.BOM_UTF8)
    if bom:
        data = data[len(codecs.BOM_UTF8):]
    for line in data.split(b'\n', 2)[:2]:
        match = _kCoding.match(line)
        if match:
            name = match.group(1).decode('ascii')
            if bom:
                # Only a spelling of utf-8 goes with a BOM, as 3.x's compiler has it.
                name = name[:12].lower().replace('_', '-')
                return 'utf-8' if name == 'utf-8' or name.startswith('utf-8-') else None
            try:
                return codecs.lookup(name).name
            except LookupError:
                return None
        if not _kBlankOrComment.match(line):
            break
    return 'utf-8'


def Decode27Tokens(tokens, encoding):
    """The 2.7 tokens (latin-1 text of their bytes) as text. 2.7 gives a
    character outside ASCII outside strings one error token per byte, 3.x
    one per character: such runs are decoded together and split by character."""
    out = []
    run = b''
    for token in tokens:
        raw = token.encode('latin-1')
        if len(raw) == 1 and ord(raw) >= 0x80:
            run += raw
            continue
        if run:
            out.extend(run.decode(encoding))
            run = b''
        out.append(raw.decode(encoding))
    if run:
        out.extend(run.decode(encoding))
    return out


def HasAsciiInsideCharacters(text, encoding):
    """Whether some character of `text` encodes to bytes that include ASCII."""
    for ch in set(text):
        if ord(ch) >= 0x80 and any(b < 0x80 for b in bytearray(ch.encode(encoding))):
            return True
    return False


# --- Comparison ----------------------------------------------------------------

def _Records(result):
    return [(tuple(tokens), lineno, indent, kind) for tokens, lineno, indent, kind in result]


def Compare(path, r27, r3, show):
    """(kind, lines of detail) of the difference for one file; kind is None
    when both interpreters agree."""
    with open(path, 'rb') as f:
        data = f.read().replace(b'\r\n', b'\n').replace(b'\r', b'\n')
    encoding = DeclaredEncoding(data)
    text = None
    if encoding is not None:
        try:
            text = data.decode(encoding)
        except UnicodeDecodeError:
            pass
    e27, e3 = r27.get('error'), r3.get('error')
    if e27 or e3:
        if e27 == e3:
            return None, []
        detail = ['2.7: %s' % (_ErrorText(e27) if e27 else 'reads it'),
                  '3.x: %s' % (_ErrorText(e3) if e3 else 'reads it')]
        if e3 and not e27 and e3[0] == 'SyntaxError' and text is None:
            return 'declared encoding', detail
        if e27 and e3:
            return 'both reject differently', detail
        return ('2.7 rejects' if e27 else '3.x rejects'), detail

    multi_byte = text is not None and HasAsciiInsideCharacters(text, encoding)
    try:
        got27 = [(tuple(Decode27Tokens(tokens, encoding)), lineno, indent, kind)
                 for tokens, lineno, indent, kind in r27['records']]
    except UnicodeDecodeError as exc:
        return ('multi-byte encoding' if multi_byte else 'tokens not decodable',
                ['2.7 tokens in %s: %s' % (encoding, exc)])
    got3 = _Records(r3['records'])
    if got27 == got3:
        return None, []
    detail = []
    if len(got27) != len(got3):
        detail.append('%d records on 2.7, %d on 3.x' % (len(got27), len(got3)))
    differing = [i for i, (a, b) in enumerate(zip(got27, got3)) if a != b]
    detail.append('%d records differ' % len(differing))
    for index in differing[:show]:
        detail.append('record %d: 2.7 %r' % (index, got27[index]))
        detail.append('record %d: 3.x %r' % (index, got3[index]))
    return ('multi-byte encoding' if multi_byte else 'records'), detail


def _ErrorText(error):
    name, lineno, msg = error
    return '%s at line %s: %s' % (name, lineno, msg)


# --- Driver --------------------------------------------------------------------

def Interpreter(given):
    """The interpreter to run: `given` itself, or the pyenv install of version `given`."""
    if not given[:1].isdigit():
        return given
    versions = os.path.join(PyenvRoot(), 'versions')
    found = []
    for candidate in glob.glob(os.path.join(versions, given + '*')):
        name = os.path.basename(candidate)
        if name == given or name.startswith(given + '.'):
            major_minor = '.'.join(name.split('.')[:2])
            exe = os.path.join(candidate, 'bin', 'python' + major_minor)
            if os.path.exists(exe):
                found.append((tuple(int(p) for p in name.split('.') if p.isdigit()), exe))
    if not found:
        sys.exit('no Python %s under %s' % (given, versions))
    return max(found)[1]


def Checked(py, major):
    """`py`, once it runs and is Python `major`."""
    try:
        got = subprocess.check_output([py, '-c', 'import sys; print(sys.version_info[0])'])
    except (OSError, subprocess.CalledProcessError) as exc:
        sys.exit('cannot run %s: %s' % (py, exc))
    if got.decode().strip() != str(major):
        sys.exit('%s is not Python %d' % (py, major))
    return py


def SourceFiles(root):
    """Sorted .py files under `root`, site-packages left out."""
    paths = []
    for dirpath, dirnames, filenames in os.walk(root):
        dirnames[:] = sorted(d for d in dirnames if d != 'site-packages')
        paths.extend(os.path.join(dirpath, f) for f in filenames if f.endswith('.py'))
    return sorted(paths)


def Main(argv):
    parser = argparse.ArgumentParser(description=__doc__.split('\n')[0])
    parser.add_argument('--py2', default='2.7', help='the 2.7 interpreter (default: pyenv 2.7)')
    parser.add_argument('--py3', help='the 3.x interpreter, e.g. 3.11 (required)')
    parser.add_argument('--root', help='directory to read (default: the 2.7 standard library)')
    parser.add_argument('--show', type=int, default=3, help='differing records shown per file')
    parser.add_argument('--worker', help=argparse.SUPPRESS)
    parser.add_argument('--native', action='store_true',
                        help='native reader against the reference, in this interpreter')
    parser.add_argument('--adversarial', type=int, metavar='COUNT',
                        help='native against reference on COUNT generated texts')
    parser.add_argument('--seed', type=int, default=1, help='seed of the generated texts')
    args, extra_roots = parser.parse_known_args(argv)
    if any(r.startswith('-') for r in extra_roots):
        parser.error('unrecognized arguments: %s' % ' '.join(extra_roots))
    if args.worker:
        Work(args.worker)
        return 0
    if args.adversarial is not None:
        return Adversarial(args.adversarial, args.seed)
    if args.native:
        roots = [r for r in [args.root] + extra_roots if r] or [os.path.dirname(os.__file__)]
        return NativeParity(roots, args.show)
    if extra_roots:
        parser.error('unrecognized arguments: %s' % ' '.join(extra_roots))
    if not args.py3:
        parser.error('--py3 is required')

    py2, py3 = Checked(Interpreter(args.py2), 2), Checked(Interpreter(args.py3), 3)
    root = args.root or subprocess.check_output(
        [py2, '-c', 'import os; print(os.path.dirname(os.__file__))']).decode().strip()
    paths = SourceFiles(root)
    fd, list_path = tempfile.mkstemp(suffix='.json')
    try:
        with os.fdopen(fd, 'w') as f:
            json.dump(paths, f)
        # No bytecode in the source tree.
        env = dict(os.environ, PYTHONDONTWRITEBYTECODE='1')
        workers = [subprocess.Popen([py, os.path.abspath(__file__), '--worker', list_path],
                                    stdout=subprocess.PIPE, env=env) for py in (py2, py3)]
        counts, kinds = Tally(paths, workers, args.show)
        for worker in workers:
            # A worker still writing after an early stop ends on the closed pipe.
            worker.stdout.close()
            worker.wait()
    finally:
        os.remove(list_path)

    print('%s vs %s over %s' % (py2, py3, root))
    print('files %d, records %d (2.7) %d (3.x), identical %d, differing %d, '
          '3.x rejects %d, 2.7 rejects %d, both reject %d' % (
              len(paths), counts['records 2.7'], counts['records 3.x'], counts['identical'],
              counts['differing'], counts['3.x rejects'], counts['2.7 rejects'], counts['both reject']))
    unexplained = 0
    for kind in sorted(kinds):
        print('  %-26s %5d  %s' % (kind, kinds[kind],
                                   'documented' if kExplained[kind] else 'NOT EXPLAINED'))
        if not kExplained[kind]:
            unexplained += kinds[kind]
    if any(w.returncode for w in workers):
        print('a worker failed')
        return 2
    return 1 if unexplained else 0


# --- Native against reference -------------------------------------------------

def FileOutcome(path, reference):
    """What ReadLogicalsFromFile gives for `path`, as plain data."""
    from pysource.logicals import ReadLogicalsFromFile
    try:
        logicals = ReadLogicalsFromFile(path, reference=reference)
    except Exception as exc:  # any failure is compared, not a crash of the tool
        return ('error', type(exc).__name__, repr(exc.args))
    return ('records', [(tuple(l.fTokens), l.fLineno, l.fIndent, l.fKind) for l in logicals])


def NativeParity(roots, show):
    sys.path.insert(0, kToolsDir)
    from progress import Progress  # noqa: E402 (tools/)
    paths = []
    for root in roots:
        paths.extend(SourceFiles(root) if os.path.isdir(root) else [root])
    counts = dict.fromkeys(['identical', 'differing', 'records', 'rejected'], 0)
    progress = Progress(len(paths))
    for path in paths:
        progress.Step(note=os.path.basename(path))
        native, ref = FileOutcome(path, False), FileOutcome(path, True)
        if native == ref:
            counts['identical'] += 1
            if native[0] == 'records':
                counts['records'] += len(native[1])
            else:
                counts['rejected'] += 1
            continue
        counts['differing'] += 1
        progress.Close()
        print('%s: native and reference differ' % path)
        if native[0] != ref[0] or native[0] == 'error':
            print('    native:    %s' % (native if native[0] == 'error' else 'reads it'))
            print('    reference: %s' % (ref if ref[0] == 'error' else 'reads it'))
        else:
            a, b = native[1], ref[1]
            if len(a) != len(b):
                print('    %d records native, %d reference' % (len(a), len(b)))
            differing = [i for i, (x, y) in enumerate(zip(a, b)) if x != y]
            for index in differing[:show]:
                print('    record %d: native    %r' % (index, a[index]))
                print('    record %d: reference %r' % (index, b[index]))
    progress.Close()
    print('Python %s, native against reference over %s' % (sys.version.split()[0], ', '.join(roots)))
    print('files %d, identical %d (records %d, rejected alike %d), differing %d' % (
        len(paths), counts['identical'], counts['records'], counts['rejected'], counts['differing']))
    return 1 if counts['differing'] else 0


def Adversarial(count, seed):
    sys.path.insert(0, kToolsDir)
    import reader_adversarial  # noqa: E402 (tools/)
    differing = reader_adversarial.Run(seed, count, sys.stdout)
    print('Python %s, native against reference: %d generated texts (seed %d), differing %d' % (
        sys.version.split()[0], count, seed, differing))
    return 1 if differing else 0


def Tally(paths, workers, show):
    counts = dict.fromkeys(['records 2.7', 'records 3.x', 'identical', 'differing',
                            '3.x rejects', '2.7 rejects', 'both reject'], 0)
    kinds = {}
    progress = sys.stderr.isatty()
    for index, path in enumerate(paths):
        if progress:
            sys.stderr.write('\r%d/%d %s\x1b[K' % (index + 1, len(paths), path[-60:]))
            sys.stderr.flush()
        r27, r3 = [json.loads(w.stdout.readline().decode('utf-8') or 'null') for w in workers]
        if r27 is None or r3 is None:
            print('a worker stopped early')
            break
        counts['records 2.7'] += len(r27.get('records', ()))
        counts['records 3.x'] += len(r3.get('records', ()))
        if 'error' in r27 and 'error' in r3:
            counts['both reject'] += 1
        elif 'error' in r27:
            counts['2.7 rejects'] += 1
        elif 'error' in r3:
            counts['3.x rejects'] += 1
        kind, detail = Compare(path, r27, r3, show)
        if kind is None:
            counts['identical'] += 1
            continue
        counts['differing'] += 1
        kinds[kind] = kinds.get(kind, 0) + 1
        if progress:
            sys.stderr.write('\r\x1b[K')
        print('%s: %s' % (path, kind))
        for line in detail:
            print('    ' + line)
    if progress:
        sys.stderr.write('\r\x1b[K')
    return counts, kinds


if __name__ == '__main__':
    sys.exit(Main(sys.argv[1:]))
