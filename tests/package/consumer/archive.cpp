#include "ForwardingArchive.h"

#include <KivArchive/KivArchive.h>

#include <cstdio>
#include <stdexcept>

using namespace KivArchive;

namespace {

struct Refused : std::runtime_error {
    using std::runtime_error::runtime_error;
};

/// A host's archive, which can be away.
class Away final : public ForwardingArchive {
public:
    bool isAway = false;

protected:
    IArchive& Reach() override {
        if (isAway)
            throw Refused("away");
        return archive_;
    }

private:
    MemArchive archive_;
};

/// Stops what reports to it, or throws.
class Stop final : public IProgress {
public:
    explicit Stop(bool throws) : throws_(throws) {}
    bool Report(Progress const&) override {
        if (throws_)
            throw Refused("stop");
        return false;
    }

private:
    bool throws_;
};

template <class Failed, class Call>
bool EndsIn(Call call) {
    try {
        call();
        return false;
    } catch (Failed const&) {
        return true;
    }
}

} // namespace

/// Classes of hosts that derive from the component's interfaces, and exceptions that cross its boundary both ways.
int main() {
    auto const archive = std::make_shared<Away>();
    ArchivedRepository late(archive);
    ArchivedRepository repository(archive);
    Commit commit(&repository, false);
    commit.AddBlob(&repository, u"a", KivVcs::Blob::CopyText("a"));
    repository.DoCommit(commit);
    bool const publishes = repository.Publish().published;

    Stop stop(false);
    Stop fail(true);
    bool const throws =
        EndsIn<ArchiveError>([&] { late.Refresh(&stop); }) && EndsIn<Refused>([&] { late.Refresh(&fail); });
    archive->isAway = true;
    bool const isAway = EndsIn<Refused>([&] { repository.Refresh(); });

    IArchive& interface = *archive;
    KivVcs::IRepository& base = repository;
    bool const casts = dynamic_cast<Away*>(&interface) != nullptr && dynamic_cast<MemArchive*>(&interface) == nullptr &&
                       dynamic_cast<ArchivedRepository*>(&base) != nullptr;
    std::printf("publishes: %d, throws: %d, away: %d, casts: %d\n", publishes, throws, isAway, casts);
    return publishes && throws && isAway && casts ? 0 : 1;
}
