"""The replay run over many files, its summary and its command line."""

import argparse
import hashlib
import os
import random
import sys
import traceback

import toolpath
from progress import Progress
from pysource.scopebodycache import CChangeFinder

from replaykit.checks import LiveDocument
from replaykit.editor import JoinLines, ReplayError, SourceRejected, SplitLines
from replaykit.makers import EditMaker
from replaykit.repro import kDefaultReproDir, Tracer, WriteReproducer

kSamplePath = os.path.join(toolpath.kRepoDir, 'samples', 'outline_sample.py')
kStdlibDir = toolpath.StdlibDir()
StdlibFiles = toolpath.StdlibFiles


def _Percentile(sorted_values, fraction):
    if not sorted_values:
        return 0.0
    k = min(len(sorted_values) - 1, int(round(fraction * (len(sorted_values) - 1))))
    return sorted_values[k]


def SeededRandom(*parts):
    """A Random seeded the same way on every run (str hashes may be salted)."""
    key = ':'.join(str(p) for p in parts)
    key = key if isinstance(key, bytes) else key.encode('utf-8')
    return random.Random(int(hashlib.md5(key).hexdigest()[:16], 16))


def SampleFiles(paths, count, seed, max_lines=None):
    """`count` of `paths` picked by `seed`, in their given order; files longer
    than `max_lines` are passed over."""
    if max_lines is not None:
        kept = []
        for p in paths:
            try:
                if toolpath.ReadSource(p).count('\n') <= max_lines:
                    kept.append(p)
            except (IOError, OSError, SyntaxError, ValueError):
                pass
        paths = kept
    if count >= len(paths):
        return list(paths)
    picked = set(SeededRandom('sample', seed).sample(range(len(paths)), count))
    return [p for i, p in enumerate(paths) if i in picked]


def ByKind(times_by_kind):
    """{kind: (count, median, p95)} of the times recorded by kind."""
    return dict((k, (len(v), _Percentile(sorted(v), 0.5), _Percentile(sorted(v), 0.95)))
                for k, v in times_by_kind.items())


def _Short(path):
    if path.startswith(kStdlibDir):
        return 'stdlib' + path[len(kStdlibDir):]
    return os.path.relpath(path) if path.startswith(os.getcwd()) else path


