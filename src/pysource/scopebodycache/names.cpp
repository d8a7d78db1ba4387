#include "pysource/scopebodycache/names.hpp"

#include "common/pycompat.hpp"
#include "common/pyref.hpp"

namespace sbc {

Names gNames;

namespace {
PyObject* intern(const char* text) { return py::check(compat::internStr(text)).release(); }
}  // namespace

void internNames() {
    gNames.empty = intern("");
    gNames.star = intern("*");
    gNames.dot = intern(".");
    gNames.join = intern("join");
    gNames.moduleName = intern(kModuleName);
    gNames.fastaccess = intern("_fastaccess");
    gNames.symbolinfo = intern("symbolinfo");
    gNames.GetFullNameForScopeDef = intern("GetFullNameForScopeDef");
    gNames.IndexForLineno = intern("IndexForLineno");
    gNames.FindIndexOfLogical = intern("FindIndexOfLogical");
    gNames.LeafScopeNameHasIndex = intern("LeafScopeNameHasIndex");
    gNames.dict = intern("__dict__");
    gNames.update = intern("update");
    gNames.startswith = intern("startswith");
    gNames.unpickleChangeFinder = intern("__pyx_unpickle_CChangeFinder");
    gNames.unpickleScopeBodyCache = intern("__pyx_unpickle_CScopeBodyCache");
    gNames.GetBodyOfScope = intern("GetBodyOfScope");
    gNames.GetScopeDef = intern("GetScopeDef");
    gNames.FindScopeDef = intern("_FindScopeDef");
    gNames.FindBodyOfScopeDef = intern("_FindBodyOfScopeDef");
}

}  // namespace sbc
