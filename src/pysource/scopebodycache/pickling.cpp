// Pickling and copying of CChangeFinder and CScopeBodyCache.
//
// An object travels as a tuple of its fields sorted by field name (the base
// class's two fields first) plus, for a Python subclass, its __dict__. A
// checksum of the field list goes with it, so that a pickle made with
// another field list is refused rather than loaded into the wrong fields.
// Both classes share one reduce, one rebuild and one state applier, driven
// by a table of their fields.
#include "pysource/scopebodycache/pickling.hpp"

#include "pysource/contracts/destroyable_base.hpp"
#include "pysource/scopebodycache/bodycache.hpp"
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/function.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/siblings.hpp"

#include <cstddef>
#include <string_view>

namespace sbc {
namespace {


enum class FieldKind : uint8_t {
    Destroyed,  // the base's flag, stored as True/False
    Signals,    // the base's __fSignalCatchers: dict or None
    Object,     // an object slot of the state block: None or exactly `type`
    Index,      // a Py_ssize_t of the state block, stored as an int
};

struct Field {
    FieldKind kind;
    Py_ssize_t offset;   // within the state block (Object, Index)
    PyTypeObject* type;  // Object: the exact type accepted besides None
    const char* typeName;
};

constexpr int kMaxFields = 10;

// A finder state taken while a call was in progress (from an override, or
// after a direct _PrepareForFind) holds that call's sets and table: they
// belong to the call, which goes on in the object they were taken from. A
// finder loaded or copied from it comes back idle, so that its next call
// works; only the finder running a call of its own keeps what it is given.
void finderLoaded(PyObject* self) {
    const FinderState& s = finderState(self);
    if (!s.inCall && s.contentsChanges != Py_None) finder::Clear(self);
}

struct PickledClass {
    PyTypeObject* (*type)() noexcept;
    const Py_ssize_t* stateOffset;  // where the state block starts
    long checksum;
    const char* checksumMessage;  // one %zd: the checksum found in the pickle
    PyObject* Names::*rebuildName;
    void (*stateApplied)(PyObject* self) noexcept;  // internal state to reset
    void (*stateLoaded)(PyObject* self);             // after every field is applied
    int fieldCount;
    Field fields[kMaxFields];
};

contracts::DestroyableObject* base(PyObject* self) noexcept {
    return reinterpret_cast<contracts::DestroyableObject*>(self);
}

// --- The field tables, expanded from the classes' field lists --------------
// The two base fields come first: their names sort before ours.

#define SBC_BASE_FIELD_NAMES "__fDestroyed, __fSignalCatchers"
#define SBC_BASE_FIELDS {FieldKind::Destroyed, 0, nullptr, nullptr}, {FieldKind::Signals, 0, nullptr, "dict"},
#define SBC_PICKLED_FIELD(State, kind, member, type) \
    {FieldKind::kind, static_cast<Py_ssize_t>(offsetof(State, member)), SBC_FIELD_TYPE_##type, #type},
#define SBC_FINDER_FIELD(kind, member, name, type) SBC_PICKLED_FIELD(FinderState, kind, member, type)
#define SBC_BODY_CACHE_FIELD(kind, member, name, type) SBC_PICKLED_FIELD(BodyCacheState, kind, member, type)

// Stored pickles carry these checksums for exactly these field lists; the
// hashes below fail the build if a list changes without a new checksum and
// a way to load the pickles made before.
constexpr std::string_view kFinderFieldList = SBC_BASE_FIELD_NAMES SBC_FINDER_FIELDS(SBC_FIELD_NAME_LIST);
static_assert(namesSorted(kFinderFieldList), "the state tuple is sorted by field name");
static_assert(fieldListHash(kFinderFieldList) == 0x541e59a9u, "CChangeFinder pickles carry 0x093a2af");
constexpr std::string_view kBodyCacheFieldList =
    SBC_BASE_FIELD_NAMES SBC_BODY_CACHE_FIELDS(SBC_FIELD_NAME_LIST);
static_assert(namesSorted(kBodyCacheFieldList), "the state tuple is sorted by field name");
static_assert(fieldListHash(kBodyCacheFieldList) == 0xfcb07ba2u, "CScopeBodyCache pickles carry 0xa66c71f");

const PickledClass kChangeFinder = {
    changeFinderType,
    &gFinderStateOffset,
    0x093a2af,
    "Incompatible checksums (%zd vs 0x093a2af = (" SBC_BASE_FIELD_NAMES SBC_FINDER_FIELDS(SBC_FIELD_NAME_LIST) "))",
    &Names::unpickleChangeFinder,
    dropDefinitionIndex,  // rebuilt from the list when needed
    finderLoaded,
    2 + 0 SBC_FINDER_FIELDS(SBC_COUNT_FIELD),
    {SBC_BASE_FIELDS SBC_FINDER_FIELDS(SBC_FINDER_FIELD)},
};

const PickledClass kScopeBodyCache = {
    scopeBodyCacheType,
    &gBodyCacheStateOffset,
    0xa66c71f,
    "Incompatible checksums (%zd vs 0xa66c71f = (" SBC_BASE_FIELD_NAMES SBC_BODY_CACHE_FIELDS(SBC_FIELD_NAME_LIST) "))",
    &Names::unpickleScopeBodyCache,
    dropBodyIndexes,
    nullptr,
    2 + 0 SBC_BODY_CACHE_FIELDS(SBC_COUNT_FIELD),
    {SBC_BASE_FIELDS SBC_BODY_CACHE_FIELDS(SBC_BODY_CACHE_FIELD)},
};

PyObject*& objectAt(const PickledClass& c, const Field& f, PyObject* self) {
    return *reinterpret_cast<PyObject**>(reinterpret_cast<char*>(self) + *c.stateOffset + f.offset);
}

Py_ssize_t& indexAt(const PickledClass& c, const Field& f, PyObject* self) {
    return *reinterpret_cast<Py_ssize_t*>(reinterpret_cast<char*>(self) + *c.stateOffset + f.offset);
}

// --- Reduce -------------------------------------------------------------------

// getattr(self, '__dict__', None)
py::Ref instanceDict(PyObject* self) {
    PyObject* d = PyObject_GetAttr(self, gNames.dict);
    if (d != nullptr) return py::Ref::steal(d);
    if (!PyErr_ExceptionMatches(PyExc_AttributeError)) py::fail();
    PyErr_Clear();
    return py::Ref::none();
}

py::Ref reduce(const PickledClass& c, PyObject* self) {
    py::Ref fields[kMaxFields];
    bool anyObjectSet = false;
    for (int i = 0; i < c.fieldCount; ++i) {
        const Field& f = c.fields[i];
        switch (f.kind) {
        case FieldKind::Destroyed:
            fields[i] = py::Ref::own(base(self)->fDestroyed ? Py_True : Py_False);
            break;
        case FieldKind::Signals:
        case FieldKind::Object: {
            PyObject* value = f.kind == FieldKind::Signals ? base(self)->fSignalCatchers : objectAt(c, f, self);
            fields[i] = py::Ref::own(value != nullptr ? value : Py_None);
            anyObjectSet = anyObjectSet || !fields[i].isNone();
            break;
        }
        case FieldKind::Index:
            fields[i] = py::check(compat::intFromSsize(indexAt(c, f, self)));
            break;
        }
    }
    py::Ref dict = instanceDict(self);
    const Py_ssize_t size = c.fieldCount + (dict.isNone() ? 0 : 1);
    py::Ref state = py::check(PyTuple_New(size));
    for (int i = 0; i < c.fieldCount; ++i) PyTuple_SET_ITEM(state.get(), i, fields[i].release());
    if (!dict.isNone()) PyTuple_SET_ITEM(state.get(), c.fieldCount, dict.release());
    const bool setstateForm = size > c.fieldCount || anyObjectSet;

    py::Ref rebuild = py::Ref::own(lookupGlobal(gNames.*c.rebuildName));
    py::Ref checksum = py::check(compat::intFromLong(c.checksum));
    PyObject* type = reinterpret_cast<PyObject*>(Py_TYPE(self));
    if (setstateForm) {
        py::Ref args = py::check(PyTuple_Pack(3, type, checksum.get(), Py_None));
        return py::check(PyTuple_Pack(3, rebuild.get(), args.get(), state.get()));
    }
    py::Ref args = py::check(PyTuple_Pack(3, type, checksum.get(), state.get()));
    return py::check(PyTuple_Pack(2, rebuild.get(), args.get()));
}

// --- Apply state --------------------------------------------------------------

// Fields are assigned one at a time as they are read: a failure part way
// leaves the earlier ones assigned.
void applyState(const PickledClass& c, PyObject* self, PyObject* state) {
    // Whatever the state holds, internal state built for the old one goes.
    c.stateApplied(self);
    if (state == Py_None) msg::raise(PyExc_TypeError, msg::kNoneNotSubscriptable);
    py::Ref keep = py::Ref::own(state);
    const Py_ssize_t size = PyTuple_GET_SIZE(state);
    for (int i = 0; i < c.fieldCount; ++i) {
        if (i >= size) msg::raise(PyExc_IndexError, msg::kTupleIndexOutOfRange);
        PyObject* item = PyTuple_GET_ITEM(state, i);
        const Field& f = c.fields[i];
        switch (f.kind) {
        case FieldKind::Destroyed: base(self)->fDestroyed = py::truth(item) ? 1 : 0; break;
        case FieldKind::Signals: storeTyped(&base(self)->fSignalCatchers, item, &PyDict_Type, "dict"); break;
        case FieldKind::Object: storeTyped(&objectAt(c, f, self), item, f.type, f.typeName); break;
        case FieldKind::Index: indexAt(c, f, self) = py::asIndex(item); break;
        }
    }
    if (size > c.fieldCount && PyObject_HasAttr(self, gNames.dict)) {
        py::Ref dict = py::check(PyObject_GetAttr(self, gNames.dict));
        py::Ref result = py::check(
            PyObject_CallMethodObjArgs(dict.get(), gNames.update, PyTuple_GET_ITEM(state, c.fieldCount), nullptr));
    }
    if (c.stateLoaded != nullptr) c.stateLoaded(self);
}

void setState(const PickledClass& c, PyObject* self, PyObject* state) {
    if (state != Py_None && !PyTuple_CheckExact(state)) msg::raiseExpectedType("tuple", state);
    applyState(c, self, state);
}

// --- Rebuild ------------------------------------------------------------------

py::Ref rebuild(const PickledClass& c, PyObject* type, PyObject* checksumArg, PyObject* state) {
    const Py_ssize_t checksum = py::asIndex(checksumArg);
    if (checksum != c.checksum) {
        py::Ref pickle = py::check(PyImport_ImportModule("pickle"));
        py::Ref pickleError = py::check(PyObject_GetAttrString(pickle.get(), "PickleError"));
        py::Ref message = py::check(compat::strFromFormat(c.checksumMessage, checksum));
        PyErr_SetObject(pickleError.get(), message.get());
        py::fail();
    }
    py::Ref result = py::check(PyObject_CallMethod(reinterpret_cast<PyObject*>(c.type()),
                                                   const_cast<char*>("__new__"), const_cast<char*>("(O)"),
                                                   type));
    if (state != Py_None) {
        if (!PyTuple_CheckExact(state)) msg::raiseExpectedType("tuple", state);
        applyState(c, result.get(), state);
    }
    return result;
}

// --- Python-visible functions -------------------------------------------------

template <const PickledClass& C>
PyObject* m_reduce(PyObject* self, PyObject* const*) {
    return reduce(C, self).release();
}

template <const PickledClass& C>
PyObject* m_setstate(PyObject* self, PyObject* const* a) {
    setState(C, self, a[0]);
    return py::Ref::none().release();
}

template <const PickledClass& C>
PyObject* f_unpickle(PyObject*, PyObject* const* a) {
    return rebuild(C, a[0], a[1], a[2]).release();
}

struct ClassFunctions {
    const PickledClass& pickled;
    FunctionSpec reduce;
    FunctionSpec setstate;
    FunctionSpec unpickle;
};

// The rebuild functions' names and parameter names are written into every
// pickle (pickle refers to a function by module and name, and callers may
// pass the arguments by keyword): they never change.
constexpr Param kStateParam{"__pyx_state", ArgCheck::Any};
#define SBC_UNPICKLE_PARAMS \
    {{"__pyx_type", ArgCheck::Any}, {"__pyx_checksum", ArgCheck::Any}, kStateParam}

const ClassFunctions kScopeBodyCacheFunctions = {
    kScopeBodyCache,
    {"__reduce__", nullptr, m_reduce<kScopeBodyCache>, 0, 0, {}},
    {"__setstate__", nullptr, m_setstate<kScopeBodyCache>, 1, 1, {kStateParam}},
    {"__pyx_unpickle_CScopeBodyCache", nullptr, f_unpickle<kScopeBodyCache>, 3, 3, SBC_UNPICKLE_PARAMS},
};

const ClassFunctions kChangeFinderFunctions = {
    kChangeFinder,
    {"__reduce__", nullptr, m_reduce<kChangeFinder>, 0, 0, {}},
    {"__setstate__", nullptr, m_setstate<kChangeFinder>, 1, 1, {kStateParam}},
    {"__pyx_unpickle_CChangeFinder", nullptr, f_unpickle<kChangeFinder>, 3, 3, SBC_UNPICKLE_PARAMS},
};
#undef SBC_UNPICKLE_PARAMS

const ClassFunctions& functionsFor(PyTypeObject* type) {
    return type == scopeBodyCacheType() ? kScopeBodyCacheFunctions : kChangeFinderFunctions;
}

// type.<name> as found through the class, compared by identity with object's.
bool inheritsFromObject(PyTypeObject* type, const char* name) {
    py::Ref own = py::check(PyObject_GetAttrString(reinterpret_cast<PyObject*>(type), name));
    py::Ref object = py::check(PyObject_GetAttrString(reinterpret_cast<PyObject*>(&PyBaseObject_Type), name));
    return own.get() == object.get();
}

void install(PyTypeObject* type) {
    PyObject* typeObject = reinterpret_cast<PyObject*>(type);
    // A class with hooks of its own keeps them (3.11 on, every class has
    // object's __getstate__, which does not count).
    if (PyObject_HasAttrString(typeObject, "__getstate__") &&
        !(compat::kObjectHasGetstate && inheritsFromObject(type, "__getstate__"))) {
        return;
    }
    if (!inheritsFromObject(type, "__reduce_ex__") || !inheritsFromObject(type, "__reduce__")) return;
    const ClassFunctions& f = functionsFor(type);
    py::Ref reduceMethod = newMethod(f.reduce, type, kModuleName);
    py::checkStatus(PyDict_SetItemString(type->tp_dict, "__reduce__", reduceMethod.get()));
    py::Ref setstateMethod = newMethod(f.setstate, type, kModuleName);
    py::checkStatus(PyDict_SetItemString(type->tp_dict, "__setstate__", setstateMethod.get()));
    PyType_Modified(type);
}

}  // namespace

void installPickling(PyTypeObject* type) {
    try {
        install(type);
        return;
    } catch (...) {
        py::setErrorFromCurrentException();
    }
    PyErr_Clear();
    PyErr_Format(PyExc_RuntimeError, "Unable to initialize pickling for %s", type->tp_name);
    py::fail();
}

void bindUnpickleFunctions(PyObject* moduleDict) {
    for (const ClassFunctions* f : {&kScopeBodyCacheFunctions, &kChangeFinderFunctions}) {
        py::Ref function = newFunction(f->unpickle, kModuleName);
        py::checkStatus(PyDict_SetItemString(moduleDict, f->unpickle.name, function.get()));
    }
}

}  // namespace sbc
