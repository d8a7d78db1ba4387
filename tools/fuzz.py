#!/usr/bin/env python2.7
"""Time-bounded hostile fuzzer for pysource.scopebodycache.

    fuzz.py [--seconds S] [--seed N] [--known] [--jobs J] [--sanitize]
            [--episode K [--leak-probe]] [--profile P] [--report-dir DIR]

Runs seeded episodes of random calls in child processes until S seconds
(default 60) have passed. An episode starts from a random small Python file
read into logicals and named by a whole-list pass, then makes 8-40 actions
drawn for its profile:

  edits     realistic editor edits through FindChanges (single edits,
            batches of sub-edits applied top to bottom, block moves, whole
            replacements, undo), cache lookups and Clear, pickle/cPickle
            (protocols 0-2) and copy round trips, _destroy_impl/destroy;
  badargs   wrong types, counts and keywords for every method and module
            function, extra items in added/removed, bad items in the list,
            steps called directly, _PropagateScopeIndexChangeForward;
  hostile   Python subclasses whose steps raise, return junk, re-enter,
            mutate the list, clear/destroy/re-prepare the finder, set its
            state, copy it, start threads; module globals rebound;
  pickles   crafted reduce values for the __pyx_unpickle_* functions and
            __setstate__;
  mixed     all of these.

Findings: a crash or sanitizer report (the child dies), a hang (an episode
over --episode-timeout), a memory blow-up, a finder left refusing every
FindChanges as recursive, names that differ from a whole-list pass of the
same text (episodes without overrides or bad items), a warm cache cleared
with the returned change sets answering unlike a fresh one, an added
logical left unnamed after a normal return with a bad item in the list,
_PropagateScopeIndexChangeForward rewriting names outside the old scope,
objects or memory that keep growing when a finished episode is run again
(a leak probe every --leak-every seconds), and a non-empty gc.garbage.

The summary lists the calls made by kind with their outcomes (returned, or
raised by exception type). The exit status is 1 when there is any finding;
each finding is written to --report-dir with the command that replays its
episode, the episode's call log and, for a names finding, a standalone
script holding the list right before the failing call. --known keeps away
from the shapes of faults already known (see kKnownShapes in
fuzzkit/episode.py); findings that met one of them name it.

Examples (from the repository root, after scripts/build.sh):

    scripts/python.sh tools/fuzz.py --seconds 300 --seed 1
    scripts/python.sh -O tools/fuzz.py --seconds 300 --seed 1
    scripts/python.sh tools/fuzz.py --seed 1 --episode 17      # replay one
    scripts/build.sh --sanitize && scripts/python.sh tools/fuzz.py --sanitize --seconds 300

--sanitize runs the children on build-asan/ with the sanitizer runtime
preloaded, as this line does by hand:

    LD_PRELOAD=$(g++ -print-file-name=libasan.so):$(g++ -print-file-name=libubsan.so) \\
    ASAN_OPTIONS=detect_leaks=0:abort_on_error=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 \\
    PYTHONPATH=build-asan/python scripts/python.sh tools/fuzz.py --seconds 300
"""

import argparse
import os
import subprocess
import sys
import time

sys.path.insert(0, os.path.dirname(os.path.abspath(__file__)))


