#pragma once

/// @file
/// The content of one file.

#include "KivVcs/Object.h"

namespace KivVcs {

/// An uninterpreted sequence of bytes. It has neither name nor metadata; names live in trees.
class KIVVCS_EXPORT Blob : public Object {
public:
    /// An empty blob.
    Blob() noexcept = default;
    /// A blob with the content of @p data, whose chunks it shares.
    explicit Blob(Buffer data) noexcept : data_(std::move(data)) {}

    /// "blob"
    [[nodiscard]] KivStringT<char> GetHeader() const override;
    /// "100644"
    [[nodiscard]] KivStringT<char> GetStoragePrefix() const override;
    /// The content.
    Buffer const& GetData() const override { return data_; }

    /// Reads a blob from its packed form: everything behind the header's zero byte, whatever size the header tells.
    /// Large chunks of a stream on a buffer are shared, not copied.
    /// @return null if the stream is not valid, cannot be read, or its header does not begin with "blob".
    static cow_ptr<Blob> Deserialize(StreamIO& stream);

protected:
    [[nodiscard]] Id ComputeId() const override;

private:
    Buffer data_;
};

[[nodiscard]] KIVVCS_EXPORT cow_ptr<Blob> dll_wrapped_shared(std::unique_ptr<Blob> blob);

} // namespace KivVcs
