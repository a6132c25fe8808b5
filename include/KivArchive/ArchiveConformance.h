#pragma once

/// @file
/// The conformance suite for those who write an archive. It needs no test framework.

#include "KivArchive/detail/ConformanceContents.h"
#include "KivArchive/detail/ConformanceTables.h"
#include "KivArchive/detail/ConformanceUse.h"

#include <memory>

namespace KivArchive {

/// Makes a new, empty archive. Each case uses one of its own.
using ArchiveMaker = std::function<std::unique_ptr<IArchive>()>;

/// Receives each failure as a sentence that begins with the name of the case. May throw, which ends the check.
using ConformanceFailure = std::function<void(std::string const&)>;

/// Checks everything that `IArchive` promises.
inline void CheckArchiveConformance(ArchiveMaker const& makeEmpty, ConformanceFailure const& onFailure) {
    struct Case {
        const char* name;
        void (*check)(Conformance::Trial& trial, IArchive& archive);
    };
    for (Case const& each : {Case{"Objects", Conformance::CheckObjects},
                             {"Versions", Conformance::CheckVersions},
                             {"LargeContents", Conformance::CheckLargeContents},
                             {"Branches", Conformance::CheckBranches},
                             {"Records", Conformance::CheckRecords},
                             {"Ancestry", Conformance::CheckAncestry},
                             {"Marks", Conformance::CheckMarks},
                             {"RemovedEarlierVersions", Conformance::CheckRemovedEarlierVersions},
                             {"Inherited", Conformance::CheckInherited},
                             {"Refusals", Conformance::CheckRefusals},
                             {"Threads", Conformance::CheckThreads}}) {
        Conformance::Trial trial(each.name, onFailure);
        auto const archive = makeEmpty();
        try {
            each.check(trial, *archive);
        } catch (ArchiveError const& error) {
            trial.Expect(false, std::string("unexpected failure: ") + error.what());
        }
    }
}

} // namespace KivArchive
