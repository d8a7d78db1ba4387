// Stand-in for tallowkit.destroyable: the CDestroyable base class that native
// and Python classes extend, and the signal-emission globals published in
// `_capi`.
//
// destroy() dispatches through the instance's native method table, and the
// table's entry reaches _destroy_impl by attribute lookup: an override in any
// subclass, native or Python, runs exactly once.

#include "common/pycompat.hpp"
#include "common/pyref.hpp"
#include "pysource/contracts/capi.hpp"
#include "pysource/contracts/destroyable_base.hpp"
#include "siblings/sibling_util.hpp"

#include <structmember.h>

namespace destroyable {

using contracts::DestroyableObject;
using contracts::DestroyableVtable;
using siblings::cstr;

PyTypeObject gDestroyableType = {PyVarObject_HEAD_INIT(nullptr, 0)};
PyTypeObject gHandlerRecordType = {PyVarObject_HEAD_INIT(nullptr, 0)};
PyTypeObject gEmissionStackItemType = {PyVarObject_HEAD_INIT(nullptr, 0)};

PyObject* gDestroyImplName = nullptr;  // interned "_destroy_impl"

// The variables published through _capi (the capsules point at these).
PyObject* gEmissionStack = nullptr;
PyObject* gClassSignalHandlers = nullptr;
PyObject* gSignalsForCls = nullptr;
PyObject* gEmptyFrozenset = nullptr;
PyObject* gQObjectClass = nullptr;
int gLogAllEmissions = 0;
int gTriedToImportQObject = 0;

inline DestroyableObject* asDestroyable(PyObject* o) {
    return reinterpret_cast<DestroyableObject*>(o);
}

// ---------------------------------------------------------------------------
// Native methods.

PyObject* destroyEntry(DestroyableObject* self) {
    if (self->fDestroyed) return py::Ref::none().release();
    // Set first: a _destroy_impl that calls destroy() again must not recurse.
    self->fDestroyed = 1;
    return PyObject_CallMethodObjArgs(reinterpret_cast<PyObject*>(self), gDestroyImplName,
                                      nullptr);
}

DestroyableVtable gVtable = {destroyEntry};

// ---------------------------------------------------------------------------
// Slots.

PyObject* destroyableNew(PyTypeObject* type, PyObject*, PyObject*) {
    PyObject* self = type->tp_alloc(type, 0);
    if (self == nullptr) return nullptr;
    DestroyableObject* d = asDestroyable(self);
    d->vtab = &gVtable;
    Py_INCREF(Py_None);
    d->fSignalCatchers = Py_None;
    d->fDestroyed = 0;
    return self;
}

int destroyableInit(PyObject*, PyObject* args, PyObject* kwds) {
    Py_ssize_t given = PyTuple_GET_SIZE(args) + (kwds != nullptr ? PyDict_Size(kwds) : 0);
    if (given != 0) {
        PyErr_Format(PyExc_TypeError, "__init__() takes no arguments (%zd given)", given);
        return -1;
    }
    return 0;
}

int destroyableTraverse(PyObject* self, visitproc visit, void* arg) {
    Py_VISIT(asDestroyable(self)->fSignalCatchers);
    return 0;
}

// Leaves None behind so native code may keep reading the field unchecked.
int destroyableClear(PyObject* self) {
    py::storeSlot(&asDestroyable(self)->fSignalCatchers, Py_None);
    return 0;
}

// Native subclasses chain to this after releasing their own fields.
void destroyableDealloc(PyObject* self) {
    PyObject_GC_UnTrack(self);
    Py_CLEAR(asDestroyable(self)->fSignalCatchers);
    Py_TYPE(self)->tp_free(self);
}

// ---------------------------------------------------------------------------
// Python-level methods and attributes.

PyObject* destroy(PyObject* self, PyObject*) {
    DestroyableObject* d = asDestroyable(self);
    return (d->vtab != nullptr ? d->vtab->destroy : destroyEntry)(d);
}

PyObject* destroyImpl(PyObject*, PyObject*) { return py::Ref::none().release(); }

PyObject* isDestroyed(PyObject* self, PyObject*) {
    return PyBool_FromLong(asDestroyable(self)->fDestroyed);
}

PyMethodDef gDestroyableMethods[] = {
    {"destroy", destroy, METH_NOARGS, "Marks the object destroyed and runs _destroy_impl once."},
    {"_destroy_impl", destroyImpl, METH_NOARGS, "What subclasses release on destroy()."},
    {"IsDestroyed", isDestroyed, METH_NOARGS, nullptr},
    {nullptr, nullptr, 0, nullptr},
};

PyObject* getSignalCatchers(PyObject* self, void*) {
    PyObject* value = asDestroyable(self)->fSignalCatchers;
    return py::Ref::own(value != nullptr ? value : Py_None).release();
}

int setSignalCatchers(PyObject* self, PyObject* value, void*) {
    if (value == nullptr || (value != Py_None && !PyDict_Check(value))) {
        PyErr_SetString(PyExc_TypeError, "__fSignalCatchers must be a dict or None");
        return -1;
    }
    py::storeSlot(&asDestroyable(self)->fSignalCatchers, value);
    return 0;
}

PyGetSetDef gDestroyableGetSet[] = {
    {cstr("__fSignalCatchers"), getSignalCatchers, setSignalCatchers, nullptr, nullptr},
    {nullptr, nullptr, nullptr, nullptr, nullptr},
};

PyMemberDef gDestroyableMembers[] = {
    {cstr("__fDestroyed"), T_INT, offsetof(DestroyableObject, fDestroyed), 0, nullptr},
    {nullptr, 0, 0, 0, nullptr},
};

// ---------------------------------------------------------------------------
// Module frame.

void readyDestroyableType(PyObject* module) {
    PyTypeObject& t = gDestroyableType;
    t.tp_name = "tallowkit.destroyable.CDestroyable";
    t.tp_basicsize = sizeof(DestroyableObject);
    t.tp_flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_BASETYPE | Py_TPFLAGS_HAVE_GC;
    t.tp_doc = "Base of objects with an explicit end of life: destroy().";
    t.tp_dealloc = destroyableDealloc;
    t.tp_traverse = destroyableTraverse;
    t.tp_clear = destroyableClear;
    t.tp_methods = gDestroyableMethods;
    t.tp_members = gDestroyableMembers;
    t.tp_getset = gDestroyableGetSet;
    t.tp_init = destroyableInit;
    t.tp_new = destroyableNew;
    t.tp_free = PyObject_GC_Del;
    siblings::readyType(module, "CDestroyable", &t);
    siblings::setVtable(&t, &gVtable, "DestroyableVtable");
}

// Creates the object behind a published variable; the variable keeps it for
// the life of the process, and the module shows the same object.
void publishObject(PyObject* module, PyObject* capi, const char* name, PyObject** slot,
                   PyObject* value) {
    if (value == nullptr) py::fail();
    *slot = value;
    siblings::publish(capi, name, slot, contracts::sig::kObject);
    siblings::setAttr(module, name, value);
}

compat::ModuleDef gModuleDef = SBC_MODULE_DEF("destroyable", "Objects with an explicit end of life.", nullptr);

// The module, made and filled; on 3.x the reference the init function
// returns.
py::Ref init() {
    py::Ref owner;
    PyObject* module = compat::createModule(gModuleDef, owner);
    gDestroyImplName = compat::internStr("_destroy_impl");
    if (gDestroyImplName == nullptr) py::fail();
    readyDestroyableType(module);
    siblings::readyMinimalType(module, "_CHandlerRecord", &gHandlerRecordType,
                               "tallowkit.destroyable._CHandlerRecord");
    siblings::readyMinimalType(module, "_CEmissionStackItem", &gEmissionStackItemType,
                               "tallowkit.destroyable._CEmissionStackItem");

    PyObject* capi = siblings::makeCapi(module);
    publishObject(module, capi, "_gEmissionStack", &gEmissionStack, PyList_New(0));
    publishObject(module, capi, "_gClassSignalHandlers", &gClassSignalHandlers, PyDict_New());
    publishObject(module, capi, "_gSignalsForCls", &gSignalsForCls, PyDict_New());
    publishObject(module, capi, "_kEmptyFrozenset", &gEmptyFrozenset, PyFrozenSet_New(nullptr));
    publishObject(module, capi, "_gQObjectClass", &gQObjectClass, py::Ref::none().release());
    // Native flags: a module attribute would only be a copy, so _capi alone.
    siblings::publish(capi, "_gLogAllEmissions", &gLogAllEmissions, contracts::sig::kInt);
    siblings::publish(capi, "_gTriedToImportQObject", &gTriedToImportQObject,
                      contracts::sig::kInt);
    return owner;
}

}  // namespace destroyable

SBC_MODULE_INIT(destroyable) {
    PyObject* module = py::guarded([] { return destroyable::init().release(); });
    return compat::initResult(module);
}
