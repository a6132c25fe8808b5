#pragma once

#include "KivVcs/Id.h"

#include <memory>

namespace KivVcs {

class Commit;
class CommitTree;
class Tree;

namespace detail {

/// What a commit knows how to fetch instead of holding it: its parent, its root, both or neither. As large as a pointer,
/// which is null while nothing is deferred.
///
/// Threads: the `const` operations may run concurrently. Everything else needs exclusive use.
class DeferredLinks {
public:
    using FetchParent = Delegate<cow_ptr<Commit>(Id const&)>;
    using FetchRoot = Delegate<cow_ptr<Tree>(Id const&)>;

    DeferredLinks() noexcept = default;
    /// What has been fetched is shared, what has not stays deferred for both.
    DeferredLinks(DeferredLinks const& other);
    DeferredLinks(DeferredLinks&& other) noexcept = default;
    DeferredLinks& operator=(DeferredLinks const& other);
    DeferredLinks& operator=(DeferredLinks&& other) noexcept = default;
    ~DeferredLinks() = default;

    /// Whether anything may be deferred.
    explicit operator bool() const noexcept { return links_ != nullptr; }

    void SetParent(Id const& id, FetchParent fetch);
    void SetRoot(Id const& id, FetchRoot fetch);
    void CopyParent(DeferredLinks const& other);
    void CopyRoot(DeferredLinks const& other);
    void ClearParent() noexcept;
    void ClearRoot() noexcept;

    /// The identifier of what is deferred; null if nothing is. The reference is valid until the link is changed.
    [[nodiscard]] Id const* ParentId() const noexcept;
    [[nodiscard]] Id const* RootId() const noexcept;
    /// What has been fetched; null if nothing has, or nothing is deferred.
    [[nodiscard]] cow_ptr<Commit> const* HeldParent() const noexcept;
    [[nodiscard]] cow_ptr<CommitTree> const* HeldRoot() const noexcept;
    /// What is deferred, fetched unless it has been already; null if nothing is deferred.
    [[nodiscard]] cow_ptr<Commit> const* Parent() const;
    [[nodiscard]] cow_ptr<CommitTree> const* Root() const;

private:
    struct Links;
    /// Apart, so that a commit that defers nothing dies without a call.
    struct Destroy {
        void operator()(Links* links) const noexcept;
    };

    Links& Writable();

    std::unique_ptr<Links, Destroy> links_;
};

} // namespace detail

} // namespace KivVcs
