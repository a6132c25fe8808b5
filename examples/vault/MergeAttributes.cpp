#include "MergeAttributes.h"

#include "Names.h"
#include "Problem.h"

#include <algorithm>
#include <unordered_set>

namespace vault {

using KivVcs::cow_ptr;
using KivVcs::Tree;

namespace {

/// What a merge starts from at one path.
struct Origins {
    Id left;
    Id right;
    std::vector<Id> bases;
};

/// A directory on the way from the top to where the merge is.
struct Level {
    std::string path;
    cow_ptr<Tree> merged;
    Origins origins;
    Directory left;
    Directory right;
    std::vector<Directory> bases;
    std::vector<Entry> entries;
    std::size_t next = 0;
};

Id DirectoryId(Directory const& directory, std::string_view name) {
    auto const* const entry = directory.Find(name);
    return entry != nullptr && entry->isDirectory ? entry->id : Id();
}

class Merger {
public:
    Merger(IArchive& archive, MergedVersions const& versions)
        : archive_(archive), reader_(archive), versions_(versions) {}

    MergedTree Run(cow_ptr<Tree> const& merged) {
        Enter("", merged, {versions_.left, versions_.right, versions_.bases});
        for (;;) {
            auto& level = levels_.back();
            if (level.next < level.entries.size()) {
                Settle(level, level.entries[level.next]);
                continue;
            }
            KeepChangedModes(level);
            const bool isGone = levels_.size() > 1 && IsGone(level);
            const auto id = isGone ? Id() : Finish(level);
            levels_.pop_back();
            if (levels_.empty()) {
                result_.tree = id;
                break;
            }
            auto& above = levels_.back();
            if (isGone)
                above.entries.erase(above.entries.begin() + static_cast<std::ptrdiff_t>(above.next));
            else
                above.entries[above.next++].id = id;
        }
        AddContents();
        return std::move(result_);
    }

private:
    void Enter(std::string path, cow_ptr<Tree> const& merged, Origins origins) {
        Level level;
        std::vector<Id> trees{origins.left, origins.right};
        trees.insert(trees.end(), origins.bases.begin(), origins.bases.end());
        const auto read = reader_.Read(trees);
        const auto take = [&read](Id const& id) {
            const auto found = read.find(id);
            if (found == read.end())
                throw Problem("a directory is damaged or missing: " + DigitsOf(id), findingsExitStatus);
            return found->second;
        };
        level.left = take(origins.left);
        level.right = take(origins.right);
        for (auto const& base : origins.bases)
            level.bases.push_back(take(base));
        const auto add = [&level](KivVcs::PathList const& names, bool isDirectory) {
            for (auto const& name : names) {
                auto stored = KivVcs::ToUtf8(name);
                if (!IsOwn(stored))
                    level.entries.push_back({std::move(stored), isDirectory, {}, {}});
            }
        };
        add(merged->GetLocalBlobPaths(), false);
        add(merged->GetLocalSubtreePaths(), true);
        std::sort(level.entries.begin(), level.entries.end(),
                  [](Entry const& one, Entry const& other) { return ComesBefore(one.name, other.name); });
        level.path = std::move(path);
        level.merged = merged;
        level.origins = std::move(origins);
        levels_.push_back(std::move(level));
    }

    void Settle(Level& level, Entry& entry) {
        const auto name = KivVcs::FromUtf8(entry.name);
        if (entry.isDirectory) {
            SettleDirectory(level, entry, level.merged->GetLocalTree(name));
            return;
        }
        const auto blob = level.merged->GetLocalBlob(name);
        entry.id = blob->GetId();
        contents_.emplace(entry.id, blob);
        const auto find = [&entry](Directory const& directory) {
            auto const* const found = directory.Find(entry.name);
            return found != nullptr && !found->isDirectory ? found : nullptr;
        };
        std::optional<Attributes> base;
        for (std::size_t i = 0; i < level.bases.size(); ++i) {
            auto const* const found = find(level.bases[i]);
            const auto attributes = found != nullptr ? found->attributes : std::nullopt;
            base = i == 0 || (base && attributes && base->IsLike(*attributes)) ? attributes : std::nullopt;
        }
        Choose(level.path, entry, find(level.left), find(level.right), base);
        ++level.next;
    }

