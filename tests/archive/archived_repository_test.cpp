#include "ArchiveFiles.h"
#include "KivArchive/ArchivedRepository.h"
#include "KivArchive/MemArchive.h"
#include "support/Builders.h"

#include <KivVcs/History.h>

#include <gtest/gtest.h>

/// Repositories over archives.

namespace KivArchive {
namespace {

using KivVcs::Blob;
using KivVcs::History;
using KivVcs::MakeBlob;
using KivVcs::NameOf;
using KivVcs::Narrow;
using KivVcs::Tree;
using KivVcs::Wide;

/// An archive that counts what it is asked for.
class CountingArchive final : public IArchive {
public:
    [[nodiscard]] std::vector<Id> FindMissing(std::span<const Id> ids) override { return Far().FindMissing(ids); }
    [[nodiscard]] std::vector<ObjectInfo> Describe(std::span<const Id> ids) override { return Far().Describe(ids); }
    ReadOutcome Read(std::span<const Id> ids, ObjectReceiver const& receiver) override {
        return Far().Read(ids, [&](ArchivedObject const& object) {
            contents += object.type == ObjectType::Blob ? 1 : 0;
            receiver(object);
        });
    }
    [[nodiscard]] std::optional<Buffer> ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) override {
        ++contents;
        return Far().ReadContent(id, offset, size);
    }
    bool StoreContent(Id const& id, StreamIO& content, Id const& earlier, IProgress* progress) override {
        return Far().StoreContent(id, content, earlier, progress);
    }
    ChangeOutcome Apply(Change const& change) override {
        stored += change.objects.size();
        relied += change.relied.size();
        return Far().Apply(change);
    }
    [[nodiscard]] std::vector<Branch> ReadBranches() override { return Far().ReadBranches(); }
    [[nodiscard]] std::vector<Record> ReadRecords(std::span<const KivStringT<char16_t>> names) override {
        return Far().ReadRecords(names);
    }
    [[nodiscard]] std::vector<KivStringT<char16_t>> ListRecords() override { return Far().ListRecords(); }
    [[nodiscard]] std::vector<Ancestry> ReadAncestry(std::span<const Id> commits, Follow follow,
                                                     std::size_t more) override {
        return Far().ReadAncestry(commits, follow, more);
    }
    [[nodiscard]] std::vector<Ancestry> ListAncestry(Id const& after, std::size_t limit) override {
        return Far().ListAncestry(after, limit);
    }
    [[nodiscard]] std::vector<ObjectInfo> ListObjects(Id const& after, std::size_t limit) override {
        return Far().ListObjects(after, limit);
    }
    void Mark(std::span<const Id> ids) override { Far().Mark(ids); }
    void Unmark(std::span<const Id> ids) override { Far().Unmark(ids); }
    [[nodiscard]] std::vector<Id> ListMarked(std::chrono::seconds grace, Id const& after, std::size_t limit) override {
        return Far().ListMarked(grace, after, limit);
    }
    std::vector<Id> Remove(std::span<const Id> ids, std::chrono::seconds grace) override {
        return Far().Remove(ids, grace);
    }
    std::uint64_t Compact(std::uint64_t bytes) override { return Far().Compact(bytes); }
    [[nodiscard]] ArchiveStatistics GetStatistics() override { return far_.GetStatistics(); }

    std::size_t calls = 0;
    std::size_t contents = 0;
    std::size_t stored = 0;
    std::size_t relied = 0;

private:
    MemArchive& Far() { return ++calls, far_; }

