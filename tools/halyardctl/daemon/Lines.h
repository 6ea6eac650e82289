// Messages that somebody types or another program writes, a JSON text a line.
//
// Lines are given on as they come, not when the input ends. Not thread-safe.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "common/Value.h"
#include "reading/Trouble.h"

namespace halyard::ctl {

class Lines {
public:
    // More than any message that the daemon takes.
    static constexpr std::size_t kLongest = 4 * 1024 * 1024;

    // "-" is standard input.
    static reading::Outcome<Lines> open(const std::string& path);
    ~Lines();
    Lines(Lines&& other) noexcept;
    Lines(const Lines&) = delete;
    Lines& operator=(const Lines&) = delete;

    // The next line that is not blank; none at the end. One that is too long is empty.
    std::optional<std::string> next();
    // Of the line that next() gave last, from 1.
    std::uint64_t number() const { return number_; }

private:
    explicit Lines(int descriptor) : descriptor_(descriptor) {}
    std::optional<std::string> nextOfAny();
    bool fill();

    int descriptor_;
    std::string buffer_;
    std::size_t at_ = 0;
    std::uint64_t number_ = 0;
    bool ended_ = false;
    bool wasTooLong_ = false;
};

// The dictionary that a JSON text holds. None for any other text, and for one that nests
// deeper than a message may.
std::optional<Dictionary> dictionaryIn(std::string_view json);

} // namespace halyard::ctl
