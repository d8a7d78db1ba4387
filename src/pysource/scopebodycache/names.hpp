// Strings interned once at import: attribute names looked up at each call,
// the empty scope name, and the texts of the module's own messages.
#pragma once

#include <Python.h>

namespace sbc {

struct Names {
    PyObject* empty;  // "", the module scope
    PyObject* star;   // "*"
    PyObject* fastaccess;
    PyObject* symbolinfo;
    PyObject* GetFullNameForScopeDef;
    PyObject* IndexForLineno;
    PyObject* FindIndexOfLogical;
    PyObject* LeafScopeNameHasIndex;
    PyObject* dict;
    PyObject* update;
    PyObject* startswith;
    PyObject* unpickleChangeFinder;
    PyObject* unpickleScopeBodyCache;
    PyObject* GetBodyOfScope;
    PyObject* GetScopeDef;
    PyObject* FindScopeDef;
    PyObject* FindBodyOfScopeDef;
};

extern Names gNames;

void internNames();

namespace msg {
inline constexpr const char* kNotLogical = "Argument must be a logical";
inline constexpr const char* kExpectedType = "Expected %.16s, got %.200s";
inline constexpr const char* kNoneHasNoLen = "object of type 'NoneType' has no len()";
inline constexpr const char* kNoneNotIterable = "'NoneType' object is not iterable";
inline constexpr const char* kNoneNoAttribute = "'NoneType' object has no attribute '%.30s'";
inline constexpr const char* kNoneNotSubscriptable = "'NoneType' object is not subscriptable";
inline constexpr const char* kRecursive = "FindChanges cannot be called recursively";
inline constexpr const char* kNoScopeFound = "No logical found for scope name: {}";
inline constexpr const char* kMustStartScope = "logical must start a scope: {}";
inline constexpr const char* kDefNotInList = "scope defining logical is not in logical list";
inline constexpr const char* kNeedMoreValues = "need more than %zd value%.1s to unpack";
inline constexpr const char* kTooManyValues = "too many values to unpack (expected %zd)";
}  // namespace msg

// Raise helpers: set the exception and throw.
[[noreturn]] void raiseNotLogical();
[[noreturn]] void raiseExpectedType(const char* expected, PyObject* got);
[[noreturn]] void raiseNoneAttribute(const char* attribute);
[[noreturn]] void raise(PyObject* type, const char* text);
// `{}` in the template replaced with repr(value).
[[noreturn]] void raiseWithRepr(PyObject* type, const char* templ, PyObject* value);

}  // namespace sbc
