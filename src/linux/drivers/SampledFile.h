// A small text file that is read again and again: it stays open between reads,
// because opening costs three times what reading does.
//
// Never waits for a file that is none (a pipe, a device), reads at most
// kMaxSampledFile bytes, and finds the file again when it was replaced or when
// its device has gone and come back. A driver whose read blocks does block here:
// see GuardedReader.
//
// Not thread-safe.
#pragma once

#include <atomic>
#include <cstddef>
#include <filesystem>
#include <functional>
#include <string>

#include "common/Result.h"

namespace halyard::linux_ {

inline constexpr std::size_t kMaxSampledFile = 64 * 1024;

// How many more files may stay open; the rest is opened for each read.
using DescriptorBudget = std::atomic<int>;

class SampledFile {
public:
    // Opens the file in another way than by its path; the caller owns the descriptor.
    using Opener = std::function<Result<int>()>;

    // Borrows the budget. Opens nothing yet. With an opener, which is there because
    // the file is not to be trusted, it does so for each read, and the path is only
    // what the file is called.
    SampledFile(std::filesystem::path path, DescriptorBudget& budget, Opener opener = {});
    SampledFile(SampledFile&& other) noexcept;
    SampledFile& operator=(SampledFile&&) = delete;
    ~SampledFile();

    // The whole of the file as it is now, in `text`; or why not.
    Result<void> read(std::string& text);
    const std::filesystem::path& path() const { return path_; }

private:
    Result<void> open();
    void close();
    bool isStillTheFile() const;
    Result<void> readOpen(std::string& text) const;

    std::filesystem::path path_;
    DescriptorBudget* budget_;
    Opener opener_;
    int descriptor_ = -1;
    bool ofKernel_ = false; // Its path leads to it for as long as it is there,
    bool oneRead_ = false;  // and one read yields all of it.
};

// Nothing is there, or no longer: the device is missing, not broken.
inline bool meansAbsent(const Failure& failure) {
    return failure.code == std::errc::no_such_file_or_directory ||
           failure.code == std::errc::no_such_device ||
           failure.code == std::errc::no_such_device_or_address ||
           failure.code == std::errc::not_a_directory;
}

} // namespace halyard::linux_
