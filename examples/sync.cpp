// Two replicas of one set of files. Each is changed while it is offline; what the other lacks goes over as packed forms, and
// the two are merged. KivArchive does this for stores that last and for any number of parties; here is what it takes by hand.

#include "load_history.h"

#include <iostream>

using namespace KivVcs;

namespace {

struct Replica {
    std::string name;
    Repository repository{std::make_unique<MemObjectsStorage>()};

    void Write(std::string const& path, std::string const& content) {
        Commit version(&repository, false);
        version.AddBlob(&repository, FromUtf8(path), Blob::CopyText(content));
        version.SetAuthorName(FromUtf8(name));
        version.SetDescription(FromUtf8("Write " + path + "\n\nA description may have several lines."));
        repository.DoCommit(version);
    }

    [[nodiscard]] std::string Read(std::string const& path) const {
        const auto blob = repository.GetHead()->GetBlob(FromUtf8(path));
        return blob ? blob->CopyToString() : "(none)";
    }
};

/// What a replica sends when it is asked for an object.
Buffer PackedForm(Repository const& repository, Id const& id) {
    if (const auto commit = repository.GetCommitFromStorage(id))
        return commit->GetPackedData();
    if (const auto tree = repository.GetTreeFromStorage(id))
        return tree->GetPackedData();
    const auto blob = repository.GetBlobFromStorage(id);
    return blob ? blob->GetPackedData() : Buffer();
}

/// Brings over what `to` lacks of the other's head, which the branch "theirs" then keeps.
cow_ptr<Commit> Receive(Replica& to, Replica const& from) {
    int objects = 0;
    const auto fetch = [&](Id const& id) {
        ++objects;
        return PackedForm(from.repository, id);
    };
    auto head = LoadHistory(to.repository, from.repository.GetHead()->GetId(), fetch);
    if (head && !to.repository.MoveBranchTo(u"theirs", head))
        to.repository.CreateBranch(u"theirs", head);
    std::cout << to.name << " received " << objects << " objects from " << from.name << '\n';
    return head;
}

/// Merges the other's work into one's own, which is kept where both changed a file, and prints what that decided.
MergeResult Pull(Replica& to, Replica const& from) {
    const auto theirs = Receive(to, from);
    const MergeOutcome outcome = MergeWithOutcome(to.repository, theirs, {AlwaysChooseLeft(), {}});
    for (auto const& conflict : outcome.conflicts)
        std::cout << "both changed " << conflict.path << ": " << to.name << "'s is kept\n";
    if (outcome.result == MergeResult::Merged) {
        Commit described(&to.repository, true);
        described.SetDescription(FromUtf8("Merge what " + from.name + " did"));
        to.repository.DoCommit(described);
    }
    return outcome.result;
}

} // namespace

int main() {
    Replica ada{"Ada"};
    Replica ben{"Ben"};
    ada.Write("plan.txt", "Paint the house");
    ada.Write("tools.txt", "brush");
    bool isWell = Pull(ben, ada) == MergeResult::Forwarded;

    // Offline, on both sides.
    ada.Write("plan.txt", "Paint the house blue");
    ben.Write("plan.txt", "Paint the house red");
    ben.Write("guests.txt", "Cleo");

    // Ada merges. Her merge has everything that Ben has, so he takes it over as it is: a commit names one parent only, which
    // does not tell him that his own work is in it.
    isWell = Pull(ada, ben) == MergeResult::Merged && isWell;
    isWell = ben.repository.MoveBranchTo(u"master", Receive(ben, ada)) && isWell;
    for (Replica const* replica : {&ada, &ben})
        std::cout << replica->name << ": " << replica->Read("plan.txt") << ", " << replica->Read("guests.txt") << '\n';

    // Both drop the versions in between, and still have the same one.
    ada.repository.MoveBranchTo(u"theirs", ada.repository.GetHead());
    isWell = ada.repository.SimplifyCommitGraph(true) && ben.repository.SimplifyCommitGraph(true) && isWell;
    std::cout << ShortIds(*ada.repository.GetStorage()).ShortFormOf(ada.repository.GetHead()->GetId())
              << " is the head of " << ada.repository.GetCommitCount() << " commit\n";
    isWell = ada.repository.GetHead()->GetId() == ben.repository.GetHead()->GetId() && isWell;
    return isWell && ada.Read("plan.txt") == "Paint the house blue" && ben.Read("guests.txt") == "Cleo" ? 0 : 1;
}
