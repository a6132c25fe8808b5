// A document of many pages with undo and redo without limit. The current branch is what the editor shows; "newest" is what redo
// leads back to. Undo and redo only move a branch, so both take no time and nothing is lost by them.

#include <KivVcs/KivVcs.h>

#include <iostream>

using namespace KivVcs;

namespace {

class Document {
public:
    Document() {
        Commit blank(&repository_, false);
        repository_.CreateBranch(u"newest", repository_.DoCommit(blank));
    }

    [[nodiscard]] std::string GetPage(int page) const {
        const auto blob = repository_.GetHead()->GetBlob(PathOf(page));
        return blob ? blob->CopyToString() : "";
    }

    /// Makes a version. What was undone before can no longer be redone.
    void SetPage(int page, std::string const& text) {
        Commit version(&repository_, false);
        version.AddBlob(&repository_, PathOf(page), Blob::CopyText(text));
        version.SetDescription(FromUtf8("Write page " + std::to_string(page)));
        repository_.MoveBranchTo(u"newest", repository_.DoCommit(version));
    }

    /// False at the first version: a branch does not move to a parent that is not there.
    bool Undo() { return repository_.MoveBranchTo(repository_.GetCurentBranch(), repository_.GetHead()->GetParent()); }

    /// False at the newest version. Commits know their parents only, so the way back is sought from the other end.
    bool Redo() {
        for (auto const& version : History(repository_.GetHead(u"newest"))) {
            if (version->GetParent() == repository_.GetHead())
                return repository_.MoveBranchTo(repository_.GetCurentBranch(), version);
        }
        return false;
    }

    /// Lets go of the versions that neither undo nor redo leads to.
    void Collect() { repository_.UpdateStorage(); }

    [[nodiscard]] std::uint64_t CountVersions() const { return repository_.GetCommitCount(); }

    /// All contents, directories and commit texts of all versions.
    [[nodiscard]] std::uint64_t CountBytes() const {
        std::uint64_t bytes = 0;
        const auto add = [&bytes](auto const& table) {
            for (auto const& [id, object] : table)
                bytes += object->GetData().GetSize();
        };
        IObjectsStorage const& storage = *repository_.GetStorage();
        add(storage.GetBlobs());
        add(storage.GetTrees());
        add(storage.GetCommits());
        return bytes;
    }

private:
    static KivStringT<char16_t> PathOf(int page) { return FromUtf8("pages/" + std::to_string(page)); }

    Repository repository_{std::make_unique<MemObjectsStorage>()};
};

bool Check(bool isTrue, const char* what) {
    std::cout << (isTrue ? "" : "NOT ") << what << '\n';
    return isTrue;
}

} // namespace

int main() {
    constexpr int pages = 20;
    constexpr int edits = 200;
    Document document;
    for (int page = 0; page < pages; ++page)
        document.SetPage(page, std::string(2'000, 'x'));
    const std::uint64_t before = document.CountBytes();
    for (int edit = 1; edit <= edits; ++edit)
        document.SetPage(edit % pages, std::string(2'000, 'x') + std::to_string(edit));
    const std::uint64_t each = (document.CountBytes() - before) / edits;
    std::cout << "A version of " << pages * 2'000 << " bytes, of which one page changed, takes " << each << " bytes\n";
    bool isWell = Check(each < 5'000, "a version costs the page, two directories and a commit");

    for (int step = 0; step < 150; ++step)
        isWell = document.Undo() && isWell;
    isWell = Check(document.GetPage(50 % pages).ends_with("x50"), "undone 150 times: edit 50 is the last") && isWell;
    for (int step = 0; step < 100; ++step)
        isWell = document.Redo() && isWell;
    isWell = Check(document.GetPage(150 % pages).ends_with("x150"), "redone 100 times: edit 150 is the last") && isWell;

    document.SetPage(0, "Another way");
    isWell = Check(!document.Redo(), "after another edit there is nothing to redo") && isWell;
    document.Collect();
    isWell = Check(document.CountVersions() == 1 + pages + 150 + 1, "50 versions were let go of") && isWell;
    while (document.Undo()) {
    }
    isWell = Check(document.GetPage(0).empty(), "undone to the blank document") && isWell;
    return isWell ? 0 : 1;
}
