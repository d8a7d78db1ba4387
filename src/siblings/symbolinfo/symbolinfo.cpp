// Stand-in for pysource.symbolinfo: the scope-name helpers and the symbol
// kind constants, published both as module attributes and as typed entry
// points in `_capi`.
//
// Scope names are dotted ("A#0.f#1"); a leaf's "#<digits>" suffix tells apart
// scopes of the same name. The helpers run on every edit, so they build their
// results directly and never call into Python code. They take str only (a
// TypeError otherwise); LeafScopeNameHasIndex answers False for a non-str.

#include "common/pycompat.hpp"
#include "common/pyref.hpp"
#include "pysource/contracts/capi.hpp"
#include "siblings/sibling_util.hpp"

#include <cstring>
#include <string>
#include <string_view>

namespace symbolinfo {

using namespace contracts;

// ---------------------------------------------------------------------------
// Constants. Each kind is a distinct printable letter; its prefix is the
// letter and ':' so that every prefix is kPrefixLen long.

struct KindLetter {
    std::string_view stem;
    char kind;
};

constexpr KindLetter kKindLetters[] = {
    {"Set", 's'},           {"Get", 'g'},          {"SetTypeHint", 'h'},
    {"Nonlocal", 'n'},      {"Global", 'l'},       {"WithinExpr", 'w'},
    {"Import", 'i'},        {"FromImport", 'f'},   {"Decorator", 'd'},
    {"SpecificScope", 'S'}, {"SpecificUrl", 'U'},  {"BuiltinModule", 'B'},
    {"TypingModule", 'T'},  {"BuiltinClass", 'K'}, {"TypedLiteral", 'L'},
    {"Arg", 'a'},           {"TypeHint", 'H'},     {"PlainEquiv", 'e'},
    {"Method", 'm'},        {"UnboundMethod", 'u'}, {"Function", 'F'},
    {"Class", 'C'},         {"Self", 'y'},         {"Instance", 'I'},
    {"Module", 'M'},        {"InferredTypeHint", 'r'}, {"Called", 'c'},
};

constexpr char kindOf(std::string_view stem) {
    for (const KindLetter& e : kKindLetters)
        if (e.stem == stem) return e.kind;
    return 0;
}

constexpr bool kindsDistinct() {
    constexpr size_t n = sizeof(kKindLetters) / sizeof(kKindLetters[0]);
    for (size_t i = 0; i < n; ++i)
        for (size_t j = i + 1; j < n; ++j)
            if (kKindLetters[i].kind == kKindLetters[j].kind) return false;
    return true;
}
static_assert(kindsDistinct(), "symbol kinds must be distinct");

#define SI_CHECK_STEM(stem) static_assert(kindOf(#stem) != 0, "no kind letter for " #stem);
SYMBOLINFO_PREFIX_KIND_STEMS(SI_CHECK_STEM)
SYMBOLINFO_PREFIX_KIND_STEMS2(SI_CHECK_STEM)
SYMBOLINFO_PREFIX_KIND_STEMS3(SI_CHECK_STEM)
#undef SI_CHECK_STEM

constexpr Py_ssize_t kPrefixLenValue = 2;

// The published variables, in the module's source order.
#define SI_DECLARE_PAIR(stem) \
    PyObject* k##stem##Prefix = nullptr; \
    char k##stem##Kind = 0;
SYMBOLINFO_PREFIX_KIND_STEMS(SI_DECLARE_PAIR)
PyObject* kClassInstanceSuffix = nullptr;
SYMBOLINFO_PREFIX_KIND_STEMS2(SI_DECLARE_PAIR)
PyObject* kPlainEquivSpec = nullptr;
char kPlainEquivKind = 0;
SYMBOLINFO_PREFIX_KIND_STEMS3(SI_DECLARE_PAIR)
PyObject* kIterationSubscript = nullptr;
PyObject* kTypingModuleSymbolDot = nullptr;
PyObject* kTypingModuleSymbol = nullptr;
Py_ssize_t kPrefixLen = 0;
PyObject* kScopeIndexSep = nullptr;
PyObject* kModuleScopeName = nullptr;
#undef SI_DECLARE_PAIR

constexpr char kSep = '#';
constexpr char kDot = '.';

// Both views of one constant: the capsule in _capi and the module attribute.
class Publisher {
public:
    Publisher(PyObject* module, PyObject* capi) : module_(module), capi_(capi) {}

