#include "Fuzzing.h"

#include <map>

/// Adding, finding, removing, listing and comparing by any paths, beside a plain map from paths to contents.
///
/// An input is a sequence of operations, each a letter and a path that ends at a line break. Bytes from 0x80 on begin a
/// code unit of two bytes.

namespace KivVcs::Fuzzing {
namespace {

Text ReadPath(Input& input) {
    Text path;
    for (unsigned byte = 0; !input.IsUsedUp() && (byte = input.Byte()) != '\n';) {
        const unsigned unit = byte < 0x80 ? byte : (byte < 0xC0 ? 0xC000 : 0) + (byte & 0x3F) * 256 + input.Byte();
        path += static_cast<char16_t>(std::max(unit, 1U));
    }
    return path;
}

Text Joined(Text const& directory, Path name) {
    return directory.IsEmpty() ? name.ToString() : directory + u"/" + name;
}

/// A tree and what it must hold.
struct World {
    cow_ptr<Tree> tree = immu::make<Tree>();
    std::map<Text, char> blobs;

    void Remove(Text const& path) {
        blobs.erase(path);
        // "0" follows "/", so that these are the blobs below the path.
        blobs.erase(blobs.lower_bound(path + u"/"), blobs.lower_bound(path + u"0"));
    }

    void Check() const {
        const PathList listed = tree->GetDeepBlobPaths();
        Require(listed.size() == blobs.size() && tree->GetDeepBlobCount() == blobs.size(), "all blobs are listed");
        auto path = listed.begin();
        for (auto const& [name, content] : blobs) {
            char found = 0;
            const auto blob = tree->GetDeepBlob(*path);
            Require(*path++ == name, "paths are listed in order");
            Require(blob && blob->GetData().Read(0, &found, 1) && found == content, "what was added is found");
        }
    }
};

/// Enough entries for a table of several nodes.
World MakeMany(Repository& repository) {
    World world;
    for (char16_t name[] = u"A"; *name < u'A' + 36; ++*name) {
        world.tree.write()->AddBlob(&repository, name, MakeBlob('m'));
        world.blobs[name] = 'm';
    }
    return world;
}

void Compare(World const& older, World const& newer) {
    PathList differing;
    for (auto const& [path, content] : older.blobs) {
        auto const found = newer.blobs.find(path);
        if (found == newer.blobs.end() || found->second != content)
            differing.push_back(path);
    }
    for (auto const& [path, content] : newer.blobs) {
        if (!older.blobs.contains(path))
            differing.push_back(path);
    }
    std::sort(differing.begin(), differing.end());
    Require(newer.tree->GetDeepBlobDiffs(older.tree) == differing, "exactly what differs is listed");
}

/// One version that is edited, and one before it.
struct Versions {
    World world;
    World older;

    void Do(Repository& repository, char operation, Text const& written) {
        const auto components = Helpers::SplitVcsPath(written);
        Tree* const tree = world.tree.write();
        const auto found = tree->GetDeepObject(written);
        Text path;
        // Identifiers do not cover a directory beside a blob of its name.
        bool isBelowBlob = components.empty();
        for (auto const& component : components) {
            isBelowBlob = isBelowBlob || world.blobs.contains(path);
            path = Joined(path, component);
        }
        if (operation == '+' && !isBelowBlob && !tree->GetDeepTree(components)) {
            const char content = "012"[written.GetLength() % 3];
            const auto blob = tree->AddBlob(&repository, written, MakeBlob(content));
            Require(blob && tree->GetDeepBlob(path) == blob, "what was added is found");
            world.blobs[path] = content;
        } else if (operation == '-') {
            Require(tree->RemoveObject(&repository, written) == (found != nullptr), "what is there is removed");
            Require(!tree->GetDeepObject(path), "what was removed is not found");
            if (found)
                world.Remove(path);
        } else if (operation == '<') {
            // So that an identifier is there for edits to drop.
            static_cast<void>(tree->GetId());
            older = world;
        } else if (operation == '>') {
            std::swap(world, older);
        } else if (operation == '=' && !isBelowBlob && !world.blobs.contains(path) && world.blobs.size() < 20) {
            const World added = older.blobs.empty() ? MakeMany(repository) : older;
            Require(tree->AddTree(&repository, written, *added.tree) != nullptr, "a tree is added");
            world.Remove(path);
            for (auto const& [below, content] : added.blobs)
                world.blobs[Joined(path, below)] = content;
        } else {
            Require(!found || *tree->GetIdByPath(path) == found->GetId(), "identifiers are found by path");
        }
    }
};

void Run(Input input) {
    const auto repository = MakeRepository();
    Versions versions;
    while (!input.IsUsedUp()) {
        const char operation = "+-<>==+!"[input.Byte() % 8];
        versions.Do(*repository, operation, ReadPath(input));
    }
    for (World const* each : {&versions.world, &versions.older}) {
        each->Check();
        const auto stored = repository->SyncWithStorage(each->tree);
        Require(stored->GetDeepBlobPaths() == each->tree->GetDeepBlobPaths(), "equal identifiers mean equal content");
    }
    Compare(versions.older, versions.world);
    // Versions in between would take most of the time.
    repository->UpdateStorage();
    RequireConsistency(*repository->GetStorage());
}

} // namespace
} // namespace KivVcs::Fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    KivVcs::Fuzzing::Run({data, size});
    return 0;
}
