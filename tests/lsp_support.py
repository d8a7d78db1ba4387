"""What the scope server's suites share: the document class to run it on,
a client that talks to a server in-process, and the answers a fresh
document of a text gives (the oracle every answer is held against)."""

import json
import os
import re
import sys

from support import PY3, kRepoDir  # noqa: F401 (puts tools/ on the path)

kToolsDir = os.path.join(kRepoDir, 'tools')
kSamplePath = os.path.join(kRepoDir, 'samples', 'outline_sample.py')

try:
    from pysource.scopedocument import CScopeDocument as Document
    kDocumentSpec = None
except ImportError:
    # The native document is not built here: the whole-text one has its interface.
    from dockit.reference import CReferenceDocument as Document
    kDocumentSpec = 'dockit.reference:CReferenceDocument'

try:
    from pysource.scopeserver.server import CScopeServer
except (ImportError, SyntaxError):
    CScopeServer = None

# Why the server's suites cannot run here, or None.
kSkipReason = None
if CScopeServer is None:
    kSkipReason = 'pysource.scopeserver is not in the build for this interpreter'


def ServerEnvironment():
    """The environment that runs `python -m pysource.scopeserver` on this
    interpreter's build (and the whole-text document when no native one is)."""
    env = dict(os.environ)
    paths = [os.path.dirname(os.path.dirname(os.path.abspath(sys.modules['pysource'].__file__)))]
    if kDocumentSpec:
        env['SCOPESERVER_DOCUMENT'] = kDocumentSpec
        paths.append(kToolsDir)
    env['PYTHONPATH'] = os.pathsep.join(paths)
    return env


def Which(program):
    for folder in os.environ.get('PATH', '').split(os.pathsep):
        path = os.path.join(folder, program)
        if os.path.isfile(path) and os.access(path, os.X_OK):
            return path
    return None


def Unicode(text):
    """`text` as code points (2.7's document text is its UTF-8 bytes)."""
    return text if PY3 or not isinstance(text, str) else text.decode('utf-8')


def DocText(text):
    """`text` (code points) as the document holds it."""
    return text.encode('utf-8') if not PY3 and not isinstance(text, str) else text


class CClient(object):
    """Talks to a CScopeServer in-process: requests answered at once."""

    def __init__(self, encodings=None, document_class=None):
        self.sent = []
        self.server = CScopeServer(self.sent.append, document_class=document_class or Document,
                                   log=_NullLog())
        self._next = 0
        if encodings is not False:
            caps = {} if encodings is None else {'general': {'positionEncodings': encodings}}
            self.init = self.Request('initialize', {'processId': None, 'capabilities': caps})
            self.Notify('initialized', {})

    def Send(self, msg):
        before = len(self.sent)
        # Through JSON, as a message comes (2.7 then reads its strings as unicode).
        self.server.HandleMessage(json.loads(json.dumps(msg)))
        return [json.loads(text) for text in self.sent[before:]]

    def Request(self, method, params=None, raw=False):
        self._next += 1
        msg = {'jsonrpc': '2.0', 'id': self._next, 'method': method}
        if params is not None:
            msg['params'] = params
        answers = [a for a in self.Send(msg) if a.get('id') == self._next]
        assert len(answers) == 1, answers
        return answers[0] if raw else answers[0].get('result')

    def Notify(self, method, params):
        return self.Send({'jsonrpc': '2.0', 'method': method, 'params': params})

    def Open(self, text, uri='file:///t.py', version=1):
        return self.Notify('textDocument/didOpen', {'textDocument': {
            'uri': uri, 'languageId': 'python', 'version': version, 'text': text}})

    def Change(self, changes, uri='file:///t.py', version=None):
        doc = self.server.documents.get(uri)
        if version is None:
            version = (doc.version or 0) + 1 if doc else 1
        return self.Notify('textDocument/didChange', {
            'textDocument': {'uri': uri, 'version': version}, 'contentChanges': changes})

    def Symbols(self, uri='file:///t.py'):
        return self.Request('textDocument/documentSymbol', {'textDocument': {'uri': uri}})

    def Folding(self, uri='file:///t.py'):
        return self.Request('textDocument/foldingRange', {'textDocument': {'uri': uri}})

    def Text(self, uri='file:///t.py'):
        return self.server.documents[uri].doc.GetText()


class _NullLog(object):
    def write(self, text):
        pass

    def flush(self):
        pass


def Change(l1, c1, l2, c2, text):
    return {'range': {'start': {'line': l1, 'character': c1}, 'end': {'line': l2, 'character': c2}},
            'text': text}


def Units(text, encoding):
    if encoding == 'utf-8':
        return len(text.encode('utf-8'))
    if encoding == 'utf-16':
        return len(text.encode('utf-16-le')) // 2
    return len(text)


def Lines(text):
    """The lines as the client sees them: a '\\r' before '\\n' is not content."""
    lines = text.split('\n')
    return [l[:-1] if l.endswith('\r') and i < len(lines) - 1 else l for i, l in enumerate(lines)]


def _Position(lines, line, column, encoding):
    return {'line': line, 'character': Units(lines[line][:column], encoding)}


def ExpectedSymbols(text, encoding='utf-16'):
    """The document symbols a fresh document of `text` gives, worked out here
    from its outline and the text."""
    text = Unicode(text)
    lines = Lines(text)
    roots, nodes, kinds = [], {}, {}
    for name, kind, header, end in Document(text).GetOutline():
        name = Unicode(name)
        parent = name.rpartition('.')[0]
        bare = name.rpartition('.')[2].rpartition('#')[0]
        first = header - 1
        rest = '\n'.join(lines[first:first + 9])
        found = re.search(r'(?:def|class)(?:\s|\\\n)+(%s)(?![A-Za-z0-9_])' % re.escape(bare), rest)
        indent = len(lines[first]) - len(lines[first].lstrip())
        if found:
            before = rest[:found.start(1)]
            name_line = first + before.count('\n')
            name_col = len(before) - before.rfind('\n') - 1
            name_len = len(bare)
        else:  # a name the reader does not take as written: at the header's start
            name_line, name_col, name_len = first, indent, 0
        symbol = {
            'name': bare, 'detail': name,
            'kind': 5 if kind == 1 else (6 if kinds.get(parent) == 1 else 12),
            'range': {'start': _Position(lines, first, indent, encoding),
                      'end': _Position(lines, end - 1, len(lines[end - 1]), encoding)},
            'selectionRange': {'start': _Position(lines, name_line, name_col, encoding),
                               'end': _Position(lines, name_line, name_col + name_len, encoding)},
            'children': []}
        kinds[name] = kind
        nodes[name] = symbol
        (nodes[parent]['children'] if parent else roots).append(symbol)
    return roots


def ExpectedFolding(text):
    return [{'startLine': header - 1, 'endLine': end - 1}
            for _, _, header, end in Document(text).GetOutline() if end > header]


def Reads(text):
    return Document(text).IsReadable()
