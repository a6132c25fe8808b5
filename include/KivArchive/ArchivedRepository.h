#pragma once

/// @file
/// A repository whose versions are in an archive and are fetched when they are asked for.

#include "KivArchive/ArchivedBlob.h"
#include "KivArchive/IArchive.h"
#include "KivArchive/Merging.h"

#include <KivVcs/Repository.h>

#include <functional>
#include <memory>
#include <string>

namespace KivArchive {

using KivVcs::Commit;
using KivVcs::cow_ptr;
using KivVcs::Resolvers;

struct RepositoryOptions {
    /// At most this many bytes of contents are cached or held by streams; the least recently used are dropped first.
    /// Contents that a blob keeps because its `GetData` was called are not counted.
    std::uint64_t contentBytes = std::uint64_t{64} * 1024 * 1024;
    /// How many threads `ReadContents` uses; 0 stands for as many as there are processors.
    unsigned workers = 0;
    /// How many times `PublishMerging` tries.
    unsigned attempts = 20;
    /// How long `PublishMerging` waits at most after the first race that it loses; doubled after each further one, up
    /// to a second.
    std::chrono::milliseconds backOff{10};
    /// Sets the author and description of the commit of a merge; `merged` is the commit that is merged in. May be
    /// empty.
    std::function<void(Commit& merge, Commit const& merged)> describeMerge;
};

/// What became of the branches that were to be published.
struct PublishOutcome {
    /// Whether the archive has them now. If false, none of them has moved there.
    bool published = false;
    /// The branches that others have moved meanwhile, with their heads in the archive; null for none.
    std::vector<Branch> moved;
    /// The records that had another value than expected, with their values now.
    std::vector<Record> changedRecords;
};

struct RefreshOutcome {
    /// The branches that were moved, made or removed here because others had done so in the archive.
    std::vector<KivStringT<char16_t>> moved;
    /// The branches that others have moved and that have unpublished commits here. They stay as they are.
    std::vector<KivStringT<char16_t>> diverged;
};

enum class PublishMergingResult : std::uint8_t {
    Published, ///< The archive has all branches.
    GaveUp,    ///< A merge was refused: a resolver gave up.
    Lost,      ///< Every attempt lost its race.
};

struct PublishMergingOutcome {
    PublishMergingResult result = PublishMergingResult::Lost;
    /// How many times publishing was tried.
    unsigned attempts = 0;
    /// The branch that could not be merged; empty if none was refused.
    KivStringT<char16_t> branch;
    /// What each merge did, including those whose race was lost afterwards.
    std::vector<MergeReport> merges;
};

/// A repository over an archive, which it may share with others.
///
/// Its branches are read when it is made. Commits are fetched when something reaches them, ahead of a walk in growing
/// batches; root trees when they are asked for, whole, with one batch for each level; contents when they are asked for,
/// as `ArchivedBlob` says. No operation here asks for contents of its own accord, except that publishing reads those
/// that hosts have added. What has been fetched is in the storage and in those of all clones, and keeps the archive
/// alive, not the repository. Lookups by identifier search the storage and fetch nothing; `Load` fetches. Counts and
/// tables show what is loaded.
///
/// The archive sees nothing of what is committed here until it is published.
///
/// Threads: as for every repository; several repositories may share one archive on several threads. Fetching may happen
/// on any thread that reads a commit.
/// @throws ArchiveError from everything that asks the archive or reaches what has not been fetched; `Damaged`,
/// `Unrepresentable` or `Collected` if that cannot be read, so that it never looks like the end of a history
class KIVARCHIVE_EXPORT ArchivedRepository : public KivVcs::Repository {
public:
    /// Reads the branches of the archive, which must not be null, and their heads, with two batches. If there are none,
    /// the repository has the branch "master" without a head. A head that cannot be read affects its own branch only.
    explicit ArchivedRepository(std::shared_ptr<IArchive> archive, RepositoryOptions const& options = {});
    ArchivedRepository(ArchivedRepository const&) = delete;
    ArchivedRepository& operator=(ArchivedRepository const&) = delete;
    ~ArchivedRepository() override;

    [[nodiscard]] std::shared_ptr<IArchive> const& GetArchive() const noexcept;

    using KivVcs::Repository::GetHead;
    /// @throws ArchiveError if the archive has a head that cannot be read
    [[nodiscard]] cow_ptr<Commit> GetHead(KivStringViewT<char16_t> branch) const override;

