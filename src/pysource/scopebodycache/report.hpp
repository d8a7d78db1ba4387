// Steps that never raise: their failures go to the interpreter's hook for
// exceptions that cannot be raised, with the step's dotted name as context.
#pragma once

#include "common/pyref.hpp"

namespace sbc {

// Prints the pending exception's traceback to stderr, then reports it as
// unraisable under `context`. Clears it.
void reportUnraisable(const char* context) noexcept;

// Runs `body`; on failure reports under `context` and returns `fallback`.
template <class T, class Body>
T neverRaises(const char* context, T fallback, Body&& body) noexcept {
    try {
        return body();
    } catch (...) {
        py::setErrorFromCurrentException();
    }
    reportUnraisable(context);
    return fallback;
}

}  // namespace sbc
