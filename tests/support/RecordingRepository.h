#pragma once

#include "support/Builders.h"

#include <gtest/gtest.h>

#include <stdexcept>

namespace KivVcs {

/// Records the calls of virtual operations in order, and fails on request.
class RecordingRepository : public Repository {
public:
    using Repository::Repository;

    /// The calls since the last time.
    std::string TakeCalls() { return Joined(std::exchange(calls_, {})); }
    /// Lets the operation with that name throw from now on; none for the empty text.
    void Break(std::string operation) { broken_ = std::move(operation); }

    using Repository::SyncWithStorage;
    cow_ptr<Commit> DoCommit(Commit& commit) override { return Recorded("DoCommit").Repository::DoCommit(commit); }
    cow_ptr<Commit> GetHead() const override { return Recorded("GetHead()").Repository::GetHead(); }
    cow_ptr<Commit> GetHead(KivStringViewT<char16_t> branch) const override {
        return Recorded("GetHead(" + Narrow(branch) + ")").Repository::GetHead(branch);
    }
    KivStringT<char16_t> GetCurentBranch() const override {
        return Recorded("GetCurentBranch").Repository::GetCurentBranch();
    }
    cow_ptr<Commit> SyncWithStorage(cow_ptr<Commit> commit) override {
        return Recorded("Sync(" + NameOf(commit) + ")").Repository::SyncWithStorage(commit);
    }
    void UpdateStorage() override { Recorded("UpdateStorage").Repository::UpdateStorage(); }
    cow_ptr<Commit> GetCommonBase(cow_ptr<Commit> first, cow_ptr<Commit> second) const override {
        return Recorded("GetCommonBase(" + NameOf(first) + "," + NameOf(second) + ")")
            .Repository::GetCommonBase(first, second);
    }
    bool CreateBranch(KivStringViewT<char16_t> branch, cow_ptr<Commit> head) override {
        return Recorded("CreateBranch(" + Narrow(branch) + "," + NameOf(head) + ")")
            .Repository::CreateBranch(branch, head);
    }
    bool MoveBranchTo(KivStringViewT<char16_t> branch, cow_ptr<Commit> commit) override {
        return Recorded("MoveBranchTo(" + Narrow(branch) + "," + NameOf(commit) + ")")
            .Repository::MoveBranchTo(branch, commit);
    }
    bool FastForwardMerge(cow_ptr<Commit> commit) override {
        return Recorded("FastForwardMerge").Repository::FastForwardMerge(commit);
    }
    bool Merge3Way(cow_ptr<Commit> commit, Resolvers resolvers) override {
        return Recorded("Merge3Way").Repository::Merge3Way(commit, resolvers);
    }

private:
    RecordingRepository const& Recorded(std::string call) const {
        if (!broken_.empty() && call.starts_with(broken_))
            throw std::runtime_error(call);
        calls_.push_back(std::move(call));
        return *this;
    }
    RecordingRepository& Recorded(std::string call) {
        (void)std::as_const(*this).Recorded(std::move(call));
        return *this;
    }

    mutable std::vector<std::string> calls_;
    std::string broken_;
};

/// Tests with a repository whose calls are recorded, and a builder of histories in it.
class WithHistory : public testing::Test {
protected:
    IObjectsStorage& Storage() { return *repo.GetStorage(); }
    [[nodiscard]] std::string FilesOfHead() const { return Files(repo.GetHead()->GetCommitTree()->GetRoot()); }

    RecordingRepository repo{std::make_unique<MemObjectsStorage>()};
    GrownHistory history{repo};
};

} // namespace KivVcs
