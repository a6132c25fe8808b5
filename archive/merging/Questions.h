#pragma once

/// @file
/// What a merge asks its resolvers, and what came of it.

#include "EntryBases.h"

namespace KivArchive {

/// Stands between a merge and its resolvers. Keeps a list of what was asked; once something was left undecided it asks no
/// more, and everything that comes is noted as undecided, too.
class Questions {
public:
    using IsFree = std::function<bool(KivStringT<char16_t> const& name)>;

    struct KindAnswer {
        HeldEntry entry;
        /// Under which name the file goes beside the directory; empty if it does not.
        KivStringT<char16_t> fileName;
    };

    Questions(KivVcs::IRepository& repo, MergeSources const& sources, MergeResolvers const& resolvers,
              KivVcs::MergeTrees trees)
        : repo_(repo), sources_(sources), resolvers_(resolvers), trees_(std::move(trees)),
          isRootWhole_(static_cast<bool>(trees_.root)) {}

    /// The directory that questions are about from now on. The view must stay valid until `Leave`.
    void Enter(KivStringViewT<char16_t> name) { path_.push_back(name); }
    void Leave() noexcept { path_.pop_back(); }

    /// What becomes of an entry of the directory that is a directory on neither side or on one; after giving up, anything.
    [[nodiscard]] HeldEntry AskAboutEntry(KivStringT<char16_t> const& name, HeldEntry const& left,
                                          HeldEntry const& right, BaseEntry const& base);
    [[nodiscard]] KindAnswer AskAboutKinds(KivStringT<char16_t> const& name, HeldEntry const& left,
                                           HeldEntry const& right, BaseEntry const& base, IsFree const& isFree);
    /// What becomes of the directory itself, which is never undecided, and only `Root` if there is a base: once the merge has
    /// given up it goes on inside.
    [[nodiscard]] KivVcs::TreeConflictChoice AskAboutDirectory(HeldEntry const& left, HeldEntry const& right,
                                                               BaseEntry const& base);

    [[nodiscard]] bool GaveUp() const noexcept { return gaveUp_; }
    [[nodiscard]] std::vector<KivVcs::MergeConflict> TakeConflicts() noexcept { return std::move(conflicts_); }

private:
    [[nodiscard]] std::optional<HeldEntry> AskForContent(HeldEntry const& left, HeldEntry const& right,
                                                         BaseEntry const& base);
    [[nodiscard]] std::optional<KindAnswer> AskForKind(HeldEntry const& left, HeldEntry const& right,
                                                       IsFree const& isFree);
    [[nodiscard]] KivVcs::ConflictSettlement AskForChoice(BaseEntry const& base);
    void ShowBase(BaseEntry const& base);
    void Note(HeldEntry const& left, HeldEntry const& right, BaseEntry const& base, bool isDirectory,
              KivVcs::ConflictSettlement settlement);

    KivVcs::IRepository& repo_;
    MergeSources const& sources_;
    MergeResolvers const& resolvers_;
    KivVcs::MergeTrees trees_;
    /// False if what is shown as root is put together as it is needed.
    bool isRootWhole_;
    std::vector<KivStringViewT<char16_t>> path_;
    std::vector<KivVcs::MergeConflict> conflicts_;
    bool gaveUp_ = false;
};

} // namespace KivArchive
