#include "pysource/scopebodycache/fullname.hpp"

#include "pysource/contracts/accessors.hpp"
#include "pysource/scopebodycache/finder.hpp"  // assertThat
#include "pysource/scopebodycache/function.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/siblings.hpp"

namespace sbc {

using namespace contracts;

namespace {
PyObject* gFullNameFunction = nullptr;  // our own function object

PyObject* py_GetFullNameForScopeDef(PyObject*, PyObject* const* a) {
    return getFullNameForScopeDef(a[0]).release();
}

const FunctionSpec kFullNameSpec = {"GetFullNameForScopeDef", nullptr, py_GetFullNameForScopeDef, 1,
                                    1, {{"scope_def", ArgCheck::Any}}};
}  // namespace

py::Ref getFullNameForScopeDef(PyObject* scopeDef) {
    if (scopeDef == Py_None) return py::Ref::own(gNames.empty);
    Logical* logical = requireLogical(scopeDef);
    py::Ref keep = py::Ref::own(scopeDef);
    assertThat(isScopeStart(logical));
    assertThat(logical->fScopeName != nullptr && logical->fScopeName != Py_None);
    py::Ref name = py::Ref::own(localScopeDefinedChecked(logical));
    py::Ref scope = py::Ref::own(scopeName(logical));
    if (!name) {
        if (assertionsOn()) {
            PyErr_SetNone(PyExc_AssertionError);
            py::fail();
        }
        return scope;
    }
    return joinTwoScopeNames(scope.get(), name.get());
}

namespace {
WatchedName gWatchedFullName;
}  // namespace

// Asked after nativeSiblingsCurrent, which follows the current module.
bool fullNameFunctionCurrent() noexcept { return gWatchedFullName.holds(); }

void watchFullNameIn(PyObject* moduleDict) noexcept {
    gWatchedFullName.watch(moduleDict, gNames.GetFullNameForScopeDef, gFullNameFunction);
}

py::Ref callGetFullNameForScopeDef(PyObject* scopeDef, bool native) {
    if (native) return getFullNameForScopeDef(scopeDef);
    PyObject* f = lookupGlobal(gNames.GetFullNameForScopeDef);
    if (f == gFullNameFunction) return getFullNameForScopeDef(scopeDef);
    py::Ref keep = py::Ref::own(f);
    return py::check(PyObject_CallFunctionObjArgs(f, scopeDef, nullptr));
}

void bindModuleFunctions(PyObject* moduleDict) {
    py::Ref f = newFunction(kFullNameSpec, kModuleName);
    py::checkStatus(PyDict_SetItemString(moduleDict, kFullNameSpec.name, f.get()));
    gFullNameFunction = f.release();
    watchFullNameIn(moduleDict);
}

}  // namespace sbc
