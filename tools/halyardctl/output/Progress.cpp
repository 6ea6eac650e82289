#include "output/Progress.h"

#include <algorithm>
#include <cstdio>
#include <fmt/format.h>
#include <unistd.h>
#include <utility>

namespace halyard::ctl {
namespace {

constexpr std::chrono::milliseconds kPatience{1000};
constexpr std::chrono::milliseconds kPeriod{100};
constexpr int kWidth = 40;
constexpr const char* kClearLine = "\r\x1b[K";

} // namespace

Progress::Progress(std::string what)
    : what_(std::move(what)), shown_(::isatty(STDERR_FILENO) == 1),
      next_(Clock::now() + kPatience) {}

Progress::~Progress() {
    if (drawn_) {
        std::fputs(kClearLine, stderr);
    }
}

void Progress::update(double share) {
    if (!shown_ || Clock::now() < next_) {
        return;
    }
    next_ = Clock::now() + kPeriod;
    drawn_ = true;
    const double part = std::clamp(share, 0.0, 1.0);
    const auto full = static_cast<int>(part * kWidth);
    const std::string bar = fmt::format("{}{} [{:#<{}}{:.<{}}] {:3.0f} %", kClearLine, what_, "",
                                        full, "", kWidth - full, part * 100);
    std::fputs(bar.c_str(), stderr);
    std::fflush(stderr);
}

} // namespace halyard::ctl
