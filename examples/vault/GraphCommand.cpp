#include "Commands.h"
#include "Output.h"

#include <algorithm>
#include <iostream>

namespace vault {

namespace {

/// A cursor over the columns of a text graph: which commit each line leads to next.
class TextGraph {
public:
    void Draw(CommitRecord const& commit, std::string const& names) {
        auto column = Column(commit.id);
        if (column == lanes_.size())
            lanes_.push_back(commit.id);
        std::string line;
        for (std::size_t i = 0; i < lanes_.size(); ++i)
            line += i == column ? "* " : "| ";
        std::cout << line << Coloured(Shortened(commit.id), Colour::Yellow)
                  << (names.empty() ? "" : " (" + Coloured(names, Colour::Green) + ')') << "  " << DescribeTime(commit)
                  << "  " << DescribeMessage(commit) << '\n';
        Follow(column, commit);
    }

private:
    [[nodiscard]] std::size_t Column(Id const& id) const {
        return static_cast<std::size_t>(std::find(lanes_.begin(), lanes_.end(), id) - lanes_.begin());
    }

    /// Leads the line on to the parent, and branches lines off to what was merged.
    void Follow(std::size_t column, CommitRecord const& commit) {
        bool isJoined = commit.parent.IsEmpty();
        if (!isJoined) {
            const auto other = Column(commit.parent);
            isJoined = other != lanes_.size() && other != column;
            if (!isJoined)
                lanes_[column] = commit.parent;
        }
        std::size_t added = 0;
        for (auto const& merged : commit.merged) {
            if (Column(merged) == lanes_.size()) {
                lanes_.push_back(merged);
                ++added;
            }
        }
        if (added > 0 || (isJoined && column + 1 < lanes_.size()) || (isJoined && !commit.parent.IsEmpty()))
            DrawLinks(column, added, isJoined);
        if (isJoined)
            lanes_.erase(lanes_.begin() + static_cast<std::ptrdiff_t>(column));
    }

    void DrawLinks(std::size_t column, std::size_t added, bool isJoined) const {
        std::string line;
        for (std::size_t i = 0; i < lanes_.size(); ++i)
            line += i + added >= lanes_.size() ? "\\ "
                    : i > column && isJoined   ? "/ "
                    : i == column && isJoined  ? "/ "
                                               : "| ";
        while (line.ends_with(' '))
            line.pop_back();
        std::cout << line << '\n';
    }

    std::vector<Id> lanes_;
};

/// Graphviz takes what looks like an entity of HTML for one, in plain labels too.
std::string Quoted(std::string const& text) {
    std::string quoted = "\"";
    for (const char c : text) {
        if (c == '"' || c == '\\')
            quoted += '\\';
        quoted += c;
        if (c == '&')
            quoted += "amp;";
    }
    return quoted + '"';
}

void DrawDotCommit(CommitRecord const& commit) {
    const auto id = DigitsOf(commit.id);
    std::cout << "  \"" << id << "\" [label=" << Quoted(Shortened(commit.id) + "  " + DescribeMessage(commit))
              << "];\n";
    if (!commit.parent.IsEmpty())
        std::cout << "  \"" << id << "\" -> \"" << DigitsOf(commit.parent) << "\";\n";
    for (auto const& merged : commit.merged)
        std::cout << "  \"" << id << "\" -> \"" << DigitsOf(merged) << "\" [style=dashed];\n";
}

} // namespace

int Graph(VaultPlace const& place, bool isText) {
    Vault vault(place);
    const auto current = vault.CurrentBranch();
    const auto branches = vault.Archive().ReadBranches();
    std::unordered_map<Id, std::string> names;
    std::vector<Id> heads;
    if (!isText)
        std::cout << "digraph vault {\n  rankdir=BT;\n  node [shape=box, style=rounded, fontname=\"sans-serif\"];\n";
    for (auto const& [name, head] : branches) {
        heads.push_back(head);
        auto& shown = names[head];
        shown += (shown.empty() ? "" : ", ") + Printable(name) + (name == current ? "*" : "");
        if (isText)
            continue;
        const auto node = Quoted("branch " + Printable(name));
        std::cout << "  " << node << " [label=" << Quoted(Printable(name))
                  << ", shape=ellipse, style=" << (name == current ? "bold" : "solid") << "];\n";
        std::cout << "  " << node << " -> \"" << DigitsOf(head) << "\" [style=dotted];\n";
    }
    TextGraph graph;
    KivArchive::CommitListOptions options;
    options.follow = KivArchive::Follow::Reachable;
    KivArchive::ListCommits(
        vault.Archive(), heads, options,
        [&](CommitRecord const& commit) {
            const auto name = names.find(commit.id);
            if (isText)
                graph.Draw(commit, name == names.end() ? "" : name->second);
            else
                DrawDotCommit(commit);
            return static_cast<bool>(std::cout);
        },
        nullptr);
    if (!isText)
        std::cout << "}\n";
    return 0;
}

} // namespace vault
