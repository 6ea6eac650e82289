// The few files that the core reads and writes itself.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <variant>

#include "common/Error.h"

namespace halyard::platform {

// An implementation never leaves a half-written file under a name that was asked
// for, and decides where the directories that the service's own constants name
// lie on its system. Errors carry errno as their code. Any thread.
class Files {
public:
    virtual ~Files() = default;

    // The whole of a regular file; an error when it has more than `most` bytes.
    virtual std::variant<std::string, Error> readFile(std::string_view path,
                                                      std::size_t most) const = 0;
    // Absolute.
    virtual std::string currentDirectory() const = 0;
    // Where a path really lies, for people to read: the constants' directories
    // are none of this machine.
    virtual std::string located(std::string_view path) const = 0;
    // With all missing parents. `mode` is that of the directories made, less the
    // process's mask; one that is there already is a success and stays as it is.
    virtual MaybeError createDirectories(std::string_view path, std::uint32_t mode) = 0;
    // Replaces the file as a whole: readers, and a machine that loses power, see
    // the old contents or the new ones.
    virtual MaybeError writeFileAtomically(std::string_view path, std::string_view contents) = 0;
    // The same for a file that is one of many: one that is there already stays, and the new
    // one gets a name like it. The oldest of its directory go when they are too many.
    virtual std::variant<std::string, Error> addFile(std::string_view path,
                                                     std::string_view contents) = 0;
};

} // namespace halyard::platform
