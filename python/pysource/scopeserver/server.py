"""The scope server: the protocol's lifecycle, text sync and the outline
requests over the open documents, and the loop that reads and answers
framed messages.

Messages are handled one at a time, in order. Whatever one message holds,
the server answers it (an error for a request, a logged warning for a
notification) and goes on with the next; no bad input changes a document
half way.
"""

import json
import os
import sys
import traceback

from . import positions, protocol
from .document import DocumentClass
from .framing import CMessageReader, CMessageWriter, FramingError
from .protocol import (CRawJson, CRequestError, Field, IsList, IsObject, IsStr, kInvalidParams,
                       kInvalidRequest, kMethodNotFound, kServerNotInitialized)
from .workspace import CChange, COpenDocument

_kPy2 = sys.version_info[0] == 2
if _kPy2:
    from urllib import unquote
    from urlparse import urlparse
else:
    from urllib.parse import unquote, urlparse

kServerName = 'pysource.scopeserver'
kServerVersion = '1.0'
# The custom request: the scope at a position.
kScopeAtMethod = 'scope/scopeAt'

kUninitialized, kRunning, kShutDown = 'uninitialized', 'running', 'shut down'


def FilenameOf(uri):
    """The path of a file: URI (the URI itself otherwise), as a str."""
    if _kPy2 and not isinstance(uri, str):
        uri = uri.encode('utf-8')
    parsed = urlparse(uri)
    if parsed.scheme == 'file':
        return unquote(parsed.path) or uri
    return uri


