"""A language server that keeps the outline of Python files exact as they
are edited, on pysource.scopedocument: document symbols, folding ranges,
the scope at a position (hover and the scope/scopeAt request), and the
reader's error as a diagnostic. Run it as `python -m pysource.scopeserver`.

framing    the protocol's header framing over byte streams
protocol   JSON-RPC messages, error codes, checked parameters
positions  columns between the client's encoding and the document's
symbols    the outline as DocumentSymbol and FoldingRange JSON
workspace  one open text: edits, answers, diagnostics
server     the lifecycle, the handlers and the read loop
document   which document class holds the texts
"""
