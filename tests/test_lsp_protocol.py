"""The scope server's protocol: framing, lifecycle, text sync, the outline
answers held against a fresh document of the same text, positions in every
encoding, bad input, and the server run as a command over pipes."""

import json
import random
import subprocess
import sys
import time
import unittest

import lsp_support
from lsp_support import PY3, CClient, Change, DocText, ExpectedFolding, ExpectedSymbols, kSkipReason

if kSkipReason is None:
    from pysource.scopeserver import framing, protocol
    from pysource.scopeserver.framing import CMessageReader, FramingError, Frame

kSample = open(lsp_support.kSamplePath).read() if kSkipReason is None else ''


def Feed(chunks):
    """A read(n) over `chunks` that hands out at most one chunk a call."""
    chunks = list(chunks)

    def Read(n):
        if not chunks:
            return b''
        chunk = chunks.pop(0)
        if len(chunk) > n:
            chunks.insert(0, chunk[n:])
            chunk = chunk[:n]
        return chunk
    return Read


def ReadAll(data, chunks=None):
    """Bodies and framing errors of `data`, fed whole or in `chunks`."""
    reader = CMessageReader(Feed(chunks or [data]))
    out = []
    while True:
        try:
            body = reader.ReadMessage()
        except FramingError as exc:
            out.append(('error', str(exc)))
            continue
        if body is None:
            return out, reader.truncated
        out.append(body)


@unittest.skipIf(kSkipReason, kSkipReason)
class FramingTest(unittest.TestCase):

    def testSplitAndJoinedMessagesGiveTheSameBodies(self):
        bodies = [b'{"a":1}', b'{}', b'[' + b'1,' * 5000 + b'1]', u'{"t":"\u00e9\U0001f600"}'.encode('utf-8')]
        data = b''.join(Frame(b) for b in bodies)
        self.assertEqual(ReadAll(data), (bodies, False))
        self.assertEqual(ReadAll(data, [data[i:i + 1] for i in range(len(data))]), (bodies, False))
        rng = random.Random(5)
        cuts = sorted(rng.sample(range(1, len(data)), 40))
        chunks = [data[a:b] for a, b in zip([0] + cuts, cuts + [len(data)])]
        self.assertEqual(ReadAll(data, chunks), (bodies, False))

    def testContentLengthForms(self):
        ok = [b'Content-Length: 2\r\n\r\n{}', b'content-length:2\r\n\r\n{}',
              b'Content-Length:   002  \r\n\r\n{}', b'Content-Length: 2\n\n{}',
              b'Content-Length: 2\r\nContent-Type: application/vscode-jsonrpc; charset=utf-8\r\n\r\n{}',
              b'\r\n\r\nContent-Length: 2\r\n\r\n{}']
        for data in ok:
            self.assertEqual(ReadAll(data), ([b'{}'], False), data)
        self.assertEqual(ReadAll(b'Content-Length: 0\r\n\r\n'), ([b''], False))

    def testBadHeadersAreSkippedAndTheNextMessageRead(self):
        good = Frame(b'{"ok":1}')
        for bad in [b'Content-Length: x\r\n\r\n{}', b'Content-Length: -2\r\n\r\n{}',
                    b'Content-Length: 2\r\nContent-Length: 2\r\n\r\n{}',
                    b'Content-Type: text/plain\r\n\r\n{}', b'garbage\r\n\r\n',
                    b'Content-Length: 2\r\nContent-Type: x; charset=latin-1\r\n\r\n{}',
                    b'Content-Length: 99999999999\r\n\r\n',
                    b'{"jsonrpc": "2.0"}', b'x' * (framing.kMaxHeaderBytes + 10)]:
            out, truncated = ReadAll(bad + good)
            self.assertEqual(out[-1], b'{"ok":1}', bad)
            self.assertTrue(any(isinstance(o, tuple) for o in out), bad)
            self.assertFalse(truncated)

    def testInputEndingInsideAMessage(self):
        self.assertEqual(ReadAll(b'Content-Length: 10\r\n\r\n{"a"'), ([], True))
        self.assertEqual(ReadAll(b'Content-Len'), ([], True))
        self.assertEqual(ReadAll(b''), ([], False))


