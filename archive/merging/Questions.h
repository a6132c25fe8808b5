#pragma once

/// @file
/// What a merge asks its resolvers, and what they answer.

#include "EntryBases.h"

namespace KivArchive {

/// Asks the resolvers of a merge, and lists what they were asked about. Once something was left undecided it asks no
/// more, and lists everything else as undecided, too.
class Questions {
public:
    using IsFree = std::function<bool(KivStringT<char16_t> const& name)>;

    struct KindAnswer {
        HeldEntry entry;
        /// The name under which the file is kept beside the directory; empty if it is not.
        KivStringT<char16_t> fileName;
    };

    Questions(KivVcs::IRepository& repo, MergeSources const& sources, MergeResolvers const& resolvers,
              KivVcs::MergeTrees trees)
        : repo_(repo), sources_(sources), resolvers_(resolvers), trees_(std::move(trees)),
          isRootWhole_(static_cast<bool>(trees_.root)) {}

    /// The directory that questions are about from now on. The view must stay valid until `Leave`.
    void Enter(KivStringViewT<char16_t> name) { path_.push_back(name); }
    void Leave() noexcept { path_.pop_back(); }

    /// The merged entry, for one that is a directory on at most one side. Meaningless after giving up.
    [[nodiscard]] HeldEntry AskAboutEntry(KivStringT<char16_t> const& name, HeldEntry const& left,
                                          HeldEntry const& right, BaseEntry const& base);
    [[nodiscard]] KindAnswer AskAboutKinds(KivStringT<char16_t> const& name, HeldEntry const& left,
                                           HeldEntry const& right, BaseEntry const& base, IsFree const& isFree);
    /// How the directory itself is merged. Never `Undecided`, and `Root` only if there is a base: after giving up the
    /// merge goes on inside, to list what is left.
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
    /// Whether resolvers see the tree of the only base as root. Otherwise they see a tree that `ShowBase` puts
    /// together.
    bool isRootWhole_;
    std::vector<KivStringViewT<char16_t>> path_;
    std::vector<KivVcs::MergeConflict> conflicts_;
    bool gaveUp_ = false;
};

} // namespace KivArchive
