#include "ArchiveFiles.h"
#include "ForwardingArchive.h"
#include "KivArchive/CachingArchive.h"
#include "KivArchive/MemArchive.h"
#include "KivArchive/Merging.h"

#include <gtest/gtest.h>

namespace {

using namespace KivArchive;
using namespace KivArchive::Conformance;

/// A `MemArchive` that counts what is read from it, and can be away or lie.
class FarArchive final : public ForwardingArchive {
public:
    MemArchive inner;
    int readObjects = 0;
    bool isAway = false;
    bool isLying = false;

    ReadOutcome Read(std::span<const Id> ids, ObjectReceiver const& receiver) override {
        readObjects += static_cast<int>(ids.size());
        return Reach().Read(ids, [&](ArchivedObject const& object) {
            auto const lie = std::as_bytes(std::span("lie"));
            receiver({object.id, object.type, object.size, isLying ? lie : object.data});
        });
    }
    std::optional<Buffer> ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) override {
        ++readObjects;
        return Reach().ReadContent(id, offset, size);
    }

protected:
    IArchive& Reach() override {
        if (isAway)
            throw ArchiveError(Failure::Unavailable, "far", "The far archive is away.");
        return inner;
    }
};

/// A file that counts what is stored in it.
class NearFile final : public ForwardingArchive {
public:
    NearFile(std::string const& path, int& changes) : file_(path), changes_(changes) {}

    ChangeOutcome Apply(Change const& change) override {
        ++changes_;
        return ForwardingArchive::Apply(change);
    }

protected:
    IArchive& Reach() override { return file_; }

private:
    SqliteArchive file_;
    int& changes_;
};

/// A cache of a file in front of a far archive.
struct CachingArchiveTest : testing::Test {
    TemporaryDirectory directory;
    std::shared_ptr<FarArchive> far = std::make_shared<FarArchive>();
    int changesOfNear = 0;

    std::shared_ptr<IArchive> OpenNear() { return std::make_shared<NearFile>(directory.Path("near"), changesOfNear); }
    CachingArchive OpenCache(std::uint64_t maximumBytes = 1U << 30U) {
        return {OpenNear(), far, {maximumBytes, std::chrono::milliseconds(0)}};
    }
    std::vector<Id> StoreFar(std::uint32_t seed, int count) {
        Change change;
        std::vector<Id> ids;
        for (int i = 0; i < count; ++i) {
            change.objects.push_back(
                Object(ObjectType::Blob, SomeNoise(seed * 1000 + static_cast<std::uint32_t>(i), 10000)));
            ids.push_back(change.objects.back().id);
        }
        far->inner.Apply(change);
        return ids;
    }
};

TEST_F(CachingArchiveTest, Conforms) {
    int number = 0;
    CheckArchiveConformance(
        [&] {
            return std::make_unique<CachingArchive>(
                std::make_shared<SqliteArchive>(directory.Path(std::to_string(number++))),
                std::make_shared<MemArchive>());
        },
        [](std::string const& failure) { ADD_FAILURE() << failure; });
}

TEST_F(CachingArchiveTest, ReadsOnceAndOnlyWhatIsTrue) {
    std::vector<Id> const ids = StoreFar(1, 3);
    {
        CachingArchive cache = OpenCache();
        far->isLying = true;
        ReadOutcome const outcome = cache.Read(ids, [](ArchivedObject const&) { ADD_FAILURE() << "a lie is given"; });
        EXPECT_EQ(outcome.damaged.size(), 3U);
        far->isLying = false;
        EXPECT_EQ(ReadAll(cache, ids).size(), 3U);
    }
    far->readObjects = 0;
    CachingArchive cache = OpenCache();
    EXPECT_EQ(ReadAll(cache, ids).size(), 3U);
    std::string const large = SomeNoise(77, 2500000);
    Id const id = Object(ObjectType::Blob, large).id;
    Buffer bytes = BufferOf(large);
    StreamIO stream(KivVcs::MemStream::CreateOnRef(bytes));
    EXPECT_TRUE(cache.StoreContent(id, stream, {}, nullptr));
    int const before = far->readObjects;
    EXPECT_EQ(before, 0);
    EXPECT_EQ(TextOf(cache.ReadContent(id, 2000000, 100).value_or(Buffer())), large.substr(2000000, 100));
    int const once = far->readObjects;
    EXPECT_EQ(TextOf(cache.ReadContent(id, 10, 100).value_or(Buffer())), large.substr(10, 100));
    EXPECT_EQ(far->readObjects, once);
}

TEST_F(CachingArchiveTest, LetsWhatWasNotUsedForLongestGo) {
    std::vector<Id> const used = StoreFar(2, 10);
    std::vector<Id> const others = StoreFar(3, 200);
    {
        CachingArchive cache = OpenCache();
        static_cast<void>(ReadAll(cache, others));
        static_cast<void>(ReadAll(cache, used));
    }
    constexpr std::uint64_t most = 1000000;
    CachingArchive cache = OpenCache(most);
    static_cast<void>(ReadAll(cache, used));
    for (std::uint32_t round = 0; round < 6; ++round) {
        static_cast<void>(ReadAll(cache, StoreFar(4 + round, 40)));
        far->readObjects = 0;
        static_cast<void>(ReadAll(cache, used));
        EXPECT_EQ(far->readObjects, 0) << "what is used stays";
    }
    EXPECT_LT(OpenNear()->GetStatistics().bytes, 2 * most);
    static_cast<void>(ReadAll(cache, others));
    EXPECT_GE(far->readObjects, 150);
}

