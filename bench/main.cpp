#include "Measuring.h"

#include <benchmark/benchmark.h>
#include <cstdio>
#include <dlfcn.h>
#include <gnu/libc-version.h>
#include <string_view>

namespace KivVcs::Bench {
namespace {

bool countsInstructions = false;

constexpr std::string_view usage =
    "usage: kivvcs_bench quick|whole|growth [OPTION OF THE BENCHMARK LIBRARY]...   a quarter of each size and less;\n"
    "                                                       whole and a quarter; these and a sixteenth\n"
    "       kivvcs_bench tools                              what it was built with\n"
    "       valgrind --tool=callgrind --collect-atstart=no kivvcs_bench count\n"
    "                                                       one round of each in small, and a dump behind each\n";

/// The rounds of one workload, which lie beside each other: what one of them needs is let go before the next is made.
/// The first round finds out what memory is needed; it also warms the memory up for those that are timed.
class Prepared {
public:
    void Prepare(Workload const& workload) {
        if (workload_ == &workload)
            return;
        round_ = nullptr;
        contender_ = nullptr;
        workload_ = &workload;
        round_ = workload.prepare();
        memory_ = {.operations = 0};
        CountMemory(true);
        for (int number = 0; number < workload.roundsInOne; ++number) {
            const Measurement one = round_();
            memory_.keptBytes += one.keptBytes;
            memory_.residentBytes += one.residentBytes;
            memory_.operations += one.operations;
        }
        CountMemory(false);
        if (workload.contender.prepare) {
            contender_ = workload.contender.prepare();
            static_cast<void>(contender_());
        }
    }

    [[nodiscard]] Measurement RunRound() { return round_(); }
    [[nodiscard]] double RunContender() { return contender_ ? contender_() : 0; }
    [[nodiscard]] double KeptBytes() const { return PerOperation(memory_.keptBytes); }
    [[nodiscard]] double ResidentBytes() const { return PerOperation(memory_.residentBytes); }

private:
    [[nodiscard]] double PerOperation(std::int64_t bytes) const {
        return static_cast<double>(bytes) / static_cast<double>(memory_.operations);
    }

    Workload const* workload_ = nullptr;
    Round round_;
    ContenderRound contender_;
    Measurement memory_;
};

void Run(benchmark::State& state, Workload const& workload, Prepared& prepared) {
    prepared.Prepare(workload);
    double seconds = 0;
    double floorSeconds = 0;
    double contenderSeconds = 0;
    for ([[maybe_unused]] auto iteration : state) {
        const Measurement one = prepared.RunRound();
        state.SetIterationTime(one.seconds);
        seconds += one.seconds;
        floorSeconds += one.floorSeconds;
        contenderSeconds += prepared.RunContender();
    }
    const auto rounds = static_cast<double>(state.iterations());
    state.counters["floor"] = floorSeconds / rounds;
    state.counters["ours"] = seconds / rounds;
    state.counters["ratio"] = floorSeconds > 0 ? seconds / floorSeconds : 0;
    state.counters["contender"] = contenderSeconds / rounds;
    state.counters["versus"] = contenderSeconds > 0 ? seconds / contenderSeconds : 0;
    state.counters["versusLimit"] = workload.contender.limit;
    state.SetLabel(workload.contender.name);
    state.counters["bytes"] = prepared.KeptBytes();
    state.counters["resident"] = prepared.ResidentBytes();
    state.counters["ratioLimit"] = workload.limits.ratio;
    state.counters["bytesLimit"] = workload.limits.bytes;
    state.counters["growthLimit"] = workload.limits.growth;
}

std::vector<Workload> MakeWorkloads(Divisors const& divisors) {
    std::vector<Workload> workloads;
    AddBuildingWorkloads(workloads, divisors);
    AddReadingWorkloads(workloads, divisors);
    AddHistoryWorkloads(workloads, divisors);
    AddScalingWorkloads(workloads, divisors);
    return workloads;
}

void CountInstructions() {
    countsInstructions = true;
    for (Workload const& workload : MakeWorkloads({64})) {
        Round round = workload.prepare();
        CALLGRIND_ZERO_STATS;
        (void)round();
        CALLGRIND_DUMP_STATS_AT(workload.name.c_str());
    }
}

void Measure(Divisors const& divisors, int argc, char** argv) {
    KeepFreedMemory();
    const std::vector<Workload> workloads = MakeWorkloads(divisors);
    Prepared prepared;
    for (Workload const& workload : workloads) {
        benchmark::RegisterBenchmark((workload.name + "/" + std::to_string(workload.size)).c_str(),
                                     [&](benchmark::State& state) { Run(state, workload, prepared); })
            ->UseManualTime()
            ->Iterations(workload.roundsInOne)
            ->Repetitions(9)
            ->ReportAggregatesOnly()
            ->Unit(benchmark::kMillisecond);
    }
    benchmark::Initialize(&argc, argv);
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
}

} // namespace
} // namespace KivVcs::Bench

/// In place of the standard library's, so that while instructions are counted the clock stands still: commits are then
/// made at the same time, and have the same identifiers, in every run.
extern "C" int clock_gettime(clockid_t clock, std::timespec* time) noexcept {
    if (KivVcs::Bench::countsInstructions && clock == CLOCK_REALTIME) {
        *time = {.tv_sec = 1'500'000'000, .tv_nsec = 0};
        return 0;
    }
    using Clock = int (*)(clockid_t, std::timespec*);
    static const auto systemClock = reinterpret_cast<Clock>(dlsym(RTLD_NEXT, "clock_gettime"));
    return systemClock(clock, time);
}

int main(int argc, char** argv) {
    using namespace KivVcs::Bench;
    const std::string_view mode = argc > 1 ? argv[1] : "";
    if (mode == "count")
        CountInstructions();
    else if (mode == "quick")
        Measure({16, 4}, argc - 1, argv + 1);
    else if (mode == "whole")
        Measure({4, 1}, argc - 1, argv + 1);
    else if (mode == "growth")
        Measure({16, 4, 1}, argc - 1, argv + 1);
    else if (mode == "tools")
        std::printf("compiler %s, libstdc++ %d, C library %s\n", __VERSION__, __GLIBCXX__, gnu_get_libc_version());
    else
        return static_cast<int>(std::fwrite(usage.data(), 1, usage.size(), stderr) != 0);
}
