#include <fmt/format.h>

#include "linux/config/Quantities.h"
#include "linux/config/SettingsSections.h"

namespace halyard::linux_ {
namespace {

constexpr std::string_view kSignals[] = {"logs", "metrics", "traces"};

// A receiver is spoken to over HTTP, and nothing else is to be asked of the library
// that does it.
bool isEndpoint(std::string_view text) {
    for (const std::string_view scheme : {"http://", "https://"}) {
        if (text.starts_with(scheme) && text.size() > scheme.size()) {
            return true;
        }
    }
    return false;
}

void readEndpoint(TomlReader& reader, const NamedNode& at, ExportSettings& into) {
    std::string endpoint;
    reader.read(at, endpoint);
    if (at.node.is_string() && !endpoint.empty() && !isEndpoint(endpoint)) {
        reader.fail(at.node, fmt::format("{} must begin with \"http://\" or \"https://\" and name "
                                         "a host",
                                         at.name));
    }
    into.endpoint = std::move(endpoint);
}

template <std::string ExportSettings::*member>
void readFile(TomlReader& reader, const NamedNode& at, ExportSettings& into) {
    std::string& path = into.*member;
    reader.read(at, path);
    if (at.node.is_string() && !path.empty() && !path.starts_with('/')) {
        reader.fail(at.node, fmt::format("{} must be an absolute path", at.name));
    }
}

void readSignals(TomlReader& reader, const NamedNode& at, ExportSettings& into) {
    reader.read(at, into.signals);
    if (!at.node.is_array()) {
        return;
    }
    for (const toml::node& element : *at.node.as_array()) {
        const auto word = element.value_exact<std::string_view>().value_or("");
        if (std::find(std::begin(kSignals), std::end(kSignals), word) == std::end(kSignals)) {
            reader.fail(element, fmt::format("{} must be a list of some of \"logs\", \"metrics\", "
                                             "\"traces\"",
                                             at.name));
        }
    }
}

void readMaxBytesPerDay(TomlReader& reader, const NamedNode& at, ExportSettings& into) {
    reader.readSize(at, kKiB, into.maxBytesPerDay);
}

void readResource(TomlReader& reader, const NamedNode& at, ExportSettings& into) {
    const toml::table* const attributes = reader.table(at);
    if (attributes == nullptr) {
        return;
    }
    for (const auto& [key, element] : *attributes) {
        const std::string name(key.str());
        reader.read({element, fmt::format("{}.\"{}\"", at.name, name)}, into.resource[name]);
    }
}

constexpr TomlReader::Key<ExportSettings> kKeys[] = {
    {"consent", &readInto<&ExportSettings::consent>},
    {"endpoint", &readEndpoint},
    {"headers_file", &readFile<&ExportSettings::headersFile>},
    {"certificate", &readFile<&ExportSettings::certificate>},
    {"client_certificate", &readFile<&ExportSettings::clientCertificate>},
    {"client_key", &readFile<&ExportSettings::clientKey>},
    {"signals", &readSignals},
    {"analytics_events", &readInto<&ExportSettings::analyticsEvents>},
    {"omit", &readInto<&ExportSettings::omit>},
    {"max_bytes_per_day", &readMaxBytesPerDay},
    {"resource", &readResource},
};

} // namespace

void readExport(TomlReader& reader, const NamedNode& at, Settings& into) {
    reader.readSection<ExportSettings>(at, kKeys, into.exporting);
}

} // namespace halyard::linux_
