#pragma once

#include "support/HostStream.h"
#include "support/Text.h"

#include <map>

/// Packed forms built byte by byte, to compare with the library's, and a host that loads them.

namespace KivVcs {

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

/// Packed forms by identifier, and how often each was loaded.
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

/// A host that loads the packed forms of what a repository stores.
class PackedFormsOf {
public:
    explicit PackedFormsOf(Repository const& repo) : repo_(repo) {}

    PortableVersion::Delegate<StreamIO(Id const&)> Loader() {
        return [this](Id const& id) {
            for (cow_ptr<Object> const& stored :
                 {cow_ptr<Object>(repo_.GetTreeFromStorage(id)), cow_ptr<Object>(repo_.GetBlobFromStorage(id)),
                  cow_ptr<Object>(repo_.GetCommitFromStorage(id))}) {
                if (stored)
                    return StreamIO(MemStream::CreateOnRef(lent_[id] = stored->GetPackedData()));
            }
            return StreamIO();
        };
    }

private:
    Repository const& repo_;
    std::unordered_map<Id, Buffer> lent_;
};

} // namespace KivVcs
