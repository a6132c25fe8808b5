#pragma once

#include "KivVcs/Commit.h"

#include <cstddef>
#include <iterator>

namespace KivVcs {

/// Goes from a commit to its parent, and on. A parent that is deferred is fetched, which may throw. Each commit holds
/// its parent, so that the first one keeps alive what is visited.
class AncestorIterator {
public:
    using value_type = Commit;
    using difference_type = std::ptrdiff_t;

    AncestorIterator() noexcept = default;
    explicit AncestorIterator(Commit const* commit) noexcept : commit_(commit) {}

    Commit const& operator*() const noexcept { return *commit_; }
    Commit const* operator->() const noexcept { return commit_; }
    /// The commit, or null beyond the root.
    [[nodiscard]] Commit const* Get() const noexcept { return commit_; }
    explicit operator bool() const noexcept { return commit_ != nullptr; }

    AncestorIterator& operator++() {
        commit_ = commit_->Parent();
        return *this;
    }
    // NOLINTNEXTLINE(cert-dcl21-cpp): as iterators of the standard do
    AncestorIterator operator++(int) {
        AncestorIterator before = *this;
        ++*this;
        return before;
    }

    bool operator==(AncestorIterator const& other) const noexcept = default;

private:
    Commit const* commit_ = nullptr;
};

/// A commit and its ancestors, newest first, down to but without @p until; down to the root if @p until is null or no
/// ancestor. For range-based loops.
class Ancestors {
public:
    explicit Ancestors(Commit const* newest, Commit const* until = nullptr) noexcept : newest_(newest), until_(until) {}

    /// The end of the range: the commit it stops before, or the end of the history.
    class End {
    public:
        explicit End(Commit const* until) noexcept : until_(until) {}
        friend bool operator==(AncestorIterator const& position, End const& end) noexcept {
            return position.Get() == nullptr || position.Get() == end.until_;
        }

    private:
        Commit const* until_;
    };

    [[nodiscard]] AncestorIterator begin() const noexcept { return AncestorIterator(newest_); }
    [[nodiscard]] End end() const noexcept { return End(until_); }

private:
    Commit const* newest_;
    Commit const* until_;
};

} // namespace KivVcs
