#include "Changes.h"
#include "postgres/Preparation.h"

#include <algorithm>
#include <map>
#include <unordered_set>

namespace KivArchive::Postgres {

namespace {

/// How much one statement brings.
constexpr std::size_t statementSize = 8 * largestWholeContent;
/// How many bits of a number that tells type and size are those of the type.
constexpr unsigned typeBits = 4;
/// A branch is held while a change of one statement is stored.
constexpr std::size_t mostItemsOfShort = 64;

/// The bytes that stand for an identifier; none for null.
ByteView BytesOfId(Id const& id) {
    return id.IsEmpty() ? ByteView() : std::as_bytes(std::span(DigestOf(id)));
}

/// The facts of a change. Of several about one commit, the first count; what it contains adds up.
class Facts {
public:
    explicit Facts(Change const& change) {
        sorted_.reserve(change.ancestry.size());
        for (Ancestry const& facts : change.ancestry) {
            sorted_.push_back(&facts);
            for (ContainedCommit const& other : facts.contains) {
                containing_.push_back(BytesOfId(facts.commit));
                hows_.push_back(static_cast<std::int16_t>(other.how));
                contained_.push_back(BytesOfId(other.id));
            }
        }
        std::stable_sort(sorted_.begin(), sorted_.end(), [](Ancestry const* left, Ancestry const* right) {
            return IsBefore(left->commit, right->commit);
        });
        auto const isSame = [](Ancestry const* left, Ancestry const* right) { return left->commit == right->commit; };
        sorted_.erase(std::unique(sorted_.begin(), sorted_.end(), isSame), sorted_.end());
    }

    /// In ascending order of the commits, each once.
    [[nodiscard]] std::vector<Ancestry const*> const& All() const noexcept { return sorted_; }
    /// Null if there are none of it.
    [[nodiscard]] Ancestry const* Find(Id const& commit) const {
        auto const found =
            std::lower_bound(sorted_.begin(), sorted_.end(), commit,
                             [](Ancestry const* one, Id const& wanted) { return IsBefore(one->commit, wanted); });
        return found != sorted_.end() && (*found)->commit == commit ? *found : nullptr;
    }
    [[nodiscard]] bool ContainAny() const noexcept { return !contained_.empty(); }
    void AddContainedTo(Parameters& parameters) const { parameters.With(containing_).With(hows_).With(contained_); }

private:
    std::vector<Ancestry const*> sorted_;
    std::vector<ByteView> containing_;
    std::vector<std::int16_t> hows_;
    std::vector<ByteView> contained_;
};

/// Items as the columns of rows.
struct ObjectColumns {
    std::vector<ByteView> ids;
    std::vector<std::int16_t> types;
    std::vector<std::int64_t> sizes;
    std::vector<ByteView> bases;
    std::vector<ByteView> forms;
    std::size_t size = 0;

    explicit ObjectColumns(std::size_t count) {
        ids.reserve(count);
        types.reserve(count);
        sizes.reserve(count);
        bases.reserve(count);
        forms.reserve(count);
    }

    void Add(Prepared const& one) {
        ids.push_back(BytesOfId(one.item->id));
        types.push_back(static_cast<std::int16_t>(one.item->type));
        sizes.push_back(static_cast<std::int64_t>(one.item->size));
        bases.push_back(BytesOfId(one.base));
        forms.emplace_back(one.stored);
        size += one.stored.size();
    }
    void AddTo(Parameters& parameters) const { parameters.With(ids).With(types).With(sizes).With(bases).With(forms); }
};

/// The facts of some commits, beside their rows.
struct FactColumns {
    std::vector<std::optional<ByteView>> parents;
    std::vector<std::optional<ByteView>> trees;

    explicit FactColumns(std::size_t count) {
        parents.reserve(count);
        trees.reserve(count);
    }

    /// @param facts null for what has none
    void Add(Ancestry const* facts) {
        parents.push_back(facts == nullptr ? std::nullopt : std::optional(BytesOfId(facts->parent)));
        trees.push_back(facts == nullptr ? std::nullopt : std::optional(BytesOfId(facts->tree)));
    }
    void AddTo(Parameters& parameters) const { parameters.With(parents).With(trees); }
};

/// What a change uses without storing it anew, which must not be removed before the end of the transaction; sorted.
std::vector<Id> UsedBy(Change const& change, Preparation const& preparation) {
    std::vector<Id> used = change.relied;
    for (BranchMove const& move : change.branches)
        if (!move.head.IsEmpty())
            used.push_back(move.head);
    used.insert(used.end(), preparation.Present().begin(), preparation.Present().end());
    if (preparation.AreNew())
        std::erase_if(used, [&preparation](Id const& id) { return preparation.Find(id) != nullptr; });
    else
        // Others may have stored some, or somebody may have removed them.
        for (Prepared const& one : preparation.Items())
            used.push_back(one.item->id);
    SortUnique(used);
    return used;
}

/// The transaction that stores a change, in one round trip.
class Storing {
public:
    /// @param mayBeShort whether new objects on top of a branch may be taken for what nobody else knows
    Storing(Connection& connection, Preparation const& preparation, Change const& change, Token const& token,
            bool mayBeShort)
        : trip_(connection), preparation_(preparation), change_(change), used_(UsedBy(change, preparation)),
          facts_(change) {
        if (mayBeShort && IsShort())
            StoreInOneStatement(token);
        else
            StoreInOrder(token);
    }

