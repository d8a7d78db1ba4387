"""The scope server beside Debian's pylsp, both over pipes: a typed
character (didChange) then a documentSymbol request, round trip.

    scripts/python.sh --python PY bench/bench_server.py [--samples N]
        [--pylsp-samples N] [--pylsp-timeout S] [--no-pylsp] [--lines N]

Files: the standard library's _pydecimal.py (~6.4k lines) and the library's
modules put one after the other up to ~100k lines, sent to both servers
with didOpen. Each sample types a character into a line in the middle of a
function body (the next takes it out again) and asks for the symbols.

Figures:
- wall time per round trip, from writing didChange to having read the
  whole answer, median with the 10th-90th percentiles: the wall time is
  what a user waits for, and it spans two processes;
- the server's CPU time per round trip (utime + stime from /proc over all
  samples), less disturbed by the other work on a shared machine;
- for the scope server, the parts, measured in-process on the same text and
  edits: the document's edit (the didChange as handled), the outline
  (GetOutline), the symbols' JSON, and the response's text and bytes; the
  rest of the round trip is framing, the pipes and the reading;
- memory: the server's RSS, and what it holds beyond the documents (traced
  allocations of its answers' state per document).

pylsp answers through jedi and parso and is slow on large files: at 100k
lines it is given few samples (--pylsp-samples, 3) and each request a time
limit (--pylsp-timeout, 120 s); a request past the limit ends its run.
"""

import argparse
import glob
import json
import os
import re
import subprocess
import sys
import sysconfig
import time
import tracemalloc

_kRepoDir = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
sys.path.insert(0, os.path.join(_kRepoDir, 'tools'))

import toolpath  # noqa: E402

toolpath.setup()

from pysource.scopeserver import protocol  # noqa: E402
from pysource.scopeserver.framing import CMessageReader, Frame  # noqa: E402
from pysource.scopeserver.server import CScopeServer  # noqa: E402

kPylsp = ['/usr/bin/python3', '-m', 'pylsp']
kPylspSettings = {'pylsp': {'plugins': dict(
    (name, {'enabled': False}) for name in
    ('pycodestyle', 'pyflakes', 'mccabe', 'pydocstyle', 'autopep8', 'yapf', 'flake8', 'pylint',
     'rope_completion', 'rope_autoimport', 'preload', 'jedi_completion', 'jedi_hover',
     'jedi_references', 'jedi_signature_help', 'jedi_highlight', 'jedi_definition'))}}
kPylspSettings['pylsp']['plugins']['jedi_symbols'] = {'enabled': True, 'all_scopes': True}
kUri = 'file:///bench/file.py'
_kTicks = os.sysconf('SC_CLK_TCK')
_kIdAtStart = re.compile(br'^\{[^{]*?"id":\s*(\d+)\s*,\s*"result"')


def StdlibDir():
    return sysconfig.get_paths()['stdlib']


def Files(lines):
    small = open(os.path.join(StdlibDir(), '_pydecimal.py')).read()
    parts, count = [], 0
    for path in sorted(glob.glob(os.path.join(StdlibDir(), '*.py'))):
        try:
            with open(path, 'rb') as f:
                text = f.read().decode('utf-8')
        except (IOError, UnicodeDecodeError):
            continue
        if '\r' in text:
            continue
        parts.append(text if text.endswith('\n') else text + '\n')
        count += parts[-1].count('\n')
        if count >= lines:
            break
    return [('_pydecimal.py', small), ('stdlib, %d files' % len(parts), ''.join(parts))]


def TypingPlace(text):
    """A line in the middle of a function body: (line, column) to type at."""
    lines = text.split('\n')
    n = len(lines) // 2
    while not (lines[n].startswith('        ') and lines[n].strip() and
               not lines[n].strip().startswith(('#', '"', "'")) and not lines[n].rstrip().endswith('\\')):
        n += 1
    return n, 8


def _Change(l1, c1, l2, c2, text):
    return {'range': {'start': {'line': l1, 'character': c1}, 'end': {'line': l2, 'character': c2}},
            'text': text}


