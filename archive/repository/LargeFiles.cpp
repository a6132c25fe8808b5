#include "Changes.h"
#include "repository/RepositoryState.h"
#include "repository/Unreadable.h"

#include <KivVcs/SHADigest256.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <system_error>

namespace KivArchive {

namespace {

constexpr std::uint64_t pieceSize = largestWholeContent;

/// A file as a stream.
class FileStream final : public KivVcs::IStream {
public:
    explicit FileStream(std::string const& path) : file_(path, std::ios::binary) {
        std::error_code error;
        size_ = std::filesystem::file_size(path, error);
        if (error)
            file_.setstate(std::ios::failbit);
    }

    [[nodiscard]] bool IsOpen() const { return file_.is_open() && file_.good(); }
    bool Read(void* destination, std::uint64_t size) override {
        file_.read(static_cast<char*>(destination), static_cast<std::streamsize>(size));
        position_ += static_cast<std::uint64_t>(file_.gcount());
        return static_cast<bool>(file_);
    }
    bool Write(const void* /*source*/, std::uint64_t /*size*/) override { return false; }
    [[nodiscard]] std::uint64_t GetSize() const override { return size_; }
    [[nodiscard]] std::uint64_t GetPosition() const override { return position_; }

private:
    std::ifstream file_;
    std::uint64_t size_ = 0;
    std::uint64_t position_ = 0;
};

/// Reads a stream to its end, piece by piece. @return false if it cannot be read
template <class Take>
bool ForEachPiece(StreamIO& stream, const char* step, IProgress* progress, Take take) {
    std::uint64_t const size = stream.GetSize();
    std::vector<std::byte> piece(static_cast<std::size_t>(std::min(size, pieceSize)));
    for (std::uint64_t done = 0; done < size;) {
        ReportProgress(progress, {step, done, size}, {});
        std::span<std::byte> const part(piece.data(), static_cast<std::size_t>(std::min(size - done, pieceSize)));
        if (!stream.Read(part.data(), part.size()))
            return false;
        take(part);
        done += part.size();
    }
    return true;
}

/// The file that a content is written to. Removed in the end unless `Keep` was called.
class NewFile {
public:
    explicit NewFile(std::string const& path) : path_(path) {
        (void)std::remove(path.c_str());
        file_ = std::fopen(path.c_str(), "wbx");
        if (file_ == nullptr)
            Fail();
    }
    NewFile(NewFile const&) = delete;
    NewFile& operator=(NewFile const&) = delete;
    ~NewFile() {
        if (file_ != nullptr)
            (void)std::fclose(file_);
        if (!isKept_)
            (void)std::remove(path_.c_str());
    }

    void Write(std::span<const std::byte> bytes) {
        if (std::fwrite(bytes.data(), 1, bytes.size(), file_) != bytes.size())
            Fail();
    }
    void Keep() {
        std::FILE* const file = std::exchange(file_, nullptr);
        if (std::fclose(file) != 0)
            Fail();
        isKept_ = true;
    }

private:
    [[noreturn]] void Fail() const {
        int const error = errno;
        throw ArchiveError(error == ENOSPC || error == EDQUOT ? Failure::DiskFull : Failure::Unavailable, path_,
                           "The file cannot be written: " + std::generic_category().message(error) + ".");
    }

    std::string path_;
    std::FILE* file_ = nullptr;
    bool isKept_ = false;
};

} // namespace

cow_ptr<Blob> ArchivedRepository::StoreContent(ContentOpener const& open, Id const& earlier, IProgress* progress) {
    StreamIO content = open();
    if (!content)
        return nullptr;
    if (content.GetSize() <= largestWholeContent) {
        auto blob = Blob::CopyRest(content);
        return blob ? SyncWithStorage(KivVcs::immu::make<Blob>(std::move(*blob))) : nullptr;
    }
    KivVcs::SHADigest256 digest = BeginPackedForm(ObjectType::Blob, content.GetSize());
    if (!ForEachPiece(content, "identifying a content", progress,
                      [&digest](std::span<const std::byte> piece) { digest.InitData(piece.data(), piece.size()); }))
        return nullptr;
    Id::Digest bytes{};
    digest.FinalDigest(bytes.data());
    Id const id = Id::FromDigest(bytes);
    if (cow_ptr<Blob> stored = GetBlobFromStorage(id))
        return stored;
    content = open();
    if (!content || !state_->Archive().StoreContent(id, content, earlier, progress))
        return nullptr;
    state_->source->LoadBlobs({&id, 1});
    return GetBlobFromStorage(id);
}

cow_ptr<Blob> ArchivedRepository::StoreFile(std::string const& path, Id const& earlier, IProgress* progress) {
    auto const open = [&path]() -> StreamIO {
        auto stream = std::make_unique<FileStream>(path);
        return stream->IsOpen() ? StreamIO(KivVcs::Stream(std::move(stream))) : StreamIO();
    };
    return StoreContent(open, earlier, progress);
}

void ArchivedRepository::RestoreFile(Id const& id, std::string const& path, IProgress* progress) {
    StreamIO content = OpenContent(id);
    NewFile file(path);
    if (!ForEachPiece(content, "restoring a content", progress,
                      [&file](std::span<const std::byte> piece) { file.Write(piece); }))
        ThrowUnreadable(Failure::Damaged, "file", id);
    file.Keep();
}

} // namespace KivArchive