    /// @return whether it has been committed; if not, something is not as expected
    bool Run() {
        static constexpr std::string_view divisionByZero = "22012";
        static constexpr std::string_view uniqueViolation = "23505";
        try {
            auto const answers = trip_.Run();
            return !isShort_ || answers.front().HasChanged();
        } catch (Refused const& refused) {
            if (hasToken_ && IsRepeated(refused, tokenPosition_))
                return true;
            if (refused.code != divisionByZero && refused.code != uniqueViolation)
                throw;
            return false;
        }
    }

private:
    /// Whether it is one commit with a little that is new, on top of one branch, and uses nothing but what that branch keeps.
    [[nodiscard]] bool IsShort() const {
        if (change_.branches.size() != 1 || !change_.records.empty() || !used_.empty() || !preparation_.AreNew() ||
            facts_.ContainAny() || preparation_.Items().size() > mostItemsOfShort)
            return false;
        std::vector<Id> inherited = change_.inherited;
        SortUnique(inherited);
        if (!preparation_.Bases(inherited).empty())
            return false;
        BranchMove const& move = change_.branches.front();
        return !move.expected.IsEmpty() && facts_.All().size() == 1 && facts_.Find(move.head) != nullptr &&
               AreOfItems();
    }

    /// Whether all facts are of commits that are brought.
    [[nodiscard]] bool AreOfItems() const {
        auto const& items = preparation_.Items();
        return facts_.All().size() ==
               static_cast<std::size_t>(std::count_if(items.begin(), items.end(), [this](Prepared const& one) {
                   return facts_.Find(one.item->id) != nullptr;
               }));
    }

    void StoreInOneStatement(Token const& token) {
        isShort_ = true;
        BranchMove const& move = change_.branches.front();
        ObjectColumns columns(preparation_.Items().size());
        std::vector<std::int64_t> kinds;
        kinds.reserve(preparation_.Items().size());
        for (Prepared const& one : preparation_.Items()) {
            columns.Add(one);
            kinds.push_back(
                static_cast<std::int64_t>(one.item->size << typeBits | static_cast<unsigned>(one.item->type)));
        }
        Ancestry const& facts = *facts_.Find(move.head);
        Parameters parameters;
        parameters.With(BytesOfName(move.name)).With(move.expected).With(move.head);
        parameters.With(columns.ids).With(kinds).With(columns.bases).With(columns.forms);
        // Who comes again finds the token with the new head, which is stored by nobody else.
        parameters.With(facts.parent).With(facts.tree).With(ByteView(token));
        AddIfBasesStand(parameters);
    }

    /// A branch that was elsewhere in between keeps what its head reaches, stored in whatever way, and so perhaps not what was a
    /// base several steps away.
    void AddIfBasesStand(Parameters& parameters) {
        auto const& bases = preparation_.FarBases();
        if (bases.empty()) {
            trip_.Add(Statement::MoveBranchToNew, parameters);
            return;
        }
        if (bases.size() == 1) {
            auto const& [id, base] = *bases.begin();
            trip_.Add(Statement::MoveBranchToNewIfBaseStands, parameters.With(id).With(base));
            return;
        }
        std::vector<Id> ids;
        std::vector<Id> theirBases;
        for (auto const& [id, base] : bases) {
            ids.push_back(id);
            theirBases.push_back(base);
        }
        trip_.Add(Statement::MoveBranchToNewIfBasesStand,
                  parameters.With(ids).With(theirBases).With(std::uint64_t{ids.size()}));
    }

    void StoreInOrder(Token const& token) {
        trip_.Add(Statement::Begin);
        if (NeedsToken()) {
            tokenPosition_ = trip_.Add(Statement::RememberAttempt, Parameters().With(ByteView(token)));
            hasToken_ = true;
        }
        AddObjects();
        CheckObjects();
        AddFacts();
        ChangeRecords();
        MoveBranches();
        trip_.Add(Statement::Commit);
    }

    /// What only adds can be done twice.
    [[nodiscard]] bool NeedsToken() const noexcept { return !change_.branches.empty() || !change_.records.empty(); }

