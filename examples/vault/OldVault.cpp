#include "OldVault.h"

#include "Problem.h"
#include "Progress.h"
#include "Trees.h"
#include "Vault.h"

#include <KivArchive/SqliteArchive.h>
#include <KivArchive/Upkeep.h>
#include <array>
#include <fstream>
#include <iostream>
#include <memory>
#include <set>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unordered_set>

namespace vault {

using KivArchive::Link;
using KivArchive::ObjectType;

namespace {

constexpr std::string_view oldApplicationId = "KVLT";
constexpr std::uint64_t mostPendingBytes = std::uint64_t{4} * 1024 * 1024;

bool IsOldVault(std::string const& file) {
    std::array<char, 72> header{};
    std::ifstream stream(file, std::ios::binary);
    return stream.read(header.data(), header.size()) && std::string_view(header.data(), 15) == "SQLite format 3" &&
           std::string_view(header.data() + 68, 4) == oldApplicationId;
}

/// The old database, locked against writers.
class OldDatabase {
public:
    OldDatabase(std::string const& file, std::chrono::seconds wait) : file_(file) {
        sqlite3* database = nullptr;
        const int result = sqlite3_open_v2(file.c_str(), &database, SQLITE_OPEN_READWRITE, nullptr);
        database_.reset(database);
        Check(result);
        sqlite3_busy_timeout(database, static_cast<int>(std::chrono::milliseconds(wait).count()));
        sqlite3_db_config(database, SQLITE_DBCONFIG_ENABLE_TRIGGER, 0, nullptr);
        sqlite3_db_config(database, SQLITE_DBCONFIG_ENABLE_VIEW, 0, nullptr);
        Check(sqlite3_exec(database, "PRAGMA trusted_schema = OFF; BEGIN IMMEDIATE", nullptr, nullptr, nullptr));
    }

    using Row = std::vector<std::string>;

    std::vector<Row> Query(char const* sql, std::string_view parameter = {}) {
        sqlite3_stmt* prepared = nullptr;
        Check(sqlite3_prepare_v2(database_.get(), sql, -1, &prepared, nullptr));
        const std::unique_ptr<sqlite3_stmt, decltype(&sqlite3_finalize)> statement(prepared, &sqlite3_finalize);
        if (!parameter.empty())
            Check(sqlite3_bind_text64(prepared, 1, parameter.data(), parameter.size(), SQLITE_STATIC, SQLITE_UTF8));
        std::vector<Row> rows;
        int result = sqlite3_step(prepared);
        for (; result == SQLITE_ROW; result = sqlite3_step(prepared)) {
            auto& row = rows.emplace_back();
            for (int column = 0; column < sqlite3_column_count(prepared); ++column) {
                auto const* const bytes = static_cast<char const*>(sqlite3_column_blob(prepared, column));
                const auto size = static_cast<std::size_t>(sqlite3_column_bytes(prepared, column));
                row.emplace_back(bytes == nullptr ? "" : bytes, size);
            }
        }
        Check(result == SQLITE_DONE ? SQLITE_OK : result);
        return rows;
    }

private:
    void Check(int result) {
        if (result == SQLITE_OK)
            return;
        if ((result & 0xFF) == SQLITE_BUSY)
            throw Problem(Printable(file_) + " is locked by another process");
        throw Problem(Printable(file_) +
                          " is damaged: " + (database_ ? sqlite3_errmsg(database_.get()) : sqlite3_errstr(result)),
                      findingsExitStatus);
    }

    std::string const& file_;
    std::unique_ptr<sqlite3, decltype(&sqlite3_close_v2)> database_{nullptr, &sqlite3_close_v2};
};

/// Copies what branches reach, older versions first and contents before what names them.
class Upgrade {
public:
    Upgrade(OldDatabase& from, IArchive& to) : from_(from), to_(to), progress_("bringing the vault up to date") {}

    void Run() {
        KivArchive::Change last;
        for (auto const& row : from_.Query("SELECT name, head FROM branches")) {
            const auto head = Id::Parse(row[1]);
            const auto name = FromUtf8(row[0]);
            if (!head || !name)
                continue;
            CopyHistory(*head);
            if (copied_.contains(*head))
                last.branches.push_back({*name, {}, *head});
            else
                problems_.insert("branch " + Printable(row[0]) + " has lost its last version");
        }
        for (auto const& row : from_.Query("SELECT value FROM settings WHERE name = 'branch'")) {
            if (const auto name = FromUtf8(row[0]))
                last.records.push_back(Vault::MakeCurrent(*name));
        }
        to_.Apply(change_);
        to_.Apply(last);
        for (auto const& problem : problems_)
            std::cerr << "vault: left behind while bringing the vault up to date: " << problem << '\n';
    }

private:
    struct Object {
        ObjectType type = ObjectType::Blob;
        std::string data;
        std::vector<Link> links;
    };

