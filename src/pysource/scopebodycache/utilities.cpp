// The small functions of the siblings' shared declarations that this module
// publishes under their owners' module names.
#include "pysource/scopebodycache/utilities.hpp"

#include "pysource/contracts/accessors.hpp"
#include "pysource/scopebodycache/def_index.hpp"
#include "pysource/scopebodycache/function.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/report.hpp"
#include "pysource/scopebodycache/siblings.hpp"

#include <cstdint>
#include <cstring>

namespace sbc {

using namespace contracts;

double getNowTime() noexcept {
    return neverRaises("pysource._fastaccess.GetNowTime", 0.0, [] {
        py::Ref now = py::check(PyObject_CallObject(gTimeFunc, nullptr));
        const double v = PyFloat_AsDouble(now.get());
        if (v == -1.0 && PyErr_Occurred()) py::fail();
        return v;
    });
}

char getInfoBytesKind(PyObject* ibytes) noexcept {
    return neverRaises("pysource.symbolinfo.GetInfoBytesKind", char(0), [ibytes] {
        if (ibytes == Py_None) msg::raise(PyExc_TypeError, msg::kNoneHasNoLen);
        // By characters: a kind read from a 2.7 pickle (latin-1) is the same.
        // A kind is one byte: a character above U+00FF is none, and the
        // string reads as plain, never as the kind of its low byte.
        if (compat::strLength(ibytes) < 2 || compat::strCharAt(ibytes, 0) != ':') {
            return gSymbolInfo.kPlainEquivKind;
        }
        const uint32_t kind = compat::strCharAt(ibytes, 1);
        if (kind > 0xFF) return gSymbolInfo.kPlainEquivKind;
        return static_cast<char>(kind);
    });
}

bool isDefKind(char kind) noexcept {
    return kind == gSymbolInfo.kFunctionKind || kind == gSymbolInfo.kMethodKind ||
           kind == gSymbolInfo.kUnboundMethodKind;
}

namespace {

PyObject* boolResult(bool v) { return py::Ref::own(v ? Py_True : Py_False).release(); }

uint64_t doubleBits(double d) {
    uint64_t bits;
    std::memcpy(&bits, &d, sizeof bits);
    return bits;
}

double bitsDouble(uint64_t bits) {
    double d;
    std::memcpy(&d, &bits, sizeof d);
    return d;
}

double asDouble(PyObject* o) {
    const double v = PyFloat_AsDouble(o);
    if (v == -1.0 && PyErr_Occurred()) py::fail();
    return v;
}

PyObject* py_LogicalCheck(PyObject*, PyObject* const* a) { return boolResult(logicalCheck(a[0])); }

PyObject* py_RaiseIfNotLogical(PyObject*, PyObject* const* a) {
    requireLogical(a[0]);
    return boolResult(false);
}

PyObject* py_IsWhitespaceLogical(PyObject*, PyObject* const* a) {
    return boolResult(isWhitespace(requireLogical(a[0])));
}

PyObject* py_IsScopeStartLogical(PyObject*, PyObject* const* a) {
    return boolResult(isScopeStart(requireLogical(a[0])));
}

PyObject* py_GetLocalScopeDefined(PyObject*, PyObject* const* a) {
    PyObject* name = localScopeDefinedChecked(requireLogical(a[0]));
    return py::Ref::own(name ? name : Py_None).release();
}

PyObject* py_SetLogicalLocalScopeDefined(PyObject*, PyObject* const* a) {
    setLocalScopeDefined(requireLogical(a[0]), a[1]);
    noteStrayNamesWritten();  // of a list no one can tell
    return py::Ref::none().release();
}

PyObject* py_PySet_InplaceOr(PyObject*, PyObject* const* a) {
    PyObject* set = a[0];
    if (set == Py_None) msg::raise(PyExc_TypeError, msg::kNoneHasNoLen);
    const Py_ssize_t before = py::checkSize(PySet_Size(set));
    py::Ref result = py::check(PyNumber_InPlaceOr(set, a[1]));
    if (Py_TYPE(result.get()) != &PySet_Type) msg::raiseExpectedType("set", result.get());
    return boolResult(PySet_GET_SIZE(result.get()) != before);
}

PyObject* py_GetNowTime(PyObject*, PyObject* const*) {
    return py::check(PyFloat_FromDouble(getNowTime())).release();
}

PyObject* py_OutOfTime(PyObject*, PyObject* const* a) {
    const double end = asDouble(a[0]);
    return boolResult(getNowTime() >= end);
}

PyObject* py_ULongLongValueForDoubleBits(PyObject*, PyObject* const* a) {
    return py::check(PyLong_FromUnsignedLongLong(doubleBits(asDouble(a[0])))).release();
}

PyObject* py_DoubleValueForULongLongBits(PyObject*, PyObject* const* a) {
    PyObject* o = a[0];
    unsigned long long bits;
    if (compat::isMachineInt(o)) {
        const long v = compat::machineIntValue(o);
        if (v < 0) msg::raise(PyExc_OverflowError, msg::kNegativeToUnsigned);
        bits = static_cast<unsigned long long>(v);
    } else if (PyLong_Check(o)) {
        if (_PyLong_Sign(o) < 0) {
            msg::raise(PyExc_OverflowError, msg::kNegativeToUnsigned);
        }
        bits = PyLong_AsUnsignedLongLong(o);
        if (bits == static_cast<unsigned long long>(-1) && PyErr_Occurred()) py::fail();
    } else {
        py::Ref index = py::check(PyNumber_Index(o));
        PyObject* args[1] = {index.get()};
        return py_DoubleValueForULongLongBits(nullptr, args);
    }
    return py::check(PyFloat_FromDouble(bitsDouble(bits))).release();
}

PyObject* py_DoubleValueForPyIntBits(PyObject*, PyObject* const* a) {
    const Py_ssize_t v = py::asIndex(a[0]);
    const auto bits = static_cast<uint64_t>(static_cast<int64_t>(v));
    return py::check(PyFloat_FromDouble(bitsDouble(bits))).release();
}

PyObject* py_IsDefKind(PyObject*, PyObject* const* a) {
    const long v = compat::intAsLong(a[0]);
    if (v == -1 && PyErr_Occurred()) py::fail();
    if (v < -128 || v > 127) msg::raise(PyExc_OverflowError, "value too large to convert to char");
    return boolResult(isDefKind(static_cast<char>(v)));
}

PyObject* py_GetInfoBytesKind(PyObject*, PyObject* const* a) {
    return py::check(compat::intFromLong(static_cast<signed char>(getInfoBytesKind(a[0])))).release();
}

constexpr Param kLogical{"logical", ArgCheck::Any};

const FunctionSpec kFastaccessFunctions[] = {
    {"LogicalCheck", nullptr, py_LogicalCheck, 1, 1, {kLogical}},
    {"RaiseIfNotLogical", nullptr, py_RaiseIfNotLogical, 1, 1, {kLogical}},
    {"IsWhitespaceLogical", nullptr, py_IsWhitespaceLogical, 1, 1, {kLogical}},
    {"IsScopeStartLogical", nullptr, py_IsScopeStartLogical, 1, 1, {kLogical}},
    {"GetLocalScopeDefined", nullptr, py_GetLocalScopeDefined, 1, 1, {kLogical}},
    {"SetLogicalLocalScopeDefined", nullptr, py_SetLogicalLocalScopeDefined, 2, 2,
     {kLogical, {"name", ArgCheck::Any}}},
    {"PySet_InplaceOr",
     " Performs a |= on the set object.  The to_add needs to be a set\n  or frozenset.  Returns if any items were added. ",
     py_PySet_InplaceOr, 2, 2, {{"set_obj", ArgCheck::Set}, {"to_add", ArgCheck::Any}}},
    {"ULongLongValueForDoubleBits",
     " Returns the long long value with the same bit values as double ",
     py_ULongLongValueForDoubleBits, 1, 1, {{"f", ArgCheck::Any}}},
    {"DoubleValueForULongLongBits",
     " Returns double with the bit value of given unsigned long long ",
     py_DoubleValueForULongLongBits, 1, 1, {{"l", ArgCheck::Any}}},
    {"DoubleValueForPyIntBits",
     " Returns double with the bit value of given PyInt.  Needed because\n  passing a negative number to DoubleValueForULongLongBits raises an\n  exception ",
     py_DoubleValueForPyIntBits, 1, 1, {{"l", ArgCheck::Any}}},
    {"GetNowTime", " Get the time value of now; equivalent to time.time() ", py_GetNowTime, 0, 0, {}},
    {"OutOfTime", " Return whether now is past end time ", py_OutOfTime, 1, 1,
     {{"end_time", ArgCheck::Any}}},
};

const FunctionSpec kSymbolinfoFunctions[] = {
    {"IsDefKind", nullptr, py_IsDefKind, 1, 1, {{"kind", ArgCheck::Any}}},
    {"GetInfoBytesKind", nullptr, py_GetInfoBytesKind, 1, 1, {{"ibytes", ArgCheck::Str}}},
};

}  // namespace

void bindUtilities(PyObject* moduleDict) {
    bindFunctions(moduleDict, kFastaccessFunctions, kFastaccessModule);
    bindFunctions(moduleDict, kSymbolinfoFunctions, kSymbolinfoModule);
}

}  // namespace sbc
