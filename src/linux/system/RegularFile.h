// A regular file, open for reading.
//
// Paths come from clients, too, and others than regular files may do something
// when they are opened: wait, rewind a tape, arm a watchdog. So the first look
// opens nothing, and the second opens what the first one saw. Any thread.
#pragma once

#include <filesystem>
#include <string>

#include "common/Result.h"

namespace halyard::linux_ {

class RegularFile {
public:
    explicit RegularFile(const std::filesystem::path& path);
    ~RegularFile();
    RegularFile(const RegularFile&) = delete;
    RegularFile& operator=(const RegularFile&) = delete;

    // is_a_directory or invalid_argument when it is another kind of file.
    const Result<void>& opened() const { return opened_; }
    // Requires that it is open.
    int descriptor() const { return descriptor_; }
    // Leads to this very file, whatever has become of its name.
    std::string path() const;

private:
    int descriptor_ = -1;
    Result<void> opened_;
};

} // namespace halyard::linux_
