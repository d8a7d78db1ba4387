// The module's init function: binds the siblings' entry points, makes the
// two classes ready and fills the namespace, in a fixed order.
#include "common/messages.hpp"
#include "pysource/scopebodycache/bodycache.hpp"
#include "pysource/scopebodycache/dispatch.hpp"
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/fullname.hpp"
#include "pysource/scopebodycache/function.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/pickling.hpp"
#include "pysource/scopebodycache/siblings.hpp"
#include "pysource/scopebodycache/utilities.hpp"

#include <cstdlib>
#include <cstring>

namespace sbc {
namespace {

constexpr const char kInitContext[] = "init pysource.scopebodycache";

const char kModuleDoc[] =
    "Scope names of logical lines kept up to date while a file is edited, and a\n"
    "cache of scope definitions and bodies by full dotted name.";

compat::ModuleDef gModuleDef = SBC_MODULE_DEF("scopebodycache", kModuleDoc, nullptr);

void checkVersion() {
    char built[16];
    PyOS_snprintf(built, sizeof built, "%d.%d", PY_MAJOR_VERSION, PY_MINOR_VERSION);
    // "X.Y" of the running version: up to its second dot (or the end of
    // the digits), so that 3.1 is not taken for 3.11.
    char running[16] = {0};
    const char* version = Py_GetVersion();
    for (int k = 0, dots = 0; k < 15 && version[k] != '\0'; ++k) {
        if (version[k] == '.' && ++dots == 2) break;
        if (version[k] != '.' && (version[k] < '0' || version[k] > '9')) break;
        running[k] = version[k];
    }
    if (std::strcmp(built, running) != 0) {
        char text[200];
        PyOS_snprintf(text, sizeof text,
                      "compiletime version %s of module '%.100s' does not match runtime version %s",
                      built, kModuleName, running);
        py::checkStatus(PyErr_WarnEx(PyExc_RuntimeWarning, text, 1));
    }
}

void checkBuiltinNames() {
    PyObject* builtins = PyEval_GetBuiltins();
    for (const char* name : {"KeyError", "ValueError", "IndexError", "range", "enumerate", "TypeError"}) {
        if (builtins == nullptr || PyDict_GetItemString(builtins, name) == nullptr) {
            PyErr_Format(PyExc_NameError, msg::kNameNotDefined, name);
            py::fail();
        }
    }
}

void bindType(PyObject* dict, const char* name, PyTypeObject* type) {
    py::checkStatus(PyDict_SetItemString(dict, name, reinterpret_cast<PyObject*>(type)));
}

void moduleBody(PyObject* dict) {
    py::Ref tallowkit = py::check(PyImport_ImportModuleLevel(const_cast<char*>("tallowkit"), dict, dict,
                                                              nullptr, 0));
    py::checkStatus(PyDict_SetItemString(dict, "tallowkit", tallowkit.get()));

    py::Ref fastaccess = py::check(PyImport_ImportModule(kFastaccessModule));
    py::checkStatus(PyDict_SetItemString(dict, "_fastaccess", fastaccess.get()));

    py::Ref fromlist = py::check(Py_BuildValue("(s)", "symbolinfo"));
    py::Ref package = py::check(PyImport_ImportModuleLevel(const_cast<char*>(""), dict, dict,
                                                            fromlist.get(), 1));
    PyObject* symbolinfo = PyObject_GetAttrString(package.get(), "symbolinfo");
    if (symbolinfo == nullptr) {
        if (!PyErr_ExceptionMatches(PyExc_AttributeError)) py::fail();
        PyErr_Clear();
        PyErr_Format(PyExc_ImportError, "cannot import name %.230s", "symbolinfo");
        py::fail();
    }
    py::Ref symbolinfoRef = py::Ref::steal(symbolinfo);
    py::checkStatus(PyDict_SetItemString(dict, "symbolinfo", symbolinfo));
    bindNativeSiblings(fastaccess.get(), symbolinfo);

    bindScopeBodyCacheMethods();
    bindChangeFinderMethods();
    bindModuleFunctions(dict);
    bindUnpickleFunctions(dict);
    bindUtilities(dict);
}

// Makes and fills the module. On 3.x `owner` takes the reference the init
// function returns; it is the caller's so that on failure the namespace
// outlives the traceback entry that names it.
void initialize(py::Ref& owner) {
    checkVersion();
    PyObject* module = compat::createModule(gModuleDef, owner);
    PyObject* dict = PyModule_GetDict(module);
    gModuleDict = dict;
    py::Ref builtinModule = py::check(PyImport_AddModule(compat::kBuiltinsModule)).copy();
    py::checkStatus(PyDict_SetItemString(dict, "__builtins__", builtinModule.get()));
    compat::setPackage(dict, "pysource");
    compat::readOptimizeFlag();

    internNames();
    internStepNames();
    const char* check = std::getenv("SBC_CHECK_INDEX");
    gCheckDefinitionIndex = check != nullptr && check[0] == '1';
    const char* trace = std::getenv("SBC_TRACE_INDEX");
    gTraceDefinitionIndex = trace != nullptr && trace[0] == '1';
    readyFunctionType();
    checkBuiltinNames();

    bindDestroyableBase();
    readyScopeBodyCacheType();
    bindType(dict, "CScopeBodyCache", scopeBodyCacheType());
    installPickling(scopeBodyCacheType());
    readyChangeFinderType();
    bindType(dict, "CChangeFinder", changeFinderType());
    installPickling(changeFinderType());

    checkOtherTypes();
    bindVariables();
    bindFunctions();
    moduleBody(dict);
    holdModule(module);
}

// A traceback entry naming the init function, as for a Python frame.
void addInitTraceback() noexcept {
    PyObject* globals = gModuleDict ? gModuleDict : PyEval_GetGlobals();
    compat::addTracebackEntry(kModuleName, kInitContext, globals);
}

}  // namespace
}  // namespace sbc

SBC_MODULE_INIT(scopebodycache) {
    py::Ref module;
    try {
        sbc::initialize(module);
    } catch (...) {
        py::setErrorFromCurrentException();
        sbc::addInitTraceback();
        module.reset();
    }
    return compat::initResult(module.release());
}
