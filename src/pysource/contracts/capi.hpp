// How the sibling modules publish typed entry points: a dict attribute
// `_capi` on the module, mapping each entry name to a PyCapsule whose
// capsule name is the entry's signature text. A variable's capsule points
// at the variable; a function's capsule is the function pointer.
#pragma once

#include <Python.h>

namespace contracts {

inline constexpr const char* kCapiAttr = "_capi";

namespace sig {
inline constexpr const char* kObject = "PyObject *";
inline constexpr const char* kChar = "char";
inline constexpr const char* kSsize = "Py_ssize_t";
inline constexpr const char* kInt = "int";
inline constexpr const char* kJoinTwo = "PyObject *(PyObject *, PyObject *, int)";
inline constexpr const char* kSplitOne = "PyObject *(PyObject *, int)";
inline constexpr const char* kAppendSuffixes =
    "PyObject *(PyObject *, PyObject *, PyObject *, int)";
// Optional entries: the native forms of the siblings' Python-level
// functions. A sibling may publish them beside the Python functions of the
// same names; a client that finds them may call them instead, with the same
// results, while those functions are still the ones the sibling published.
inline constexpr const char* kIndexForLineno = "Py_ssize_t (PyObject *, long)";
inline constexpr const char* kFindIndexOfLogical = "Py_ssize_t (PyObject *, PyObject *)";
inline constexpr const char* kLeafScopeNameHasIndex = "int (PyObject *)";
inline constexpr const char* kScopeNameSuffix = "Py_ssize_t (PyObject *, Py_ssize_t *)";
inline constexpr const char* kScopeNameParentLength = "Py_ssize_t (PyObject *)";
}  // namespace sig

// pysource._fastaccess. IndexForLineno: -1 with an exception set on
// failure. FindIndexOfLogical: -1 when the list does not hold the object (or
// with an exception set when the first argument is not a list).
using IndexForLinenoFn = Py_ssize_t (*)(PyObject* list, long lineno);
using FindIndexOfLogicalFn = Py_ssize_t (*)(PyObject* list, PyObject* logical);
// pysource.symbolinfo. LeafScopeNameHasIndex never fails. ScopeNameSuffix
// reads the scope index a defined name carries without building objects:
// the index, -1 when the name carries none (or is not a str), or
// kSuffixTooLarge when it carries one too large for a Py_ssize_t; *bareLength
// is set to the length of the name without its suffix.
using LeafScopeNameHasIndexFn = int (*)(PyObject* name);
using ScopeNameSuffixFn = Py_ssize_t (*)(PyObject* name, Py_ssize_t* bareLength);
// ScopeNameParentLength: where SplitScopeNames would cut a full name's last
// part off, without building the parts: the length of the text before the
// last part's separator (the parts before it joined with "."), -1 when the
// name has one part, -2 when it is not a str.
using ScopeNameParentLengthFn = Py_ssize_t (*)(PyObject* full);
inline constexpr Py_ssize_t kSuffixTooLarge = -2;

// Function entry points of pysource.symbolinfo. The trailing flag tells the
// function to skip looking for a Python-level override; callers pass 0.
using JoinTwoScopeNamesFn = PyObject* (*)(PyObject* scope, PyObject* name, int skip);
using SplitScopeNamesFn = PyObject* (*)(PyObject* full, int skip);
using SplitScopeNameFromSuffixesFn = PyObject* (*)(PyObject* name, int skip);
using AppendScopeSuffixesFn = PyObject* (*)(PyObject* name, PyObject* index, PyObject* extra,
                                            int skip);

// The 61 typed variables of pysource.symbolinfo, in publishing order.
// Each stem X gives kXPrefix (object) and kXKind (char).
#define SYMBOLINFO_PREFIX_KIND_STEMS(X) \
    X(Set)                              \
    X(Get)                              \
    X(SetTypeHint)                      \
    X(Nonlocal)                         \
    X(Global)                           \
    X(WithinExpr)                       \
    X(Import)                           \
    X(FromImport)                       \
    X(Decorator)

#define SYMBOLINFO_PREFIX_KIND_STEMS2(X) \
    X(SpecificScope)                     \
    X(SpecificUrl)                       \
    X(BuiltinModule)                     \
    X(TypingModule)                      \
    X(BuiltinClass)                      \
    X(TypedLiteral)                      \
    X(Arg)                               \
    X(TypeHint)

#define SYMBOLINFO_PREFIX_KIND_STEMS3(X) \
    X(Method)                            \
    X(UnboundMethod)                     \
    X(Function)                          \
    X(Class)                             \
    X(Self)                              \
    X(Instance)                          \
    X(Module)                            \
    X(InferredTypeHint)                  \
    X(Called)

}  // namespace contracts
