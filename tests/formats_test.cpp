#include <KivVcs/KivVcs.h>

#include <gtest/gtest.h>

#include <string>
#include <string_view>

namespace KivVcs {
namespace {

using namespace std::string_literals;

constexpr auto hello = "8aec4e4876f854f688d0ebfc8f37598f38e5fd6903cccc850ca36591175aeb60";
constexpr auto empty = "473a0f4c3be8a93681a267e3b1e9a7dcda1185436fe141f7749120a303721813";
constexpr auto directory = "b117f1534d71e974e052d4dfed4b624681f38c7f9308e72d80f5696f97ee1f72";
constexpr auto files = "4792f1fea516f48f7819b493f97f80ba6411780d1ed90cc3f7073affebc91587";
constexpr auto first = "78a3d5382550bb4805422f70e95b494fbdcd83289ed57853738f46471c82bb33";

std::string PackedForm(Object const& object) {
    auto const text = Helpers::StringAFromBuffer(object.GetPackedData());
    return {text.GetString(), static_cast<std::size_t>(text.GetLength())};
}

std::string IdText(Object const& object) {
    return DataEncoding::Utf8Encode(object.GetId().GetText()).GetString();
}

Blob MakeBlob(std::string_view content) {
    Buffer data;
    data.Append(content.data(), content.size());
    return Blob(data);
}

void Sign(Commit& commit, std::int64_t seconds, std::int64_t biasInMinutes, KivStringT<char16_t> const& description) {
    commit.SetAuthorName(u"Ada");
    commit.SetAuthorEmail(u"ada@example.org");
    commit.SetCommitTime(Time::FromTimeT(seconds, TimeZone::Utc));
    commit.SetCommitTimezoneBias(TimeDelta(biasInMinutes * 600'000'000));
    commit.SetDescription(description);
}

/// The examples of docs/formats.md. Their identifiers come from sha256sum.
TEST(Formats, DocumentedExamplesAreExact) {
    Repository repository(std::make_unique<MemObjectsStorage>());
    Commit one(&repository, false);
    one.AddBlob(&repository, u"d/\u00e9.txt", Blob());
    one.AddBlob(&repository, u"a.txt", MakeBlob("hello"));
    Sign(one, 1'700'000'000, 60, u"Start");
    Commit two(repository.SyncWithStorage(immu::make<Commit>(one)), false);
    two.ReplaceRoot(&repository, one.GetCommitTree()->GetTree(u"d"));
    Sign(two, 1'700'003'600, -330, u"Keep d");

    auto const root = one.GetCommitTree()->GetRoot();
    struct {
        Object const& object;
        std::string id;
        std::string packed;
    } const examples[] = {
        {*one.GetBlob(u"d/\u00e9.txt"), empty, "blob 0\0"s},
        {*one.GetBlob(u"a.txt"), hello, "blob 5\0hello"s},
        {Tree(), "6ef19b41225c5369f1c104d45d8d85efa9b057b53b14b4b9b939dd74decc5321", "tree 0\0"s},
        {*root->GetLocalTree(u"d"), directory, "tree 83\0"s + "100644 blob \303\251.txt\0"s + empty},
        {*root, files, "tree 159\0"s + "100644 blob a.txt\0"s + hello + "40000 tree d\0"s + directory},
        {one, first,
         "commit 172\0tree "s + files +
             "\nauthor Ada <ada@example.org> 1700000000 +0100\ncommitter Ada <ada@example.org> 1700000000 "
             "+0100\n\nStart\n"},
        {two, "f2212c3c905dfd34b2ce7ccdc9d6975843cc2b072b28b13a8479e34c4e8f6172",
         "commit 245\0tree "s + directory + "\nparent " + first +
             "\nauthor Ada <ada@example.org> 1700003600 -0530\ncommitter Ada <ada@example.org> 1700003600 "
             "-0530\n\nKeep d\n"},
    };
    for (auto const& example : examples) {
        EXPECT_EQ(PackedForm(example.object), example.packed);
        EXPECT_EQ(IdText(example.object), example.id);
    }
}

} // namespace
} // namespace KivVcs
