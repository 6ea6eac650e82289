#include "content/Resource.h"

#include <fstream>
#include <sys/utsname.h>

#include "otlp/Attributes.h"

namespace halyard::exporting {
namespace {

constexpr std::size_t kMostFact = 4096;

// The machine's names for them, and those of the semantic conventions.
constexpr std::pair<std::string_view, std::string_view> kArchitectures[] = {
    {"x86_64", "amd64"}, {"aarch64", "arm64"}, {"armv7l", "arm32"}, {"armv6l", "arm32"},
    {"i686", "x86"},     {"i386", "x86"},      {"ppc64le", "ppc64"}};

std::string unquoted(std::string text) {
    const bool isQuoted = text.size() >= 2 && (text.front() == '"' || text.front() == '\'') &&
                          text.back() == text.front();
    return isQuoted ? text.substr(1, text.size() - 2) : text;
}

std::optional<std::string> releaseOf(const char* path) {
    constexpr std::string_view kKey = "VERSION_ID=";
    std::ifstream file(path);
    std::string line;
    while (file && std::getline(file, line) && line.size() < kMostFact) {
        if (line.starts_with(kKey)) {
            return unquoted(line.substr(kKey.size()));
        }
    }
    return std::nullopt;
}

} // namespace

SystemFacts systemFacts() {
    utsname names{};
    (void)::uname(&names);
    SystemFacts facts{releaseOf("/etc/os-release").value_or(names.release), names.machine};
    for (const auto& [machine, name] : kArchitectures) {
        if (facts.architecture == machine) {
            facts.architecture = name;
        }
    }
    return facts;
}

std::string resourceAttributes(const ResourceFacts& facts, const Omission& omission) {
    std::map<std::string, std::string> all = {{"service.name", "halyard"},
                                              {"service.version", HALYARD_VERSION},
                                              {"service.instance.id", facts.device},
                                              {"device.id", facts.device},
                                              {"os.type", "linux"},
                                              {"os.version", facts.system.osVersion},
                                              {"host.arch", facts.system.architecture}};
    if (facts.deviceName) {
        all["device_name"] = *facts.deviceName;
    }
    for (const auto& [key, value] : facts.own) {
        all[key] = value;
    }
    std::string fields;
    otlp::Writer writer(fields);
    for (const auto& [key, value] : all) {
        if (!omission.omits(key)) {
            otlp::addText(writer, otlp::request::kResourceAttributes, key, value);
        }
    }
    return fields;
}

} // namespace halyard::exporting
