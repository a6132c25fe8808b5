#include "KivVcs/Commit.h"
#include "KivVcs/Helpers.h"
#include "KivVcs/IRepository.h"
#include "objects/DataToHash.h"
#include "objects/PackedForm.h"

#include <charconv>
#include <cstdlib>
#include <limits>
#include <stdexcept>

namespace KivVcs {

namespace {

constexpr std::int64_t ticksPerHour = 36'000'000'000;
constexpr std::int64_t ticksPerMinute = 600'000'000;

/// The time-zone bias that an offset such as "+0545" stands for.
TimeDelta BiasFromOffset(KivStringT<char16_t> const& offset) {
    const std::int64_t sign = offset.StartsWith(u"+") ? 1 : -1;
    const std::int64_t hours = String::IntFromString(offset.Mid(1, 2));
    const std::int64_t minutes = String::IntFromString(offset.Mid(3, 4));
    return TimeDelta(hours * sign * ticksPerHour + minutes * sign * ticksPerMinute);
}

/// The parts of an author's line.
struct Signature {
    explicit Signature(KivStringT<char> const& line) {
        const int emailStart = line.Find("<");
        const int emailEnd = line.Find(">", emailStart);
        const KivStringT<char16_t> rest = line.Mid(emailEnd + 2);
        const int blank = rest.Find(u" ");
        name = String::ToStringW(line.Left(emailStart - 1));
        email = String::ToStringW(line.Mid(emailStart + 1, emailEnd - emailStart - 1));
        time = Time::FromTimeT(String::Int64FromString(rest.Left(blank)), TimeZone::Utc);
        bias = BiasFromOffset(rest.Mid(blank + 1));
    }

