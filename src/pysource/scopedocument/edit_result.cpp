// CEditResult: what one edit call did, as read-only attributes.
#include "common/pycompat.hpp"
#include "pysource/scopedocument/document.hpp"

#include <structmember.h>

#include <cstddef>

namespace sdoc {

namespace {

struct EditResultObject {
    PyObject_HEAD
    PyObject* added;
    PyObject* removed;
    PyObject* contentsChanges;
    PyObject* classChanges;
    PyObject* functionChanges;
    PyObject* region;
    PyObject* readable;
    PyObject* error;
};

PyTypeObject EditResultType = {PyVarObject_HEAD_INIT(nullptr, 0)};

#define SDOC_RESULT_FIELDS(X)                                                                         \
    X(added, "fAdded", "The logicals put into the document's list (as FindChanges got them).")        \
    X(removed, "fRemoved", "The logicals taken out of it.")                                            \
    X(contentsChanges, "fContentsChanges", "Scopes whose contents changed (FindChanges' first set).")  \
    X(classChanges, "fClassChanges", "Classes that changed (the second set).")                         \
    X(functionChanges, "fFunctionChanges", "Functions that changed (the third set).")                  \
    X(region, "fRegion", "(first line, old line count, new line count) of the lines read again.")      \
    X(readable, "fReadable", "Whether the text reads now.")                                            \
    X(error, "fError", "The reader's exception when the text does not read, else None.")

void result_dealloc(PyObject* self) {
    PyObject_GC_UnTrack(self);
    auto* r = reinterpret_cast<EditResultObject*>(self);
#define SDOC_CLEAR(field, name, doc) Py_CLEAR(r->field);
    SDOC_RESULT_FIELDS(SDOC_CLEAR)
    Py_TYPE(self)->tp_free(self);
}

int result_traverse(PyObject* self, visitproc visit, void* arg) {
    auto* r = reinterpret_cast<EditResultObject*>(self);
#define SDOC_VISIT(field, name, doc) Py_VISIT(r->field);
    SDOC_RESULT_FIELDS(SDOC_VISIT)
    return 0;
}

int result_clear(PyObject* self) {
    auto* r = reinterpret_cast<EditResultObject*>(self);
    SDOC_RESULT_FIELDS(SDOC_CLEAR)
    return 0;
}

PyObject* result_repr(PyObject* self) {
    auto* r = reinterpret_cast<EditResultObject*>(self);
    return py::guarded([&]() -> PyObject* {
        py::Ref region = py::check(PyObject_Repr(r->region));
        const Py_ssize_t added = PyList_Check(r->added) ? PyList_GET_SIZE(r->added) : -1;
        const Py_ssize_t removed = PyList_Check(r->removed) ? PyList_GET_SIZE(r->removed) : -1;
        return compat::strFromFormat("<CEditResult readable=%s region=%s added=%zd removed=%zd>",
                                     r->readable == Py_True ? "True" : "False", compat::strText(region.get()),
                                     added, removed);
    });
}

#define SDOC_MEMBER(field, name, doc) \
    {const_cast<char*>(name), T_OBJECT, offsetof(EditResultObject, field), READONLY, const_cast<char*>(doc)},
PyMemberDef result_members[] = {SDOC_RESULT_FIELDS(SDOC_MEMBER){nullptr, 0, 0, 0, nullptr}};

py::Ref setOrEmpty(PyObject* changes, Py_ssize_t k) {
    if (changes == nullptr) return py::check(PySet_New(nullptr));
    return py::Ref::own(PyTuple_GET_ITEM(changes, k));
}

}  // namespace

PyTypeObject* editResultType() noexcept { return &EditResultType; }

void readyEditResultType() {
    PyTypeObject& t = EditResultType;
    t.tp_name = "pysource.scopedocument.CEditResult";
    t.tp_basicsize = sizeof(EditResultObject);
    t.tp_flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_HAVE_GC;
    t.tp_doc = "What an edit of a CScopeDocument did (read-only; made by the document).";
    t.tp_dealloc = result_dealloc;
    t.tp_traverse = result_traverse;
    t.tp_clear = result_clear;
    t.tp_repr = result_repr;
    t.tp_members = result_members;
    py::checkStatus(PyType_Ready(&t));
}

py::Ref makeEditResult(Document& d, EditOutcome& out) {
    py::Ref region = py::check(PyTuple_New(3));
    const size_t numbers[3] = {out.regionFirstLine, out.regionOldLines, out.regionNewLines};
    for (Py_ssize_t k = 0; k < 3; ++k) {
        PyTuple_SET_ITEM(region.get(), k, py::check(compat::intFromSsize(numbers[k])).release());
    }
    py::Ref contents = setOrEmpty(out.changes.get(), 0);
    py::Ref classes = setOrEmpty(out.changes.get(), 1);
    py::Ref functions = setOrEmpty(out.changes.get(), 2);
    auto* r = PyObject_GC_New(EditResultObject, &EditResultType);
    if (r == nullptr) py::fail();
    r->added = out.added.release();
    r->removed = out.removed.release();
    r->contentsChanges = contents.release();
    r->classChanges = classes.release();
    r->functionChanges = functions.release();
    r->region = region.release();
    r->readable = py::Ref::own(d.readable ? Py_True : Py_False).release();
    r->error = py::Ref::own(d.readable || !d.error ? Py_None : d.error.get()).release();
    PyObject_GC_Track(reinterpret_cast<PyObject*>(r));
    return py::Ref::steal(reinterpret_cast<PyObject*>(r));
}

}  // namespace sdoc
