#pragma once

/// @file
/// Builders and helpers for the cases of the conformance suite.

#include "KivArchive/IArchive.h"

#include <functional>
#include <map>
#include <random>
#include <string>
#include <string_view>

namespace KivArchive::Conformance {

inline Buffer BufferOf(std::string_view text) {
    Buffer buffer;
    buffer.Append(text.data(), text.size());
    return buffer;
}

inline std::string TextOf(Buffer const& buffer) {
    std::string text;
    for (auto const& chunk : buffer.LockForRead())
        text.append(reinterpret_cast<const char*>(chunk.data()), chunk.size());
    return text;
}

inline NewObject Object(ObjectType type, std::string_view data, Id earlier = {}) {
    Buffer const buffer = BufferOf(data);
    return {Identify(type, buffer), type, buffer, std::move(earlier)};
}

inline std::string DigitsOf(Id const& id) {
    std::string digits;
    for (char16_t const unit : KivStringViewT<char16_t>(id.GetText()))
        digits += static_cast<char>(unit);
    return digits;
}

/// The data of a tree with the given files.
inline std::string TreeOf(std::vector<std::pair<std::string, Id>> const& files) {
    std::string data;
    for (auto const& [name, id] : files)
        data += "100644 blob " + name + '\0' + DigitsOf(id);
    return data;
}

/// A commit of a root tree, and its facts.
struct NewCommit {
    NewObject object;
    Ancestry facts;
};

inline NewCommit Commit(Id const& tree, Id const& parent, std::string const& description) {
    std::string const author = "Ada <ada@example.org> 1700000000 +0100\n";
    std::string const parentLine = parent.IsEmpty() ? "" : "parent " + DigitsOf(parent) + "\n";
    NewObject object = Object(ObjectType::Commit, "tree " + DigitsOf(tree) + "\n" + parentLine + "author " + author +
                                                      "committer " + author + "\n" + description + "\n");
    Ancestry facts{object.id, parent, tree, {}};
    return {std::move(object), std::move(facts)};
}

/// Text that compresses as source code does; equal seeds give equal texts everywhere.
inline std::string SomeText(std::uint32_t seed, std::size_t size) {
    std::mt19937 random(seed);
    std::string text;
    while (text.size() < size)
        text += "line " + std::to_string(random() % 100000) + (random() % 8 == 0 ? "\n" : " of many; ");
    text.resize(size);
    return text;
}

/// Bytes that do not compress.
inline std::string SomeNoise(std::uint32_t seed, std::size_t size) {
    std::mt19937 random(seed);
    std::string noise(size, '\0');
    for (char& byte : noise)
        byte = static_cast<char>(random() & 0xFFU);
    return noise;
}

/// The data of objects that were read, by identifier.
inline std::map<std::string, std::string> ReadAll(IArchive& archive, std::vector<Id> const& ids) {
    std::map<std::string, std::string> found;
    archive.Read(ids, [&found](ArchivedObject const& object) {
        found[DigitsOf(object.id)] = std::string(reinterpret_cast<const char*>(object.data.data()), object.data.size());
    });
    return found;
}

inline ChangeOutcome Store(IArchive& archive, std::vector<NewObject> objects) {
    Change change;
    change.objects = std::move(objects);
    return archive.Apply(change);
}

inline bool StoreStream(IArchive& archive, Id const& id, std::string const& data, Id const& earlier,
                        IProgress* progress = nullptr) {
    Buffer buffer = BufferOf(data);
    StreamIO stream(KivVcs::MemStream::CreateOnRef(buffer));
    return archive.StoreContent(id, stream, earlier, progress);
}

inline Change Moving(std::vector<BranchMove> moves, std::vector<NewObject> objects = {}) {
    Change change;
    change.branches = std::move(moves);
    change.objects = std::move(objects);
    return change;
}

/// Reports the failures of one case.
class Trial {
public:
    Trial(std::string name, std::function<void(std::string const&)> fail)
        : name_(std::move(name)), fail_(std::move(fail)) {}

    void Expect(bool holds, std::string const& sentence) {
        if (!holds)
            fail_(name_ + ": " + sentence);
    }

    template <class Call>
    void ExpectFailure(Failure kind, Call call, std::string const& sentence) {
        try {
            call();
        } catch (ArchiveError const& error) {
            Expect(error.GetKind() == kind, sentence + ", but of the wrong kind: " + error.what());
            return;
        }
        Expect(false, sentence);
    }

private:
    std::string name_;
    std::function<void(std::string const&)> fail_;
};

} // namespace KivArchive::Conformance
