#pragma once

#include "KivVcs/Foundation.h"
#include "KivVcs/detail/PublishedWord.h"

#include <cstdint>
#include <memory>

namespace KivVcs::detail {

/// The packed form that an object keeps once it has been asked for, and whether an object of a host's class made it.
///
/// A copy takes it along before anybody knows of which class the copy will be. It counts for an object of the kind that
/// made it; for another it is never looked into, and gives way to the first form that the object makes itself.
///
/// Threads: `GetOrMake` and `Copy` from an object may run concurrently. Everything else needs exclusive use.
class KeptForm {
public:
    KeptForm() noexcept = default;
    KeptForm(KeptForm const&) = delete;
    KeptForm& operator=(KeptForm const&) = delete;
    ~KeptForm() { Reset(); }

    /// The form of an object of that kind, made by @p make if none is kept; valid until `Reset`.
    template <class Make>
    Buffer const& GetOrMake(bool isHosts, Make make) const {
        std::uintptr_t kept = form_.Get();
        while (!Counts(kept, isHosts)) {
            auto made = std::make_unique<Buffer>(make());
            const std::uintptr_t form = AddressOf(made.get()) | (isHosts ? hostsBit : 0);
            if (form_.Replace(kept, form)) {
                Delete(kept);
                return *made.release();
            }
        }
        return *FormAt(kept);
    }

    /// Takes along what @p other, that of an object of the given kind, keeps. @pre nothing is kept here
    void Copy(KeptForm const& other, bool isHosts) {
        const std::uintptr_t kept = other.form_.Get();
        if (Counts(kept, isHosts))
            form_.Set(AddressOf(new Buffer(*FormAt(kept))) | (kept & hostsBit));
    }

    void Swap(KeptForm& other) noexcept { form_.Set(other.form_.Take(form_.Get())); }
    void Reset() noexcept { Delete(form_.Take()); }

private:
    /// Kept in the lowest bit of the address.
    static constexpr std::uintptr_t hostsBit = 1;

    static bool Counts(std::uintptr_t kept, bool isHosts) noexcept {
        return kept != 0 && ((kept & hostsBit) != 0) == isHosts;
    }
    static std::uintptr_t AddressOf(Buffer const* form) noexcept { return reinterpret_cast<std::uintptr_t>(form); }
    static Buffer const* FormAt(std::uintptr_t kept) noexcept {
        return reinterpret_cast<Buffer const*>(kept & ~hostsBit);
    }
    static void Delete(std::uintptr_t kept) noexcept { delete FormAt(kept); }

    PublishedWord<std::uintptr_t> form_;
};

} // namespace KivVcs::detail
