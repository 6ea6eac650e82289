#include "commands/GlitchWords.h"

#include <array>
#include <fmt/format.h>
#include <utility>

#include "output/Sanitise.h"
#include "output/Words.h"

namespace halyard::ctl {
namespace {

using reading::Direction;
using reading::Glitch;

constexpr std::array<std::pair<std::string_view, std::string_view>, 11> kCauses = {
    {{"process_stopped", "the process was stopped"},
     {"process_frozen", "the process was frozen"},
     {"process_gone", "the process was gone"},
     {"machine_paused", "the machine was paused"},
     {"driver_late", "the device's driver was late"},
     {"graph_overloaded", "all programs together took too long"},
     {"processor_wait", "it waited for a processor"},
     {"client_slow", "its own work took too long"},
     {"memory", "it waited for memory"},
     {"client_blocked", "it was blocked"},
     {"unknown", "nobody knows why"}}};

std::string placeOf(const Glitch& glitch) {
    const auto& place = glitch.device ? glitch.device : glitch.node;
    if (!place) {
        return {};
    }
    return (glitch.direction == Direction::Capture ? " from " : " on ") + *place;
}

std::string momentOf(const Glitch& glitch, double now) {
    const std::string day = dayAndTime(glitch.time()).substr(0, 10);
    const bool today = day == dayAndTime(now).substr(0, 10);
    return (today ? "" : day + " ") + timeOfDay(glitch.time());
}

} // namespace

std::string causeInWords(std::string_view cause) {
    for (const auto& [name, words] : kCauses) {
        if (name == cause) {
            return std::string(words);
        }
    }
    return std::string(cause);
}

std::string sentenceOf(const Terminal& terminal, const Glitch& glitch, double now) {
    const bool captured = glitch.direction == Direction::Capture;
    std::string what = glitch.seconds ? lengthOfTime(*glitch.seconds) + " " : "";
    what += captured ? "missing" : "silent";
    what += placeOf(glitch);
    if (glitch.cause) {
        what += ": " + causeInWords(*glitch.cause);
    }
    return fmt::format(
        "{}  {}, {}{}", coloured(terminal, Colour::Dim, momentOf(glitch, now)),
        coloured(terminal, Colour::Bold, sanitised(glitch.application.value_or("an application"))),
        sanitised(what), glitch.inferred ? " (inferred)" : "");
}

} // namespace halyard::ctl
