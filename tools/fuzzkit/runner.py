"""Child processes that run episodes, and the supervisor that starts them,
watches them for crashes, hangs and memory blow-ups, and reports."""

import gc
import json
import os
import select
import signal
import subprocess
import sys
import tempfile
import time
import traceback

kTag = '@@FUZZ '
kSanitizerMarks = ('ERROR: AddressSanitizer', 'ERROR: LeakSanitizer', 'runtime error:',
                   'SUMMARY: UndefinedBehaviorSanitizer', 'AddressSanitizer:DEADLYSIGNAL')


def Sanitized():
    return 'libasan' in os.environ.get('LD_PRELOAD', '')


# ---------------------------------------------------------------------------
# The child

class StderrSink(object):
    """Takes the interpreter's reports of exceptions it cannot raise (the
    module reports failing steps that way), counts them and keeps them out of
    the output. Sanitizer reports go to file descriptor 2, not here."""

    def __init__(self, recorder, optimized):
        self.rec = recorder
        self.optimized = optimized
        self.noted = False
        self.line = ''

    def write(self, text):
        # The interpreter writes a report in pieces; look at whole lines.
        self.line += text
        if '\n' not in self.line:
            if len(self.line) > 4096:
                self.line = self.line[-4096:]
            return
        lines = self.line.split('\n')
        self.line = lines.pop()
        for line in lines:
            if line.startswith('Exception') and line.endswith(' ignored'):
                self.rec.Count('(unraisable report)', 'written')
                if self.optimized and '_ProcessDedentedComments' in line and not self.noted:
                    self.noted = True
                    self.rec.Note('tag dedent-fail-O')

    def flush(self):
        pass


def _Emit(kind, payload):
    sys.__stdout__.write(kTag + json.dumps([kind, payload]) + '\n')
    sys.__stdout__.flush()


def _Census():
    """Counts that grow when references leak: container objects by type and
    the process's resident memory."""
    for name in ('last_type', 'last_value', 'last_traceback'):
        setattr(sys, name, None)
    if hasattr(sys, 'exc_clear'):  # 2.7: the exception last handled; 3.x drops it itself
        sys.exc_clear()
    gc.collect()
    gc.collect()
    counts = {}
    for o in gc.get_objects():
        name = type(o).__name__
        counts[name] = counts.get(name, 0) + 1
    counts['(all gc objects)'] = sum(counts.values())
    counts['(refs to None)'] = sys.getrefcount(None)
    rss = 0
    try:
        with open('/proc/self/status') as f:
            for line in f:
                if line.startswith('VmRSS:'):
                    rss = int(line.split()[1])
    except IOError:
        pass
    return counts, rss


def LeakProbe(seed, index, recorder, args, repeats=4):
    """Runs a finished episode again and again: no kind of object may pile
    up, and resident memory may not keep growing. Returns a detail or None."""
    from fuzzkit.episode import RunEpisode
    from fuzzkit.calls import Finding

    def Run():
        try:
            RunEpisode(seed, index, recorder, args.known, args.optimized, plant=args.plant)
        except Finding:
            pass
    Run()
    Run()
    c0, r0 = _Census()
    for _ in range(repeats):
        Run()
    c1, r1 = _Census()
    for _ in range(repeats):
        Run()
    c2, r2 = _Census()
    grown = []
    for name in sorted(c2):
        a, b, c = c0.get(name, 0), c1.get(name, 0), c2.get(name, 0)
        if b - a >= repeats and c - b >= repeats:
            grown.append('%s %d -> %d -> %d' % (name, a, b, c))
    if not Sanitized() and r1 - r0 > 4096 and r2 - r1 > 4096:
        grown.append('resident memory %d kB -> %d kB -> %d kB' % (r0, r1, r2))
    if grown:
        return 'running episode %d %d more times twice kept growing: %s' % (
            index, repeats, '; '.join(grown[:8]))
    return None


