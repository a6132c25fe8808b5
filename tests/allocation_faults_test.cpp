#include "allocation_faults/SoundnessCheck.h"

#include <cstdlib>
#include <new>

/// Operations during which one allocation after the other fails.

namespace {

/// What this program's operators `new` and `delete` do. The tests run on one thread.
struct Allocations {
    long living = 0;
    std::size_t requested = 0;
    /// The allocation that fails, counted from 1; none for 0.
    long failing = 0;
    bool laterOnesFailToo = false;
    long made = 0;
    bool hasFailed = false;
};
Allocations allocations;

bool Fails() {
    if (allocations.failing == 0)
        return false;
    ++allocations.made;
    return allocations.made == allocations.failing ||
           (allocations.laterOnesFailToo && allocations.made > allocations.failing);
}

} // namespace

// Inlined, they would look mismatched to the compiler.
[[gnu::noinline]] void* operator new(std::size_t size, std::nothrow_t const& /*tag*/) noexcept {
    if (Fails()) {
        allocations.hasFailed = true;
        return nullptr;
    }
    void* const memory = std::malloc(size == 0 ? 1 : size);
    allocations.requested += size;
    allocations.living += memory == nullptr ? 0 : 1;
    return memory;
}

[[gnu::noinline]] void* operator new(std::size_t size) {
    void* const memory = operator new(size, std::nothrow);
    return memory != nullptr ? memory : throw std::bad_alloc();
}

[[gnu::noinline]] void operator delete(void* memory) noexcept {
    allocations.living -= memory == nullptr ? 0 : 1;
    std::free(memory);
}

[[gnu::noinline]] void operator delete(void* memory, std::size_t) noexcept {
    operator delete(memory);
}

namespace KivVcs::Faults {
namespace {

/// Runs @p operation with its allocation @p failing; false if it completed, with or without a fault.
bool IsEndedByFault(Operation const& operation, World& world, long failing, bool laterOnesFailToo) {
    allocations = {.living = allocations.living, .failing = failing, .laterOnesFailToo = laterOnesFailToo};
    bool isEnded = false;
    try {
        operation.run(world);
    } catch (std::bad_alloc const&) {
        isEnded = true;
    }
    allocations.failing = 0;
    return isEnded;
}

std::string Kept(Operation const& operation, World const& world) {
    return operation.movesBranches ? world.Contents() : world.State();
}

/// Fails the allocations of an operation, every @p stride-th of them, in worlds that are made alike.
template <class Make>
long RunWithFaults(Operation const& operation, Make make, long stride, bool laterOnesFailToo) {
    std::string before;
    std::string undisturbed;
    {
        const auto world = make();
        before = Kept(operation, *world);
        SoundnessCheck{*world};
        operation.run(*world);
        SoundnessCheck{*world};
        undisturbed = operation.movesBranches ? "" : world->Outcome();
    }
    long faults = 0;
    for (allocations.hasFailed = true; allocations.hasFailed && !testing::Test::HasFailure(); ++faults) {
        SCOPED_TRACE(operation.name + std::string(", fault ") + std::to_string(faults));
        const long living = allocations.living;
        {
            const auto world = make();
            if (IsEndedByFault(operation, *world, 1 + faults * stride, laterOnesFailToo)) {
                EXPECT_EQ(Kept(operation, *world), before);
                SoundnessCheck{*world};
                operation.run(*world);
            }
            if (operation.movesBranches)
                EXPECT_TRUE(world->done && Kept(operation, *world) == before);
            else
                EXPECT_EQ(world->Outcome(), undisturbed);
        }
        EXPECT_EQ(allocations.living, living) << "leaked";
    }
    return faults - 1;
}

/// Under a sanitizer only some allocations fail, which keeps the test's time in proportion.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr const char* usualStride = "13";
#else
constexpr const char* usualStride = "1";
#endif

std::vector<Operation> AllOperations() {
    std::vector<Operation> all;
    for (auto const operations : {OnFoundation(), OnTrees(), OnCommits(), OnRepositories()})
        all.insert(all.end(), operations.begin(), operations.end());
    return all;
}

class AllocationFaults : public testing::TestWithParam<Operation> {};

TEST_P(AllocationFaults, LeaveEverythingAsItWasAndLeakNothing) {
#if defined(_WIN32)
    GTEST_SKIP() << "the library has allocation functions of its own there";
#endif
    const char* const wanted = std::getenv("KIVVCS_FAULT_STRIDE");
    const long stride = std::stol(wanted == nullptr ? usualStride : wanted);
    const World prototype;
    const std::string before = prototype.State();
    const auto makeAnew = [] { return std::make_unique<World>(); };
    const auto share = [&prototype] { return std::make_unique<World>(prototype); };
    long faults = 0;
    for (bool laterOnesFailToo : {false, true}) {
        faults += RunWithFaults(GetParam(), makeAnew, stride, laterOnesFailToo);
        faults += RunWithFaults(GetParam(), share, stride, laterOnesFailToo);
    }
    EXPECT_EQ(prototype.State(), before);
    RecordProperty("faults", std::to_string(faults));
    EXPECT_GT(faults, 0) << "nothing failed";
}

TEST(AllocationsOfBuffers, LeaveRoomInProportionToWhatIsWrittenBetweenSharedPieces) {
#if defined(_WIN32)
    GTEST_SKIP() << "the library has allocation functions of its own there";
#endif
    const Buffer shared = Buffer::Adopt(std::string(1500, 's'));
    const std::string own(100, 'o');
    Buffer buffer;
    const std::size_t before = allocations.requested;
    while (buffer.GetSize() < 16'000'000) {
        buffer.Append(shared);
        buffer.Append(own.data(), own.size());
    }
    EXPECT_LT(allocations.requested - before, 2 * buffer.GetSize());
}

INSTANTIATE_TEST_SUITE_P(Operations, AllocationFaults, testing::ValuesIn(AllOperations()),
                         [](auto const& instance) { return instance.param.name; });

} // namespace
} // namespace KivVcs::Faults
