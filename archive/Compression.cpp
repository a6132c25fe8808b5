#include "Compression.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cstring>
#include <new>
#include <zstd.h>
#include <zstd_errors.h>

namespace KivArchive {

namespace {

constexpr int level = 3;
/// From this size on, zstd's long-distance matcher finds what its ordinary tables no longer hold.
constexpr std::size_t longDistance = 200000;

void CheckMemory(std::size_t code) {
    if (ZSTD_isError(code) != 0 && ZSTD_getErrorCode(code) == ZSTD_error_memory_allocation)
        throw std::bad_alloc();
}

/// What is compared at once, as long as it is the same.
constexpr std::array<std::size_t, 4> steps{512, 64, 8, 1};

/// How many equal bytes both begin with, at most @p limit.
std::size_t CommonBeginning(const std::byte* left, const std::byte* right, std::size_t limit) noexcept {
    std::size_t same = 0;
    for (std::size_t const step : steps)
        while (step <= limit - same && std::memcmp(left + same, right + same, step) == 0)
            same += step;
    return same;
}

std::size_t CommonEnd(ByteView left, ByteView right, std::size_t limit) noexcept {
    std::size_t same = 0;
    std::byte const* const leftEnd = left.data() + left.size();
    std::byte const* const rightEnd = right.data() + right.size();
    for (std::size_t const step : steps)
        while (step <= limit - same && std::memcmp(leftEnd - same - step, rightEnd - same - step, step) == 0)
            same += step;
    return same;
}

} // namespace

struct Compressor::Contexts {
    struct FreeCompression {
        void operator()(ZSTD_CCtx* context) const noexcept { ZSTD_freeCCtx(context); }
    };
    struct FreeDecompression {
        void operator()(ZSTD_DCtx* context) const noexcept { ZSTD_freeDCtx(context); }
    };
    std::unique_ptr<ZSTD_CCtx, FreeCompression> compression;
    std::unique_ptr<ZSTD_DCtx, FreeDecompression> decompression;

