#pragma once

/// @file
/// A repository whose versions are in an archive, and come from there when they are asked for.

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
    /// At most so many bytes of contents are kept for those who read them again, and held by streams; what was not used
    /// for the longest time goes first. Contents that a blob keeps, since its `GetData` was called, are not counted.
    std::uint64_t contentBytes = std::uint64_t{64} * 1024 * 1024;
    /// On how many threads `ReadContents` reads; 0 stands for as many as there are processors.
    unsigned workers = 0;
    /// How many times `PublishMerging` tries.
    unsigned attempts = 20;
    /// How long it waits after it has lost a race for the first time, at most; twice as long each further time, up to a
    /// second.
    std::chrono::milliseconds backOff{10};
    /// Gives the commit of a merge its author and description; it is given the commit that is merged. May be empty.
    std::function<void(Commit& merge, Commit const& merged)> describeMerge;
};

/// What became of the branches that were to be published.
struct PublishOutcome {
    /// Whether the archive has them now. If not it has none of them.
    bool published = false;
    /// The branches that others have moved meanwhile, with their heads in the archive; null for none.
    std::vector<Branch> moved;
    /// The records that had another value than expected, with their values now.
    std::vector<Record> changedRecords;
};

struct RefreshOutcome {
    /// The branches that were moved, made or removed here, since others had done so.
    std::vector<KivStringT<char16_t>> moved;
    /// The branches that others have moved and that have something unpublished here, which stay as they are.
    std::vector<KivStringT<char16_t>> diverged;
};

enum class PublishMergingResult : std::uint8_t {
    Published, ///< The archive has all of it.
    GaveUp,    ///< A merge was refused: a resolver gave up.
    Lost,      ///< Others were faster each time.
};

struct PublishMergingOutcome {
    PublishMergingResult result = PublishMergingResult::Lost;
    /// How many times publishing was tried.
    unsigned attempts = 0;
    /// The branch that could not be merged; empty if none was refused.
    KivStringT<char16_t> branch;
    /// What the merges did, those of races that were lost included.
    std::vector<MergeReport> merges;
};

/// A repository over an archive, which it may share with others.
///
/// Its branches are read when it is made. Commits are fetched when something reaches them, a walk's in growing batches
/// ahead of it; root trees when they are asked for, whole, with one batch for each level; contents when they are asked for,
/// as `ArchivedBlob` says, and never by anything in here but publishing, of what hosts have added. What has been fetched is
/// in the storage, also of its clones, and keeps the archive alive, not the repository. Lookups by identifier answer from
/// the storage and fetch nothing; `Load` brings in others. Counts and tables show what is loaded.
///
/// The archive sees nothing of what is committed here until it is published.
///
/// Threads: as every repository; several repositories may share one archive on several threads. Fetching may happen on any
/// thread that reads a commit.
/// @throws ArchiveError from everything that asks the archive, and from everything that walks to what has not been fetched:
/// `Damaged`, `Unrepresentable` or `Collected` if it cannot be had, which never looks like an end of the history
class KIVARCHIVE_EXPORT ArchivedRepository : public KivVcs::Repository {
public:
    /// Opens the archive, which must not be null: reads its branches and their heads, with two batches. An archive without
    /// branches gives the branch "master" without a head. A head that cannot be read locks out its own branch only.
    explicit ArchivedRepository(std::shared_ptr<IArchive> archive, RepositoryOptions const& options = {});
    ArchivedRepository(ArchivedRepository const&) = delete;
    ArchivedRepository& operator=(ArchivedRepository const&) = delete;
    ~ArchivedRepository() override;

    [[nodiscard]] std::shared_ptr<IArchive> const& GetArchive() const noexcept;

    using KivVcs::Repository::GetHead;
    /// @throws ArchiveError if the archive has a head that cannot be read
    [[nodiscard]] cow_ptr<Commit> GetHead(KivStringViewT<char16_t> branch) const override;

    /// Brings commits, trees with all below them, and blobs into the storage; commits and blobs by one batch each.
    /// @param progress may be null; of the trees none enters the storage if it asks to stop
    /// @return those that the archive does not have
    std::vector<Id> Load(std::span<const Id> ids, IProgress* progress = nullptr);

    /// The content of a blob that is in the archive, as a value or as a stream, within the byte budget. Nobody needs to
    /// have loaded the blob.
    [[nodiscard]] Buffer ReadContent(Id const& id);
    [[nodiscard]] StreamIO OpenContent(Id const& id);

    /// Hands all these contents to @p receiver, verified, on up to `RepositoryOptions::workers` threads at once, this one
    /// among them; each of a part of @p ids, so that these are best given in the order of their paths. Of a content larger
    /// than `largestWholeContent` the receiver gets no data, and calls `OpenContent`. Nothing is kept.
    /// @param receiver may be called on several threads at once; what it throws ends all of them and passes through
    /// @param progress may be null; called on this thread
    /// @return what could not be given
    ReadOutcome ReadContents(std::span<const Id> ids, ObjectReceiver const& receiver, IProgress* progress = nullptr);

    /// Opens a content at its beginning each time it is called.
    using ContentOpener = std::function<StreamIO()>;

