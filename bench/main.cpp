#include "Measuring.h"

#include <benchmark/benchmark.h>
#include <cstring>

namespace KivVcs::Bench {
namespace {

/// The rounds of one workload, which lie beside each other: what one of them needs is let go before the next is made.
class Prepared {
public:
    Round& Of(Workload const& workload) {
        if (workload_ != &workload) {
            round_ = nullptr;
            ForgetResidentPeak();
            workload_ = &workload;
            round_ = workload.prepare();
        }
        return round_;
    }

private:
    Workload const* workload_ = nullptr;
    Round round_;
};

void Run(benchmark::State& state, Workload const& workload, Prepared& prepared) {
    Round& round = prepared.Of(workload);
    Measurement sum{.operations = 0};
    for ([[maybe_unused]] auto iteration : state) {
        const Measurement one = round();
        state.SetIterationTime(one.seconds);
        sum.seconds += one.seconds;
        sum.floorSeconds += one.floorSeconds;
        sum.keptBytes += one.keptBytes;
        sum.operations += one.operations;
    }
    const auto rounds = static_cast<double>(state.iterations());
    state.counters["floor"] = sum.floorSeconds / rounds;
    state.counters["ours"] = sum.seconds / rounds;
    state.counters["ratio"] = sum.floorSeconds > 0 ? sum.seconds / sum.floorSeconds : 0;
    state.counters["ratioLimit"] = workload.ratioLimit;
    state.counters["bytes"] = static_cast<double>(sum.keptBytes) / static_cast<double>(sum.operations);
    state.counters["bytesLimit"] = workload.bytesLimit;
    state.counters["resident"] = static_cast<double>(PeakResidentBytes());
}

} // namespace
} // namespace KivVcs::Bench

int main(int argc, char** argv) {
    using namespace KivVcs::Bench;
    const bool quick = argc > 1 && std::strcmp(argv[1], "--quick") == 0;
    std::vector<Workload> workloads;
    AddBuildingWorkloads(workloads, quick);
    AddReadingWorkloads(workloads, quick);
    AddHistoryWorkloads(workloads, quick);

    Prepared prepared;
    for (Workload const& workload : workloads) {
        benchmark::RegisterBenchmark((workload.name + "/" + std::to_string(workload.size)).c_str(),
                                     [&](benchmark::State& state) { Run(state, workload, prepared); })
            ->UseManualTime()
            ->Iterations(workload.roundsInOne)
            ->Repetitions(quick ? 3 : 7)
            ->ReportAggregatesOnly()
            ->Unit(benchmark::kMillisecond);
    }
    benchmark::Initialize(&argc, argv);
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
}
