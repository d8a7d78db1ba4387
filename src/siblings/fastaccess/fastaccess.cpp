// Stand-in for pysource._fastaccess: the logical-line record and the two
// lookups over a logical list that the editor runs after every keystroke.
//
// A logical list is in line order (fLineno non-decreasing), so both lookups
// binary-search it. Neither runs Python code while it walks the list (it only
// reads fields of the records), so borrowed items stay valid throughout.

#include "common/pycompat.hpp"
#include "common/pyref.hpp"
#include "pysource/contracts/capi.hpp"
#include "pysource/contracts/logical_record.hpp"
#include "siblings/sibling_util.hpp"

#include <cstdint>
#include <cstring>
#include <limits>
#include <string>

namespace fastaccess {

using contracts::LogicalLineObject;
using siblings::cstr;

PyTypeObject gLogicalLineType = {PyVarObject_HEAD_INIT(nullptr, 0)};
PyTypeObject gCLoggerType = {PyVarObject_HEAD_INIT(nullptr, 0)};
PyTypeObject gCBytesTokenizerType = {PyVarObject_HEAD_INIT(nullptr, 0)};

// The variables published through _capi (the capsules point at these).
PyObject* gLogicalLineTypeVar = nullptr;
PyObject* gTimeFunc = nullptr;

// The tokenizer's native method table; the scope body cache module only
// checks that one is advertised.
struct BytesTokenizerVtable {
    void* reserved;
};
BytesTokenizerVtable gBytesTokenizerVtable = {nullptr};

inline bool isLogical(PyObject* o) { return PyObject_TypeCheck(o, &gLogicalLineType); }
inline LogicalLineObject* asLogical(PyObject* o) { return reinterpret_cast<LogicalLineObject*>(o); }

// ---------------------------------------------------------------------------
// Field conversions shared by the constructor and the setters.

long long toInteger(PyObject* value, const char* field, long long lo, long long hi) {
    if (value == nullptr) {
        PyErr_Format(PyExc_TypeError, "cannot delete %s", field);
        py::fail();
    }
    long long v;
    if (compat::isMachineInt(value)) {
        v = compat::machineIntValue(value);
    } else if (PyLong_Check(value)) {
        int overflow = 0;
        v = PyLong_AsLongLongAndOverflow(value, &overflow);
        if (v == -1 && PyErr_Occurred()) py::fail();
        if (overflow != 0) v = overflow > 0 ? hi + 1 : lo - 1;
    } else {
        PyErr_Format(PyExc_TypeError, "%s must be an int, not %.200s", field,
                     Py_TYPE(value)->tp_name);
        py::fail();
    }
    if (v < lo || v > hi) {
        PyErr_Format(PyExc_OverflowError, "%s out of range [%lld, %lld]", field, lo, hi);
        py::fail();
    }
    return v;
}

template <class T>
T toField(PyObject* value, const char* field) {
    return static_cast<T>(toInteger(value, field, std::numeric_limits<T>::min(),
                                    std::numeric_limits<T>::max()));
}

void releaseTokens(PyObject** tokens, Py_ssize_t count) {
    for (Py_ssize_t i = 0; i < count; ++i) Py_DECREF(tokens[i]);
    PyMem_Free(tokens);
}

// Replaces the token array. The old tokens are released after the record is
// consistent again, since a str subclass's destructor may look at it.
void setTokens(LogicalLineObject* self, PyObject* tokens) {
    if (compat::isStr(tokens) || compat::isOtherText(tokens)) {
        PyErr_SetString(PyExc_TypeError, "tokens must be a sequence of str, not a string");
        py::fail();
    }
    py::Ref seq = py::check(PySequence_Fast(tokens, "tokens must be a sequence of str"));
    Py_ssize_t n = PySequence_Fast_GET_SIZE(seq.get());
    PyObject** items = PySequence_Fast_ITEMS(seq.get());
    for (Py_ssize_t i = 0; i < n; ++i) {
        if (!compat::isStr(items[i])) {
            PyErr_Format(PyExc_TypeError, "tokens must be str, not %.200s",
                         Py_TYPE(items[i])->tp_name);
            py::fail();
        }
    }
    PyObject** array = nullptr;
    if (n > 0) {
        array = PyMem_New(PyObject*, n);
        if (array == nullptr) {
            PyErr_NoMemory();
            py::fail();
        }
        for (Py_ssize_t i = 0; i < n; ++i) {
            Py_INCREF(items[i]);
            array[i] = items[i];
        }
    }
    PyObject** old = self->fTokens;
    Py_ssize_t oldCount = self->fTokenCount;
    self->fTokens = array;
    self->fTokenCount = n;
    releaseTokens(old, oldCount);
}

// ---------------------------------------------------------------------------
// LogicalLineType slots.

int logicalInit(PyObject* self, PyObject* args, PyObject* kwds) {
    return py::guardedStatus([&] {
        static const char* kwlist[] = {"tokens", "lineno", "indent", "kind", nullptr};
        PyObject *tokens, *lineno, *indent, *kind;
        if (!PyArg_ParseTupleAndKeywords(args, kwds, "OOOO:LogicalLineType",
                                         const_cast<char**>(kwlist), &tokens, &lineno,
                                         &indent, &kind))
            py::fail();
        // Convert everything first: a bad argument leaves the record as it was.
        int32_t l = toField<int32_t>(lineno, "lineno");
        int16_t i = toField<int16_t>(indent, "indent");
        uint8_t k = toField<uint8_t>(kind, "kind");
        LogicalLineObject* rec = asLogical(self);
        setTokens(rec, tokens);
        rec->fLineno = l;
        rec->fIndent = i;
        rec->fKind = k;
        return 0;
    });
}

int logicalTraverse(PyObject* self, visitproc visit, void* arg) {
    LogicalLineObject* rec = asLogical(self);
    for (Py_ssize_t i = 0; i < rec->fTokenCount; ++i) Py_VISIT(rec->fTokens[i]);
    Py_VISIT(rec->fScopeName);
    Py_VISIT(rec->fLocalScopeName);
    return 0;
}

int logicalClear(PyObject* self) {
    LogicalLineObject* rec = asLogical(self);
    PyObject** tokens = rec->fTokens;
    Py_ssize_t count = rec->fTokenCount;
    rec->fTokens = nullptr;
    rec->fTokenCount = 0;
    releaseTokens(tokens, count);
    Py_CLEAR(rec->fScopeName);
    Py_CLEAR(rec->fLocalScopeName);
    return 0;
}

void logicalDealloc(PyObject* self) {
    PyObject_GC_UnTrack(self);
    logicalClear(self);
    Py_TYPE(self)->tp_free(self);
}

void appendRepr(std::string& out, PyObject* o) {
    if (o == nullptr) {
        out += "None";
        return;
    }
    py::Ref r = py::check(PyObject_Repr(o));
    const std::string_view text = compat::strView(r.get());
    out.append(text.data(), text.size());
}

PyObject* logicalRepr(PyObject* self) {
    return py::guarded([&] {
        LogicalLineObject* rec = asLogical(self);
        constexpr Py_ssize_t kShownTokens = 3;
        std::string out = "<Logical line " + std::to_string(rec->fLineno) + " kind " +
                          std::to_string(rec->fKind) + " indent " +
                          std::to_string(rec->fIndent) + " [";
        for (Py_ssize_t i = 0; i < rec->fTokenCount && i < kShownTokens; ++i) {
            if (i > 0) out += ", ";
            appendRepr(out, rec->fTokens[i]);
        }
        if (rec->fTokenCount > kShownTokens) out += ", ...";
        out += "] scope ";
        // Scope names may be any object whose repr runs Python code.
        py::Ref local = py::Ref::own(rec->fLocalScopeName);
        appendRepr(out, py::Ref::own(rec->fScopeName).get());
        out += " local ";
        appendRepr(out, local.get());
        out += ">";
        return compat::strFromBytes(out.data(), static_cast<Py_ssize_t>(out.size()));
    });
}

// ---------------------------------------------------------------------------
// Attributes.

PyObject* getTokens(PyObject* self, void*) {
    LogicalLineObject* rec = asLogical(self);
    PyObject* tuple = PyTuple_New(rec->fTokenCount);
    if (tuple == nullptr) return nullptr;
    for (Py_ssize_t i = 0; i < rec->fTokenCount; ++i) {
        Py_INCREF(rec->fTokens[i]);
        PyTuple_SET_ITEM(tuple, i, rec->fTokens[i]);
    }
    return tuple;
}

PyObject* getTokenCount(PyObject* self, void*) {
    return compat::intFromSsize(asLogical(self)->fTokenCount);
}

template <class T, T LogicalLineObject::*Field>
PyObject* getInteger(PyObject* self, void*) {
    return compat::intFromLong(asLogical(self)->*Field);
}

// The closure is the field's Python name, for messages.
template <class T, T LogicalLineObject::*Field>
int setInteger(PyObject* self, PyObject* value, void* closure) {
    return py::guardedStatus([&] {
        asLogical(self)->*Field = toField<T>(value, static_cast<const char*>(closure));
        return 0;
    });
}

template <PyObject* LogicalLineObject::*Field>
PyObject* getScope(PyObject* self, void*) {
    PyObject* value = asLogical(self)->*Field;
    if (value == nullptr) value = Py_None;
    Py_INCREF(value);
    return value;
}

// Deleting makes the field absent.
template <PyObject* LogicalLineObject::*Field>
int setScope(PyObject* self, PyObject* value, void*) {
    py::storeSlot(&(asLogical(self)->*Field), value);
    return 0;
}

PyGetSetDef gLogicalGetSet[] = {
    {cstr("fTokens"), getTokens, nullptr, cstr("The token texts, as a tuple."), nullptr},
    {cstr("fTokenCount"), getTokenCount, nullptr, nullptr, nullptr},
    {cstr("fLineno"), getInteger<int32_t, &LogicalLineObject::fLineno>,
     setInteger<int32_t, &LogicalLineObject::fLineno>, nullptr, cstr("fLineno")},
    {cstr("fIndent"), getInteger<int16_t, &LogicalLineObject::fIndent>,
     setInteger<int16_t, &LogicalLineObject::fIndent>, nullptr, cstr("fIndent")},
    {cstr("fKind"), getInteger<uint8_t, &LogicalLineObject::fKind>,
     setInteger<uint8_t, &LogicalLineObject::fKind>, nullptr, cstr("fKind")},
    {cstr("fScopeName"), getScope<&LogicalLineObject::fScopeName>,
     setScope<&LogicalLineObject::fScopeName>, nullptr, nullptr},
    {cstr("fLocalScopeName"), getScope<&LogicalLineObject::fLocalScopeName>,
     setScope<&LogicalLineObject::fLocalScopeName>, nullptr, nullptr},
    {nullptr, nullptr, nullptr, nullptr, nullptr},
};

// ---------------------------------------------------------------------------
// Pickling and copying: (type, constructor args, state). The state holds
// the scope names that are present, and a subclass instance's own dict, all
// restored by setattr so that absent fields stay absent; None when empty.

PyObject* logicalReduce(PyObject* self, PyObject*) {
    return py::guarded([&] {
        LogicalLineObject* rec = asLogical(self);
        py::Ref tokens = py::check(getTokens(self, nullptr));
        py::Ref args = py::check(Py_BuildValue("(Oiii)", tokens.get(), int(rec->fLineno),
                                               int(rec->fIndent), int(rec->fKind)));
        py::Ref state = py::check(PyDict_New());
        PyObject** dictPtr = _PyObject_GetDictPtr(self);
        if (dictPtr != nullptr && *dictPtr != nullptr) {
            if (PyDict_Update(state.get(), *dictPtr) < 0) py::fail();
        }
        if (rec->fScopeName != nullptr &&
            PyDict_SetItemString(state.get(), "fScopeName", rec->fScopeName) < 0)
            py::fail();
        if (rec->fLocalScopeName != nullptr &&
            PyDict_SetItemString(state.get(), "fLocalScopeName", rec->fLocalScopeName) < 0)
            py::fail();
        // No state at all spares the unpickler a __setstate__ call per logical.
        if (PyDict_Size(state.get()) == 0) state = py::Ref::none();
        return PyTuple_Pack(3, reinterpret_cast<PyObject*>(Py_TYPE(self)), args.get(),
                            state.get());
    });
}

PyObject* logicalSetState(PyObject* self, PyObject* state) {
    return py::guarded([&] {
        if (!PyDict_Check(state)) {
            PyErr_Format(PyExc_TypeError, "state must be a dict, not %.200s",
                         Py_TYPE(state)->tp_name);
            py::fail();
        }
        // setattr may run Python code that changes the dict: walk a snapshot.
        py::Ref items = py::check(PyDict_Items(state));
        for (Py_ssize_t i = 0; i < PyList_GET_SIZE(items.get()); ++i) {
            PyObject* pair = PyList_GET_ITEM(items.get(), i);
            if (PyObject_SetAttr(self, PyTuple_GET_ITEM(pair, 0), PyTuple_GET_ITEM(pair, 1)) < 0)
                py::fail();
        }
        return py::Ref::none().release();
    });
}

PyMethodDef gLogicalMethods[] = {
    {"__reduce__", logicalReduce, METH_NOARGS, nullptr},
    {"__setstate__", logicalSetState, METH_O, nullptr},
    {nullptr, nullptr, 0, nullptr},
};

// ---------------------------------------------------------------------------
// Lookups.

constexpr Py_ssize_t kNotLogical = -1;

Py_ssize_t lowerBoundSearch(PyObject* list, long long lineno);

// The last answer, tried first: an edit asks about one place several
// times (the removed line's number, then the added line). Only a pointer
// and numbers are kept, and the answer is checked against the list before
// it is used, so a changed or freed list costs a search, never a wrong one.
struct LastBound {
    PyObject* list = nullptr;
    long long lineno = 0;
    Py_ssize_t index = -1;
};
LastBound gLastBound;

// Index of the first logical with fLineno >= lineno, or kNotLogical when the
// search met an item that is not a logical.
Py_ssize_t lowerBound(PyObject* list, long long lineno) {
    const LastBound& last = gLastBound;
    if (last.list == list && last.lineno == lineno) {
        const Py_ssize_t i = last.index;
        const Py_ssize_t n = PyList_GET_SIZE(list);
        if (i >= 0 && i <= n) {
            PyObject* at = i < n ? PyList_GET_ITEM(list, i) : nullptr;
            PyObject* before = i > 0 ? PyList_GET_ITEM(list, i - 1) : nullptr;
            const bool atOk = at == nullptr || (isLogical(at) && asLogical(at)->fLineno >= lineno);
            const bool beforeOk = before == nullptr || (isLogical(before) && asLogical(before)->fLineno < lineno);
            if (atOk && beforeOk) return i;
        }
    }
    const Py_ssize_t found = lowerBoundSearch(list, lineno);
    if (found != kNotLogical) gLastBound = {list, lineno, found};
    return found;
}

Py_ssize_t lowerBoundSearch(PyObject* list, long long lineno) {
    Py_ssize_t lo = 0;
    Py_ssize_t hi = PyList_GET_SIZE(list);
    while (lo < hi) {
        Py_ssize_t mid = lo + (hi - lo) / 2;
        PyObject* item = PyList_GET_ITEM(list, mid);
        if (!isLogical(item)) return kNotLogical;
        if (asLogical(item)->fLineno < lineno)
            lo = mid + 1;
        else
            hi = mid;
    }
    return lo;
}

Py_ssize_t linearFind(PyObject* list, PyObject* target) {
    for (Py_ssize_t i = 0; i < PyList_GET_SIZE(list); ++i)
        if (PyList_GET_ITEM(list, i) == target) return i;
    return -1;
}

Py_ssize_t findIndex(PyObject* list, PyObject* target) {
    if (!isLogical(target)) return linearFind(list, target);
    int32_t lineno = asLogical(target)->fLineno;
    Py_ssize_t i = lowerBound(list, lineno);
    if (i != kNotLogical) {
        for (Py_ssize_t n = PyList_GET_SIZE(list); i < n; ++i) {
            PyObject* item = PyList_GET_ITEM(list, i);
            if (item == target) return i;
            if (!isLogical(item) || asLogical(item)->fLineno != lineno) break;
        }
    }
    // Only reached for a list out of line order or a logical not in it.
    return linearFind(list, target);
}

void requireList(PyObject* o, const char* function);

// The native forms published in _capi: the same lookups and errors as the
// Python functions below, without building argument tuples.
Py_ssize_t nativeIndexForLineno(PyObject* list, long lineno) noexcept {
    return py::guardedAs<Py_ssize_t>(-1, [&] {
        requireList(list, "IndexForLineno");
        const Py_ssize_t i = lowerBound(list, lineno);
        if (i == kNotLogical) {
            PyErr_SetString(PyExc_TypeError, "Argument must be a logical");
            py::fail();
        }
        return i;
    });
}

Py_ssize_t nativeFindIndexOfLogical(PyObject* list, PyObject* logical) noexcept {
    return py::guardedAs<Py_ssize_t>(-1, [&] {
        requireList(list, "FindIndexOfLogical");
        return findIndex(list, logical);
    });
}

void requireList(PyObject* o, const char* function) {
    if (!PyList_Check(o)) {
        PyErr_Format(PyExc_TypeError, "%s() argument 1 must be list, not %.200s", function,
                     Py_TYPE(o)->tp_name);
        py::fail();
    }
}

PyObject* FindIndexOfLogical(PyObject*, PyObject* args) {
    return py::guarded([&] {
        PyObject *list, *logical;
        if (!PyArg_ParseTuple(args, "OO:FindIndexOfLogical", &list, &logical)) py::fail();
        requireList(list, "FindIndexOfLogical");
        return compat::intFromSsize(findIndex(list, logical));
    });
}

PyObject* IndexForLineno(PyObject*, PyObject* args) {
    return py::guarded([&] {
        PyObject *list, *linenoArg;
        if (!PyArg_ParseTuple(args, "OO:IndexForLineno", &list, &linenoArg)) py::fail();
        requireList(list, "IndexForLineno");
        long long lineno = toInteger(linenoArg, "lineno", std::numeric_limits<long long>::min(),
                                     std::numeric_limits<long long>::max());
        Py_ssize_t i = lowerBound(list, lineno);
        if (i == kNotLogical) {
            PyErr_SetString(PyExc_TypeError, "Argument must be a logical");
            py::fail();
        }
        return compat::intFromSsize(i);
    });
}

PyMethodDef gModuleMethods[] = {
    {"FindIndexOfLogical", FindIndexOfLogical, METH_VARARGS,
     "FindIndexOfLogical(logical_list, logical): index of that very object, or -1."},
    {"IndexForLineno", IndexForLineno, METH_VARARGS,
     "IndexForLineno(logical_list, lineno): index of the first logical at or after lineno."},
    {nullptr, nullptr, 0, nullptr},
};

// ---------------------------------------------------------------------------
// Module frame.

void readyLogicalType(PyObject* module) {
    PyTypeObject& t = gLogicalLineType;
    t.tp_name = "pysource._fastaccess.LogicalLineType";
    t.tp_basicsize = sizeof(LogicalLineObject);
    t.tp_flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_BASETYPE | Py_TPFLAGS_HAVE_GC;
    t.tp_doc = "LogicalLineType(tokens, lineno, indent, kind): one logical line of source.";
    t.tp_dealloc = logicalDealloc;
    t.tp_traverse = logicalTraverse;
    t.tp_clear = logicalClear;
    t.tp_repr = logicalRepr;
    t.tp_methods = gLogicalMethods;
    t.tp_getset = gLogicalGetSet;
    t.tp_init = logicalInit;
    t.tp_new = PyType_GenericNew;
    t.tp_free = PyObject_GC_Del;
    siblings::readyType(module, "LogicalLineType", &t);
}

compat::ModuleDef gModuleDef = SBC_MODULE_DEF("_fastaccess", "Logical-line records and lookups over them.", gModuleMethods);

// The module, made and filled; on 3.x the reference the init function
// returns.
py::Ref init() {
    py::Ref owner;
    PyObject* module = compat::createModule(gModuleDef, owner);
    readyLogicalType(module);
    siblings::readyMinimalType(module, "CLogger", &gCLoggerType, "pysource._fastaccess.CLogger");
    siblings::readyMinimalType(module, "CBytesTokenizer", &gCBytesTokenizerType,
                               "pysource._fastaccess.CBytesTokenizer",
                               sizeof(contracts::VtabSiblingObject));
    siblings::setVtable(&gCBytesTokenizerType, &gBytesTokenizerVtable, "CBytesTokenizerVtable");

    py::Ref time = py::check(PyImport_ImportModule("time"));
    py::Ref timeFunc = py::check(PyObject_GetAttrString(time.get(), "time"));
    gTimeFunc = timeFunc.release();  // lives as long as the process
    gLogicalLineTypeVar = reinterpret_cast<PyObject*>(&gLogicalLineType);

    PyObject* capi = siblings::makeCapi(module);
    siblings::publish(capi, "LogicalLineType", &gLogicalLineTypeVar, contracts::sig::kObject);
    siblings::publish(capi, "__TimeFunc", &gTimeFunc, contracts::sig::kObject);
    contracts::IndexForLinenoFn indexForLineno = nativeIndexForLineno;
    contracts::FindIndexOfLogicalFn findIndexOfLogical = nativeFindIndexOfLogical;
    siblings::publish(capi, "IndexForLineno", reinterpret_cast<void*>(indexForLineno),
                      contracts::sig::kIndexForLineno);
    siblings::publish(capi, "FindIndexOfLogical", reinterpret_cast<void*>(findIndexOfLogical),
                      contracts::sig::kFindIndexOfLogical);
    return owner;
}

}  // namespace fastaccess

SBC_MODULE_INIT(_fastaccess) {
    PyObject* module = py::guarded([] { return fastaccess::init().release(); });
    return compat::initResult(module);
}
