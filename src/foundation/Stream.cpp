#include "KivUtils/Stream.h"

#include <algorithm>
#include <array>
#include <typeinfo>

namespace KivUtils {

IStream::~IStream() = default;

Stream MemStream::CreateOnRef(Memory::Buffer& buffer) {
    return Stream(std::unique_ptr<IStream>(new MemStream(buffer)));
}

Stream MemStream::CreateOnCopy(Memory::Buffer content) {
    return Stream(std::unique_ptr<IStream>(new MemStream(std::move(content))));
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

std::uint64_t MemStream::ShareRest(Memory::Buffer& destination) {
    const std::uint64_t size = buffer_.GetSize();
    const std::uint64_t rest = size - std::min(position_, size);
    destination.Append(buffer_, position_, rest);
    position_ += rest;
    return rest;
}

Memory::BufferChunks::Chunk MemStream::GetNearBytes() const noexcept {
    std::uint64_t offset = position_;
    for (auto const& chunk : buffer_.LockForRead()) {
        if (offset < chunk.size())
            return chunk.subspan(static_cast<std::size_t>(offset));
        offset -= chunk.size();
    }
    return {};
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
    MemStream* const source = GetMemStream();
    if (source != nullptr && typeid(*destination) == typeid(MemStream)) {
        total = source->ShareRest(static_cast<MemStream*>(destination)->buffer_);
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

bool StreamIO::ReadRest(Memory::Buffer& destination) {
    if (MemStream* const source = GetMemStream()) {
        source->ShareRest(destination);
        return true;
    }
    const Stream appending = MemStream::CreateOnRef(destination);
    return CopyTo(appending, nullptr);
}

MemStream* StreamIO::GetMemStream() const noexcept {
    IStream* const stream = stream_;
    return stream != nullptr && typeid(*stream) == typeid(MemStream) ? static_cast<MemStream*>(stream) : nullptr;
}

} // namespace Serialization

} // namespace KivUtils
