// A glitch as people say it, and as programs read it.
//
// Free functions; any thread.
#pragma once

#include <string>
#include <string_view>

#include "output/JsonStream.h"
#include "output/Terminal.h"
#include "reading/Glitches.h"

namespace halyard::ctl {

// "the process was stopped"; the cause itself where it is none of ours.
std::string causeInWords(std::string_view cause);

// "14:03:12.4  firefox, 320 ms silent on out.speaker: the process was stopped", with the
// day before it when that is not the day of `now`. Fit for the terminal.
std::string sentenceOf(const Terminal& terminal, const reading::Glitch& glitch, double now);

// An object.
void writeGlitch(JsonStream& json, const reading::Glitch& glitch);

} // namespace halyard::ctl
