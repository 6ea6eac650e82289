#include "output/Terminal.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <clocale>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/ioctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include "output/Sanitise.h"

namespace halyard::ctl {
namespace {

constexpr std::size_t kLeastWidth = 40;
constexpr std::size_t kUsualWidth = 80;
// Small systems have no pager.
constexpr const char* kUsualPager = "command -v less >/dev/null 2>&1 && exec less -R -F; exec cat";

bool isSet(const char* name) {
    const char* const value = std::getenv(name);
    return value != nullptr && *value != '\0';
}

std::size_t widthOfTerminal() {
    if (const char* const columns = std::getenv("COLUMNS")) {
        std::size_t width = 0;
        const char* const end = columns + std::strlen(columns);
        if (std::from_chars(columns, end, width).ptr == end && width > 0) {
            return std::max(width, kLeastWidth);
        }
    }
    winsize size{};
    if (::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0) {
        return std::max<std::size_t>(size.ws_col, kLeastWidth);
    }
    return kUsualWidth;
}

const char* codeOf(Colour colour) {
    switch (colour) {
    case Colour::Bold:
        return "1";
    case Colour::Dim:
        return "2";
    case Colour::Red:
        return "31";
    case Colour::Green:
        return "32";
    case Colour::Yellow:
        return "33";
    case Colour::Plain:
        break;
    }
    return "0";
}

} // namespace

Terminal::Terminal() : isTerminal_(::isatty(STDOUT_FILENO) == 1), stream_(stdout) {
    // Only what kinds of letters there are: numbers keep their points.
    if (std::setlocale(LC_CTYPE, "C.UTF-8") == nullptr) {
        std::setlocale(LC_CTYPE, "");
    }
    std::signal(SIGPIPE, SIG_IGN);
    const char* const kind = std::getenv("TERM");
    hasColour_ =
        isTerminal_ && !isSet("NO_COLOR") && kind != nullptr && std::string_view(kind) != "dumb";
    width_ = isTerminal_ ? widthOfTerminal() : 0;
}

Terminal::~Terminal() {
    (void)flush();
    if (pager_ > 0) {
        std::fclose(stream_);
        int status = 0;
        while (::waitpid(pager_, &status, 0) < 0 && errno == EINTR) {
        }
    }
}

void Terminal::page() {
    if (!isTerminal_ || pager_ != 0) {
        return;
    }
    const char* const wanted = std::getenv("PAGER");
    // An empty one means none.
    if (wanted == nullptr || *wanted != '\0') {
        startPager(wanted == nullptr ? kUsualPager : wanted);
    }
}

void Terminal::startPager(const char* command) {
    std::array<int, 2> ends{};
    if (::pipe2(ends.data(), O_CLOEXEC) != 0) {
        return;
    }
    pager_ = ::fork();
    if (pager_ == 0) {
        std::signal(SIGPIPE, SIG_DFL);
        ::dup2(ends[0], STDIN_FILENO);
        ::execl("/bin/sh", "sh", "-c", command, static_cast<char*>(nullptr));
        ::_exit(127);
    }
    ::close(ends[0]);
    std::FILE* const stream = pager_ < 0 ? nullptr : ::fdopen(ends[1], "w");
    if (stream == nullptr) {
        ::close(ends[1]);
        return;
    }
    stream_ = stream;
    // The keys are the pager's: Ctrl-C is for it.
    std::signal(SIGINT, SIG_IGN);
}

void Terminal::write(std::string_view text) {
    if (!broken_ && std::fwrite(text.data(), 1, text.size(), stream_) != text.size()) {
        broken_ = true;
        error_ = errno;
    }
}

bool Terminal::flush() {
    if (!broken_ && std::fflush(stream_) != 0) {
        broken_ = true;
        error_ = errno;
    }
    return !broken_;
}

bool Terminal::goesOn() {
    if (!broken_ && std::ferror(stream_) != 0) {
        broken_ = true;
        error_ = errno;
    }
    return !broken_;
}

std::string Terminal::complaint() const {
    return broken_ && error_ != EPIPE ? fmt::format("cannot write: {}", std::strerror(error_))
                                      : std::string();
}

std::string coloured(const Terminal& terminal, Colour colour, std::string_view text) {
    if (!terminal.hasColour() || colour == Colour::Plain) {
        return std::string(text);
    }
    return fmt::format("\x1b[{}m{}\x1b[0m", codeOf(colour), text);
}

void complain(std::string_view text) {
    const std::string line = "halyardctl: " + sanitised(text) + "\n";
    std::fputs(line.c_str(), stderr);
}

} // namespace halyard::ctl
