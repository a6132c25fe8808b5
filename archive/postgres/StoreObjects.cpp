#include "Changes.h"
#include "postgres/Preparation.h"

#include <algorithm>
#include <map>
#include <unordered_set>

namespace KivArchive::Postgres {

namespace {

/// How much one statement brings.
constexpr std::size_t statementSize = 8 * largestWholeContent;

bool IsBefore(Id const& left, Id const& right) {
    return DigestOf(left) < DigestOf(right);
}

bool Contains(std::vector<Id> const& sorted, Id const& id) {
    return std::binary_search(sorted.begin(), sorted.end(), id, IsBefore);
}

void SortUnique(std::vector<Id>& ids) {
    std::sort(ids.begin(), ids.end(), IsBefore);
    ids.erase(std::unique(ids.begin(), ids.end()), ids.end());
}

/// The transaction that stores a change, in one round trip.
class Storing {
public:
    Storing(Connection& connection, Preparation const& preparation, Change const& change, Token const& token)
        : trip_(connection), preparation_(preparation), change_(change) {
        trip_.Add(Statement::Begin);
        if (NeedsToken()) {
            tokenPosition_ = trip_.Add(Statement::RememberAttempt, Parameters().With(ByteView(token)));
            hasToken_ = true;
        }
        AddObjects();
        CheckObjects();
        AddAncestry();
        ChangeRecords();
        MoveBranches();
        trip_.Add(Statement::Commit);
    }

    /// @return whether it has been committed; if not, something is not as expected
    bool Run() {
        static constexpr std::string_view divisionByZero = "22012";
        static constexpr std::string_view uniqueViolation = "23505";
        try {
            trip_.Run();
            return true;
        } catch (Refused const& refused) {
            if (hasToken_ && IsRepeated(refused, tokenPosition_))
                return true;
            if (refused.code != divisionByZero && refused.code != uniqueViolation)
                throw;
            return false;
        }
    }

    /// What is used without being stored anew.
    [[nodiscard]] std::vector<Id> const& Used() const noexcept { return used_; }

private:
    /// What only adds can be done twice.
    [[nodiscard]] bool NeedsToken() const noexcept { return !change_.branches.empty() || !change_.records.empty(); }

    void AddObjects() {
        std::vector<Prepared> const& items = preparation_.Items();
        for (std::size_t next = 0; next < items.size();) {
            std::vector<Id> ids;
            std::vector<std::int16_t> types;
            std::vector<std::int64_t> sizes;
            std::vector<Id> bases;
            std::vector<ByteView> forms;
            for (std::size_t size = 0; next < items.size() && size < statementSize; ++next) {
                Prepared const& one = items[next];
                ids.push_back(one.item->id);
                types.push_back(static_cast<std::int16_t>(one.item->type));
                sizes.push_back(static_cast<std::int64_t>(one.item->size));
                bases.push_back(one.base);
                forms.emplace_back(one.stored);
                size += one.stored.size();
            }
            trip_.Add(preparation_.AreNew() ? Statement::AddNewObjects : Statement::AddObjects,
                      Parameters().With(ids).With(types).With(sizes).With(bases).With(forms));
        }
    }

    /// Holds what is used and what is a base until the end of the transaction, so that nobody removes it. Marks are
    /// looked at behind that.
    void CheckObjects() {
        used_ = change_.relied;
        for (BranchMove const& move : change_.branches)
            if (!move.head.IsEmpty())
                used_.push_back(move.head);
        used_.insert(used_.end(), preparation_.Present().begin(), preparation_.Present().end());
        std::vector<Id> items;
        for (Prepared const& one : preparation_.Items())
            items.push_back(one.item->id);
        if (preparation_.AreNew()) {
            SortUnique(items);
            std::erase_if(used_, [&items](Id const& id) { return Contains(items, id); });
        } else {
            // Others may have stored some, or somebody may have removed them.
            used_.insert(used_.end(), items.begin(), items.end());
        }
        SortUnique(used_);
        if (!preparation_.Removed().empty())
            trip_.Add(Statement::BringBack, Parameters().With(preparation_.Removed()));
        std::vector<Id> bases = preparation_.Bases();
        std::vector<Id> held = used_;
        held.insert(held.end(), bases.begin(), bases.end());
        SortUnique(held);
        // Bases need not be objects, but for those that are used as well.
        std::erase_if(bases, [this](Id const& id) { return Contains(used_, id); });
        if (!held.empty())
            trip_.Add(Statement::CheckUsed, Parameters().With(held).With(std::uint64_t{held.size()}).With(bases));
        if (!used_.empty())
            trip_.Add(Statement::DeleteMarks, Parameters().With(used_));
    }

