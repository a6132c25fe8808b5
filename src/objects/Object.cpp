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
    if (id_.IsSet())
        return id_.Get();
    Id id = ComputeId();
    id_.Keep(id);
    return id;
}

Buffer const& Object::GetPackedData() const {
    return packedData_.GetOrMake([this] {
        Buffer const& data = GetData();
        Buffer packed;
        AppendPackedHeader(packed, GetHeader(), data.GetSize());
        packed.Append(data);
        return packed;
    });
}

Id Object::ComputeId() const {
    Buffer const& data = GetData();
    IdDigest digest(GetHeader(), data.GetSize());
    digest.Feed(data);
    return digest.Finish();
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

bool Object::HasSameId(Object const& other) const {
    if (this == &other || id_.Equals(other.id_))
        return true;
    return !(id_.IsSet() && other.id_.IsSet()) && GetId() == other.GetId();
}

cow_ptr<Object> dll_wrapped_shared(std::unique_ptr<Object> object) {
    return cow_ptr<Object>(std::move(object));
}

} // namespace KivVcs
