#include "tree/OwnTables.h"

#include "KivVcs/Repository.h"

#include <typeinfo>

namespace KivVcs::detail {

OwnTables OwnTables::Behind(IRepository& repo) noexcept {
    if (&typeid(repo) != &typeid(Repository))
        return {};
    IObjectsStorage* const storage = static_cast<Repository&>(repo).Repository::GetStorage();
    if (storage == nullptr || &typeid(*storage) != &typeid(MemObjectsStorage))
        return {};
    auto& own = static_cast<MemObjectsStorage&>(*storage);
    return {&own.blobs_, &own.trees_};
}

} // namespace KivVcs::detail
