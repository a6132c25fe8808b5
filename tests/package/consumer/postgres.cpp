#include <KivArchive/PostgresArchive.h>

/// An exception of the component comes out of it as what it is. Nobody answers there.
int main() {
    try {
        KivArchive::PostgresArchive archive("host=/nowhere");
    } catch (KivArchive::ArchiveError const& error) {
        return error.GetKind() == KivArchive::Failure::Unavailable ? 0 : 1;
    }
    return 1;
}
