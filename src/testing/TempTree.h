// A directory of a test's own, with whatever files it writes there; all gone
// at the end.
#pragma once

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string>
#include <string_view>

namespace halyard::testing {

class TempTree {
public:
    // In `parent`, for what is to lie on a certain disk.
    explicit TempTree(
        const std::filesystem::path& parent = std::filesystem::temp_directory_path()) {
        std::string name = (parent / "halyard-XXXXXX").native();
        if (::mkdtemp(name.data()) == nullptr) {
            throw std::runtime_error("no temporary directory: " + name);
        }
        root_ = name;
    }
    ~TempTree() {
        std::error_code ignored;
        std::filesystem::remove_all(root_, ignored);
    }
    TempTree(const TempTree&) = delete;
    TempTree& operator=(const TempTree&) = delete;

    const std::filesystem::path& path() const { return root_; }
    std::filesystem::path operator/(std::string_view relative) const { return root_ / relative; }

    // Makes the folders it takes; replaces what was there. `path` may also be one
    // that this gave out.
    std::filesystem::path write(const std::filesystem::path& path, std::string_view text) const {
        const std::filesystem::path file = root_ / path;
        std::filesystem::create_directories(file.parent_path());
        std::ofstream(file, std::ios::binary | std::ios::trunc) << text;
        return file;
    }

private:
    std::filesystem::path root_;
};

} // namespace halyard::testing
