// What differs between the interpreters the modules build for (2.7, and 3.8
// to 3.13), each behind one named helper, so that the rest of the sources
// reads the same for all of them.
//
// Names and tokens are the interpreter's `str`: bytes on 2.7, text on 3.x.
// The module works on their bytes (UTF-8 on 3.x): a view of them, or a new
// str made from bytes that came from such views (cut at ASCII separators,
// so they are whole UTF-8 again). Integers are `int` (and `long` on 2.7).
#pragma once

#include <Python.h>

#include <cstdint>
#include <frameobject.h>

#include <cstdarg>
#include <cstdint>
#include <cstring>
#include <string_view>

#include "common/pyref.hpp"

#if PY_MAJOR_VERSION >= 3 && PY_VERSION_HEX < 0x03080000
#error "the modules build for Python 2.7 and 3.8 to 3.13"
#endif

namespace compat {

inline constexpr bool kPython3 = PY_MAJOR_VERSION >= 3;

// The built-in module's name, and the type a name must have as messages
// call it (2.7's str is bytes).
#if PY_MAJOR_VERSION >= 3
inline constexpr const char* kBuiltinsModule = "builtins";
inline constexpr const char* kNameTypeName = "str";
#else
inline constexpr const char* kBuiltinsModule = "__builtin__";
inline constexpr const char* kNameTypeName = "bytes";
#endif

// --- str ----------------------------------------------------------------------

#if PY_MAJOR_VERSION >= 3
inline bool isStr(PyObject* o) noexcept { return PyUnicode_Check(o); }
inline bool isStrExact(PyObject* o) noexcept { return PyUnicode_CheckExact(o); }
inline PyTypeObject* strType() noexcept { return &PyUnicode_Type; }
// The other kind of text a caller may hand in where a str is wanted: 2.7's
// unicode, 3.x's bytes.
inline bool isOtherText(PyObject* o) noexcept { return PyBytes_Check(o); }

// The UTF-8 bytes of a str (NUL-terminated), or null with an exception set
// (a str that holds lone surrogates has none). An ASCII str is its own
// UTF-8; any other caches its encoding on first use.
inline const char* strBytes(PyObject* s, Py_ssize_t* size) noexcept {
    if (PyUnicode_IS_COMPACT_ASCII(s)) {
        *size = PyUnicode_GET_LENGTH(s);
        return static_cast<const char*>(PyUnicode_DATA(s));
    }
    return PyUnicode_AsUTF8AndSize(s, size);
}
#else
inline bool isStr(PyObject* o) noexcept { return PyString_Check(o); }
inline bool isStrExact(PyObject* o) noexcept { return PyString_CheckExact(o); }
inline PyTypeObject* strType() noexcept { return &PyString_Type; }
inline bool isOtherText(PyObject* o) noexcept { return PyUnicode_Check(o); }
inline const char* strBytes(PyObject* s, Py_ssize_t* size) noexcept {
    *size = PyString_GET_SIZE(s);
    return PyString_AS_STRING(s);
}
#endif

// The bytes of a str as a view; throws when it has none. The view lives as
// long as the str.
inline std::string_view strView(PyObject* s) {
    Py_ssize_t size;
    const char* data = strBytes(s, &size);
    if (data == nullptr) py::fail();
    return {data, static_cast<size_t>(size)};
}

// As strView, for code that cannot raise: false (no exception left set)
// when the str has no bytes.
inline bool tryStrView(PyObject* s, std::string_view* out) noexcept {
    Py_ssize_t size;
    const char* data = strBytes(s, &size);
    if (data == nullptr) {
        PyErr_Clear();
        return false;
    }
    *out = {data, static_cast<size_t>(size)};
    return true;
}

// As strView where the caller cannot raise and has already read the str's
// bytes once (they are cached then): empty when it has none.
inline std::string_view strViewOrEmpty(PyObject* s) noexcept {
    std::string_view view;
    return tryStrView(s, &view) ? view : std::string_view();
}

// The NUL-terminated bytes of a str; throws when it has none.
inline const char* strText(PyObject* s) { return strView(s).data(); }

// The NUL-terminated bytes of the other kind of text (isOtherText): 3.x's
// bytes as they are, 2.7's unicode encoded with the default encoding into
// `holder`. Throws when it cannot be encoded.
inline const char* otherTextBytes(PyObject* o, py::Ref* holder) {
#if PY_MAJOR_VERSION >= 3
    (void)holder;
    return PyBytes_AS_STRING(o);
#else
    *holder = py::check(PyUnicode_AsEncodedString(o, nullptr, nullptr));
    return PyString_AS_STRING(holder->get());
#endif
}

// The length of a str in characters (bytes on 2.7), and the character at
// `i` (< length) as a code point (a byte's value, 0-255, on 2.7): a
// character above U+00FF is never narrowed to a byte.
inline Py_ssize_t strLength(PyObject* s) {
#if PY_MAJOR_VERSION >= 3
    return py::checkSize(PyUnicode_GetLength(s));
#else
    return PyString_GET_SIZE(s);
#endif
}

inline uint32_t strCharAt(PyObject* s, Py_ssize_t i) {
#if PY_MAJOR_VERSION >= 3
    const Py_UCS4 c = PyUnicode_ReadChar(s, i);
    if (c == static_cast<Py_UCS4>(-1) && PyErr_Occurred()) py::fail();
    return c;
#else
    return static_cast<unsigned char>(PyString_AS_STRING(s)[i]);
#endif
}

// sys.modules of the running interpreter (borrowed).
inline PyObject* modulesDict() noexcept {
#if PY_MAJOR_VERSION >= 3
    return PyImport_GetModuleDict();
#else
    return PyThreadState_GET()->interp->modules;
#endif
}

// Whether the interpreter's report of an exception that cannot be raised
// (sys.unraisablehook's default, 3.8 on) prints its traceback.
inline constexpr bool kUnraisableHookPrintsTraceback = PY_VERSION_HEX >= 0x03080000;

// A new str from bytes (UTF-8 on 3.x); null with an exception set.
inline PyObject* strFromBytes(const char* data, Py_ssize_t size) noexcept {
#if PY_MAJOR_VERSION >= 3
    return PyUnicode_FromStringAndSize(data, size);
#else
    return PyString_FromStringAndSize(data, size);
#endif
}

inline PyObject* strFromText(const char* text) noexcept {
#if PY_MAJOR_VERSION >= 3
    return PyUnicode_FromString(text);
#else
    return PyString_FromString(text);
#endif
}

// A new str from a printf-style format, as PyErr_Format takes it.
inline PyObject* strFromFormat(const char* format, ...) noexcept {
    va_list args;
    va_start(args, format);
#if PY_MAJOR_VERSION >= 3
    PyObject* result = PyUnicode_FromFormatV(format, args);
#else
    PyObject* result = PyString_FromFormatV(format, args);
#endif
    va_end(args);
    return result;
}

inline PyObject* internStr(const char* text) noexcept {
#if PY_MAJOR_VERSION >= 3
    return PyUnicode_InternFromString(text);
#else
    return PyString_InternFromString(text);
#endif
}

// obj.name(a[, b]) with `name` an interned str: no format to parse and, on
// 3.9 on, no bound method or argument tuple made.
inline PyObject* callMethod(PyObject* obj, PyObject* name, PyObject* a, PyObject* b = nullptr) noexcept {
#if PY_VERSION_HEX >= 0x03090000
    PyObject* args[3] = {obj, a, b};
    return PyObject_VectorcallMethod(name, args, b != nullptr ? 3 : 2, nullptr);
#else
    return PyObject_CallMethodObjArgs(obj, name, a, b, nullptr);
#endif
}

// A new str of the pieces joined, made in one allocation when it can be.
template <size_t N>
PyObject* strConcat(const std::string_view (&parts)[N]) noexcept {
    Py_ssize_t size = 0;
    for (const std::string_view& part : parts) size += static_cast<Py_ssize_t>(part.size());
#if PY_MAJOR_VERSION >= 3
    bool ascii = true;
    for (const std::string_view& part : parts) {
        for (char c : part) ascii = ascii && static_cast<unsigned char>(c) < 0x80;
    }
    if (!ascii) {
        // Rare (a name that is not ASCII): decoded from the joined bytes.
        char small[256];
        char* buffer = size <= static_cast<Py_ssize_t>(sizeof small) ? small
                                                                       : static_cast<char*>(PyMem_Malloc(size));
        if (buffer == nullptr) return PyErr_NoMemory();
        char* out = buffer;
        for (const std::string_view& part : parts) {
            if (!part.empty()) std::memcpy(out, part.data(), part.size());
            out += part.size();
        }
        PyObject* result = PyUnicode_DecodeUTF8(buffer, size, nullptr);
        if (buffer != small) PyMem_Free(buffer);
        return result;
    }
    PyObject* result = PyUnicode_New(size, 127);
    if (result == nullptr) return nullptr;
    char* out = static_cast<char*>(PyUnicode_DATA(result));
#else
    PyObject* result = PyString_FromStringAndSize(nullptr, size);
    if (result == nullptr) return nullptr;
    char* out = PyString_AS_STRING(result);
#endif
    for (const std::string_view& part : parts) {
        if (!part.empty()) std::memcpy(out, part.data(), part.size());
        out += part.size();
    }
    return result;
}

// --- Text as characters (the reader) -----------------------------------------

// The characters of an exact str to read: 2.7's bytes (kind 1); on 3.x the
// str's own array, of 1, 2 or 4 bytes a character, and whether it is ASCII.
struct TextChars {
    const void* data;
    Py_ssize_t length;
    int kind;
    bool ascii;
};

inline bool textChars(PyObject* s, TextChars* out) noexcept {
#if PY_MAJOR_VERSION >= 3
#if PY_VERSION_HEX < 0x030C0000
    if (PyUnicode_READY(s) == -1) return false;
#endif
    out->data = PyUnicode_DATA(s);
    out->length = PyUnicode_GET_LENGTH(s);
    out->kind = static_cast<int>(PyUnicode_KIND(s));
    out->ascii = PyUnicode_IS_ASCII(s) != 0;
#else
    out->data = PyString_AS_STRING(s);
    out->length = PyString_GET_SIZE(s);
    out->kind = 1;
    out->ascii = false;
#endif
    return true;
}

// A new str of `n` characters of such an array (`ascii`: known to be ASCII).
inline PyObject* strFromChars(const uint8_t* p, Py_ssize_t n, bool ascii) noexcept {
#if PY_MAJOR_VERSION >= 3
    if (ascii) {
        PyObject* s = PyUnicode_New(n, 127);
        if (s != nullptr && n > 0) std::memcpy(PyUnicode_DATA(s), p, static_cast<size_t>(n));
        return s;
    }
    return PyUnicode_FromKindAndData(PyUnicode_1BYTE_KIND, p, n);
#else
    (void)ascii;
    return PyString_FromStringAndSize(reinterpret_cast<const char*>(p), n);
#endif
}

#if PY_MAJOR_VERSION >= 3
inline PyObject* strFromChars(const uint16_t* p, Py_ssize_t n, bool) noexcept {
    return PyUnicode_FromKindAndData(PyUnicode_2BYTE_KIND, p, n);
}
inline PyObject* strFromChars(const uint32_t* p, Py_ssize_t n, bool) noexcept {
    return PyUnicode_FromKindAndData(PyUnicode_4BYTE_KIND, p, n);
}
#endif

// Holds off the cyclic collector while a native loop makes many objects
// that hold no cycles (records of a read): the collections the allocations
// would trigger find nothing there, and cost more the more the process
// holds. The collector runs again as before once the pause ends; a pause
// that cannot tell whether it runs does nothing.
class GcPause {
public:
    GcPause() noexcept {
#if PY_VERSION_HEX >= 0x030A0000
        paused_ = PyGC_Disable() == 1;
#else
        py::SavedError saved;
        static PyObject* gc = PyImport_ImportModule("gc");  // lives as long as the process
        PyObject* r = gc ? PyObject_CallMethod(gc, const_cast<char*>("isenabled"), nullptr) : nullptr;
        if (r == Py_True) {
            PyObject* d = PyObject_CallMethod(gc, const_cast<char*>("disable"), nullptr);
            paused_ = d != nullptr;
            Py_XDECREF(d);
        }
        Py_XDECREF(r);
        gc_ = gc;
        PyErr_Clear();
        saved.restore();
#endif
    }
    ~GcPause() {
#if PY_VERSION_HEX >= 0x030A0000
        if (paused_) PyGC_Enable();
#else
        if (paused_) {
            py::SavedError saved;
            PyObject* r = PyObject_CallMethod(gc_, const_cast<char*>("enable"), nullptr);
            Py_XDECREF(r);
            PyErr_Clear();
            saved.restore();
        }
#endif
    }
    GcPause(const GcPause&) = delete;
    GcPause& operator=(const GcPause&) = delete;

private:
    bool paused_ = false;
#if PY_VERSION_HEX < 0x030A0000
    PyObject* gc_ = nullptr;
#endif
};

// Whether two exact strs are equal.
inline bool strEqual(PyObject* a, PyObject* b) noexcept {
#if PY_MAJOR_VERSION >= 3
    return a == b || PyUnicode_Compare(a, b) == 0;
#else
    return _PyString_Eq(a, b) != 0;
#endif
}

// --- int ----------------------------------------------------------------------

// 2.7's machine-size int, which 3.x does not have (every int is a long there).
#if PY_MAJOR_VERSION >= 3
inline bool isMachineInt(PyObject*) noexcept { return false; }
inline long machineIntValue(PyObject*) noexcept { return 0; }
#else
inline bool isMachineInt(PyObject* o) noexcept { return PyInt_Check(o); }
inline long machineIntValue(PyObject* o) noexcept { return PyInt_AS_LONG(o); }
#endif

inline bool isIntExact(PyObject* o) noexcept {
#if PY_MAJOR_VERSION >= 3
    return PyLong_CheckExact(o);
#else
    return PyInt_CheckExact(o);
#endif
}

// The C long of an int (or of what converts to one); -1 with an exception
// set on failure.
inline long intAsLong(PyObject* o) noexcept {
#if PY_MAJOR_VERSION >= 3
    return PyLong_AsLong(o);
#else
    return PyInt_AsLong(o);
#endif
}

// Whether `o` is an int whose value fits a C long, and that value: 2.7's
// int, or (3.x) an int that does not overflow. Never raises.
inline bool smallIntOf(PyObject* o, long* value) noexcept {
#if PY_MAJOR_VERSION >= 3
    if (!PyLong_Check(o)) return false;
    int overflow = 0;
    *value = PyLong_AsLongAndOverflow(o, &overflow);
    if (*value == -1 && PyErr_Occurred()) {
        PyErr_Clear();
        return false;
    }
    return overflow == 0;
#else
    if (!PyInt_Check(o)) return false;
    *value = PyInt_AS_LONG(o);
    return true;
#endif
}

// An int known to fit (one this module made); no error check.
inline long smallIntValue(PyObject* o) noexcept {
#if PY_MAJOR_VERSION >= 3
    return PyLong_AsLong(o);
#else
    return PyInt_AS_LONG(o);
#endif
}

inline PyObject* intFromSsize(Py_ssize_t v) noexcept {
#if PY_MAJOR_VERSION >= 3
    return PyLong_FromSsize_t(v);
#else
    return PyInt_FromSsize_t(v);
#endif
}

inline PyObject* intFromLong(long v) noexcept {
#if PY_MAJOR_VERSION >= 3
    return PyLong_FromLong(v);
#else
    return PyInt_FromLong(v);
#endif
}

// An int (a long when it is too large) from NUL-terminated decimal digits.
inline PyObject* intFromDigits(const char* digits) noexcept {
#if PY_MAJOR_VERSION >= 3
    return PyLong_FromString(digits, nullptr, 10);
#else
    return PyInt_FromString(const_cast<char*>(digits), nullptr, 10);
#endif
}

// The value of an int as a machine size, any int subclass or long too;
// -1 with an exception set on failure.
inline Py_ssize_t intAsSsize(PyObject* index) noexcept {
#if PY_MAJOR_VERSION >= 3
    return PyLong_AsSsize_t(index);
#else
    return PyInt_AsSsize_t(index);
#endif
}

}  // namespace compat

