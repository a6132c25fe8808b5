#pragma once

/// @file
/// What every archive must do, for those who write one: hand `CheckArchiveConformance` a way to make empty archives and
/// a place to report failures to. Needs no test framework and no more than the library.

#include "KivArchive/detail/ConformanceContents.h"
#include "KivArchive/detail/ConformanceTables.h"
#include "KivArchive/detail/ConformanceUse.h"

#include <memory>

namespace KivArchive {

/// An archive is tried with nothing but what is in it; each case begins with an empty one.
using ArchiveMaker = std::function<std::unique_ptr<IArchive>()>;

/// Receives what is wrong, in a sentence that begins with the case. May throw, which ends the check.
using ConformanceFailure = std::function<void(std::string const&)>;

/// Tries everything that `IArchive` promises. @p makeEmpty gives a new, empty archive at each call.
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
