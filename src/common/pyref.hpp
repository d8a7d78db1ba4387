// Reference ownership and the single error channel shared by every native
// module of the project.
#pragma once

#include <Python.h>

#include <cassert>
#include <new>
#include <utility>

namespace py {

// Thrown when a C API call failed and a Python exception is already set.
// Caught at every entry point from the interpreter; never crosses into it.
struct Error {};

// Every failure path goes through here, so a failure without an exception
// (which the interpreter would turn into a SystemError far from its cause)
// is caught where it happens in debug builds.
[[noreturn]] inline void fail() {
    assert(PyErr_Occurred() != nullptr && "failure without a Python exception set");
    throw Error{};
}

// Ownership convention: a raw PyObject* parameter or result is borrowed
// unless the function says otherwise; anything kept past a call that can
// run Python code is held in a Ref.

// An owning handle. It never converts to PyObject* implicitly: get() lends,
// release() hands the reference back to the interpreter.
class Ref {
public:
    Ref() noexcept = default;
    Ref(const Ref&) = delete;
    Ref& operator=(const Ref&) = delete;
    Ref(Ref&& other) noexcept : obj_(other.obj_) { other.obj_ = nullptr; }
    Ref& operator=(Ref&& other) noexcept {
        if (this != &other) {
            PyObject* old = obj_;
            obj_ = other.obj_;
            other.obj_ = nullptr;
            Py_XDECREF(old);
        }
        return *this;
    }
    ~Ref() { Py_XDECREF(obj_); }

    // Takes over a new reference (may be null).
    static Ref steal(PyObject* o) noexcept { return Ref(o); }
    // Takes a new reference to a borrowed object (may be null).
    static Ref own(PyObject* o) noexcept {
        Py_XINCREF(o);
        return Ref(o);
    }
    static Ref none() noexcept { return own(Py_None); }

    PyObject* get() const noexcept { return obj_; }
    PyObject* release() noexcept {
        PyObject* o = obj_;
        obj_ = nullptr;
        return o;
    }
    Ref copy() const noexcept { return own(obj_); }
    void reset() noexcept {
        PyObject* old = obj_;
        obj_ = nullptr;
        Py_XDECREF(old);
    }
    explicit operator bool() const noexcept { return obj_ != nullptr; }
    bool isNone() const noexcept { return obj_ == Py_None; }

private:
    explicit Ref(PyObject* o) noexcept : obj_(o) {}
    PyObject* obj_ = nullptr;
};

// A new reference that must not be null; throws when the call failed.
inline Ref check(PyObject* newRef) {
    if (newRef == nullptr) fail();
    return Ref::steal(newRef);
}

// An int status of the C API (-1 with an exception set means failure).
inline int checkStatus(int status) {
    if (status == -1 && PyErr_Occurred()) fail();
    return status;
}

inline Py_ssize_t checkSize(Py_ssize_t n) {
    if (n == -1 && PyErr_Occurred()) fail();
    return n;
}

inline bool truth(PyObject* o) { return checkStatus(PyObject_IsTrue(o)) != 0; }

// Stores `value` into an owned PyObject* slot. The old value is released
// last: its destructor may run Python code that looks at the slot.
inline void storeSlot(PyObject** slot, PyObject* value) noexcept {
    PyObject* old = *slot;
    Py_XINCREF(value);
    *slot = value;
    Py_XDECREF(old);
}

// The one translation of a C++ exception into the interpreter's: call it
// inside `catch (...)`. Error already carries a Python exception;
// bad_alloc becomes MemoryError; anything else is a bug, reported as
// SystemError rather than ending the process.
inline void setErrorFromCurrentException() noexcept {
    try {
        throw;
    } catch (const Error&) {
    } catch (const std::bad_alloc&) {
        PyErr_NoMemory();
    } catch (...) {
        PyErr_SetString(PyExc_SystemError, "unexpected C++ exception");
    }
}

// Runs `body`; on failure the Python exception is set and `failed` returned.
template <class T, class Body>
T guardedAs(T failed, Body&& body) noexcept {
    try {
        return body();
    } catch (...) {
        setErrorFromCurrentException();
        return failed;
    }
}

// An entry point returning an object: nullptr on failure.
template <class Body>
PyObject* guarded(Body&& body) noexcept {
    return guardedAs<PyObject*>(nullptr, static_cast<Body&&>(body));
}

// An entry point returning a status: -1 on failure.
template <class Body>
int guardedStatus(Body&& body) noexcept {
    return guardedAs<int>(-1, static_cast<Body&&>(body));
}

// Keeps the pending exception aside while cleanup code runs; restores it
// unless the cleanup raised one of its own.
class SavedError {
public:
    SavedError() noexcept { PyErr_Fetch(&type_, &value_, &tb_); }
    SavedError(const SavedError&) = delete;
    SavedError& operator=(const SavedError&) = delete;
    void restore() noexcept {
        PyErr_Restore(type_, value_, tb_);
        type_ = value_ = tb_ = nullptr;
    }
    ~SavedError() {
        Py_XDECREF(type_);
        Py_XDECREF(value_);
        Py_XDECREF(tb_);
    }

private:
    PyObject* type_ = nullptr;
    PyObject* value_ = nullptr;
    PyObject* tb_ = nullptr;
};

}  // namespace py
