#include "MergingRound.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <iostream>

/// Rounds of parties that merge again and again, beside a plain model. KIVVCS_MERGE_ROUNDS sets the number of rounds,
/// KIVVCS_MERGE_PARTIES that of parties, and KIVVCS_MERGE_SEED the first seed.

namespace KivArchive {
namespace {

std::uint32_t NumberFrom(const char* variable, std::uint32_t otherwise) {
    const char* const value = std::getenv(variable);
    return value != nullptr ? static_cast<std::uint32_t>(std::atoi(value)) : otherwise;
}

Account RunRound(std::uint32_t seed, std::size_t parties, std::vector<std::uint32_t> const& steps) {
    Account account;
    Round(seed, parties, account).Run(steps);
    return account;
}

/// The kind of the first fault, without its path.
std::string KindOfFault(Account const& account) {
    return account.faults.empty() ? "" : account.faults.front().substr(0, account.faults.front().find(','));
}

/// Leaves out all steps that the round does not need to fail in the same way.
Account Shrink(std::uint32_t seed, std::size_t parties, std::vector<std::uint32_t> steps, Account found) {
    for (std::size_t size = steps.size() / 2; size > 0; size /= 2)
        for (std::size_t begin = 0; begin + size <= steps.size();) {
            auto fewer = steps;
            auto const first = fewer.begin() + static_cast<std::ptrdiff_t>(begin);
            fewer.erase(first, first + static_cast<std::ptrdiff_t>(size));
            Account account = RunRound(seed, parties, fewer);
            if (KindOfFault(account) != KindOfFault(found)) {
                ++begin;
                continue;
            }
            steps = std::move(fewer);
            found = std::move(account);
        }
    return found;
}

TEST(MergingRounds, LoseNoEditAndBringNoneBack) {
    std::uint32_t const rounds = NumberFrom("KIVVCS_MERGE_ROUNDS", 60);
    std::uint32_t const parties = NumberFrom("KIVVCS_MERGE_PARTIES", 3);
    std::uint32_t const first = NumberFrom("KIVVCS_MERGE_SEED", 1);
    Account all;
    std::uint32_t faulty = 0;
    for (std::uint32_t seed = first; seed < first + rounds; ++seed) {
        std::mt19937 random(seed);
        std::vector<std::uint32_t> steps(10 * parties);
        std::generate(steps.begin(), steps.end(), std::ref(random));
        Account account = RunRound(seed, parties, steps);
        for (auto const& [name, count] : account.counts)
            all.counts[name] += count;
        if (account.faults.empty())
            continue;
        ++faulty;
        std::string text;
        for (auto const& step : Shrink(seed, parties, steps, std::move(account)).steps)
            text += "\n" + step;
        ADD_FAILURE() << "round " << seed << ", with as few steps as it takes:" << text;
    }
    std::cout << rounds << " rounds of " << parties << " parties, " << faulty << " faulty:";
    for (auto const& [name, count] : all.counts)
        std::cout << " " << count << " " << name << ";";
    std::cout << "\n";
    EXPECT_GT(all.counts["questions"], 0U);
    EXPECT_GT(all.counts["collected"], 0U);
}

} // namespace
} // namespace KivArchive
