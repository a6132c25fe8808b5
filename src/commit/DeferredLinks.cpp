#include "KivVcs/detail/DeferredLinks.h"

#include "KivVcs/Commit.h"
#include "KivVcs/detail/PublishedWord.h"

#include <stdexcept>

namespace KivVcs::detail {

namespace {

cow_ptr<Commit> HoldFetched(cow_ptr<Commit> commit) {
    return commit;
}

cow_ptr<CommitTree> HoldFetched(cow_ptr<Tree> root) {
    return immu::make<CommitTree>(std::move(root));
}

/// An identifier, the function that fetches the object with that identifier, and what holds the object once it has been
/// fetched. A link with the null identifier is unset.
template <class Holder, class Fetched>
class DeferredLink {
public:
    using Fetch = Delegate<cow_ptr<Fetched>(Id const&)>;

    DeferredLink() noexcept = default;
    DeferredLink(Id id, Fetch fetch) noexcept : id_(std::move(id)), fetch_(std::move(fetch)) {}
    DeferredLink(DeferredLink const& other) : id_(other.id_), fetch_(other.fetch_) {
        if (cow_ptr<Holder> const* const held = other.GetHeld()) {
            held_ = *held;
            state_.Set(State::Held);
        }
    }
    DeferredLink& operator=(DeferredLink other) noexcept {
        id_ = std::move(other.id_);
        fetch_ = std::move(other.fetch_);
        held_.swap(other.held_);
        state_.Set(other.state_.Get());
        return *this;
    }
    ~DeferredLink() = default;

    [[nodiscard]] bool IsSet() const noexcept { return !id_.IsEmpty(); }
    [[nodiscard]] Id const& GetId() const noexcept { return id_; }
    [[nodiscard]] cow_ptr<Holder> const* GetHeld() const noexcept {
        return state_.Get() == State::Held ? &held_ : nullptr;
    }

    [[nodiscard]] cow_ptr<Holder> const& Get() const {
        if (GetHeld() == nullptr && BeginToFetch()) {
            const Fetching fetching(*this);
            cow_ptr<Fetched> fetched = fetch_(id_);
            if (!fetched || !(fetched->GetId() == id_))
                throw std::runtime_error("a deferred object could not be fetched");
            held_ = HoldFetched(std::move(fetched));
        }
        return held_;
    }

private:
    // 32 bits, which platforms can wait on directly.
    enum class State : std::int32_t { NotFetched, Fetching, Held };

    /// Held by the one thread that fetches, while the others wait. If it fails, another one tries.
    class Fetching {
    public:
        explicit Fetching(DeferredLink const& link) noexcept : link_(link) {}
        Fetching(Fetching const&) = delete;
        Fetching& operator=(Fetching const&) = delete;
        ~Fetching() { link_.state_.PublishToWaiting(link_.held_ ? State::Held : State::NotFetched); }

    private:
        DeferredLink const& link_;
    };

    /// Whether this thread has to fetch; false once another one has done so.
    [[nodiscard]] bool BeginToFetch() const noexcept {
        for (;;) {
            State state = State::NotFetched;
            if (state_.Replace(state, State::Fetching))
                return true;
            if (state == State::Held)
                return false;
            state_.WaitWhile(State::Fetching);
        }
    }

    Id id_;
    Fetch fetch_;
    mutable cow_ptr<Holder> held_;
    PublishedWord<State> state_;
};

} // namespace

struct DeferredLinks::Links {
    DeferredLink<Commit, Commit> parent;
    DeferredLink<CommitTree, Tree> root;
};

void DeferredLinks::Destroy::operator()(Links* links) const noexcept {
    std::default_delete<Links>()(links);
}

DeferredLinks::DeferredLinks(DeferredLinks const& other)
    : links_(other.links_ == nullptr ? nullptr : std::make_unique<Links>(*other.links_).release()) {}
DeferredLinks& DeferredLinks::operator=(DeferredLinks const& other) {
    return *this = DeferredLinks(other);
}

DeferredLinks::Links& DeferredLinks::Writable() {
    if (links_ == nullptr)
        links_.reset(std::make_unique<Links>().release());
    return *links_;
}

void DeferredLinks::SetParent(Id const& id, FetchParent fetch) {
    Writable().parent = {id, std::move(fetch)};
}

void DeferredLinks::SetRoot(Id const& id, FetchRoot fetch) {
    Writable().root = {id, std::move(fetch)};
}

void DeferredLinks::CopyParent(DeferredLinks const& other) {
    if (other.ParentId() != nullptr)
        Writable().parent = other.links_->parent;
}

void DeferredLinks::CopyRoot(DeferredLinks const& other) {
    if (other.RootId() != nullptr)
        Writable().root = other.links_->root;
}

void DeferredLinks::ClearParent() noexcept {
    if (links_ != nullptr && links_->root.IsSet())
        links_->parent = {};
    else
        links_.reset();
}

void DeferredLinks::ClearRoot() noexcept {
    if (links_ != nullptr && links_->parent.IsSet())
        links_->root = {};
    else
        links_.reset();
}

Id const* DeferredLinks::ParentId() const noexcept {
    return links_ == nullptr || !links_->parent.IsSet() ? nullptr : &links_->parent.GetId();
}

Id const* DeferredLinks::RootId() const noexcept {
    return links_ == nullptr || !links_->root.IsSet() ? nullptr : &links_->root.GetId();
}

cow_ptr<Commit> const* DeferredLinks::HeldParent() const noexcept {
    return links_ == nullptr ? nullptr : links_->parent.GetHeld();
}

cow_ptr<CommitTree> const* DeferredLinks::HeldRoot() const noexcept {
    return links_ == nullptr ? nullptr : links_->root.GetHeld();
}

cow_ptr<Commit> const* DeferredLinks::Parent() const {
    return ParentId() == nullptr ? nullptr : &links_->parent.Get();
}

cow_ptr<CommitTree> const* DeferredLinks::Root() const {
    return RootId() == nullptr ? nullptr : &links_->root.Get();
}

} // namespace KivVcs::detail