@unittest.skipIf(kSkipReason, kSkipReason)
class LifecycleTest(unittest.TestCase):

    def testInitializeAdvertisesWhatIsServed(self):
        caps = CClient().init['capabilities']
        self.assertEqual(caps, {
            'positionEncoding': 'utf-16', 'textDocumentSync': {'openClose': True, 'change': 2},
            'documentSymbolProvider': True, 'foldingRangeProvider': True, 'hoverProvider': True,
            'experimental': {'scopeAtProvider': True}})

    def testPositionEncodingFollowsTheClientsOrder(self):
        for offered, chosen in [(None, 'utf-16'), (['utf-8', 'utf-16'], 'utf-8'),
                                (['utf-32'], 'utf-32'), (['utf-16', 'utf-8'], 'utf-16'),
                                (['latin-1', 7, 'utf-32'], 'utf-32'), ('utf-8', 'utf-16')]:
            self.assertEqual(CClient(offered).init['capabilities']['positionEncoding'], chosen)

    def testRequestsBeforeInitializeAndAfterShutdown(self):
        client = CClient(encodings=False)
        self.assertEqual(client.Request('textDocument/documentSymbol', {}, raw=True)['error']['code'],
                         protocol.kServerNotInitialized)
        self.assertEqual(client.Open('x = 1\n'), [])  # dropped, not an error
        client.Request('initialize', {'capabilities': {}})
        self.assertNotIn('file:///t.py', client.server.documents)
        self.assertEqual(client.Request('initialize', {}, raw=True)['error']['code'],
                         protocol.kInvalidRequest)
        self.assertIsNone(client.Request('shutdown', raw=True)['result'])
        self.assertEqual(client.Request('textDocument/hover', {}, raw=True)['error']['code'],
                         protocol.kInvalidRequest)
        client.Notify('exit', None)
        self.assertEqual(client.server.exit_code, 0)
        unclean = CClient()
        unclean.Notify('exit', None)
        self.assertEqual(unclean.server.exit_code, 1)

    def testUnknownMethodsAndCancellation(self):
        client = CClient()
        self.assertEqual(client.Request('textDocument/rename', {}, raw=True)['error']['code'],
                         protocol.kMethodNotFound)
        self.assertEqual(client.Request('$/unknown', {}, raw=True)['error']['code'], protocol.kMethodNotFound)
        self.assertEqual(client.Notify('workspace/didChangeConfiguration', {'settings': {}}), [])
        self.assertEqual(client.Notify('$/cancelRequest', {'id': 99}), [])
        # A request cancelled by a message read with it is not run.
        client.Open('def f():\n    pass\n')
        request = {'jsonrpc': '2.0', 'id': 'r', 'method': 'textDocument/documentSymbol',
                   'params': {'textDocument': {'uri': 'file:///t.py'}}}
        cancel = {'jsonrpc': '2.0', 'method': '$/cancelRequest', 'params': {'id': 'r'}}
        client.server.HandleBodies([json.dumps(request).encode(), json.dumps(cancel).encode()])
        self.assertEqual(json.loads(client.sent[-1])['error']['code'], protocol.kRequestCancelled)


