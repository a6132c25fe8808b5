#pragma once

#include "support/Builders.h"

#include <functional>

/// Objects of hosts' classes, which count calls.

namespace KivVcs {

/// A blob that knows its identifier and fetches its content when asked for it.
class LazyBlob final : public Blob {
public:
    /// @param fetched counts how often the content is asked for
    LazyBlob(std::string const& content, int& fetched)
        : id_(MakeBlob(content).GetId()), content_(MakeBlob(content).GetData()), fetched_(&fetched) {}

    Id GetId() const override { return id_; }
    Buffer const& GetData() const override { return ++*fetched_, content_; }

protected:
    cow_ptr<Blob> Copy() const override { return immu::make<LazyBlob>(*this); }

private:
    Id id_;
    Buffer content_;
    int* fetched_;
};

/// A blob that a host says how to pack, and that fetches its content when asked for it.
class HostBlob : public Blob {
public:
    HostBlob(std::string const& knownId, std::function<std::string()> fetch)
        : id(Wide(knownId)), fetch_(std::move(fetch)) {}

    Id GetId() const override { return Id(id); }
    KivStringT<char> GetHeader() const override { return header.c_str(); }
    KivStringT<char> GetStoragePrefix() const override { return prefix.c_str(); }
    Buffer const& GetData() const override { return fetched_ = BufferOf(fetch_()); }

    KivStringT<char16_t> id;
    std::string header = "blob";
    std::string prefix = "100644";

protected:
    cow_ptr<Blob> Copy() const override { return immu::make<HostBlob>(*this); }

private:
    std::function<std::string()> fetch_;
    mutable Buffer fetched_;
};

/// A directory that passes itself to a host in its destructor.
class HostTree : public Tree {
public:
    HostTree(Tree const& entries, std::function<void(Tree const&)> leave) : Tree(entries), leave_(std::move(leave)) {}
    HostTree(HostTree const&) = default;
    ~HostTree() override { leave_(*this); }

protected:
    cow_ptr<Tree> Copy() const override { return immu::make<HostTree>(*this); }

private:
    std::function<void(Tree const&)> leave_;
};

/// A commit with a given identifier, which counts how often it is asked for it, and reads its parent in its destructor.
class NamedCommit : public Commit {
public:
    struct Log {
        int asked = 0;
        int died = 0;
        int diedWithParent = 0;
    };

    NamedCommit(KivStringT<char16_t> const& name, cow_ptr<Commit> parent, Log& log)
        : Commit(std::move(parent), false), name_(name), log_(&log) {}
    ~NamedCommit() override {
        ++log_->died;
        log_->diedWithParent += GetParent() ? 1 : 0;
    }

    Id GetId() const override { return ++log_->asked, Id(name_); }

protected:
    cow_ptr<Commit> Copy() const override { return immu::make<NamedCommit>(*this); }

private:
    KivStringT<char16_t> name_;
    Log* log_;
};

} // namespace KivVcs