    ZSTD_CCtx* Compression() {
        if (compression == nullptr)
            compression.reset(ZSTD_createCCtx());
        if (compression == nullptr)
            throw std::bad_alloc();
        return compression.get();
    }
    ZSTD_DCtx* Decompression() {
        if (decompression == nullptr)
            decompression.reset(ZSTD_createDCtx());
        if (decompression == nullptr)
            throw std::bad_alloc();
        return decompression.get();
    }
};

Compressor::Compressor() : contexts_(std::make_unique<Contexts>()) {}
Compressor::~Compressor() = default;

bool Compressor::Compress(ByteView bytes, ByteView prefix, std::size_t limit, Bytes& to) {
    ZSTD_CCtx* const context = contexts_->Compression();
    ZSTD_CCtx_reset(context, ZSTD_reset_session_and_parameters);
    ZSTD_CCtx_setParameter(context, ZSTD_c_compressionLevel, level);
    ZSTD_CCtx_setParameter(context, ZSTD_c_dictIDFlag, 0);
    if (!prefix.empty()) {
        auto const reach = static_cast<int>(std::bit_width(prefix.size() + bytes.size()));
        ZSTD_CCtx_setParameter(context, ZSTD_c_windowLog, std::clamp(reach, 10, 27));
        if (prefix.size() + bytes.size() > longDistance) {
            ZSTD_CCtx_setParameter(context, ZSTD_c_enableLongDistanceMatching, 1);
            ZSTD_CCtx_setParameter(context, ZSTD_c_ldmMinMatch, 32);
            ZSTD_CCtx_setParameter(context, ZSTD_c_ldmHashLog, 20);
            ZSTD_CCtx_setParameter(context, ZSTD_c_ldmHashRateLog, 4);
        }
        ZSTD_CCtx_refPrefix(context, prefix.data(), prefix.size());
    }
    std::size_t const before = to.size();
    std::size_t const room = std::min(limit, ZSTD_compressBound(bytes.size()));
    to.resize(before + room);
    std::size_t const size = ZSTD_compress2(context, to.data() + before, room, bytes.data(), bytes.size());
    bool const fits = ZSTD_isError(size) == 0 && size < limit;
    to.resize(before + (fits ? size : 0));
    CheckMemory(size);
    return fits;
}

void Compressor::Decompress(ByteView bytes, ByteView prefix, std::byte* to, std::size_t size) {
    ZSTD_DCtx* const context = contexts_->Decompression();
    ZSTD_DCtx_reset(context, ZSTD_reset_session_and_parameters);
    if (!prefix.empty())
        ZSTD_DCtx_refPrefix(context, prefix.data(), prefix.size());
    std::size_t const decompressed = ZSTD_decompressDCtx(context, to, size, bytes.data(), bytes.size());
    CheckMemory(decompressed);
    if (ZSTD_isError(decompressed) != 0 || decompressed != size)
        throw Malformed();
}

bool CanDecompressTo(ByteView bytes, std::uint64_t size) noexcept {
    // A block of 128 KiB takes at least four bytes.
    constexpr std::uint64_t maximumGrowth = 32768;
    return size / maximumGrowth <= bytes.size() && ZSTD_getFrameContentSize(bytes.data(), bytes.size()) == size;
}

bool AppendDifference(Compressor& compressor, ByteView base, ByteView form, std::size_t limit, std::size_t mostPlain,
                      Bytes& to) {
    std::size_t const shorter = std::min(base.size(), form.size());
    std::size_t const begin = CommonBeginning(base.data(), form.data(), shorter);
    std::size_t const end = CommonEnd(base, form, shorter - begin);
    ByteView const between = form.subspan(begin, form.size() - begin - end);
    ByteView const replaced = base.subspan(begin, base.size() - begin - end);
    std::size_t const before = to.size();
    constexpr std::size_t usualSize = 64;
    to.reserve(before + usualSize);
    AppendNumber(to, begin);
    AppendNumber(to, end);
    Append(to, std::byte{1});
    std::size_t const head = to.size() - before;
    // Bytes that are few, or do not become fewer, are stored as they are.
    bool const isWorthTrying = between.size() > mostPlain || head + between.size() >= limit;
    if (isWorthTrying &&
        compressor.Compress(between, replaced, std::min(limit > head ? limit - head : 0, between.size()), to))
        return true;
    to.back() = std::byte{0};
    if (head + between.size() < limit) {
        Append(to, between);
        return true;
    }
    to.resize(before);
    return false;
}

Bytes ApplyDifference(Compressor& compressor, ByteView base, ByteView difference, std::size_t size) {
    ByteReader reader(difference);
    std::uint64_t const begin = reader.TakeNumber();
    std::uint64_t const end = reader.TakeNumber();
    bool const isCompressed = reader.TakeByte() != 0;
    std::size_t const shorter = std::min(base.size(), size);
    if (begin > shorter || end > shorter - begin)
        throw Malformed();
    auto const beginSize = static_cast<std::size_t>(begin);
    auto const endSize = static_cast<std::size_t>(end);
    std::size_t const betweenSize = size - beginSize - endSize;
    if (isCompressed ? !CanDecompressTo(reader.Rest(), betweenSize) : reader.Rest().size() != betweenSize)
        throw Malformed();
    Bytes form;
    form.reserve(size);
    Append(form, base.first(beginSize));
    form.resize(beginSize + betweenSize);
    if (isCompressed)
        compressor.Decompress(reader.Rest(), base.subspan(beginSize, base.size() - beginSize - endSize),
                              form.data() + beginSize, betweenSize);
    else
        std::copy(reader.Rest().begin(), reader.Rest().end(), form.data() + beginSize);
    Append(form, base.last(endSize));
    return form;
}

} // namespace KivArchive
