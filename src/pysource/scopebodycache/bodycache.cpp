// CScopeBodyCache: resolves a full dotted scope name one level at a time
// through the cached body of its parent, and caches both the defining
// logical and the body list under that name until the owner clears them.
//
// The lookups call each other as ordinary methods on the instance, so an
// override in a Python subclass takes part in every resolution. Nothing here
// watches the logical list: a cached entry is trusted until Clear.
#include "pysource/scopebodycache/bodycache.hpp"

#include "pysource/contracts/accessors.hpp"
#include "pysource/contracts/destroyable_base.hpp"
#include "pysource/scopebodycache/destroyable_subclass.hpp"
#include "pysource/scopebodycache/function.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/siblings.hpp"

namespace sbc {

using namespace contracts;

Py_ssize_t gBodyCacheStateOffset = 0;

namespace {

PyTypeObject BodyCacheType = {PyVarObject_HEAD_INIT(nullptr, 0)};
PyTypeObject* gBodyCacheType = &BodyCacheType;  // the class in use (see Slots::ready)

// --- Small helpers with the semantics of the Python operations ------------

// dict.get(key, None) on a field that may be None; a stored None counts as
// absent. PyDict_GetItem swallows lookup errors in 2.7, so a miss is
// confirmed by a lookup that reports them.
py::Ref cacheGet(PyObject* field, PyObject* key) {
    if (field == Py_None) msg::raiseNoneAttribute("get");
    py::Ref dict = py::Ref::own(field);
    PyObject* v = PyDict_GetItem(dict.get(), key);
    if (v == nullptr) {
        if (py::checkStatus(PyDict_Contains(dict.get(), key)) == 0) return py::Ref();
        v = PyDict_GetItem(dict.get(), key);
    }
    if (v == nullptr || v == Py_None) return py::Ref();
    return py::Ref::own(v);
}

// field[key] = value; the field may have been emptied to None by Python code
// that ran while the value was computed.
void cacheStore(PyObject* field, PyObject* key, PyObject* value) {
    if (field == Py_None) msg::raise(PyExc_TypeError, msg::kNoneNotSubscriptable);
    py::Ref dict = py::Ref::own(field);
    py::checkStatus(PyDict_SetItem(dict.get(), key, value));
}

// field.pop(key, None), the result dropped.
void cachePop(PyObject* field, PyObject* key) {
    if (field == Py_None) msg::raiseNoneAttribute("pop");
    py::Ref dict = py::Ref::own(field);
    if (py::checkStatus(PyDict_Contains(dict.get(), key)) == 0) return;
    if (PyDict_DelItem(dict.get(), key) < 0) {
        // A key's __eq__ may have removed it in between.
        if (!PyErr_ExceptionMatches(PyExc_KeyError)) py::fail();
        PyErr_Clear();
    }
}

void cacheClear(PyObject* field) {
    if (field == Py_None) msg::raiseNoneAttribute("clear");
    py::Ref dict = py::Ref::own(field);
    PyDict_Clear(dict.get());
}

// self.<name>(arg) as a normal method call. An instance of the class itself
// (no subclass, no instance dictionary) can only find our own method, so
// that is run directly.
py::Ref callMethod(PyObject* self, PyObject* name, PyObject* arg, py::Ref (*own)(PyObject*, PyObject*)) {
    if (Py_TYPE(self) == scopeBodyCacheType()) return own(self, arg);
    return py::check(PyObject_CallMethodObjArgs(self, name, arg, nullptr));
}

// `for item in seq`: exact lists and tuples by index against their live
// size, anything else through the iterator protocol. `body` returns false
// to stop early.
template <class Body>
void forEach(PyObject* seq, Body&& body) {
    if (PyList_CheckExact(seq) || PyTuple_CheckExact(seq)) {
        py::Ref keep = py::Ref::own(seq);
        const bool isList = PyList_CheckExact(seq);
        for (Py_ssize_t i = 0;; ++i) {
            const Py_ssize_t n = isList ? PyList_GET_SIZE(seq) : PyTuple_GET_SIZE(seq);
            if (i >= n) return;
            py::Ref item = py::Ref::own(isList ? PyList_GET_ITEM(seq, i) : PyTuple_GET_ITEM(seq, i));
            if (!body(item.get())) return;
        }
    }
    py::Ref it = py::check(PyObject_GetIter(seq));
    for (;;) {
        PyObject* next = PyIter_Next(it.get());
        if (next == nullptr) {
            if (PyErr_Occurred()) py::fail();
            return;
        }
        py::Ref item = py::Ref::steal(next);
        if (!body(item.get())) return;
    }
}

// --- Indexed bodies -----------------------------------------------------------
// Resolving a name looks its leaf up in the parent's body; scanning that
// body each time makes resolving every scope of a file quadratic in the
// number of definitions at a level. The first search of a body indexes its
// definitions by defined name (first one wins, as the scan has it), and the
// index serves while that very list, with that length, is the body found.
// An index is not made for a body the scan would fail on (an item that is
// not a logical, a defined name that is not a str): that body is scanned.

void dropIndexFor(PyObject* self, PyObject* scopeName) {
    PyObject* indexes = bodyCacheState(self).bodyIndexes;
    if (indexes == nullptr) return;
    py::Ref keep = py::Ref::own(indexes);
    if (PyDict_DelItem(indexes, scopeName) < 0) PyErr_Clear();  // absent, or unhashable
}

// {defined name: first position} of `body`, or None when it cannot be made.
py::Ref indexBody(PyObject* body) {
    py::Ref names = py::check(PyDict_New());
    for (Py_ssize_t i = 0; i < PyList_GET_SIZE(body); ++i) {
        PyObject* item = PyList_GET_ITEM(body, i);
        if (!logicalCheck(item)) return py::Ref::none();
        PyObject* defined = localScopeDefined(asLogical(item));
        if (defined == nullptr) continue;
        if (!compat::isStrExact(defined)) return py::Ref::none();
        py::Ref position = py::check(compat::intFromSsize(i));
        if (py::checkStatus(PyDict_Contains(names.get(), defined)) == 0) {
            py::checkStatus(PyDict_SetItem(names.get(), defined, position.get()));
        }
    }
    return names;
}

// The definition named `leaf` in `body` through the index, or an empty
// handle when the index cannot answer (then the body is scanned). Sets
// `absent` when the index knows that no definition has that name.
py::Ref findInIndexedBody(PyObject* self, PyObject* scopeName, PyObject* body, PyObject* leaf, bool* absent) {
    *absent = false;
    if (!compat::isStrExact(scopeName) || !compat::isStrExact(leaf) || !PyList_CheckExact(body)) return {};
    // A short body is scanned faster than an index is built.
    if (PyList_GET_SIZE(body) < 16) return {};
    BodyCacheState& s = bodyCacheState(self);
    if (s.bodyIndexes == nullptr) s.bodyIndexes = py::check(PyDict_New()).release();
    py::Ref indexes = py::Ref::own(s.bodyIndexes);
    py::Ref entry = py::Ref::own(PyDict_GetItem(indexes.get(), scopeName));
    const Py_ssize_t size = PyList_GET_SIZE(body);
    if (!entry || PyTuple_GET_ITEM(entry.get(), 0) != body ||
        compat::smallIntValue(PyTuple_GET_ITEM(entry.get(), 1)) != size) {
        py::Ref names = indexBody(body);
        py::Ref length = py::check(compat::intFromSsize(size));
        entry = py::check(PyTuple_Pack(3, body, length.get(), names.get()));
        py::checkStatus(PyDict_SetItem(indexes.get(), scopeName, entry.get()));
    }
    PyObject* names = PyTuple_GET_ITEM(entry.get(), 2);
    if (names == Py_None) return {};
    PyObject* position = PyDict_GetItem(names, leaf);
    if (position == nullptr) {
        *absent = true;
        return {};
    }
    // The one it names is checked: still there, still of that name.
    const Py_ssize_t i = compat::smallIntValue(position);
    if (i >= PyList_GET_SIZE(body)) return {};
    PyObject* item = PyList_GET_ITEM(body, i);
    if (!logicalCheck(item)) return {};
    PyObject* defined = localScopeDefined(asLogical(item));
    if (defined == nullptr || !compat::isStrExact(defined) || !compat::strEqual(defined, leaf)) return {};
    return py::Ref::own(item);
}

// --- The lookups ------------------------------------------------------------

py::Ref findScopeDef(PyObject* self, PyObject* scopeName);
py::Ref findBodyOfScopeDef(PyObject* self, PyObject* scopeDef);
py::Ref getBodyOfScope(PyObject* self, PyObject* scopeName);

py::Ref getScopeDef(PyObject* self, PyObject* scopeName) {
    if (py::Ref cached = cacheGet(bodyCacheState(self).scopeDefCache, scopeName)) return cached;
    py::Ref def = callMethod(self, gNames.FindScopeDef, scopeName, findScopeDef);
    cacheStore(bodyCacheState(self).scopeDefCache, scopeName, def.get());
    return def;
}

py::Ref getBodyOfScope(PyObject* self, PyObject* scopeName) {
    if (py::Ref cached = cacheGet(bodyCacheState(self).scopeBodyCache, scopeName)) return cached;
    py::Ref def = callMethod(self, gNames.GetScopeDef, scopeName, getScopeDef);
    py::Ref body = callMethod(self, gNames.FindBodyOfScopeDef, def.get(), findBodyOfScopeDef);
    cacheStore(bodyCacheState(self).scopeBodyCache, scopeName, body.get());
    return body;
}

py::Ref parentScopeName(PyObject* parts, Py_ssize_t count) {
    if (count == 1) return py::Ref::own(gNames.empty);
    if (count == 2) return py::check(PySequence_GetItem(parts, 0));
    py::Ref ancestors = py::check(PySequence_GetSlice(parts, 0, count - 1));
    return py::check(PyObject_CallMethodObjArgs(gNames.dot, gNames.join, ancestors.get(), nullptr));
}

// The parent's name and the leaf of a full name, as SplitScopeNames and the
// join of all but the last part give them.
void splitParent(PyObject* scopeName, py::Ref* parentName, py::Ref* leafName) {
    const Py_ssize_t cut = gNative.scopeNameParentLength != nullptr && compat::isStrExact(scopeName)
                               ? gNative.scopeNameParentLength(scopeName)
                               : -2;
    if (cut == -1) {
        *parentName = py::Ref::own(gNames.empty);
        *leafName = py::Ref::own(scopeName);
        return;
    }
    if (cut >= 0) {
        const std::string_view text = compat::strView(scopeName);
        *parentName = py::check(compat::strFromBytes(text.data(), cut));
        *leafName = py::check(compat::strFromBytes(text.data() + cut + 1,
                                                   static_cast<Py_ssize_t>(text.size()) - cut - 1));
        return;
    }
    py::Ref parts = splitScopeNames(scopeName);
    const Py_ssize_t count = py::checkSize(PyObject_Size(parts.get()));
    *parentName = parentScopeName(parts.get(), count);
    *leafName = py::check(PySequence_GetItem(parts.get(), -1));
}

py::Ref findScopeDef(PyObject* self, PyObject* scopeName) {
    if (py::checkSize(PyObject_Size(scopeName)) == 0) return py::Ref::none();
    py::Ref parentName, leafName;
    splitParent(scopeName, &parentName, &leafName);
    py::Ref parentBody = callMethod(self, gNames.GetBodyOfScope, parentName.get(), getBodyOfScope);

    bool absent = false;
    py::Ref found = findInIndexedBody(self, parentName.get(), parentBody.get(), leafName.get(), &absent);
    if (found) return found;
    if (absent) msg::raiseWithRepr(PyExc_KeyError, msg::kNoScopeFound, scopeName);
    forEach(parentBody.get(), [&](PyObject* logical) {
        const Logical* l = requireLogical(logical);
        py::Ref defined = py::Ref::own(localScopeDefinedChecked(l));
        // Logicals that define nothing compare as None, which a name never equals.
        if (!defined) return true;
        if (!py::checkStatus(PyObject_RichCompareBool(defined.get(), leafName.get(), Py_EQ))) return true;
        found = py::Ref::own(logical);
        return false;
    });
    if (!found) msg::raiseWithRepr(PyExc_KeyError, msg::kNoScopeFound, scopeName);
    return found;
}

py::Ref findBodyOfScopeDef(PyObject* self, PyObject* scopeDef) {
    Py_ssize_t first = 0;
    long defIndent = -1;
    if (scopeDef != Py_None) {
        const Logical* def = requireLogical(scopeDef);
        if (!isScopeStart(def)) msg::raiseWithRepr(PyExc_ValueError, msg::kMustStartScope, scopeDef);
        py::Ref list = py::Ref::own(bodyCacheState(self).logicalList);
        first = findIndexOfLogical(list.get(), scopeDef, nativeSiblingsCurrent()) + 1;
        if (first == 0) msg::raise(PyExc_IndexError, msg::kDefNotInList);
        defIndent = def->fIndent;
    }

    py::Ref list = py::Ref::own(bodyCacheState(self).logicalList);
    if (list.isNone()) msg::raise(PyExc_TypeError, msg::kNoneHasNoLen);
    const Py_ssize_t end = PyList_GET_SIZE(list.get());
    py::Ref body = py::check(PyList_New(0));
    long nestedIndent = -1;  // -1: not inside a nested class or def
    // No Python code runs in this loop, but the length was taken once, and
    // a rebound FindIndexOfLogical may answer below -1: list[i] as Python
    // indexes it, negative counting from the end, IndexError outside.
    for (Py_ssize_t i = first; i < end; ++i) {
        const Py_ssize_t size = PyList_GET_SIZE(list.get());
        const Py_ssize_t at = i < 0 ? i + size : i;
        if (at < 0 || at >= size) msg::raise(PyExc_IndexError, msg::kListIndexOutOfRange);
        PyObject* logical = PyList_GET_ITEM(list.get(), at);
        const Logical* l = requireLogical(logical);
        if (isWhitespace(l)) continue;
        const long indent = l->fIndent;
        if (indent <= defIndent) break;
        if (nestedIndent != -1) {
            if (indent > nestedIndent) continue;
            nestedIndent = -1;
        }
        py::checkStatus(PyList_Append(body.get(), logical));
        // A class/def line without a name opens no scope, as the change
        // finder names it: the lines under it stay in this body.
        if (isScopeStart(l) && localScopeDefined(l) != nullptr) nestedIndent = indent;
    }
    return body;
}

void destroyImpl(PyObject* self) {
    BodyCacheState& s = bodyCacheState(self);
    py::storeSlot(&s.scopeBodyCache, Py_None);
    py::storeSlot(&s.scopeDefCache, Py_None);
    dropBodyIndexes(self);
}

void clear(PyObject* self, PyObject* scopeNames) {
    forEach(scopeNames, [&](PyObject* item) {
        if (py::checkSize(PyObject_Size(item)) == 1 &&
            py::checkStatus(PyObject_RichCompareBool(item, gNames.star, Py_EQ))) {
            cacheClear(bodyCacheState(self).scopeBodyCache);
            cacheClear(bodyCacheState(self).scopeDefCache);
            dropBodyIndexes(self);
            return false;
        }
        cachePop(bodyCacheState(self).scopeBodyCache, item);
        cachePop(bodyCacheState(self).scopeDefCache, item);
        dropIndexFor(self, item);
        return true;
    });
}

// --- Type slots -------------------------------------------------------------

using Slots = DestroyableSubclass<BodyCacheState, &gBodyCacheStateOffset>;

int cache_init(PyObject* self, PyObject* args, PyObject* kwargs) {
    return py::guardedStatus([&] {
        storeTyped(&bodyCacheState(self).logicalList, initDestroyableSubclass(self, args, kwargs).get(),
                   &PyList_Type, "list");
        BodyCacheState& s = bodyCacheState(self);
        py::Ref bodies = py::check(PyDict_New());
        py::storeSlot(&s.scopeBodyCache, bodies.get());
        py::Ref defs = py::check(PyDict_New());
        py::storeSlot(&s.scopeDefCache, defs.get());
        return 0;
    });
}

PyObject* fieldOrNone(PyObject* field) { return py::Ref::own(field ? field : Py_None).release(); }

PyObject* get_logical_list(PyObject* self, void*) { return fieldOrNone(bodyCacheState(self).logicalList); }
PyObject* get_body_cache(PyObject* self, void*) { return fieldOrNone(bodyCacheState(self).scopeBodyCache); }
PyObject* get_def_cache(PyObject* self, void*) { return fieldOrNone(bodyCacheState(self).scopeDefCache); }

PyGetSetDef cache_getset[] = {
    {const_cast<char*>("_fLogicalList"), get_logical_list, nullptr, nullptr, nullptr},
    {const_cast<char*>("_fScopeBodyCache"), get_body_cache, nullptr, nullptr, nullptr},
    {const_cast<char*>("_fScopeDefCache"), get_def_cache, nullptr, nullptr, nullptr},
    {nullptr, nullptr, nullptr, nullptr, nullptr},
};

// --- Python-visible methods -------------------------------------------------

PyObject* m_destroy_impl(PyObject* self, PyObject* const*) {
    destroyImpl(self);
    return py::Ref::none().release();
}
PyObject* m_GetBodyOfScope(PyObject* self, PyObject* const* a) {
    return getBodyOfScope(self, a[0]).release();
}
PyObject* m_Clear(PyObject* self, PyObject* const* a) {
    clear(self, a[0] ? a[0] : gNames.star);
    return py::Ref::none().release();
}
PyObject* m_GetScopeDef(PyObject* self, PyObject* const* a) {
    return getScopeDef(self, a[0]).release();
}
PyObject* m_FindScopeDef(PyObject* self, PyObject* const* a) {
    return findScopeDef(self, a[0]).release();
}
PyObject* m_FindBodyOfScopeDef(PyObject* self, PyObject* const* a) {
    return findBodyOfScopeDef(self, a[0]).release();
}

constexpr Param kScopeName{"scope_name", ArgCheck::Any};

const FunctionSpec kMethods[] = {
    {"_destroy_impl", nullptr, m_destroy_impl, 0, 0, {}},
    {"GetBodyOfScope", nullptr, m_GetBodyOfScope, 1, 1, {kScopeName}},
    {"Clear", nullptr, m_Clear, 0, 1, {{"scope_names", ArgCheck::Any}}},
    {"GetScopeDef", nullptr, m_GetScopeDef, 1, 1, {kScopeName}},
    {"_FindScopeDef",
     " Finds the scope def for the name without using the _fScopeDefCache\n"
     "    for the name (this is used to find the value to put in the cache).\n"
     "    Raises KeyError if scope isn't found ",
     m_FindScopeDef, 1, 1, {kScopeName}},
    {"_FindBodyOfScopeDef", nullptr, m_FindBodyOfScopeDef, 1, 1, {{"scope_def", ArgCheck::Any}}},
};

}  // namespace

PyTypeObject* scopeBodyCacheType() noexcept { return gBodyCacheType; }

void dropBodyIndexes(PyObject* self) noexcept { bodyCacheState(self).clearInternal(); }

void readyScopeBodyCacheType() {
    BodyCacheType.tp_name = "pysource.scopebodycache.CScopeBodyCache";
    Slots::fillType(BodyCacheType);
    BodyCacheType.tp_init = cache_init;
    BodyCacheType.tp_getset = cache_getset;
    gBodyCacheType = Slots::ready(BodyCacheType);
}

void bindScopeBodyCacheMethods() { bindMethods(gBodyCacheType, kMethods, kModuleName); }

}  // namespace sbc
