// Slots shared by the two classes built on tallowkit.destroyable.CDestroyable:
// their object fields live after the base's instance, whatever size that
// turned out to be at import, and take part in garbage collection.
#pragma once

#include "common/pycompat.hpp"
#include "common/pyref.hpp"
#include "pysource/contracts/destroyable_base.hpp"
#include "pysource/scopebodycache/function.hpp"
#include "pysource/scopebodycache/siblings.hpp"

namespace sbc {

// State: the class's state block, with forEachObject(visit) over its
// object fields (fields.hpp) and traverseInternal/clearInternal for the
// references its internal state holds; Offset: where the block starts.
template <class State, Py_ssize_t* Offset>
struct DestroyableSubclass {
    static State& state(PyObject* self) noexcept { return contracts::stateAt<State>(self, *Offset); }

    // Places the fields after the base; returns the instance size.
    static Py_ssize_t layout() noexcept {
        const Py_ssize_t align = alignof(State);
        *Offset = (gDestroyableType->tp_basicsize + align - 1) / align * align;
        return *Offset + static_cast<Py_ssize_t>(sizeof(State));
    }

    // The base allocates zeroed memory: indices start at 0, objects at None.
    static PyObject* tp_new(PyTypeObject* type, PyObject* args, PyObject* kwargs) {
        // A base written in Python may leave __new__ to object's, which
        // takes no arguments of its own: 2.7 lets a class with its own
        // __init__ pass them (with a warning), 3.x refuses them.
        py::Ref noArgs;
        if (compat::kObjectNewRefusesArguments && gDestroyableType->tp_new == PyBaseObject_Type.tp_new) {
            noArgs = py::Ref::steal(PyTuple_New(0));
            if (!noArgs) return nullptr;
            args = noArgs.get();
            kwargs = nullptr;
        }
        PyObject* self = gDestroyableType->tp_new(type, args, kwargs);
        if (self == nullptr) return nullptr;
        state(self).forEachObject([](PyObject*& field) {
            Py_INCREF(Py_None);
            field = Py_None;
        });
        return self;
    }

    static int tp_traverse(PyObject* self, visitproc visit, void* arg) {
        int status = 0;
        if (compat::kInstancesOwnHeapType && heap) Py_VISIT(Py_TYPE(self));
        state(self).forEachObject([&](PyObject* field) {
            if (status == 0 && field != nullptr) status = visit(field, arg);
        });
        if (status != 0) return status;
        if ((status = state(self).traverseInternal(visit, arg)) != 0) return status;
        if (baseSlotsChain()) {
            return gDestroyableType->tp_traverse ? gDestroyableType->tp_traverse(self, visit, arg) : 0;
        }
        Py_VISIT(base(self)->fSignalCatchers);
        return 0;
    }

    static int tp_clear(PyObject* self) {
        state(self).forEachObject([](PyObject*& field) { py::storeSlot(&field, Py_None); });
        state(self).clearInternal();
        if (baseSlotsChain()) return gDestroyableType->tp_clear ? gDestroyableType->tp_clear(self) : 0;
        py::storeSlot(&base(self)->fSignalCatchers, Py_None);
        return 0;
    }

    static void tp_dealloc(PyObject* self) {
        PyObject_GC_UnTrack(self);
        state(self).forEachObject([](PyObject*& field) { Py_CLEAR(field); });
        state(self).clearInternal();
        if (baseSlotsChain()) {
            gDestroyableType->tp_dealloc(self);
            return;
        }
        Py_CLEAR(base(self)->fSignalCatchers);
        PyTypeObject* type = Py_TYPE(self);
        type->tp_free(self);
        if (compat::kInstancesOwnHeapType && heap) Py_DECREF(type);
    }

    // Whether the class was made as a heap type (compat::readyType).
    static inline bool heap = false;

    // Makes the filled-in type ready; returns the class to use.
    static PyTypeObject* ready(PyTypeObject& type) { return compat::readyType(&type, &heap); }

    static void fillType(PyTypeObject& type) noexcept {
        type.tp_basicsize = layout();
        type.tp_flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_BASETYPE | Py_TPFLAGS_HAVE_GC;
        type.tp_base = gDestroyableType;
        type.tp_new = tp_new;
        type.tp_dealloc = tp_dealloc;
        type.tp_traverse = tp_traverse;
        type.tp_clear = tp_clear;
    }

private:
    // A heap-type base (a Python class given in place of CDestroyable) has
    // subtype_* slots that start again from the instance's type; chaining
    // to them would come back here.
    static bool baseSlotsChain() noexcept {
        return !(gDestroyableType->tp_flags & Py_TPFLAGS_HEAPTYPE);
    }
    static contracts::DestroyableObject* base(PyObject* self) noexcept {
        return reinterpret_cast<contracts::DestroyableObject*>(self);
    }
};

// The first steps of both __init__s: parse the one argument `logical_list`,
// then run CDestroyable.__init__(self), looked up as Python code would.
// Returns the argument, held: the base's __init__ may run Python code that
// clears the caller's keyword dict.
inline py::Ref initDestroyableSubclass(PyObject* self, PyObject* args, PyObject* kwargs) {
    static const FunctionSpec spec = {"__init__", nullptr, nullptr, 1, 1,
                                      {{"logical_list", ArgCheck::Any}}, true};
    ParsedArgs parsed;
    parseArgs(spec, args, 0, kwargs, parsed);
    py::Ref logicalList = py::Ref::own(parsed[0]);
    py::check(PyObject_CallMethod(reinterpret_cast<PyObject*>(gDestroyableType),
                                  const_cast<char*>("__init__"), const_cast<char*>("(O)"), self));
    return logicalList;
}

}  // namespace sbc
