#pragma once

/// @file
/// The histories of commits by their facts, read as far as needed.

#include "KivArchive/Merging.h"

#include <cstdint>
#include <map>
#include <unordered_map>

namespace KivArchive {

/// Commits as numbered nodes, with links to what they contain: parents, and what was merged, rewritten and found equal.
/// There may be cycles: commits may have been rebased there and back.
class AncestryGraph {
public:
    using Node = std::uint32_t;

    /// Where two histories meet.
    struct Meeting {
        /// The common ancestors that no other one contains, one for each cycle, ordered by identifier.
        std::vector<Node> bases;
        /// The bases themselves, but of a cycle all commits that a side has been at: both sides contain what all of
        /// these changed, and none of them is the latest.
        std::vector<Node> arrivals;
        bool leftContainsRight = false;
        bool rightContainsLeft = false;
    };

    explicit AncestryGraph(AncestryReader read) : read_(std::move(read)) {}

    /// The number of a commit, whether or not it has facts.
    [[nodiscard]] Node Enter(Id const& commit);
    [[nodiscard]] Id const& CommitOf(Node node) const noexcept { return *entries_[node].commit; }
    /// Null for a commit without a tree or without facts.
    [[nodiscard]] Id const& TreeOf(Node node) const noexcept { return entries_[node].tree; }
    [[nodiscard]] bool IsKnown(Node node) const noexcept { return entries_[node].isKnown; }

    /// Finds where two histories meet, reading as many facts as that takes.
    [[nodiscard]] Meeting Meet(Node left, Node right);

    /// Where a side brought @p commits together, which both sides contain: the earliest commits that contain all of
    /// them, and that @p side contains and @p other does not. One that @p isUsable rejects is replaced by the next ones
    /// above. Empty if there are none, or if @p commits are more than 64.
    /// @pre the two have met
    [[nodiscard]] std::vector<Node> FindFirstWithAll(Node side, Node other, std::span<const Node> commits,
                                                     std::function<bool(Node)> const& isUsable);

private:
    struct Entry {
        Id const* commit = nullptr;
        Id tree;
        std::size_t firstLink = 0;
        std::uint32_t links = 0;
        bool isRead = false;
        bool isKnown = false;
    };
    /// What a walk has found out about a commit. Valid during that walk only.
    struct Mark {
        std::uint64_t walk = 0;
        /// One bit for each of the first 63 commits that it was reached from; the last bit stands for all others.
        std::uint64_t reachedFrom = 0;
        std::uint8_t sides = 0;
        bool isOrdered = false;
    };
    /// For each commit, those that link to it.
    using Above = std::unordered_map<Node, std::vector<Node>>;

    static constexpr std::uint8_t leftSide = 1;
    static constexpr std::uint8_t rightSide = 2;
    static constexpr std::uint8_t bothSides = leftSide | rightSide;
    static constexpr std::size_t lastBit = 63;

    [[nodiscard]] std::span<const Node> LinksOf(Node node) const noexcept {
        return std::span(links_).subspan(entries_[node].firstLink, entries_[node].links);
    }
    [[nodiscard]] Mark& MarkOf(Node node) noexcept;
    void BeginWalk();
    void Read(std::span<const Node> nodes, std::size_t more);
    void AddFacts(Ancestry const& facts);
    [[nodiscard]] std::vector<Node> Reach(Node from, std::uint8_t side);
    [[nodiscard]] std::vector<Node> OrderCommon(std::vector<Node> const& reached);
    /// @return the cycle of each, its smallest identifier first
    [[nodiscard]] std::vector<std::vector<Node>> FindBest(std::vector<Node> const& ordered);
    [[nodiscard]] std::vector<Node> FindArrivals(std::vector<std::vector<Node>> const& cycles,
                                                 std::vector<Node> const& reached, std::span<const Node> sides);
    void SortById(std::vector<Node>& nodes) const;
    [[nodiscard]] std::vector<Node> ReachFromBest(Node best, std::size_t number);
    /// The commits that contain @p node and are contained in it.
    /// @param reached all that it contains
    [[nodiscard]] std::vector<Node> CycleOf(Node node, std::vector<Node> const& reached) const;
    [[nodiscard]] Above TurnLinks(std::vector<Node> const& nodes) const;
    template <class Visit>
    static void ForEachAbove(Above const& above, Node node, Visit const& visit) {
        if (auto const found = above.find(node); found != above.end())
            std::for_each(found->second.begin(), found->second.end(), visit);
    }
    [[nodiscard]] std::uint64_t MarkAbove(std::span<const Node> commits, Above const& above);

    AncestryReader read_;
    std::unordered_map<Id, Node> numbers_;
    std::vector<Entry> entries_;
    std::vector<Node> links_;
    std::vector<Mark> marks_;
    std::uint64_t walk_ = 0;
};

} // namespace KivArchive