    /// Enters a directory that both sides changed; any other is one side's.
    void SettleDirectory(Level& level, Entry& entry, cow_ptr<Tree> const& merged) {
        Origins origins{DirectoryId(level.left, entry.name), DirectoryId(level.right, entry.name), {}};
        for (auto const& base : level.bases)
            origins.bases.push_back(DirectoryId(base, entry.name));
        const auto& id = merged->GetId();
        const auto isChanged = [&origins](Id const& side) {
            return origins.bases.empty() || std::any_of(origins.bases.begin(), origins.bases.end(),
                                                        [&](Id const& base) { return base != side; });
        };
        const bool isLeft = id == origins.left && (origins.right.IsEmpty() || !isChanged(origins.right));
        const bool isRight = id == origins.right && (origins.left.IsEmpty() || !isChanged(origins.left));
        if (isLeft || isRight || (id == origins.left && id == origins.right)) {
            entry.id = id;
            ++level.next;
            return;
        }
        Enter(level.path + entry.name + '/', merged, std::move(origins));
    }

    /// Gives an entry its attributes. Where a link stands against a file whose mode was changed, it is the entry of one side.
    void Choose(std::string const& directory, Entry& entry, Entry const* left, Entry const* right,
                std::optional<Attributes> const& base) {
        if (left == nullptr || right == nullptr || !left->attributes || !right->attributes) {
            auto const* const only = left != nullptr && (left->attributes || right == nullptr) ? left : right;
            entry.attributes = only == nullptr ? std::nullopt : only->attributes;
            return;
        }
        const auto path = directory + entry.name;
        const bool isAsked = !versions_.settled.contains(path);
        auto const* const source = entry.id == right->id ? right : left;
        auto const* const preferred = isAsked ? (versions_.prefersRight ? right : left) : source;
        const auto before = result_.conflicts.size();
        auto chosen = Combine(path, *left->attributes, *right->attributes, base, preferred == right, isAsked);
        if (left->id == right->id) {
            entry.attributes = chosen;
            return;
        }
        if (left->attributes->isLink != right->attributes->isLink && result_.conflicts.size() > before) {
            entry = *preferred;
            return;
        }
        // A link is what its content is.
        chosen.isLink = source->attributes->isLink;
        if (entry.id == source->id)
            chosen.time = source->attributes->time;
        entry.attributes = chosen;
    }

    Attributes Combine(std::string const& path, Attributes const& left, Attributes const& right,
                       std::optional<Attributes> const& base, bool isRight, bool isAsked) {
        auto chosen = isRight ? right : left;
        chosen.time = std::max(left.time, right.time);
        if (base && base->IsLike(left)) {
            chosen.mode = right.mode;
            chosen.isLink = right.isLink;
        } else if (base && base->IsLike(right)) {
            chosen.mode = left.mode;
            chosen.isLink = left.isLink;
        } else if (!left.IsLike(right) && isAsked) {
            const auto wordFor = [&](Attributes const& side, Attributes const& other) {
                return side.isLink == other.isLink ? "changed its mode"
                       : side.isLink               ? "made it a link"
                                                   : "changed the file's mode";
            };
            result_.conflicts.push_back({path, wordFor(left, right), wordFor(right, left)});
        }
        return chosen;
    }

