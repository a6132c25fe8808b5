#include "Contenders.h"

#if defined(KIVVCS_BENCH_WITH_LIBGIT2)

#include "Measuring.h"

#include <git2.h>
#include <git2/sys/mempack.h>
#include <git2/sys/repository.h>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

namespace KivVcs::Bench {

namespace {

void Require(int error) {
    if (error < 0)
        throw std::runtime_error(git_error_last() == nullptr ? "libgit2 failed" : git_error_last()->message);
}

template <class T, void (*release)(T*)>
struct Release {
    void operator()(T* object) const noexcept { release(object); }
};
using OdbHandle = std::unique_ptr<git_odb, Release<git_odb, git_odb_free>>;
using RepositoryHandle = std::unique_ptr<git_repository, Release<git_repository, git_repository_free>>;
using TreeHandle = std::unique_ptr<git_tree, Release<git_tree, git_tree_free>>;
using CommitHandle = std::unique_ptr<git_commit, Release<git_commit, git_commit_free>>;
using BuilderHandle = std::unique_ptr<git_treebuilder, Release<git_treebuilder, git_treebuilder_free>>;
using SignatureHandle = std::unique_ptr<git_signature, Release<git_signature, git_signature_free>>;

/// Objects in memory.
class GitRepository {
public:
    GitRepository() {
        static const int started = git_libgit2_init();
        Require(started);
        // It is told what it has just made itself.
        Require(git_libgit2_opts(GIT_OPT_ENABLE_STRICT_OBJECT_CREATION, 0));
        git_odb* odb = nullptr;
        Require(git_odb_new(&odb));
        odb_.reset(odb);
        git_odb_backend* memory = nullptr;
        Require(git_mempack_new(&memory));
        Require(git_odb_add_backend(odb, memory, 1));
        git_repository* repository = nullptr;
        Require(git_repository_wrap_odb(&repository, odb));
        repository_.reset(repository);
    }

    [[nodiscard]] git_oid AddBlob(std::string_view content) {
        git_oid id;
        Require(git_blob_create_from_buffer(&id, repository_.get(), content.data(), content.size()));
        return id;
    }

    [[nodiscard]] BuilderHandle Build() {
        git_treebuilder* builder = nullptr;
        Require(git_treebuilder_new(&builder, repository_.get(), nullptr));
        return BuilderHandle(builder);
    }

    [[nodiscard]] static git_oid Write(BuilderHandle const& builder) {
        git_oid id;
        Require(git_treebuilder_write(&id, builder.get()));
        return id;
    }

    /// The tree with another blob at @p path; @p base may be null.
    [[nodiscard]] TreeHandle Update(git_tree* base, std::string const& path, std::string_view content) {
        const git_tree_update update{GIT_TREE_UPDATE_UPSERT, AddBlob(content), GIT_FILEMODE_BLOB, path.c_str()};
        git_oid id;
        if (base == nullptr) {
            const git_oid empty = Write(Build());
            const TreeHandle none = LookUp(empty);
            Require(git_tree_create_updated(&id, repository_.get(), none.get(), 1, &update));
        } else {
            Require(git_tree_create_updated(&id, repository_.get(), base, 1, &update));
        }
        return LookUp(id);
    }

    [[nodiscard]] TreeHandle LookUp(git_oid const& id) {
        git_tree* tree = nullptr;
        Require(git_tree_lookup(&tree, repository_.get(), &id));
        return TreeHandle(tree);
    }