TEST_F(CachingArchiveTest, ServesWhatItHasWhileTheFarArchiveIsAway) {
    SmallHost host(*far, 9);
    for (int i = 0; i < 3; ++i)
        EXPECT_TRUE(host.Publish());
    std::vector<Id> const unknown = StoreFar(5, 1);
    Id const head = host.Head();
    CachingArchive cache = OpenCache();
    EXPECT_EQ(HeadOf(cache), head);
    EXPECT_EQ(cache.ReadAncestry({&head, 1}, Follow::Parents, 10).size(), 3U);
    EXPECT_EQ(ReadAll(cache, {head}).size(), 1U);
    EXPECT_FALSE(cache.IsAway());

    far->isAway = true;
    EXPECT_EQ(HeadOf(cache), head);
    EXPECT_TRUE(cache.IsAway());
    EXPECT_EQ(cache.ReadAncestry({&head, 1}, Follow::Parents, 10).size(), 3U);
    int given = 0;
    std::vector<Id> const both{unknown[0], head};
    try {
        cache.Read(both, [&given](ArchivedObject const&) { ++given; });
        ADD_FAILURE() << "what is not here must not look as if it were nowhere";
    } catch (ArchiveError const& error) {
        EXPECT_EQ(error.GetKind(), Failure::Unavailable);
    }
    EXPECT_EQ(given, 1);
    EXPECT_THROW(cache.Apply({}), ArchiveError);

    far->isAway = false;
    SmallHost own(cache, 9);
    EXPECT_TRUE(own.Publish());
    Change settings;
    settings.records.push_back({{u"settings", Conformance::BufferOf("dark")}, false, {}});
    EXPECT_TRUE(cache.Apply(settings).applied);
    far->isAway = true;
    EXPECT_EQ(HeadOf(cache), own.Head()) << "what was stored through the cache has been seen";
    std::vector<KivStringT<char16_t>> const names{u"settings"};
    EXPECT_EQ(cache.ReadRecords(names).size(), 1U);
    far->isAway = false;
    SmallHost other(*far, 10);
    EXPECT_TRUE(other.Publish());
    EXPECT_EQ(HeadOf(cache), other.Head()) << "branches are asked for anew";
    EXPECT_FALSE(cache.IsAway());
}

TEST_F(CachingArchiveTest, DoesNotTakeWhatItHasNotSeenForNothing) {
    SmallHost host(*far, 9);
    EXPECT_TRUE(host.Publish());
    CachingArchive cache = OpenCache();
    std::vector<KivStringT<char16_t>> const names{u"settings"};
    auto const isUnavailable = [&far = *far](auto call) {
        far.isAway = true;
        try {
            static_cast<void>(call());
        } catch (ArchiveError const& error) {
            return error.GetKind() == Failure::Unavailable;
        }
        return false;
    };
    auto const readBranches = [&] { return cache.ReadBranches().size(); };
    auto const readRecords = [&] { return cache.ReadRecords(names).size(); };
    auto const readFacts = [&] { return cache.ReadAncestry({&host.Head(), 1}, Follow::Parents, 9).size(); };
    EXPECT_TRUE(isUnavailable(readBranches)) << "an archive without branches is another thing";
    EXPECT_TRUE(isUnavailable(readRecords));
    EXPECT_TRUE(isUnavailable(readFacts));
    far->isAway = false;
    EXPECT_EQ(readBranches() + readRecords() + readFacts(), 2U);
    EXPECT_FALSE(isUnavailable(readBranches));
    EXPECT_FALSE(isUnavailable(readRecords));
    EXPECT_EQ(readRecords(), 0U) << "that there is none was seen";
    EXPECT_FALSE(isUnavailable(readFacts));
    far->isAway = false;
    Id const seen = host.Head();
    EXPECT_TRUE(host.Publish());
    auto const findBases = [&] { return FindMergeBases(cache, seen, host.Head()).size(); };
    EXPECT_TRUE(isUnavailable(findBases)) << "versions that seem to have nothing in common would conflict everywhere";
    far->isAway = false;
    EXPECT_EQ(findBases(), 1U);
    EXPECT_FALSE(isUnavailable(findBases));
}

TEST_F(CachingArchiveTest, ReadingWhatIsNearStoresNothing) {
    SmallHost host(*far, 9);
    EXPECT_TRUE(host.Publish());
    auto const readAll = [&](CachingArchive& cache) {
        Id const head = HeadOf(cache);
        std::vector<KivStringT<char16_t>> const names{u"settings"};
        return cache.ReadRecords(names).size() + cache.ReadAncestry({&head, 1}, Follow::Parents, 9).size() +
               ReadAll(cache, {head}).size();
    };
    {
        CachingArchive first = OpenCache();
        EXPECT_EQ(readAll(first), 2U);
    }
    CachingArchive second = OpenCache();
    int const before = changesOfNear;
    EXPECT_EQ(readAll(second), 2U);
    EXPECT_EQ(changesOfNear, before);
}

} // namespace
