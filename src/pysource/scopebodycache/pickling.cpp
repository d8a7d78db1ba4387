#include "pysource/scopebodycache/pickling.hpp"

namespace sbc {

void installPickling(PyTypeObject*) {}
void bindUnpickleFunctions(PyObject*) {}

}  // namespace sbc
