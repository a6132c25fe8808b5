#include "KivVcs/Blob.h"

#include "KivVcs/Helpers.h"
#include "objects/DataToHash.h"
#include "objects/PackedForm.h"

#include <array>
#include <istream>
#include <typeinfo>

namespace KivVcs {

KivStringT<char> Blob::GetHeader() const {
    return "blob";
}

KivStringT<char> Blob::GetStoragePrefix() const {
    return "100644";
}

bool Blob::IsOfHostClass() const noexcept {
    return &typeid(*this) != &typeid(Blob);
}

cow_ptr<Blob> Blob::Copy() const {
    return immu::make<Blob>(GetData());
}

Id Blob::ComputeId() const {
    IdDigest digest("blob", data_.GetSize());
    digest.Feed(data_);
    return digest.Finish();
}

optional<std::uint64_t> Blob::GetSizeToHash() const noexcept {
    return data_.GetSize();
}

void Blob::GetDataToHash(detail::DataToHash& data) const {
    data.word = "blob";
    data.kept = &data_;
}

Blob Blob::CopyText(std::string_view text) {
    return CopyBytes(text.data(), text.size());
}

Blob Blob::CopyBytes(std::span<std::byte const> bytes) {
    return CopyBytes(bytes.data(), bytes.size());
}

Blob Blob::CopyBytes(const void* data, std::size_t size) {
    Buffer content;
    content.Append(data, size);
    return Blob(std::move(content));
}

optional<Blob> Blob::CopyRest(StreamIO& stream) {
    Buffer content;
    if (!stream || !stream.ReadRest(content))
        return {};
    return Blob(std::move(content));
}

optional<Blob> Blob::CopyRest(std::istream& stream) {
    Buffer content;
    std::array<char, 65536> piece;
    while (stream) {
        stream.read(piece.data(), piece.size());
        content.Append(piece.data(), static_cast<std::uint64_t>(stream.gcount()));
    }
    if (!stream.eof() || stream.bad())
        return {};
    return Blob(std::move(content));
}

std::string Blob::CopyToString() const {
    std::string content;
    Buffer const& data = GetData();
    content.reserve(static_cast<std::size_t>(data.GetSize()));
    for (auto const& chunk : data.LockForRead())
        content.append(reinterpret_cast<const char*>(chunk.data()), chunk.size());
    return content;
}

cow_ptr<Blob> Blob::Deserialize(StreamIO& stream) {
    if (!stream || !Helpers::ShiftObjectIdentifier(stream, "blob"))
        return nullptr;
    Buffer data;
    if (!stream.ReadRest(data))
        return nullptr;
    return immu::make<Blob>(std::move(data));
}

cow_ptr<Blob> CopyOf(Blob const& blob) {
    cow_ptr<Blob> copy = blob.IsOfHostClass() ? blob.Copy() : nullptr;
    return copy.use_count() == 1 ? copy : immu::make<Blob>(blob);
}

cow_ptr<Blob> dll_wrapped_shared(std::unique_ptr<Blob> blob) {
    return cow_ptr<Blob>(std::move(blob));
}

} // namespace KivVcs
