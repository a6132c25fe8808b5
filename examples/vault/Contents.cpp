#include "Contents.h"

#include "Names.h"
#include "Parallel.h"
#include "Problem.h"

#include <KivVcs/Foundation.h>
#include <KivVcs/SHADigest256.h>
#include <cerrno>
#include <fcntl.h>
#include <future>
#include <system_error>
#include <unordered_set>

namespace vault {

using KivArchive::ObjectType;

namespace {

constexpr std::uint64_t windowBytes = std::uint64_t{8} * 1024 * 1024;
constexpr std::size_t windowFiles = 2000;
constexpr int mostAttempts = 5;
constexpr std::size_t pieceSize = std::size_t{256} * 1024;

std::string SystemReason() {
    return std::generic_category().message(errno);
}

constexpr char const* unsettled = "changes while it is read";

/// A file as a stream of as many bytes as it had at first.
class FileStream final : public KivVcs::IStream {
public:
    FileStream(int file, std::uint64_t size) noexcept : file_(file), size_(size) {}

    bool Read(void* destination, std::uint64_t size) override {
        const auto done = size <= size_ - position_
                              ? ReadUpTo(file_, {static_cast<std::byte*>(destination), static_cast<std::size_t>(size)})
                              : std::nullopt;
        position_ += done.value_or(0);
        return done == size;
    }
    bool Write(const void*, std::uint64_t) override { return false; }
    [[nodiscard]] std::uint64_t GetSize() const override { return size_; }
    [[nodiscard]] std::uint64_t GetPosition() const override { return position_; }

private:
    int file_;
    std::uint64_t size_;
    std::uint64_t position_ = 0;
};

class ContentReader {
public:
    ContentReader(IArchive* archive, Progress& progress) noexcept : archive_(archive), progress_(progress) {}

    std::uint64_t Run(std::string const& top, std::vector<WantedContent>& wanted) {
        const DirectoryOpener opener(top);
        for (std::size_t begin = 0; begin < wanted.size();) {
            auto end = begin;
            for (std::uint64_t bytes = 0; end < wanted.size() && end - begin < windowFiles && bytes < windowBytes;
                 ++end)
                bytes += std::min(wanted[end].entry->state.size, KivArchive::largestWholeContent);
            ReadWindow(opener.Top(), std::span(wanted).subspan(begin, end - begin));
            begin = end;
        }
        Finish();
        return stored_;
    }

private:
    struct Slot {
        WantedContent* wanted = nullptr;
        std::optional<NewObject> object;
    };

    /// Reads while the window before is being stored.
    void ReadWindow(int top, std::span<WantedContent> window) {
        std::vector<Slot> slots;
        for (auto& wanted : window)
            slots.push_back({&wanted, {}});
        std::atomic<std::size_t> next = 0;
        InParallel([&] {
            DirectoryOpener opener(OpenDirectory(top, "."));
            for (auto at = next++; at < slots.size(); at = next++)
                ReadSlot(opener, slots[at]);
        });
        KivArchive::Change change;
        std::unordered_set<Id> taken;
        for (auto& slot : slots) {
            progress_.Step(slot.wanted->entry->state.size);
            if (slot.object && taken.insert(slot.object->id).second)
                change.objects.push_back(*std::move(slot.object));
        }
        Finish();
        if (archive_ != nullptr && !change.objects.empty()) {
            stored_ += change.objects.size();
            storing_ = std::async(std::launch::async,
                                  [archive = archive_, applied = std::move(change)] { archive->Apply(applied); });
        }
    }

    void Finish() {
        if (storing_.valid())
            storing_.get();
    }

    void ReadSlot(DirectoryOpener& opener, Slot& slot) {
        auto& wanted = *slot.wanted;
        wanted.problem.clear();
        for (int attempt = 0; attempt < mostAttempts; ++attempt) {
            const int directory = opener.Open(FilePath(*wanted.directory));
            const auto name = FilePath(wanted.entry->name);
            if (directory < 0)
                wanted.problem = SystemReason();
            else if (wanted.entry->kind == ScannedEntry::Kind::Link)
                ReadLink(directory, name, slot);
            else
                ReadFile(directory, name, slot);
            if (wanted.problem != unsettled)
                return;
            usleep(static_cast<useconds_t>(1000U << static_cast<unsigned>(attempt)));
        }
    }

