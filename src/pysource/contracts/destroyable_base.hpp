// The instance layout of tallowkit.destroyable.CDestroyable that subclasses
// written in C++ extend, and the native method table it publishes.
#pragma once

#include <Python.h>

namespace contracts {

struct DestroyableObject;

// Native methods of CDestroyable, published as a capsule in the type's
// dictionary under kVtableAttr.
struct DestroyableVtable {
    PyObject* (*destroy)(DestroyableObject* self);
};

struct DestroyableObject {
    PyObject_HEAD
    DestroyableVtable* vtab;
    PyObject* fSignalCatchers;  // __fSignalCatchers: dict or None
    int fDestroyed;             // __fDestroyed
};

// Attribute of a type's dictionary that holds its native method table.
inline constexpr const char* kVtableAttr = "__vtable__";

// A class built on CDestroyable keeps its own state block after the base's
// instance, at an offset fixed at import (the base's size is only known
// then).
template <class State>
inline State& stateAt(PyObject* self, Py_ssize_t offset) noexcept {
    return *reinterpret_cast<State*>(reinterpret_cast<char*>(self) + offset);
}

}  // namespace contracts
