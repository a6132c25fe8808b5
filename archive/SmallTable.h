#pragma once

/// @file
/// Tables that mostly have few keys.

#include <algorithm>
#include <cstddef>
#include <unordered_map>
#include <utility>
#include <vector>

namespace KivArchive {

/// Keys with a value each. Few of them take one piece of memory, and are compared one by one.
template <class Key, class Value>
class SmallTable {
public:
    /// Null if it is not there. Valid until the next `Add`.
    [[nodiscard]] Value const* Find(Key const& key) const {
        if (!many_.empty()) {
            auto const found = many_.find(key);
            return found == many_.end() ? nullptr : &found->second;
        }
        auto const found = std::find_if(few_.begin(), few_.end(), [&key](auto const& one) { return one.first == key; });
        return found == few_.end() ? nullptr : &found->second;
    }
    [[nodiscard]] Value* Find(Key const& key) { return const_cast<Value*>(std::as_const(*this).Find(key)); }
    [[nodiscard]] bool Contains(Key const& key) const { return Find(key) != nullptr; }

    /// @return false, changing nothing, if it is there
    bool Add(Key const& key, Value value) {
        if (few_.size() == mostFew) {
            std::unordered_map<Key, Value> all(few_.begin(), few_.end());
            many_ = std::move(all);
            few_.clear();
        }
        if (!many_.empty())
            return many_.emplace(key, std::move(value)).second;
        if (Contains(key))
            return false;
        if (few_.empty())
            few_.reserve(usual);
        few_.emplace_back(key, std::move(value));
        return true;
    }

    [[nodiscard]] std::size_t Count() const noexcept { return many_.empty() ? few_.size() : many_.size(); }

    void Clear() noexcept {
        few_.clear();
        many_.clear();
    }

private:
    static constexpr std::size_t usual = 8;
    static constexpr std::size_t mostFew = 16;

    std::vector<std::pair<Key, Value>> few_;
    /// All of them, once they are more.
    std::unordered_map<Key, Value> many_;
};

/// Keys only.
template <class Key>
class SmallSet {
public:
    [[nodiscard]] bool Contains(Key const& key) const { return keys_.Contains(key); }
    /// @return false if it is there
    bool Add(Key const& key) { return keys_.Add(key, {}); }
    void Clear() noexcept { keys_.Clear(); }

private:
    struct Nothing {};
    SmallTable<Key, Nothing> keys_;
};

} // namespace KivArchive
