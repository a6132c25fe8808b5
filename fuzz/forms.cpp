#include "CompactForms.h"
#include "Fuzzing.h"
#include "PackedForms.h"
#include "Segment.h"

#include <KivArchive/Upkeep.h>
#include <KivVcs/SHADigest256.h>

#include <algorithm>

/// The forms that archives store, from whoever wrote them: packed commits and trees, their compact forms, segments and
/// differences. What is read as exact gives the same bytes again.

namespace KivArchive {
namespace {

using KivVcs::Fuzzing::Require;

/// Runs @p use, which may find that a form is malformed.
template <class Use>
void Try(Use use) {
    try {
        use();
    } catch (Malformed const&) {
        return;
    }
}

std::string DigitsOf(Id const& id) {
    return KivVcs::ToUtf8(id.GetText());
}

void ReadCommit(ByteView data) {
    auto const commit = ReadPackedCommit(data);
    if (!commit)
        return;
    auto const text = [](std::string_view utf8) { return KivVcs::FromUtf8(utf8); };
    constexpr std::int64_t minute = 600'000'000;
    KivVcs::Commit made;
    made.SetAuthorName(text(commit->authorName));
    made.SetAuthorEmail(text(commit->authorEmail));
    made.SetDescription(text(commit->description));
    made.SetCommitTime(KivVcs::Time::FromTimeT(commit->seconds, KivVcs::TimeZone::Utc));
    made.SetCommitTimezoneBias(KivVcs::TimeDelta(commit->biasMinutes * minute));
    made.DeferParent(commit->parent, {});
    made.DeferRoot(commit->tree, {});
    Require(made.GetId() == Identify(ObjectType::Commit, data), "a commit that is read packs to the same bytes");
}

void ReadTree(ByteView data) {
    std::string again;
    PackedEntries entries(data);
    while (entries.Next())
        again += std::string(entries.Get().isTree ? "40000 tree " : "100644 blob ") + std::string(entries.Get().name) +
                 '\0' + DigitsOf(entries.Get().GetId());
    std::vector<Link> links;
    bool const hasLinks = ReadLinks(ObjectType::Tree, data, links);
    Require(!entries.AreSound() || (hasLinks && std::ranges::equal(std::as_bytes(std::span(again)), data)),
            "a sound tree is what its entries are");
}

void Compact(ByteView data) {
    if (auto const form = CompactTree(data))
        Require(std::ranges::equal(ExpandTree(*form, data.size()), data), "a compact tree expands to itself");
    if (auto const form = CompactCommit(data))
        Require(std::ranges::equal(ExpandCommit(*form, data.size()), data), "a compact commit expands to itself");
}

void Expand(ByteView data) {
    for (std::uint64_t size = 0; size < 4 * data.size() + 300; ++size) {
        Try([&] { static_cast<void>(ExpandTree(data, size)); });
        Try([&] { static_cast<void>(ExpandCommit(data, size)); });
    }
}

/// With the check that it would have.
void ReadSegment(ByteView data) {
    constexpr std::size_t checkSize = 8;
    Id const digest = DigestOfBytes(data);
    ByteView const check = std::as_bytes(std::span(*digest.GetDigest())).first(checkSize);
    Bytes form(check.begin(), check.end());
    Append(form, data);
    Compressor compressor;
    Try([&] {
        Segment const segment(7, form);
        Try([&] { static_cast<void>(segment.DecompressShared(compressor)); });
        for (Member const& member : segment.Members())
            Try([&] {
                if (member.encoding == Encoding::Difference)
                    static_cast<void>(segment.BaseOf(member));
                static_cast<void>(ExpandForm(member, member.own));
            });
    });
}

void ReadDifference(ByteView data) {
    std::size_t const part = data.empty() ? 0 : static_cast<std::size_t>(data.front()) % data.size();
    ByteView const base = data.first(part);
    ByteView const rest = data.subspan(part);
    Compressor compressor;
    for (std::size_t size = 0; size < 2 * data.size(); ++size)
        Try([&] { static_cast<void>(ApplyDifference(compressor, base, rest, size)); });
    for (std::size_t const mostPlain : {std::size_t{0}, std::size_t{48}, data.size()}) {
        Bytes difference;
        if (AppendDifference(compressor, base, rest, data.size() + 100, mostPlain, difference))
            Require(std::ranges::equal(ApplyDifference(compressor, base, difference, rest.size()), rest),
                    "a difference makes what it was made of");
    }
}

} // namespace
} // namespace KivArchive

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace KivArchive;
    if (size == 0)
        return 0;
    ByteView const rest = std::as_bytes(std::span(data, size)).subspan(1);
    static constexpr void (*targets[])(ByteView) = {ReadCommit, ReadTree, Compact, Expand, ReadSegment, ReadDifference};
    targets[data[0] % std::size(targets)](rest);
    return 0;
}
