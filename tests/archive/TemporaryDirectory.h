#pragma once

#include <filesystem>
#include <stdexcept>
#include <stdlib.h>
#include <string>

/// A directory for one test's files.
class TemporaryDirectory {
public:
    TemporaryDirectory() {
        std::string name = (std::filesystem::temp_directory_path() / "archive_test_XXXXXX").string();
        if (mkdtemp(name.data()) == nullptr)
            throw std::runtime_error("no temporary directory");
        path_ = name;
    }
    TemporaryDirectory(TemporaryDirectory const&) = delete;
    TemporaryDirectory& operator=(TemporaryDirectory const&) = delete;
    ~TemporaryDirectory() {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }

    [[nodiscard]] std::string Path(std::string const& name) const { return (path_ / name).string(); }

private:
    std::filesystem::path path_;
};
