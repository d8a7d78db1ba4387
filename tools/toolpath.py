"""Makes the built packages importable for the scripts in tools/."""

import errno
import os
import subprocess
import sys

kToolsDir = os.path.dirname(os.path.abspath(__file__))
kRepoDir = os.path.dirname(kToolsDir)


def BuildDir():
    """Where scripts/build.sh builds for the running interpreter: build/ for
    2.7, build-pyX.Y/ for another."""
    if sys.version_info[:2] == (2, 7):
        return os.path.join(kRepoDir, 'build')
    return os.path.join(kRepoDir, 'build-py%d.%d' % sys.version_info[:2])


def setup():
    """Imports pysource.scopebodycache, falling back to the build directory's
    python/ (BuildDir).

    Returns the repository root.
    """
    try:
        import pysource.scopebodycache  # noqa: F401
    except ImportError:
        # A stale half-import (e.g. the source tree's pysource without the
        # built extensions) would shadow the build directory.
        for name in list(sys.modules):
            if name.split('.')[0] in ('pysource', 'tallowkit'):
                del sys.modules[name]
        sys.path.insert(0, os.path.join(BuildDir(), 'python'))
        import pysource.scopebodycache  # noqa: F401
    return kRepoDir


def ReadSource(path):
    """The text of the source file at `path` with newlines made '\\n', as
    2.7's universal-newline read gives it: bytes on 2.7; on 3.x str,
    decoded as the file declares (SyntaxError or UnicodeDecodeError when it
    cannot be)."""
    if sys.version_info[0] == 2:
        with open(path, 'rU') as f:
            return f.read()
    import io
    import tokenize
    with open(path, 'rb') as f:
        data = f.read()
    encoding, _ = tokenize.detect_encoding(io.BytesIO(data).readline)
    text = data.decode(encoding)
    if text.startswith(u'\ufeff'):
        text = text[1:]
    return text.replace(u'\r\n', u'\n').replace(u'\r', u'\n')


def PyenvRoot():
    """Where pyenv keeps its interpreters."""
    root = os.environ.get('PYENV_ROOT')
    if root:
        return root
    try:
        return subprocess.check_output(['pyenv', 'root']).decode().strip()
    except (OSError, subprocess.CalledProcessError):
        return os.path.expanduser('~/.pyenv')


def StdlibDir():
    """The standard library of the running interpreter."""
    return os.path.dirname(os.path.abspath(os.__file__))


def StdlibFiles(root=None):
    """Sorted paths of the .py files under root (default: the standard
    library), test/ included, site-packages not."""
    paths = []
    for dirpath, dirnames, filenames in os.walk(root or StdlibDir()):
        dirnames[:] = sorted(d for d in dirnames if d != 'site-packages')
        paths.extend(os.path.join(dirpath, f) for f in filenames if f.endswith('.py'))
    return sorted(paths)


def RunMain(main):
    """Runs a tool's main() and exits with its status; a reader that stops
    early (`tool | head`) ends the tool quietly."""
    try:
        status = main()
        sys.stdout.flush()
    except IOError as exc:  # BrokenPipeError on 3.x is one too
        if exc.errno != errno.EPIPE:
            raise
        # Whatever is still buffered would fail again at exit: point stdout at nothing.
        os.dup2(os.open(os.devnull, os.O_WRONLY), sys.stdout.fileno())
        status = 1
    sys.exit(status)
