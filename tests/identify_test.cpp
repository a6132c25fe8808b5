#include "support/HostObjects.h"

#include <gtest/gtest.h>

#include <random>
#include <stdexcept>

/// Identifiers that are computed beside each other.

namespace KivVcs {
namespace {

using Pointers = std::vector<Object const*>;

/// Bytes that no two ranges of have in common by chance.
Buffer RandomBytes(std::size_t size) {
    return Buffer::Build(size, [size, random = std::mt19937(7)](std::byte* out) mutable {
        std::generate_n(out, size, [&random] { return static_cast<std::byte>(random()); });
    });
}

TEST(Identify, GivesWhatOneStreamGivesAtAllLengthsAndInAllPieces) {
    const Buffer source = RandomBytes(300'000);
    std::vector<Buffer> contents;
    for (std::size_t size = 0; size <= 620; ++size) {
        contents.emplace_back();
        contents.back().Append(source, size, size);
    }
    std::mt19937 random(11);
    for (int number = 0; number < 150; ++number) {
        Buffer& content = contents.emplace_back();
        // Large pieces are shared where they lie, at any alignment; small ones are copied to the end.
        for (auto pieces = 1 + random() % 5; pieces > 0; --pieces)
            content.Append(source, random() % 1000,
                           random() % 4 == 0 ? random() % 100 : 512 + random() % (1U << random() % 17));
    }
    std::shuffle(contents.begin(), contents.end(), random);
    for (const std::size_t count : {std::size_t{1}, std::size_t{2}, std::size_t{13}, contents.size()}) {
        std::vector<Blob> blobs;
        Pointers pointers{nullptr};
        for (std::size_t index = 0; index < count; ++index)
            blobs.emplace_back(contents[index]);
        for (Blob const& blob : blobs)
            pointers.push_back(&blob);
        const auto once = pointers;
        pointers.insert(pointers.end(), once.begin(), once.end());
        Identify(pointers);
        for (std::size_t index = 0; index < count; ++index) {
            ASSERT_NE(blobs[index].GetKnownDigest(), nullptr);
            ASSERT_EQ(blobs[index].GetId(), Id(Blob(contents[index]).GetPackedData())) << contents[index].GetSize();
        }
    }
    Identify(Pointers());
}

/// Hands out objects that nobody has identified.
class ForgetfulRepository final : public Repository {
public:
    ForgetfulRepository() : Repository(nullptr) {}
    using Repository::SyncWithStorage;
    cow_ptr<Tree> SyncWithStorage(cow_ptr<Tree> tree) override { return Forget(std::move(tree)); }
    cow_ptr<Blob> SyncWithStorage(cow_ptr<Blob> blob) override { return Forget(std::move(blob)); }

private:
    template <class T>
    static cow_ptr<T> Forget(cow_ptr<T> object) {
        if (object->IsOfHostClass())
            return object;
        auto copy = immu::make<T>(*object);
        copy.write()->ResetState();
        return copy;
    }
};

TEST(Identify, DoesWhatAnObjectShowsFirst) {
    ForgetfulRepository forgetful;
    Tree tree;
    for (int file = 0; file < 40; ++file)
        tree.AddBlob(&forgetful, Wide("d" + std::to_string(file % 7) + "/" + std::to_string(file)), MakeBlob("x"));
    tree.AddBlob(&forgetful, u"file", MakeBlob("top"));
    Tree const same = *MakeTree(forgetful, "file=top");
    auto line = immu::make<Commit>();
    line.write()->ReplaceRoot(nullptr, immu::make<Tree>(tree));
    for (int number = 0; number < 20'000; ++number)
        line = immu::make<Commit>(std::move(line), false);
    ASSERT_TRUE(tree.GetLocalTree(u"d1")->GetKnownDigest() == nullptr && line->GetKnownDigest() == nullptr);

    Identify(Pointers{line.get(), &tree, nullptr, &same, line->GetParent().get(), line.get()});
    for (Object const* object :
         Pointers{line.get(), &tree, &same, tree.GetLocalTree(u"d1").get(), tree.GetDeepBlob(u"d1/1").get()})
        EXPECT_NE(object->GetKnownDigest(), nullptr);
    Repository storing(std::make_unique<MemObjectsStorage>());
    Tree expected;
    for (auto const& path : tree.GetDeepBlobPaths())
        expected.AddBlob(&storing, path, *tree.GetDeepBlob(path));
    EXPECT_EQ(tree.GetId(), expected.GetId());
    EXPECT_EQ(same.GetId(), MakeTree(storing, "file=top")->GetId());
    Commit last = *line;
    last.ResetState();
    EXPECT_EQ(line->GetId(), last.GetId());
}

TEST(Identify, AsksObjectsOfHostsClassesInOrder) {
    std::string asked;
    bool broken = false;
    struct Named final : Blob {
        Named(Named const&) = default;
        Named(std::string& log, bool const& isBroken, char letter) : asked(&log), broken(&isBroken), name(letter) {}
        Id GetId() const override {
            if (*broken && name == 'c')
                throw std::runtime_error("not known");
            *asked += name;
            return Id(Wide(std::string("host's ") + name));
        }
        cow_ptr<Blob> Copy() const override { return immu::make<Named>(*this); }
        std::string* asked;
        bool const* broken;
        char name;
    };
    ForgetfulRepository forgetful;
    Tree tree;
    tree.AddBlob(&forgetful, u"file", Named(asked, broken, 'a'));
    tree.AddBlob(&forgetful, u"other", MakeBlob("x"));
    Named const others[] = {{asked, broken, 'b'}, {asked, broken, 'c'}};
    const Blob own = MakeBlob("own");
    const Pointers pointers{&others[0], &tree, &own, &others[1]};
    asked.clear();
    broken = true;
    EXPECT_THROW(Identify(pointers), std::runtime_error);
    EXPECT_EQ(asked, "ba");
    EXPECT_EQ(tree.GetKnownDigest(), nullptr);
    broken = false;
    Identify(pointers);
    // The directory asks again for what it shows.
    EXPECT_EQ(asked, "babaca");
    EXPECT_TRUE(tree.GetKnownDigest() != nullptr && own.GetKnownDigest() != nullptr);
    EXPECT_EQ(tree.GetId(), Id(tree.GetPackedData()));
    EXPECT_NE(Narrow(tree.ToString()).find("host's a"), std::string::npos);
}

} // namespace
} // namespace KivVcs
