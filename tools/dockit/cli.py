"""The replay of text edits over many files, its summary and its command line."""

from __future__ import print_function

import argparse
import os
import sys
import time
import traceback

import toolpath
from progress import Progress

from dockit.checks import Session
from dockit.makers import TextEditMaker
from dockit.repro import DocumentClass, WriteReproducer, kDefaultReproDir
from replaykit.cli import ByKind, ChoosePaths, SampleFiles, SeededRandom, StdlibFiles, _Short  # noqa: F401 (offered here too)


def RunReplay(paths, document='native', seed=0, edits_per_file=150, reset_every=50,
              utf16_fraction=0.2, self_check=False, cache_check=True, repro_dir=kDefaultReproDir,
              max_repros=10, stop_on_failure=False, quiet=False, out=None, ignore=()):
    """Replays `edits_per_file` seeded calls on a document of each file (made
    again from the file's text every `reset_every` calls) and checks each.
    Returns a summary dict; its 'failures' list has one entry per failing call."""
    out = out or sys.stdout
    document_class = DocumentClass(document)

    def Say(line, always=False):
        if always or not quiet:
            out.write(line + '\n')
            out.flush()

    summary = dict(files=0, files_rejected=0, edits=0, unreadable=0, batches=0, utf16=0,
                   set_texts=0, disagreements=0, errors=0, failures=[], by_invariant={},
                   document=document)
    times_by_kind = {}
    repros = 0
    progress = Progress(len(paths))
    for done, path in enumerate(paths):
        progress.Show(done, note='%d edits, %d disagreements' % (
            summary['edits'], summary['disagreements']))
        try:
            original = toolpath.ReadSource(path)
        except (IOError, OSError, SyntaxError, ValueError) as exc:
            summary['files_rejected'] += 1
            Say('%s: skipped (%s)' % (path, str(exc).splitlines()[0] if str(exc) else exc))
            continue
        summary['files'] += 1
        maker = TextEditMaker(SeededRandom(seed, _Short(path)), utf16_fraction)
        session, history = None, []

        def NewSession(text):
            try:
                made = Session(document_class, text, path, self_check, cache_check, ignore)
            except Exception:
                summary['errors'] += 1
                Say('%s: making the document raised\n%s' % (path, traceback.format_exc()),
                    always=True)
                return None
            if made.problems.found:
                summary['disagreements'] += 1
                Say('FAIL %s: the new document disagrees' % path, always=True)
                for line in made.problems.Lines():
                    Say('    ' + line, always=True)
                return None
            return made
        file_edits = file_fails = tries = 0
        while file_edits < edits_per_file and tries < edits_per_file * 4:
            tries += 1
            if session is None or (reset_every and len(history) >= reset_every):
                session = NewSession(original)
                if session is None:
                    break
                maker.Reset(original)
                history = []
            before = session.text
            op = maker.Next(before, session.baseline_text == before)
            if op is None:
                continue
            start = time.time()
            problems = session.Step(op)
            seconds = time.time() - start
            history.append((before, op))
            file_edits += 1
            summary['edits'] += 1
            summary['unreadable'] += session.baseline_text != session.text
            summary['batches'] += op.method == 'EditMany'
            summary['utf16'] += bool(op.utf16)
            summary['set_texts'] += op.method == 'SetText'
            times_by_kind.setdefault(op.kind, []).append(seconds * 1e3)
            invariant = problems.invariant
            if invariant is None:
                continue

            file_fails += 1
            summary['disagreements' if invariant != 'exception' else 'errors'] += 1
            summary['by_invariant'][invariant] = summary['by_invariant'].get(invariant, 0) + 1
            where = '%s, call %d (seed %s)' % (path, file_edits, seed)
            Say('FAIL [%s] %s: %s' % (invariant, where, op.Describe()), always=True)
            for line in problems.Lines():
                Say('    ' + line, always=True)
            failure = dict(path=path, edit=file_edits, kind=op.kind, invariant=invariant,
                           details=problems.Lines(), repro=None)
            if repro_dir and repros < max_repros:
                repros += 1
                stem = 'repro_%03d_%s_%s' % (repros, os.path.splitext(os.path.basename(path))[0],
                                            invariant)
                try:
                    repro, text, note = WriteReproducer(
                        repro_dir, stem, document_class, document, history, invariant, where,
                        self_check=self_check, cache_check=cache_check, ignore=ignore)
                    failure['repro'] = repro
                    Say('    reproducer: %s (%s)' % (repro, note), always=True)
                    shown = text.splitlines()
                    for line in shown[:80]:
                        Say('    | ' + line, always=True)
                    if len(shown) > 80:
                        Say('    | ... (%d lines more)' % (len(shown) - 80), always=True)
                except Exception:
                    Say('    could not write a reproducer:\n' + traceback.format_exc(), always=True)
            summary['failures'].append(failure)
            if stop_on_failure:
                break
            # Go on from the text the call should have left, in a new document.
            session = NewSession(op.Result(before))
            history = []
            if session is None:
                break
            maker.Reset(session.text)

        Say('%-60s %5d lines %4d calls %2d failed' % (_Short(path), original.count('\n') + 1,
                                                      file_edits, file_fails))
        if stop_on_failure and file_fails:
            break
    progress.Close()
    summary['by_kind'] = ByKind(times_by_kind)
    return summary


