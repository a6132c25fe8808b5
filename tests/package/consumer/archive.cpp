#include <KivArchive/KivArchive.h>

/// A class of the component, which derives from an interface of it.
int main() {
    KivArchive::MemArchive archive;
    KivArchive::IArchive& interface = archive;
    return dynamic_cast<KivArchive::MemArchive*>(&interface) != nullptr && interface.ReadBranches().empty() ? 0 : 1;
}
