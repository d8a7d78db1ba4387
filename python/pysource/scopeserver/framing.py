"""Messages framed as the Language Server Protocol frames them: header
lines ("Name: value", ended by CRLF), an empty line, then a body of exactly
Content-Length bytes.

The reader owns its buffer so that it can skip a bad header: it discards
input up to the next "Content-Length:" and goes on from there. A body is
JSON text, so the next header name rarely appears inside one; when it
does, the message after the bad one is lost too, and the reader resyncs
again at the next header.
"""

import re

# A header block this long without its empty line is not a header.
kMaxHeaderBytes = 8192
# A larger body is refused: a corrupt length would otherwise swallow every
# later message while the reader waits for the body.
kMaxBodyBytes = 1 << 30
kChunk = 1 << 16

_kHeaderStart = re.compile(br'(?i)content-length[ \t]*:')
# Enough bytes kept from a discarded tail to still find a header name cut
# across two reads.
_kKeepTail = len(b'content-length:') + 8


class FramingError(Exception):
    """A header block that cannot be framed; the reader has skipped past it."""


class CMessageReader(object):
    """Reads framed bodies from `read(n)`, a function that returns up to `n`
    bytes, blocking only when none are ready, and b'' at the end of input
    (os.read on a pipe, or a test's feed)."""

    def __init__(self, read):
        self._read = read
        self._buf = bytearray()
        self._pos = 0
        self._eof = False
        self.truncated = False  # the input ended inside a message

    def _Fill(self, wanted=kChunk):
        if self._eof:
            return False
        if self._pos and self._pos >= len(self._buf) // 2:
            del self._buf[:self._pos]
            self._pos = 0
        data = self._read(max(wanted, kChunk))
        if not data:
            self._eof = True
            return False
        self._buf += data
        return True

    def HasBuffered(self):
        """Whether the next message (or framing error) is already buffered,
        so that reading it does not wait for input."""
        ends = self._HeaderEnd()
        if ends is None:
            return False
        try:
            length = self._Length(bytes(self._buf[self._pos:ends[0]]))
        except FramingError:
            return True
        return len(self._buf) - ends[1] >= length

    def _HeaderEnd(self):
        """(where the header block's empty line starts, where the body
        starts), or None while the block is not all buffered."""
        buf = self._buf
        pos = self._pos
        while True:
            nl = buf.find(b'\n', pos)
            if nl < 0:
                return None
            line_end = nl - 1 if nl > pos and buf[nl - 1] == 0x0D else nl
            if line_end == pos:
                if pos == self._pos:
                    # Empty lines before a header are stray line ends: skipped.
                    self._pos = pos = nl + 1
                    continue
                return pos, nl + 1
            pos = nl + 1

    def ReadMessage(self):
        """The next body (bytes), or None at the end of input. Raises
        FramingError for a bad header block, after skipping it."""
        while True:
            ends = self._HeaderEnd()
            if ends is not None:
                break
            if len(self._buf) - self._pos > kMaxHeaderBytes:
                self._Resync()
                raise FramingError('a header block longer than %d bytes' % kMaxHeaderBytes)
            if not self._Fill():
                if self._buf[self._pos:].strip():
                    self.truncated = True
                return None
        try:
            length = self._Length(bytes(self._buf[self._pos:ends[0]]))
        except FramingError:
            self._Resync()
            raise
        start = ends[1]
        while len(self._buf) - start < length:
            before = self._pos
            if not self._Fill(length - (len(self._buf) - start)):
                self.truncated = True
                return None
            start -= before - self._pos  # the buffer may have been compacted
        body = bytes(self._buf[start:start + length])
        self._pos = start + length
        return body

    @staticmethod
    def _Length(header):
        length = None
        for line in header[:-1].split(b'\n'):  # the block ends with its last line's '\n'
            line = line.rstrip(b'\r')
            name, colon, value = line.partition(b':')
            if not colon or not name.strip():
                raise FramingError('a header line without a name: %r' % line[:80])
            name, value = name.strip().lower(), value.strip()
            if name == b'content-length':
                if length is not None:
                    raise FramingError('Content-Length given twice')
                if not value.isdigit():
                    raise FramingError('Content-Length is not a number: %r' % value[:40])
                length = int(value)
                if length > kMaxBodyBytes:
                    raise FramingError('Content-Length %d is more than %d' % (length, kMaxBodyBytes))
            elif name == b'content-type':
                charset = re.search(br'(?i)charset\s*=\s*"?([\w-]+)', value)
                if charset and charset.group(1).lower() not in (b'utf-8', b'utf8'):
                    raise FramingError('only UTF-8 bodies are read, not %r' % charset.group(1))
        if length is None:
            raise FramingError('a header block without Content-Length')
        return length

    def _Resync(self):
        """Drops input up to the next header name after the start of the bad
        block: one glued to the end of a stray body is found too."""
        self._pos += 1
        while True:
            match = _kHeaderStart.search(self._buf, self._pos)
            if match:
                self._pos = match.start()
                return
            self._pos = max(self._pos, len(self._buf) - _kKeepTail)
            if not self._Fill():
                self._pos = len(self._buf)
                return


def Frame(body):
    """`body` (bytes) with its header."""
    return b'Content-Length: ' + str(len(body)).encode('ascii') + b'\r\n\r\n' + body


class CMessageWriter(object):
    """Writes framed bodies to a binary stream and flushes after each."""

    def __init__(self, stream):
        self._stream = stream

    def WriteMessage(self, body):
        header = b'Content-Length: ' + str(len(body)).encode('ascii') + b'\r\n\r\n'
        if len(body) < kChunk:
            self._stream.write(header + body)
        else:
            # No copy of a large body just to prepend its header.
            self._stream.write(header)
            self._stream.write(body)
        self._stream.flush()
