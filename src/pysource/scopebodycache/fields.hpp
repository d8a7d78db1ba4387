// How the pickled fields of both classes are declared: each class lists its
// fields once, in one X-macro (finder.hpp, bodycache.hpp), and its state
// struct, its slots and its pickling table are all expanded from that list,
// so they cannot drift apart.
//
//   X(kind, member, "Python name", type)
//   kind: Object (a PyObject*, None or exactly `type`) or Index (Py_ssize_t)
#pragma once

#include "common/messages.hpp"
#include "common/pyref.hpp"

#include <cstdint>
#include <string_view>

#define SBC_FIELD_MEMBER_Object(member) PyObject* member;
#define SBC_FIELD_MEMBER_Index(member) Py_ssize_t member;
#define SBC_FIELD_MEMBER(kind, member, name, type) SBC_FIELD_MEMBER_##kind(member)

#define SBC_FIELD_VISIT_Object(member) visit(member);
#define SBC_FIELD_VISIT_Index(member)
#define SBC_FIELD_VISIT(kind, member, name, type) SBC_FIELD_VISIT_##kind(member)

// ", <Python name>" for each field: the tail of the checksum message.
#define SBC_FIELD_NAME_LIST(kind, member, name, type) ", " name
// "+ 1" for each field: the count.
#define SBC_COUNT_FIELD(kind, member, name, type) +1

namespace sbc {

// The exact built-in type a field accepts besides None.
#define SBC_FIELD_TYPE_set (&PySet_Type)
#define SBC_FIELD_TYPE_list (&PyList_Type)
#define SBC_FIELD_TYPE_dict (&PyDict_Type)
#define SBC_FIELD_TYPE_index (nullptr)

// A field store with the field's type rule: exactly `type` or None, else
// TypeError "Expected <name>, got <type>".
inline void storeTyped(PyObject** slot, PyObject* value, PyTypeObject* type, const char* name) {
    if (value != Py_None && Py_TYPE(value) != type) msg::raiseExpectedType(name, value);
    py::storeSlot(slot, value);
}

// FNV-1a of a field list text: the static check that the list still
// matches the checksum stored pickles carry.
constexpr uint32_t fieldListHash(std::string_view text) {
    uint32_t h = 2166136261u;
    for (char c : text) h = (h ^ static_cast<unsigned char>(c)) * 16777619u;
    return h;
}

// Whether the names of a field list are in the order pickling writes them.
constexpr bool namesSorted(std::string_view list) {
    std::string_view previous;
    while (!list.empty()) {
        const size_t comma = list.find(", ");
        const std::string_view name = list.substr(0, comma);
        if (name < previous) return false;
        previous = name;
        list = comma == std::string_view::npos ? std::string_view() : list.substr(comma + 2);
    }
    return true;
}

}  // namespace sbc