def RunReplay(paths, seed=0, edits_per_file=150, batch_fraction=0.15, cache_check=True,
              reset_every=50, stop_on_failure=False, repro_dir=kDefaultReproDir,
              max_repros=10, quiet=False, trace=False, out=None, finder_class=CChangeFinder):
    """Replays `edits_per_file` seeded edits on each file (the text goes back to
    the file's own every `reset_every` edits) and checks each FindChanges call.
    Returns a summary dict; its 'failures' list has one entry per failing edit."""
    out = out or sys.stdout

    def Say(line, always=False):
        if always or not quiet:
            out.write(line + '\n')
            out.flush()

    summary = dict(files=0, files_rejected=0, edits=0, batches=0, skipped=0,
                   logicals_compared=0, names_disagreements=0, cache_disagreements=0,
                   errors=0, replay_errors=0, failures=[], cache_check=cache_check)
    times, times_by_kind, sizes = [], {}, []
    repros = 0
    progress = Progress(len(paths))
    for done, path in enumerate(paths):
        progress.Show(done, note='%d edits' % summary['edits'])
        try:
            try:
                source = toolpath.ReadSource(path)
            except (SyntaxError, ValueError) as exc:  # 3.x: not decodable as declared
                raise SourceRejected(str(exc))
            original = JoinLines(SplitLines(source))
            doc = LiveDocument(original, cache_check, finder_class)
        except (IOError, OSError, SourceRejected) as exc:
            summary['files_rejected'] += 1
            Say('%s: skipped (%s)' % (path, str(exc).splitlines()[0] if str(exc) else exc))
            continue
        except Exception:
            summary['files_rejected'] += 1
            summary['errors'] += 1
            Say('%s: the whole-file pass raised\n%s' % (path, traceback.format_exc()), always=True)
            continue
        summary['files'] += 1
        sizes.append(len(doc.lst))
        maker = EditMaker(SeededRandom(seed, _Short(path)), batch_fraction)
        file_fails = file_edits = file_skipped = 0
        file_times = []
        tries = 0
        while file_edits < edits_per_file and tries < edits_per_file * 6:
            tries += 1
            made = maker.Next(doc.lines)
            if made is None:
                continue
            splices, reads = made
            if reads is None:
                file_skipped += 1
                continue
            old_text = doc.text
            kinds = set(sp.kind.split(':')[0] for sp in splices)
            kind = kinds.pop() if len(kinds) == 1 else 'batch'
            before_call = Tracer(repro_dir, old_text, splices, reads[-1][0], path) if trace else None
            try:
                outcome = doc.Edit(splices, reads, before_call)
            except ReplayError as exc:
                # Our own fault, not the product's: say so and go on from the new text.
                summary['replay_errors'] += 1
                Say('REPLAY BUG %s, edit %d: %s\n%r' % (path, file_edits + 1, exc, splices),
                    always=True)
                doc = LiveDocument(JoinLines(reads[-1][0]), cache_check, finder_class)
                continue
            file_edits += 1
            summary['edits'] += 1
            summary['batches'] += len(splices) > 1
            summary['logicals_compared'] += outcome.compared
            micros = outcome.seconds * 1e6
            times.append(micros)
            file_times.append(micros)
            times_by_kind.setdefault(kind, []).append(micros)
            invariant = outcome.problems.invariant
            if invariant is None:
                if reset_every and file_edits % reset_every == 0:
                    doc = LiveDocument(original, cache_check, finder_class)
                    maker.Reset()
                continue

            file_fails += 1
            summary[{'names': 'names_disagreements', 'cache': 'cache_disagreements',
                     'error': 'errors'}[invariant]] += 1
            where = '%s, edit %d (seed %s)' % (path, file_edits, seed)
            Say('FAIL [%s] %s: %s' % (invariant, where, ', '.join(s.Describe() for s in splices)),
                always=True)
            for line in outcome.problems.Lines():
                Say('    ' + line, always=True)
            failure = dict(path=path, edit=file_edits, kind=kind, invariant=invariant,
                           splices=[s.Describe() for s in splices],
                           details=outcome.problems.Lines(), repro=None)
            if repro_dir and repros < max_repros:
                repros += 1
                stem = 'repro_%03d_%s_%s' % (repros, os.path.splitext(os.path.basename(path))[0],
                                            invariant)
                try:
                    repro, note = WriteReproducer(repro_dir, stem, old_text, splices,
                                                  invariant, cache_check, where, finder_class)
                except Exception:
                    repro, note = None, 'could not write: %s' % traceback.format_exc()
                failure['repro'] = repro
                Say('    reproducer: %s (%s)' % (repro, note), always=True)
            summary['failures'].append(failure)
            if stop_on_failure:
                break
            # The names are wrong from here on: start again from a fresh pass.
            doc = LiveDocument(doc.text, cache_check, finder_class)

        summary['skipped'] += file_skipped
        file_times.sort()
        Say('%-60s %6d logicals %4d edits %3d skipped %2d failed  median %6.1f us' % (
            _Short(path), sizes[-1], file_edits, file_skipped, file_fails,
            _Percentile(file_times, 0.5)))
        if stop_on_failure and file_fails:
            break
    progress.Close()

    times.sort()
    sizes.sort()
    summary['findchanges_us_median'] = _Percentile(times, 0.5)
    summary['findchanges_us_p95'] = _Percentile(times, 0.95)
    summary['logicals_per_file_median'] = _Percentile(sizes, 0.5)
    summary['logicals_per_file_max'] = sizes[-1] if sizes else 0
    summary['by_kind'] = ByKind(times_by_kind)
    return summary


