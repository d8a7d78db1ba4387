// The logical-line record of pysource._fastaccess, as both that module and
// pysource.scopebodycache see it. Fields are read and written directly.
#pragma once

#include <Python.h>

#include <cstdint>

namespace contracts {

enum LogicalKind : uint8_t {
    kClassLogical = 1,
    kDefLogical = 2,
    kCommentLogical = 21,
    kBlankLogical = 22,
};

struct LogicalLineObject {
    PyObject_HEAD
    PyObject** fTokens;        // fTokenCount owned str references
    int32_t fLineno;
    Py_ssize_t fTokenCount;
    int16_t fIndent;
    uint8_t fKind;
    PyObject* fScopeName;       // owned, may be null (absent)
    PyObject* fLocalScopeName;  // owned, may be null (absent)
};

}  // namespace contracts
