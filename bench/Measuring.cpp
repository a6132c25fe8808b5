#include "Measuring.h"

#include <algorithm>
#include <openssl/evp.h>
#include <stdexcept>

namespace KivVcs::Bench {

MemoryTaken::MemoryTaken() : live_(LiveBytes()), resident_(0) {
    if (CountsMemory()) {
        ForgetResidentPeak();
        resident_ = PeakResidentBytes();
    }
}

void MemoryTaken::WriteTo(Measurement& measurement) const {
    measurement.keptBytes = LiveBytes() - live_;
    if (CountsMemory())
        measurement.residentBytes = PeakResidentBytes() - resident_;
}

std::unique_ptr<Repository> MakeRepository() {
    SettleFreedMemory();
    return std::make_unique<Repository>(std::make_unique<MemObjectsStorage>());
}

// Tables are asked of clones, so that the repository goes on as if nobody had asked.

std::unordered_set<Id> StoredIds(Repository const& repo) {
    std::unordered_set<Id> ids;
    const auto add = [&ids](auto const& table) {
        for (auto const& [id, object] : table)
            ids.insert(id);
    };
    const auto storage = repo.GetStorage()->Clone();
    add(storage->GetBlobs());
    add(storage->GetTrees());
    add(storage->GetCommits());
    return ids;
}

struct HashFloor::Context {
    Context() : digest(EVP_MD_CTX_new()), algorithm(EVP_MD_fetch(nullptr, "SHA256", nullptr)) {}
    Context(Context const&) = delete;
    Context& operator=(Context const&) = delete;
    ~Context() {
        EVP_MD_CTX_free(digest);
        EVP_MD_free(algorithm);
    }

    EVP_MD_CTX* digest;
    EVP_MD* algorithm;
};

HashFloor::HashFloor() : context_(std::make_shared<Context>()) {}

void HashFloor::AddStored(Repository const& repo, std::unordered_set<Id> const& known) {
    const auto add = [&](auto const& table) {
        for (auto const& [id, object] : table) {
            if (!known.contains(id))
                AddForm(*object);
        }
    };
    const auto storage = repo.GetStorage()->Clone();
    add(storage->GetBlobs());
    add(storage->GetTrees());
    add(storage->GetCommits());
}

double HashFloor::Run(std::vector<char> const* content) {
    if (sizes_.empty())
        return 0;
    const std::uint64_t largest = *std::max_element(sizes_.begin(), sizes_.end());
    if (content == nullptr)
        scratch_.resize(largest, 'x');
    std::vector<char> const& source = content == nullptr ? scratch_ : *content;
    bool good = true;
    const double seconds = SecondsOf([&] {
        std::size_t offset = 0;
        unsigned char digest[EVP_MAX_MD_SIZE];
        for (const std::uint64_t size : sizes_) {
            const std::size_t held = std::min<std::size_t>(size, source.size());
            if (content == nullptr || offset + held > source.size())
                offset = 0;
            good &= EVP_DigestInit_ex2(context_->digest, context_->algorithm, nullptr) == 1;
            good &= EVP_DigestUpdate(context_->digest, source.data() + offset, held) == 1;
            // The header of a piece that is all of the content.
            good &= held == size || EVP_DigestUpdate(context_->digest, source.data(), size - held) == 1;
            good &= EVP_DigestFinal_ex(context_->digest, digest, nullptr) == 1;
            offset += held;
        }
    });
    if (!good)
        throw std::runtime_error("hashing failed");
    return seconds;
}

} // namespace KivVcs::Bench
