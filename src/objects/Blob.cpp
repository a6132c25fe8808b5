#include "KivVcs/Blob.h"

#include "KivVcs/Helpers.h"
#include "objects/PackedForm.h"

namespace KivVcs {

KivStringT<char> Blob::GetHeader() const {
    return "blob";
}

KivStringT<char> Blob::GetStoragePrefix() const {
    return "100644";
}

Id Blob::ComputeId() const {
    IdDigest digest("blob", data_.GetSize());
    digest.Feed(data_);
    return digest.Finish();
}

cow_ptr<Blob> Blob::Deserialize(StreamIO& stream) {
    if (!stream || !Helpers::ShiftObjectIdentifier(stream, "blob"))
        return nullptr;
    Buffer data;
    if (!stream.ReadRest(data))
        return nullptr;
    return immu::make<Blob>(std::move(data));
}

cow_ptr<Blob> dll_wrapped_shared(std::unique_ptr<Blob> blob) {
    return cow_ptr<Blob>(std::move(blob));
}

} // namespace KivVcs
