#include "Changes.h"
#include "postgres/Forms.h"
#include "postgres/Store.h"

#include <unordered_set>

namespace KivArchive {

using namespace Postgres;

namespace {

/// How many objects are asked for at once, and how much of them may come at once.
constexpr std::size_t batchSize = 4096;
constexpr std::uint64_t windowSize = 8 * largestWholeContent;

/// Hands over one object. @return false if it is not what its identifier says
bool HandOver(Forms& forms, Id const& id, Row const& row, Compressor& compressor, ObjectReceiver const& receiver) {
    ObjectType const type = ObjectTypeOf(row.type);
    if (row.type == StoredType::LargeBlob) {
        receiver({id, type, row.size, {}});
        return true;
    }
    Form form;
    Bytes expanded;
    ByteView data;
    try {
        form = forms.FormOf(id, compressor);
        data = form.bytes;
        if (Member const& member = forms.MemberOf(id); member.isCompact) {
            expanded = ExpandForm(member, form.bytes);
            data = expanded;
        }
    } catch (Malformed const&) {
        return false;
    }
    if (!(Identify(type, data) == id))
        return false;
    receiver({id, type, data.size(), data});
    return true;
}

/// One call of `Read`.
class Reading {
public:
    Reading(Store& store, ObjectReceiver const& receiver) : store_(store), receiver_(receiver) {}

    void Read(std::span<const Id> ids) {
        Forms forms = Fetch(ids, windowSize);
        if (forms.AreWhole()) {
            HandOverAll(forms, ids);
            return;
        }
        std::vector<Id> window;
        std::uint64_t size = 0;
        auto const close = [&] {
            Forms whole = Fetch(window, UINT64_MAX / 2);
            HandOverAll(whole, window);
            window.clear();
            size = 0;
        };
        for (Id const& id : ids) {
            window.push_back(id);
            size += forms.StoredSizeOf(id);
            if (size >= windowSize / 2)
                close();
        }
        if (!window.empty())
            close();
    }

    [[nodiscard]] ReadOutcome const& Outcome() const noexcept { return outcome_; }

private:
    Forms Fetch(std::span<const Id> ids, std::uint64_t most) {
        return store_.Run([&](Connection& connection) {
            Forms forms;
            forms.Read(connection, ids, most);
            return forms;
        });
    }

    void HandOverAll(Forms& forms, std::span<const Id> ids) {
        for (Id const& id : ids) {
            Row const* const row = forms.Find(id);
            if (row == nullptr || !IsObject(*row))
                outcome_.missing.push_back(id);
            else if (!HandOver(forms, id, *row, compressor_, receiver_))
                outcome_.damaged.push_back(id);
        }
    }

    Store& store_;
    ObjectReceiver const& receiver_;
    Compressor compressor_;
    ReadOutcome outcome_;
};

/// Those of the ids that are objects here.
std::unordered_map<Id, ObjectInfo> FindObjects(Store& store, std::span<const Id> ids) {
    for (Id const& id : ids)
        static_cast<void>(DigestOf(id));
    std::unordered_map<Id, ObjectInfo> found;
    if (ids.empty())
        return found;
    Rows const rows = store.Run([ids](Connection& connection) {
        RoundTrip trip(connection);
        trip.Add(Statement::FindObjects, Parameters().With(ids));
        return trip.Run().front();
    });
    for (int i = 0; i < rows.Count(); ++i)
        if (Row const row = RowOf(rows.Number(i, 1)); IsObject(row)) {
            Id const id = rows.Identifier(i, 0);
            found.emplace(id, ObjectInfo{id, ObjectTypeOf(row.type), static_cast<std::uint64_t>(rows.Number(i, 2))});
        }
    return found;
}

} // namespace

std::vector<Id> PostgresArchive::FindMissing(std::span<const Id> ids) {
    auto const found = FindObjects(*store_, ids);
    std::vector<Id> missing;
    for (Id const& id : ids)
        if (found.count(id) == 0)
            missing.push_back(id);
    return missing;
}

std::vector<ObjectInfo> PostgresArchive::Describe(std::span<const Id> ids) {
    auto const found = FindObjects(*store_, ids);
    std::vector<ObjectInfo> described;
    for (Id const& id : ids)
        if (auto const object = found.find(id); object != found.end())
            described.push_back(object->second);
    return described;
}

ReadOutcome PostgresArchive::Read(std::span<const Id> ids, ObjectReceiver const& receiver) {
    for (Id const& id : ids)
        static_cast<void>(DigestOf(id));
    Reading reading(*store_, receiver);
    for (; !ids.empty(); ids = ids.subspan(std::min(batchSize, ids.size())))
        reading.Read(ids.first(std::min(batchSize, ids.size())));
    return reading.Outcome();
}

} // namespace KivArchive
