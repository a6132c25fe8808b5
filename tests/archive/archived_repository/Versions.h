#pragma once

#include "ArchiveFiles.h"
#include "ForwardingArchive.h"
#include "KivArchive/ArchivedRepository.h"
#include "KivArchive/MemArchive.h"
#include "support/Builders.h"

#include <KivVcs/History.h>

#include <gtest/gtest.h>

#include <atomic>

/// Builders of versions in archives, and an archive that counts calls.

namespace KivArchive {

using Conformance::TextOf;
using KivVcs::Blob;
using KivVcs::History;
using KivVcs::MakeBlob;
using KivVcs::NameOf;
using KivVcs::Tree;
using KivVcs::Wide;

/// An archive that counts what any thread asks it for.
class CountingArchive final : public ForwardingArchive {
public:
    ReadOutcome Read(std::span<const Id> ids, ObjectReceiver const& receiver) override {
        return ForwardingArchive::Read(ids, [&](ArchivedObject const& object) {
            contents += object.type == ObjectType::Blob ? 1 : 0;
            receiver(object);
        });
    }
    std::optional<Buffer> ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) override {
        ++contents;
        return ForwardingArchive::ReadContent(id, offset, size);
    }
    ChangeOutcome Apply(Change const& change) override {
        stored += change.objects.size();
        relied += change.relied.size();
        inherited = change.inherited;
        return ForwardingArchive::Apply(change);
    }

    std::atomic<std::size_t> calls = 0;
    std::atomic<std::size_t> contents = 0;
    std::atomic<std::size_t> stored = 0;
    std::atomic<std::size_t> relied = 0;
    std::vector<Id> inherited;

protected:
    IArchive& Reach() override { return ++calls, far_; }

private:
    MemArchive far_;
};

/// Commits files, written as "path=content other=content", with a removal as "-path".
inline cow_ptr<Commit> CommitFiles(KivVcs::IRepository& repository, std::string const& files, std::string const& name) {
    Commit commit(&repository, false);
    std::istringstream words(files);
    for (std::string word; words >> word;) {
        auto const equals = word.find('=');
        if (word.front() == '-')
            commit.RemoveObject(&repository, Wide(word.substr(1)));
        else
            commit.AddBlob(&repository, Wide(word.substr(0, equals)), MakeBlob(word.substr(equals + 1)));
    }
    commit.SetDescription(Wide(name));
    commit.SetAuthorName(u"Ada");
    return repository.DoCommit(commit);
}

inline std::string FilesOf(cow_ptr<Commit> const& commit) {
    return KivVcs::Files(commit->GetCommitTree()->GetRoot());
}

inline std::string Line(cow_ptr<Commit> const& head) {
    std::string line;
    for (auto const& commit : History(head))
        line += (line.empty() ? "" : " ") + NameOf(commit);
    return line;
}

inline Resolvers TakingOurs() {
    return {KivVcs::AlwaysChooseLeft(), [](auto const&, auto const&) { return KivVcs::TreeConflictChoice::Merge; }};
}

/// The kind of failure of a call; nothing if it does not fail. @param sentence receives the failure's sentence
template <class Call>
std::optional<Failure> FailureOf(Call call, std::string* sentence = nullptr) {
    try {
        call();
    } catch (ArchiveError const& error) {
        if (sentence != nullptr)
            *sentence = error.what();
        return error.GetKind();
    }
    return std::nullopt;
}

} // namespace KivArchive
