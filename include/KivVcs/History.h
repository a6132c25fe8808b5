#pragma once

/// @file
/// The history of a commit as a range, and what each commit changed.

#include "KivVcs/Commit.h"
#include "KivVcs/Differences.h"

#include <cstddef>
#include <cstdint>
#include <iterator>
#include <limits>

namespace KivVcs {

/// A commit and its ancestors, newest first:
///
///     for (auto const& commit : History(repository.GetHead()).Changing(u"docs").First(10))
///
/// Parents are asked for as the walk goes on, so that only commits that it reaches are fetched, and none is held once
/// the walk has passed it: a history may have any length. Null is a history without commits.
///
/// Threads: a value. A walk reads commits as their `const` operations do.
class KIVVCS_EXPORT History {
public:
    class Iterator;

    explicit History(cow_ptr<Commit> head) noexcept : head_(std::move(head)) {}

    /// Only the commits in which @p path differs from their parent: a file or directory was added, was removed or has
    /// another identifier. A root commit adds all that it holds. The path without components is the whole tree.
    [[nodiscard]] History Changing(KivStringViewT<char16_t> path) const;

    /// At most the @p count newest of these commits.
    [[nodiscard]] History First(std::uint64_t count) const;

    /// @throws what asking commits for parents, trees and identifiers throws; so does every step of the iterator
    [[nodiscard]] Iterator begin() const;
    [[nodiscard]] Iterator end() const noexcept;

private:
    cow_ptr<Commit> head_;
    optional<KivStringT<char16_t>> path_;
    std::uint64_t count_ = std::numeric_limits<std::uint64_t>::max();
};

/// A position in a history. An input iterator: the commit that it shows is its own, and may be kept by copying the
/// pointer.
class KIVVCS_EXPORT History::Iterator {
public:
    using iterator_category = std::input_iterator_tag;
    using value_type = cow_ptr<Commit>;
    using difference_type = std::ptrdiff_t;
    using pointer = cow_ptr<Commit> const*;
    using reference = cow_ptr<Commit> const&;

    /// The end of every history.
    Iterator() noexcept = default;

    [[nodiscard]] reference operator*() const noexcept { return commit_; }
    [[nodiscard]] pointer operator->() const noexcept { return &commit_; }
    Iterator& operator++();
    // NOLINTNEXTLINE(cert-dcl21-cpp): as iterators of the standard do
    Iterator operator++(int) {
        Iterator before = *this;
        ++*this;
        return before;
    }

    /// Whether both show the same object, or are at an end.
    friend bool operator==(Iterator const& left, Iterator const& right) noexcept {
        return left.commit_ == right.commit_;
    }

private:
    friend class History;

    Iterator(cow_ptr<Commit> head, optional<KivStringT<char16_t>> path, std::uint64_t count);

    cow_ptr<Commit> commit_;
    optional<KivStringT<char16_t>> path_;
    std::uint64_t left_ = 0;
};

/// What a commit changed of its parent's files; all that it has if it has no parent.
[[nodiscard]] KIVVCS_EXPORT Differences DifferencesFromParent(Commit const& commit,
                                                              DifferenceOptions const& options = {});

} // namespace KivVcs
