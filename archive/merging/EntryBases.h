#pragma once

/// @file
/// The bases of a merge, entry by entry.

#include "AncestryGraph.h"

#include <deque>
#include <set>

namespace KivArchive {

using KivVcs::Blob;
using KivVcs::cow_ptr;
using KivVcs::Tree;

/// What a directory holds under a name: a file, a directory or nothing.
struct HeldEntry {
    cow_ptr<Blob> file;
    cow_ptr<Tree> directory;
    Id id;

    [[nodiscard]] bool IsNothing() const noexcept { return !file && !directory; }

    friend bool operator==(HeldEntry const& left, HeldEntry const& right) noexcept { return left.id == right.id; }
};

[[nodiscard]] HeldEntry EntryIn(cow_ptr<Tree> const& directory, KivStringT<char16_t> const& name);
[[nodiscard]] HeldEntry EntryOf(cow_ptr<Tree> directory);

/// The entry that both sides started from; nothing if that is not known, or there is no base.
using BaseEntry = std::optional<HeldEntry>;

/// The trees of all versions that a merge reads, each down to the directory that the merge is in.
class VersionTrees {
public:
    VersionTrees(MergeSources const& sources, AncestryGraph const& graph) : sources_(sources), graph_(graph) {}

    /// Sets the tree of a version, which is not asked for then.
    void SetTree(AncestryGraph::Node version, cow_ptr<Tree> tree) { levels_.front().emplace(version, std::move(tree)); }

    /// The view must stay valid until `Leave`.
    void Enter(KivStringT<char16_t> const& name);
    void Leave() noexcept;

    [[nodiscard]] bool IsGone(AncestryGraph::Node version);
    /// The directory that the merge is in; null if the version does not have it. @pre the version is not gone
    [[nodiscard]] cow_ptr<Tree> const& DirectoryOf(AncestryGraph::Node version);
    /// The versions that were asked for and are gone, ordered.
    [[nodiscard]] std::set<Id> const& Gone() const noexcept { return gone_; }

private:
    using Directories = std::unordered_map<AncestryGraph::Node, cow_ptr<Tree>>;

    MergeSources const& sources_;
    AncestryGraph const& graph_;
    std::vector<KivStringT<char16_t> const*> names_;
    std::deque<Directories> levels_{1};
    std::set<Id> gone_;
};

/// Finds the base of each entry of a merge, the same one for either order of the sides.
class EntryBases {
public:
    EntryBases(MergeSources const& sources, MergeSide const& left, MergeSide const& right);

    /// The directory in which entries are looked up from now on.
    void Enter(KivStringT<char16_t> const& name) { versions_.Enter(name); }
    void Leave() noexcept { versions_.Leave(); }

    /// The base of the trees that are merged.
    [[nodiscard]] BaseEntry OfAll();
    [[nodiscard]] BaseEntry Of(KivStringT<char16_t> const& name);

    /// The tree of the only base; null if there are none or several, or if it is gone.
    [[nodiscard]] cow_ptr<Tree> OnlyBase();
    [[nodiscard]] std::vector<Id> LostBases();

private:
    using Node = AncestryGraph::Node;
    using Pair = std::pair<Node, Node>;
    struct Found {
        std::map<Pair, BaseEntry> entries;
        unsigned depth = 0;
    };

    /// Bases whose own bases are several, and so on, as merges that cross again and again leave them, are followed this
    /// far.
    static constexpr unsigned deepest = 16;
    /// The most pairs of versions that are compared for one entry, and the most whose bases are looked for in one
    /// merge. Whatever is beyond these limits counts as not known, so that resolvers are asked.
    static constexpr std::size_t maximumPairsOfEntry = 256;
    static constexpr std::size_t maximumPairs = 4096;

    [[nodiscard]] AncestryGraph::Meeting const* MeetingOf(Pair pair);
    [[nodiscard]] BaseEntry Find(Pair pair, KivStringT<char16_t> const* name, Found& found);
    [[nodiscard]] BaseEntry CombineBases(Pair pair, std::vector<Node> const& bases, KivStringT<char16_t> const* name,
                                         Found& found);
    [[nodiscard]] BaseEntry DecidedByBoth(Pair pair, std::vector<Node> const& bases, KivStringT<char16_t> const* name);
    [[nodiscard]] std::vector<Node> const& FirstWithAll(Node side, Node other, std::vector<Node> const& bases);
    [[nodiscard]] bool IsChangedBy(Node base, std::vector<Node> const& bases, KivStringT<char16_t> const* name,
                                   Found& found);
    [[nodiscard]] BaseEntry CommonEntry(std::vector<Node> const& versions, KivStringT<char16_t> const* name);
    [[nodiscard]] HeldEntry EntryAt(Node version, KivStringT<char16_t> const* name);

    AncestryGraph graph_;
    VersionTrees versions_;
    Pair sides_;
    std::map<Pair, AncestryGraph::Meeting> meetings_;
    std::map<std::pair<Pair, std::vector<Node>>, std::vector<Node>> firstWithAll_;
};

} // namespace KivArchive