    /// Brings commits, blobs, and trees with everything below them into the storage; commits and blobs with one batch
    /// each.
    /// @param progress may be null; if it asks to stop, no tree enters the storage
    /// @return those that the archive does not have
    std::vector<Id> Load(std::span<const Id> ids, IProgress* progress = nullptr);

    /// The content of a blob that is in the archive, as a value or as a stream, within the byte budget. The blob need
    /// not be loaded.
    [[nodiscard]] Buffer ReadContent(Id const& id);
    [[nodiscard]] StreamIO OpenContent(Id const& id);

    /// Passes all these contents, verified, to @p receiver, on up to `RepositoryOptions::workers` threads at once, this
    /// one among them. Each thread reads one part of @p ids, which is fastest in the order of their paths. For a
    /// content larger than `largestWholeContent` the receiver gets no data, and calls `OpenContent`. Nothing is cached.
    /// @param receiver may be called on several threads at once; what it throws stops all of them and passes through
    /// @param progress may be null; called on this thread
    /// @return what could not be read
    ReadOutcome ReadContents(std::span<const Id> ids, ObjectReceiver const& receiver, IProgress* progress = nullptr);

    /// Opens a content at its beginning each time it is called.
    using ContentOpener = std::function<StreamIO()>;

    /// Stores the content of a stream as a blob. One larger than `largestWholeContent` is not held in memory: it is
    /// read a first time to be identified, and a second time into the archive, in pieces. There it stays invisible
    /// until a commit that has it is published.
    /// @param earlier the content that this one replaces under its path, which makes it cheap to store; may be null
    /// @param progress may be null
    /// @return null if the stream cannot be read to its end, or differs the second time
    cow_ptr<KivVcs::Blob> StoreContent(ContentOpener const& open, Id const& earlier = {},
                                       IProgress* progress = nullptr);
    /// The same for a file. @param path in the encoding of the file system
    cow_ptr<KivVcs::Blob> StoreFile(std::string const& path, Id const& earlier = {}, IProgress* progress = nullptr);

    /// Writes a content to a new file, in pieces, in place of an existing one. After a failure there is no file.
    /// @param progress may be null
    /// @throws ArchiveError, `Unavailable` or `DiskFull` if the file cannot be written
    void RestoreFile(Id const& id, std::string const& path, IProgress* progress = nullptr);

    /// The head that a branch had in the archive when the archive's branches were last read; null if it had none.
    [[nodiscard]] Id GetPublishedHead(KivStringViewT<char16_t> branch) const;
    /// Whether a branch was moved here and so differs from the archive's, as last read.
    [[nodiscard]] bool HasUnpublished(KivStringViewT<char16_t> branch) const;

    /// Stores in the archive what the heads of these branches reach and the archive lacks, and moves the branches
    /// there: all of them, and the records, or none. Branches that were removed here are removed there. A commit that
    /// was merged is published along with the one that merged it.
    ///
    /// Looks for what is missing from the top down, comparing directories with those of the parent; stores each object
    /// after those that it names, in changes of a little more than 8 MiB. The last change moves the branches; what is
    /// stored before it is invisible, and stays for the next try. Tries again if something that it relied on has been
    /// collected meanwhile.
    /// @param branches those that have nothing unpublished, or do not exist, are left out
    /// @param progress may be null
    /// @throws ArchiveError; `Unrepresentable`, naming the path, for what a packed form cannot show, and `Collected` if
    /// the archive has lost something of which only the identifier is known here; what a host's objects throw
    PublishOutcome Publish(std::span<const KivStringT<char16_t>> branches,
                           std::vector<RecordChange> const& records = {}, IProgress* progress = nullptr);
    /// The same for all branches.
    PublishOutcome Publish(IProgress* progress = nullptr);

    /// Reads the archive's branches, and gives those that have nothing unpublished here the heads that they have there.
    /// A branch that was removed here comes back if others have moved it.
    /// @param progress may be null; nothing has moved if it asks to stop
    RefreshOutcome Refresh(IProgress* progress = nullptr);

    /// Publishes all branches, merging what others have published until it succeeds: refreshes, merges every branch
    /// that has moved on both sides, publishes, and begins again if it has lost the race. Where others have rewritten
    /// the published head, the commits on top of it are rebased onto the rewritten one without a merge. The current
    /// branch stays current.
    ///
    /// What has been merged stays merged if a later step fails.
    /// @param resolvers as `Merge` takes them; may be asked again about what was merged for a race that was lost
    /// @param progress may be null
    /// @throws as `Publish` and `Refresh`; what resolvers throw
    PublishMergingOutcome PublishMerging(Resolvers const& resolvers, IProgress* progress = nullptr);
    PublishMergingOutcome PublishMerging(MergeResolvers const& resolvers, IProgress* progress = nullptr);

