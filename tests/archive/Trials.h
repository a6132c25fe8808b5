#pragma once

#include "ArchiveFiles.h"
#include "KivArchive/ArchivedRepository.h"
#include "KivArchive/MemArchive.h"

/// Further operations for trials, beside those of `SmallHost`.
namespace KivArchive {

/// Publishes one more version of a branch of its own through a repository, which fetches what was there.
inline bool PublishByRepository(std::shared_ptr<IArchive> const& archive, std::string const& text,
                                IProgress* progress = nullptr) {
    ArchivedRepository repository(archive);
    KivStringT<char16_t> const branch(u"repository");
    if (!repository.BranchExist(branch))
        repository.CreateBranch(branch, nullptr);
    repository.Checkout(branch);
    KivVcs::Commit draft(&repository, false);
    KivVcs::Blob const blob(Conformance::BufferOf(text));
    draft.AddBlob(&repository, u"same/file", blob);
    draft.AddBlob(&repository, KivVcs::FromUtf8("d" + std::to_string(text.size() % 7) + "/" + text), blob);
    repository.DoCommit(draft);
    return repository.Publish(progress).published;
}

/// What every trial synchronizes from another archive.
inline SynchronizeOptions FromElsewhere() {
    SynchronizeOptions options;
    options.branches = {{u"master", u"theirs"}};
    return options;
}

} // namespace KivArchive