namespace py {

// A machine-size index; non-integers raise the interpreter's TypeError
// instead of being truncated.
inline Py_ssize_t asIndex(PyObject* o) {
    if (compat::isIntExact(o)) {
#if PY_MAJOR_VERSION >= 3
        const Py_ssize_t v = PyLong_AsSsize_t(o);
        if (v == -1 && PyErr_Occurred()) fail();
        return v;
#else
        return PyInt_AS_LONG(o);
#endif
    }
    PyObject* index = PyNumber_Index(o);
    if (index == nullptr) fail();
    Py_ssize_t v = compat::intAsSsize(index);
    Py_DECREF(index);
    if (v == -1 && PyErr_Occurred()) fail();
    return v;
}

}  // namespace py

namespace compat {

// --- Modules ------------------------------------------------------------------

// The init function of extension module `name`: `void initNAME()` on 2.7,
// `PyObject* PyInit_NAME()` on 3.x. Its body ends with
// `return compat::initResult(module)`. Init functions must stay visible
// although the modules build with hidden visibility.
#if PY_MAJOR_VERSION >= 3
#define SBC_MODULE_INIT(name) extern "C" __attribute__((visibility("default"))) PyObject* PyInit_##name()
using InitResult = PyObject*;
inline PyObject* initResult(PyObject* module) noexcept { return module; }
#else
#define SBC_MODULE_INIT(name) extern "C" __attribute__((visibility("default"))) void init##name()
using InitResult = void;
inline void initResult(PyObject*) noexcept {}
#endif

// A module's definition for the lifetime of the process (3.x keeps a
// pointer to it); 2.7 reads only the texts.
struct ModuleDef {
#if PY_MAJOR_VERSION >= 3
    PyModuleDef def;
#endif
    const char* name;
    const char* doc;
    PyMethodDef* methods;
};

#if PY_MAJOR_VERSION >= 3
#define SBC_MODULE_DEF(name, doc, methods) \
    {{PyModuleDef_HEAD_INIT, name, doc, -1, methods, nullptr, nullptr, nullptr, nullptr}, name, doc, methods}
#else
#define SBC_MODULE_DEF(name, doc, methods) {name, doc, methods}
#endif

// Creates the module. On 2.7 the interpreter holds it (a borrowed
// reference); on 3.x the caller owns it until the init function returns it:
// `owner` takes that reference and gives it up with release().
inline PyObject* createModule(ModuleDef& def, py::Ref& owner) {
#if PY_MAJOR_VERSION >= 3
    owner = py::check(PyModule_Create(&def.def));
    return owner.get();
#else
    (void)owner;
    PyObject* module = Py_InitModule4(def.name, def.methods, def.doc, nullptr, PYTHON_API_VERSION);
    if (module == nullptr) py::fail();
    return module;
#endif
}

// What a module built into a package must find in its namespace during
// init so that a relative import from it works: 2.7 finds the package from
// __name__; 3.x would do so only with an ImportWarning, so __package__ is
// set as the import system would set it afterwards.
inline void setPackage(PyObject* moduleDict, const char* package) {
#if PY_MAJOR_VERSION >= 3
    py::Ref name = py::check(PyUnicode_FromString(package));
    py::checkStatus(PyDict_SetItemString(moduleDict, "__package__", name.get()));
#else
    (void)moduleDict;
    (void)package;
#endif
}

// --- Functions and methods ----------------------------------------------------

// What the descriptor protocol gives for a method found through the class
// (obj null) or an instance: 2.7's unbound or bound method; on 3.x the
// function itself or a bound method.
inline PyObject* methodFor(PyObject* function, PyObject* obj, PyObject* type) noexcept {
#if PY_MAJOR_VERSION >= 3
    (void)type;
    if (obj == nullptr) {
        Py_INCREF(function);
        return function;
    }
    return PyMethod_New(function, obj);
#else
    return PyMethod_New(function, obj, type);
#endif
}

// Makes a filled-in static type object ready and returns the type to use.
// 3.x refuses a static type whose base is a heap type (a class written in
// Python standing in for a native base): it is then made as a heap type
// with the same slots. `heap` tells which it was; a heap type's instances
// hold a reference to it on 3.x (see kInstancesOwnHeapType).
inline PyTypeObject* readyType(PyTypeObject* type, bool* heap) {
    *heap = false;
#if PY_MAJOR_VERSION >= 3
    PyTypeObject* base = type->tp_base;
    if (base != nullptr && (base->tp_flags & Py_TPFLAGS_HEAPTYPE)) {
        PyType_Slot slots[16];
        int n = 0;
        auto add = [&](int slot, void* value) {
            if (value != nullptr) slots[n++] = {slot, value};
        };
        add(Py_tp_dealloc, reinterpret_cast<void*>(type->tp_dealloc));
        add(Py_tp_traverse, reinterpret_cast<void*>(type->tp_traverse));
        add(Py_tp_clear, reinterpret_cast<void*>(type->tp_clear));
        add(Py_tp_new, reinterpret_cast<void*>(type->tp_new));
        add(Py_tp_init, reinterpret_cast<void*>(type->tp_init));
        add(Py_tp_repr, reinterpret_cast<void*>(type->tp_repr));
        add(Py_tp_call, reinterpret_cast<void*>(type->tp_call));
        add(Py_tp_descr_get, reinterpret_cast<void*>(type->tp_descr_get));
        add(Py_tp_methods, type->tp_methods);
        add(Py_tp_members, type->tp_members);
        add(Py_tp_getset, type->tp_getset);
        add(Py_tp_doc, const_cast<char*>(type->tp_doc));
        slots[n] = {0, nullptr};
        PyType_Spec spec = {type->tp_name, static_cast<int>(type->tp_basicsize), 0,
                            static_cast<unsigned int>(type->tp_flags), slots};
        py::Ref bases = py::check(PyTuple_Pack(1, reinterpret_cast<PyObject*>(base)));
        PyObject* made = py::check(PyType_FromSpecWithBases(&spec, bases.get())).release();
        *heap = true;
        return reinterpret_cast<PyTypeObject*>(made);  // lives as long as the process
    }
#endif
    py::checkStatus(PyType_Ready(type));
    return type;
}

// 3.x: an instance of a heap type holds a reference to its type, which the
// first tp_dealloc that is not the interpreter's own gives back.
inline constexpr bool kInstancesOwnHeapType = kPython3;

// object.__new__ given arguments for a class that has its own __new__ and
// __init__: 2.7 warns, 3.x raises TypeError.
inline constexpr bool kObjectNewRefusesArguments = kPython3;

// 3.x calls a callable with a C array of arguments (vectorcall), with no
// tuple to build; 2.7 knows only tp_call. A type that offers it keeps the
// entry point in each instance (SBC_VECTORCALL_MEMBER).
#if PY_MAJOR_VERSION >= 3
#define SBC_HAVE_VECTORCALL 1
#define SBC_VECTORCALL_MEMBER(name) vectorcallfunc name;
#if PY_VERSION_HEX >= 0x03090000
inline constexpr unsigned long kHaveVectorcall = Py_TPFLAGS_HAVE_VECTORCALL;
#else
inline constexpr unsigned long kHaveVectorcall = _Py_TPFLAGS_HAVE_VECTORCALL;
#endif

inline void enableVectorcall(PyTypeObject* type, size_t offset) noexcept {
    type->tp_vectorcall_offset = static_cast<Py_ssize_t>(offset);
    type->tp_flags |= kHaveVectorcall;
}

// A vectorcall handed to `call` (a tp_call) as an argument tuple and a
// keyword dict.
inline PyObject* vectorcallThroughTuple(ternaryfunc call, PyObject* callable, PyObject* const* args,
                                        Py_ssize_t nargs, PyObject* kwnames) noexcept {
    PyObject* tuple = PyTuple_New(nargs);
    if (tuple == nullptr) return nullptr;
    for (Py_ssize_t i = 0; i < nargs; ++i) {
        Py_INCREF(args[i]);
        PyTuple_SET_ITEM(tuple, i, args[i]);
    }
    PyObject* kwargs = nullptr;
    const Py_ssize_t nkw = kwnames != nullptr ? PyTuple_GET_SIZE(kwnames) : 0;
    if (nkw > 0) {
        kwargs = PyDict_New();
        for (Py_ssize_t k = 0; kwargs != nullptr && k < nkw; ++k) {
            if (PyDict_SetItem(kwargs, PyTuple_GET_ITEM(kwnames, k), args[nargs + k]) < 0) Py_CLEAR(kwargs);
        }
        if (kwargs == nullptr) {
            Py_DECREF(tuple);
            return nullptr;
        }
    }
    PyObject* result = call(callable, tuple, kwargs);
    Py_DECREF(tuple);
    Py_XDECREF(kwargs);
    return result;
}
#else
#define SBC_HAVE_VECTORCALL 0
#define SBC_VECTORCALL_MEMBER(name)
#endif

// Whether a class that does not define __getstate__ still has one, from
// object (3.11 on): the pickling hooks are installed unless the class has
// its own.
inline constexpr bool kObjectHasGetstate = PY_VERSION_HEX >= 0x030B0000;

// --- Interpreter state ----------------------------------------------------------

// Whether the interpreter runs optimised (-O): fixed at start-up. 3.12
// deprecates the C flag, so 3.x reads sys.flags once, at import
// (readOptimizeFlag).
#if PY_MAJOR_VERSION >= 3
inline int gOptimizeLevel = 0;
inline bool optimized() noexcept { return gOptimizeLevel != 0; }
inline void readOptimizeFlag() {
    PyObject* flags = PySys_GetObject("flags");  // borrowed
    if (flags == nullptr) return;
    py::Ref level = py::check(PyObject_GetAttrString(flags, "optimize"));
    gOptimizeLevel = static_cast<int>(PyLong_AsLong(level.get()));
    if (gOptimizeLevel == -1 && PyErr_Occurred()) py::fail();
}
#else
inline bool optimized() noexcept { return Py_OptimizeFlag != 0; }
inline void readOptimizeFlag() {}
#endif

// A traceback entry for a native function, as if a Python frame `function`
// in file `file` had been running: the failure of an init function says
// where it happened.
inline void addTracebackEntry(const char* file, const char* function, PyObject* globals) noexcept {
    if (globals == nullptr) return;  // a frame needs them
    PyObject *type, *value, *tb;
    PyErr_Fetch(&type, &value, &tb);
    PyCodeObject* code = PyCode_NewEmpty(file, function, 0);
    PyFrameObject* frame = nullptr;
    if (code != nullptr) frame = PyFrame_New(PyThreadState_Get(), code, globals, nullptr);
    PyErr_Restore(type, value, tb);
    if (frame != nullptr) {
#if PY_MAJOR_VERSION < 3
        frame->f_lineno = 0;
#endif
        PyTraceBack_Here(frame);
    }
    Py_XDECREF(code);
    Py_XDECREF(frame);
}

// --- Watching one name of a dict ---------------------------------------------
// DictWatch answers cheaply whether a dict may have changed since it was
// last marked: the caller then looks the name up again. What each
// interpreter offers for it:
// - 2.7: the entry table and the entry the name was found in: while the
//   table is the same and the entry holds the same key and value, the name
//   maps to that value (a key has one entry, which stays until the table is
//   rebuilt);
// - 3.8 to 3.11: the dict's version tag, which changes with every change of
//   the dict;
// - 3.12 on (the tag is deprecated there): a dict watcher, which counts
//   every change of the watched dicts.
class DictWatch {
public:
    // Starts watching `dict`, at import. Where it cannot be watched, every
    // question finds it changed (the caller looks the name up each time).
    void watch(PyObject* dict) noexcept {
        marked_ = false;
        watched_ = enable(dict);
    }
    // Whether `dict` cannot have changed the binding of `name` to
    // `expected` since mark().
    bool unchanged(PyObject* dict, PyObject* name, PyObject* expected) const noexcept;
    // Notes the dict as it is now: `name` maps to `expected` in it.
    void mark(PyObject* dict, PyObject* name) noexcept;

private:
    static bool enable(PyObject* dict) noexcept;
    bool watched_ = false;
    bool marked_ = false;
#if PY_MAJOR_VERSION < 3
    void* table_ = nullptr;
    void* entry_ = nullptr;
    PyObject* key_ = nullptr;  // compared only
#elif PY_VERSION_HEX < 0x030C0000
    uint64_t version_ = 0;
#else
    uint64_t generation_ = 0;
#endif
};

#if PY_MAJOR_VERSION < 3

inline bool DictWatch::enable(PyObject*) noexcept { return true; }

inline bool DictWatch::unchanged(PyObject* dict, PyObject*, PyObject* expected) const noexcept {
    if (!watched_ || !marked_) return false;
    auto* d = reinterpret_cast<PyDictObject*>(dict);
    if (table_ != d->ma_table) return false;
    auto* e = static_cast<PyDictEntry*>(entry_);
    return e->me_key == key_ && e->me_value == expected;
}

// The key the entry holds, which need not be the very object looked up
// with (sys.modules keys are not interned).
inline void DictWatch::mark(PyObject* dict, PyObject* name) noexcept {
    auto* d = reinterpret_cast<PyDictObject*>(dict);
    table_ = d->ma_table;
    auto* e = d->ma_lookup(d, name, reinterpret_cast<PyStringObject*>(name)->ob_shash);
    entry_ = e;
    key_ = e != nullptr ? e->me_key : nullptr;
    marked_ = e != nullptr && key_ != nullptr;
}

#elif PY_VERSION_HEX < 0x030C0000

inline bool DictWatch::enable(PyObject*) noexcept { return true; }

inline bool DictWatch::unchanged(PyObject* dict, PyObject*, PyObject*) const noexcept {
    return watched_ && marked_ && reinterpret_cast<PyDictObject*>(dict)->ma_version_tag == version_;
}

inline void DictWatch::mark(PyObject* dict, PyObject*) noexcept {
    version_ = reinterpret_cast<PyDictObject*>(dict)->ma_version_tag;
    marked_ = true;
}

#else

// Every event of every watched dict moves the generation on. The watched
// dicts are module namespaces, which change at import and then seldom.
inline uint64_t gDictGeneration = 1;
inline int gDictWatcher = -1;  // -1: not made yet; -2: none to be had

inline int countDictEvent(PyDict_WatchEvent, PyObject*, PyObject*, PyObject*) noexcept {
    ++gDictGeneration;
    return 0;
}

inline bool DictWatch::enable(PyObject* dict) noexcept {
    if (gDictWatcher == -1) {
        gDictWatcher = PyDict_AddWatcher(countDictEvent);
        if (gDictWatcher < 0) {
            gDictWatcher = -2;  // none left: names are looked up each time
            PyErr_Clear();
        }
    }
    if (gDictWatcher < 0) return false;
    if (PyDict_Watch(gDictWatcher, dict) < 0) {
        PyErr_Clear();
        return false;
    }
    return true;
}

inline bool DictWatch::unchanged(PyObject*, PyObject*, PyObject*) const noexcept {
    return watched_ && marked_ && generation_ == gDictGeneration;
}

inline void DictWatch::mark(PyObject*, PyObject*) noexcept {
    generation_ = gDictGeneration;
    marked_ = true;
}

#endif

// --- Text as characters --------------------------------------------------------

// The characters of a str as an array: 3.x by the str's kind (1, 2 or 4
// bytes a code point), 2.7 as its bytes (1). Lives as long as the str.
struct CharsView {
    const void* data;
    int width;  // bytes a character
    Py_ssize_t length;
};

inline CharsView strChars(PyObject* s) {
#if PY_MAJOR_VERSION >= 3
#if PY_VERSION_HEX < 0x030C0000
    if (PyUnicode_READY(s) < 0) py::fail();
#endif
    return {PyUnicode_DATA(s), static_cast<int>(PyUnicode_KIND(s)), PyUnicode_GET_LENGTH(s)};
#else
    return {PyString_AS_STRING(s), 1, PyString_GET_SIZE(s)};
#endif
}

// A new str of `n` characters of `width` bytes each (code points on 3.x,
// bytes on 2.7); null with an exception set.
inline PyObject* strFromWidth(const void* data, int width, Py_ssize_t n) noexcept {
#if PY_MAJOR_VERSION >= 3
    return PyUnicode_FromKindAndData(width, data, n);
#else
    if (width == 1) return PyString_FromStringAndSize(static_cast<const char*>(data), n);
    // Wider characters on 2.7 are bytes kept in wider slots.
    PyObject* s = PyString_FromStringAndSize(nullptr, n);
    if (s == nullptr) return nullptr;
    char* out = PyString_AS_STRING(s);
    for (Py_ssize_t i = 0; i < n; ++i) {
        out[i] = static_cast<char>(width == 2 ? static_cast<const uint16_t*>(data)[i]
                                              : static_cast<const uint32_t*>(data)[i]);
    }
    return s;
#endif
}

// What a column of a text counts: code points on 3.x, bytes on 2.7.
inline constexpr const char* kColumnUnit = kPython3 ? "code points" : "bytes";

}  // namespace compat
