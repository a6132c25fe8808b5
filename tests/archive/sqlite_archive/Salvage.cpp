#include "Trials.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <set>

/// Salvaging archives' files that cannot be opened any more.

namespace KivArchive {
namespace {

using namespace Conformance;

/// The identifiers of all objects.
std::set<std::string> ObjectsOf(IArchive& archive) {
    std::set<std::string> ids;
    for (ObjectInfo const& info : archive.ListObjects({}, 1U << 20U))
        ids.insert(DigitsOf(info.id));
    return ids;
}

/// Salvages an archive with one page after the other overwritten.
class Salvaging : public testing::Test {
protected:
    static constexpr std::size_t page = 4096;
    // Pages are in the order in which tables are made.
    static constexpr std::size_t beginOfBranches = 3 * page;

    /// Makes the archive, and salvages it as it is while it is open, when most of it is in the log.
    void SetUp() override {
        SqliteArchive archive(directory.Path("archive"));
        SmallHost host(archive, 1);
        for (int i = 0; i < 9; ++i)
            ASSERT_TRUE(host.Publish());
        Change change;
        change.records.push_back({{u"settings", BufferOf(std::string(5000, 'x'))}, false, {}});
        archive.Apply(change);
        head = host.Head();
        all = ObjectsOf(archive);
        WriteFile(path, ReadFile(directory.Path("archive")));
        WriteFile(path + "-wal", ReadFile(directory.Path("archive-wal")));
        MemArchive salvaged;
        Salvage(path, salvaged, nullptr);
        EXPECT_EQ(ObjectsOf(salvaged), all);
        EXPECT_EQ(HeadOf(salvaged), head);
    }

    /// Counts the objects that are left when a page is overwritten.
    std::size_t CountWithout(std::string bytes, std::size_t begin, bool isTable) {
        std::fill_n(bytes.begin() + static_cast<std::ptrdiff_t>(begin), page, '\xA5');
        WriteFile(path, bytes);
        MemArchive salvaged;
        SalvageReport const report = Salvage(path, salvaged, nullptr);
        EXPECT_TRUE(Verify(salvaged, nullptr).damaged.empty());
        std::size_t const found = ObjectsOf(salvaged).size();
        EXPECT_TRUE(isTable || found == all.size()) << "page " << begin / page + 1 << " loses objects";
        bool const hasHead = salvaged.FindMissing({&head, 1}).empty();
        EXPECT_TRUE(!hasHead || (HeadOf(salvaged) == head || begin == beginOfBranches));
        EXPECT_TRUE(!hasHead || report.lastCommits == std::vector<Id>{head});
        EXPECT_TRUE(salvaged.ListRecords().size() == 1 || begin > 0);
        return found;
    }

    TemporaryDirectory const directory;
    std::string const path = directory.Path("damaged");
    Id head;
    std::set<std::string> all;
};

TEST_F(Salvaging, LosesWhatIsOnADamagedPageAndNothingElse) {
    std::string const sound = ReadFile(directory.Path("archive"));
    int whole = 0;
    std::size_t lost = 0;
    int tried = 0;
    for (std::size_t begin = 0; begin < sound.size(); begin += page) {
        bool const isTable = sound[begin] == 13 || sound[begin] == 0;
        if (isTable && begin / page % 16 != 3)
            continue;
        std::size_t const found = CountWithout(sound, begin, isTable);
        whole += found == all.size() ? 1 : 0;
        lost += all.size() - found;
        ++tried;
    }
    std::printf("%d damaged pages: nothing lost by %d, %.1f of %zu objects by each of the others\n", tried, whole,
                static_cast<double>(lost) / std::max(1, tried - whole), all.size());
    EXPECT_GT(whole, 7);
    EXPECT_LT(whole, tried);
}

} // namespace
} // namespace KivArchive