def Edits(place, k, enter=False):
    """Sample k's change: a character typed (or with `enter` a line broken)
    at `place`, then taken out again by the next sample."""
    line, col = place
    if enter:
        if k % 2 == 0:
            return [_Change(line, col, line, col, '\n' + ' ' * col)]
        return [_Change(line, col, line + 1, col, '')]
    if k % 2 == 0:
        return [_Change(line, col, line, col, 'x')]
    return [_Change(line, col, line, col + 1, '')]


def Percentiles(values):
    values = sorted(values)

    def At(q):
        return values[min(len(values) - 1, int(q * (len(values) - 1) + 0.5))]
    return At(0.5), At(0.1), At(0.9)


def Ms(values):
    if not values:
        return '-'
    median, low, high = Percentiles(values)
    return '%.2f ms (%.2f-%.2f)' % (median * 1e3, low * 1e3, high * 1e3)


class CPipeClient(object):
    """A client over the pipes of a server process."""

    def __init__(self, cmd, env=None):
        self.proc = subprocess.Popen(cmd, stdin=subprocess.PIPE, stdout=subprocess.PIPE,
                                     stderr=subprocess.DEVNULL, env=env)
        self.reader = CMessageReader(lambda n: os.read(self.proc.stdout.fileno(), n))
        self.next_id = 0

    def Send(self, method, params, request=False):
        msg = {'jsonrpc': '2.0', 'method': method, 'params': params}
        if request:
            self.next_id += 1
            msg['id'] = self.next_id
        self.proc.stdin.write(Frame(json.dumps(msg).encode('utf-8')))
        self.proc.stdin.flush()
        return msg.get('id')

    def Wait(self, msg_id, deadline=None):
        """The raw body of the response to `msg_id` (the others are skipped).
        A large answer is not decoded: its id is read from its start, where
        both servers write it, so that the round trip is the servers' and
        the pipes', not this client's JSON decoding (timed apart)."""
        while True:
            if deadline is not None and time.time() > deadline:
                raise RuntimeError('timed out')
            body = self.reader.ReadMessage()
            if body is None:
                raise RuntimeError('the server ended')
            if len(body) > 4096:
                head = _kIdAtStart.search(body[:200])
                if head and int(head.group(1)) == msg_id:
                    return body
                continue
            msg = json.loads(body.decode('utf-8'))
            if msg.get('id') == msg_id and 'method' not in msg:
                if 'error' in msg:
                    raise RuntimeError('error: %r' % msg['error'])
                return body

    def Request(self, method, params, timeout=None):
        msg_id = self.Send(method, params, request=True)
        return self.Wait(msg_id, None if timeout is None else time.time() + timeout)

    def Cpu(self):
        with open('/proc/%d/stat' % self.proc.pid) as f:
            fields = f.read().rsplit(')', 1)[1].split()
        return (int(fields[11]) + int(fields[12])) / float(_kTicks)

    def Rss(self):
        with open('/proc/%d/status' % self.proc.pid) as f:
            for line in f:
                if line.startswith('VmRSS:'):
                    return int(line.split()[1]) * 1024
        return 0

    def Close(self):
        try:
            self.Request('shutdown', None, timeout=30)
            self.Send('exit', None)
            self.proc.wait(timeout=30)
        except Exception:
            self.proc.kill()
            self.proc.wait()


def Started(cmd, env):
    client = CPipeClient(cmd, env)
    Initialize(client, pylsp=False)
    return client


def Initialize(client, pylsp):
    caps = {'textDocument': {'documentSymbol': {'hierarchicalDocumentSymbolSupport': True}}}
    client.Request('initialize', {'processId': os.getpid(), 'rootUri': 'file:///bench',
                                  'capabilities': caps}, timeout=120)
    client.Send('initialized', {})
    if pylsp:
        client.Send('workspace/didChangeConfiguration', {'settings': kPylspSettings})