class CScopeServer(object):
    """Handles decoded messages; `send(text)` writes one JSON message."""

    def __init__(self, send, document_class=None, log=None, verbose=False):
        self._send = send
        self._document_class = document_class
        self._log = log if log is not None else sys.stderr
        self._verbose = verbose
        self.state = kUninitialized
        self.encoding = positions.kUtf16
        self.documents = {}
        self.exit_code = None
        self._requests = {
            'initialize': self._Initialize,
            'shutdown': self._Shutdown,
            'textDocument/documentSymbol': self._DocumentSymbol,
            'textDocument/foldingRange': self._FoldingRange,
            'textDocument/hover': self._Hover,
            kScopeAtMethod: self._ScopeAt,
        }
        self._notifications = {
            'initialized': None,
            'exit': self._Exit,
            'textDocument/didOpen': self._DidOpen,
            'textDocument/didChange': self._DidChange,
            'textDocument/didClose': self._DidClose,
            '$/cancelRequest': None,
        }

    # --- Messages ----------------------------------------------------------------

    def HandleBodies(self, bodies):
        """Handles the bodies read together, in order; a request cancelled
        by a later one of them is answered RequestCancelled without being run."""
        messages = [self._Decode(body) for body in bodies]
        cancelled = set()
        for msg in messages:
            if isinstance(msg, dict) and msg.get('method') == '$/cancelRequest':
                params = msg.get('params')
                if isinstance(params, dict) and protocol.IsId(params.get('id')):
                    cancelled.add(params['id'])
        for msg in messages:
            if isinstance(msg, _CUndecodable):
                self._send(protocol.ErrorResponse(None, protocol.kParseError, msg.reason))
            elif cancelled and isinstance(msg, dict) and 'method' in msg and \
                    protocol.IsId(msg.get('id')) and msg['id'] in cancelled:
                self._send(protocol.ErrorResponse(msg['id'], protocol.kRequestCancelled, 'cancelled'))
            else:
                self.HandleMessage(msg)
            if self.exit_code is not None:
                break

    def HandleBody(self, body):
        self.HandleBodies([body])

    @staticmethod
    def _Decode(body):
        try:
            return json.loads(body.decode('utf-8'))
        except Exception as exc:  # not UTF-8, not JSON, nested past the recursion limit
            return _CUndecodable('not JSON: %s' % exc)

    def HandleMessage(self, msg):
        if not isinstance(msg, dict):
            self._send(protocol.ErrorResponse(None, kInvalidRequest, 'a message is a JSON object'))
            return
        method = msg.get('method')
        has_id = 'id' in msg
        msg_id = msg.get('id')
        if has_id and not (protocol.IsId(msg_id) or msg_id is None):
            self._send(protocol.ErrorResponse(None, kInvalidRequest, 'an id is a number or a string'))
            return
        if method is None:
            if has_id and ('result' in msg or 'error' in msg):
                self.Log(protocol.kLogInfo, 'a response to a request never sent: %r' % (msg_id,))
            else:
                self._Invalid(msg_id if has_id else None, 'no method')
            return
        if msg.get('jsonrpc') != '2.0' or not IsStr(method):
            self._Invalid(msg_id if has_id else None, 'not a JSON-RPC 2.0 message')
            return
        params = msg.get('params')
        if params is not None and not isinstance(params, (dict, list)):
            if has_id:
                self._send(protocol.ErrorResponse(msg_id, kInvalidParams, 'params is an object'))
            else:
                self.Log(protocol.kLogWarning, '%s: params is not an object' % method)
            return
        if has_id:
            self._Request(msg_id, method, params)
        else:
            self._Notification(method, params)

    def _Invalid(self, msg_id, text):
        if msg_id is None:
            self.Log(protocol.kLogWarning, 'invalid message: %s' % text)
        self._send(protocol.ErrorResponse(msg_id, kInvalidRequest, text))

    def _Request(self, msg_id, method, params):
        if msg_id is None:
            self._Invalid(None, 'a request with a null id')
            return
        try:
            if self.state == kUninitialized and method != 'initialize':
                raise CRequestError(kServerNotInitialized, 'the server is not initialized')
            if self.state == kShutDown:
                raise CRequestError(kInvalidRequest, 'the server is shut down')
            handler = self._requests.get(method)
            if handler is None:
                raise CRequestError(kMethodNotFound, 'no such method: %s' % method)
            result = handler(params if params is not None else {})
        except CRequestError as exc:
            self._send(protocol.ErrorResponse(msg_id, exc.code, exc.message))
            return
        except Exception as exc:
            self.Log(protocol.kLogError, '%s failed:\n%s' % (method, traceback.format_exc()))
            self._send(protocol.ErrorResponse(msg_id, protocol.kInternalError,
                                              '%s: %s' % (type(exc).__name__, exc)))
            return
        self._send(protocol.Response(msg_id, result))

    def _Notification(self, method, params):
        if method == 'exit':
            self._Exit(params)
            return
        if self.state != kRunning:
            if self._verbose:
                self.Log(protocol.kLogInfo, '%s dropped: the server is %s' % (method, self.state))
            return
        if method not in self._notifications:
            if not method.startswith('$/') and self._verbose:
                self.Log(protocol.kLogInfo, 'notification ignored: %s' % method)
            return
        handler = self._notifications[method]
        if handler is None:
            return
        try:
            handler(params if params is not None else {})
        except CRequestError as exc:
            self.Log(protocol.kLogWarning, '%s ignored: %s' % (method, exc.message))
        except Exception:
            self.Log(protocol.kLogError, '%s failed:\n%s' % (method, traceback.format_exc()))

    def Log(self, level, text):
        """To stderr, and to the client as window/logMessage once it may get one."""
        if level <= protocol.kLogWarning or self._verbose:
            try:
                self._log.write('scopeserver: %s\n' % text)
                self._log.flush()
            except (IOError, OSError, ValueError):
                pass
        if self.state == kRunning and level <= protocol.kLogWarning:
            self._send(protocol.Notification('window/logMessage', {'type': level, 'message': text}))

    # --- Lifecycle ---------------------------------------------------------------

    def _Initialize(self, params):
        if self.state != kUninitialized:
            raise CRequestError(kInvalidRequest, 'initialize was sent already')
        if not isinstance(params, dict):
            raise CRequestError(kInvalidParams, 'initialize takes an object')
        caps = params.get('capabilities')
        general = caps.get('general') if isinstance(caps, dict) else None
        offered = general.get('positionEncodings') if isinstance(general, dict) else None
        self.encoding = positions.kUtf16
        if isinstance(offered, list):
            # The client's order is its preference.
            for name in offered:
                if name in positions.kEncodings:
                    self.encoding = str(name)
                    break
        if self._document_class is None:
            self._document_class = DocumentClass()
        self.state = kRunning
        return {
            'capabilities': {
                'positionEncoding': self.encoding,
                'textDocumentSync': {'openClose': True, 'change': 2},
                'documentSymbolProvider': True,
                'foldingRangeProvider': True,
                'hoverProvider': True,
                'experimental': {'scopeAtProvider': True},
            },
            'serverInfo': {'name': kServerName, 'version': kServerVersion},
        }

    def _Shutdown(self, params):
        self.state = kShutDown
        self.documents.clear()
        return None

    def _Exit(self, params):
        self.exit_code = 0 if self.state == kShutDown else 1

    # --- Text sync ---------------------------------------------------------------

    def _DidOpen(self, params):
        item = Field(params, 'textDocument', IsObject, 'an object')
        uri = Field(item, 'uri', IsStr, 'a string')
        text = Field(item, 'text', IsStr, 'a string')
        version = Field(item, 'version', protocol.IsInt, 'an integer', optional=True)
        if uri in self.documents:
            self.Log(protocol.kLogWarning, '%s was open already: its text is replaced' % uri)
        try:
            doc = self._document_class(positions.ToDocumentText(text), FilenameOf(uri))
        except (SyntaxError, TypeError, ValueError) as exc:
            self.documents.pop(uri, None)
            raise CRequestError(kInvalidParams, 'cannot hold %s: %s' % (uri, exc))
        opened = COpenDocument(uri, doc, version, self.encoding)
        self.documents[uri] = opened
        self._Publish(opened)

    def _DidChange(self, params):
        item = Field(params, 'textDocument', IsObject, 'an object')
        uri = Field(item, 'uri', IsStr, 'a string')
        version = Field(item, 'version', protocol.IsInt, 'an integer', optional=True)
        raw = Field(params, 'contentChanges', IsList, 'a list')
        opened = self.documents.get(uri)
        if opened is None:
            raise CRequestError(kInvalidParams, '%s is not open' % uri)
        if version is not None and opened.version is not None and version <= opened.version:
            raise CRequestError(kInvalidParams, 'version %d of %s after version %d: not applied' % (
                version, uri, opened.version))
        changes = []
        for change in raw:
            text = Field(change, 'text', IsStr, 'a string')
            if 'range' in change:
                start, end = protocol.Range(change)
                changes.append(CChange(start, end, text))
            else:
                changes.append(CChange(None, None, text))
        opened.CheckChanges(changes)
        opened.Apply(changes, version if version is not None else opened.version)
        self._Publish(opened)

    def _DidClose(self, params):
        uri = protocol.DocumentUri(params)
        opened = self.documents.pop(uri, None)
        if opened is None:
            raise CRequestError(kInvalidParams, '%s is not open' % uri)
        if opened.published is not None:
            self._send(protocol.Notification('textDocument/publishDiagnostics',
                                              {'uri': uri, 'diagnostics': []}))

    def _Publish(self, opened):
        """Publishes the reader's error when it is not the one published last."""
        error = opened.Error()
        if error == opened.published:
            return
        opened.published = error
        params = {'uri': opened.uri, 'diagnostics': opened.Diagnostics(error)}
        if opened.version is not None:
            params['version'] = opened.version
        self._send(protocol.Notification('textDocument/publishDiagnostics', params))

    # --- Requests ----------------------------------------------------------------

    def _Open(self, params):
        uri = protocol.DocumentUri(params)
        opened = self.documents.get(uri)
        if opened is None:
            raise CRequestError(kInvalidParams, '%s is not open' % uri)
        return opened

    def _DocumentSymbol(self, params):
        return CRawJson(self._Open(params).SymbolsJson())

    def _FoldingRange(self, params):
        return CRawJson(self._Open(params).FoldingJson())

    def _ScopeAnswer(self, params):
        opened = self._Open(params)
        line, _ = protocol.Position(params)
        scope = opened.ScopeAt(line)
        error = opened.Error()
        answer = {'scope': scope, 'readable': error is None, 'error': None}
        if error is not None:
            answer['error'] = '%s: %s (line %s)' % (error[0], error[1], error[2])
        return answer

    def _ScopeAt(self, params):
        return self._ScopeAnswer(params)

    def _Hover(self, params):
        answer = self._ScopeAnswer(params)
        text = 'scope: %s' % (answer['scope'] or '(module)')
        if not answer['readable']:
            text += '\nfrom the last text that read; now %s' % answer['error']
        return {'contents': {'kind': 'plaintext', 'value': text}}


