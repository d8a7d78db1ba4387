#include "pysource/scopebodycache/def_index.hpp"

#include "pysource/contracts/accessors.hpp"
#include "pysource/scopebodycache/siblings.hpp"

#include <algorithm>
#include <cstring>
#include <unordered_map>

namespace sbc {

using namespace contracts;

namespace {

bool sameStr(PyObject* a, PyObject* b) noexcept {
    return a == b || compat::strViewOrEmpty(a) == compat::strViewOrEmpty(b);
}

bool sameBytes(PyObject* s, std::string_view bytes) noexcept { return compat::strViewOrEmpty(s) == bytes; }

struct LaterFirst {
    bool operator()(const DefIndex::Candidate& a, const DefIndex::Candidate& b) const noexcept {
        return a.at > b.at;
    }
};

}  // namespace

bool readDefinedName(PyObject* logical, DefinedName* out) {
    PyObject* name = localScopeDefined(asLogical(logical));
    if (name == nullptr) return false;
    out->name = name;
    out->index = gNative.scopeNameSuffix(name, &out->bareLength);
    return true;
}

py::Ref bareNameOf(PyObject* logical, const DefinedName& name) {
    const std::string_view whole = compat::strView(name.name);
    if (name.bareLength == static_cast<Py_ssize_t>(whole.size())) return py::Ref::own(name.name);
    PyObject* token = definedToken(asLogical(logical));
    if (token != nullptr && compat::isStrExact(token) && sameBytes(token, name.bare())) return py::Ref::own(token);
    return py::check(compat::strFromBytes(whole.data(), name.bareLength));
}

namespace {

// The stamps of the lists that have an index, by list. An index holds its
// list, so no other list can take the address while the stamp is in use.
std::unordered_map<const PyObject*, ListStamp>& stamps() {
    static auto* map = new std::unordered_map<const PyObject*, ListStamp>();  // never freed: used at exit
    return *map;
}

uint64_t gStrayWrites = 0;

}  // namespace

void noteNamesWritten(PyObject* list) noexcept {
    auto& map = stamps();
    if (map.empty()) return;
    auto found = map.find(list);
    if (found != map.end()) ++found->second.writes;
}

void noteStrayNamesWritten() noexcept { ++gStrayWrites; }

DefIndex::DefIndex(PyObject* list) : list_(py::Ref::own(list)), slots_(16, nullptr) {
    stamp_ = &stamps()[list];  // node-based: the address stays
    ++stamp_->indexes;
    seenWrites_ = stamp_->writes;
    seenStrayWrites_ = gStrayWrites;
}

DefIndex::~DefIndex() {
    clear();
    flushReleases();
    if (--stamp_->indexes == 0) stamps().erase(list_.get());
}

bool DefIndex::current() const noexcept {
    return stamp_->writes == seenWrites_ && gStrayWrites == seenStrayWrites_;
}

void DefIndex::noteOwnWrites() noexcept {
    seenWrites_ = ++stamp_->writes;
    seenStrayWrites_ = gStrayWrites;
}

void DefIndex::clear() {
    for (Group*& g : slots_) {
        if (g == nullptr) continue;
        for (Member& m : g->members) released_.push_back(m.def);
        g = nullptr;
    }
    pool_.clear();
    free_.clear();
    used_ = 0;
    groupOf_.clear();
    groupOfBuilt_ = false;
    for (Candidate& c : candidates_) released_.push_back(c.def.release());
    candidates_.clear();
}

void DefIndex::flushReleases() noexcept {
    std::vector<PyObject*> pending;
    pending.swap(released_);
    for (PyObject* o : pending) Py_DECREF(o);
}

size_t DefIndex::hashOf(PyObject* scope, std::string_view bare) {
    // A str caches its hash, so the scope part costs nothing after the
    // first time; bare names are short.
    size_t h = static_cast<size_t>(PyObject_Hash(scope)) * 0x9E3779B97F4A7C15ull;
    for (char c : bare) h = (h ^ static_cast<unsigned char>(c)) * 0x100000001B3ull;
    return h;
}

DefIndex::Group* DefIndex::find(PyObject* scope, std::string_view bare, size_t hash) const {
    const size_t mask = slots_.size() - 1;
    for (size_t i = hash & mask;; i = (i + 1) & mask) {
        Group* g = slots_[i];
        if (g == nullptr) return nullptr;
        if (g->hash == hash && sameStr(g->scope.get(), scope) && g->bare() == bare) return g;
    }
}

void DefIndex::grow() {
    std::vector<Group*> old(slots_.size() * 2, nullptr);
    old.swap(slots_);
    const size_t mask = slots_.size() - 1;
    for (Group* g : old) {
        if (g == nullptr) continue;
        size_t i = g->hash & mask;
        while (slots_[i] != nullptr) i = (i + 1) & mask;
        slots_[i] = g;
    }
}

DefIndex::Group& DefIndex::findOrAdd(PyObject* scope, const DefinedName& name, size_t hash) {
    if (Group* g = find(scope, name.bare(), hash)) return *g;
    if ((used_ + 1) * 2 > slots_.size()) grow();
    Group* g;
    if (!free_.empty()) {
        g = free_.back();
        free_.pop_back();
    } else {
        g = &pool_.emplace_back();
    }
    g->scope = py::Ref::own(scope);
    g->bareSource = py::Ref::own(name.name);
    g->bareLength = name.bareLength;
    g->hash = hash;
    const size_t mask = slots_.size() - 1;
    size_t i = hash & mask;
    while (slots_[i] != nullptr) i = (i + 1) & mask;
    slots_[i] = g;
    ++used_;
    return *g;
}

void DefIndex::erase(Group* group) {
    // Backward-shift deletion keeps every probe chain unbroken.
    const size_t mask = slots_.size() - 1;
    size_t i = group->hash & mask;
    while (slots_[i] != group) i = (i + 1) & mask;
    slots_[i] = nullptr;
    for (size_t j = (i + 1) & mask; slots_[j] != nullptr; j = (j + 1) & mask) {
        const size_t home = slots_[j]->hash & mask;
        const bool stays = i <= j ? (i < home && home <= j) : (i < home || home <= j);
        if (stays) continue;
        slots_[i] = slots_[j];
        slots_[j] = nullptr;
        i = j;
    }
    --used_;
    group->scope.reset();
    group->bareSource.reset();
    group->members.clear();
    free_.push_back(group);
}

Py_ssize_t DefIndex::listIndexOf(PyObject* def, Py_ssize_t hint) {
    PyObject* list = list_.get();
    const Py_ssize_t n = PyList_GET_SIZE(list);
    if (hint >= 0 && hint < n && PyList_GET_ITEM(list, hint) == def) return hint;
    // An edit above moves every later member by as much as it moved the
    // last one looked for.
    const Py_ssize_t shifted = hint + lastShift_;
    if (hint >= 0 && shifted >= 0 && shifted < n && PyList_GET_ITEM(list, shifted) == def) return shifted;
    // Else each is found by its line number (the list is in line order) in
    // log n, where a search from the top cost the file's length for each of
    // a name's many definitions.
    const int32_t lineno = asLogical(def)->fLineno;
    Py_ssize_t j = gNative.indexForLineno != nullptr ? gNative.indexForLineno(list, lineno) : -1;
    if (j < 0) PyErr_Clear();
    for (; j >= 0 && j < n; ++j) {
        PyObject* item = PyList_GET_ITEM(list, j);
        if (item == def) {
            if (hint >= 0) lastShift_ = j - hint;
            return j;
        }
        if (!logicalCheck(item) || asLogical(item)->fLineno != lineno) break;
    }
    // Out of line order (a caller's mistake): the search from the top.
    const Py_ssize_t found = gNative.findIndexOfLogical(list, def);
    if (found < 0) {
        PyErr_Clear();
        return -1;
    }
    return found;
}

Py_ssize_t DefIndex::indexOf(Member& member) {
    const Py_ssize_t found = listIndexOf(member.def, member.at);
    if (found >= 0) member.at = found;
    return found;
}

Py_ssize_t DefIndex::lowerBound(Group& group, Py_ssize_t at) {
    size_t lo = 0;
    size_t hi = group.members.size();
    // A group out of list order means the list was rearranged without the
    // finder being told: the index no longer matches it. Small groups (all
    // but a few) are checked whole on each use.
    if (hi <= 8) {
        Py_ssize_t previous = -1;
        for (Member& m : group.members) {
            const Py_ssize_t i = indexOf(m);
            if (i <= previous) return -1;
            previous = i;
        }
    }
    while (lo < hi) {
        const size_t mid = lo + (hi - lo) / 2;
        const Py_ssize_t i = indexOf(group.members[mid]);
        if (i < 0) return -1;
        if (i < at) {
            lo = mid + 1;
        } else {
            hi = mid;
        }
    }
    return static_cast<Py_ssize_t>(lo);
}

void DefIndex::queueFrom(Group& group, size_t position) {
    for (size_t k = position; k < group.members.size(); ++k) {
        Member& m = group.members[k];
        const Py_ssize_t at = indexOf(m);
        if (at < 0) continue;  // found missing when popped, through positionOf
        candidates_.push_back({at, py::Ref::own(m.def)});
        std::push_heap(candidates_.begin(), candidates_.end(), LaterFirst());
    }
}

Py_ssize_t DefIndex::append(PyObject* def, Py_ssize_t at, PyObject* scope, const DefinedName& name) {
    if (groupOfBuilt_ && groupOf_.find(def) != nullptr) remove(def);
    Group& group = findOrAdd(scope, name, hashOf(scope, name.bare()));
    Py_INCREF(def);
    group.members.push_back({def, at});
    if (groupOfBuilt_) groupOf_.set(def, &group);
    return static_cast<Py_ssize_t>(group.members.size()) - 1;
}

bool DefIndex::rebuild() {
    clear();
    PyObject* list = list_.get();
    for (Py_ssize_t j = 0; j < PyList_GET_SIZE(list); ++j) {
        PyObject* item = PyList_GET_ITEM(list, j);
        if (!logicalCheck(item)) return false;  // the table walk says where
        if (!isScopeStart(asLogical(item))) continue;
        PyObject* scope = scopeName(asLogical(item));
        DefinedName name;
        // Not named yet (added in this call): filed when it is visited.
        if (scope == Py_None || !readDefinedName(item, &name)) continue;
        if (!compat::isStrExact(scope) || !compat::isStrExact(name.name)) return false;
        append(item, j, scope, name);
    }
    // A stored index that is not the position is repaired when the pass
    // comes to it, as the table walk would.
    for (Group* g : slots_) {
        if (g == nullptr) continue;
        for (size_t k = 0; k < g->members.size(); ++k) {
            DefinedName name;
            readDefinedName(g->members[k].def, &name);
            if (name.index != static_cast<Py_ssize_t>(k)) {
                queueFrom(*g, k);
                break;
            }
        }
    }
    return true;
}

void DefIndex::ensureGroupOf() {
    if (groupOfBuilt_) return;
    groupOf_.clear();
    for (Group* g : slots_) {
        if (g == nullptr) continue;
        for (const Member& m : g->members) groupOf_.set(m.def, g);
    }
    groupOfBuilt_ = true;
}

size_t DefIndex::memberCount() const {
    size_t count = 0;
    for (const Group* g : slots_) {
        if (g != nullptr) count += g->members.size();
    }
    return count;
}

void DefIndex::remove(PyObject* def) {
    ensureGroupOf();
    Group** found = groupOf_.find(def);
    if (found == nullptr) return;
    Group* group = *found;
    groupOf_.erase(def);
    auto& members = group->members;
    const auto pos = std::find_if(members.begin(), members.end(), [&](const Member& m) { return m.def == def; });
    const size_t position = static_cast<size_t>(pos - members.begin());
    members.erase(position);
    released_.push_back(def);
    if (members.empty()) {
        erase(group);
    } else {
        queueFrom(*group, position);
    }
}

bool DefIndex::place(PyObject* def, Py_ssize_t at) {
    remove(def);
    PyObject* scope = scopeName(asLogical(def));
    DefinedName name;
    if (scope == Py_None || !readDefinedName(def, &name)) return true;
    if (!compat::isStrExact(scope) || !compat::isStrExact(name.name)) return false;
    Group& group = findOrAdd(scope, name, hashOf(scope, name.bare()));
    const Py_ssize_t position = lowerBound(group, at);
    if (position < 0) {
        if (group.members.empty()) erase(&group);
        return false;
    }
    Py_INCREF(def);
    group.members.insert(static_cast<size_t>(position), Member{def, at});
    groupOf_.set(def, &group);  // remove() above made the map
    queueFrom(group, static_cast<size_t>(position));
    return true;
}

Py_ssize_t DefIndex::countBefore(PyObject* scope, const DefinedName& name, Py_ssize_t at) {
    if (!compat::isStrExact(scope) || !compat::isStrExact(name.name)) return -1;
    Group* group = find(scope, name.bare(), hashOf(scope, name.bare()));
    return group == nullptr ? 0 : lowerBound(*group, at);
}

Py_ssize_t DefIndex::positionOf(PyObject* def, Py_ssize_t hint) {
    ensureGroupOf();
    Group** found = groupOf_.find(def);
    if (found == nullptr) return -1;
    Group& group = **found;
    auto& members = group.members;
    if (members.size() > 8) {
        // Members are in list order: a binary search, not a walk over a
        // name's many definitions for each one renumbered.
        const Py_ssize_t at = listIndexOf(def, hint);
        const Py_ssize_t k = at < 0 ? -1 : lowerBound(group, at);
        if (k < 0 || static_cast<size_t>(k) >= members.size() || members[k].def != def) return -1;
        members[k].at = at;
        return k;
    }
    for (size_t k = 0; k < members.size(); ++k) {
        if (members[k].def == def) return indexOf(members[k]) < 0 ? -1 : static_cast<Py_ssize_t>(k);
    }
    return -1;
}

bool DefIndex::popCandidate(Py_ssize_t end, Candidate* out) {
    if (candidates_.empty() || candidates_.front().at >= end) return false;
    std::pop_heap(candidates_.begin(), candidates_.end(), LaterFirst());
    *out = std::move(candidates_.back());
    candidates_.pop_back();
    return true;
}

int DefIndex::traverse(visitproc visit, void* arg) const {
    Py_VISIT(list_.get());
    for (const Group* g : slots_) {
        if (g == nullptr) continue;
        for (const Member& m : g->members) Py_VISIT(m.def);
    }
    for (const Candidate& c : candidates_) Py_VISIT(c.def.get());
    for (PyObject* o : released_) Py_VISIT(o);
    return 0;
}

bool DefIndex::matchesList(std::string* why) {
    DefIndex fresh(list_.get());
    if (!fresh.rebuild()) {
        *why = "the list holds names that cannot be indexed";
        return false;
    }
    if (fresh.memberCount() != memberCount()) {
        *why = "the index holds " + std::to_string(memberCount()) + " definitions, the list " +
               std::to_string(fresh.memberCount());
        return false;
    }
    for (Group* g : fresh.slots_) {
        if (g == nullptr) continue;
        Group* mine = find(g->scope.get(), g->bare(), g->hash);
        const std::string key = std::string(compat::strViewOrEmpty(g->scope.get())) + " / " + std::string(g->bare());
        if (mine == nullptr || mine->members.size() != g->members.size()) {
            *why = "the group " + key + " differs";
            return false;
        }
        for (size_t k = 0; k < g->members.size(); ++k) {
            DefinedName name;
            readDefinedName(g->members[k].def, &name);
            if (mine->members[k].def != g->members[k].def || name.index != static_cast<Py_ssize_t>(k)) {
                *why = "member " + std::to_string(k) + " of " + key + " differs";
                return false;
            }
        }
    }
    return true;
}

}  // namespace sbc
