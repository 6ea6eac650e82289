// Where a command writes to: the terminal, through a pager when that is what it takes,
// or whatever the output was led to.
//
// Not thread-safe; one for the process.
#pragma once

#include <cstddef>
#include <cstdio>
#include <string>
#include <string_view>
#include <sys/types.h>

namespace halyard::ctl {

class Terminal {
public:
    // Sets the process's locale for text, and lets writes to a pipe that nobody reads
    // fail instead of ending the process.
    Terminal();
    // Waits for the pager.
    ~Terminal();
    Terminal(const Terminal&) = delete;
    Terminal& operator=(const Terminal&) = delete;

    bool isTerminal() const { return isTerminal_; }
    bool hasColour() const { return hasColour_; }
    // Cells of a line; 0 when there is no end to it.
    std::size_t width() const { return width_; }

    // From here on the output goes through $PAGER, or less, if it goes to a terminal.
    // Before the first output.
    void page();

    std::FILE* stream() const { return stream_; }
    void write(std::string_view text);
    // False when nobody takes the output any more, or the disk is full.
    [[nodiscard]] bool flush();
    bool isBroken() const { return broken_; }
    // For who writes to the stream themselves: whether to go on.
    [[nodiscard]] bool goesOn();
    // Why the output could not be written; empty when its reader just went away.
    std::string complaint() const;

private:
    void startPager(const char* command);

    bool isTerminal_ = false;
    bool hasColour_ = false;
    std::size_t width_ = 0;
    std::FILE* stream_ = nullptr;
    pid_t pager_ = 0;
    bool broken_ = false;
    int error_ = 0;
};

// In colour when the terminal has any. `text` is taken as it is.
enum class Colour { Plain, Bold, Dim, Red, Green, Yellow };
std::string coloured(const Terminal& terminal, Colour colour, std::string_view text);

// A line on standard error, sanitised, after the program's name.
void complain(std::string_view text);

} // namespace halyard::ctl
