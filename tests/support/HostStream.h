#pragma once

#include "KivUtils/Stream.h"

#include <algorithm>
#include <memory>
#include <string>
#include <utility>

/// A host's stream: holds bytes, may claim to be of another size, and accepts writes up to a limit.
class HostStream final : public KivUtils::IStream {
public:
    explicit HostStream(std::string bytes, std::uint64_t claimed, std::size_t room = 0)
        : bytes_(std::move(bytes)), claimed_(claimed), room_(room) {}

    bool Read(void* destination, std::uint64_t size) override {
        if (size > bytes_.size() - position_)
            return false;
        position_ += bytes_.copy(static_cast<char*>(destination), static_cast<std::size_t>(size), position_);
        return true;
    }
    bool Write(const void* source, std::uint64_t size) override {
        if (bytes_.size() + size > room_)
            return false;
        bytes_.append(static_cast<const char*>(source), static_cast<std::size_t>(size));
        return true;
    }
    [[nodiscard]] std::uint64_t GetSize() const override { return claimed_; }
    [[nodiscard]] std::uint64_t GetPosition() const override { return position_; }
    [[nodiscard]] std::string const& Bytes() const { return bytes_; }

private:
    std::string bytes_;
    std::uint64_t claimed_;
    std::size_t room_;
    std::size_t position_ = 0;
};

inline KivUtils::Serialization::StreamIO ReaderOf(std::string bytes, std::uint64_t claimed) {
    return KivUtils::Serialization::StreamIO(KivUtils::Stream(std::make_unique<HostStream>(std::move(bytes), claimed)));
}

inline KivUtils::Serialization::StreamIO ReaderOf(std::string const& bytes) {
    return ReaderOf(bytes, bytes.size());
}
