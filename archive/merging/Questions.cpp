#include "Questions.h"

#include <KivVcs/Helpers.h>

#include <utility>

namespace KivArchive {

namespace {

using KivVcs::ChangeKind;
using KivVcs::ConflictChoice;
using KivVcs::ConflictSettlement;
using KivVcs::TreeConflictChoice;

ChangeKind ChangeOf(BaseEntry const& before, HeldEntry const& after) noexcept {
    HeldEntry const nothing;
    HeldEntry const& old = before ? *before : nothing;
    if (after.IsNothing())
        return before && old.IsNothing() ? ChangeKind::Unchanged : ChangeKind::Removed;
    if (old.IsNothing())
        return ChangeKind::Added;
    if (old == after)
        return ChangeKind::Unchanged;
    if (static_cast<bool>(old.directory) == static_cast<bool>(after.directory))
        return ChangeKind::Changed;
    return after.directory ? ChangeKind::FileBecameDirectory : ChangeKind::DirectoryBecameFile;
}

KivStringT<char16_t> Join(std::vector<KivStringViewT<char16_t>> const& path) {
    KivStringT<char16_t> joined;
    for (auto const& component : path) {
        if (!joined.IsEmpty())
            joined += u'/';
        joined += component;
    }
    return joined;
}

/// Enters a directory for as long as it exists.
class Entering {
public:
    Entering(Questions& questions, KivStringT<char16_t> const& name) : questions_(questions) { questions_.Enter(name); }
    Entering(Entering const&) = delete;
    Entering& operator=(Entering const&) = delete;
    ~Entering() { questions_.Leave(); }

private:
    Questions& questions_;
};

HeldEntry const& Chosen(ConflictSettlement settlement, HeldEntry const& left, HeldEntry const& right,
                        BaseEntry const& base) noexcept {
    if (settlement == ConflictSettlement::Root)
        return *base;
    return settlement == ConflictSettlement::Right ? right : left;
}

/// An answer that takes the base counts as undecided if there is none.
ConflictSettlement WhereThereIs(BaseEntry const& base, ConflictSettlement settlement) noexcept {
    return settlement == ConflictSettlement::Root && !base ? ConflictSettlement::Undecided : settlement;
}

bool IsOneName(KivStringT<char16_t> const& name) {
    auto const components = KivVcs::Helpers::SplitVcsPath(name);
    return components.size() == 1 && components.front() == KivStringViewT<char16_t>(name);
}

} // namespace

HeldEntry Questions::AskAboutEntry(KivStringT<char16_t> const& name, HeldEntry const& left, HeldEntry const& right,
                                   BaseEntry const& base) {
    Entering const entering(*this, name);
    ShowBase(base);
    if (auto const merged = AskForContent(left, right, base)) {
        Note(left, right, base, false,
             *merged == left    ? ConflictSettlement::Left
             : *merged == right ? ConflictSettlement::Right
                                : ConflictSettlement::Combined);
        return *merged;
    }
    ConflictSettlement const settlement = AskForChoice(base);
    Note(left, right, base, false, settlement);
    return Chosen(settlement, left, right, base);
}

Questions::KindAnswer Questions::AskAboutKinds(KivStringT<char16_t> const& name, HeldEntry const& left,
                                               HeldEntry const& right, BaseEntry const& base, IsFree const& isFree) {
    Entering const entering(*this, name);
    ShowBase(base);
    if (auto answer = AskForKind(left, right, isFree)) {
        bool const isPlain = answer->fileName.IsEmpty();
        Note(left, right, base, false,
             isPlain && answer->entry == left    ? ConflictSettlement::Left
             : isPlain && answer->entry == right ? ConflictSettlement::Right
                                                 : ConflictSettlement::Combined);
        return std::move(*answer);
    }
    ConflictSettlement const settlement = AskForChoice(base);
    Note(left, right, base, false, settlement);
    return {Chosen(settlement, left, right, base), {}};
}

std::optional<HeldEntry> Questions::AskForContent(HeldEntry const& left, HeldEntry const& right,
                                                  BaseEntry const& base) {
    if (gaveUp_ || !resolvers_.contents || !left.file || !right.file)
        return {};
    auto const contentOf = [this](Blob const& file) {
        return sources_.content ? sources_.content(file) : file.GetData();
    };
    DisputedContents contents;
    if (base && base->file)
        contents.base = contentOf(*base->file);
    contents.left = contentOf(*left.file);
    contents.right = contentOf(*right.file);
    auto merged = resolvers_.contents(path_, contents);
    if (!merged)
        return {};
    cow_ptr<Blob> file(KivVcs::emplace, std::move(*merged));
    Id const id = file->GetId();
    return HeldEntry{std::move(file), nullptr, id};
}

std::optional<Questions::KindAnswer> Questions::AskForKind(HeldEntry const& left, HeldEntry const& right,
                                                           IsFree const& isFree) {
    if (gaveUp_ || !resolvers_.kinds)
        return {};
    KindDecision decision = resolvers_.kinds(path_, trees_);
    HeldEntry const& file = left.file ? left : right;
    HeldEntry const& directory = left.file ? right : left;
    switch (decision.keep) {
    case KindDecision::Keep::File:
        return KindAnswer{file, {}};
    case KindDecision::Keep::Directory:
        return KindAnswer{directory, {}};
    case KindDecision::Keep::None:
        return KindAnswer{};
    case KindDecision::Keep::Both:
        if (IsOneName(decision.fileName) && isFree(decision.fileName))
            return KindAnswer{directory, std::move(decision.fileName)};
        break;
    case KindDecision::Keep::Undecided:
        break;
    }
    return {};
}

ConflictSettlement Questions::AskForChoice(BaseEntry const& base) {
    auto const& ask = resolvers_.choices.blobResolver;
    return WhereThereIs(base, SettlementOf(gaveUp_ || !ask ? ConflictChoice::Undecided : ask(path_, trees_)));
}

TreeConflictChoice Questions::AskAboutDirectory(HeldEntry const& left, HeldEntry const& right, BaseEntry const& base) {
    auto const& ask = resolvers_.choices.treeResolver;
    if (gaveUp_)
        return TreeConflictChoice::Merge;
    TreeConflictChoice const choice = ask ? ask(path_, trees_) : TreeConflictChoice::Undecided;
    auto const answer = SettlementOf(choice);
    if (!answer)
        return TreeConflictChoice::Merge;
    ConflictSettlement const settlement = WhereThereIs(base, *answer);
    Note(left, right, base, true, settlement);
    return settlement == ConflictSettlement::Undecided ? TreeConflictChoice::Merge : choice;
}

/// Unless the root that resolvers see is the tree of the only base, puts the base of this entry into it.
void Questions::ShowBase(BaseEntry const& base) {
    if (isRootWhole_ || gaveUp_ || !base)
        return;
    if (base->file)
        trees_.root.write()->AddObjectToTree(&repo_, path_, *base->file);
    else if (base->directory)
        trees_.root.write()->AddObjectToTree(&repo_, path_, *base->directory);
}

void Questions::Note(HeldEntry const& left, HeldEntry const& right, BaseEntry const& base, bool isDirectory,
                     ConflictSettlement settlement) {
    conflicts_.push_back({Join(path_), isDirectory, ChangeOf(base, left), ChangeOf(base, right), base ? base->id : Id(),
                          left.id, right.id, settlement});
    gaveUp_ = gaveUp_ || settlement == ConflictSettlement::Undecided;
}

ContentResolver MergeTexts(std::uint64_t maximumBytes) {
    return [maximumBytes](auto const& /*path*/, DisputedContents const& contents) -> std::optional<Buffer> {
        if (!contents.base)
            return {};
        TextMergeOptions options;
        options.maximumBytes = maximumBytes;
        TextMerge merge = MergeTextLines(*contents.base, contents.left, contents.right, options);
        return merge.result == TextMergeResult::Merged ? std::optional(std::move(merge.text)) : std::nullopt;
    };
}

} // namespace KivArchive