def FormatSummary(summary):
    lines = []
    if summary['by_kind']:
        lines.append('FindChanges time by edit kind (us):')
        lines.append('  %-20s %6s %9s %9s' % ('kind', 'edits', 'median', 'p95'))
        for kind, (n, med, p95) in sorted(summary['by_kind'].items()):
            lines.append('  %-20s %6d %9.1f %9.1f' % (kind, n, med, p95))
    lines.append('FindChanges per edit: median %.1f us, p95 %.1f us; logicals per file: '
                 'median %d, max %d' % (summary['findchanges_us_median'],
                                        summary['findchanges_us_p95'],
                                        summary['logicals_per_file_median'],
                                        summary['logicals_per_file_max']))
    cache = 'checked' if summary['cache_check'] else 'not checked'
    lines.append('files %d (rejected %d), edits %d (batches %d), skipped edits %d, logicals '
                 'compared %d' % (summary['files'], summary['files_rejected'], summary['edits'],
                                  summary['batches'], summary['skipped'],
                                  summary['logicals_compared']))
    lines.append('disagreements: names %d, change sets %d (%s), errors %d' % (
        summary['names_disagreements'], summary['cache_disagreements'], cache,
        summary['errors']))
    if summary['replay_errors']:
        lines.append('REPLAY BUGS (the tool, not the product): %d' % summary['replay_errors'])
    return lines


def Failed(summary):
    return bool(summary['names_disagreements'] or summary['cache_disagreements'] or
                summary['errors'] or summary['replay_errors'])


def ChoosePaths(paths, stdlib, sample, seed):
    """The files a replay edits: those given, the standard library's too with
    `stdlib`, the bundled sample when there are none; with `sample`, that
    many of them picked by `seed`."""
    paths = list(paths)
    if stdlib:
        paths.extend(StdlibFiles())
    if not paths:
        paths = [kSamplePath]
    if sample is not None:
        paths = SampleFiles(paths, sample, seed)
    return paths


def _ParseArgs(argv):
    parser = argparse.ArgumentParser(
        prog='replay.py', description='Replays seeded edits through CChangeFinder and checks '
        'each call against a fresh whole-file pass.')
    parser.add_argument('files', nargs='*', metavar='FILE',
                        help='files to edit (default: the bundled sample)')
    parser.add_argument('--stdlib', action='store_true',
                        help='add every .py file of the running interpreter\'s standard library')
    parser.add_argument('--sample', type=int, metavar='N',
                        help='replay only N of the files, picked by the seed')
    parser.add_argument('--seed', default='0', help='random seed (default 0)')
    parser.add_argument('--edits', type=int, default=150, metavar='N',
                        help='edits replayed on each file (default 150)')
    parser.add_argument('--edits-per-file', '--reset-every', dest='reset_every', type=int,
                        default=50, metavar='N',
                        help='edits before the document goes back to the original text '
                        '(default 50; 0: never)')
    parser.add_argument('--batch-fraction', type=float, default=0.15, metavar='F',
                        help='fraction of edits that are batches of 2-5 changes (default 0.15)')
    parser.add_argument('--no-cache-check', dest='cache_check', action='store_false',
                        help='do not check the change sets through CScopeBodyCache')
    parser.add_argument('--stop-on-failure', action='store_true')
    parser.add_argument('--repro-dir', default=kDefaultReproDir, metavar='DIR',
                        help='where reproducers go (default %s)' % kDefaultReproDir)
    parser.add_argument('--max-repros', type=int, default=10, metavar='N',
                        help='shrink and write at most N reproducers (default 10)')
    parser.add_argument('--trace', action='store_true',
                        help='write DIR/last_edit.py before every call (for crashes)')
    parser.add_argument('--quiet', action='store_true',
                        help='print only failures and the summary')
    parser.add_argument('--check-index', action='store_true',
                        help='compare the definition index with the list after every call')
    return parser.parse_args(argv)


def main(argv=None):
    args = _ParseArgs(sys.argv[1:] if argv is None else argv)
    paths = ChoosePaths(args.files, args.stdlib, args.sample, args.seed)
    summary = RunReplay(paths, seed=args.seed, edits_per_file=args.edits,
                        batch_fraction=args.batch_fraction, cache_check=args.cache_check,
                        reset_every=args.reset_every, stop_on_failure=args.stop_on_failure,
                        repro_dir=args.repro_dir, max_repros=args.max_repros,
                        quiet=args.quiet, trace=args.trace)
    sys.stdout.write('\n'.join(FormatSummary(summary)) + '\n')
    return 1 if Failed(summary) else 0
