// usage: kivvcs_speed
// Times what every platform can run, and prints a line for each: name, value, unit. scripts/portability.sh compares the lines
// of two platforms. Everything is done over and over for a second and more, and the fastest round counts.

#include <KivVcs/KivVcs.h>

#include "objects/Sha256Compression.h"

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <string>

namespace KivVcs {
namespace {

constexpr int commitCount = 10'000;
constexpr int fileCount = 10'000;
constexpr std::size_t hashedBytes = 16 << 20;

KivStringT<char16_t> Path(int number, int directories) {
    return String::ToStringW(
        ("directory" + std::to_string(number % directories) + "/file" + std::to_string(number)).c_str());
}

Blob Content(std::string const& text) {
    Buffer content;
    content.Append(text.data(), text.size());
    return Blob(content);
}

class Stopwatch {
public:
    [[nodiscard]] double Milliseconds() const {
        return std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start_).count();
    }

private:
    std::chrono::steady_clock::time_point start_ = std::chrono::steady_clock::now();
};

/// The least time that @p round, which returns its own, takes.
template <class Round>
double Fastest(Round round) {
    const Stopwatch all;
    double fastest = round();
    for (int rounds = 1; rounds < 3 || all.Milliseconds() < 1000; ++rounds)
        fastest = std::min(fastest, round());
    return fastest;
}

/// Ten thousand versions, each of which changes one of a hundred files in ten directories.
double CommitRound() {
    Repository repository(std::make_unique<MemObjectsStorage>());
    const Stopwatch time;
    for (int number = 0; number < commitCount; ++number) {
        Commit commit(&repository, false);
        commit.AddBlob(&repository, Path(number % 100, 10), Content(std::to_string(number)));
        commit.SetDescription(u"Change a file");
        if (!repository.DoCommit(commit))
            return 0;
    }
    return time.Milliseconds();
}

/// Two branches that each changed three fifths of ten thousand files, a fifth of them in both.
class Merging {
public:
    Merging() {
        Change(0, fileCount, "base");
        repository_.CreateBranch(u"other", nullptr);
        Change(0, fileCount * 3 / 5, "mine");
        mine_ = repository_.GetHead();
        repository_.Checkout(u"other");
        Change(fileCount * 2 / 5, fileCount, "other");
    }

    double Round() {
        repository_.Checkout(u"master");
        repository_.MoveBranchTo(u"master", mine_);
        repository_.UpdateStorage();
        const auto other = repository_.GetHead(u"other");
        const auto always = [](auto const&...) { return TreeConflictChoice::Merge; };
        const Stopwatch time;
        const bool merged = repository_.Merge(other, {AlwaysChooseRight(), always});
        return merged ? time.Milliseconds() : 0;
    }

private:
    void Change(int from, int to, std::string const& content) {
        Commit commit(&repository_, false);
        for (int number = from; number < to; ++number)
            commit.AddBlob(&repository_, Path(number, 100), Content(content + std::to_string(number)));
        repository_.DoCommit(commit);
    }

    Repository repository_{std::make_unique<MemObjectsStorage>()};
    cow_ptr<Commit> mine_;
};

/// The portable code, whatever instructions the processor has.
double HashRound() {
    static std::string const bytes(hashedBytes, 'x');
    Sha256::State state = Sha256::initialState;
    const Stopwatch time;
    Sha256::CompressPortably(state, reinterpret_cast<const std::uint8_t*>(bytes.data()),
                             bytes.size() / Sha256::blockSize);
    const double milliseconds = time.Milliseconds();
    return state == Sha256::initialState ? 0 : milliseconds;
}

} // namespace
} // namespace KivVcs

int main() {
    KivVcs::Merging merging;
    std::printf("commits %.1f ms\n", KivVcs::Fastest(KivVcs::CommitRound));
    std::printf("merge %.1f ms\n", KivVcs::Fastest([&merging] { return merging.Round(); }));
    std::printf("hash %.1f ms\n", KivVcs::Fastest(KivVcs::HashRound));
    return 0;
}
