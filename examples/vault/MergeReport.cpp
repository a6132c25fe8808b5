#include "MergeReport.h"

#include "Names.h"
#include "Output.h"

#include <iostream>

namespace vault {

using KivVcs::ChangeKind;
using KivVcs::ConflictSettlement;

namespace {

std::string WordFor(ChangeKind kind) {
    switch (kind) {
    case ChangeKind::Added:
        return "added it";
    case ChangeKind::Removed:
        return "removed it";
    case ChangeKind::DirectoryBecameFile:
        return "made it a file";
    case ChangeKind::FileBecameDirectory:
        return "made it a directory";
    case ChangeKind::Unchanged:
        return "left it as it was";
    case ChangeKind::Changed:
    case ChangeKind::Renamed:
        break;
    }
    return "changed it";
}

std::string WordFor(ConflictSettlement settlement) {
    switch (settlement) {
    case ConflictSettlement::Left:
        return "left";
    case ConflictSettlement::Right:
        return "right";
    case ConflictSettlement::Root:
        return "base";
    case ConflictSettlement::Combined:
        return "combined";
    case ConflictSettlement::Undecided:
        break;
    }
    return "undecided";
}

std::string SettlementOf(MergedPath const& path) {
    if (path.taken == "undecided")
        return path.taken;
    if (path.taken == "marked")
        return "marked in the file";
    return "took " + path.taken + (path.isRemoved ? ", which removed it" : "");
}

} // namespace

MergedPath DescribeConflict(KivVcs::MergeConflict const& conflict, bool isMarked, bool isStopped) {
    MergedPath path;
    path.path = ToUtf8(conflict.path);
    path.left = WordFor(conflict.leftChange);
    path.right = WordFor(conflict.rightChange);
    path.isConflict = isMarked || conflict.settlement != ConflictSettlement::Combined;
    path.taken = isStopped ? "undecided" : isMarked ? "marked" : WordFor(conflict.settlement);
    auto const& taken = conflict.settlement == ConflictSettlement::Left    ? conflict.leftId
                        : conflict.settlement == ConflictSettlement::Right ? conflict.rightId
                                                                           : conflict.rootId;
    path.isRemoved = taken.IsEmpty();
    return path;
}

MergedPath DescribeConflict(ModeConflict const& conflict, bool prefersRight, bool isStopped) {
    return {conflict.path,
            std::string(conflict.left),
            std::string(conflict.right),
            true,
            isStopped      ? "undecided"
            : prefersRight ? "right"
                           : "left",
            false};
}

void ListMerged(std::span<MergedPath const> paths) {
    for (auto const& path : paths) {
        if (path.isConflict)
            std::cout << Coloured("conflict ", Colour::Red) << PrintableName(path.path) << ": left " << path.left
                      << ", right " << path.right << "; " << SettlementOf(path) << '\n';
        else
            std::cout << Coloured("merged ", Colour::Green) << PrintableName(path.path)
                      << ": both changed it, in different lines\n";
    }
}

void WriteMergeJson(std::string_view result, Id const& head, std::span<MergedPath const> paths) {
    std::cout << R"({"result":")" << result << R"(","head":")" << DigitsOf(head) << R"(","conflicts":[)";
    for (std::size_t i = 0; i < paths.size(); ++i)
        std::cout << (i == 0 ? "\n" : ",\n") << R"({"path":)" << JsonText(paths[i].path) << R"(,"left":")"
                  << paths[i].left << R"(","right":")" << paths[i].right << R"(","taken":")" << paths[i].taken
                  << R"("})";
    std::cout << (paths.empty() ? "]}\n" : "\n]}\n");
}

} // namespace vault