def RoundTrips(client, text, place, samples, timeout=None, budget=None, enter=False):
    """(wall times, server CPU per round trip, JSON size, the first symbols' time)."""
    client.Send('textDocument/didOpen', {'textDocument': {
        'uri': kUri, 'languageId': 'python', 'version': 1, 'text': text}})
    start = time.time()
    body = client.Request('textDocument/documentSymbol', {'textDocument': {'uri': kUri}}, timeout=timeout)
    first = time.time() - start
    times = []
    cpu = client.Cpu()
    began = time.time()
    for k in range(samples):
        start = time.perf_counter()
        client.Send('textDocument/didChange', {'textDocument': {'uri': kUri, 'version': k + 2},
                                               'contentChanges': Edits(place, k, enter)})
        try:
            body = client.Request('textDocument/documentSymbol', {'textDocument': {'uri': kUri}},
                                  timeout=timeout)
        except RuntimeError:
            break
        times.append(time.perf_counter() - start)
        if budget is not None and time.time() - began > budget:
            break
    cpu = (client.Cpu() - cpu) / max(1, len(times))
    client.Send('textDocument/didClose', {'textDocument': {'uri': kUri}})
    start = time.perf_counter()
    answer = json.loads(body.decode('utf-8'))['result']
    decode = time.perf_counter() - start
    return times, cpu, (len(body), len(answer), decode * 1e3), first


def Parts(text, place, samples, enter=False):
    """The scope server's parts of a round trip, in-process, and the server."""
    server = _Opened(text)
    opened = server.documents[kUri]
    parts = dict(edit=[], outline=[], json=[], response=[])
    for k in range(samples):
        body = json.dumps({'jsonrpc': '2.0', 'method': 'textDocument/didChange', 'params': {
            'textDocument': {'uri': kUri, 'version': k + 2}, 'contentChanges': Edits(place, k, enter)}}).encode()
        t0 = time.perf_counter()
        server.HandleBody(body)
        t1 = time.perf_counter()
        opened.Outline()
        t2 = time.perf_counter()
        symbols = opened.SymbolsJson()
        t3 = time.perf_counter()
        protocol.Response(k, protocol.CRawJson(symbols)).encode('utf-8')
        t4 = time.perf_counter()
        for name, value in zip(('edit', 'outline', 'json', 'response'), (t1 - t0, t2 - t1, t3 - t2, t4 - t3)):
            parts[name].append(value)
    return parts, opened.doc


def _Opened(text):
    server = CScopeServer(lambda text: None, log=open(os.devnull, 'w'))
    server.HandleMessage({'jsonrpc': '2.0', 'id': 0, 'method': 'initialize', 'params': {'capabilities': {}}})
    server.HandleMessage({'jsonrpc': '2.0', 'method': 'textDocument/didOpen', 'params': {'textDocument': {
        'uri': kUri, 'languageId': 'python', 'version': 1, 'text': text}}})
    return server


def Held(text, place):
    """Bytes the server holds for an open document beyond the document
    itself, once it has answered symbols, folding ranges and a scope after
    a typed character and a line break (traced allocations)."""
    tracemalloc.start()
    server = _Opened(text)
    opened = server.documents[kUri]
    opened.Outline()  # the document's own, made when first asked
    base = tracemalloc.get_traced_memory()[0]
    for k, enter in ((0, False), (1, False), (0, True), (1, True)):
        server.HandleMessage({'jsonrpc': '2.0', 'method': 'textDocument/didChange', 'params': {
            'textDocument': {'uri': kUri, 'version': k + 2 + 2 * enter},
            'contentChanges': Edits(place, k, enter)}})
        opened.SymbolsJson()
        opened.FoldingJson()
        opened.ScopeAt(place[0])
    held = tracemalloc.get_traced_memory()[0] - base
    tracemalloc.stop()
    return held, len(opened.Outline())