    void AddObjects() {
        std::vector<Prepared> const& items = preparation_.Items();
        for (std::size_t next = 0; next < items.size();) {
            ObjectColumns columns(items.size() - next);
            FactColumns facts(items.size() - next);
            for (; next < items.size() && columns.size < statementSize; ++next) {
                columns.Add(items[next]);
                facts.Add(facts_.Find(items[next].item->id));
            }
            Parameters parameters;
            columns.AddTo(parameters);
            facts.AddTo(parameters);
            trip_.Add(preparation_.AreNew() ? Statement::AddNewObjects : Statement::AddObjects, parameters);
        }
        if (preparation_.ForFacts().empty())
            return;
        ObjectColumns columns(preparation_.ForFacts().size());
        for (Prepared const& one : preparation_.ForFacts())
            columns.Add(one);
        Parameters parameters;
        columns.AddTo(parameters);
        trip_.Add(Statement::AddToFacts, parameters);
    }

    /// Holds what is used and what is a base until the end of the transaction, so that nobody removes it. Marks are
    /// looked at behind that.
    void CheckObjects() {
        if (!preparation_.Removed().empty())
            trip_.Add(Statement::BringBack, Parameters().With(preparation_.Removed()));
        std::vector<Id> bases = preparation_.Bases({});
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

    void AddFacts() {
        if (!facts_.All().empty() && !(preparation_.AreNew() && AreOfItems())) {
            // The server may have the commits, with their facts or without.
            std::vector<ByteView> commits;
            FactColumns columns(facts_.All().size());
            commits.reserve(facts_.All().size());
            for (Ancestry const* const facts : facts_.All()) {
                commits.push_back(BytesOfId(facts->commit));
                columns.Add(facts);
            }
            Parameters parameters;
            parameters.With(commits);
            columns.AddTo(parameters);
            trip_.Add(Statement::AddFacts, parameters);
            trip_.Add(Statement::SetFacts, parameters);
        }
        if (facts_.ContainAny()) {
            Parameters parameters;
            facts_.AddContainedTo(parameters);
            trip_.Add(Statement::AddContained, parameters);
        }
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
    std::vector<Id> used_;
    Facts facts_;
    bool isShort_ = false;
    bool hasToken_ = false;
    std::size_t tokenPosition_ = 0;
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

struct FoundReason {
    /// An earlier attempt has stored it, whose answer was lost.
    bool isStored = false;
    ChangeOutcome outcome;
};

/// Why a change could not be stored: an outcome that is not applied if a race is lost; one that is if there is no reason.
/// @param needed what it relies on without bringing it
/// @param token what it has left behind if it is there already
/// @throws ArchiveError of kind `Collected` if some of what it needs is not there
FoundReason FindReason(Connection& connection, Change const& change, std::vector<Id> const& needed, Token const& token,
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
    if (!change.branches.empty())
        trip.Add(Statement::FindAttempt, Parameters().With(change.branches.front().head).With(ByteView(token)));
    auto const answers = trip.Run();

    if (!change.branches.empty() && answers[3].Count() != 0)
        return {true, {true, {}, {}}};
    ChangeOutcome outcome = Compare(change, answers[0], answers[1]);
    if (!outcome.applied)
        return {false, std::move(outcome)};
    std::unordered_set<Id> present;
    for (int i = 0; i < answers[2].Count(); ++i)
        if (!RowOf(answers[2].Number(i, 1)).isRemoved)
            present.insert(answers[2].Identifier(i, 0));
    for (Id const& id : needed)
        if (present.count(id) == 0)
            ThrowCollected(id, shown);
    return {false, std::move(outcome)};
}

/// What @p change relies on without bringing it.
std::vector<Id> NeededBy(Change const& change, std::vector<Item> const& items) {
    std::vector<Id> brought;
    brought.reserve(items.size());
    for (Item const& item : items)
        brought.push_back(item.id);
    SortUnique(brought);
    std::vector<Id> needed = change.relied;
    for (BranchMove const& move : change.branches)
        if (!move.head.IsEmpty())
            needed.push_back(move.head);
    std::erase_if(needed, [&brought](Id const& id) { return Contains(brought, id); });
    return needed;
}

} // namespace

ChangeOutcome Store::Apply(std::vector<Item> const& items, Change const& change) {
    Token const token = MakeToken();
    bool looksForPresent = false;
    Attempts attempts(options_, false);
    for (;;) {
        auto const outcome = Run([&](Connection& connection) -> std::optional<ChangeOutcome> {
            Preparation preparation(items, connection, recent_, options_.workers, looksForPresent);
            if (Storing(connection, preparation, change, token, !looksForPresent).Run()) {
                preparation.KeepStored();
                return ChangeOutcome{true, {}, {}};
            }
            FoundReason reason = FindReason(connection, change, NeededBy(change, items), token, Shown());
            if (reason.isStored || !reason.outcome.applied)
                return std::move(reason.outcome);
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