@unittest.skipIf(kSkipReason, kSkipReason)
class OutlineTest(unittest.TestCase):

    def Check(self, client, uri='file:///t.py', encoding='utf-16'):
        """The answers of a fresh document of the text, or while it does not
        read, of the last text that did."""
        text = client.Text(uri)
        if lsp_support.Reads(text):
            self.last = ExpectedSymbols(text, encoding), ExpectedFolding(text)
        self.assertEqual(client.Symbols(uri), self.last[0])
        self.assertEqual(client.Folding(uri), self.last[1])

    def testEditsKeepTheOutlineOfAFreshRead(self):
        # Typing, deleting, Enter, joining lines, and a docstring opened and
        # closed, each followed by the answers (the pieces rewritten after
        # an edit are held against a fresh document's).
        client = CClient()
        client.Open(kSample)
        self.Check(client)
        lines = kSample.split('\n')
        rng = random.Random(11)
        readable = {True: 0, False: 0}
        for step in range(60):
            count = len(client.Text().split('\n'))
            line = rng.randrange(count - 1)
            width = len(client.Text().split('\n')[line])
            col = rng.randint(0, width)
            kind = step % 6
            if kind == 0:
                change = Change(line, col, line, col, rng.choice(['x', ' ', '(', ':', 'def ']))
            elif kind == 1:
                change = Change(line, col, line, min(width, col + 3), '')
            elif kind == 2:
                change = Change(line, col, line, col, '\n' + ' ' * rng.choice([0, 4, 8]))
            elif kind == 3:
                change = Change(line, width, line + 1, 0, '')
            elif kind == 4:
                change = Change(line, 0, line, 0, '    def typed(self):\n        pass\n')
            else:
                change = Change(line, col, line, col, '"""')
            client.Change([change])
            self.Check(client)
            readable[lsp_support.Reads(client.Text())] += 1
            if not lsp_support.Reads(client.Text()) and rng.random() < 0.9:
                # Take back what broke the text (the docstring or bracket
                # closed again), so that it reads as often as not.
                start = change['range']['start']
                added = change['text'].split('\n')
                end_col = len(added[-1]) + (start['character'] if len(added) == 1 else 0)
                client.Change([Change(start['line'], start['character'],
                                      start['line'] + len(added) - 1, end_col, '')])
                self.Check(client)
        self.assertGreater(min(readable.values()), 10, readable)
        self.assertNotEqual(client.Text(), kSample)
        client.Change([{'text': '\n'.join(lines)}])
        self.Check(client)
        self.assertEqual(client.Text(), kSample)

    def testTextThatDoesNotReadAnswersFromTheLastThatDid(self):
        text = 'class A:\n    def f(self):\n        return 1\n\ndef g():\n    pass\n'
        for asked_before in (True, False):
            client = CClient()
            client.Open(text)
            before = client.Symbols() if asked_before else ExpectedSymbols(text)
            sent = client.Change([Change(1, 4, 1, 4, 'x = (')])
            diagnostics = [m for m in sent if m.get('method') == 'textDocument/publishDiagnostics']
            self.assertEqual(len(diagnostics), 1)
            self.assertIn('EOF in multi-line statement', diagnostics[0]['params']['diagnostics'][0]['message'])
            self.assertEqual(client.Symbols(), before)
            hover = client.Request('textDocument/hover', {'textDocument': {'uri': 'file:///t.py'},
                                                          'position': {'line': 2, 'character': 0}})
            self.assertIn('last text that read', hover['contents']['value'])
            # Still broken: nothing new is published; the answers stay.
            self.assertEqual(client.Change([Change(0, 0, 0, 0, '# ')]), [])
            self.assertEqual(client.Symbols(), before)
            sent = client.Change([Change(1, 9, 1, 9, ')')])
            self.assertEqual([m['params']['diagnostics'] for m in sent], [[]])
            self.Check(client)
            self.assertEqual(client.Text(), '# ' + text.replace('    def', '    x = ()def', 1))

    def testOpenedUnreadable(self):
        client = CClient()
        sent = client.Open('class A:\n    def f(self, x:\n')
        self.assertEqual([m['method'] for m in sent], ['textDocument/publishDiagnostics'])
        self.assertEqual(sent[0]['params']['version'], 1)
        self.assertEqual(client.Symbols(), [])  # no text has read yet
        self.assertEqual(client.Folding(), [])
        sent = client.Change([Change(1, 17, 1, 17, ')')])
        self.assertEqual(sent[0]['params']['diagnostics'], [])
        self.Check(client)

    def testScopeAtAndHover(self):
        client = CClient()
        client.Open('class A:\n    def f(self):\n        return 1\nx = 2\n')
        at = lambda line: client.Request('scope/scopeAt', {  # noqa: E731
            'textDocument': {'uri': 'file:///t.py'}, 'position': {'line': line, 'character': 0}})
        self.assertEqual([at(n)['scope'] for n in range(4)], ['', 'A#0', 'A#0.f#0', ''])
        self.assertEqual(at(2), {'scope': 'A#0.f#0', 'readable': True, 'error': None})
        hover = client.Request('textDocument/hover', {'textDocument': {'uri': 'file:///t.py'},
                                                      'position': {'line': 2, 'character': 3}})
        self.assertEqual(hover['contents']['value'], 'scope: A#0.f#0')

    def testPiecesKeptAcrossEditsAreThoseOfAFreshRead(self):
        # Each case: the edits, then how many symbols may be worked out again
        # from their lines (the others keep theirs); the answers must be a
        # fresh read's either way.
        text = ('class A:\n    def f(self):\n        return 1\n\n    def \\\n        g(self):\n'
                '        pass\n\n\nclass B(A):\n    x = 1\n\n    def h(self):\n        y = 2\n')
        cases = [
            ([Change(2, 15, 2, 15, '0')], 1),                      # typing in a body ending f
            ([Change(13, 9, 13, 9, 'z')], 2),                      # the last line: ends h and B
            ([Change(1, 8, 1, 8, ' ')], 1),                        # the header's name moves
            ([Change(5, 8, 5, 8, 'x')], 1),                        # a name on the header's next line
            ([Change(2, 16, 2, 16, '\n        x = 2')], 1),         # Enter: A and f end later
            ([Change(0, 0, 0, 0, 'import os\n')], 1),              # all move down (A's header edited)
            ([Change(8, 0, 8, 0, '\n\n')], 0),                      # all below move down
            ([Change(0, 0, 0, 8, 'def A():\n')], 3),               # A a function: f, g no methods
            ([Change(9, 0, 9, 0, 'def k():\n    pass\n')], 2),     # k added, on B's first line
            ([Change(12, 0, 14, 0, '')], 1),                       # h removed: B ends earlier
            ([Change(0, 6, 0, 7, 'C'), Change(9, 6, 9, 7, 'D')], 5),  # both classes renamed: all names
        ]
        for changes, most in cases:
            client = CClient()
            client.Open(text)
            self.Check(client)
            stats = client.server.documents['file:///t.py']._symbols.stats
            before = dict(stats)
            client.Change(changes)
            self.Check(client)
            self.assertEqual(stats['built'], before['built'], changes)
            self.assertLessEqual(stats['rewritten'] - before['rewritten'], most, changes)

    def testDeepNestingAndNamesOutsideAscii(self):
        text = ''.join('    ' * n + 'def f%d():\n' % n for n in range(70)) + '    ' * 70 + 'pass\n'
        # Names as the reader takes them: cut at a letter outside ASCII, or none.
        text += u'class \u00c9t\u00e9:\n    def g_\u00e9(self):\n        return "\U0001f600"\n'
        client = CClient()
        client.Open(text)
        self.Check(client)
        client.Change([Change(70, 0, 70, 0, '    ' * 69 + 'def new():\n')])
        self.Check(client)

    def testSeveralChangesInOneNotificationApplyInOrder(self):
        client = CClient()
        client.Open('def f():\n    pass\n')
        client.Change([Change(0, 4, 0, 5, 'gg'), Change(1, 4, 1, 8, 'return 1'),
                       Change(2, 0, 2, 0, 'class B:\n    x = 1\n'), Change(0, 4, 0, 4, 'h')])
        self.assertEqual(client.Text(), 'def hgg():\n    return 1\nclass B:\n    x = 1\n')
        self.Check(client)


