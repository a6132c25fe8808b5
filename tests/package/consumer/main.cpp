#include "Hosts.h"

#include <cstdio>

using namespace KivVcs;

namespace {

template <class Call>
bool IsRefused(Call call) {
    try {
        call();
        return false;
    } catch (hosts::Refused const&) {
        return true;
    }
}

/// What crosses the library's boundary: texts, virtual calls both ways, and pointers made on the library's side.
bool Commits(IRepository& repository) {
    Buffer content;
    content.Append("hello", 5);
    Commit commit(&repository, false);
    const auto blob = commit.AddBlob(&repository, u"a/b.txt", Blob(content));
    const auto stored = repository.DoCommit(commit);
    // sha256 of "blob 5", a zero byte and "hello"
    return blob && stored && stored == repository.GetHead() &&
           blob->GetId().GetText() == u"8aec4e4876f854f688d0ebfc8f37598f38e5fd6903cccc850ca36591175aeb60";
}

/// Exceptions of the host go through the library's frames, out of a storage and out of a stream.
bool LetsExceptionsThrough(IRepository& repository, hosts::Storage& storage) {
    storage.refuses = true;
    const bool adding = IsRefused([&repository] {
        Commit commit(&repository, false);
        commit.AddBlob(&repository, u"new", Blob(Buffer(3)));
    });
    storage.refuses = false;
    StreamIO stream{Stream(std::make_unique<hosts::Stream>())};
    return adding && IsRefused([&stream] { (void)Blob::Deserialize(stream); });
}

/// Both sides have one idea of every class.
bool CastsToDerivedClasses(IRepository& repository) {
    const hosts::Note note;
    IObject const& object = note;
    const auto clone = repository.GetStorage()->Clone();
    cow_ptr<Object> const file = repository.GetHead()->GetCommitTree()->GetRoot()->GetDeepObject(u"a/b.txt");
    return dynamic_cast<hosts::Note const*>(&object) != nullptr && object != *file &&
           dynamic_cast<Blob const*>(file.get()) != nullptr && dynamic_cast<Tree const*>(file.get()) == nullptr &&
           dynamic_cast<hosts::Storage*>(repository.GetStorage()) != nullptr &&
           dynamic_cast<MemObjectsStorage*>(clone.get()) != nullptr &&
           dynamic_cast<hosts::Repository*>(&repository) != nullptr &&
           dynamic_cast<Repository*>(&repository) == nullptr;
}

} // namespace

int main() {
    auto owned = std::make_unique<hosts::Storage>();
    hosts::Storage& storage = *owned;
    hosts::Repository repository(std::move(owned));
    const bool commits = Commits(repository);
    const bool throws = LetsExceptionsThrough(repository, storage);
    const bool casts = CastsToDerivedClasses(repository);
    std::printf("commits: %d, throws: %d, casts: %d\n", commits, throws, casts);
    return commits && throws && casts ? 0 : 1;
}
