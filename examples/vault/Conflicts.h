#pragma once

#include "Revision.h"

#include <string>
#include <vector>

namespace vault {

/// Who wins where both sides changed one file.
enum class ConflictPolicy {
    Left,
    Right,
    Base,
    /// The side whose nearest stamp file has the later time; where stamps do not decide, the side whose head was saved
    /// later.
    Newest,
    /// Nobody: the merge is called off.
    Stop,
};

/// Decides the conflicts of one merge by a policy and remembers them.
class Conflicts {
public:
    /// @p base may be null.
    Conflicts(ConflictPolicy policy, CommitHandle const& left, CommitHandle const& base, CommitHandle const& right);

    /// Resolvers for the merge; they refer to this object. With `Stop` they go on as with `Left`, so that every
    /// conflict is found.
    [[nodiscard]] KivVcs::Resolvers MakeResolvers();

    /// Gives the entries their owner that are a file on one side and a directory on the other. No resolver is asked
    /// about all of them: the merge takes files and directories one after the other, so that the later change would win
    /// unnoticed.
    void SettleKinds(KivVcs::Commit& merged, KivVcs::IRepository& repository);

    [[nodiscard]] bool IsEmpty() const noexcept { return paths_.empty(); }
    /// A line for each conflict, sorted; with what @p merged holds, unless that is null.
    [[nodiscard]] std::vector<std::string> Describe(CommitHandle const& merged) const;

private:
    [[nodiscard]] KivVcs::ConflictChoice Decide(KivVcs::array_view<TextView const> path,
                                                KivVcs::MergeTrees const& trees);
    [[nodiscard]] bool IsKindConflict(TextView path) const;

    ConflictPolicy policy_;
    KivVcs::MergeTrees trees_;
    KivVcs::BlobConflictResolver newest_;
    KivVcs::BlobConflictResolver resolver_;
    KivVcs::PathList paths_;
};

} // namespace vault
