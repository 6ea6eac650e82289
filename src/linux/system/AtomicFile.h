// A file that appears whole or not at all: written under a hidden name beside
// its own, brought to the disk, then renamed.
//
// For one thread at a time. Without commit() nothing remains.
#pragma once

#include <cstdio>
#include <filesystem>
#include <string_view>
#include <system_error>

namespace halyard::linux_ {

class AtomicFile {
public:
    explicit AtomicFile(std::filesystem::path path);
    ~AtomicFile();
    AtomicFile(const AtomicFile&) = delete;
    AtomicFile& operator=(const AtomicFile&) = delete;

    // What opening or the first write that failed came to; none so far.
    std::errc error() const { return error_; }
    void write(std::string_view text);
    // For writers that want a stream; null when the file could not be opened.
    std::FILE* stream() const { return stream_; }

    // Once, last. The default value is success.
    [[nodiscard]] std::errc commit();

private:
    void failed();
    std::errc syncDirectory() const;

    const std::filesystem::path path_;
    std::filesystem::path temporary_;
    std::FILE* stream_ = nullptr;
    std::errc error_{};
};

} // namespace halyard::linux_