def FormatSummary(summary):
    lines = []
    if summary['by_kind']:
        lines.append('call and checks, ms, by edit kind:')
        lines.append('  %-16s %7s %8s %8s' % ('kind', 'calls', 'median', 'p95'))
        for kind, (n, med, p95) in sorted(summary['by_kind'].items()):
            lines.append('  %-16s %7d %8.2f %8.2f' % (kind, n, med, p95))
    if summary['by_invariant']:
        lines.append('by invariant: ' + ', '.join('%s %d' % kv for kv in
                                                  sorted(summary['by_invariant'].items())))
    lines.append('%s document: files %d (rejected %d), edits %d (unreadable after %d, EditMany %d, '
                 'SetText %d, utf16 %d), disagreements %d, errors %d' % (
                     summary['document'], summary['files'], summary['files_rejected'],
                     summary['edits'], summary['unreadable'], summary['batches'],
                     summary['set_texts'], summary['utf16'], summary['disagreements'],
                     summary['errors']))
    return lines


def Failed(summary):
    return bool(summary['disagreements'] or summary['errors'])


def _ParseArgs(argv):
    parser = argparse.ArgumentParser(
        prog='doc_replay.py', description='Replays seeded text edits through a document and '
        'checks it after every call against a fresh read and a whole-file pass.')
    parser.add_argument('paths', nargs='*', metavar='FILE', help='files to edit')
    parser.add_argument('--files', nargs='+', default=[], metavar='FILE',
                        help='more files to edit (default, with no file: the bundled sample)')
    parser.add_argument('--stdlib', action='store_true',
                        help='every .py file of the running interpreter\'s standard library')
    parser.add_argument('--sample', type=int, metavar='N',
                        help='only N of the files, picked by the seed')
    parser.add_argument('--seed', default='0', help='random seed (default 0)')
    parser.add_argument('--edits', type=int, default=150, metavar='N',
                        help='calls on each file (default 150)')
    parser.add_argument('--reset-every', type=int, default=50, metavar='N',
                        help='calls before the document is made again from the file (default 50; '
                        '0: never)')
    parser.add_argument('--utf16-fraction', type=float, default=0.2, metavar='F',
                        help='fraction of calls with UTF-16 columns (default 0.2)')
    parser.add_argument('--reference', action='store_true',
                        help='replay through CReferenceDocument (tests the replay itself)')
    parser.add_argument('--self-check', action='store_true',
                        help='also call SelfCheck() after every call')
    parser.add_argument('--no-cache-check', dest='cache_check', action='store_false',
                        help='no warm CScopeBodyCache cleared with the change sets')
    parser.add_argument('--stop-on-failure', action='store_true')
    parser.add_argument('--repro-dir', default=kDefaultReproDir, metavar='DIR',
                        help='where reproducers go (default %s)' % kDefaultReproDir)
    parser.add_argument('--max-repros', type=int, default=10, metavar='N',
                        help='shrink and write at most N reproducers (default 10)')
    parser.add_argument('--ignore', action='append', default=[], metavar='INVARIANT',
                        help='do not count disagreements of INVARIANT (e.g. region; repeatable)')
    parser.add_argument('--quiet', action='store_true', help='print only failures and the summary')
    return parser.parse_args(argv)


def main(argv=None):
    args = _ParseArgs(sys.argv[1:] if argv is None else argv)
    paths = ChoosePaths(list(args.paths) + list(args.files), args.stdlib, args.sample, args.seed)
    document = 'reference' if args.reference else 'native'
    try:
        DocumentClass(document)
    except ImportError as exc:
        sys.stderr.write('pysource.scopedocument cannot be imported (%s); --reference replays '
                         'through the document in Python\n' % exc)
        return 2
    summary = RunReplay(paths, document=document, seed=args.seed, edits_per_file=args.edits,
                        reset_every=args.reset_every, utf16_fraction=args.utf16_fraction,
                        self_check=args.self_check, cache_check=args.cache_check,
                        repro_dir=args.repro_dir, max_repros=args.max_repros,
                        stop_on_failure=args.stop_on_failure, quiet=args.quiet,
                        ignore=frozenset(args.ignore))
    sys.stdout.write('\n'.join(FormatSummary(summary)) + '\n')
    return 1 if Failed(summary) else 0