@unittest.skipIf(kSkipReason, kSkipReason)
class PositionsTest(unittest.TestCase):
    # Each emoji is 2 UTF-16 units, 4 UTF-8 bytes, 1 code point.
    kText = u'\ufeffclass A:\n    s = "\U0001f600\u00e9"\n    def f(self):\n        return "\U0001f600"\n'

    def testEveryEncodingOnCharactersOutsideTheBmp(self):
        for encoding in ('utf-16', 'utf-8', 'utf-32'):
            client = CClient([encoding])
            client.Open(self.kText)
            self.assertEqual(client.Symbols(), ExpectedSymbols(self.kText, encoding))
            after = {'utf-16': 11, 'utf-8': 13, 'utf-32': 10}[encoding]  # after the emoji
            client.Change([Change(1, after, 1, after, 'x')])
            self.assertEqual(client.Text().split('\n')[1], DocText(u'    s = "\U0001f600x\u00e9"'))
            self.assertEqual(client.Symbols(), ExpectedSymbols(client.Text(), encoding))
            self.assertEqual(client.Symbols()[0]['selectionRange']['start']['character'],
                             {'utf-16': 7, 'utf-8': 9, 'utf-32': 7}[encoding])

    def testColumnsInsideACharacterOrPastTheEnd(self):
        client = CClient()
        client.Open(u'x = "\U0001f600"\n')
        client.Change([Change(0, 6, 0, 6, 'a')])  # inside the pair: before it
        client.Change([Change(0, 99, 0, 99, '#')])  # past the end: at the end
        self.assertEqual(client.Text(), DocText(u'x = "a\U0001f600"#\n'))

    def testCrLfLines(self):
        text = 'class A:\r\n    def f(self):\r\n        pass\r\n'
        client = CClient()
        client.Open(text)
        self.assertEqual(client.Symbols(), ExpectedSymbols(text))
        self.assertEqual(client.Symbols()[0]['range']['end'], {'line': 2, 'character': 12})
        # Typing at (and past) the end of a line stays before its '\r'.
        client.Change([Change(2, 12, 2, 12, '  # x'), Change(0, 50, 0, 50, '  # y')])
        client.Change([Change(1, 16, 2, 0, '\r\n        x = 1\r\n')])  # Enter, a line added
        self.assertEqual(client.Text(), 'class A:  # y\r\n    def f(self):\r\n        x = 1\r\n'
                                        '        pass  # x\r\n')
        client.Change([Change(1, 16, 2, 13, '')])  # a join
        self.assertEqual(client.Text(), 'class A:  # y\r\n    def f(self):\r\n        pass  # x\r\n')
        self.assertEqual(client.Symbols(), ExpectedSymbols(client.Text()))

    def testLoneCarriageReturnIsACharacterOfItsLine(self):
        client = CClient()
        client.Open('x = 1\ry = 2\ndef f():\r\n    pass\r')
        client.Change([Change(0, 8, 0, 8, 'Z'), Change(2, 8, 2, 8, '#')])
        self.assertEqual(client.Text(), 'x = 1\ry Z= 2\ndef f():\r\n    pass#\r')
        self.assertEqual(client.Symbols()[0]['range']['end'], {'line': 2, 'character': 10})


