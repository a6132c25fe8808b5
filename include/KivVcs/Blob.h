#pragma once

/// @file
/// The content of one file.

#include "KivVcs/Object.h"

#include <cstddef>
#include <iosfwd>
#include <span>
#include <string>
#include <string_view>

namespace KivVcs {

/// An uninterpreted sequence of bytes. It has neither name nor metadata; names live in trees.
class KIVVCS_EXPORT Blob : public Object {
public:
    /// An empty blob.
    Blob() noexcept = default;
    /// A blob with the content of @p data, whose chunks it shares.
    explicit Blob(Buffer data) noexcept : data_(std::move(data)) {}

    /// A blob with a copy of @p text, whose bytes are taken as they are, of @p bytes, or of the @p size bytes at @p
    /// data.
    /// @throws std::bad_alloc; std::length_error for a size that memory cannot hold
    [[nodiscard]] static Blob CopyText(std::string_view text);
    [[nodiscard]] static Blob CopyBytes(std::span<std::byte const> bytes);
    [[nodiscard]] static Blob CopyBytes(const void* data, std::size_t size);
    /// A blob with a copy of everything from the position of an open stream to its end, read in pieces; nothing if the
    /// stream is not valid or reading failed on the way. Large chunks of a stream on a buffer are shared.
    /// @throws as above, and what the stream throws
    [[nodiscard]] static optional<Blob> CopyRest(StreamIO& stream);
    [[nodiscard]] static optional<Blob> CopyRest(std::istream& stream);

    /// A blob with the bytes that @p text or @p bytes owns, which are not copied, or with the @p size bytes at
    /// `memory.get()`: see `Buffer::Adopt`. @throws std::bad_alloc; what was to be adopted is as before then
    [[nodiscard]] static Blob AdoptText(std::string&& text) { return Blob(Buffer::Adopt(std::move(text))); }
    [[nodiscard]] static Blob AdoptBytes(std::vector<std::byte>&& bytes) {
        return Blob(Buffer::Adopt(std::move(bytes)));
    }
    template <class T, class Deleter>
    [[nodiscard]] static Blob AdoptBytes(std::unique_ptr<T, Deleter>&& memory, std::uint64_t size) {
        return Blob(Buffer::Adopt(std::move(memory), size));
    }

    /// "blob"
    [[nodiscard]] KivStringT<char> GetHeader() const override;
    /// "100644"
    [[nodiscard]] KivStringT<char> GetStoragePrefix() const override;
    /// The content.
    Buffer const& GetData() const override { return data_; }

    /// The content of `GetData` as one string, as chunks that stay valid as `GetData` does, and as a stream of its own
    /// that shares the content and may outlive this blob.
    /// @throws std::bad_alloc, and what an override of `GetData` throws
    [[nodiscard]] std::string CopyToString() const;
    [[nodiscard]] Memory::BufferChunks GetChunks() const { return GetData().LockForRead(); }
    [[nodiscard]] StreamIO OpenStream() const { return StreamIO(MemStream::CreateOnCopy(GetData())); }

    /// Reads a blob from its packed form: everything after the header's zero byte, whatever size the header states.
    /// Large chunks of a stream on a buffer are shared, not copied.
    /// @return null if the stream is not valid, cannot be read, or its header does not begin with "blob".
    static cow_ptr<Blob> Deserialize(StreamIO& stream);

    [[nodiscard]] bool IsOfHostClass() const noexcept final;

protected:
    /// For a host's class that knows the identifier of its content and gets the content when `GetData` is called: trees
    /// hold and pack such a blob as fast as any, by @p digest and as "100644 blob", without calling it. The digest
    /// stays as long as the object lives, assignment included; that of a copy is what the host's copy constructor
    /// passes to this one.
    explicit Blob(Id::Digest const& digest) noexcept : Object(digest) {}

    /// A copy of an object of a host's class, which nobody else holds; by default a `Blob` with what `GetData` returns.
    /// Not called for objects of exactly this class.
    [[nodiscard]] virtual cow_ptr<Blob> Copy() const;

private:
    friend KIVVCS_EXPORT cow_ptr<Blob> CopyOf(Blob const& blob);

    [[nodiscard]] Id ComputeId() const final;
    [[nodiscard]] optional<std::uint64_t> GetSizeToHash() const noexcept final;
    void GetDataToHash(detail::DataToHash& data) const final;

    Buffer data_;
};

/// A copy that the caller owns alone: of an object of a host's class the one that its `Copy` makes, or a `Blob` if that
/// is null or somebody else's.
[[nodiscard]] KIVVCS_EXPORT cow_ptr<Blob> CopyOf(Blob const& blob);

[[nodiscard]] KIVVCS_EXPORT cow_ptr<Blob> dll_wrapped_shared(std::unique_ptr<Blob> blob);

} // namespace KivVcs
