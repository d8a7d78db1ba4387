"""The document class the server keeps each text in.

The server is written against the document's interface; the class is
chosen here only. SCOPESERVER_DOCUMENT=module:Class in the environment
names another class with that interface (the tests and the benchmark use it
to run the whole-text reference document).
"""

import importlib
import os

kDocumentEnv = 'SCOPESERVER_DOCUMENT'


def DocumentClass():
    """The class named by SCOPESERVER_DOCUMENT, else CScopeDocument; raises
    ImportError with a readable message when it cannot be imported."""
    spec = os.environ.get(kDocumentEnv)
    if spec:
        module, _, name = spec.partition(':')
        try:
            return getattr(importlib.import_module(module), name or 'CScopeDocument')
        except (ImportError, AttributeError) as exc:
            raise ImportError('%s=%s cannot be imported: %s' % (kDocumentEnv, spec, exc))
    from pysource.scopedocument import CScopeDocument
    return CScopeDocument