    std::optional<Object> Read(Id const& id) {
        const auto digits = DigitsOf(id);
        const auto rows = from_.Query("SELECT packed FROM objects WHERE id = ?", digits);
        Object object;
        if (!rows.empty()) {
            auto const& packed = rows.front().front();
            const auto headerEnd = packed.find('\0');
            object.type = packed.starts_with("tree ")     ? ObjectType::Tree
                          : packed.starts_with("commit ") ? ObjectType::Commit
                                                          : ObjectType::Blob;
            object.data = headerEnd == std::string::npos ? "" : packed.substr(headerEnd + 1);
            const auto bytes = std::as_bytes(std::span(object.data));
            if (KivArchive::Identify(object.type, bytes) == id &&
                KivArchive::ReadLinks(object.type, bytes, object.links))
                return object;
        }
        problems_.insert((rows.empty() ? "missing object " : "damaged object ") + digits);
        return std::nullopt;
    }

    void CopyHistory(Id const& head) {
        std::vector<Id> line;
        std::unordered_set<Id> seen;
        for (Id id = head; !id.IsEmpty() && !copied_.contains(id) && seen.insert(id).second;) {
            line.push_back(id);
            const auto commit = Read(id);
            id = commit ? LinkOf(*commit, ObjectType::Commit) : Id();
        }
        Id earlierTree;
        for (auto id = line.rbegin(); id != line.rend(); ++id) {
            const auto commit = Read(*id);
            if (!commit || commit->type != ObjectType::Commit)
                continue;
            const auto tree = LinkOf(*commit, ObjectType::Tree);
            if (!tree.IsEmpty())
                CopyTree(tree, earlierTree);
            Keep(*id, *commit, {});
            change_.ancestry.push_back({*id, LinkOf(*commit, ObjectType::Commit), tree, {}});
            earlierTree = tree;
        }
    }

    static Id LinkOf(Object const& commit, ObjectType type) {
        for (auto const& link : commit.links) {
            if (link.type == type)
                return link.id;
        }
        return {};
    }

    /// A directory on the way to the one that is being copied.
    struct Level {
        Id id;
        Id earlier;
        Object tree;
        std::unordered_map<std::string, Id> earlierEntries;
        std::size_t next = 0;
    };

    void CopyTree(Id const& root, Id const& earlierRoot) {
        std::vector<Level> levels;
        const auto enter = [&](Id const& id, Id const& earlier) {
            if (copied_.contains(id))
                return;
            if (auto tree = Read(id); tree && tree->type == ObjectType::Tree)
                levels.push_back({id, earlier, *std::move(tree), EntriesOf(earlier), 0});
        };
        enter(root, earlierRoot);
        while (!levels.empty()) {
            auto& level = levels.back();
            if (level.next == level.tree.links.size()) {
                Keep(level.id, level.tree, level.earlier);
                levels.pop_back();
                continue;
            }
            const auto link = level.tree.links[level.next++];
            const auto found = level.earlierEntries.find(std::string(link.name));
            const auto earlier = found == level.earlierEntries.end() ? Id() : found->second;
            if (link.type == ObjectType::Tree)
                enter(link.id, earlier);
            else if (!copied_.contains(link.id))
                CopyContent(link.id, earlier);
        }
    }

    std::unordered_map<std::string, Id> EntriesOf(Id const& tree) {
        std::unordered_map<std::string, Id> entries;
        if (const auto object = tree.IsEmpty() ? std::nullopt : Read(tree)) {
            for (auto const& link : object->links)
                entries.emplace(link.name, link.id);
        }
        return entries;
    }

    void CopyContent(Id const& id, Id const& earlier) {
        const auto content = Read(id);
        if (!content || content->type != ObjectType::Blob)
            return;
        if (content->data.size() <= KivArchive::largestWholeContent) {
            Keep(id, *content, earlier);
            return;
        }
        KivVcs::StreamIO stream(KivVcs::MemStream::CreateOnCopy(BufferOf(content->data)));
        if (to_.StoreContent(id, stream, earlier, nullptr))
            copied_.insert(id);
    }

    void Keep(Id const& id, Object const& object, Id const& earlier) {
        copied_.insert(id);
        pendingBytes_ += object.data.size();
        change_.objects.push_back({id, object.type, BufferOf(object.data), earlier});
        progress_.Step(object.data.size());
        if (pendingBytes_ < mostPendingBytes)
            return;
        to_.Apply(change_);
        change_ = {};
        pendingBytes_ = 0;
    }

    OldDatabase& from_;
    IArchive& to_;
    Progress progress_;
    std::unordered_set<Id> copied_;
    std::set<std::string> problems_;
    KivArchive::Change change_;
    std::uint64_t pendingBytes_ = 0;
};

} // namespace

void UpgradeOldVault(std::string const& file, std::chrono::seconds wait) {
    if (!IsOldVault(file))
        return;
    OldDatabase old(file, wait);
    // Somebody else may have done it while this one waited.
    if (!IsOldVault(file))
        return;
    const auto upgraded = file + ".upgrading";
    for (auto const* const suffix : {"", "-wal", "-shm"})
        unlink((upgraded + suffix).c_str());
    try {
        KivArchive::SqliteArchive archive(upgraded);
        Upgrade(old, archive).Run();
    } catch (...) {
        for (auto const* const suffix : {"", "-wal", "-shm"})
            unlink((upgraded + suffix).c_str());
        throw;
    }
    if (rename(upgraded.c_str(), file.c_str()) != 0)
        throw Problem("cannot replace " + Printable(file) + " by the vault that was brought up to date");
}

} // namespace vault