    static void ReadLink(int directory, std::string const& name, Slot& slot) {
        auto& wanted = *slot.wanted;
        struct stat status {};
        std::string target(wanted.entry->state.size + 1, '\0');
        const auto size = readlinkat(directory, name.c_str(), target.data(), target.size());
        if (size < 0 || fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
            wanted.problem = SystemReason();
            return;
        }
        wanted.state = StateOf(status);
        wanted.problem = wanted.state == wanted.entry->state ? "" : unsettled;
        target.resize(static_cast<std::size_t>(size));
        Take(slot, BufferOf(target));
    }

    void ReadFile(int directory, std::string const& name, Slot& slot) {
        auto& wanted = *slot.wanted;
        // Not blocking matters only if the file has been exchanged for a pipe since it was looked at.
        const Descriptor file(openat(directory, name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
        struct stat status {};
        if (!file.IsOpen() || fstat(file.Get(), &status) != 0) {
            wanted.problem = SystemReason();
            return;
        }
        wanted.state = StateOf(status);
        wanted.problem = S_ISREG(status.st_mode) ? "" : "is no file any more";
        if (!wanted.problem.empty())
            return;
        if (wanted.state.size > KivArchive::largestWholeContent)
            ReadLarge(file, wanted);
        else
            ReadSmall(file, slot);
        if (wanted.problem.empty() && (fstat(file.Get(), &status) != 0 || StateOf(status) != wanted.state))
            wanted.problem = unsettled;
        if (!wanted.problem.empty()) {
            wanted.id = Id();
            slot.object.reset();
        }
    }

    static void ReadSmall(Descriptor const& file, Slot& slot) {
        auto& wanted = *slot.wanted;
        std::optional<std::uint64_t> done;
        auto content = Buffer::Build(wanted.state.size, [&](std::byte* to) {
            done = ReadUpTo(file.Get(), {to, static_cast<std::size_t>(wanted.state.size)});
        });
        if (wanted.state.size > 0 && !done)
            wanted.problem = SystemReason();
        else if (done.value_or(0) != wanted.state.size)
            wanted.problem = unsettled;
        else
            Take(slot, std::move(content));
    }

    static void Take(Slot& slot, Buffer content) {
        auto& wanted = *slot.wanted;
        wanted.id = KivArchive::Identify(ObjectType::Blob, content);
        if (wanted.id != wanted.earlier)
            slot.object = {wanted.id, ObjectType::Blob, std::move(content), wanted.earlier};
    }

    /// In pieces, twice: a content is stored under its identifier.
    void ReadLarge(Descriptor const& file, WantedContent& wanted) {
        KivVcs::SHADigest256 hash;
        const auto header = "blob " + std::to_string(wanted.state.size);
        hash.InitData(header.c_str(), header.size() + 1);
        std::vector<std::byte> piece(pieceSize);
        for (std::uint64_t done = 0; done < wanted.state.size;) {
            const auto count = ReadUpTo(
                file.Get(), std::span(piece).first(std::min<std::uint64_t>(pieceSize, wanted.state.size - done)));
            if (!count)
                wanted.problem = SystemReason();
            else if (*count == 0)
                wanted.problem = unsettled;
            if (!wanted.problem.empty())
                return;
            hash.InitData(piece.data(), *count);
            done += *count;
        }
        Id::Digest digest{};
        hash.FinalDigest(digest.data());
        wanted.id = Id::FromDigest(digest);
        if (archive_ == nullptr || wanted.id == wanted.earlier ||
            archive_->FindMissing(std::span(&wanted.id, 1)).empty())
            return;
        if (lseek(file.Get(), 0, SEEK_SET) != 0) {
            wanted.problem = SystemReason();
            return;
        }
        KivVcs::StreamIO stream(KivVcs::Stream(std::make_unique<FileStream>(file.Get(), wanted.state.size)));
        if (!archive_->StoreContent(wanted.id, stream, wanted.earlier, nullptr))
            wanted.problem = unsettled;
        else
            ++stored_;
    }

    IArchive* archive_;
    Progress& progress_;
    std::future<void> storing_;
    std::atomic<std::uint64_t> stored_ = 0;
};

} // namespace

std::uint64_t ReadContents(std::string const& top, std::vector<WantedContent>& wanted, IArchive* archive,
                           Progress& progress) {
    return ContentReader(archive, progress).Run(top, wanted);
}

} // namespace vault
