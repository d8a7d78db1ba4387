"""JSON-RPC 2.0 as the Language Server Protocol uses it: error codes,
message shapes, and checked access to parameters."""

import json
import sys

_kPy2 = sys.version_info[0] == 2
if _kPy2:
    _kIntTypes = (int, long)  # noqa: F821 (2.7 only)
    _kStrTypes = (str, unicode)  # noqa: F821
else:
    _kIntTypes = (int,)
    _kStrTypes = (str,)

kParseError = -32700
kInvalidRequest = -32600
kMethodNotFound = -32601
kInvalidParams = -32602
kInternalError = -32603
kServerNotInitialized = -32002
kRequestCancelled = -32800

# MessageType of window/logMessage.
kLogError = 1
kLogWarning = 2
kLogInfo = 3


class CRequestError(Exception):
    """Answered as the request's error response."""

    def __init__(self, code, message):
        Exception.__init__(self, message)
        self.code = code
        self.message = message


class CRawJson(object):
    """A result that is already JSON text (written into the response as is)."""

    __slots__ = ('text',)

    def __init__(self, text):
        self.text = text


def IsInt(value):
    return isinstance(value, _kIntTypes) and not isinstance(value, bool)


def IsStr(value):
    return isinstance(value, _kStrTypes)


def IsId(value):
    return IsInt(value) or IsStr(value)


def Field(obj, name, check, what, optional=False):
    """obj[name], checked by `check`; CRequestError(InvalidParams) naming
    the field when it is missing or wrong."""
    if not isinstance(obj, dict):
        raise CRequestError(kInvalidParams, 'expected an object holding %r' % name)
    if name not in obj:
        if optional:
            return None
        raise CRequestError(kInvalidParams, 'missing %r' % name)
    value = obj[name]
    if not check(value):
        raise CRequestError(kInvalidParams, '%r must be %s, not %s' % (
            name, what, json.dumps(value)[:60]))
    return value


def IsObject(value):
    return isinstance(value, dict)


def IsList(value):
    return isinstance(value, list)


def IsNatural(value):
    return IsInt(value) and value >= 0


def Position(obj, name='position'):
    """(line, character) of a Position field."""
    pos = Field(obj, name, IsObject, 'an object')
    return (Field(pos, 'line', IsNatural, 'an integer >= 0'),
            Field(pos, 'character', IsNatural, 'an integer >= 0'))


def Range(obj, name='range'):
    """((line, character), (line, character)) of a Range field."""
    rng = Field(obj, name, IsObject, 'an object')
    return Position(rng, 'start'), Position(rng, 'end')


def DocumentUri(params):
    doc = Field(params, 'textDocument', IsObject, 'an object')
    return Field(doc, 'uri', IsStr, 'a string')


def Response(msg_id, result):
    if isinstance(result, CRawJson):
        return '{"jsonrpc":"2.0","id":%s,"result":%s}' % (json.dumps(msg_id), result.text)
    return json.dumps({'jsonrpc': '2.0', 'id': msg_id, 'result': result})


def ErrorResponse(msg_id, code, message):
    return json.dumps({'jsonrpc': '2.0', 'id': msg_id,
                       'error': {'code': code, 'message': message}})


def Notification(method, params):
    return json.dumps({'jsonrpc': '2.0', 'method': method, 'params': params})
