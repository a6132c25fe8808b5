#pragma once

#include "ArchiveFiles.h"
#include "KivArchive/MemArchive.h"

#include <gtest/gtest.h>

/// Helpers for the tests of verifying, collecting, synchronizing and repairing.

namespace KivArchive {

inline constexpr std::chrono::seconds noGrace{0};

inline CollectReport CollectNow(IArchive& archive, std::vector<Id> kept = {}) {
    CollectOptions options;
    options.grace = noGrace;
    options.kept = std::move(kept);
    options.slice = 3;
    return Collect(archive, options, nullptr);
}

/// Every test is run on each kind of archive.
class ArchiveUpkeep : public testing::TestWithParam<bool> {
protected:
    std::unique_ptr<IArchive> Make() {
        if (!GetParam())
            return std::make_unique<MemArchive>();
        return std::make_unique<SqliteArchive>(directory_.Path("archive"));
    }

    TemporaryDirectory directory_;
};

inline void MoveHead(IArchive& archive, Id const& from, Id const& to) {
    Change change;
    change.branches = {{u"master", from, to}};
    ASSERT_TRUE(archive.Apply(change).applied);
}

} // namespace KivArchive
