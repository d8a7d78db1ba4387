// The texts of the errors the module raises, each written once, and the
// helpers that set an exception and throw. Where a text copies one of the
// interpreter's own messages, callers rely on it being that message.
#pragma once

#include "common/pycompat.hpp"
#include "common/pyref.hpp"

#include <string>

namespace msg {

inline constexpr const char* kNotLogical = "Argument must be a logical";
inline constexpr const char* kExpectedType = "Expected %.16s, got %.200s";
inline constexpr const char* kExpectedBytes =
    compat::kPython3 ? "expected str, %.200s found" : "expected bytes, %.200s found";
inline constexpr const char* kArgumentType =
    "Argument '%.200s' has incorrect type (expected %.200s, got %.200s)";
inline constexpr const char* kNoneHasNoLen = "object of type 'NoneType' has no len()";
inline constexpr const char* kNoneNotIterable = "'NoneType' object is not iterable";
inline constexpr const char* kNoneArgumentNotIterable = "argument of type 'NoneType' is not iterable";
inline constexpr const char* kNoneNoAttribute = "'NoneType' object has no attribute '%.30s'";
inline constexpr const char* kNoneNotSubscriptable = "'NoneType' object is not subscriptable";
inline constexpr const char* kListIndexOutOfRange = "list index out of range";
inline constexpr const char* kTupleIndexOutOfRange = "tuple index out of range";
// The interpreter's own texts of a failed `a, b = seq`.
inline constexpr const char* kNeedMoreValues = compat::kPython3
                                                   ? "not enough values to unpack (expected 2, got %zd)"
                                                   : "need more than %zd value%.1s to unpack";
inline constexpr const char* kTooManyValues = "too many values to unpack (expected %zd)";
inline constexpr const char* kNegativeToUnsigned = "can't convert negative value to unsigned long long";
// As the interpreter words it: later 3.x versions refuse such a call
// before it reaches the module, and every 3.x should read the same.
inline constexpr const char* kKeywordsMustBeStrings =
    compat::kPython3 ? "keywords must be strings" : "%.200s() keywords must be strings";
inline constexpr const char* kNameNotDefined = "name '%.200s' is not defined";
inline constexpr const char* kRecursive = "FindChanges cannot be called recursively";
inline constexpr const char* kNoScopeFound = "No logical found for scope name: {}";
inline constexpr const char* kMustStartScope = "logical must start a scope: {}";
inline constexpr const char* kDefNotInList = "scope defining logical is not in logical list";
inline constexpr const char* kScopeNotFound =
    "the logical at index %zd cannot be given a scope name: a logical before it has none yet "
    "(one inserted without being passed as added?)";
inline constexpr const char* kCommentRunStuck =
    "_ProcessDedentedComments answered %zd for the comment or blank line at index %zd, so the "
    "lines from there could not be given scope names (the step reported why)";

[[noreturn]] inline void raise(PyObject* type, const char* text) {
    PyErr_SetString(type, text);
    py::fail();
}

// "Expected <expected>, got <type of got>"
[[noreturn]] inline void raiseExpectedType(const char* expected, PyObject* got) {
    PyErr_Format(PyExc_TypeError, kExpectedType, expected, Py_TYPE(got)->tp_name);
    py::fail();
}

// The AttributeError of calling a method on None.
[[noreturn]] inline void raiseNoneAttribute(const char* attribute) {
    PyErr_Format(PyExc_AttributeError, kNoneNoAttribute, attribute);
    py::fail();
}

// `a, b = seq` with `found` items.
[[noreturn]] inline void raiseUnpackCount(Py_ssize_t found) {
    if (found < 2) {
        PyErr_Format(PyExc_ValueError, kNeedMoreValues, found, found == 1 ? "" : "s");
    } else {
        PyErr_Format(PyExc_ValueError, kTooManyValues, Py_ssize_t(2));
    }
    py::fail();
}

// The template's `{}` replaced with repr(value).
[[noreturn]] inline void raiseWithRepr(PyObject* type, const char* templ, PyObject* value) {
    py::Ref r = py::check(PyObject_Repr(value));
    const std::string_view shown = compat::strView(r.get());
    std::string text(templ);
    const auto at = text.find("{}");
    text.replace(at, 2, shown.data(), shown.size());
    py::Ref message = py::check(compat::strFromBytes(text.data(), static_cast<Py_ssize_t>(text.size())));
    PyErr_SetObject(type, message.get());
    py::fail();
}

}  // namespace msg
