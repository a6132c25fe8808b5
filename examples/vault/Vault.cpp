#include "Vault.h"

#include "HistoryLoader.h"
#include "Problem.h"
#include "Verify.h"

namespace vault {

using KivVcs::Id;

namespace {

constexpr char16_t const* firstBranch = u"master";

/// A text that the file holds, which only damage can have made anything but UTF-8.
Text StoredText(VaultFile const& file, std::string const& bytes) {
    if (auto text = FromUtf8(bytes))
        return *std::move(text);
    throw Problem(Printable(file.Path().native()) + " is damaged: this is no text: " + Printable(bytes),
                  findingsExitStatus);
}

[[noreturn]] void ReportDamage(VaultFile& file, std::string const& head) {
    Progress progress("looking for damage");
    auto findings = FindDamage(file, progress);
    if (findings.empty())
        findings.push_back("the history of " + Printable(head) + " does not read back");
    std::string report = Printable(file.Path().native()) + ": " + findings.front();
    for (auto finding = findings.begin() + 1; finding != findings.end(); ++finding)
        report += "; " + *finding;
    throw Problem(report, findingsExitStatus);
}

} // namespace

Vault::Vault(std::filesystem::path const& path, VaultFile::Access access)
    : file_(path, access), repository_(std::make_unique<KivVcs::MemObjectsStorage>(std::initializer_list<TextView>{})) {
    if (file_.IsNew()) {
        Storage().CreateBranch(firstBranch, nullptr);
        return;
    }
    Progress progress("loading");
    // Branches come when all commits are there: until then the current branch has no head, as loading demands.
    std::map<std::string, CommitHandle> heads;
    for (auto const& [name, head] : file_.ReadBranches())
        heads.emplace(name, Load(file_, head, progress));
    for (auto const& [name, head] : heads)
        Storage().CreateBranch(StoredText(file_, name), head);
    if (const auto current = file_.ReadCurrentBranch(); !repository_.Checkout(StoredText(file_, current)))
        throw Problem(Printable(path.native()) + ": the current branch is missing: " + Printable(current),
                      findingsExitStatus);
}

Vault::CommitHandle Vault::Import(VaultFile& from, std::string const& head) {
    // While commits are loaded the current branch must have no head; it gets it back afterwards.
    const auto current = repository_.GetCurentBranch();
    const auto currentHead = repository_.GetHead();
    Storage().RemoveBranch(current);
    Progress progress("reading " + Printable(from.Path().native()));
    auto imported = Load(from, head, progress);
    Storage().CreateBranch(current, currentHead);
    return imported;
}

Vault::CommitHandle Vault::Load(VaultFile& from, std::string const& head, Progress& progress) {
    if (head.empty())
        return nullptr;
    const bool isOwn = &from == &file_;
    HistoryLoader loader(from, repository_, progress, [&](Id const& id) {
        if (isOwn)
            inFile_.insert(id);
    });
    auto commit = loader.Load(Id(StoredText(from, head)));
    if (!commit)
        ReportDamage(from, head);
    return commit;
}

std::size_t Vault::Write() {
    const auto written = WriteObjects();
    WriteBranches();
    file_.Commit();
    return written;
}

void Vault::WriteAndPrune() {
    WriteObjects();
    for (auto const& name : file_.ListObjects()) {
        const Id id(StoredText(file_, name));
        if (!Storage().GetCommit(id) && !Storage().GetTree(id) && !Storage().GetBlob(id))
            file_.DeleteObject(name);
    }
    WriteBranches();
    file_.Commit();
}

std::size_t Vault::WriteObjects() {
    // What a merge or a rebase made on its way and nothing refers to stays out of the file.
    repository_.UpdateStorage();
    Progress progress("writing");
    std::size_t written = 0;
    const auto writeNew = [&](auto const& table) {
        for (auto const& [id, object] : table) {
            if (inFile_.contains(id))
                continue;
            auto const& packed = object->GetPackedData();
            file_.WriteObject(ToUtf8(id), packed);
            progress.Step(packed.GetSize());
            ++written;
        }
    };
    writeNew(Storage().GetBlobs());
    writeNew(Storage().GetTrees());
    writeNew(Storage().GetCommits());
    return written;
}

void Vault::WriteBranches() {
    VaultFile::Branches branches;
    for (auto const& [name, head] : Storage().GetRefs())
        branches.emplace(ToUtf8(name), head ? ToUtf8(head->GetId()) : "");
    file_.WriteBranches(branches, ToUtf8(repository_.GetCurentBranch()));
}

} // namespace vault
