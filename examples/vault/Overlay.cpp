#include "Overlay.h"

namespace vault {

using KivArchive::ObjectInfo;
using KivVcs::Id;

void Overlay::Add(KivArchive::Change const& change) {
    KivArchive::Change objects;
    objects.objects = change.objects;
    added_.Apply(objects);
}

std::vector<Id> Overlay::FindMissing(Ids ids) {
    return archive_.FindMissing(added_.FindMissing(ids));
}

std::vector<ObjectInfo> Overlay::Describe(Ids ids) {
    auto described = added_.Describe(ids);
    for (auto& info : archive_.Describe(added_.FindMissing(ids)))
        described.push_back(std::move(info));
    return described;
}

KivArchive::ReadOutcome Overlay::Read(Ids ids, KivArchive::ObjectReceiver const& receiver) {
    return archive_.Read(added_.Read(ids, receiver).missing, receiver);
}

std::optional<KivVcs::Buffer> Overlay::ReadContent(Id const& id, std::uint64_t offset, std::uint64_t size) {
    auto content = added_.ReadContent(id, offset, size);
    return content ? content : archive_.ReadContent(id, offset, size);
}

} // namespace vault
