#pragma once

/// @file
/// Operations that move several branches, or none when an exception ends them.

#include "KivVcs/Storage.h"

namespace KivVcs {

/// The branches that an operation has moved or made. Takes that back when it dies, unless told to keep it.
///
/// Holds the former heads, and nothing of them once the moves are kept. The names must outlive it.
class BranchMoves {
public:
    /// @param storage may be null, and then has no branches
    /// @param limit the number of branches at most, so that noting them takes no memory
    BranchMoves(IObjectsStorage* storage, std::size_t limit) : storage_(storage) { moves_.reserve(limit); }
    BranchMoves(BranchMoves const&) = delete;
    BranchMoves& operator=(BranchMoves const&) = delete;
    ~BranchMoves() {
        for (; storage_ != nullptr && !moves_.empty(); moves_.pop_back())
            TakeBack(moves_.back());
    }

    void NoteMove(KivStringViewT<char16_t> branch, cow_ptr<Commit> formerHead) noexcept {
        moves_.push_back({branch, std::move(formerHead)});
    }
    void NoteNew(KivStringViewT<char16_t> branch) noexcept { moves_.push_back({branch, nullptr}); }

    void Keep() noexcept { moves_.clear(); }

private:
    struct Move {
        KivStringViewT<char16_t> branch;
        /// Null for a branch that has been made.
        cow_ptr<Commit> formerHead;
    };

    /// Directly, since it may be the host's own operation that has failed.
    void TakeBack(Move& move) noexcept {
        try {
            if (move.formerHead)
                storage_->UpdateBranch(move.branch, std::move(move.formerHead));
            else
                storage_->RemoveBranch(move.branch);
        } catch (...) {
            // The storage cannot: the branch stays where it is, and the exception that ended the operation tells of it.
            return;
        }
    }

    IObjectsStorage* storage_;
    std::vector<Move> moves_;
};

} // namespace KivVcs