def _ParseArgs(argv):
    p = argparse.ArgumentParser(prog='fuzz.py', description='Hostile fuzzer for '
                                'pysource.scopebodycache (see the module docstring).')
    p.add_argument('--seconds', type=float, default=60.0)
    p.add_argument('--seed', default='0')
    p.add_argument('--known', action='store_true',
                   help='keep away from the shapes of the faults already known')
    p.add_argument('--jobs', type=int, default=1, help='child processes at once')
    p.add_argument('--episode', type=int, help='replay this one episode and print its log')
    p.add_argument('--leak-probe', action='store_true', help='with --episode: its leak probe')
    p.add_argument('--profile', choices=['edits', 'badargs', 'hostile', 'pickles', 'mixed',
                                         'documents'])
    p.add_argument('--steps', type=int, help='actions per episode (default 8-40)')
    p.add_argument('--episode-timeout', type=float,
                   help='seconds one episode may take (default 20, 120 sanitized)')
    p.add_argument('--leak-every', type=float, default=45.0,
                   help='seconds between leak probes (0: none)')
    p.add_argument('--rss-limit-mb', type=int, default=3000)
    p.add_argument('--report-dir', default='/tmp/fuzz-reports')
    p.add_argument('--sanitize', action='store_true',
                   help='run on build-asan/ with the sanitizer runtime preloaded')
    p.add_argument('--quiet', action='store_true')
    p.add_argument('--plant', choices=['crash', 'hang', 'stuck', 'names', 'leak'],
                   help=argparse.SUPPRESS)
    # Used between the supervisor and its children.
    p.add_argument('--child', action='store_true', help=argparse.SUPPRESS)
    p.add_argument('--start', type=int, default=0, help=argparse.SUPPRESS)
    p.add_argument('--stride', type=int, default=1, help=argparse.SUPPRESS)
    p.add_argument('--deadline', type=float, help=argparse.SUPPRESS)
    p.add_argument('--count', type=int, help=argparse.SUPPRESS)
    p.add_argument('--log', help=argparse.SUPPRESS)
    p.add_argument('--probe-only', action='store_true', help=argparse.SUPPRESS)
    args = p.parse_args(argv)
    args.optimized = bool(sys.flags.optimize)
    return args


def _Sanitize(argv):
    """Starts this script again with the sanitizer runtime preloaded and the
    sanitizer build first on the path."""
    repo = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
    libs = [subprocess.check_output(['g++', '-print-file-name=' + lib]).decode('ascii').strip()
            for lib in ('libasan.so', 'libubsan.so')]
    env = dict(os.environ)
    env['LD_PRELOAD'] = ':'.join(libs)
    env['ASAN_OPTIONS'] = 'detect_leaks=0:abort_on_error=1'
    env['UBSAN_OPTIONS'] = 'print_stacktrace=1:halt_on_error=1'
    build = 'build-asan' if sys.version_info[:2] == (2, 7) else 'build-py%d.%d-asan' % sys.version_info[:2]
    env['PYTHONPATH'] = os.path.join(repo, build, 'python') + os.pathsep + \
        env.get('PYTHONPATH', '')
    flags = ['-O'] if sys.flags.optimize else []
    argv = [a for a in argv if a != '--sanitize']
    os.execve(sys.executable, [sys.executable] + flags + [os.path.abspath(__file__)] + argv, env)


def _FixHashSeed(argv):
    """3.x salts str hashes per process: an episode replays the same calls
    only under one seed, so the fuzzer starts again with a fixed one (2.7
    does not salt them)."""
    env = dict(os.environ, PYTHONHASHSEED='0')
    flags = ['-O'] if sys.flags.optimize else []
    os.execve(sys.executable, [sys.executable] + flags + [os.path.abspath(__file__)] + argv, env)


def main(argv=None):
    argv = sys.argv[1:] if argv is None else argv
    args = _ParseArgs(argv)
    if sys.version_info[0] >= 3 and os.environ.get('PYTHONHASHSEED') != '0':
        _FixHashSeed(argv)
    if args.sanitize and 'libasan' not in os.environ.get('LD_PRELOAD', ''):
        _Sanitize(argv)
    import toolpath
    toolpath.setup()
    from fuzzkit import runner
    if args.child:
        return runner.ChildMain(args)
    if args.episode_timeout is None:
        args.episode_timeout = 120.0 if runner.Sanitized() else 20.0
    args.first = 0
    if args.episode is not None:
        args.first, args.jobs, args.count, args.deadline = args.episode, 1, 1, None
    else:
        args.count = None
        args.deadline = time.time() + args.seconds
    sup = runner.Supervisor(args)
    status = sup.Run()
    if args.episode is not None and not args.leak_probe:
        with open(os.path.join(sup.workdir, 'child0.log')) as f:
            sys.stdout.write('\ncall log:\n' + f.read())
    return status


if __name__ == '__main__':
    sys.exit(main())
