#include "Measuring.h"

#include <algorithm>
#include <openssl/evp.h>
#include <stdexcept>

namespace KivVcs::Bench {

std::vector<std::int64_t> Sizes(bool quick, std::int64_t whole) {
    if (quick)
        return {whole / 16};
    return {whole / 4, whole};
}

std::unique_ptr<Repository> MakeRepository() {
    return std::make_unique<Repository>(std::make_unique<MemObjectsStorage>());
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

void HashFloor::AddTree(Tree const& tree) {
    const Tree copy(tree);
    Add(copy.GetPackedData().GetSize());
}

void HashFloor::AddStored(Repository const& repo) {
    IObjectsStorage const& storage = *repo.GetStorage();
    for (auto const& [id, blob] : storage.GetBlobs())
        Add(Blob(*blob).GetPackedData().GetSize());
    for (auto const& [id, tree] : storage.GetTrees())
        AddTree(*tree);
    for (auto const& [id, commit] : storage.GetCommits())
        Add(Commit(*commit).GetPackedData().GetSize());
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
