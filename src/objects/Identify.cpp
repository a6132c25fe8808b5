#include "objects/LaneDigests.h"

#include <algorithm>
#include <unordered_map>

namespace KivVcs {

namespace detail {

/// Identifies objects by height: first those that show no identifier which is missing, then those that show only these.
class Identification final : public DigestCustomer {
public:
    /// Finds what has to be identified.
    explicit Identification(array_view<Object const* const> objects) {
        found_.reserve(objects.size());
        for (Object const* const object : objects) {
            if (object != nullptr && object->GetKnownDigest() == nullptr)
                Visit(*object);
        }
        const auto isBefore = [](Found const& left, Found const& right) {
            return left.height != right.height ? left.height < right.height : left.weight > right.weight;
        };
        if (!std::is_sorted(found_.begin(), found_.end(), isBefore))
            std::stable_sort(found_.begin(), found_.end(), isBefore);
    }

    void Run() {
        while (next_ < found_.size()) {
            height_ = found_[next_].height;
            for (; IsAtHeight() && found_[next_].weight == asked; ++next_)
                static_cast<void>(found_[next_].object->GetId());
            DigestBesideEachOther(*this);
        }
    }

    bool Next(DataToHash& next) override {
        while (IsAtHeight()) {
            // Given twice, it may have been identified meanwhile.
            Object const* const object = found_[next_++].object;
            if (object->GetKnownDigest() != nullptr)
                continue;
            next.object = object;
            object->GetDataToHash(next);
            return true;
        }
        return false;
    }

    void Take(DataToHash const& hashed, Id::Digest const& digest) noexcept override { hashed.Identify(digest); }

private:
    struct Found {
        Object const* object;
        std::uint32_t height;
        /// The size in 4 KiB: what is smaller need not be sorted.
        std::uint32_t weight;
    };

    /// The weight of what is asked for its identifier.
    static constexpr auto asked = static_cast<std::uint32_t>(-1);

    /// An object whose parts are computed first: those of the open objects from `openBefore` on.
    struct Frame {
        Object const* object;
        std::size_t openBefore;
        std::uint32_t height = 1;
    };

    void Visit(Object const& object) {
        optional<std::uint32_t> height = HeightOf(object);
        while (!frames_.empty()) {
            Frame& frame = frames_.back();
            if (height)
                frame.height = std::max(frame.height, *height + 1);
            if (open_.Count() > frame.openBefore) {
                height = HeightOf(open_.TakeLast());
                continue;
            }
            height = frame.height;
            Find(*frame.object, *height);
            heights_.emplace(frame.object, *height);
            frames_.pop_back();
        }
    }

    /// The height of an object, 0 for one that is identified; nothing if those that it shows have to be visited before.
    optional<std::uint32_t> HeightOf(Object const& object) {
        if (object.IsIdentified())
            return 0;
        if (const auto visited = heights_.find(&object); visited != heights_.end())
            return visited->second;
        const std::size_t openBefore = open_.Count();
        object.ListParts(open_);
        if (open_.Count() > openBefore) {
            frames_.push_back({&object, openBefore});
            return {};
        }
        Find(object, 1);
        return 1;
    }

    void Find(Object const& object, std::uint32_t height) {
        const optional<std::uint64_t> size = object.IsOfHostClass() ? std::nullopt : object.GetSizeToHash();
        const std::uint64_t weight = size ? std::min<std::uint64_t>(*size / 4096, asked - 1) : asked;
        found_.push_back({&object, height, static_cast<std::uint32_t>(weight)});
    }

    [[nodiscard]] bool IsAtHeight() const noexcept { return next_ < found_.size() && found_[next_].height == height_; }

    std::vector<Found> found_;
    std::vector<Frame> frames_;
    OpenObjects open_;
    /// Of those that show others.
    std::unordered_map<Object const*, std::uint32_t> heights_;
    std::size_t next_ = 0;
    std::uint32_t height_ = 0;
};

} // namespace detail

void Identify(array_view<Object const* const> objects) {
    detail::Identification(objects).Run();
}

} // namespace KivVcs
