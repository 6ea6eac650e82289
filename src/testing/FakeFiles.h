#pragma once

#include <map>
#include <string>
#include <vector>

#include "platform/Files.h"

namespace halyard::testing {

// Files in memory. What a test sets as `createError` or `writeError` is what the
// next calls fail with.
class FakeFiles final : public platform::Files {
public:
    struct Made {
        std::string path;
        std::uint32_t mode;

        bool operator==(const Made&) const = default;
    };

    std::variant<std::string, Error> readFile(std::string_view path,
                                              std::size_t most) const override {
        const auto file = files.find(std::string(path));
        if (file == files.end()) {
            return Error{"posix", 2, "No such file or directory"};
        }
        if (file->second.size() > most) {
            return Error{"posix", 27, "File too large"};
        }
        return file->second;
    }
    std::string currentDirectory() const override { return workingDirectory; }
    std::string located(std::string_view path) const override { return place + std::string(path); }
    MaybeError createDirectories(std::string_view path, std::uint32_t mode) override {
        directories.push_back({std::string(path), mode});
        return createError;
    }
    MaybeError writeFileAtomically(std::string_view path, std::string_view contents) override {
        if (!writeError) {
            files[std::string(path)] = contents;
        }
        return writeError;
    }
    std::variant<std::string, Error> addFile(std::string_view path,
                                             std::string_view contents) override {
        if (const MaybeError error = writeFileAtomically(path, contents)) {
            return *error;
        }
        return std::string(path);
    }

    std::map<std::string, std::string> files; // by path
    std::vector<Made> directories;
    std::string workingDirectory = "/current";
    std::string place; // what stands before every path, on "the machine"
    MaybeError createError;
    MaybeError writeError;
};

} // namespace halyard::testing
