#include "Fuzzing.h"

#include <stdexcept>
#include <string>

/// Reading packed forms from a host that lies: about sizes, about what is there, about which object is which.
///
/// An input is what to read (0 a blob, 1 a tree, 2 a commit) and packed forms that end at 0xFF. The first byte of each is
/// its manner; the bytes 0xF0 to 0xF7 stand for the identifiers under which the loader knows the first eight forms.

namespace KivVcs::Fuzzing {
namespace {

enum Manner : unsigned { Honest, ClaimsMore, ClaimsAll, ClaimsHalf, Wavers, ThrowsHalfway, CannotBeAsked, IsMissing };

struct Form {
    Manner manner;
    std::string bytes;
};

class LyingStream final : public IStream {
public:
    explicit LyingStream(Form const& form) : form_(form) {}

    bool Read(void* destination, std::uint64_t size) override {
        if (form_.manner == ThrowsHalfway && position_ + size > form_.bytes.size() / 2)
            throw std::runtime_error("broken stream");
        const auto taken = static_cast<std::size_t>(std::min<std::uint64_t>(size, form_.bytes.size() - position_));
        form_.bytes.copy(static_cast<char*>(destination), taken, position_);
        position_ += taken;
        return taken == size;
    }
    bool Write(const void*, std::uint64_t) override { return false; }
    [[nodiscard]] std::uint64_t GetSize() const override {
        const std::uint64_t size = form_.bytes.size();
        const std::uint64_t claims[] = {size, size + 1, ~std::uint64_t{0}, size / 2, size >> (asked_++ % 3)};
        return form_.manner < std::size(claims) ? claims[form_.manner] : size;
    }
    [[nodiscard]] std::uint64_t GetPosition() const override { return position_; }

private:
    Form form_;
    std::size_t position_ = 0;
    mutable unsigned asked_ = 0;
};

/// Packed forms, each under an identifier of 64 equal digits, which none of them can have.
class Host {
public:
    explicit Host(Input input) : kind_(input.Byte() % 3) {
        while (!input.IsUsedUp() && forms_.size() < 8) {
            Form form{static_cast<Manner>(input.Byte() % 8), {}};
            for (unsigned byte = 0; !input.IsUsedUp() && (byte = input.Byte()) != 0xFF;)
                form.bytes.append(byte < 0xF0 ? 1 : 64, static_cast<char>(byte < 0xF0 ? byte : '0' + byte % 8));
            maximumLoads_ += 1 + form.bytes.size();
            forms_.push_back(std::move(form));
        }
    }

    void ReadAll() {
        const auto repository = MakeRepository();
        for (char digit = '0'; digit < '8'; ++digit) {
            try {
                Read(digit, *repository);
            } catch (std::runtime_error const&) {
                continue;
            }
        }
        RequireConsistency(*repository->GetStorage());
        for (Form& form : forms_)
            form.manner = Honest;
        Require(Read('0', *repository) == Read('0', *MakeRepository()),
                "reading gives the same, whatever failed before");
    }

private:
    StreamIO Open(Id const& id) {
        Require(loads_++ < maximumLoads_ + 1, "every tree is read once, and every entry asked for once");
        const auto index = static_cast<unsigned>(id.GetText()[0] - u'0');
        if (index >= forms_.size() || forms_[index].manner == IsMissing)
            return {};
        if (forms_[index].manner == CannotBeAsked)
            throw std::runtime_error("broken loader");
        return StreamIO(Stream(std::make_unique<LyingStream>(forms_[index])));
    }

    /// The identifier of what is read.
    Id Read(char digit, Repository& repository) {
        loads_ = 0;
        const Id id(KivStringT<char>(std::string(64, digit).c_str()));
        const auto loader = [this](Id const& wanted) { return Open(wanted); };
        if (kind_ == 0) {
            StreamIO stream = Open(id);
            const auto blob = repository.SyncWithStorage(Blob::Deserialize(stream));
            return blob ? blob->GetId() : Id();
        }
        if (kind_ == 1) {
            const auto tree = Tree::Deserialize(id, &repository, loader);
            return tree ? tree->GetId() : Id();
        }
        Id parent;
        const auto commit = Commit::Deserialize(id, parent, &repository, loader);
        // A text that holds this word elsewhere, or an offset of more digits, is read back for what it is not.
        if (commit && Helpers::StringAFromBuffer(commit->GetData()).Find("parent ") < 0 &&
            std::abs(commit->GetCommitTimezoneBias().GetTicks()) < 3'600'000'000'000)
            repository.SyncWithStorage(commit);
        return commit ? commit->GetId() : Id();
    }

    unsigned kind_;
    std::vector<Form> forms_;
    std::size_t maximumLoads_ = 0;
    std::size_t loads_ = 0;
};

} // namespace
} // namespace KivVcs::Fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    KivVcs::Fuzzing::Host({data, size}).ReadAll();
    return 0;
}
