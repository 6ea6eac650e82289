// A file that appears whole or not at all: written under a hidden name beside
// its own, brought to the disk, then renamed.
//
// For one thread at a time. Without commit() nothing remains.
#pragma once

#include <cstdio>
#include <filesystem>
#include <string_view>

#include "common/Result.h"

namespace halyard::linux_ {

class AtomicFile {
public:
    explicit AtomicFile(std::filesystem::path path);
    ~AtomicFile();
    AtomicFile(const AtomicFile&) = delete;
    AtomicFile& operator=(const AtomicFile&) = delete;

    void write(std::string_view text);
    // For writers that want a stream; null when the file could not be opened.
    std::FILE* stream() const { return stream_; }

    // Once, last. Opening and writing fail here, too.
    Result<void> commit();

private:
    void failed();
    Result<void> syncDirectory() const;

    const std::filesystem::path path_;
    std::filesystem::path temporary_;
    std::FILE* stream_ = nullptr;
    Result<void> result_; // the first failure
};

} // namespace halyard::linux_
