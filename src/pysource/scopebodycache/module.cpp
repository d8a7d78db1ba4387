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

#include <frameobject.h>

#include <cstdlib>

namespace sbc {
namespace {

constexpr const char kInitContext[] = "init pysource.scopebodycache";

const char kModuleDoc[] =
    "Scope names of logical lines kept up to date while a file is edited, and a\n"
    "cache of scope definitions and bodies by full dotted name.";

void checkVersion() {
    char built[16];
    PyOS_snprintf(built, sizeof built, "%d.%d", PY_MAJOR_VERSION, PY_MINOR_VERSION);
    char running[4] = {0, 0, 0, 0};
    const char* version = Py_GetVersion();
    for (int k = 0; k < 3 && version[k] != '\0'; ++k) running[k] = version[k];
    if (built[0] != running[0] || built[2] != running[2]) {
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

void initialize() {
    checkVersion();
    PyObject* module = Py_InitModule4("scopebodycache", nullptr, kModuleDoc, nullptr, PYTHON_API_VERSION);
    if (module == nullptr) py::fail();
    PyObject* dict = PyModule_GetDict(module);
    gModuleDict = dict;
    py::Ref builtinModule = py::check(PyImport_AddModule("__builtin__")).copy();
    py::checkStatus(PyDict_SetItemString(dict, "__builtins__", builtinModule.get()));

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
}

// A traceback entry naming the init function, as for a Python frame.
void addInitTraceback() {
    PyObject *type, *value, *tb;
    PyErr_Fetch(&type, &value, &tb);
    PyCodeObject* code = PyCode_NewEmpty(kModuleName, kInitContext, 0);
    PyFrameObject* frame = nullptr;
    if (code != nullptr) frame = PyFrame_New(PyThreadState_Get(), code, gModuleDict ? gModuleDict : PyEval_GetGlobals(), nullptr);
    PyErr_Restore(type, value, tb);
    if (frame != nullptr) {
        frame->f_lineno = 0;
        PyTraceBack_Here(frame);
    }
    Py_XDECREF(code);
    Py_XDECREF(frame);
}

}  // namespace
}  // namespace sbc

PY_MODULE_INIT initscopebodycache() {
    try {
        sbc::initialize();
    } catch (...) {
        py::setErrorFromCurrentException();
        sbc::addInitTraceback();
    }
}
