#pragma once

#include "HostStream.h"
#include "RecordingRepository.h"

/// Packed forms put together byte by byte, to compare with those of the library, and a host that hands them out.

namespace KivVcs {

using Names = std::vector<std::string>;

inline std::string Identifier(std::string const& type, std::string const& data) {
    static std::map<std::string, std::string> known;
    const std::string packed = type + " " + std::to_string(data.size()) + '\0' + data;
    if (known.size() > 20'000)
        known.clear();
    std::string& id = known[packed];
    if (id.empty())
        id = Narrow(Helpers::ComputeEncodedSHA256Hash(packed.data(), packed.size()));
    return id;
}

inline std::string Entry(std::string const& type, std::string const& name, std::string const& id) {
    return (type == "tree" ? "40000 " : "100644 ") + type + " " + name + '\0' + id;
}

inline Names ToNames(PathList const& paths) {
    Names names;
    for (auto const& path : paths)
        names.push_back(Narrow(path));
    return names;
}

inline std::string Bytes(Buffer const& buffer) {
    const KivStringT<char> text = Helpers::StringAFromBuffer(buffer);
    return {text.GetString(), static_cast<std::size_t>(text.GetLength())};
}

/// Packed forms by identifier, and how often they were asked for.
struct Packed {
    std::map<std::string, std::string> forms;
    int loads = 0;

    std::string Add(std::string const& type, std::string const& data) {
        const std::string id = Identifier(type, data);
        forms[id] = type + " " + std::to_string(data.size()) + '\0' + data;
        return id;
    }
    PortableVersion::Delegate<StreamIO(Id const&)> Loader() {
        return [this](Id const& wanted) {
            ++loads;
            auto const form = forms.find(Narrow(wanted.GetText()));
            return form == forms.end() ? StreamIO() : ReaderOf(form->second);
        };
    }
    cow_ptr<Tree> Read(std::string const& id, IRepository* repo) {
        return Tree::Deserialize(Id(Wide(id)), repo, Loader());
    }
};

} // namespace KivVcs
