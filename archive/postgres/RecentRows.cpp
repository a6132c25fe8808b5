#include "postgres/RecentRows.h"

#include <utility>

namespace KivArchive::Postgres {

namespace {

constexpr std::uint64_t maximumBytes = std::uint64_t{2} * 1024 * 1024;
constexpr std::uint64_t largestRow = maximumBytes / 4;
/// What a row takes beside its form, about.
constexpr std::uint64_t rowSize = 256;

} // namespace

void RecentRows::Keep(Id const& id, WholeRow row) {
    if (row.form.bytes.size() > largestRow)
        return;
    std::scoped_lock const lock(mutex_);
    std::uint64_t const size = row.form.bytes.size() + rowSize;
    if (size_ + size > maximumBytes) {
        before_ = std::exchange(current_, {});
        size_ = 0;
    }
    if (current_.insert_or_assign(id, std::move(row)).second)
        size_ += size;
}

WholeRow const* RecentRows::Find(Id const& id) {
    if (auto const found = current_.find(id); found != current_.end())
        return &found->second;
    auto const found = before_.find(id);
    if (found == before_.end())
        return nullptr;
    size_ += found->second.form.bytes.size() + rowSize;
    return &current_.insert_or_assign(id, found->second).first->second;
}

void RecentRows::Drop(Id const& id) {
    std::scoped_lock const lock(mutex_);
    if (auto const found = current_.find(id); found != current_.end()) {
        size_ -= found->second.form.bytes.size() + rowSize;
        current_.erase(found);
    }
    before_.erase(id);
}

bool RecentRows::GiveAll(std::span<const Id> ids, Forms& forms) {
    std::scoped_lock const lock(mutex_);
    for (Id const& id : ids) {
        WholeRow const* recent = Find(id);
        std::uint64_t const wanted = recent == nullptr ? 0 : GenerationOfBase(recent->version.generation + 1);
        for (Id at = id; recent != nullptr;) {
            forms.Take(at, *recent);
            std::uint64_t const generation = recent->version.generation;
            if (generation <= wanted)
                break;
            at = recent->version.base;
            recent = Find(at);
            // What came from a damaged database may go round in circles.
            if (recent != nullptr && recent->version.generation >= generation)
                return false;
        }
        if (recent == nullptr)
            return false;
    }
    return true;
}

} // namespace KivArchive::Postgres
