// A small ordered table in two blocks of memory, keys and values: an entry costs what the two do,
// without the gap between them that a pair has, or the 48 bytes that a tree adds.
#pragma once

#include <algorithm>
#include <cstddef>
#include <iterator>
#include <memory>
#include <utility>
#include <vector>

template <typename Key, typename Value>
class SortedTable {
public:
    using Entry = std::pair<Key, Value>;

    /// Adds an entry, or replaces the value of the key.
    void set(Key key, Value value) {
        const auto at = place(key);
        if (isAt(at, key)) {
            values_.begin()[at] = std::move(value);
        } else {
            keys_.insert(keys_.begin() + at, std::move(key));
            values_.insert(values_.begin() + at, std::move(value));
        }
    }

    /// Returns whether there was such an entry.
    template <typename AnyKey>
    bool erase(const AnyKey& key) {
        const auto at = place(key);
        if (!isAt(at, key)) {
            return false;
        }
        // The entry leaves the table before what it holds is released.
        [[maybe_unused]] const Entry released(std::move(keys_.begin()[at]),
                                              std::move(values_.begin()[at]));
        keys_.erase(keys_.begin() + at);
        values_.erase(values_.begin() + at);
        return true;
    }

    /// The value of the key, or a default-made one.
    template <typename AnyKey>
    [[nodiscard]] Value get(const AnyKey& key) const {
        const auto at = place(key);
        return isAt(at, key) ? values_.begin()[at] : Value();
    }

    [[nodiscard]] bool empty() const { return keys_.empty(); }

    [[nodiscard]] std::size_t size() const { return keys_.size(); }

    /// The first entry of a table that is not empty.
    [[nodiscard]] Entry front() const { return {keys_.front(), values_.front()}; }

private:
    /// An object is found by its address alone, too.
    template <typename Object>
    static const Object* Comparable(const std::shared_ptr<Object>& key) {
        return key.get();
    }

    template <typename AnyKey>
    static const AnyKey& Comparable(const AnyKey& key) {
        return key;
    }

    /// Where the key is, or would be.
    template <typename AnyKey>
    [[nodiscard]] std::ptrdiff_t place(const AnyKey& key) const {
        const auto isBefore = [](const Key& entry, const AnyKey& wanted) {
            return Comparable(entry) < Comparable(wanted);
        };
        return std::lower_bound(keys_.begin(), keys_.end(), key, isBefore) - keys_.begin();
    }

    template <typename AnyKey>
    [[nodiscard]] bool isAt(std::ptrdiff_t at, const AnyKey& key) const {
        return at != std::ssize(keys_) && Comparable(keys_.begin()[at]) == Comparable(key);
    }

    std::vector<Key> keys_;
    std::vector<Value> values_;  // in the order of their keys
};