    void AddAncestry() {
        std::vector<Id> commits;
        std::vector<Id> parents;
        std::vector<Id> trees;
        std::vector<Id> containing;
        std::vector<std::int16_t> hows;
        std::vector<Id> contained;
        for (Ancestry const& facts : change_.ancestry) {
            commits.push_back(facts.commit);
            parents.push_back(facts.parent);
            trees.push_back(facts.tree);
            for (ContainedCommit const& other : facts.contains) {
                containing.push_back(facts.commit);
                hows.push_back(static_cast<std::int16_t>(other.how));
                contained.push_back(other.id);
            }
        }
        if (!commits.empty())
            trip_.Add(Statement::AddAncestry, Parameters().With(commits).With(parents).With(trees));
        if (!contained.empty())
            trip_.Add(Statement::AddContained, Parameters().With(containing).With(hows).With(contained));
    }

    void ChangeRecords() {
        for (auto const& [record, compared, expected] : change_.records) {
            Bytes const name = BytesOfName(record.name);
            Buffer const value = Joined(record.value.value_or(Buffer()));
            Parameters const named = Parameters().With(name);
            Parameters const set = Parameters().With(name).With(BytesOf(value));
            if (compared && expected)
                trip_.Add(Statement::CheckRecord, Parameters().With(name).With(BytesOf(Joined(*expected))));
            if (compared && !expected)
                record.value ? trip_.Add(Statement::MakeRecord, set) : trip_.Add(Statement::CheckNoRecord, named);
            else if (record.value)
                trip_.Add(Statement::ChangeRecord, set);
            else
                trip_.Add(Statement::RemoveRecord, named);
            if (!compared && record.value)
                trip_.Add(Statement::AddRecord, set);
        }
    }

    /// Last, since this is what others wait for.
    void MoveBranches() {
        for (BranchMove const& move : change_.branches) {
            Bytes const name = BytesOfName(move.name);
            if (!move.expected.IsEmpty()) {
                if (move.head.IsEmpty())
                    trip_.Add(Statement::RemoveBranch, Parameters().With(name).With(move.expected));
                else
                    trip_.Add(Statement::MoveBranch, Parameters().With(name).With(move.expected).With(move.head));
            } else if (move.head.IsEmpty()) {
                trip_.Add(Statement::CheckNoHead, Parameters().With(name));
            } else {
                trip_.Add(Statement::MakeBranch, Parameters().With(name).With(move.head));
            }
        }
    }