    /// Moves the current branch if that takes no new commit: to @p commit if it contains the head, or if both have the
    /// same tree and @p commit has the smaller identifier. Leaves it where it is if the head contains @p commit, or if
    /// both have the same tree and the head has the smaller identifier. Of two commits with the same tree, the one that
    /// is taken is recorded to contain the other, so that both sides of an exchange end with the same head.
    /// @return whether the branch has @p commit now
    bool FastForwardMerge(cow_ptr<Commit> commit) override;
    /// As `Repository::Merge`, with `FastForwardMerge` and `Merge3Way` of this class.
    bool Merge(cow_ptr<Commit> commit, Resolvers resolvers) override;
    /// Merges the tree of @p commit into the current branch with `MergeAgain`, by a new commit that contains both, even
    /// if its tree is that of one side. `GetCommonBase` is not called: all that a commit contains counts, not only its
    /// parents.
    bool Merge3Way(cow_ptr<Commit> commit, Resolvers resolvers) override;

    /// `Merge` and `Merge3Way` with all resolvers, and with an account of what was done.
    /// @param progress may be null; nothing has been committed if it asks to stop
    MergeReport MergeWithReport(cow_ptr<Commit> const& commit, MergeResolvers const& resolvers,
                                IProgress* progress = nullptr);
    MergeReport Merge3WayWithReport(cow_ptr<Commit> const& commit, MergeResolvers const& resolvers,
                                    IProgress* progress = nullptr);

protected:
    /// Records that @p rebuilt stands for @p old on a rewritten history. Publishing @p rebuilt stores this.
    void CommitRewritten(cow_ptr<Commit> old, cow_ptr<Commit> rebuilt) override;

    /// Merges what others have published on @p branch into it, for `PublishMerging`, with `MergeWithReport`.
    [[nodiscard]] virtual MergeReport MergePublished(KivStringViewT<char16_t> branch, cow_ptr<Commit> const& theirs,
                                                     MergeResolvers const& resolvers, IProgress* progress);

    /// Records that @p commit contains @p contained. Publishing @p commit stores this; a commit that it merged is held
    /// until then, and published along.
    void RecordContained(cow_ptr<Commit> const& commit, Containment how, cow_ptr<Commit> const& contained);

    /// As `IArchive::ReadAncestry`, including the facts of commits that have not been published.
    [[nodiscard]] std::vector<Ancestry> ReadAncestry(std::span<const Id> commits, Follow follow,
                                                     std::size_t more) const;

private:
    struct State;
    struct Moves;

    explicit ArchivedRepository(std::unique_ptr<State> state);

    [[nodiscard]] Moves PendingMoves(std::span<const KivStringT<char16_t>> branches) const;
    [[nodiscard]] bool IsContained(Id const& commit, cow_ptr<Commit> const& in) const;
    PublishOutcome PublishOnce(std::span<const KivStringT<char16_t>> branches, std::vector<RecordChange> const& records,
                               bool asksForAll, IProgress* progress);
    [[nodiscard]] bool IsOwnDoing(PublishOutcome const& outcome) const;
    void RefreshBranch(Branch const& theirs, RefreshOutcome& outcome);
    void ForgetRemoved(std::vector<Branch> const& theirs, RefreshOutcome& outcome);
    void TakePublished(KivStringT<char16_t> const& branch);
    void ReturnTo(KivStringT<char16_t> const& branch);
    [[nodiscard]] MergeReport MergeDiverged(KivStringT<char16_t> const& branch, MergeResolvers const& resolvers,
                                            IProgress* progress);
    [[nodiscard]] std::optional<KivVcs::MergeResult> MergeWithoutCommit(cow_ptr<Commit> const& commit,
                                                                        IProgress* progress);
    void EnterLine(cow_ptr<Commit> commit);
    [[nodiscard]] AncestryReader FactsReader(IProgress* progress) const;
    [[nodiscard]] MergeSources SourcesOfMerge(IProgress* progress);
    [[nodiscard]] bool CommitMerge(cow_ptr<Commit> const& head, cow_ptr<Commit> const& commit,
                                   cow_ptr<KivVcs::Tree> tree);
    void RebaseOntoRewritten(KivStringT<char16_t> const& branch);

    std::unique_ptr<State> state_;
};

} // namespace KivArchive
