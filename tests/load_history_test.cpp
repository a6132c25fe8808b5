#include "load_history.h"

#include "support/Builders.h"

#include <gtest/gtest.h>

#include <set>

/// The loader that the documents show.

namespace KivVcs {
namespace {

/// Everything that a repository stores, by identifier.
std::map<Id, Buffer> FormsOf(Repository const& repository) {
    std::map<Id, Buffer> forms;
    const auto keep = [&forms](auto const& table) {
        for (auto const& [id, object] : table)
            forms.emplace(id, object->GetPackedData());
    };
    IObjectsStorage const& storage = *repository.GetStorage();
    keep(storage.GetBlobs());
    keep(storage.GetTrees());
    keep(storage.GetCommits());
    return forms;
}

Fetch From(std::map<Id, Buffer> const& forms) {
    return [&forms](Id const& id) {
        const auto found = forms.find(id);
        return found == forms.end() ? Buffer() : found->second;
    };
}

/// Commits whose texts are easily misread, one on top of the other.
cow_ptr<Commit> GrowMisleadingHistory(Repository& repository) {
    const std::string id(64, 'a');
    cow_ptr<Commit> parent;
    const auto grow = [&](Commit commit, std::string const& description, std::string const& name, std::int64_t seconds,
                          std::int64_t biasMinutes) {
        commit.SetParent(parent);
        commit.SetDescription(FromUtf8(description));
        commit.SetAuthorName(FromUtf8(name));
        commit.SetAuthorEmail(FromUtf8(name + "@example.org"));
        commit.SetCommitTime(Time::FromTimeT(seconds, TimeZone::Utc));
        commit.SetCommitTimezoneBias(TimeDelta(biasMinutes * 600'000'000));
        parent = repository.SyncWithStorage(immu::make<Commit>(commit));
    };
    grow(Commit(), "Fix\n\nparent " + id + "\nauthor Eve <> 1 +0000", "", 0, 0);
    Commit emptied(nullptr, false);
    emptied.ReplaceRoot(&repository, immu::make<Tree>());
    grow(emptied, "", "L\303\251a <lea> 7 ", 2'000'000'000, -330);
    Commit files(nullptr, false);
    files.AddBlob(&repository, u"d/x", MakeBlob("1"));
    files.AddBlob(&repository, u"y", MakeBlob("1"));
    files.AddTree(&repository, u"empty", Tree());
    grow(files, "tree " + id + "\n\n", "author ", 4'000'000'000, 345);
    grow(Commit(), "\n\n\n", "> ", -5, -59);
    return parent;
}

TEST(LoadingAHistory, GivesTheSameCommitsWhateverTheirTextsLookLike) {
    Repository source(std::make_unique<MemObjectsStorage>());
    const auto head = GrowMisleadingHistory(source);
    const auto forms = FormsOf(source);
    for (bool holdsTheRoot : {false, true}) {
        Repository target(std::make_unique<MemObjectsStorage>());
        Commit own(nullptr, false);
        own.AddBlob(&target, u"own", MakeBlob("own"));
        const auto ownHead = target.DoCommit(own);
        cow_ptr<Commit> root;
        if (holdsTheRoot)
            root = LoadHistory(target, head->GetParent()->GetParent()->GetParent()->GetId(), From(forms));
        const auto loaded = LoadHistory(target, head->GetId(), From(forms));
        ASSERT_TRUE(loaded);
        EXPECT_EQ(loaded->GetId(), head->GetId());
        const auto first = loaded->GetParent()->GetParent()->GetParent();
        EXPECT_EQ(first->GetParent(), nullptr);
        EXPECT_EQ(first->GetDescription(), head->GetParent()->GetParent()->GetParent()->GetDescription());
        EXPECT_TRUE(!holdsTheRoot || first == root);
        EXPECT_EQ(Files(loaded->GetParent()->GetCommitTree()->GetRoot()), "d/x=1 empty/ y=1");
        EXPECT_EQ(LoadHistory(target, head->GetId(), From({})), loaded);
        EXPECT_EQ(target.GetHead(), ownHead);
    }
}

TEST(LoadingAHistory, TakesNothingThatIsMissingOrDamaged) {
    Repository source(std::make_unique<MemObjectsStorage>());
    const auto head = GrowMisleadingHistory(source);
    const auto forms = FormsOf(source);
    std::set<Id> needed;
    Repository sound(std::make_unique<MemObjectsStorage>());
    LoadHistory(sound, head->GetId(), [&](Id const& id) {
        needed.insert(id);
        return forms.at(id);
    });
    EXPECT_EQ(needed.size(), 7U);
    for (auto const& id : needed) {
        std::string bytes = Bytes(forms.at(id));
        bytes.back() = static_cast<char>(bytes.back() ^ 1);
        for (Buffer const& wrong : {Buffer(), Blob::CopyText(bytes).GetData()}) {
            auto damaged = forms;
            damaged[id] = wrong;
            Repository target(std::make_unique<MemObjectsStorage>());
            EXPECT_EQ(LoadHistory(target, head->GetId(), From(damaged)), nullptr) << id;
        }
    }
    // Sound as objects, but no commits that the text can hold.
    for (auto const* text :
         {"", "tree \n", "tree \nauthor a\n\n\n", "tree \nauthor  <> 1 +0000\ncommitter  <> 2 +0000\n\n\n",
          "tree \nauthor > <\ncommitter > <\n\n\n", "tree \nauthor  <>\ncommitter  <>\n\n\n"}) {
        Buffer form;
        Helpers::AppendToBuffer(form, "commit " + std::to_string(std::string_view(text).size()));
        form.Append("", 1);
        Helpers::AppendToBuffer(form, text);
        Repository target(std::make_unique<MemObjectsStorage>());
        EXPECT_EQ(LoadHistory(target, Id(form), From({{Id(form), form}})), nullptr) << text;
    }
}

} // namespace
} // namespace KivVcs