    // `*slot` keeps the interned str for the life of the process.
    void object(const char* name, PyObject** slot, const char* value) {
        PyObject* s = compat::internStr(value);
        if (s == nullptr) py::fail();
        *slot = s;
        siblings::publish(capi_, name, slot, sig::kObject);
        siblings::setAttr(module_, name, s);
    }

    void kind(const char* name, char* slot, char value) {
        *slot = value;
        siblings::publish(capi_, name, slot, sig::kChar);
        py::Ref n = py::check(compat::intFromLong(static_cast<unsigned char>(value)));
        siblings::setAttr(module_, name, n.get());
    }

    void size(const char* name, Py_ssize_t* slot, Py_ssize_t value) {
        *slot = value;
        siblings::publish(capi_, name, slot, sig::kSsize);
        py::Ref n = py::check(compat::intFromSsize(value));
        siblings::setAttr(module_, name, n.get());
    }

    void pair(const char* stem, PyObject** prefix, char* kindSlot) {
        char k = kindOf(stem);
        const char prefixText[] = {k, ':', '\0'};
        static_assert(sizeof(prefixText) - 1 == kPrefixLenValue, "prefix length");
        object(("k" + std::string(stem) + "Prefix").c_str(), prefix, prefixText);
        kind(("k" + std::string(stem) + "Kind").c_str(), kindSlot, k);
    }

private:
    PyObject* module_;
    PyObject* capi_;
};

void publishConstants(Publisher& p) {
#define SI_PUBLISH_PAIR(stem) p.pair(#stem, &k##stem##Prefix, &k##stem##Kind);
    SYMBOLINFO_PREFIX_KIND_STEMS(SI_PUBLISH_PAIR)
    p.object("kClassInstanceSuffix", &kClassInstanceSuffix, "()");
    SYMBOLINFO_PREFIX_KIND_STEMS2(SI_PUBLISH_PAIR)
    p.object("kPlainEquivSpec", &kPlainEquivSpec, "e:");
    p.kind("kPlainEquivKind", &kPlainEquivKind, kindOf("PlainEquiv"));
    SYMBOLINFO_PREFIX_KIND_STEMS3(SI_PUBLISH_PAIR)
    p.object("kIterationSubscript", &kIterationSubscript, "[]");
    p.object("kTypingModuleSymbolDot", &kTypingModuleSymbolDot, "typing.");
    p.object("kTypingModuleSymbol", &kTypingModuleSymbol, "typing");
    p.size("kPrefixLen", &kPrefixLen, kPrefixLenValue);
    p.object("kScopeIndexSep", &kScopeIndexSep, "#");
    p.object("kModuleScopeName", &kModuleScopeName, "");
#undef SI_PUBLISH_PAIR
}

// ---------------------------------------------------------------------------
// Scope-name helpers.

void requireStr(PyObject* o, const char* what) {
    if (!compat::isStr(o)) {
        PyErr_Format(PyExc_TypeError, "%s must be str, not %.200s", what, Py_TYPE(o)->tp_name);
        py::fail();
    }
}

// The bytes of a str (UTF-8 on 3.x); throws when it has none.
std::string_view view(PyObject* s) { return compat::strView(s); }

// Concatenates pieces into one new str with a single allocation.
template <size_t N>
py::Ref concat(const std::string_view (&parts)[N]) {
    return py::check(compat::strConcat(parts));
}

// Length of the "#<digits>" suffix at the end of `name`, or 0 if it has none.
size_t suffixLength(std::string_view name) {
    size_t digits = 0;
    while (digits < name.size() && name[name.size() - 1 - digits] >= '0' &&
           name[name.size() - 1 - digits] <= '9')
        ++digits;
    if (digits == 0 || digits == name.size() || name[name.size() - 1 - digits] != kSep) return 0;
    return digits + 1;
}

PyObject* JoinTwoScopeNames(PyObject* scope, PyObject* name, int /*skip*/) noexcept {
    return py::guarded([&] {
        requireStr(scope, "scope");
        requireStr(name, "name");
        if (view(scope).empty()) return py::Ref::own(name).release();
        return concat({view(scope), std::string_view(&kDot, 1), view(name)}).release();
    });
}

PyObject* SplitScopeNames(PyObject* full, int /*skip*/) noexcept {
    return py::guarded([&] {
        // Callers rely on the message len() gives, e.g. for None.
        py::checkSize(PyObject_Size(full));
        requireStr(full, "scope name");
        std::string_view text = view(full);
        Py_ssize_t count = 1;
        for (char c : text) count += c == kDot;
        py::Ref parts = py::check(PyList_New(count));
        size_t start = 0;
        for (Py_ssize_t i = 0; i < count; ++i) {
            size_t end = text.find(kDot, start);
            if (end == std::string_view::npos) end = text.size();
            PyObject* part = compat::strFromBytes(text.data() + start,
                                                        static_cast<Py_ssize_t>(end - start));
            if (part == nullptr) py::fail();
            PyList_SET_ITEM(parts.get(), i, part);
            start = end + 1;
        }
        return parts.release();
    });
}

PyObject* SplitScopeNameFromSuffixes(PyObject* name, int /*skip*/) noexcept {
    return py::guarded([&] {
        requireStr(name, "name");
        std::string_view text = view(name);
        size_t suffix = suffixLength(text);
        py::Ref bare, index;
        if (suffix == 0) {
            bare = py::Ref::own(name);
            index = py::check(compat::intFromLong(-1));
        } else {
            size_t bareLength = text.size() - suffix;
            bare = py::check(
                compat::strFromBytes(text.data(), static_cast<Py_ssize_t>(bareLength)));
            // The digits run to the str's terminating NUL; a long suffix gives a long.
            index = py::check(compat::intFromDigits(text.data() + bareLength + 1));
        }
        PyObject* result = PyTuple_New(2);
        if (result == nullptr) py::fail();
        PyTuple_SET_ITEM(result, 0, bare.release());
        PyTuple_SET_ITEM(result, 1, index.release());
        return result;
    });
}

PyObject* AppendScopeSuffixes(PyObject* name, PyObject* index, PyObject* extra,
                              int /*skip*/) noexcept {
    return py::guarded([&] {
        requireStr(name, "name");
        if (extra != Py_None) requireStr(extra, "extra");
        char digits[32];
        py::Ref longText;  // keeps a long's digits alive
        std::string_view indexText;
        long value;
        if (compat::smallIntOf(index, &value)) {
            // Runs once per definition named: formatted by hand.
            unsigned long magnitude = value < 0 ? 0UL - static_cast<unsigned long>(value)
                                                : static_cast<unsigned long>(value);
            char* end = digits + sizeof digits;
            char* p = end;
            do {
                *--p = static_cast<char>('0' + magnitude % 10);
                magnitude /= 10;
            } while (magnitude != 0);
            if (value < 0) *--p = '-';
            indexText = std::string_view(p, static_cast<size_t>(end - p));
        } else if (PyLong_Check(index)) {
            longText = py::check(PyObject_Str(index));
            indexText = view(longText.get());
        } else {
            PyErr_Format(PyExc_TypeError, "index must be an int, not %.200s",
                         Py_TYPE(index)->tp_name);
            py::fail();
        }
        std::string_view extraText = extra == Py_None ? std::string_view() : view(extra);
        return concat({view(name), std::string_view(&kSep, 1), indexText, extraText}).release();
    });
}

// ---------------------------------------------------------------------------
// Python-level functions.

PyObject* pyJoinTwoScopeNames(PyObject*, PyObject* args) {
    PyObject *scope, *name;
    if (!PyArg_ParseTuple(args, "OO:JoinTwoScopeNames", &scope, &name)) return nullptr;
    return JoinTwoScopeNames(scope, name, 0);
}

PyObject* pySplitScopeNames(PyObject*, PyObject* args) {
    PyObject* full;
    if (!PyArg_ParseTuple(args, "O:SplitScopeNames", &full)) return nullptr;
    return SplitScopeNames(full, 0);
}

PyObject* pySplitScopeNameFromSuffixes(PyObject*, PyObject* args) {
    PyObject* name;
    if (!PyArg_ParseTuple(args, "O:SplitScopeNameFromSuffixes", &name)) return nullptr;
    return SplitScopeNameFromSuffixes(name, 0);
}

PyObject* pyAppendScopeSuffixes(PyObject*, PyObject* args) {
    PyObject *name, *index, *extra = Py_None;
    if (!PyArg_ParseTuple(args, "OO|O:AppendScopeSuffixes", &name, &index, &extra))
        return nullptr;
    return AppendScopeSuffixes(name, index, extra, 0);
}

// The bytes of a name for the native forms, which cannot raise: false for
// anything but a str with bytes (UTF-8) to read.
bool nameBytes(PyObject* name, std::string_view* out) noexcept {
    return compat::isStr(name) && compat::tryStrView(name, out);
}

int nativeLeafScopeNameHasIndex(PyObject* name) noexcept {
    std::string_view text;
    return nameBytes(name, &text) && suffixLength(text) != 0;
}

PyObject* LeafScopeNameHasIndex(PyObject*, PyObject* name) {
    return py::Ref::own(nativeLeafScopeNameHasIndex(name) ? Py_True : Py_False).release();
}

Py_ssize_t nativeScopeNameParentLength(PyObject* full) noexcept {
    std::string_view text;
    if (!nameBytes(full, &text)) return -2;
    const size_t dot = text.rfind(kDot);
    return dot == std::string_view::npos ? -1 : static_cast<Py_ssize_t>(dot);
}

Py_ssize_t nativeScopeNameSuffix(PyObject* name, Py_ssize_t* bareLength) noexcept {
    std::string_view text;
    if (!nameBytes(name, &text)) {
        *bareLength = 0;
        return -1;
    }
    const size_t suffix = suffixLength(text);
    *bareLength = static_cast<Py_ssize_t>(text.size() - suffix);
    if (suffix == 0) return -1;
    Py_ssize_t index = 0;
    for (char c : text.substr(text.size() - suffix + 1)) {
        if (index > (PY_SSIZE_T_MAX - 9) / 10) return kSuffixTooLarge;
        index = index * 10 + (c - '0');
    }
    return index;
}

PyMethodDef gModuleMethods[] = {
    {"JoinTwoScopeNames", pyJoinTwoScopeNames, METH_VARARGS,
     "JoinTwoScopeNames(scope, name): name within scope (dotted)."},
    {"SplitScopeNames", pySplitScopeNames, METH_VARARGS,
     "SplitScopeNames(full): the list of dotted parts."},
    {"SplitScopeNameFromSuffixes", pySplitScopeNameFromSuffixes, METH_VARARGS,
     "SplitScopeNameFromSuffixes(name): (bare name, index), index -1 without a suffix."},
    {"AppendScopeSuffixes", pyAppendScopeSuffixes, METH_VARARGS,
     "AppendScopeSuffixes(name, index, extra=None): name#index followed by extra."},
    {"LeafScopeNameHasIndex", LeafScopeNameHasIndex, METH_O,
     "LeafScopeNameHasIndex(name): whether name ends in '#' and digits (False for non-str)."},
    {nullptr, nullptr, 0, nullptr},
};

// ---------------------------------------------------------------------------
// Module frame.

PyTypeObject gCSingleResolvedInfoType = {PyVarObject_HEAD_INIT(nullptr, 0)};
PyTypeObject gCFullyScopedNameType = {PyVarObject_HEAD_INIT(nullptr, 0)};
PyTypeObject gCDefInfoType = {PyVarObject_HEAD_INIT(nullptr, 0)};

struct SingleResolvedInfoVtable {
    void* reserved;
};
SingleResolvedInfoVtable gSingleResolvedInfoVtable = {nullptr};

void publishFunctions(PyObject* capi) {
    JoinTwoScopeNamesFn join = JoinTwoScopeNames;
    SplitScopeNamesFn split = SplitScopeNames;
    SplitScopeNameFromSuffixesFn splitSuffixes = SplitScopeNameFromSuffixes;
    AppendScopeSuffixesFn append = AppendScopeSuffixes;
    siblings::publish(capi, "JoinTwoScopeNames", reinterpret_cast<void*>(join), sig::kJoinTwo);
    siblings::publish(capi, "SplitScopeNames", reinterpret_cast<void*>(split), sig::kSplitOne);
    siblings::publish(capi, "SplitScopeNameFromSuffixes", reinterpret_cast<void*>(splitSuffixes),
                      sig::kSplitOne);
    siblings::publish(capi, "AppendScopeSuffixes", reinterpret_cast<void*>(append),
                      sig::kAppendSuffixes);
    LeafScopeNameHasIndexFn hasIndex = nativeLeafScopeNameHasIndex;
    ScopeNameSuffixFn suffix = nativeScopeNameSuffix;
    siblings::publish(capi, "LeafScopeNameHasIndex", reinterpret_cast<void*>(hasIndex),
                      sig::kLeafScopeNameHasIndex);
    siblings::publish(capi, "ScopeNameSuffix", reinterpret_cast<void*>(suffix), sig::kScopeNameSuffix);
    ScopeNameParentLengthFn parentLength = nativeScopeNameParentLength;
    siblings::publish(capi, "ScopeNameParentLength", reinterpret_cast<void*>(parentLength),
                      sig::kScopeNameParentLength);
}

compat::ModuleDef gModuleDef = SBC_MODULE_DEF("symbolinfo", "Scope-name helpers and symbol kind constants.", gModuleMethods);

// The module, made and filled; on 3.x the reference the init function
// returns.
py::Ref init() {
    py::Ref owner;
    PyObject* module = compat::createModule(gModuleDef, owner);
    PyObject* capi = siblings::makeCapi(module);
    Publisher publisher(module, capi);
    publishConstants(publisher);
    publishFunctions(capi);
    siblings::readyMinimalType(module, "CSingleResolvedInfo", &gCSingleResolvedInfoType,
                               "pysource.symbolinfo.CSingleResolvedInfo",
                               sizeof(contracts::VtabSiblingObject));
    siblings::setVtable(&gCSingleResolvedInfoType, &gSingleResolvedInfoVtable,
                        "CSingleResolvedInfoVtable");
    siblings::readyMinimalType(module, "CFullyScopedName", &gCFullyScopedNameType,
                               "pysource.symbolinfo.CFullyScopedName");
    siblings::readyMinimalType(module, "CDefInfo", &gCDefInfoType,
                               "pysource.symbolinfo.CDefInfo");
    return owner;
}

}  // namespace symbolinfo

SBC_MODULE_INIT(symbolinfo) {
    PyObject* module = py::guarded([] { return symbolinfo::init().release(); });
    return compat::initResult(module);
}
