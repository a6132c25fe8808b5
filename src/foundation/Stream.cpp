#include "KivUtils/Stream.h"

#include <algorithm>
#include <array>
#include <typeinfo>

namespace KivUtils {

IStream::~IStream() = default;

Stream MemStream::CreateOnRef(Memory::Buffer& buffer) {
    return Stream(std::unique_ptr<IStream>(new MemStream(buffer)));
}

bool MemStream::Read(void* destination, std::uint64_t size) {
    if (!buffer_.Read(position_, destination, size))
        return false;
    position_ += size;
    return true;
}

bool MemStream::Write(const void* source, std::uint64_t size) {
    buffer_.Append(source, size, 1);
    return true;
}

std::uint64_t MemStream::ShareRest(MemStream& destination) {
    const std::uint64_t size = buffer_.GetSize();
    const std::uint64_t rest = size - std::min(position_, size);
    destination.buffer_.Append(buffer_, position_, rest);
    position_ += rest;
    return rest;
}

namespace Serialization {

bool StreamIO::Read(void* destination, std::uint64_t size) {
    IStream* const stream = stream_;
    return stream != nullptr && stream->Read(destination, size);
}

std::uint64_t StreamIO::GetSize() const {
    const IStream* const stream = stream_;
    return stream == nullptr ? 0 : stream->GetSize();
}

std::uint64_t StreamIO::GetPosition() const {
    const IStream* const stream = stream_;
    return stream == nullptr ? 0 : stream->GetPosition();
}

bool StreamIO::CopyTo(IStream* destination, std::uint64_t* copied) {
    std::uint64_t total = 0;
    const auto finish = [&total, copied](bool success) {
        if (copied != nullptr)
            *copied = total;
        return success;
    };
    IStream* const stream = stream_;
    if (stream == nullptr || destination == nullptr)
        return finish(false);
    if (typeid(*stream) == typeid(MemStream) && typeid(*destination) == typeid(MemStream)) {
        total = static_cast<MemStream&>(*stream).ShareRest(static_cast<MemStream&>(*destination));
        return finish(true);
    }
    // As large as what a buffer keeps in one block of exact size.
    std::array<std::byte, 65536> piece;
    for (std::uint64_t position = GetPosition(), size = GetSize(); position < size;) {
        const std::uint64_t count = std::min<std::uint64_t>(piece.size(), size - position);
        if (!stream->Read(piece.data(), count) || !destination->Write(piece.data(), count))
            return finish(false);
        total += count;
        position += count;
    }
    return finish(true);
}

} // namespace Serialization

} // namespace KivUtils
