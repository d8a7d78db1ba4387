// What the document uses of the modules beside it, bound once at import.
// They are kept for the life of the process, as the module is.
#include "common/pycompat.hpp"
#include "pysource/scopedocument/document.hpp"

namespace sdoc {

Imports gImports = {};

namespace {

PyObject* attributeOf(const char* module, const char* name) {
    py::Ref m = py::check(PyImport_ImportModule(module));
    return py::check(PyObject_GetAttrString(m.get(), name)).release();
}

}  // namespace

void bindImports() {
    gImports.decodeSource = attributeOf("pysource.logicals", "_SourceText");
    gImports.changeFinder = attributeOf("pysource.scopebodycache", "CChangeFinder");
    gImports.bodyCache = attributeOf("pysource.scopebodycache", "CScopeBodyCache");
    gImports.fullName = attributeOf("pysource.scopebodycache", "GetFullNameForScopeDef");
    PyObject* type = attributeOf("pysource._fastaccess", "LogicalLineType");
    if (!PyType_Check(type)) {
        PyErr_SetString(PyExc_ImportError, "pysource._fastaccess.LogicalLineType is not a type");
        py::fail();
    }
    gImports.logicalType = reinterpret_cast<PyTypeObject*>(type);
    gImports.emptyName = py::check(compat::internStr("")).release();
    gImports.syntaxError = PyExc_SyntaxError;
    gImports.findChanges = py::check(compat::internStr("FindChanges")).release();
    gImports.clear = py::check(compat::internStr("Clear")).release();
    gImports.getBodyOfScope = py::check(compat::internStr("GetBodyOfScope")).release();
    gImports.getScopeDef = py::check(compat::internStr("GetScopeDef")).release();
}

}  // namespace sdoc
