#include "KivVcs/Object.h"

#include "objects/PackedForm.h"

namespace KivVcs {

IObject::~IObject() = default;

bool Object::operator==(IObject const& other) const {
    return GetId() == other.GetId();
}

bool Object::operator!=(IObject const& other) const {
    return !(*this == other);
}

Id Object::GetId() const {
    if (GetKnownDigest() != nullptr)
        return id_.Get();
    const bool isHosts = IsOfHostClass();
    if (id_.IsHosts() && isHosts)
        return id_.Get();
    Id id = isHosts ? Id(GetPackedData()) : ComputeId();
    id_.Keep(id, isHosts);
    return id;
}

Buffer const& Object::GetPackedData() const {
    return packedData_.GetOrMake(IsOfHostClass(), [this] {
        const KivStringT<char> header = GetHeader();
        Buffer const& data = GetData();
        Buffer packed;
        AppendPackedHeader(packed, header, data.GetSize());
        packed.Append(data);
        return packed;
    });
}

Id Object::ComputeId() const {
    return ComputePackedId();
}

void Object::ListParts(detail::OpenObjects&) const {}

optional<std::uint64_t> Object::GetSizeToHash() const noexcept {
    return {};
}

void Object::GetDataToHash(detail::DataToHash&) const {}

Id Object::ComputePackedId() const {
    const KivStringT<char> header = GetHeader();
    Buffer const& data = GetData();
    IdDigest digest(header, data.GetSize());
    digest.Feed(data);
    return digest.Finish();
}

Id::Digest const* Object::ConfirmCopiedDigest() const noexcept {
    if (IsOfHostClass())
        return nullptr;
    id_.Confirm();
    return &id_.Digest();
}

KivStringT<char16_t> Object::ToString() const {
    Buffer const& packed = GetPackedData();
    KivStringT<char16_t> text;
    for (auto const& chunk : packed.LockForRead()) {
        for (std::byte byte : chunk) {
            if (byte == std::byte{0})
                text += u"\\0";
            else
                text += static_cast<char16_t>(static_cast<signed char>(byte));
        }
    }
    return text;
}

void Object::ResetState() {
    id_.Reset();
    packedData_.Reset();
}

cow_ptr<Object> dll_wrapped_shared(std::unique_ptr<Object> object) {
    return cow_ptr<Object>(std::move(object));
}

} // namespace KivVcs