def ChildMain(args):
    from fuzzkit.calls import Finding, Recorder
    from fuzzkit.episode import Canary, RunEpisode
    rec = Recorder(args.log)
    sys.stderr = StderrSink(rec, args.optimized)
    sys.setrecursionlimit(400)
    if args.probe_only:
        _Emit('begin', {'episode': args.start, 'probe': True})
        detail = LeakProbe(args.seed, args.start, rec, args)
        _Emit('end', {'episode': args.start, 'counts': rec.counts, 'probe': True, 'finding': {
            'kind': 'leak', 'detail': detail, 'tags': [], 'profile': '?', 'script': None,
            'episode': args.start, 'log': [], 'probe': True} if detail else None})
        return 0
    k = args.start
    done = 0
    last_clean = None
    next_probe = time.time() + args.leak_every if args.leak_every else None
    while True:
        if args.count is not None and done >= args.count:
            break
        if args.deadline and time.time() >= args.deadline:
            break
        _Emit('begin', {'episode': k})
        finding = None
        try:
            ctx = RunEpisode(args.seed, k, rec, args.known, args.optimized, args.steps,
                             args.profile, args.plant)
            tags = sorted(ctx.tags)
        except Finding as f:
            finding = {'kind': f.kind, 'detail': f.detail, 'tags': f.tags,
                       'profile': f.profile, 'script': f.script}
        except Exception:
            finding = {'kind': 'fuzzer-error', 'detail': traceback.format_exc(), 'tags': [],
                       'profile': '?', 'script': None}
        if finding is None:
            if not Canary():
                finding = {'kind': 'fuzzer-error', 'detail': 'module globals not restored',
                           'tags': tags, 'profile': '?', 'script': None}
            else:
                last_clean = k
        gc.collect()
        if gc.garbage and finding is None:
            finding = {'kind': 'gc-garbage', 'detail': 'gc.garbage holds %d object(s): %s' % (
                len(gc.garbage), ', '.join(type(o).__name__ for o in gc.garbage[:6])),
                'tags': tags, 'profile': '?', 'script': None}
        del gc.garbage[:]
        if finding is not None:
            finding['episode'] = k
            finding['log'] = rec.Tail()
        _Emit('end', {'episode': k, 'counts': rec.counts, 'finding': finding})
        rec.counts = {}
        done += 1
        if next_probe is not None and time.time() >= next_probe and last_clean is not None:
            _Emit('begin', {'episode': last_clean, 'probe': True})
            detail = LeakProbe(args.seed, last_clean, rec, args)
            finding = None
            if detail:
                finding = {'kind': 'leak', 'detail': detail, 'tags': [], 'profile': '?',
                           'script': None, 'episode': last_clean, 'log': [], 'probe': True}
            _Emit('end', {'episode': last_clean, 'counts': {}, 'finding': finding,
                          'probe': True})
            rec.counts = {}
            next_probe = time.time() + args.leak_every
            last_clean = None
        k += args.stride
    return 0


# ---------------------------------------------------------------------------
# The supervisor

class Child(object):

    def __init__(self, slot, start, args, workdir):
        self.slot = slot
        self.log = os.path.join(workdir, 'child%d.log' % slot)
        self.err = os.path.join(workdir, 'child%d.err' % slot)
        cmd = [sys.executable] + (['-O'] if args.optimized else []) + [
            os.path.abspath(sys.argv[0]), '--child', '--seed', str(args.seed),
            '--start', str(start), '--stride', str(args.jobs), '--log', self.log,
            '--leak-every', str(args.leak_every)]
        if args.deadline:
            cmd += ['--deadline', repr(args.deadline)]
        if args.count is not None:
            cmd += ['--count', str(args.count)]
        for flag, value in (('--steps', args.steps), ('--profile', args.profile),
                            ('--plant', args.plant)):
            if value:
                cmd += [flag, str(value)]
        if args.known:
            cmd.append('--known')
        if args.leak_probe:
            cmd.append('--probe-only')
        self.errf = open(self.err, 'w')
        self.proc = subprocess.Popen(cmd, stdout=subprocess.PIPE, stderr=self.errf,
                                     close_fds=True)
        self.buf = ''
        self.current = None       # (episode, probe, started)
        self.last = start - args.jobs

    def Lines(self):
        data = os.read(self.proc.stdout.fileno(), 65536)
        if not data:
            return None
        # The child writes JSON lines, ASCII: str on 2.7, decoded on 3.x.
        self.buf += data if isinstance(data, str) else data.decode('utf-8', 'replace')
        lines = self.buf.split('\n')
        self.buf = lines.pop()
        return lines

    def Kill(self):
        try:
            os.kill(self.proc.pid, signal.SIGKILL)
        except OSError:
            pass
        self.proc.wait()
        self.errf.close()

    def Rss(self):
        try:
            with open('/proc/%d/status' % self.proc.pid) as f:
                for line in f:
                    if line.startswith('VmRSS:'):
                        return int(line.split()[1])
        except (IOError, ValueError):
            pass
        return 0

    def StderrTail(self, n=80):
        if not self.errf.closed:
            self.errf.flush()
        try:
            with open(self.err) as f:
                return f.read().splitlines()[-n:]
        except IOError:
            return []

    def LogLines(self):
        try:
            with open(self.log) as f:
                return f.read().splitlines()
        except IOError:
            return []