    RoundTrip trip_;
    Preparation const& preparation_;
    Change const& change_;
    bool hasToken_ = false;
    std::size_t tokenPosition_ = 0;
    std::vector<Id> used_;
};

/// Compares branches and records with what @p change expects.
ChangeOutcome Compare(Change const& change, Rows const& branches, Rows const& records) {
    std::map<KivStringT<char16_t>, Id> heads;
    for (int i = 0; i < branches.Count(); ++i)
        heads.emplace(NameOfBytes(branches.Value(i, 0)), branches.Identifier(i, 1));
    std::map<KivStringT<char16_t>, std::optional<Buffer>> values;
    for (int i = 0; i < records.Count(); ++i) {
        ByteView const value = records.Value(i, 1);
        values[NameOfBytes(records.Value(i, 0))].emplace().Append(value.data(), value.size());
    }
    ChangeOutcome outcome;
    for (BranchMove const& move : change.branches)
        if (Id const head = heads[move.name]; !(head == move.expected))
            outcome.movedBranches.push_back({move.name, head});
    for (RecordChange const& record : change.records)
        if (auto const& value = values[record.record.name]; record.compared && !SameValue(value, record.expected))
            outcome.changedRecords.push_back({record.record.name, value});
    outcome.applied = outcome.movedBranches.empty() && outcome.changedRecords.empty();
    return outcome;
}

/// Why a change could not be stored: an outcome that is not applied if a race is lost.
/// @param needed what it relies on without bringing it
/// @throws ArchiveError of kind `Collected` if some of that is not there
ChangeOutcome FindReason(Connection& connection, Change const& change, std::vector<Id> const& needed,
                         std::string const& shown) {
    std::vector<Bytes> branches;
    for (BranchMove const& move : change.branches)
        branches.push_back(BytesOfName(move.name));
    std::vector<Bytes> records;
    for (RecordChange const& record : change.records)
        records.push_back(BytesOfName(record.record.name));
    RoundTrip trip(connection);
    trip.Add(Statement::ReadHeads, Parameters().With(branches));
    trip.Add(Statement::ReadRecords, Parameters().With(records));
    trip.Add(Statement::FindRows, Parameters().With(needed));
    auto const answers = trip.Run();

    ChangeOutcome outcome = Compare(change, answers[0], answers[1]);
    if (!outcome.applied)
        return outcome;
    std::unordered_set<Id> present;
    for (int i = 0; i < answers[2].Count(); ++i)
        if (!RowOf(answers[2].Number(i, 1)).isRemoved)
            present.insert(answers[2].Identifier(i, 0));
    for (Id const& id : needed)
        if (present.count(id) == 0)
            ThrowCollected(id, shown);
    return outcome;
}

/// What @p change relies on without bringing it.
std::vector<Id> NeededBy(Change const& change, std::vector<Item> const& items) {
    std::unordered_set<Id> brought;
    for (Item const& item : items)
        brought.insert(item.id);
    std::vector<Id> needed = change.relied;
    for (BranchMove const& move : change.branches)
        if (!move.head.IsEmpty())
            needed.push_back(move.head);
    std::erase_if(needed, [&brought](Id const& id) { return brought.count(id) != 0; });
    return needed;
}

} // namespace

ChangeOutcome Store::Apply(std::vector<Item> const& items, Change const& change) {
    Token const token = MakeToken();
    std::vector<Id> const needed = NeededBy(change, items);
    bool looksForPresent = false;
    Attempts attempts(options_, false);
    for (;;) {
        auto const outcome = Run([&](Connection& connection) -> std::optional<ChangeOutcome> {
            Preparation const preparation(items, connection, recent_, options_.workers, looksForPresent);
            if (Storing(connection, preparation, change, token).Run()) {
                preparation.KeepStored();
                return ChangeOutcome{true, {}, {}};
            }
            ChangeOutcome reason = FindReason(connection, change, needed, Shown());
            if (!reason.applied)
                return reason;
            // Others have stored or removed the same meanwhile.
            return std::nullopt;
        });
        if (outcome)
            return *outcome;
        looksForPresent = true;
        if (!attempts.WaitAfterConflict())
            throw ArchiveError(Failure::Locked, Shown(), "Others have kept this archive busy for too long.");
    }
}

} // namespace KivArchive::Postgres

namespace KivArchive {

ChangeOutcome PostgresArchive::Apply(Change const& change) {
    CheckChange(change, store_->Shown());
    std::vector<Item> items;
    items.reserve(change.objects.size());
    for (NewObject const& object : change.objects)
        items.push_back({object.id, static_cast<StoredType>(object.type), object.data.GetSize(), Joined(object.data),
                         object.earlier});
    return store_->Apply(items, change);
}

} // namespace KivArchive