@unittest.skipIf(kSkipReason, kSkipReason)
class BadInputTest(unittest.TestCase):

    def Errors(self, client, bodies):
        before = len(client.sent)
        client.server.HandleBodies(bodies)
        return [json.loads(m).get('error', {}).get('code') for m in client.sent[before:]]

    def testAnswersKeepTheOrderOfTheMessages(self):
        client = CClient()
        bodies = [b'{"jsonrpc": "2.0", "id": 1, "method": "shutdown"}', b'{"bad',
                  b'{"jsonrpc": "2.0", "id": 2, "method": "shutdown"}']
        client.server.HandleBodies(bodies)
        self.assertEqual([json.loads(m).get('id') for m in client.sent[-3:]], [1, None, 2])

    def testMalformedMessagesAreAnsweredAndTheServerGoesOn(self):
        client = CClient()
        client.Open('def f():\n    pass\n')
        for body, code in [(b'{"jsonrpc": "2.0", "id": 1, "method"', protocol.kParseError),
                           (b'\xff\xfe{}', protocol.kParseError), (b'', protocol.kParseError),
                           (b'[' * 100000 + b']' * 100000, protocol.kParseError),
                           (b'[1, 2]', protocol.kInvalidRequest), (b'7', protocol.kInvalidRequest),
                           (b'{"jsonrpc": "2.0", "id": [1], "method": "shutdown"}', protocol.kInvalidRequest),
                           (b'{"jsonrpc": "1.0", "id": 1, "method": "shutdown"}', protocol.kInvalidRequest),
                           (b'{"jsonrpc": "2.0", "id": 1}', protocol.kInvalidRequest),
                           (b'{"jsonrpc": "2.0", "id": 1, "method": 5}', protocol.kInvalidRequest),
                           (b'{"jsonrpc": "2.0", "id": 1, "method": "textDocument/hover", "params": 3}',
                            protocol.kInvalidParams)]:
            self.assertEqual(self.Errors(client, [body]), [code], body[:40])
        self.assertEqual(client.server.state, 'running')
        self.assertEqual(client.Text(), 'def f():\n    pass\n')

    def testBadFieldsInRequests(self):
        client = CClient()
        client.Open('def f():\n    pass\n')
        for params in [{}, {'textDocument': 'file:///t.py'}, {'textDocument': {'uri': 3}},
                       {'textDocument': {'uri': 'file:///other.py'}, 'position': {'line': 0, 'character': 0}},
                       {'textDocument': {'uri': 'file:///t.py'}},
                       {'textDocument': {'uri': 'file:///t.py'}, 'position': {'line': -1, 'character': 0}},
                       {'textDocument': {'uri': 'file:///t.py'}, 'position': {'line': True, 'character': 0}},
                       {'textDocument': {'uri': 'file:///t.py'}, 'position': {'line': 9, 'character': 0}}]:
            answer = client.Request('scope/scopeAt', params, raw=True)
            self.assertEqual(answer['error']['code'], protocol.kInvalidParams, params)

    def testBadChangesLeaveTheDocumentAsItWas(self):
        client = CClient()
        text = 'def f():\n    pass\n'
        client.Open(text)
        symbols = client.Symbols()
        for changes, version in [([Change(5, 0, 5, 0, 'x')], 2), ([Change(0, 0, 3, 1, '')], 2),
                                 ([Change(1, 4, 0, 0, 'x')], 2), ([Change(0, 0, 0, 0, 7)], 2),
                                 ([{'range': {'start': {'line': 0}}, 'text': 'x'}], 2),
                                 ([Change(0, 0, 0, 0, 'x'), Change(9, 0, 9, 0, 'y')], 2),
                                 ('x', 2), ([Change(0, 0, 0, 0, 'x')], 1), ([Change(0, 0, 0, 0, 'x')], 0)]:
            sent = client.Change(changes, version=version)
            self.assertEqual([m['method'] for m in sent], ['window/logMessage'], changes)
            self.assertEqual(client.Text(), text)
        self.assertEqual(client.Symbols(), symbols)
        # Not opened, or closed: a warning, the open ones untouched.
        sent = client.Change([Change(0, 0, 0, 0, 'x')], uri='file:///other.py', version=2)
        self.assertEqual([m['method'] for m in sent], ['window/logMessage'])
        client.Notify('textDocument/didClose', {'textDocument': {'uri': 'file:///t.py'}})
        self.assertEqual(client.server.documents, {})
        # The end of the text just past its last line is a place.
        client.Open(text)
        client.Change([Change(2, 0, 2, 0, 'x = 1\n')])
        self.assertEqual(client.Text(), text + 'x = 1\n')

    def testAFailingDocumentIsAnInternalError(self):
        class CFailing(lsp_support.Document):
            def GetOutline(self):
                raise RuntimeError('boom')
        client = CClient(document_class=CFailing)
        client.Open('x = 1\n')
        self.assertEqual(client.Request('textDocument/documentSymbol', {
            'textDocument': {'uri': 'file:///t.py'}}, raw=True)['error']['code'], protocol.kInternalError)
        self.assertEqual(client.Request('scope/scopeAt', {'textDocument': {'uri': 'file:///t.py'},
                                                          'position': {'line': 0, 'character': 0}})['scope'], '')


