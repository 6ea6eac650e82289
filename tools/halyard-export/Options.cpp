#include "Options.h"

#include <algorithm>
#include <charconv>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include "linux/system/SmallFile.h"

namespace halyard::exporting {
namespace {

using linux_::Environment;
using reading::Exit;
using reading::Outcome;
using reading::Trouble;

constexpr std::array<std::string_view, kSignals> kVariables = {"LOGS", "METRICS", "TRACES"};
constexpr std::size_t kMostHeaderBytes = 64 * 1024;
constexpr std::size_t kMostRecords = 8192;
constexpr std::int64_t kMostMilliseconds = 3'600'000;

// Unset and empty are the same, as the standard has it.
std::optional<std::string> valueOf(const Environment& environment, const std::string& name) {
    auto value = environment(name);
    return value && !value->empty() ? std::move(value) : std::nullopt;
}

// That of the signal, else that of all.
std::optional<std::string> otlpValue(const Environment& environment, std::size_t signal,
                                     std::string_view name) {
    auto own =
        valueOf(environment, fmt::format("OTEL_EXPORTER_OTLP_{}_{}", kVariables[signal], name));
    return own ? own : valueOf(environment, fmt::format("OTEL_EXPORTER_OTLP_{}", name));
}

std::string_view trimmed(std::string_view text) {
    constexpr std::string_view kBlanks = " \t\r";
    const std::size_t first = text.find_first_not_of(kBlanks);
    return first == std::string_view::npos
               ? std::string_view()
               : text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

std::string decoded(std::string_view text) {
    std::string plain;
    for (std::size_t i = 0; i < text.size(); ++i) {
        unsigned byte = 0;
        const bool isCode =
            text[i] == '%' && i + 2 < text.size() &&
            std::from_chars(text.data() + i + 1, text.data() + i + 3, byte, 16).ptr ==
                text.data() + i + 3;
        plain += isCode ? static_cast<char>(byte) : text[i];
        i += isCode ? 2 : 0;
    }
    return plain;
}

std::optional<std::int64_t> numberIn(const std::optional<std::string>& text) {
    std::int64_t number = 0;
    if (!text) {
        return std::nullopt;
    }
    const auto [end, error] = std::from_chars(text->data(), text->data() + text->size(), number);
    return error == std::errc() && end == text->data() + text->size() && number > 0
               ? std::optional(number)
               : std::nullopt;
}

bool isTrue(const std::optional<std::string>& text) {
    std::string lower = text.value_or("");
    std::transform(lower.begin(), lower.end(), lower.begin(),
                   [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c; });
    return lower == "true";
}

std::string withPath(std::string endpoint, Signal signal) {
    while (endpoint.ends_with('/')) {
        endpoint.pop_back();
    }
    return endpoint + "/v1/" + std::string(nameOf(signal));
}

// A header's name and value end with the line; what would begin another is none.
bool isHeader(const std::pair<std::string, std::string>& header) {
    const auto isControl = [](char c) { return static_cast<unsigned char>(c) < 0x20; };
    return !header.first.empty() && header.first.find_first_of(": ") == std::string::npos &&
           std::none_of(header.first.begin(), header.first.end(), isControl) &&
           std::none_of(header.second.begin(), header.second.end(), isControl);
}

class Reader {
public:
    Reader(const linux_::ExportSettings& settings, const Environment& environment)
        : settings_(settings), environment_(environment) {}

    Outcome<Options> read() {
        options_.consent = settings_.consent;
        options_.omit = settings_.omit;
        options_.analyticsEvents = settings_.analyticsEvents;
        options_.maxBytesPerDay = settings_.maxBytesPerDay;
        readResource();
        readTimes();
        readFiles();
        for (std::size_t i = 0; i < kSignals; ++i) {
            if (auto read = readSignal(i); !read.ok()) {
                return read.failure();
            }
        }
        if (isTrue(valueOf(environment_, "OTEL_SDK_DISABLED"))) {
            options_.urls = {};
        }
        if (!options_.clientKey.empty()) {
            if (auto checked = checkIsPrivate(options_.clientKey); !checked.ok()) {
                return checked.failure();
            }
        }
        return std::move(options_);
    }

private:
    void readResource() {
        options_.resource = settings_.resource;
        for (auto& [key, value] :
             pairsIn(valueOf(environment_, "OTEL_RESOURCE_ATTRIBUTES").value_or(""))) {
            options_.resource[key] = value;
        }
        if (const auto name = valueOf(environment_, "OTEL_SERVICE_NAME")) {
            options_.resource["service.name"] = *name;
        }
    }
    void readTimes() {
        const auto number = [this](const char* name) {
            return numberIn(valueOf(environment_, name));
        };
        if (const auto delay = number("OTEL_BLRP_SCHEDULE_DELAY")) {
            options_.delay = std::chrono::milliseconds(std::min(*delay, kMostMilliseconds));
        }
        if (const auto records = number("OTEL_BLRP_MAX_EXPORT_BATCH_SIZE")) {
            options_.limits.records = std::min(static_cast<std::size_t>(*records), kMostRecords);
        }
        if (const auto timeout = number("OTEL_EXPORTER_OTLP_TIMEOUT")) {
            options_.timeout = std::chrono::milliseconds(std::min(*timeout, kMostMilliseconds));
        }
    }
    void readFiles() {
        const auto choose = [this](const char* name, const std::string& settled) {
            return valueOf(environment_, std::string("OTEL_EXPORTER_OTLP_") + name)
                .value_or(settled);
        };
        options_.certificate = choose("CERTIFICATE", settings_.certificate);
        options_.clientCertificate = choose("CLIENT_CERTIFICATE", settings_.clientCertificate);
        options_.clientKey = choose("CLIENT_KEY", settings_.clientKey);
        options_.compress = otlpValue(environment_, 0, "COMPRESSION").value_or("gzip") != "none";
    }

    Outcome<void> readSignal(std::size_t i) {
        const auto signal = static_cast<Signal>(i);
        const auto protocol = otlpValue(environment_, i, "PROTOCOL").value_or("http/protobuf");
        if (protocol != "http/protobuf") {
            return Trouble(Exit::Failed, fmt::format("OTEL_EXPORTER_OTLP_PROTOCOL is {}: only "
                                                     "http/protobuf is spoken here",
                                                     protocol));
        }
        if (auto headers = readHeadersOf(i); !headers.ok()) {
            return headers.failure();
        }
        const bool isWanted = std::find(settings_.signals.begin(), settings_.signals.end(),
                                        nameOf(signal)) != settings_.signals.end();
        const auto exporter = valueOf(environment_, fmt::format("OTEL_{}_EXPORTER", kVariables[i]));
        if (!isWanted || exporter == "none") {
            return {};
        }
        const auto own =
            valueOf(environment_, fmt::format("OTEL_EXPORTER_OTLP_{}_ENDPOINT", kVariables[i]));
        const std::string base =
            valueOf(environment_, "OTEL_EXPORTER_OTLP_ENDPOINT").value_or(settings_.endpoint);
        options_.urls[i] = own ? *own : base.empty() ? "" : withPath(base, signal);
        if (!options_.urls[i].empty() && !options_.urls[i].starts_with("https://") &&
            !options_.urls[i].starts_with("http://")) {
            return Trouble(
                Exit::Failed,
                fmt::format("the endpoint of {} is no http: or https: address", nameOf(signal)));
        }
        return {};
    }
    Outcome<void> readHeadersOf(std::size_t i) {
        if (!settings_.headersFile.empty()) {
            auto read = readHeaders(settings_.headersFile);
            if (!read.ok()) {
                return read.failure();
            }
            options_.headers[i] = std::move(read.value());
        }
        for (auto& header : pairsIn(otlpValue(environment_, i, "HEADERS").value_or(""))) {
            if (isHeader(header)) {
                options_.headers[i].push_back(std::move(header));
            }
        }
        return {};
    }

    const linux_::ExportSettings& settings_;
    const Environment& environment_;
    Options options_;
};

} // namespace

Outcome<Options> optionsFrom(const linux_::ExportSettings& settings,
                             const Environment& environment) {
    return Reader(settings, environment).read();
}

bool Options::isAnythingSent() const {
    return std::any_of(urls.begin(), urls.end(), [](const auto& url) { return !url.empty(); });
}

std::vector<std::pair<std::string, std::string>> pairsIn(std::string_view text) {
    std::vector<std::pair<std::string, std::string>> pairs;
    while (!text.empty()) {
        const std::size_t end = std::min(text.find(','), text.size());
        const std::string_view pair = text.substr(0, end);
        const std::size_t equals = pair.find('=');
        if (equals != std::string_view::npos && !trimmed(pair.substr(0, equals)).empty()) {
            pairs.emplace_back(decoded(trimmed(pair.substr(0, equals))),
                               decoded(trimmed(pair.substr(equals + 1))));
        }
        text.remove_prefix(std::min(end + 1, text.size()));
    }
    return pairs;
}

std::string shownAddress(std::string url) {
    url.erase(std::min(url.find_first_of("?#"), url.size()));
    const std::size_t scheme = url.find("://");
    const std::size_t host = scheme == std::string::npos ? 0 : scheme + 3;
    const std::size_t user = url.rfind('@', url.find('/', host));
    if (user != std::string::npos && user >= host) {
        url.erase(host, user + 1 - host);
    }
    return url;
}

Outcome<void> checkIsPrivate(const std::string& path) {
    struct stat facts {};
    if (::stat(path.c_str(), &facts) != 0) {
        return Trouble(Exit::Failed, Failure::ofErrno("cannot use " + path).message());
    }
    const bool isOurs = facts.st_uid == ::geteuid() || facts.st_uid == 0;
    if (!S_ISREG(facts.st_mode) || !isOurs || (facts.st_mode & 077U) != 0) {
        return Trouble(Exit::NotAllowed,
                       fmt::format("{} may be read by others than its user, so it is not used: "
                                   "chmod 0600 it",
                                   path));
    }
    return {};
}

Outcome<Options::Headers> readHeaders(const std::string& path) {
    if (auto checked = checkIsPrivate(path); !checked.ok()) {
        return checked.failure();
    }
    const auto text = linux_::readSmallFile(path, kMostHeaderBytes);
    if (!text.ok()) {
        return Trouble(Exit::Failed,
                       fmt::format("cannot read {}: {}", path, text.failure().message()));
    }
    Options::Headers headers;
    std::string_view rest = text.value();
    for (int number = 1; !rest.empty(); ++number) {
        const std::size_t end = std::min(rest.find('\n'), rest.size());
        const std::string_view line = trimmed(rest.substr(0, end));
        rest.remove_prefix(std::min(end + 1, rest.size()));
        if (line.empty() || line.starts_with('#')) {
            continue;
        }
        const std::size_t colon = std::min(line.find(':'), line.size());
        std::pair<std::string, std::string> header(
            trimmed(line.substr(0, colon)), trimmed(line.substr(std::min(colon + 1, line.size()))));
        if (colon == line.size() || !isHeader(header)) {
            // Not the line itself, which may be a secret.
            return Trouble(Exit::Failed,
                           fmt::format("{}:{}: must be \"name: value\"", path, number));
        }
        headers.push_back(std::move(header));
    }
    return headers;
}

} // namespace halyard::exporting
