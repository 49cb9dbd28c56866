// A small ordered table in one block of memory: a client costs 16 bytes here, where a tree
// costs 64.
#pragma once

#include <algorithm>
#include <utility>
#include <vector>

template <typename Key, typename Value>
class SortedTable {
public:
    using Entry = std::pair<Key, Value>;

    /// Adds an entry, or replaces the value of the key.
    void set(Key key, Value value) {
        const auto at = place(key);
        if (at != entries_.end() && at->first == key) {
            at->second = std::move(value);
        } else {
            entries_.insert(at, Entry(std::move(key), std::move(value)));
        }
    }

    /// Returns whether there was such an entry.
    template <typename AnyKey>
    bool erase(const AnyKey& key) {
        const auto at = place(key);
        if (at == entries_.end() || at->first != key) {
            return false;
        }
        // The entry leaves the table before what it holds is released.
        [[maybe_unused]] const Entry released = std::move(*at);
        entries_.erase(at);
        return true;
    }

    /// The value of the key, or a default-made one.
    template <typename AnyKey>
    [[nodiscard]] Value get(const AnyKey& key) const {
        const auto at = std::lower_bound(entries_.begin(), entries_.end(), key, IsBefore());
        return at != entries_.end() && at->first == key ? at->second : Value();
    }

    [[nodiscard]] bool empty() const { return entries_.empty(); }

    [[nodiscard]] std::size_t size() const { return entries_.size(); }

    /// The first entry of a table that is not empty.
    [[nodiscard]] const Entry& front() const { return entries_.front(); }

private:
    struct IsBefore {
        template <typename AnyKey>
        bool operator()(const Entry& entry, const AnyKey& key) const {
            return entry.first < key;
        }
    };

    template <typename AnyKey>
    auto place(const AnyKey& key) {
        return std::lower_bound(entries_.begin(), entries_.end(), key, IsBefore());
    }

    std::vector<Entry> entries_;
};