    /// A stored blob with the content of a stream. One larger than `largestWholeContent` is not held: it goes to the
    /// archive at once, in pieces, where nothing shows it until a commit that has it is published. It is read twice, to be
    /// identified first.
    /// @param earlier the content that this one replaces under its path, which makes it cheap to store; may be null
    /// @param progress may be null
    /// @return null if the stream cannot be read to its end, or gives something else the second time
    cow_ptr<KivVcs::Blob> StoreContent(ContentOpener const& open, Id const& earlier = {},
                                       IProgress* progress = nullptr);
    /// The same for a file. @param path in the encoding of the file system
    cow_ptr<KivVcs::Blob> StoreFile(std::string const& path, Id const& earlier = {}, IProgress* progress = nullptr);

    /// Writes a content to a new file, in pieces; an existing file is replaced. After a failure there is none.
    /// @param progress may be null
    /// @throws ArchiveError, `Unavailable` or `DiskFull` if the file cannot be written
    void RestoreFile(Id const& id, std::string const& path, IProgress* progress = nullptr);

    /// The head that a branch had in the archive when that was last looked at; null if it had none.
    [[nodiscard]] Id GetPublishedHead(KivStringViewT<char16_t> branch) const;
    /// Whether a branch stands elsewhere than in the archive, as far as that is known, because it was moved here.
    [[nodiscard]] bool HasUnpublished(KivStringViewT<char16_t> branch) const;

    /// Writes what the heads of these branches reach and the archive lacks, and moves the branches there: all of them, and
    /// the records, or none. Branches that were removed here are removed there. What has been merged, too, is published with
    /// the commit that merged it.
    ///
    /// Asks for what is missing from the top, directories against those of the parent; stores children first, in
    /// changes of 8 MiB and a little more, the last of which moves the branches. Whatever is stored before that is not
    /// visible, and stays for the next try. Tries again if something that it relied on has been collected meanwhile.
    /// @param branches those that have nothing unpublished, or do not exist, are left out
    /// @param progress may be null
    /// @throws ArchiveError, `Unrepresentable` with its path for what a packed form cannot show, and `Collected` if
    /// something is gone that is only known here by its identifier; what a host's objects throw
    PublishOutcome Publish(std::span<const KivStringT<char16_t>> branches,
                           std::vector<RecordChange> const& records = {}, IProgress* progress = nullptr);
    /// The same for all branches.
    PublishOutcome Publish(IProgress* progress = nullptr);

    /// Looks at the archive's branches, and moves those that have nothing unpublished here to where they are there. A branch
    /// that was removed here comes back if others have moved it.
    /// @param progress may be null; nothing has moved if it asks to stop
    RefreshOutcome Refresh(IProgress* progress = nullptr);

    /// Publishes all branches, merging what others have published until it wins: refreshes, merges every branch that has
    /// moved on both sides, publishes, and begins again if others were faster. Where the head that is known here was
    /// rewritten there, the commits on top of it are put on the rebuilt one without a merge. The current branch stays
    /// current.
    ///
    /// What has been merged stays so if a later step fails.
    /// @param resolvers as `Merge` takes them; may be asked again about what was merged for a race that was lost
    /// @param progress may be null
    /// @throws as `Publish` and `Refresh`; what resolvers throw
    PublishMergingOutcome PublishMerging(Resolvers const& resolvers, IProgress* progress = nullptr);
    PublishMergingOutcome PublishMerging(MergeResolvers const& resolvers, IProgress* progress = nullptr);

    /// Moves the current branch if that takes no new commit: to @p commit if that contains the head, or if both have one
    /// tree and @p commit the smaller identifier; nowhere if the head contains @p commit, or both have one tree and the head
    /// has the smaller identifier. Of two with one tree the one that is taken is noted to contain the other, so that both
    /// sides of an exchange end with the same head.
    /// @return whether the branch has @p commit now
    bool FastForwardMerge(cow_ptr<Commit> commit) override;
    /// As `Repository::Merge`, with `FastForwardMerge` and `Merge3Way` of this class.
    bool Merge(cow_ptr<Commit> commit, Resolvers resolvers) override;
    /// Merges the tree of @p commit into the current branch with `MergeAgain`, by a new commit that contains both, also if its
    /// tree is that of one side. `GetCommonBase` is not asked: what counts is what a commit contains, not only its parents.
    bool Merge3Way(cow_ptr<Commit> commit, Resolvers resolvers) override;

    /// `Merge` and `Merge3Way` with all resolvers, and with an account of what was done.
    /// @param progress may be null; nothing has been committed if it asks to stop
    MergeReport MergeWithReport(cow_ptr<Commit> const& commit, MergeResolvers const& resolvers,
                                IProgress* progress = nullptr);
    MergeReport Merge3WayWithReport(cow_ptr<Commit> const& commit, MergeResolvers const& resolvers,
                                    IProgress* progress = nullptr);

protected:
    /// Notes that @p rebuilt stands for @p old on a rewritten history, for the archive to know once it is published.
    void CommitRewritten(cow_ptr<Commit> old, cow_ptr<Commit> rebuilt) override;

    /// Merges what others have published on @p branch into it, for `PublishMerging`, with `MergeWithReport`.
    [[nodiscard]] virtual MergeReport MergePublished(KivStringViewT<char16_t> branch, cow_ptr<Commit> const& theirs,
                                                     MergeResolvers const& resolvers, IProgress* progress);

    /// Notes that @p commit contains @p contained, for the archive to know once @p commit is published. What was merged is
    /// kept until then, and published along.
    void RecordContained(cow_ptr<Commit> const& commit, Containment how, cow_ptr<Commit> const& contained);

    /// As `IArchive::ReadAncestry`, with what is known of commits that have not been published.
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
