// CScopeDocument's slots and method table: argument parsing and the calls
// into the engine, queries, pickling and the self-check.
#include "common/messages.hpp"
#include "common/pycompat.hpp"
#include "pysource/scopedocument/document.hpp"

#include <memory>
#include <new>

namespace sdoc {

namespace {

PyTypeObject DocumentType = {PyVarObject_HEAD_INIT(nullptr, 0)};

// The document of `self`; a document whose __init__ failed or never ran
// holds no text yet.
Document& ready(PyObject* self) {
    Document* d = reinterpret_cast<DocumentObject*>(self)->doc;
    if (d == nullptr || !d->list) {
        msg::raise(PyExc_ValueError, "the document was not initialised (CScopeDocument(text, filename))");
    }
    return *d;
}

bool flagArgument(PyObject* value, const char* name) {
    if (value == nullptr) return false;
    if (!PyBool_Check(value) && !PyIndex_Check(value)) {
        PyErr_Format(PyExc_TypeError, "%s must be a bool, not %.200s", name, Py_TYPE(value)->tp_name);
        py::fail();
    }
    return py::truth(value);
}

PyObject* doc_new(PyTypeObject* type, PyObject*, PyObject*) {
    return py::guarded([&]() -> PyObject* {
        py::Ref self = py::check(type->tp_alloc(type, 0));
        auto* o = reinterpret_cast<DocumentObject*>(self.get());
        o->doc = new Document();
        o->weakrefs = nullptr;
        return self.release();
    });
}

int doc_init(PyObject* self, PyObject* args, PyObject* kwargs) {
    return py::guardedStatus([&] {
        static const char* kwlist[] = {"text", "filename", nullptr};
        PyObject* text;
        PyObject* filename = nullptr;
        if (!PyArg_ParseTupleAndKeywords(args, kwargs, "O|O:CScopeDocument", const_cast<char**>(kwlist), &text,
                                         &filename)) {
            py::fail();
        }
        py::Ref name = filename ? py::Ref::own(filename) : py::check(compat::strFromText("<string>"));
        if (!compat::isStr(name.get())) {
            PyErr_Format(PyExc_TypeError, "filename must be str, not %.200s", Py_TYPE(name.get())->tp_name);
            py::fail();
        }
        Document* d = reinterpret_cast<DocumentObject*>(self)->doc;
        // Read into a new state, so that a failure leaves the old one.
        auto fresh = std::make_unique<Document>();
        openDocument(*fresh, text, name.get());
        if (d->busy) msg::raise(PyExc_RuntimeError, "the document is being edited (a call came back into it)");
        reinterpret_cast<DocumentObject*>(self)->doc = fresh.release();
        delete d;
        return 0;
    });
}

int doc_traverse(PyObject* self, visitproc visit, void* arg) {
    Document* d = reinterpret_cast<DocumentObject*>(self)->doc;
    if (d == nullptr) return 0;
    Py_VISIT(d->list.get());
    Py_VISIT(d->finder.get());
    Py_VISIT(d->cache.get());
    Py_VISIT(d->error.get());
    return 0;
}

int doc_clear(PyObject* self) {
    Document* d = reinterpret_cast<DocumentObject*>(self)->doc;
    if (d == nullptr || d->busy) return 0;
    // Dropped last: their destructors may look at the document.
    py::Ref list = std::move(d->list);
    py::Ref finder = std::move(d->finder);
    py::Ref cache = std::move(d->cache);
    py::Ref error = std::move(d->error);
    return 0;
}

void doc_dealloc(PyObject* self) {
    PyObject_GC_UnTrack(self);
    auto* o = reinterpret_cast<DocumentObject*>(self);
    if (o->weakrefs != nullptr) PyObject_ClearWeakRefs(self);
    Document* d = o->doc;
    o->doc = nullptr;
    delete d;
    Py_TYPE(self)->tp_free(self);
}

// --- Methods ---------------------------------------------------------------------

PyObject* m_Edit(PyObject* self, PyObject* args, PyObject* kwargs) {
    return py::guarded([&]() -> PyObject* {
        static const char* kwlist[] = {"start_line", "start_col", "end_line", "end_col", "text", "utf16", nullptr};
        EditRequest request;
        PyObject* utf16 = nullptr;
        // Five positional arguments, as an editor sends a keystroke, need
        // no parsing.
        if (kwargs == nullptr && PyTuple_GET_SIZE(args) == 5) {
            PyObject** items = &PyTuple_GET_ITEM(args, 0);
            request = EditRequest{items[0], items[1], items[2], items[3], items[4]};
        } else if (!PyArg_ParseTupleAndKeywords(args, kwargs, "OOOOO|O:Edit", const_cast<char**>(kwlist),
                                                &request.startLine, &request.startColumn, &request.endLine,
                                                &request.endColumn, &request.text, &utf16)) {
            py::fail();
        }
        Document& d = ready(self);
        const bool units = flagArgument(utf16, "utf16");
        requireEditText(request.text);
        return applyEdits(d, request, units).release();
    });
}

PyObject* m_EditMany(PyObject* self, PyObject* args, PyObject* kwargs) {
    return py::guarded([&]() -> PyObject* {
        static const char* kwlist[] = {"edits", "utf16", nullptr};
        PyObject* edits;
        PyObject* utf16 = nullptr;
        if (!PyArg_ParseTupleAndKeywords(args, kwargs, "O|O:EditMany", const_cast<char**>(kwlist), &edits, &utf16)) {
            py::fail();
        }
        Document& d = ready(self);
        const bool units = flagArgument(utf16, "utf16");
        if (compat::isStr(edits) || compat::isOtherText(edits)) {
            msg::raise(PyExc_TypeError, "edits must be a sequence of (start_line, start_col, end_line, end_col, text)");
        }
        py::Ref seq = py::check(PySequence_Fast(edits, "edits must be a sequence of edits"));
        const Py_ssize_t n = PySequence_Fast_GET_SIZE(seq.get());
        std::vector<py::Ref> held;
        std::vector<EditRequest> requests;
        for (Py_ssize_t i = 0; i < n; ++i) {
            PyObject* item = PySequence_Fast_GET_ITEM(seq.get(), i);
            if (!(PyTuple_Check(item) || PyList_Check(item)) || PySequence_Fast_GET_SIZE(item) != 5) {
                PyErr_Format(PyExc_TypeError,
                             "edit %zd must be a (start_line, start_col, end_line, end_col, text) tuple, not %.200s",
                             i, Py_TYPE(item)->tp_name);
                py::fail();
            }
            py::Ref tuple = py::check(PySequence_Tuple(item));
            PyObject** f = &PyTuple_GET_ITEM(tuple.get(), 0);
            requireEditText(f[4]);
            for (int k = 0; k < 4; ++k) {
                if (!PyIndex_Check(f[k])) {
                    PyErr_Format(PyExc_TypeError, "edit %zd: lines and columns must be ints, not %.200s", i,
                                 Py_TYPE(f[k])->tp_name);
                    py::fail();
                }
            }
            requests.push_back({f[0], f[1], f[2], f[3], f[4]});
            held.push_back(std::move(tuple));
        }
        return applyEdits(d, requests, units).release();
    });
}

PyObject* m_SetText(PyObject* self, PyObject* text) {
    return py::guarded([&]() -> PyObject* { return setText(ready(self), text).release(); });
}

PyObject* m_GetText(PyObject* self, PyObject*) {
    return py::guarded([&]() -> PyObject* { return py::Ref::own(wholeText(ready(self))).release(); });
}

PyObject* m_GetLine(PyObject* self, PyObject* lineno) {
    return py::guarded([&]() -> PyObject* { return getLine(ready(self), lineno).release(); });
}

PyObject* m_GetLineCount(PyObject* self, PyObject*) {
    return py::guarded([&]() -> PyObject* { return compat::intFromSsize(ready(self).rows.count()); });
}

PyObject* m_GetFilename(PyObject* self, PyObject*) {
    return py::guarded([&]() -> PyObject* { return ready(self).filename.copy().release(); });
}

PyObject* m_IsReadable(PyObject* self, PyObject*) {
    return py::guarded([&]() -> PyObject* { return PyBool_FromLong(ready(self).readable); });
}

PyObject* m_GetError(PyObject* self, PyObject*) {
    return py::guarded([&]() -> PyObject* {
        Document& d = ready(self);
        return py::Ref::own(!d.readable && d.error ? d.error.get() : Py_None).release();
    });
}

PyObject* m_GetLogicals(PyObject* self, PyObject*) {
    return py::guarded([&]() -> PyObject* { return logicalsCopy(ready(self)).release(); });
}

PyObject* m_GetScopeAtLine(PyObject* self, PyObject* lineno) {
    return py::guarded([&]() -> PyObject* { return scopeAtLine(ready(self), lineno).release(); });
}

PyObject* m_GetOutline(PyObject* self, PyObject*) {
    return py::guarded([&]() -> PyObject* { return outline(ready(self)).release(); });
}

// The cache's answer; a body is handed out as a copy, so that the caller
// cannot change what the cache holds.
PyObject* m_GetBodyOfScope(PyObject* self, PyObject* name) {
    return py::guarded([&]() -> PyObject* {
        Document& d = ready(self);
        BusyGuard busy(d);
        py::Ref body = py::check(
            compat::callMethod(d.cache.get(), gImports.getBodyOfScope, name));
        if (PyList_Check(body.get())) return PyList_GetSlice(body.get(), 0, PyList_GET_SIZE(body.get()));
        return body.release();
    });
}

PyObject* m_GetScopeDef(PyObject* self, PyObject* name) {
    return py::guarded([&]() -> PyObject* {
        Document& d = ready(self);
        BusyGuard busy(d);
        return py::check(compat::callMethod(d.cache.get(), gImports.getScopeDef, name)).release();
    });
}

PyObject* m_SelfCheck(PyObject* self, PyObject*) {
    return py::guarded([&]() -> PyObject* {
        Document& d = ready(self);
        BusyGuard busy(d);
        selfCheck(d);
        return py::Ref::none().release();
    });
}

PyObject* m_GetLastEditStats(PyObject* self, PyObject*) {
    return py::guarded([&]() -> PyObject* {
        const EditStats& s = ready(self).stats;
        return Py_BuildValue("{s:n,s:n,s:n,s:n,s:n,s:O,s:O}", "rows_scanned", static_cast<Py_ssize_t>(s.rowsScanned),
                             "logicals_made", static_cast<Py_ssize_t>(s.logicalsMade), "logicals_removed",
                             static_cast<Py_ssize_t>(s.logicalsRemoved), "logicals_shifted",
                             static_cast<Py_ssize_t>(s.logicalsShifted), "edits", static_cast<Py_ssize_t>(s.edits),
                             "find_changes_called", s.findChangesCalled ? Py_True : Py_False, "whole_read",
                             s.wholeRead ? Py_True : Py_False);
    });
}

PyObject* m_MemoryUse(PyObject* self, PyObject*) {
    return py::guarded([&]() -> PyObject* {
        Document& d = ready(self);
        size_t damage = 0;
        for (const DamageRange& r : d.damage.ranges) damage += r.baselineMiddle.capacity() * sizeof(uint32_t);
        return Py_BuildValue("{s:n,s:n,s:n}", "text", static_cast<Py_ssize_t>(d.text.bytesHeld()), "rows",
                             static_cast<Py_ssize_t>(d.rows.bytesHeld()), "damage",
                             static_cast<Py_ssize_t>(damage));
    });
}

PyObject* m_reduce(PyObject* self, PyObject*) {
    return py::guarded([&]() -> PyObject* { return reduceDocument(self, ready(self)).release(); });
}

PyObject* m_setstate(PyObject* self, PyObject* state) {
    return py::guarded([&]() -> PyObject* {
        Document& d = ready(self);
        if (d.busy) msg::raise(PyExc_RuntimeError, "the document is being edited (a call came back into it)");
        restoreDocument(self, state);
        return py::Ref::none().release();
    });
}

#define SDOC_KW(f) reinterpret_cast<PyCFunction>(reinterpret_cast<void (*)()>(f))

PyMethodDef doc_methods[] = {
    {"Edit", SDOC_KW(m_Edit), METH_VARARGS | METH_KEYWORDS,
     "Edit(start_line, start_col, end_line, end_col, text, utf16=False) -> CEditResult\n\n"
     "Replaces the range by `text`. Lines are 1-based as fLineno; columns are 0-based, in\n"
     "characters of the text (code points on 3.x, bytes on 2.7), or with utf16=True in\n"
     "UTF-16 code units. A bad range raises ValueError and changes nothing."},
    {"EditMany", SDOC_KW(m_EditMany), METH_VARARGS | METH_KEYWORDS,
     "EditMany(edits, utf16=False) -> CEditResult\n\n"
     "Applies (start_line, start_col, end_line, end_col, text) edits in order, each in the\n"
     "coordinates the ones before it left; one FindChanges call for them all. A bad edit\n"
     "raises and changes nothing."},
    {"SetText", m_SetText, METH_O, "SetText(text) -> CEditResult: the whole text replaced, as one edit."},
    {"GetText", m_GetText, METH_NOARGS, "The current text."},
    {"GetLine", m_GetLine, METH_O, "GetLine(lineno): the line without its '\\n'."},
    {"GetLineCount", m_GetLineCount, METH_NOARGS, "The number of lines: text.count('\\n') + 1."},
    {"GetFilename", m_GetFilename, METH_NOARGS, "The filename used in the reader's messages."},
    {"IsReadable", m_IsReadable, METH_NOARGS, "Whether the current text reads."},
    {"GetError", m_GetError, METH_NOARGS, "The reader's exception for the current text, or None."},
    {"GetLogicals", m_GetLogicals, METH_NOARGS,
     "A new list of the document's logicals (the baseline's while the text does not read)."},
    {"GetScopeAtLine", m_GetScopeAtLine, METH_O,
     "GetScopeAtLine(lineno): fScopeName of the last logical at or before the line, '' if none."},
    {"GetOutline", m_GetOutline, METH_NOARGS,
     "[(scoped_name, kind, header_line, end_line)] for each named class and def, in order."},
    {"GetBodyOfScope", m_GetBodyOfScope, METH_O, "GetBodyOfScope(scoped_name): the scope's body logicals."},
    {"GetScopeDef", m_GetScopeDef, METH_O, "GetScopeDef(scoped_name): the logical that defines the scope."},
    {"SelfCheck", m_SelfCheck, METH_NOARGS,
     "Compares the document with a fresh read and whole-file pass; AssertionError on a difference."},
    {"GetLastEditStats", m_GetLastEditStats, METH_NOARGS, "What the last edit (or the creation) did."},
    {"_MemoryUse", m_MemoryUse, METH_NOARGS, "Bytes the document holds besides its logicals."},
    {"__reduce__", m_reduce, METH_NOARGS, nullptr},
    {"__setstate__", m_setstate, METH_O, nullptr},
    {nullptr, nullptr, 0, nullptr}};

}  // namespace

PyTypeObject* documentType() noexcept { return &DocumentType; }

void readyDocumentType() {
    PyTypeObject& t = DocumentType;
    t.tp_name = "pysource.scopedocument.CScopeDocument";
    t.tp_basicsize = sizeof(DocumentObject);
    t.tp_flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_BASETYPE | Py_TPFLAGS_HAVE_GC;
    t.tp_doc =
        "CScopeDocument(text, filename='<string>')\n\n"
        "A text, its logicals and their scope names, kept up to date edit by edit.";
    t.tp_new = doc_new;
    t.tp_init = doc_init;
    t.tp_dealloc = doc_dealloc;
    t.tp_traverse = doc_traverse;
    t.tp_clear = doc_clear;
    t.tp_methods = doc_methods;
    t.tp_weaklistoffset = offsetof(DocumentObject, weakrefs);
    py::checkStatus(PyType_Ready(&t));
}

}  // namespace sdoc