class _CUndecodable(object):
    """A body that is not JSON, and why."""

    def __init__(self, reason):
        self.reason = reason


def Serve(infd, outstream, server_factory=CScopeServer, **kwargs):
    """Reads framed messages from the file descriptor `infd` and answers on
    the binary `outstream` until `exit` or the end of input; returns the
    exit status."""
    reader = CMessageReader(lambda n: os.read(infd, n))
    writer = CMessageWriter(outstream)

    def Send(text):
        writer.WriteMessage(text.encode('utf-8'))

    server = server_factory(Send, **kwargs)
    body = b''
    try:
        while server.exit_code is None:
            bodies = []
            while True:
                try:
                    body = reader.ReadMessage()
                except FramingError as exc:
                    server.Log(protocol.kLogWarning, 'bad header skipped: %s' % exc)
                    if reader.HasBuffered():
                        continue
                    if bodies:
                        break
                    continue
                if body is None:
                    break
                bodies.append(body)
                if not reader.HasBuffered():
                    break
            if bodies:
                server.HandleBodies(bodies)
            if body is None:
                if reader.truncated:
                    server.Log(protocol.kLogWarning, 'the input ended inside a message')
                break
    except (IOError, OSError) as exc:
        # The client is gone (a closed pipe): nothing more can be said to it.
        sys.stderr.write('scopeserver: the client went away (%s)\n' % exc)
        return 1
    except KeyboardInterrupt:
        return 1
    if server.exit_code is not None:
        return server.exit_code
    return 0 if server.state == kShutDown else 1