    KivStringT<char16_t> name;
    KivStringT<char16_t> email;
    Time time;
    TimeDelta bias;
};

/// Writes a number in decimal, with zeros in front of fewer than @p width digits, and returns the end.
char16_t* WriteNumber(std::int32_t number, char16_t* to, std::ptrdiff_t width = 1) {
    std::array<char, 11> digits{};
    const char* const end = std::to_chars(digits.data(), digits.data() + digits.size(), number).ptr;
    to = std::fill_n(to, std::max<std::ptrdiff_t>(width - (end - digits.data()), 0), u'0');
    return std::copy(static_cast<const char*>(digits.data()), end, to);
}

template <class C>
KivStringT<C> Join(std::initializer_list<KivStringViewT<C>> pieces) {
    std::int64_t length = 0;
    for (KivStringViewT<C> piece : pieces)
        length += piece.GetLength();
    if (length > std::numeric_limits<int>::max())
        throw std::length_error("commit longer than a signed 32-bit length can hold");
    return KivStringT<C>::Build(static_cast<int>(length), [pieces](C* units) {
        for (KivStringViewT<C> piece : pieces)
            units = std::copy(piece.begin(), piece.end(), units);
    });
}

/// An identifier as the text of a commit shows it.
KivStringT<char> Shown(Id const& id) {
    if (Id::Digest const* const digest = id.GetDigest())
        return KivStringT<char>::Build(int{idLength}, [digest](char* digits) { WriteDigits(*digest, digits); });
    return DataEncoding::Utf8Encode(UntilZero(id.GetText()));
}

/// The text of @p commit. A parent is shown even if its identifier is null.
KivStringT<char> TextOf(Commit const& commit, bool hasParent) {
    const KivStringT<char16_t> author =
        Commit::GetAuthorInfo(u"author", commit.GetAuthorName(), commit.GetAuthorEmail(), commit.GetCommitTime(),
                              commit.GetCommitTimezoneBias());
    // The committer is always the author, at the same time.
    const KivStringT<char> signature = DataEncoding::Utf8Encode(KivStringViewT<char16_t>(author).Mid(6));
    const KivStringT<char> root = Shown(commit.GetRootId());
    const KivStringT<char> parent = hasParent ? Shown(commit.GetParentId()) : KivStringT<char>();
    const KivStringT<char> description = DataEncoding::Utf8Encode(UntilZero(commit.GetDescription()));
    return Join<char>({"tree ", root, "\n", hasParent ? "parent " : "", parent, hasParent ? "\n" : "", "author",
                       signature, "\ncommitter", signature, "\n\n", description, "\n"});
}

} // namespace

KivStringT<char> Commit::GetHeader() const {
    return "commit";
}

KivStringT<char> Commit::GetStoragePrefix() const {
    return {};
}

void Commit::IdentifyAncestors() const {
    // Oldest first: asked from the newest on, each commit would ask its parent in turn, one call deeper for every
    // commit. Only commits of exactly the library's class do that, and the identifier of a deferred parent is known.
    std::vector<Commit const*> unidentified;
    for (Commit const* ancestor = parent_.get();
         ancestor != nullptr && ancestor->GetKnownDigest() == nullptr && !ancestor->IsOfHostClass();
         ancestor = ancestor->parent_.get())
        unidentified.push_back(ancestor);
    for (; !unidentified.empty(); unidentified.pop_back())
        static_cast<void>(unidentified.back()->GetId());
}

void Commit::ListParts(detail::OpenObjects& parts) const {
    parts.Add(parent_.get());
    if (tree_)
        parts.Add(tree_->GetRoot().get());
}

Buffer const& Commit::GetData() const {
    return data_.GetOrMake([this] {
        Buffer data;
        Helpers::AppendToBuffer(data, TextOf(*this, HasParent()));
        return data;
    });
}

Id Commit::ComputeId() const {
    IdentifyAncestors();
    if (data_.Get() != nullptr)
        return ComputePackedId();
    // The text is not kept: every commit of a history would have one, and texts are asked for far less often than
    // identifiers.
    const KivStringT<char> text = TextOf(*this, HasParent());
    const auto size = static_cast<std::size_t>(text.GetLength());
    IdDigest digest("commit", size);
    digest.Feed(text.GetString(), size);
    return digest.Finish();
}

KivStringT<char16_t> Commit::GetAuthorInfo(KivStringViewT<char16_t> role, KivStringViewT<char16_t> name,
                                           KivStringViewT<char16_t> email, Time time, TimeDelta bias) {
    const auto hours = static_cast<std::int32_t>(bias.GetTicks() / ticksPerHour);
    const auto minutes = static_cast<std::int32_t>(std::abs(bias.GetTicks() / ticksPerMinute) % 60);
    std::array<char16_t, 64> when{};
    char16_t* end = WriteNumber(static_cast<std::int32_t>(time.ToTimeT(TimeZone::Utc)), when.data());
    *end++ = u' ';
    *end++ = hours < 0 ? u'-' : u'+';
    end = WriteNumber(minutes, WriteNumber(std::abs(hours), end, 2), 2);
    return Join<char16_t>({UntilZero(role),
                           u" ",
                           UntilZero(name),
                           u" <",
                           UntilZero(email),
                           u"> ",
                           {when.data(), static_cast<int>(end - when.data())}});
}

optional<KivStringT<char>> Commit::ParseCommitInfo(KivStringT<char> const& text, KivStringViewT<char> key,
                                                   int& position) {
    const int found = text.Find(key, position);
    if (found < 0)
        return std::nullopt;
    const int start = found + key.GetLength();
    const int end = text.Find("\n", start);
    position = end < 0 ? text.GetLength() : end;
    return end < 0 ? KivStringT<char>() : text.Mid(start, end - start);
}

cow_ptr<Commit> Commit::Deserialize(Id const& id, Id& parentId, IRepository* repository,
                                    PortableVersion::Delegate<StreamIO(Id const&)> loader) {
    if (repository == nullptr || id.IsEmpty())
        return nullptr;
    if (cow_ptr<Commit> stored = repository->GetCommitFromStorage(id))
        return stored;
    if (!loader)
        return nullptr;
    StreamIO stream = loader(id);
    if (!Helpers::ShiftObjectIdentifier(stream, "commit "))
        return nullptr;
    const KivStringT<char> text = Helpers::StreamToStringA(stream);
    int position = 0;
    const auto next = [&text, &position](KivStringViewT<char> key) {
        return ParseCommitInfo(text, key, position).value_or(KivStringT<char>());
    };
    const auto treeLine = ParseCommitInfo(text, "tree ", position);
    if (!treeLine)
        return nullptr;
    const Id treeId{KivStringT<char16_t>(*treeLine)};
    parentId = Id(KivStringT<char16_t>(next("parent ")));
    const Signature author(next("author "));
    const KivStringT<char16_t> description = String::ToStringW(next("\n\n"));

    Commit commit(repository, false);
    commit.SetAuthorName(author.name);
    commit.SetAuthorEmail(author.email);
    commit.SetDescription(description);
    commit.SetCommitTime(author.time);
    commit.SetCommitTimezoneBias(author.bias);
    if (!treeId.IsEmpty())
        commit.SetTree(CommitTree::Deserialize(treeId, repository, std::move(loader)));
    commit.RebuildTree(repository);
    commit.ResetState();
    return immu::make<Commit>(std::move(commit));
}

} // namespace KivVcs