    /// A file that one side removed while the other one changed nothing but its mode goes without a question from a merge of
    /// contents; it is for somebody to decide, too.
    void KeepChangedModes(Level& level) {
        if (level.bases.empty())
            return;
        for (auto const& before : level.bases.front().entries) {
            auto const* const left = level.left.Find(before.name);
            auto const* const right = level.right.Find(before.name);
            auto const* const only = left != nullptr ? left : right;
            const bool isChanged = (left == nullptr) != (right == nullptr) && !before.isDirectory &&
                                   !only->isDirectory && only->id == before.id && only->attributes &&
                                   before.attributes && !only->attributes->IsLike(*before.attributes);
            const auto at = std::lower_bound(
                level.entries.begin(), level.entries.end(), before.name,
                [](Entry const& entry, std::string const& name) { return ComesBefore(entry.name, name); });
            if (!isChanged || (at != level.entries.end() && at->name == before.name))
                continue;
            const auto wordFor = [](Entry const* side) { return side == nullptr ? "removed it" : "changed its mode"; };
            result_.conflicts.push_back({level.path + before.name, wordFor(left), wordFor(right)});
            if (versions_.prefersRight == (left == nullptr))
                level.entries.insert(at, *only);
        }
    }

    /// Whether nothing but attributes is left of a directory that one side removed.
    static bool IsGone(Level const& level) {
        auto const& origins = level.origins;
        return level.entries.empty() && (origins.left.IsEmpty() || origins.right.IsEmpty()) &&
               std::any_of(origins.bases.begin(), origins.bases.end(), [](Id const& base) { return !base.IsEmpty(); });
    }

    Id Finish(Level& level) {
        Directory directory{std::move(level.entries), {}, {}};
        std::optional<Attributes> base;
        if (level.bases.size() == 1)
            base = level.bases.front().own;
        auto const& left = level.left.own;
        auto const& right = level.right.own;
        directory.own = left && right ? Combine(level.path.empty() ? "." : level.path, *left, *right, base,
                                                versions_.prefersRight, true)
                        : left        ? left
                                      : right;
        auto packed = Pack(directory);
        std::unordered_set<Id> vouchedFor;
        for (auto const* const side : {&level.left, &level.right}) {
            for (auto const& entry : side->entries)
                vouchedFor.insert(entry.id);
        }
        for (auto const* const id : {&level.origins.left, &level.origins.right}) {
            if (!id->IsEmpty())
                result_.change.relied.push_back(*id);
        }
        for (auto const& entry : directory.entries) {
            if (!vouchedFor.contains(entry.id) && !added_.contains(entry.id) &&
                (entry.isDirectory || !contents_.contains(entry.id)))
                result_.change.relied.push_back(entry.id);
        }
        for (auto& content : packed.attributes)
            Add(std::move(content));
        packed.tree.earlier = level.origins.left;
        auto id = packed.tree.id;
        Add(std::move(packed.tree));
        return id;
    }

    /// The contents that the archive lacks come before everything else.
    void AddContents() {
        std::vector<Id> ids;
        for (auto const& [id, blob] : contents_)
            ids.push_back(id);
        for (auto const& id : archive_.FindMissing(ids)) {
            auto const& data = contents_.at(id)->GetData();
            if (data.GetSize() > KivArchive::largestWholeContent) {
                KivVcs::StreamIO stream(KivVcs::MemStream::CreateOnCopy(data));
                archive_.StoreContent(id, stream, {}, nullptr);
                result_.change.relied.push_back(id);
                continue;
            }
            result_.change.objects.insert(result_.change.objects.begin(), {id, KivArchive::ObjectType::Blob, data, {}});
        }
    }

    void Add(NewObject object) {
        if (added_.insert(object.id).second)
            result_.change.objects.push_back(std::move(object));
    }

    IArchive& archive_;
    TreeReader reader_;
    MergedVersions const& versions_;
    std::vector<Level> levels_;
    std::unordered_map<Id, cow_ptr<KivVcs::Blob>> contents_;
    std::unordered_set<Id> added_;
    MergedTree result_;
};

} // namespace

MergedTree MergeAttributes(IArchive& archive, cow_ptr<Tree> const& merged, MergedVersions const& versions) {
    return Merger(archive, versions).Run(merged);
}

} // namespace vault
