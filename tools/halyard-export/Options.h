// What was settled about the sending: the device's configuration, with the standard
// OTEL_* variables over it.
//
// A value; any thread.
#pragma once

#include <array>
#include <chrono>
#include <cstdint>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "content/Collector.h"
#include "linux/config/ExportSettings.h"
#include "linux/system/Directories.h"
#include "place/ExportPlace.h"
#include "reading/Trouble.h"

namespace halyard::exporting {

struct Options {
    using Headers = std::vector<std::pair<std::string, std::string>>;

    bool consent = false;
    // By signal; empty: that one is not sent.
    std::array<std::string, kSignals> urls;
    std::array<Headers, kSignals> headers;
    std::string certificate;
    std::string clientCertificate;
    std::string clientKey;
    std::chrono::milliseconds timeout{10'000};
    bool compress = true;
    // Between a commit and the request that tells of it.
    std::chrono::milliseconds delay{3'000};
    BatchLimits limits;
    bool analyticsEvents = false;
    std::vector<std::string> omit;
    std::uint64_t maxBytesPerDay = 0;
    std::map<std::string, std::string> resource;

    bool isSent(Signal signal) const { return !urls[static_cast<std::size_t>(signal)].empty(); }
    bool isAnythingSent() const;
};

// Fails where what was settled cannot be kept to: an unknown protocol, a file with
// secrets that others may read. The consent is the file's alone.
reading::Outcome<Options> optionsFrom(const linux_::ExportSettings& settings,
                                      const linux_::Environment& environment);

// "key=value,key=value", each percent-encoded; what is no pair is passed over.
std::vector<std::pair<std::string, std::string>> pairsIn(std::string_view text);

// An address without user, password, query and fragment: what may stand in a log.
std::string shownAddress(std::string url);

// A file of "name: value" lines, which nobody but its user may read.
reading::Outcome<Options::Headers> readHeaders(const std::string& path);
// The same demand on a file that is used by its name.
reading::Outcome<void> checkIsPrivate(const std::string& path);

} // namespace halyard::exporting