    MemArchive far_;
};

/// Commits files, written as "path=content other=content", with a removal as "-path".
cow_ptr<Commit> CommitFiles(KivVcs::IRepository& repository, std::string const& files, std::string const& name) {
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

std::string FilesOf(cow_ptr<Commit> const& commit) {
    return KivVcs::Files(commit->GetCommitTree()->GetRoot());
}

std::string Line(cow_ptr<Commit> const& head) {
    std::string line;
    for (auto const& commit : History(head))
        line += (line.empty() ? "" : " ") + NameOf(commit);
    return line;
}

Resolvers TakingOurs() {
    return {KivVcs::AlwaysChooseLeft(), [](auto const&, auto const&) { return KivVcs::TreeConflictChoice::Merge; }};
}

TEST(ArchivedRepository, VersionsComeBackAsTheyWerePublished) {
    auto const archive = std::make_shared<CountingArchive>();
    cow_ptr<Commit> head;
    {
        ArchivedRepository repository(archive);
        CommitFiles(repository, "a=1 docs/b=2 docs/deep/c=3", "one");
        CommitFiles(repository, "docs/deep/c=4", "two");
        head = CommitFiles(repository, "-a -docs/b -docs/deep/c", "three\n\nwith more\nlines");
        EXPECT_TRUE(archive->ReadBranches().empty());
        EXPECT_TRUE(repository.HasUnpublished(u"master"));
        EXPECT_TRUE(repository.Publish().published);
        EXPECT_FALSE(repository.HasUnpublished(u"master"));
    }
    EXPECT_EQ(ProblemsOf(*archive), "");
    ArchivedRepository repository(archive);
    EXPECT_EQ(repository.GetCommitCount(), 1U) << "only heads are read";
    auto const read = repository.GetHead();
    EXPECT_EQ(read->GetId(), head->GetId());
    EXPECT_EQ(Line(read), "three\n\nwith more\nlines two one");
    EXPECT_EQ(FilesOf(read), "") << "an emptied directory";
    archive->contents = 0;
    EXPECT_EQ(KivVcs::DifferencesFromParent(*read->GetParent()).begin()->path, Wide("docs/deep/c"));
    EXPECT_EQ(archive->contents, 0U);
    EXPECT_EQ(FilesOf(read->GetParent()), "a=1 docs/b=2 docs/deep/c=4");
}

TEST(ArchivedRepository, PublishesOnlyWhatIsNew) {
    auto const archive = std::make_shared<CountingArchive>();
    ArchivedRepository repository(archive);
    std::string files;
    for (int i = 0; i < 300; ++i)
        files += "d" + std::to_string(i % 10) + "/f" + std::to_string(i) + "=" + std::to_string(i) + " ";
    CommitFiles(repository, files, "many");
    EXPECT_TRUE(repository.Publish().published);
    EXPECT_EQ(archive->stored, 300U + 11U + 1U);

    archive->stored = archive->relied = archive->calls = 0;
    ArchivedRepository other(archive);
    CommitFiles(other, "d3/f13=new", "one edit");
    std::size_t const callsBefore = archive->calls;
    EXPECT_TRUE(other.Publish().published);
    EXPECT_EQ(archive->stored, 4U);
    EXPECT_LE(archive->relied, 4U);
    EXPECT_EQ(archive->calls - callsBefore, 2U);
    EXPECT_EQ(ProblemsOf(*archive), "");
}

TEST(ArchivedRepository, BranchesMoveByCompareAndSwap) {
    auto const archive = std::make_shared<MemArchive>();
    ArchivedRepository ours(archive);
    CommitFiles(ours, "a=1", "base");
    ASSERT_TRUE(ours.Publish().published);
    ArchivedRepository theirs(archive);
    CommitFiles(theirs, "b=2", "theirs");
    theirs.CreateBranch(u"topic", nullptr);
    ASSERT_TRUE(theirs.Publish().published);
    auto const own = CommitFiles(ours, "c=3", "ours");
    auto const lost = ours.Publish();
    EXPECT_FALSE(lost.published);
    ASSERT_EQ(lost.moved.size(), 1U);
    EXPECT_EQ(lost.moved[0].head, theirs.GetHead()->GetId());

    auto const refreshed = ours.Refresh();
    EXPECT_EQ(refreshed.diverged, std::vector<KivStringT<char16_t>>{u"master"});
    EXPECT_EQ(refreshed.moved, std::vector<KivStringT<char16_t>>{u"topic"});
    EXPECT_EQ(ours.GetHead(), own);
    EXPECT_FALSE(ours.Publish().published) << "what others did is not overwritten";
    auto const outcome = ours.PublishMerging(TakingOurs());
    EXPECT_EQ(outcome.result, PublishMergingResult::Published);
    EXPECT_EQ(FilesOf(ours.GetHead()), "a=1 b=2 c=3");
    EXPECT_EQ(theirs.Refresh().moved, std::vector<KivStringT<char16_t>>{u"master"});
    EXPECT_EQ(theirs.GetHead()->GetId(), ours.GetHead()->GetId());
    EXPECT_EQ(ProblemsOf(*archive), "");
}

} // namespace
} // namespace KivArchive