class Supervisor(object):

    def __init__(self, args):
        self.args = args
        self.workdir = tempfile.mkdtemp(prefix='fuzz-')
        self.counts = {}
        self.findings = []
        self.episodes = 0
        self.probes = 0

    def Finding(self, finding):
        self.findings.append(finding)
        n = len(self.findings)
        if not self.args.quiet:
            lines = (finding['detail'] or '').strip().splitlines() or ['']
            # A traceback reads best by its last line.
            line = lines[-1] if finding['kind'] == 'fuzzer-error' else lines[0]
            sys.stdout.write('FINDING %d: %s in episode %s: %s\n' % (
                n, finding['kind'], finding['episode'], line[:300]))
            sys.stdout.flush()

    def _Lost(self, child, kind, detail):
        """The child died or was killed inside an episode."""
        episode, probe, _ = child.current
        log = child.LogLines()
        starts = [k for k, l in enumerate(log) if l.startswith('  # action ')]
        tail = log[starts[-1]:] if starts else log
        tags = sorted(set(l.split('# tag ', 1)[1] for l in tail if '# tag ' in l))
        profile = [l.split('(profile ', 1)[1].rstrip(')') for l in log[:1] if '(profile ' in l]
        self.Finding({'kind': kind, 'detail': detail, 'episode': episode, 'tags': tags,
                      'profile': profile[0] if profile else '?', 'script': None, 'log': log[-400:],
                      'stderr': child.StderrTail(), 'probe': probe})

    def Run(self):
        from fuzzkit.calls import MergeCounts
        args = self.args
        limit = args.episode_timeout
        rss_limit = args.rss_limit_mb * 1024
        children = [Child(j, args.first + j, args, self.workdir) for j in range(args.jobs)]
        while children:
            fds = dict((c.proc.stdout.fileno(), c) for c in children)
            ready, _, _ = select.select(list(fds), [], [], 0.5)
            now = time.time()
            for fd in ready:
                child = fds[fd]
                lines = child.Lines()
                if lines is None:         # the child ended
                    code = child.proc.wait()
                    child.errf.close()
                    children.remove(child)
                    err = child.StderrTail()
                    sanitizer = [l for l in err if any(m in l for m in kSanitizerMarks)]
                    if child.current is not None or code != 0 or sanitizer:
                        if child.current is None:
                            child.current = (child.last, False, now)
                        how = ('killed by signal %d' % -code) if code < 0 else \
                            'exit status %d' % code
                        self._Lost(child, 'crash', 'the child process died (%s)%s' % (
                            how, ': ' + sanitizer[0].strip() if sanitizer else ''))
                        nxt = child.current[0] + args.jobs
                        if self._MoreTime(now) and not child.current[1]:
                            children.append(Child(child.slot, nxt, args, self.workdir))
                    continue
                for line in lines:
                    if not line.startswith(kTag):
                        continue
                    kind, payload = json.loads(line[len(kTag):])
                    if kind == 'begin':
                        child.current = (payload['episode'], payload.get('probe', False), now)
                    else:
                        MergeCounts(self.counts, payload['counts'])
                        if payload.get('probe'):
                            self.probes += 1
                        else:
                            self.episodes += 1
                            child.last = payload['episode']
                        if payload['finding']:
                            self.Finding(payload['finding'])
                        child.current = None
            for child in list(children):
                if child.current is None:
                    continue
                episode, probe, started = child.current
                over = now - started > limit * (4 if probe else 1)
                rss = child.Rss()
                if over or rss > rss_limit:
                    child.Kill()
                    children.remove(child)
                    self._Lost(child, 'hang' if over else 'memory',
                               ('episode still running after %d s' % (now - started)) if over
                               else 'the child grew to %d MB' % (rss // 1024))
                    if self._MoreTime(now):
                        children.append(Child(child.slot, episode + args.jobs, args,
                                              self.workdir))
            if args.deadline and now > args.deadline + limit + 30:
                for child in children:
                    child.Kill()
                children = []
        return self.Report()

    def _MoreTime(self, now):
        return (not self.args.deadline or now < self.args.deadline) and self.args.count is None

    def Report(self):
        from fuzzkit.calls import FormatCounts
        from fuzzkit.episode import kKnownShapes
        args = self.args
        out = sys.stdout
        mode = ('-O ' if args.optimized else '') + ('sanitizer build' if Sanitized() else
                                                    'normal build')
        out.write('\nseed %s, %s, %d episode(s), %d leak probe(s)%s\n' % (
            args.seed, mode, self.episodes, self.probes, ', known shapes skipped'
            if args.known else ''))
        for line in FormatCounts(self.counts):
            out.write(line + '\n')
        if not self.findings:
            out.write('no findings\n')
            return 0
        if not os.path.isdir(args.report_dir):
            os.makedirs(args.report_dir)
        stale = 'finding-%s-' % args.seed
        for name in os.listdir(args.report_dir):
            if name.startswith(stale):
                os.remove(os.path.join(args.report_dir, name))
        out.write('%d finding(s):\n' % len(self.findings))
        for n, f in enumerate(self.findings, 1):
            known = [t for t in f['tags'] if t in kKnownShapes]
            path = os.path.join(args.report_dir, 'finding-%s-%d.txt' % (args.seed, n))
            with open(path, 'w') as fh:
                fh.write(self.Reproducer(f, known))
            out.write('  %d. %s, episode %s%s: %s\n     %s\n     reproducer: %s\n' % (
                n, f['kind'], f['episode'], ' (leak probe)' if f.get('probe') else '',
                (f['detail'].splitlines() or [''])[0][:400],
                'known shape: ' + ', '.join(known) if known else 'no known shape',
                path))
        return 1

    def Reproducer(self, f, known):
        from fuzzkit.episode import kKnownShapes
        args = self.args
        env = ''
        if Sanitized():
            env = 'LD_PRELOAD=%s ASAN_OPTIONS=%s ' % (
                os.environ.get('LD_PRELOAD', ''), os.environ.get('ASAN_OPTIONS', ''))
        cmd = '%sscripts/python.sh %stools/fuzz.py --seed %s --episode %s%s%s' % (
            env, '-O ' if args.optimized else '', args.seed, f['episode'],
            ' --known' if args.known else '', ' --leak-probe' if f.get('probe') else '')
        for flag, value in (('--profile', args.profile), ('--steps', args.steps),
                            ('--plant', args.plant)):
            if value:
                cmd += ' %s %s' % (flag, value)
        parts = ['%s in episode %s of seed %s (profile %s)' % (
            f['kind'], f['episode'], args.seed, f.get('profile')),
            f['detail'], '',
            'known shapes met: %s' % (', '.join('%s (%s)' % (t, kKnownShapes[t])
                                                for t in known) or 'none'),
            'tags: %s' % ', '.join(f['tags']), '', 'replay: ' + cmd, '']
        if f.get('script'):
            parts += ['standalone script (the list right before the call):', '', f['script'], '']
        if f.get('stderr'):
            parts += ['child stderr (tail):'] + f['stderr'] + ['']
        parts += ['call log of the episode:'] + f.get('log', [])
        return '\n'.join(parts) + '\n'
