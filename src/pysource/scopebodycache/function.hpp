// The module's function object: every Python-visible function and method of
// the module is one of these, so that each reports its own __module__ and
// qualified name, and so that one argument parser serves them all.
#pragma once

#include "common/pyref.hpp"

#include <cstdint>

namespace sbc {

// What the parser checks of a parameter before the function runs.
enum class ArgCheck : uint8_t {
    Any,
    List,   // exactly list, or None
    Str,    // exactly str, or None
    Set,    // exactly set, or None
};

struct Param {
    const char* name;
    ArgCheck check;
};

constexpr int kMaxParams = 4;

// The implementation gets the parsed arguments; a missing optional one is
// nullptr. `self` is the instance for methods and nullptr for functions.
using Impl = PyObject* (*)(PyObject* self, PyObject* const* argv);

struct FunctionSpec {
    const char* name;
    const char* doc;  // nullptr: no docstring
    Impl impl;
    uint8_t required;
    uint8_t total;
    Param params[kMaxParams];
    // __init__ takes keywords even with a single parameter.
    bool isInit = false;
};

// Parsed arguments. Each is held for the whole call: one given by keyword is
// borrowed from the caller's own dict, which Python code run by the call (an
// override, a key's __eq__ during the parse) may clear.
class ParsedArgs {
public:
    void set(int i, PyObject* value) {
        held_[i] = py::Ref::own(value);
        argv_[i] = value;
    }
    PyObject* const* argv() const noexcept { return argv_; }
    PyObject* operator[](int i) const noexcept { return argv_[i]; }

private:
    PyObject* argv_[kMaxParams] = {};  // nullptr: an optional one not given
    py::Ref held_[kMaxParams];
};

// Parses args[first:] and `kwargs` by `spec`. Throws with the interpreter's
// argument error set.
void parseArgs(const FunctionSpec& spec, PyObject* args, Py_ssize_t first, PyObject* kwargs,
               ParsedArgs& out);

// Makes the function type ready; once, at import.
void readyFunctionType();

// A module-level function reporting `module` as its __module__.
py::Ref newFunction(const FunctionSpec& spec, const char* module);

// A method of `owner`: bound through the descriptor protocol, qualified name
// "<owner>.<name>", __module__ the owner's module.
py::Ref newMethod(const FunctionSpec& spec, PyTypeObject* owner, const char* module);

// Puts a method for each spec into the class dictionary of `type`, in
// order, reporting `module` as their __module__.
void bindMethods(PyTypeObject* type, const FunctionSpec* specs, size_t count, const char* module);

template <size_t N>
void bindMethods(PyTypeObject* type, const FunctionSpec (&specs)[N], const char* module) {
    bindMethods(type, specs, N, module);
}

// Binds a module-level function for each spec in `moduleDict`, in order.
void bindFunctions(PyObject* moduleDict, const FunctionSpec* specs, size_t count, const char* module);

template <size_t N>
void bindFunctions(PyObject* moduleDict, const FunctionSpec (&specs)[N], const char* module) {
    bindFunctions(moduleDict, specs, N, module);
}

// Whether `callable` is the bound form of `function` (our own built-in
// method as found on an instance).
bool isBoundFormOf(PyObject* callable, PyObject* function);

}  // namespace sbc
