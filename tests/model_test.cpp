#include "model/World.h"

#include <gtest/gtest.h>

#include <cstdlib>

/// Random sequences of operations on a repository and on a plain model of it, which must agree after every step.

namespace KivVcs::Model {
namespace {

/// One action and the number from which it draws what it needs, so that any others can be left out.
struct Step {
    Action const* action;
    unsigned number;
};

/// What goes wrong, with all steps up to there; empty if nothing does.
std::string Failure(std::vector<Step> const& steps) {
    World world;
    try {
        for (Step const& step : steps) {
            world.log += std::string("\n") + step.action->name;
            world.Run(step.action->run, step.number);
            world.Check();
            if (step.number % 32 == 0 || &step == &steps.back())
                world.CheckAll();
        }
        return "";
    } catch (std::exception const& failure) {
        return world.log + "\n" + failure.what();
    }
}

/// Leaves out what the failure does not need, in ever smaller pieces.
std::vector<Step> Shrunk(std::vector<Step> steps) {
    for (std::size_t size = steps.size(); size > 0;) {
        const std::size_t before = steps.size();
        for (std::size_t from = 0; from < steps.size();) {
            auto fewer = steps;
            const auto first = fewer.begin() + static_cast<std::ptrdiff_t>(from);
            fewer.erase(first, first + static_cast<std::ptrdiff_t>(std::min(size, steps.size() - from)));
            if (Failure(fewer).empty())
                from += size;
            else
                steps = fewer;
        }
        size = size == 1 && steps.size() < before ? 1 : size / 2;
    }
    return steps;
}

int FromEnvironment(const char* name, int usual) {
    const char* const value = std::getenv(name);
    return value == nullptr ? usual : std::atoi(value);
}

class RandomOperations : public testing::TestWithParam<int> {};

TEST_P(RandomOperations, DoWhatThePlainModelDoes) {
    std::vector<Action const*> lots;
    for (auto const actions : {Editing(), Branches(), Pruning(), Merging()})
        for (Action const& action : actions)
            lots.insert(lots.end(), static_cast<std::size_t>(action.weight), &action);
    std::mt19937 random(static_cast<unsigned>(GetParam()));
    for (int left = FromEnvironment("KIVVCS_MODEL_STEPS", 1000); left > 0;) {
        std::vector<Step> steps(static_cast<std::size_t>(std::min(left, 300)));
        for (Step& step : steps)
            step = {lots[random() % lots.size()], static_cast<unsigned>(random())};
        left -= static_cast<int>(steps.size());
        if (!Failure(steps).empty()) {
            steps = Shrunk(steps);
            FAIL() << "seed " << GetParam() << ", shrunk to " << steps.size() << " steps:" << Failure(steps);
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomOperations, testing::Range(1, FromEnvironment("KIVVCS_MODEL_SEEDS", 20) + 1));

} // namespace
} // namespace KivVcs::Model