@unittest.skipIf(kSkipReason, kSkipReason)
class PipesTest(unittest.TestCase):
    """The server as a command: framing on real pipes, exit and a vanished client."""

    def Start(self):
        return subprocess.Popen([sys.executable, '-m', 'pysource.scopeserver'], stdin=subprocess.PIPE,
                                stdout=subprocess.PIPE, stderr=subprocess.PIPE,
                                env=lsp_support.ServerEnvironment())

    def Message(self, method, params, msg_id=None):
        msg = {'jsonrpc': '2.0', 'method': method, 'params': params}
        if msg_id is not None:
            msg['id'] = msg_id
        return Frame(json.dumps(msg).encode('utf-8'))

    def testASessionOverPipes(self):
        server = self.Start()
        data = (self.Message('initialize', {'capabilities': {}}, 1) + b'junk\r\n\r\n' +
                self.Message('textDocument/didOpen', {'textDocument': {
                    'uri': 'file:///p.py', 'languageId': 'python', 'version': 1, 'text': kSample}}) +
                self.Message('textDocument/documentSymbol', {'textDocument': {'uri': 'file:///p.py'}}, 2) +
                self.Message('shutdown', None, 3) + self.Message('exit', None))
        out, err = server.communicate(data, **({'timeout': 60} if PY3 else {}))
        self.assertEqual(server.returncode, 0, err)
        reader = CMessageReader(Feed([out]))
        answers = {}
        while True:
            body = reader.ReadMessage()
            if body is None:
                break
            msg = json.loads(body.decode('utf-8'))
            answers[msg.get('id', msg.get('method'))] = msg
        self.assertEqual(answers[2]['result'], ExpectedSymbols(kSample))
        self.assertIn(b'bad header skipped', err)
        self.assertEqual(answers[3]['result'], None)

    def testAClientThatGoesAwayEndsTheServer(self):
        server = self.Start()
        server.stdin.write(self.Message('initialize', {'capabilities': {}}, 1) + b'Content-Length: 50\r\n\r\n{')
        server.stdin.close()
        deadline = time.time() + 30
        while server.poll() is None and time.time() < deadline:
            time.sleep(0.05)
        self.assertEqual(server.returncode, 1)
        err = server.stderr.read()
        self.assertNotIn(b'Traceback', err)
        self.assertIn(b'ended inside a message', err)
        server.stdout.close()
        server.stderr.close()

    def testAClientThatStopsReadingEndsTheServer(self):
        server = self.Start()
        server.stdout.close()
        try:
            server.stdin.write(self.Message('initialize', {'capabilities': {}}, 1) +
                               self.Message('textDocument/didOpen', {'textDocument': {
                                   'uri': 'file:///p.py', 'languageId': 'python', 'version': 1,
                                   'text': kSample}}) +
                               self.Message('textDocument/documentSymbol',
                                            {'textDocument': {'uri': 'file:///p.py'}}, 2))
            server.stdin.close()
        except (IOError, OSError):
            pass  # it is gone already
        self.assertEqual(server.wait(), 1)
        err = server.stderr.read()
        server.stderr.close()
        self.assertIn(b'the client went away', err)
        self.assertNotIn(b'Traceback', err)
        self.assertNotIn(b'Exception ignored', err)


if __name__ == '__main__':
    unittest.main()
