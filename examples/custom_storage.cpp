// A storage of the host's own: it keeps objects as the library does and counts what goes through it. Deriving from the storage
// in memory is the short way; a storage that keeps objects elsewhere implements IObjectsStorage in the same places.

#include <KivVcs/KivVcs.h>

#include <iostream>

using namespace KivVcs;

namespace {

class CountingStorage : public MemObjectsStorage {
public:
    struct Counts {
        /// How often an object was asked for, and how often it was there.
        std::uint64_t lookups = 0;
        std::uint64_t found = 0;
        /// How many objects were handed over, and the bytes of what they hold.
        std::uint64_t added = 0;
        std::uint64_t bytes = 0;
    };

    [[nodiscard]] Counts const& GetCounts() const { return counts_; }

    // A clone is of the same class, and goes on counting from here.
    [[nodiscard]] std::unique_ptr<IObjectsStorage> Clone() const override {
        return std::make_unique<CountingStorage>(*this);
    }
    [[nodiscard]] cow_ptr<Commit> GetCommit(Id const& id) const override {
        return Looked(MemObjectsStorage::GetCommit(id));
    }
    [[nodiscard]] cow_ptr<Tree> GetTree(Id const& id) const override { return Looked(MemObjectsStorage::GetTree(id)); }
    [[nodiscard]] cow_ptr<Blob> GetBlob(Id const& id) const override { return Looked(MemObjectsStorage::GetBlob(id)); }
    void AddCommit(cow_ptr<Commit> commit) override {
        Added(*commit);
        MemObjectsStorage::AddCommit(std::move(commit));
    }
    void AddTree(cow_ptr<Tree> tree) override {
        Added(*tree);
        MemObjectsStorage::AddTree(std::move(tree));
    }
    void AddBlob(cow_ptr<Blob> blob) override {
        Added(*blob);
        MemObjectsStorage::AddBlob(std::move(blob));
    }

private:
    template <class T>
    cow_ptr<T> Looked(cow_ptr<T> object) const {
        ++counts_.lookups;
        counts_.found += object ? 1 : 0;
        return object;
    }

    void Added(Object const& object) {
        ++counts_.added;
        counts_.bytes += object.GetData().GetSize();
    }

    // Lookups do not change what is stored, but they are counted.
    mutable Counts counts_;
};

void Print(const char* when, CountingStorage::Counts const& counts) {
    std::cout << when << ": " << counts.lookups << " lookups, " << counts.found << " found; " << counts.added
              << " objects added, " << counts.bytes << " bytes\n";
}

/// A version in which every file has one of ten contents.
void Save(Repository& repository, int version) {
    Commit commit(&repository, false);
    for (int file = 0; file < 100; ++file)
        commit.AddBlob(&repository, FromUtf8("files/" + std::to_string(file)),
                       Blob::CopyText("content " + std::to_string((file + version) % 10)));
    repository.DoCommit(commit);
}

} // namespace

int main() {
    auto storage = std::make_unique<CountingStorage>();
    CountingStorage const& counting = *storage; // the repository owns it from now on
    Repository repository(std::move(storage));

    Save(repository, 0);
    Print("First version", counting.GetCounts());
    const std::uint64_t blobs = repository.GetBlobCount();
    Save(repository, 1);
    Print("Second version", counting.GetCounts());
    std::cout << "200 files were saved, " << repository.GetBlobCount() << " contents are stored\n";

    const auto clone = counting.Clone();
    const bool isCounting = dynamic_cast<CountingStorage const*>(clone.get()) != nullptr;
    return isCounting && blobs == 10 && repository.GetBlobCount() == 10 ? 0 : 1;
}
