// Merges every kind of disagreement about one name and compares what comes of it with the table in a document, given as the
// argument; with --write before it, puts the table there.

#include <KivVcs/KivVcs.h>

#include <algorithm>
#include <fstream>
#include <iostream>
#include <map>
#include <sstream>
#include <string>
#include <vector>

using namespace KivVcs;

namespace {

/// What a version holds under the name "x": nothing, a file, or a directory of files.
using State = std::map<std::string, std::string>;

struct Case {
    const char* was;
    const char* left;
    const char* right;
    State root;
    State leftState;
    State rightState;
};

const State nothing;
const State file{{"x", "old"}};
const State changed{{"x", "left's"}};
const State changedToo{{"x", "right's"}};
const State directory{{"x/a", "old"}, {"x/b", "old"}};
const State changedA{{"x/a", "left's"}, {"x/b", "old"}};
const State changedAToo{{"x/a", "right's"}, {"x/b", "old"}};
const State changedB{{"x/a", "old"}, {"x/b", "right's"}};

const std::vector<Case> cases{
    {"a file", "changed it", "left it alone", file, changed, file},
    {"a file", "removed it", "left it alone", file, nothing, file},
    {"a file", "changed it", "changed it alike", file, changed, changed},
    {"a file", "changed it", "changed it otherwise", file, changed, changedToo},
    {"a file", "changed it", "removed it", file, changed, nothing},
    {"a file", "removed it", "removed it", file, nothing, nothing},
    {"a file", "made it a directory", "left it alone", file, changedA, file},
    {"a file", "changed it", "made it a directory", file, changed, changedB},
    {"a file", "made it a directory", "removed it", file, changedA, nothing},
    {"a file", "made it a directory", "made it another directory", file, changedA, changedB},
    {"nothing", "added a file", "added nothing", nothing, changed, nothing},
    {"nothing", "added a file", "added the same file", nothing, changed, changed},
    {"nothing", "added a file", "added another file", nothing, changed, changedToo},
    {"nothing", "added a file", "added a directory", nothing, changed, changedB},
    {"nothing", "added a directory", "added a file", nothing, changedA, changedToo},
    {"nothing", "added a directory", "added another directory", nothing, changedA, changedAToo},
    {"a directory", "changed a file in it", "left it alone", directory, changedA, directory},
    {"a directory", "changed a file in it", "changed another one", directory, changedA, changedB},
    {"a directory", "changed a file in it", "changed the same one otherwise", directory, changedA, changedAToo},
    {"a directory", "changed a file in it", "removed the directory", directory, changedA, nothing},
    {"a directory", "removed it", "left it alone", directory, nothing, directory},
    {"a directory", "removed it", "removed it", directory, nothing, nothing},
    {"a directory", "made it a file", "left it alone", directory, changed, directory},
    {"a directory", "made it a file", "changed a file in it", directory, changed, changedB},
    {"a directory", "made it a file", "removed it", directory, changed, nothing},
    {"a directory", "made it a file", "made it another file", directory, changed, changedToo},
};

KivStringT<char16_t> Wide(std::string const& text) {
    return String::ToStringW({text.data(), static_cast<int>(text.size())});
}

std::string Narrow(KivStringViewT<char16_t> text) {
    return DataEncoding::Utf8Encode(text).GetString();
}

cow_ptr<Tree> TreeOf(Repository& repository, State const& state) {
    cow_ptr<Tree> tree(emplace);
    for (auto const& [path, text] : state) {
        Buffer content;
        content.Append(text.data(), text.size());
        tree.write()->AddBlob(&repository, Wide(path), Blob(content));
    }
    return tree;
}

/// The files of a tree with their contents; "(empty)" for a directory that stays without any.
std::string Show(cow_ptr<Tree> const& tree) {
    if (!tree)
        return "gives up";
    std::string shown;
    for (auto const& path : tree->GetDeepBlobPaths()) {
        const std::string content = Helpers::StringAFromBuffer(tree->GetDeepBlob(path)->GetData()).GetString();
        shown += (shown.empty() ? "" : ", ") + ("`" + Narrow(path) + "` " + content);
    }
    if (shown.empty())
        return tree->IsEmpty() ? "`x` is gone" : "`x` is empty";
    return shown;
}

/// What is asked on the way, and what comes of one answer about files.
struct Merged {
    std::string asked;
    std::string result;
};

Merged Merge(Case const& disagreement, ConflictChoice choice) {
    Repository repository(std::make_unique<MemObjectsStorage>());
    const MergeTrees trees{TreeOf(repository, disagreement.leftState), TreeOf(repository, disagreement.root),
                           TreeOf(repository, disagreement.rightState)};
    std::string asked;
    const auto note = [&asked](const char* kind, array_view<KivStringViewT<char16_t> const> path) {
        std::string joined;
        for (auto const component : path)
            joined += (joined.empty() ? "" : "/") + Narrow(component);
        asked += (asked.empty() ? "" : ", ") + (kind + ("`" + joined + "`"));
    };
    const Resolvers resolvers{[&](auto path, auto const&) {
                                  note("file ", path);
                                  return choice;
                              },
                              [&](auto path, auto const&) {
                                  if (!path.empty())
                                      note("directory ", path);
                                  return TreeConflictChoice::Merge;
                              }};
    const auto result = ThreeWayMerge(&repository, trees, resolvers);
    return {asked, Show(result)};
}

std::string MakeTable() {
    std::ostringstream table;
    table << "| `x` was | left | right | asked about | `Left` | `Right` | `Root` |\n|---|---|---|---|---|---|---|\n";
    for (auto const& disagreement : cases) {
        const Merged left = Merge(disagreement, ConflictChoice::Left);
        const Merged right = Merge(disagreement, ConflictChoice::Right);
        const Merged root = Merge(disagreement, ConflictChoice::Root);
        table << "| " << disagreement.was << " | " << disagreement.left << " | " << disagreement.right << " | ";
        table << (left.asked.empty() ? "nothing" : left.asked) << " | " << left.result << " | ";
        if (left.result == right.result && left.result == root.result)
            table << "the same | the same |\n";
        else
            table << right.result << " | " << root.result << " |\n";
    }
    return table.str();
}

} // namespace

int main(int count, char** arguments) {
    const bool writes = count == 3 && std::string(arguments[1]) == "--write";
    const std::string document = arguments[count - 1];
    std::stringstream content;
    content << std::ifstream(document).rdbuf();
    const std::string text = content.str();
    const std::string opening = "<!-- what merging_table.cpp finds -->\n\n";
    const auto start = text.find(opening);
    const auto end = text.find("\n<!-- end of it -->");
    if (start == std::string::npos || end == std::string::npos || end < start) {
        std::cerr << document << " has no place for the table\n";
        return 1;
    }
    const auto from = start + opening.size();
    const std::string table = MakeTable();
    if (writes)
        std::ofstream(document) << text.substr(0, from) << table << text.substr(end);
    else if (text.substr(from, end - from) != table) {
        std::cerr << document << " does not show what merges do:\n" << table;
        return 1;
    }
    return 0;
}
