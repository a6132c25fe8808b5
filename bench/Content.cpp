#include "Content.h"

namespace KivVcs::Bench {

Path Numbered(char const* prefix, std::int64_t number) {
    std::string digits = std::to_string(number);
    digits.insert(0, digits.size() < 6 ? 6 - digits.size() : 0, '0');
    return Path(KivStringT<char>((prefix + digits).c_str()));
}

std::vector<Path> FilePaths(std::int64_t count, std::vector<int> const& directories) {
    std::vector<Path> paths;
    for (std::int64_t file = 0; file < count; ++file) {
        Path path;
        std::int64_t rest = file;
        for (const int inThis : directories) {
            path += Numbered("directory-", rest % inThis);
            path += u'/';
            rest /= inThis;
        }
        paths.push_back(path + Numbered("file-", file));
    }
    return paths;
}

Buffer SmallContent(std::int64_t number, int version) {
    const std::string text = "content " + std::to_string(number) + " version " + std::to_string(version);
    Buffer buffer;
    buffer.Append(text.data(), text.size());
    return buffer;
}

std::vector<Buffer> SmallContents(std::int64_t count, int version) {
    std::vector<Buffer> contents;
    for (std::int64_t number = 0; number < count; ++number)
        contents.push_back(SmallContent(number, version));
    return contents;
}

std::vector<Path> DirectoryNames(std::int64_t count) {
    std::vector<Path> names;
    for (std::int64_t number = 0; number < count; ++number)
        names.push_back(Numbered("directory-", number));
    return names;
}

cow_ptr<Tree> MakeTwoLevels(Repository& repo, std::vector<Path> const& files, std::vector<Buffer>& contents,
                            std::vector<Path> const& directories) {
    Tree root;
    const std::size_t inEach = files.size() / directories.size();
    for (std::size_t number = 0; number < directories.size(); ++number) {
        Tree directory;
        for (std::size_t file = number * inEach; file < (number + 1) * inEach; ++file)
            directory.AddBlob(&repo, files[file], Blob(std::move(contents[file])));
        root.AddTree(&repo, directories[number], directory);
    }
    return repo.SyncWithStorage(immu::make<Tree>(std::move(root)));
}

cow_ptr<Tree> MakeTwoLevels(Repository& repo, std::int64_t files, std::int64_t inEach) {
    auto contents = SmallContents(files);
    return MakeTwoLevels(repo, FilePaths(files, {}), contents, DirectoryNames(files / inEach));
}

cow_ptr<Tree> ChangeTwoLevels(Repository& repo, Tree const& tree, std::int64_t inEach, std::int64_t first,
                              std::int64_t step, std::int64_t count, int version) {
    Tree root(tree);
    const std::int64_t end = first + count * step;
    for (std::int64_t file = first; file < end;) {
        const std::int64_t number = file / inEach;
        const Path name = Numbered("directory-", number);
        Tree directory(*root.GetLocalTree(name));
        for (; file < end && file / inEach == number; file += step)
            directory.AddBlob(&repo, Numbered("file-", file), Blob(SmallContent(file, version)));
        root.AddTree(&repo, name, directory);
    }
    root.ResetState();
    return repo.SyncWithStorage(immu::make<Tree>(std::move(root)));
}

} // namespace KivVcs::Bench
