// The definition index: the class/def logicals of one logical list, grouped
// by definition key (containing scope name, defined name without its scope
// index), each group in list order. A definition's scope index is its
// position in its group.
//
// It is what the scopes-seen table is for the whole list, kept from one
// FindChanges call to the next: the whole-list pass builds it, the
// incremental pass keeps it in step with every name it stores, and adding
// or removing a definition then renumbers only the later definitions of the
// same key (queued as candidates, repaired in list order) instead of
// recounting the list from the top. It mirrors the names stored in the
// logicals and nothing else, so it can always be rebuilt from them.
//
// Only the finder's native pass uses it; it is never pickled. It is
// dropped whenever it cannot be shown to match the list (see finder.hpp).
#pragma once

#include "common/pycompat.hpp"
#include "common/pyref.hpp"
#include "common/small_vector.hpp"

#include <cstdint>
#include <deque>

#include <memory>
#include <string_view>
#include <vector>

namespace sbc {

// Pointer keys to values, open addressing: the index files every
// definition of a file here, and a node allocation per entry would cost
// more than the rest of filing it.
template <class V>
class PointerMap {
public:
    // No slots until the first key: most indexes never need one.
    size_t size() const noexcept { return used_; }
    void clear() {
        std::vector<Slot>().swap(slots_);
        used_ = 0;
    }
    V* find(const void* key) noexcept {
        if (slots_.empty()) return nullptr;
        const size_t mask = slots_.size() - 1;
        for (size_t i = home(key, mask);; i = (i + 1) & mask) {
            if (slots_[i].key == key) return &slots_[i].value;
            if (slots_[i].key == nullptr) return nullptr;
        }
    }
    void set(const void* key, V value) {
        if (V* v = find(key)) {
            *v = value;
            return;
        }
        if ((used_ + 1) * 2 > slots_.size()) grow();
        place(key, value);
        ++used_;
    }
    bool erase(const void* key) noexcept {
        if (slots_.empty()) return false;
        const size_t mask = slots_.size() - 1;
        size_t i = home(key, mask);
        while (slots_[i].key != key) {
            if (slots_[i].key == nullptr) return false;
            i = (i + 1) & mask;
        }
        slots_[i] = Slot();
        // Backward shift keeps every probe chain unbroken.
        for (size_t j = (i + 1) & mask; slots_[j].key != nullptr; j = (j + 1) & mask) {
            const size_t h = home(slots_[j].key, mask);
            const bool stays = i <= j ? (i < h && h <= j) : (i < h || h <= j);
            if (stays) continue;
            slots_[i] = slots_[j];
            slots_[j] = Slot();
            i = j;
        }
        --used_;
        return true;
    }
    template <class F>
    void forEach(F&& f) const {
        for (const Slot& s : slots_) {
            if (s.key != nullptr) f(s.key, s.value);
        }
    }

private:
    struct Slot {
        const void* key = nullptr;
        V value{};
    };
    static size_t home(const void* key, size_t mask) noexcept {
        return (reinterpret_cast<uintptr_t>(key) >> 4) * 0x9E3779B97F4A7C15ull >> 32 & mask;
    }
    void place(const void* key, V value) noexcept {
        const size_t mask = slots_.size() - 1;
        size_t i = home(key, mask);
        while (slots_[i].key != nullptr) i = (i + 1) & mask;
        slots_[i] = Slot{key, value};
    }
    void grow() {
        std::vector<Slot> old(slots_.empty() ? 16 : slots_.size() * 2);
        old.swap(slots_);
        for (const Slot& s : old) {
            if (s.key != nullptr) place(s.key, s.value);
        }
    }
    std::vector<Slot> slots_;
    size_t used_ = 0;
};

// A defined name as the symbol-info component reads it: the name object,
// the length of its part without a scope index, and the index (-1: none;
// contracts::kSuffixTooLarge: one no count can reach).
struct DefinedName {
    PyObject* name = nullptr;  // borrowed
    Py_ssize_t bareLength = 0;
    Py_ssize_t index = -1;
    std::string_view bare() const noexcept {
        return compat::strViewOrEmpty(name).substr(0, static_cast<size_t>(bareLength));
    }
};

// Name writes, by logical list. Every finder of a list writes the names of
// the same logicals, and a definition index mirrors those names only while
// nothing else writes them: each list that has an index gets a stamp that
// every writer advances (a FindChanges of any finder of the list, a step
// called directly), and an index is trusted only while the stamp is the one
// it last saw. Names written where the list cannot be told (a logical's
// local name set through the module function) advance every stamp at once.
struct ListStamp {
    uint64_t writes = 0;
    size_t indexes = 0;  // the indexes of the list that hold this stamp
};
// Someone is about to write names of `list`'s logicals: every index of the
// list goes stale. Cheap when no index exists anywhere.
void noteNamesWritten(PyObject* list) noexcept;
// Names were written in a logical of a list unknown: every index goes stale.
void noteStrayNamesWritten() noexcept;

class DefIndex {
public:
    // A definition whose stored index may no longer be its position.
    struct Candidate {
        Py_ssize_t at;  // list index
        py::Ref def;
    };

