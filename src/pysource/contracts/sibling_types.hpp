// Instance layouts of the sibling types that this module checks at import
// but does not use. Only their sizes matter here.
#pragma once

#include <Python.h>

namespace contracts {

// CLogger, CFullyScopedName, CDefInfo, _CHandlerRecord, _CEmissionStackItem.
struct PlainSiblingObject {
    PyObject_HEAD
};

// CBytesTokenizer and CSingleResolvedInfo carry a native method table
// (published in the type's dictionary under kVtableAttr).
struct VtabSiblingObject {
    PyObject_HEAD
    void* vtab;
};

}  // namespace contracts
