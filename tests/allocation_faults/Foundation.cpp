#include "allocation_faults/World.h"
#include "support/HostStream.h"

#include <gtest/gtest.h>

namespace KivVcs::Faults {
namespace {

void AssignABlob(World& w) {
    const Blob other = MakeBlob("other");
    w.done = other.GetPackedData().GetSize() > w.blob.GetPackedData().GetSize();
    w.blob = other;
}

void ReadBlobs(World& w) {
    Buffer large(0);
    large.Append("blob 1", 7);
    large.Append("0123456789", 10, 1'000);
    StreamIO stream(MemStream::CreateOnRef(large));
    w.done = Blob::Deserialize(stream)->GetData().GetSize() == 10'000;
    StreamIO host = ReaderOf(std::string("blob 1\0", 7) + std::string(200'000, 'h'));
    w.done = w.done && Blob::Deserialize(host)->GetData().GetSize() == 200'000;
}

void UseHelpers(World& w) {
    Buffer data(w.data);
    Helpers::AppendToBuffer(data, KivStringViewT<char16_t>(u"wide"));
    Helpers::AppendToBuffer(data, w.blob.GetData());
    StreamIO host = ReaderOf(std::string(70'000, 'h'));
    w.narrow = Helpers::StreamToStringA(host).Left(5);
    w.done = Helpers::SplitVcsPath(u"a/b/c").size() == 3 && Id(KivStringT<char16_t>(u"no digest")) != Id(data);
    w.text = Helpers::ComputeEncodedSHA256Hash(data) + Helpers::ComputeEncodedSHA256Hash("abc", 3);
}

void JoinTexts(World& w) {
    auto text = KivStringT<char16_t>(u"one") + u" two three four five";
    text = text.Mid(1) + KivStringT<char16_t>(u"six").Left(2);
    w.narrow.FormatInternal("%s %05d", "made", 42);
    w.text = text + DataEncoding::HexEncode("abc", 3) + KivStringT<char16_t>(w.narrow);
}

void CopyBuffers(World& w) {
    Buffer large(70'000);
    large.Append(large);
    Buffer all(large);
    all.Append(large, 5, 100'000);
    StreamIO stream(MemStream::CreateOnRef(all));
    Buffer copy(0);
    Stream destination = MemStream::CreateOnRef(copy);
    w.done = stream.CopyTo(destination, nullptr) && copy.GetSize() == 240'000;
    w.data.Append("appended four times.", 20, 4);
}

void AdoptText(World& w) {
    for (const std::size_t size : {std::size_t{100}, std::size_t{10'000}}) {
        std::string text(size, 'a');
        try {
            w.done = Blob::AdoptText(std::move(text)).GetData().GetSize() == size;
        } catch (...) {
            if (text.size() != size) // NOLINT(bugprone-use-after-move): a fault takes nothing
                ADD_FAILURE() << "lost in a fault";
            throw;
        }
    }
}

// clang-format off
const Operation operations[] = {
    {"AssignABlob", AssignABlob},
    {"ReadBlobs", ReadBlobs},
    {"UseHelpers", UseHelpers},
    {"JoinTexts", JoinTexts},
    {"AppendToAText", [](World& w) { w.text += u"appended once"; }},
    {"CopyBuffers", CopyBuffers},
    {"CodeTextsAsUtf8", [](World& w) { w.text = FromUtf8(ToUtf8(u"J\u00f8rn, too long for a short string")); }},
    {"CopyTextOfABlob", [](World& w) { w.blob = Blob::CopyText(w.blob.CopyToString() + ", too long for a short string"); }},
    {"CopyTheRestOfAStream", [](World& w) { auto rest = w.blob.OpenStream(); w.blob = *Blob::CopyRest(rest); }},
    {"AdoptText", AdoptText},
};
// clang-format on

} // namespace

std::span<Operation const> OnFoundation() {
    return operations;
}

} // namespace KivVcs::Faults