    explicit DefIndex(PyObject* list);
    ~DefIndex();
    DefIndex(const DefIndex&) = delete;
    DefIndex& operator=(const DefIndex&) = delete;

    PyObject* list() const noexcept { return list_.get(); }
    Py_ssize_t definitionCount() const { return static_cast<Py_ssize_t>(memberCount()); }

    // Files `def` (at list index `at`) last in the group of its key and
    // returns its position there: the whole-list pass counts this way.
    Py_ssize_t append(PyObject* def, Py_ssize_t at, PyObject* scope, const DefinedName& name);

    // Files every named definition of the list under its stored names and
    // queues those whose stored index is not their position. False when a
    // stored name cannot be indexed (not a str): the caller falls back to
    // the table walk.
    bool rebuild();

    // Takes `def` out of its group, queueing the definitions after it.
    void remove(PyObject* def);

    // Files `def` (at list index `at`) under the names it now stores,
    // queueing it and the definitions after it in its old and new groups.
    // False when its names cannot be indexed.
    bool place(PyObject* def, Py_ssize_t at);

    // How many definitions of the key stand before list index `at`: the
    // scope index of a definition there. -1 when the index no longer
    // matches the list (a member is not where it can be found).
    Py_ssize_t countBefore(PyObject* scope, const DefinedName& name, Py_ssize_t at);

    // The position of a member in its group, or -1; `hint` is where in the
    // list it stood when last seen.
    Py_ssize_t positionOf(PyObject* def, Py_ssize_t hint = -1);

    // Pops the queued candidate with the lowest list index below `end`.
    bool popCandidate(Py_ssize_t end, Candidate* out);
    bool hasCandidates() const noexcept { return !candidates_.empty(); }

    // The list length when the last call ended, for the check at the next.
    Py_ssize_t recordedLength = -1;

    // Whether no one but its finder has written names of the list since it
    // last looked (see ListStamp), and its finder's own writes: the finder
    // notes them, then looks again.
    bool current() const noexcept;
    void noteOwnWrites() noexcept;

    // Drops the references to definitions taken out during the call. Their
    // release can run Python code (a logical's last reference, a name's
    // finalizer), so it waits until the index is not in use.
    void flushReleases() noexcept;

    // For the garbage collector: every reference the index holds.
    int traverse(visitproc visit, void* arg) const;

    // Whether the groups equal those `rebuild` would make now, each member
    // at the index its name carries (the self-check).
    bool matchesList(std::string* why);

private:
    struct Member {
        PyObject* def;   // owned
        Py_ssize_t at;   // its list index when last seen (checked before use)
    };
    struct Group {
        py::Ref scope;
        py::Ref bareSource;  // a defined name whose first bareLength bytes are the key
        Py_ssize_t bareLength = 0;
        size_t hash = 0;
        SmallVector<Member, 2> members;  // most keys have one definition
        std::string_view bare() const noexcept {
            return compat::strViewOrEmpty(bareSource.get()).substr(0, static_cast<size_t>(bareLength));
        }
    };

    size_t hashOf(PyObject* scope, std::string_view bare);
    Group* find(PyObject* scope, std::string_view bare, size_t hash) const;
    Group& findOrAdd(PyObject* scope, const DefinedName& name, size_t hash);
    void erase(Group* group);
    void grow();
    Py_ssize_t indexOf(Member& member);  // the member's list index, or -1
    Py_ssize_t listIndexOf(PyObject* def, Py_ssize_t hint);
    Py_ssize_t lastShift_ = 0;  // how far the last member found had moved
    Py_ssize_t lowerBound(Group& group, Py_ssize_t at);  // first member not before `at`
    void queueFrom(Group& group, size_t position);
    void clear();

    py::Ref list_;
    ListStamp* stamp_;  // the list's, shared with its other indexes
    uint64_t seenWrites_ = 0;
    uint64_t seenStrayWrites_ = 0;
    std::vector<Group*> slots_;  // open addressing, linear probing, into pool_
    std::deque<Group> pool_;      // never moves a group; freed ones are reused
    std::vector<Group*> free_;
    size_t used_ = 0;
    // Each member's group, made when first needed: a file that is read and
    // not edited never needs it.
    PointerMap<Group*> groupOf_;
    bool groupOfBuilt_ = false;
    void ensureGroupOf();
    size_t memberCount() const;
    std::vector<Candidate> candidates_;  // a min-heap on `at`
    std::vector<PyObject*> released_;    // owned, dropped by flushReleases
};

// The defined name of a class/def logical (fLocalScopeName, else its name
// token), read through the symbol-info native entry; false when it has none.
bool readDefinedName(PyObject* logical, DefinedName* out);

// The defined name without its scope index, as a str: the name itself, or
// the logical's name token when that is it (the usual case), else a new str.
py::Ref bareNameOf(PyObject* logical, const DefinedName& name);

}  // namespace sbc
