#include "trace/Results.h"

#include <fstream>
#include <rapidjson/document.h>
#include <stdexcept>
#include <string>

namespace halyard::load {
namespace {

// The metadata end the file, which may have gigabytes before them.
constexpr std::streamoff kTail = 4096;
constexpr const char* kMetadata = "\"otherData\":";

std::string tailOf(const std::filesystem::path& path) {
    std::ifstream file(path, std::ios::binary | std::ios::ate);
    const std::streamoff size = file.tellg();
    if (!file || size < 0) {
        throw std::runtime_error(path.string() + " cannot be read");
    }
    file.seekg(size > kTail ? size - kTail : 0);
    return {std::istreambuf_iterator<char>(file), {}};
}

} // namespace

TraceResults readTraceResults(const std::filesystem::path& timeline) {
    const std::string tail = tailOf(timeline);
    const std::size_t at = tail.rfind(kMetadata);
    rapidjson::Document document;
    if (at == std::string::npos ||
        document.Parse(('{' + tail.substr(at)).c_str()).HasParseError()) {
        throw std::runtime_error(timeline.string() + " has no metadata");
    }
    const auto& trace = document["otherData"]["traces"][0];
    return {2 * trace["pairs"].GetUint64() + trace["startsWithoutStop"].GetUint64() +
                trace["stopsWithoutStart"].GetUint64(),
            trace["eventsLost"].GetUint64()};
}

} // namespace halyard::load
