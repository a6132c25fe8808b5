#include "Changes.h"
#include "repository/RepositoryState.h"

#include <algorithm>
#include <atomic>
#include <exception>
#include <thread>

namespace KivArchive {

namespace {

constexpr std::size_t batchSize = 256;

/// Reads with several threads, a part on each, which stop together.
class ParallelReading {
public:
    ParallelReading(IArchive& archive, std::span<const Id> ids, ObjectReceiver const& receiver, IProgress* progress)
        : archive_(archive), ids_(ids), receiver_(receiver), progress_(progress) {}

    ReadOutcome Run(std::size_t workers) {
        std::size_t const share = (ids_.size() + workers - 1) / workers;
        std::vector<ReadOutcome> outcomes(workers);
        std::vector<std::exception_ptr> failures(workers);
        auto const read = [&](std::size_t worker) noexcept {
            try {
                std::size_t const begin = std::min(ids_.size(), worker * share);
                ReadPart(ids_.subspan(begin, std::min(share, ids_.size() - begin)), worker == 0, outcomes[worker]);
            } catch (...) {
                failures[worker] = std::current_exception();
                isStopped_ = true;
            }
        };
        std::vector<std::thread> threads;
        threads.reserve(workers);
        std::size_t started = 1;
        try {
            for (; started < workers; ++started)
                threads.emplace_back(read, started);
        } catch (std::system_error const&) {
            // Without some of the threads it only takes longer.
        } catch (std::bad_alloc const&) {
        }
        read(0);
        for (; started < workers; ++started)
            read(started);
        for (std::thread& thread : threads)
            thread.join();
        for (auto const& failure : failures)
            if (failure)
                std::rethrow_exception(failure);
        return Joined(outcomes);
    }

private:
    void ReadPart(std::span<const Id> part, bool reports, ReadOutcome& outcome) {
        for (; !part.empty() && !isStopped_; part = part.subspan(std::min(batchSize, part.size()))) {
            if (reports)
                ReportProgress(progress_, {"reading contents", done_, ids_.size()}, {});
            std::span<const Id> const batch = part.first(std::min(batchSize, part.size()));
            ReadOutcome const read = archive_.Read(batch, receiver_);
            outcome.missing.insert(outcome.missing.end(), read.missing.begin(), read.missing.end());
            outcome.damaged.insert(outcome.damaged.end(), read.damaged.begin(), read.damaged.end());
            done_ += batch.size();
        }
    }

    static ReadOutcome Joined(std::vector<ReadOutcome> const& outcomes) {
        ReadOutcome all;
        for (ReadOutcome const& outcome : outcomes) {
            all.missing.insert(all.missing.end(), outcome.missing.begin(), outcome.missing.end());
            all.damaged.insert(all.damaged.end(), outcome.damaged.begin(), outcome.damaged.end());
        }
        return all;
    }

    IArchive& archive_;
    std::span<const Id> ids_;
    ObjectReceiver const& receiver_;
    IProgress* progress_;
    std::atomic<std::size_t> done_{0};
    std::atomic<bool> isStopped_{false};
};

} // namespace

ReadOutcome ArchivedRepository::ReadContents(std::span<const Id> ids, ObjectReceiver const& receiver,
                                             IProgress* progress) {
    std::size_t const wanted =
        state_->options.workers == 0 ? std::max(std::thread::hardware_concurrency(), 1U) : state_->options.workers;
    std::size_t const useful = std::clamp<std::size_t>((ids.size() + batchSize - 1) / batchSize, 1, wanted);
    return ParallelReading(state_->Archive(), ids, receiver, progress).Run(useful);
}

} // namespace KivArchive
