#pragma once

/// @file
/// The objects of an archive by number, as they were at one time.

#include "Changes.h"

#include <algorithm>

namespace KivArchive {

/// How many objects or marks are asked for at once where all of them are visited.
inline constexpr std::size_t pageSize = 4096;

class ObjectIndex {
public:
    ObjectIndex(IArchive& archive, IProgress* progress) {
        for (Id after;;) {
            ReportProgress(progress, {"listing objects", digests_.size(), 0}, {});
            auto const page = archive.ListObjects(after, listedAtOnce);
            for (ObjectInfo const& info : page)
                digests_.push_back(DigestOf(info.id));
            if (page.size() < listedAtOnce)
                return;
            after = page.back().id;
        }
    }

    [[nodiscard]] std::size_t Size() const noexcept { return digests_.size(); }
    [[nodiscard]] Id At(std::size_t number) const noexcept { return Id::FromDigest(digests_[number]); }
    /// The number of an object, in ascending order of the digests; nothing if it is not among them.
    [[nodiscard]] std::optional<std::size_t> Find(Id const& id) const {
        auto const found = std::lower_bound(digests_.begin(), digests_.end(), DigestOf(id));
        if (found == digests_.end() || *found != DigestOf(id))
            return std::nullopt;
        return static_cast<std::size_t>(found - digests_.begin());
    }

private:
    /// Many, since an archive reads what it keeps together once for each of these batches.
    static constexpr std::size_t listedAtOnce = std::size_t{1} << 16U;

    std::vector<Id::Digest> digests_;
};

} // namespace KivArchive
