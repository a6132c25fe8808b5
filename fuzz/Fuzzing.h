#pragma once

#include "KivVcs/KivVcs.h"

#include <cstdio>
#include <cstdlib>
#include <span>

/// What the fuzz targets share: decisions taken off an input, and promises that hold for all objects there are.

namespace KivVcs::Fuzzing {

using Text = KivStringT<char16_t>;
using Path = KivStringViewT<char16_t>;

/// Ends the program if a promise of the library is broken.
inline void Require(bool kept, const char* promise) {
    if (kept)
        return;
    std::fprintf(stderr, "Broken: %s\n", promise);
    std::abort();
}

/// The bytes of an input, taken one by one; zeros when they are used up.
class Input {
public:
    Input(const std::uint8_t* data, std::size_t size) : rest_(data, size) {}

    [[nodiscard]] bool IsUsedUp() const { return rest_.empty(); }
    unsigned Byte() {
        const unsigned byte = rest_.empty() ? 0 : rest_.front();
        rest_ = rest_.subspan(rest_.empty() ? 0 : 1);
        return byte;
    }

private:
    std::span<const std::uint8_t> rest_;
};

inline Blob MakeBlob(char content) {
    Buffer data;
    data.Append(&content, 1);
    return Blob(std::move(data));
}

/// A repository that holds nothing but the empty tree, which reading back would leave out.
inline std::unique_ptr<Repository> MakeRepository() {
    auto repository = std::make_unique<Repository>(std::make_unique<MemObjectsStorage>());
    repository->SyncWithStorage(immu::make<Tree>());
    return repository;
}

/// Requires that every object has the identifier of its content, and reads back from its packed form as it was.
inline void RequireConsistency(IObjectsStorage const& storage) {
    std::unordered_map<Id, Buffer> packed;
    const auto pack = [&packed](auto const& table) {
        for (auto const& [id, object] : table) {
            auto copy = *object;
            copy.ResetState();
            packed[id] = copy.GetPackedData();
            Require(id == object->GetId() && id == copy.GetId(), "a kept identifier is that of the content");
            Require(id == Id(packed[id]), "an identifier is that of the packed form");
        }
    };
    pack(storage.GetBlobs());
    pack(storage.GetTrees());
    pack(storage.GetCommits());
    const auto loader = [&packed](Id const& id) {
        auto const found = packed.find(id);
        return found == packed.end() ? StreamIO() : StreamIO(MemStream::CreateOnRef(found->second));
    };
    const auto repository = MakeRepository();
    for (auto const& [id, tree] : storage.GetTrees()) {
        const auto read = Tree::Deserialize(id, repository.get(), loader);
        Require(read && read->GetId() == id && read->GetLocalBlobPaths() == tree->GetLocalBlobPaths(),
                "a tree reads back as it was");
    }
    for (auto const& [id, commit] : storage.GetCommits()) {
        Id parent;
        auto read = Commit::Deserialize(id, parent, repository.get(), loader);
        Require(parent == (commit->GetParent() ? commit->GetParent()->GetId() : Id()), "a commit names its parent");
        read.write()->SetParent(commit->GetParent());
        Require(read->GetId() == id, "a commit reads back as it was");
    }
}

} // namespace KivVcs::Fuzzing
