#pragma once

#include <filesystem>
#include <string>

namespace halyard::load {

// A private directory, gone with its contents when this object is.
class TemporaryDirectory {
public:
    // Throws std::system_error.
    explicit TemporaryDirectory(const std::string& parent);
    ~TemporaryDirectory();
    TemporaryDirectory(const TemporaryDirectory&) = delete;
    TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;

    const std::filesystem::path& path() const { return path_; }

private:
    std::filesystem::path path_;
};

} // namespace halyard::load