def Main():
    parser = argparse.ArgumentParser(description=__doc__.split('\n')[0])
    parser.add_argument('--samples', type=int, default=200)
    parser.add_argument('--pylsp-samples', type=int, default=20)
    parser.add_argument('--pylsp-large-samples', type=int, default=3)
    parser.add_argument('--pylsp-timeout', type=float, default=120.0)
    parser.add_argument('--no-pylsp', action='store_true')
    parser.add_argument('--lines', type=int, default=100000)
    args = parser.parse_args()

    env = dict(os.environ)
    env['PYTHONPATH'] = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(protocol.__file__))))
    if 'SCOPESERVER_DOCUMENT' in env:
        env['PYTHONPATH'] += os.pathsep + os.path.join(_kRepoDir, 'tools')
    ours_cmd = [sys.executable, '-m', 'pysource.scopeserver']
    document = env.get('SCOPESERVER_DOCUMENT', 'pysource.scopedocument:CScopeDocument')
    print('scope server: %s on Python %s, document %s' % (
        ' '.join(ours_cmd[1:]), sys.version.split()[0], document))
    have_pylsp = not args.no_pylsp and os.path.exists(kPylsp[0]) and subprocess.call(
        kPylsp[:1] + ['-c', 'import pylsp'], stderr=subprocess.DEVNULL) == 0
    print('pylsp: %s' % ('%s (jedi_symbols only; linters off)' % ' '.join(kPylsp) if have_pylsp
                         else 'not run'))
    print('load average at start: %.1f %.1f %.1f' % os.getloadavg())

    rows = []
    for label, text in Files(args.lines):
        lines = text.count('\n')
        place = TypingPlace(text)
        print('\n%s: %d lines, typing at line %d' % (label, lines, place[0] + 1))
        ours = Started(ours_cmd, env)
        rss_empty = ours.Rss()
        times, cpu, size, first = RoundTrips(ours, text, place, args.samples)
        rss = ours.Rss()
        ours.Close()
        print('  scope server: round trip %s, server CPU %.2f ms, first answer %.0f ms' % (
            Ms(times), cpu * 1e3, first * 1e3))
        print('    answer: %d bytes, %d top-level symbols; the client decodes it in %.1f ms '
              '(not in the round trip)' % size)
        parts, doc = Parts(text, place, min(args.samples, 100))
        held, symbols = Held(text, place)
        for name in ('edit', 'outline', 'json', 'response'):
            print('    %-9s %s' % (name, Ms(parts[name])))
        own = getattr(doc, '_MemoryUse', lambda: {})()
        print('  memory: server RSS %.1f MiB with no document, %.1f MiB with it open; '
              'the answers\' state %.0f KiB beyond the document (%.0f bytes a symbol, %d symbols; '
              'the document besides its logicals: %s)' % (
                  rss_empty / 2.0 ** 20, rss / 2.0 ** 20, held / 1024.0, held / max(1, symbols), symbols,
                  ', '.join('%s %.0f KiB' % (k, v / 1024.0) for k, v in sorted(own.items())) or '-'))
        etimes, ecpu, _, _ = RoundTrips(Started(ours_cmd, env), text, place, args.samples, enter=True)
        eparts = Parts(text, place, min(args.samples, 100), enter=True)[0]
        print('  scope server, a line broken instead (Enter; every line below moves): round trip %s, '
              'server CPU %.2f ms' % (Ms(etimes), ecpu * 1e3))
        for name in ('edit', 'outline', 'json', 'response'):
            print('    %-9s %s' % (name, Ms(eparts[name])))
        row = dict(label=label, lines=lines, ours=times, ours_cpu=cpu, parts=parts)
        if have_pylsp:
            samples = args.pylsp_samples if lines < 20000 else args.pylsp_large_samples
            pylsp = CPipeClient(kPylsp)
            Initialize(pylsp, pylsp=True)
            try:
                ptimes, pcpu, psize, pfirst = RoundTrips(pylsp, text, place, samples,
                                                         timeout=args.pylsp_timeout,
                                                         budget=args.pylsp_timeout)
            except RuntimeError as exc:
                ptimes, pcpu, psize, pfirst = [], 0.0, None, float('nan')
                print('  pylsp: %s' % exc)
            pylsp.Close()
            print('  pylsp: round trip %s over %d samples, server CPU %.1f ms, first answer %.0f ms' % (
                Ms(ptimes), len(ptimes), pcpu * 1e3, pfirst * 1e3))
            if psize:
                print('    answer: %d bytes, %d symbols (flat); decoded in %.1f ms' % psize)
            row.update(pylsp=ptimes, pylsp_cpu=pcpu)
        rows.append(row)

    print('\n| file | lines | scope server, round trip | its CPU | pylsp, round trip | its CPU | pylsp / ours |')
    print('|---|---|---|---|---|---|---|')
    for row in rows:
        ptimes = row.get('pylsp') or []
        ratio = '%.0fx' % (Percentiles(ptimes)[0] / Percentiles(row['ours'])[0]) if ptimes else '-'
        print('| %s | %d | %s | %.2f ms | %s | %s | %s |' % (
            row['label'], row['lines'], Ms(row['ours']), row['ours_cpu'] * 1e3, Ms(ptimes),
            '%.0f ms' % (row['pylsp_cpu'] * 1e3) if ptimes else '-', ratio))


if __name__ == '__main__':
    Main()
