// A folder that other users may write to, and what may be read of it: regular
// files of owners who are trusted, through no link and on no other file system.
//
// So nothing that somebody puts there makes a reader wait, neither for the other
// end of a pipe nor for a file system that its owner serves, and none of it costs
// more than a look.
//
// Keeps nothing open. One thread at a time.
#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <string>

#include "common/Result.h"

namespace halyard::linux_ {

class SharedFolder {
public:
    // Beyond these, a folder is not looked through.
    static constexpr std::size_t kMaxEntries = 4096;

    using Trust = std::function<bool(std::uint32_t owner)>;

    // Requires a `trusts` that can be called.
    SharedFolder(std::filesystem::path path, Trust trusts)
        : path_(std::move(path)), trusts_(std::move(trusts)) {}

    // Makes the folder where it is missing. Everybody may write to it, and nobody
    // remove what is another's.
    static Result<void> make(const std::filesystem::path& path);

    const std::filesystem::path& path() const { return path_; }
    bool isThere() const;

    // A descriptor, which the caller owns. A file that is not to be read fails with
    // operation_not_permitted, whatever it is.
    Result<int> open(const std::string& name) const;

    // Calls back with each name until that answers false. False, then, and when
    // there is more to see than was seen; no folder has nothing to see.
    bool look(const std::function<bool(const char* name)>& visit) const;

private:
    const std::filesystem::path path_;
    const Trust trusts_;
};

} // namespace halyard::linux_
