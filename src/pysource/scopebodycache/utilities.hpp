#pragma once

#include "common/pyref.hpp"

namespace sbc {

// Binds the published utilities in the module namespace, in table order.
void bindUtilities(PyObject* moduleDict);

double getNowTime() noexcept;
char getInfoBytesKind(PyObject* ibytes) noexcept;
bool isDefKind(char kind) noexcept;

}  // namespace sbc
