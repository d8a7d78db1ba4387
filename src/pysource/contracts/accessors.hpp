// Inline accessors of logicals and the byte-wise name comparison. They
// belong to the siblings' shared declarations; this module carries its own
// implementation of each.
#pragma once

#include "common/messages.hpp"
#include "common/pyref.hpp"
#include "pysource/contracts/logical_record.hpp"

#include <cstring>
#include <string_view>

namespace contracts {

// The record type, bound at import from pysource._fastaccess.
extern PyTypeObject* gLogicalLineType;

using Logical = LogicalLineObject;

inline bool logicalCheck(PyObject* o) noexcept { return Py_TYPE(o) == gLogicalLineType; }

inline Logical* asLogical(PyObject* o) noexcept { return reinterpret_cast<Logical*>(o); }

// TypeError "Argument must be a logical" unless `o` is exactly a logical.
// The record is borrowed: use it only where no Python code can run.
inline Logical* requireLogical(PyObject* o) {
    if (!logicalCheck(o)) msg::raise(PyExc_TypeError, msg::kNotLogical);
    return asLogical(o);
}

// An owned logical, checked when it is taken: a record that stays valid
// across calls that can run Python code (which may empty the list).
class LogicalRef {
public:
    LogicalRef() noexcept = default;
    // A new reference to `o`; TypeError unless it is exactly a logical.
    static LogicalRef own(PyObject* o) {
        requireLogical(o);
        return LogicalRef(py::Ref::own(o));
    }
    Logical* operator->() const noexcept { return asLogical(ref_.get()); }
    Logical* record() const noexcept { return asLogical(ref_.get()); }
    PyObject* get() const noexcept { return ref_.get(); }
    explicit operator bool() const noexcept { return bool(ref_); }

private:
    explicit LogicalRef(py::Ref ref) noexcept : ref_(std::move(ref)) {}
    py::Ref ref_;
};

inline bool isWhitespace(const Logical* l) noexcept {
    return l->fKind == kCommentLogical || l->fKind == kBlankLogical;
}

inline bool isScopeStart(const Logical* l) noexcept {
    return l->fKind == kDefLogical || l->fKind == kClassLogical;
}

// fScopeName, None when absent. Borrowed.
inline PyObject* scopeName(const Logical* l) noexcept {
    return l->fScopeName ? l->fScopeName : Py_None;
}

inline void setScopeName(Logical* l, PyObject* name) noexcept { py::storeSlot(&l->fScopeName, name); }

// The name token of a class/def line; nullptr when there is none. Borrowed.
inline PyObject* definedToken(const Logical* l) noexcept {
    const bool isDef = l->fKind == kDefLogical;
    if (!isDef && l->fKind != kClassLogical) return nullptr;
    const std::string_view keyword = isDef ? "def" : "class";
    // Compared up to the first NUL, as the bytes of a C string: equal when
    // the token is the word, or the word followed by a NUL.
    auto is = [](std::string_view text, std::string_view word) {
        return text.size() >= word.size() && (text.size() == word.size() || text[word.size()] == '\0') &&
               text.compare(0, word.size(), word) == 0;
    };
    for (Py_ssize_t i = 0; i < l->fTokenCount; ++i) {
        PyObject* token = l->fTokens[i];
        std::string_view bytes;
        if (compat::isStr(token) && compat::tryStrView(token, &bytes)) {
            const char* text = bytes.data();
            if (text[0] == '\\') continue;
            if (text[0] == keyword[0] && is(bytes, keyword)) continue;
            if (isDef && text[0] == 'a' && is(bytes, "async")) continue;
        }
        return token;
    }
    return nullptr;
}

// The defined name: fLocalScopeName when set, else the name token of a
// class/def line; nullptr when there is none. Borrowed.
inline PyObject* localScopeDefined(const Logical* l) noexcept {
    if (l->fLocalScopeName != nullptr && l->fLocalScopeName != Py_None) return l->fLocalScopeName;
    return definedToken(l);
}

// As localScopeDefined, with the exact-str test of the Python entry point.
PyObject* localScopeDefinedChecked(const Logical* l);

// None clears the field.
inline void setLocalScopeDefined(Logical* l, PyObject* name) noexcept {
    py::storeSlot(&l->fLocalScopeName, name == Py_None ? nullptr : name);
}

// The bytes of a name: a str directly (its UTF-8 on 3.x), 2.7's unicode
// through the default encoding, 3.x's bytes as they are, a bytearray's
// buffer; anything else is a TypeError.
class NameBytes {
public:
    explicit NameBytes(PyObject* name);
    const char* get() const noexcept { return bytes_; }

private:
    py::Ref encoded_;
    const char* bytes_ = nullptr;
};

// Whether two names have the same bytes up to the first NUL.
inline bool strEquals(PyObject* a, PyObject* b) {
    if (a == b && compat::isStrExact(a)) return true;
    if (compat::isStrExact(a) && compat::isStrExact(b)) {
        const std::string_view x = compat::strView(a);
        const std::string_view y = compat::strView(b);
        if (x == y) return true;
        return std::strcmp(x.data(), y.data()) == 0;
    }
    NameBytes c(b);
    NameBytes s(a);
    return std::strcmp(s.get(), c.get()) == 0;
}

}  // namespace contracts
