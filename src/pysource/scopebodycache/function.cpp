#include "pysource/scopebodycache/function.hpp"

#include "common/messages.hpp"

#include <structmember.h>

#include <cstring>

namespace sbc {
namespace {

struct FunctionObject {
    PyObject_HEAD
    const FunctionSpec* spec;
    PyObject* name;      // str
    PyObject* qualname;  // str
    PyObject* module;    // str
    PyObject* doc;       // str or None
    PyTypeObject* owner; // the class of a method, else nullptr
    bool isMethod;
    SBC_VECTORCALL_MEMBER(vectorcall)
};

PyTypeObject FunctionType = {PyVarObject_HEAD_INIT(nullptr, 0)};

[[noreturn]] void countError(const FunctionSpec& spec, Py_ssize_t given) {
    const bool exact = spec.required == spec.total;
    Py_ssize_t expected;
    const char* moreOrLess;
    if (given < spec.required) {
        expected = spec.required;
        moreOrLess = exact ? "exactly" : "at least";
    } else {
        expected = spec.total;
        moreOrLess = exact ? "exactly" : "at most";
    }
    PyErr_Format(PyExc_TypeError,
                 "%.200s() takes %.8s %zd positional argument%.1s (%zd given)", spec.name,
                 moreOrLess, expected, expected == 1 ? "" : "s", given);
    py::fail();
}

const char* checkTypeName(ArgCheck check, PyTypeObject** type) {
    switch (check) {
    case ArgCheck::List: *type = &PyList_Type; return "list";
    case ArgCheck::Str: *type = compat::strType(); return "str";
    case ArgCheck::Set: *type = &PySet_Type; return "set";
    case ArgCheck::Any: break;
    }
    *type = nullptr;
    return nullptr;
}

int indexOfParam(const FunctionSpec& spec, PyObject* key) {
    const char* text = compat::strText(key);
    for (int i = 0; i < spec.total; ++i) {
        if (std::strcmp(spec.params[i].name, text) == 0) return i;
    }
    return -1;
}

}  // namespace

namespace {

// The common call: every parameter by position, none by keyword. False,
// having done nothing, for any other call.
bool parsePositional(const FunctionSpec& spec, PyObject* const* items, Py_ssize_t nargs, ParsedArgs& out) {
    if (nargs != spec.total || spec.total == 0 || (spec.total == 1 && spec.isInit)) return false;
    for (int i = 0; i < spec.total; ++i) {
        PyObject* v = items[i];
        PyTypeObject* type;
        const char* typeName = checkTypeName(spec.params[i].check, &type);
        if (type != nullptr && v != Py_None && Py_TYPE(v) != type) {
            PyErr_Format(PyExc_TypeError, msg::kArgumentType, spec.params[i].name, typeName,
                         Py_TYPE(v)->tp_name);
            py::fail();
        }
        out.set(i, v);
    }
    return true;
}

}  // namespace

void parseArgs(const FunctionSpec& spec, PyObject* args, Py_ssize_t first, PyObject* kwargs,
               ParsedArgs& out) {
    const Py_ssize_t nargs = PyTuple_GET_SIZE(args) - first;
    const bool haveKeywords = kwargs != nullptr && PyDict_Size(kwargs) > 0;
    if (!haveKeywords && parsePositional(spec, &PyTuple_GET_ITEM(args, first), nargs, out)) {
        return;
    }

    // Functions without parameters and single-parameter ones take no keywords.
    const bool noKeywords = spec.total == 0 || (spec.total == 1 && spec.required == 1 && !spec.isInit);
    if (noKeywords) {
        if (haveKeywords) {
            PyErr_Format(PyExc_TypeError, "%.200s() takes no keyword arguments", spec.name);
            py::fail();
        }
        if (spec.total == 0 && nargs != 0) {
            PyErr_Format(PyExc_TypeError, "%.200s() takes no arguments (%zd given)", spec.name, nargs);
            py::fail();
        }
        if (spec.total == 1 && nargs != 1) {
            PyErr_Format(PyExc_TypeError, "%.200s() takes exactly one argument (%zd given)",
                         spec.name, nargs);
            py::fail();
        }
    } else {
        if (nargs > spec.total) countError(spec, nargs);
        for (Py_ssize_t i = 0; i < nargs; ++i) out.set(static_cast<int>(i), PyTuple_GET_ITEM(args, first + i));
        if (haveKeywords) {
            // Required parameters missing from both are reported before any
            // keyword is judged.
            Py_ssize_t taken = 0;
            for (int i = static_cast<int>(nargs); i < spec.total; ++i) {
                PyObject* v = PyDict_GetItemString(kwargs, spec.params[i].name);
                if (v != nullptr) {
                    out.set(i, v);
                    ++taken;
                } else if (i < spec.required) {
                    countError(spec, i);
                }
            }
            if (taken < PyDict_Size(kwargs)) {
                PyObject* key;
                PyObject* value;
                Py_ssize_t pos = 0;
                while (PyDict_Next(kwargs, &pos, &key, &value)) {
                    if (!compat::isStr(key)) {
                        PyErr_Format(PyExc_TypeError, msg::kKeywordsMustBeStrings, spec.name);
                        py::fail();
                    }
                    const int at = indexOfParam(spec, key);
                    if (at < 0) {
                        PyErr_Format(PyExc_TypeError,
                                     "%.200s() got an unexpected keyword argument '%.200s'",
                                     spec.name, compat::strText(key));
                        py::fail();
                    }
                    if (at < nargs) {
                        PyErr_Format(PyExc_TypeError,
                                     "%s() got multiple values for keyword argument '%s'", spec.name,
                                     compat::strText(key));
                        py::fail();
                    }
                }
            }
        } else if (nargs < spec.required) {
            countError(spec, nargs);
        }
    }
    if (noKeywords && spec.total == 1) out.set(0, PyTuple_GET_ITEM(args, first));

    for (int i = 0; i < spec.total; ++i) {
        PyTypeObject* type;
        const char* typeName = checkTypeName(spec.params[i].check, &type);
        PyObject* v = out[i];
        if (type == nullptr || v == nullptr || v == Py_None || Py_TYPE(v) == type) continue;
        PyErr_Format(PyExc_TypeError,
                     "Argument '%.200s' has incorrect type (expected %.200s, got %.200s)",
                     spec.params[i].name, typeName, Py_TYPE(v)->tp_name);
        py::fail();
    }
}

namespace {

// The instance a method is called on: the first argument.
PyObject* methodSelf(FunctionObject* f, PyObject* const* items, Py_ssize_t nargs) {
    // Reached unbound, the first argument is the instance.
    if (nargs < 1) {
        PyErr_Format(PyExc_TypeError, "descriptor '%.200s' needs an argument", compat::strText(f->qualname));
        py::fail();
    }
    PyObject* self = items[0];
    // Taken from the class dict, a method can be handed anything.
    if (!PyObject_TypeCheck(self, f->owner)) {
        PyErr_Format(PyExc_TypeError, "descriptor '%.200s' requires a '%.100s' object but received a '%.100s'",
                     compat::strText(f->name), f->owner->tp_name, Py_TYPE(self)->tp_name);
        py::fail();
    }
    return self;
}

PyObject* function_call(PyObject* op, PyObject* args, PyObject* kwargs) {
    auto* f = reinterpret_cast<FunctionObject*>(op);
    return py::guarded([&]() -> PyObject* {
        PyObject* self = nullptr;
        if (f->isMethod) self = methodSelf(f, &PyTuple_GET_ITEM(args, 0), PyTuple_GET_SIZE(args));
        ParsedArgs parsed;
        parseArgs(*f->spec, args, f->isMethod ? 1 : 0, kwargs, parsed);
        return f->spec->impl(self, parsed.argv());
    });
}

#if SBC_HAVE_VECTORCALL
// 3.x's call without an argument tuple (a bound method passes the instance
// first). Calls with keywords take the general path.
PyObject* function_vectorcall(PyObject* op, PyObject* const* args, size_t nargsf, PyObject* kwnames) {
    auto* f = reinterpret_cast<FunctionObject*>(op);
    const Py_ssize_t nargs = PyVectorcall_NARGS(nargsf);
    if (kwnames == nullptr || PyTuple_GET_SIZE(kwnames) == 0) {
        PyObject* result = nullptr;
        const bool done = py::guardedAs<bool>(true, [&] {
            PyObject* self = f->isMethod ? methodSelf(f, args, nargs) : nullptr;
            const Py_ssize_t first = f->isMethod ? 1 : 0;
            ParsedArgs parsed;
            if (!parsePositional(*f->spec, args + first, nargs - first, parsed)) return false;
            result = f->spec->impl(self, parsed.argv());
            return true;
        });
        if (done) return result;
    }
    return compat::vectorcallThroughTuple(function_call, op, args, nargs, kwnames);
}
#endif

PyObject* function_descr_get(PyObject* op, PyObject* obj, PyObject* type) {
    auto* f = reinterpret_cast<FunctionObject*>(op);
    if (!f->isMethod) {
        Py_INCREF(op);
        return op;
    }
    if (obj == Py_None) obj = nullptr;
    return compat::methodFor(op, obj, type);
}

void function_dealloc(PyObject* op) {
    auto* f = reinterpret_cast<FunctionObject*>(op);
    Py_XDECREF(f->name);
    Py_XDECREF(f->qualname);
    Py_XDECREF(f->module);
    Py_XDECREF(f->doc);
    Py_XDECREF(reinterpret_cast<PyObject*>(f->owner));
    Py_TYPE(op)->tp_free(op);
}

PyObject* function_repr(PyObject* op) {
    auto* f = reinterpret_cast<FunctionObject*>(op);
    return py::guarded([&] {
        return compat::strFromFormat("<function %s at %p>", compat::strText(f->qualname), op);
    });
}

// Pickled by reference: module and name.
PyObject* function_reduce(PyObject* op, PyObject*) {
    auto* f = reinterpret_cast<FunctionObject*>(op);
    Py_INCREF(f->qualname);
    return f->qualname;
}

PyMethodDef function_methods[] = {
    {"__reduce__", function_reduce, METH_NOARGS, nullptr},
    {nullptr, nullptr, 0, nullptr},
};

PyMemberDef function_members[] = {
    {const_cast<char*>("__name__"), T_OBJECT, offsetof(FunctionObject, name), READONLY, nullptr},
    {const_cast<char*>("__qualname__"), T_OBJECT, offsetof(FunctionObject, qualname), READONLY, nullptr},
    {const_cast<char*>("__module__"), T_OBJECT, offsetof(FunctionObject, module), READONLY, nullptr},
    {const_cast<char*>("__doc__"), T_OBJECT, offsetof(FunctionObject, doc), READONLY, nullptr},
    {nullptr, 0, 0, 0, nullptr},
};

py::Ref makeFunction(const FunctionSpec& spec, const char* qualname, const char* module,
                     PyTypeObject* owner) {
    const bool isMethod = owner != nullptr;
    py::Ref op = py::check(PyType_GenericAlloc(&FunctionType, 0));
    auto* f = reinterpret_cast<FunctionObject*>(op.get());
    f->spec = &spec;
    f->isMethod = isMethod;
    f->owner = owner;
    Py_XINCREF(owner);
    f->name = py::check(compat::internStr(spec.name)).release();
    f->qualname = py::check(compat::strFromText(qualname)).release();
    f->module = py::check(compat::internStr(module)).release();
    f->doc = spec.doc ? py::check(compat::strFromText(spec.doc)).release() : py::Ref::none().release();
#if SBC_HAVE_VECTORCALL
    f->vectorcall = function_vectorcall;
#endif
    return op;
}

}  // namespace

void readyFunctionType() {
    FunctionType.tp_name = "pysource.scopebodycache.function";
    FunctionType.tp_basicsize = sizeof(FunctionObject);
    FunctionType.tp_flags = Py_TPFLAGS_DEFAULT;
    FunctionType.tp_dealloc = function_dealloc;
    FunctionType.tp_repr = function_repr;
    FunctionType.tp_call = function_call;
    FunctionType.tp_descr_get = function_descr_get;
    FunctionType.tp_methods = function_methods;
    FunctionType.tp_members = function_members;
#if SBC_HAVE_VECTORCALL
    compat::enableVectorcall(&FunctionType, offsetof(FunctionObject, vectorcall));
#endif
    py::checkStatus(PyType_Ready(&FunctionType));
}

py::Ref newFunction(const FunctionSpec& spec, const char* module) {
    return makeFunction(spec, spec.name, module, nullptr);
}

py::Ref newMethod(const FunctionSpec& spec, PyTypeObject* owner, const char* module) {
    const char* dot = std::strrchr(owner->tp_name, '.');
    py::Ref qual = py::check(
        compat::strFromFormat("%s.%s", dot ? dot + 1 : owner->tp_name, spec.name));
    return makeFunction(spec, compat::strText(qual.get()), module, owner);
}

void bindMethods(PyTypeObject* type, const FunctionSpec* specs, size_t count, const char* module) {
    for (size_t k = 0; k < count; ++k) {
        py::Ref f = newMethod(specs[k], type, module);
        py::checkStatus(PyDict_SetItemString(type->tp_dict, specs[k].name, f.get()));
    }
    PyType_Modified(type);
}

void bindFunctions(PyObject* moduleDict, const FunctionSpec* specs, size_t count, const char* module) {
    for (size_t k = 0; k < count; ++k) {
        py::Ref f = newFunction(specs[k], module);
        py::checkStatus(PyDict_SetItemString(moduleDict, specs[k].name, f.get()));
    }
}

bool isBoundFormOf(PyObject* callable, PyObject* function) {
    return PyMethod_Check(callable) && PyMethod_GET_FUNCTION(callable) == function;
}

}  // namespace sbc
