"""Makes the built packages importable for the scripts in tools/."""

import os
import sys

kToolsDir = os.path.dirname(os.path.abspath(__file__))
kRepoDir = os.path.dirname(kToolsDir)


def setup():
    """Imports pysource.scopebodycache, falling back to <repo>/build/python.

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
        sys.path.insert(0, os.path.join(kRepoDir, 'build', 'python'))
        import pysource.scopebodycache  # noqa: F401
    return kRepoDir
