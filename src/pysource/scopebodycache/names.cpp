#include "pysource/scopebodycache/names.hpp"

#include "common/pyref.hpp"

#include <cstring>
#include <string>

namespace sbc {

Names gNames;

namespace {
PyObject* intern(const char* text) { return py::check(PyString_InternFromString(text)).release(); }
}  // namespace

void internNames() {
    gNames.empty = intern("");
    gNames.star = intern("*");
    gNames.fastaccess = intern("_fastaccess");
    gNames.symbolinfo = intern("symbolinfo");
    gNames.GetFullNameForScopeDef = intern("GetFullNameForScopeDef");
    gNames.IndexForLineno = intern("IndexForLineno");
    gNames.FindIndexOfLogical = intern("FindIndexOfLogical");
    gNames.LeafScopeNameHasIndex = intern("LeafScopeNameHasIndex");
    gNames.dict = intern("__dict__");
    gNames.update = intern("update");
    gNames.startswith = intern("startswith");
    gNames.unpickleChangeFinder = intern("__pyx_unpickle_CChangeFinder");
    gNames.unpickleScopeBodyCache = intern("__pyx_unpickle_CScopeBodyCache");
    gNames.GetBodyOfScope = intern("GetBodyOfScope");
    gNames.GetScopeDef = intern("GetScopeDef");
    gNames.FindScopeDef = intern("_FindScopeDef");
    gNames.FindBodyOfScopeDef = intern("_FindBodyOfScopeDef");
}

void raiseNotLogical() { raise(PyExc_TypeError, msg::kNotLogical); }

void raiseExpectedType(const char* expected, PyObject* got) {
    PyErr_Format(PyExc_TypeError, msg::kExpectedType, expected, Py_TYPE(got)->tp_name);
    py::fail();
}

void raiseNoneAttribute(const char* attribute) {
    PyErr_Format(PyExc_AttributeError, msg::kNoneNoAttribute, attribute);
    py::fail();
}

void raise(PyObject* type, const char* text) {
    PyErr_SetString(type, text);
    py::fail();
}

void raiseWithRepr(PyObject* type, const char* templ, PyObject* value) {
    py::Ref r = py::check(PyObject_Repr(value));
    std::string text(templ);
    const auto at = text.find("{}");
    text.replace(at, 2, PyString_AS_STRING(r.get()), PyString_GET_SIZE(r.get()));
    py::Ref message = py::check(PyString_FromStringAndSize(text.data(), text.size()));
    PyErr_SetObject(type, message.get());
    py::fail();
}

}  // namespace sbc
