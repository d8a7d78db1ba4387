"""python -m pysource.scopeserver [--log FILE] [--verbose]

Speaks the Language Server Protocol on stdin and stdout."""

import argparse
import os
import sys

from .document import DocumentClass
from .server import Serve


def Main(argv=None):
    parser = argparse.ArgumentParser(prog='python -m pysource.scopeserver',
                                     description='A language server for the scope outline of Python files.')
    parser.add_argument('--log', metavar='FILE', help='append the log to FILE instead of stderr')
    parser.add_argument('--verbose', action='store_true', help='log every dropped message too')
    args = parser.parse_args(argv)
    log = open(args.log, 'a') if args.log else sys.stderr
    try:
        document_class = DocumentClass()
    except ImportError as exc:
        log.write('scopeserver: no document class: %s\n' % exc)
        return 2
    stdin_fd = sys.stdin.fileno()
    stdout = getattr(sys.stdout, 'buffer', sys.stdout)
    # Anything printed by mistake goes to the log, never into the protocol's stream.
    sys.stdout = log
    code = Serve(stdin_fd, stdout, document_class=document_class, log=log, verbose=args.verbose)
    # Whatever is still buffered for a client that went away goes nowhere at exit.
    try:
        os.dup2(os.open(os.devnull, os.O_WRONLY), stdout.fileno())
    except (OSError, AttributeError, ValueError):
        pass
    return code


if __name__ == '__main__':
    sys.exit(Main())
