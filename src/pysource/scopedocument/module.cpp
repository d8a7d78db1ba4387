// pysource.scopedocument: the module's init function.
#include "common/pycompat.hpp"
#include "pysource/scopedocument/document.hpp"

#include <cstdlib>

namespace sdoc {
namespace {

const char kModuleDoc[] =
    "A text that follows edits: its logicals and their scope names kept up to date by\n"
    "pysource.scopebodycache, with the changed scopes of every edit.";

compat::ModuleDef gModuleDef = SBC_MODULE_DEF("scopedocument", kModuleDoc, nullptr);

void initialize(py::Ref& owner) {
    PyObject* module = compat::createModule(gModuleDef, owner);
    PyObject* dict = PyModule_GetDict(module);
    compat::setPackage(dict, "pysource");
    const char* check = std::getenv("SBC_CHECK_DOCUMENT");
    gCheckEveryEdit = check != nullptr && check[0] == '1';
    // "CHARS,ROWS": the size of the text's and the row table's chunks.
    if (const char* chunks = std::getenv("SBC_DOCUMENT_CHUNKS")) {
        char* rest = nullptr;
        const unsigned long chars = std::strtoul(chunks, &rest, 10);
        const unsigned long rows = *rest == ',' ? std::strtoul(rest + 1, nullptr, 10) : 0;
        if (chars > 0 && rows > 0) setChunkSizes(chars, rows);
    }
    bindImports();
    readyDocumentType();
    readyEditResultType();
    py::checkStatus(PyDict_SetItemString(dict, "CScopeDocument", reinterpret_cast<PyObject*>(documentType())));
    py::checkStatus(PyDict_SetItemString(dict, "CEditResult", reinterpret_cast<PyObject*>(editResultType())));
}

}  // namespace
}  // namespace sdoc

SBC_MODULE_INIT(scopedocument) {
    py::Ref module;
    try {
        sdoc::initialize(module);
    } catch (...) {
        py::setErrorFromCurrentException();
        module.reset();
    }
    return compat::initResult(module.release());
}
