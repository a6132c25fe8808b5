#pragma once

#include "objects/DataToHash.h"

namespace KivVcs {

/// Gives the data to hash one after the other, and takes the digests of their packed forms.
class DigestCustomer {
public:
    virtual ~DigestCustomer() = default;
    /// Fills in the next ones; false if there are none.
    virtual bool Next(detail::DataToHash& next) = 0;
    /// Called in the order in which they are ready, not in that in which they were given.
    virtual void Take(detail::DataToHash const& hashed, Id::Digest const& digest) noexcept = 0;
};

/// Digests what @p customer gives, as many forms beside each other as the processor takes fastest: the next one begins
/// wherever one has ended. @throws what the customer throws
void DigestBesideEachOther(DigestCustomer& customer);

} // namespace KivVcs