    [[nodiscard]] CommitHandle AddCommit(git_tree const& tree, git_commit const* parent, git_signature const& author) {
        git_oid id;
        Require(git_commit_create(&id, repository_.get(), nullptr, &author, &author, nullptr, "", &tree,
                                  parent == nullptr ? 0 : 1, &parent));
        git_commit* commit = nullptr;
        Require(git_commit_lookup(&commit, repository_.get(), &id));
        return CommitHandle(commit);
    }

private:
    OdbHandle odb_;
    RepositoryHandle repository_;
};

std::string Numbered(const char* prefix, std::int64_t number) {
    const std::string digits = std::to_string(number);
    return prefix + std::string(digits.size() < 6 ? 6 - digits.size() : 0, '0') + digits;
}

std::string Content(std::int64_t number, std::int64_t version) {
    return "content " + std::to_string(number) + " version " + std::to_string(version);
}

/// Paths as the library is given them.
std::vector<std::string> Paths(std::int64_t count, std::vector<int> const& directories) {
    std::vector<std::string> paths;
    for (std::int64_t file = 0; file < count; ++file) {
        std::string path;
        std::int64_t rest = file;
        for (const int inThis : directories) {
            path += Numbered("directory-", rest % inThis) + '/';
            rest /= inThis;
        }
        paths.push_back(path + Numbered("file-", file));
    }
    return paths;
}

/// Rounds of @p work on a new repository each.
template <class Work>
Contender OnRepository(Work work) {
    return {"libgit2", [=] {
                return [=] {
                    GitRepository repository;
                    return SecondsOf([&] { work(repository); });
                };
            }};
}

} // namespace

Contender Libgit2Blobs(std::int64_t count, std::int64_t size) {
    return {"libgit2", [=] {
                auto content = std::make_shared<std::string>(static_cast<std::size_t>(count * size), 'c');
                for (std::int64_t blob = 0; blob < count; ++blob)
                    content->replace(static_cast<std::size_t>(blob * size), 6, Numbered("", blob));
                return [=] {
                    GitRepository repository;
                    return SecondsOf([&] {
                        for (std::int64_t blob = 0; blob < count; ++blob)
                            static_cast<void>(repository.AddBlob(std::string_view(*content).substr(
                                static_cast<std::size_t>(blob * size), static_cast<std::size_t>(size))));
                    });
                };
            }};
}

Contender Libgit2Directories(std::int64_t files, std::int64_t contentSize) {
    return {"libgit2", [=] {
                std::vector<std::string> names;
                std::vector<std::string> contents;
                for (std::int64_t file = 0; file < files; ++file) {
                    names.push_back(Numbered("file-", file));
                    contents.push_back(Content(file, 0));
                    if (contentSize > 0)
                        contents.back().resize(static_cast<std::size_t>(contentSize), 'c');
                }
                return [=] {
                    GitRepository repository;
                    return SecondsOf([&] {
                        const BuilderHandle root = repository.Build();
                        BuilderHandle directory;
                        const auto finish = [&](std::int64_t number) {
                            const git_oid id = GitRepository::Write(directory);
                            Require(git_treebuilder_insert(nullptr, root.get(), Numbered("directory-", number).c_str(),
                                                           &id, GIT_FILEMODE_TREE));
                        };
                        for (std::size_t file = 0; file < names.size(); ++file) {
                            if (file % 100 == 0)
                                directory = repository.Build();
                            const git_oid id = repository.AddBlob(contents[file]);
                            Require(git_treebuilder_insert(nullptr, directory.get(), names[file].c_str(), &id,
                                                           GIT_FILEMODE_BLOB));
                            if (file % 100 == 99)
                                finish(static_cast<std::int64_t>(file / 100));
                        }
                        static_cast<void>(GitRepository::Write(root));
                    });
                };
            }};
}

Contender Libgit2FilesByPath(std::int64_t files) {
    return OnRepository([files, paths = Paths(files, {20, 25})](GitRepository& repository) {
        TreeHandle tree;
        for (std::int64_t file = 0; file < files; ++file)
            tree = repository.Update(tree.get(), paths[static_cast<std::size_t>(file)], Content(file, 0));
    });
}

Contender Libgit2Commits(std::int64_t commits) {
    return {"libgit2", [=] {
                return [commits, paths = Paths(1000, {10, 10})] {
                    GitRepository repository;
                    TreeHandle tree;
                    for (std::string const& path : paths)
                        tree = repository.Update(tree.get(), path, Content(0, 0));
                    git_signature* signature = nullptr;
                    Require(git_signature_new(&signature, "name", "mail", 1'500'000'000, 0));
                    const SignatureHandle author(signature);
                    CommitHandle head = repository.AddCommit(*tree, nullptr, *author);
                    return SecondsOf([&] {
                        for (std::int64_t number = 0; number < commits; ++number) {
                            tree = repository.Update(tree.get(), paths[static_cast<std::size_t>(number) * 37 % 1000],
                                                     Content(number, 1));
                            head = repository.AddCommit(*tree, head.get(), *author);
                        }
                    });
                };
            }};
}

} // namespace KivVcs::Bench

#else

namespace KivVcs::Bench {

Contender Libgit2Blobs(std::int64_t, std::int64_t) {
    return {};
}

Contender Libgit2Directories(std::int64_t, std::int64_t) {
    return {};
}

Contender Libgit2FilesByPath(std::int64_t) {
    return {};
}

Contender Libgit2Commits(std::int64_t) {
    return {};
}

} // namespace KivVcs::Bench

#endif
