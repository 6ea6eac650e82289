#include "OnceReport.h"

#include <algorithm>
#include <charconv>
#include <fmt/core.h>
#include <utility>

#include "PlainText.h"

namespace halyard::pipewire {

namespace {

using Rows = std::vector<std::vector<std::string>>;

// Longer names are cut, so that a row stays a line.
constexpr std::size_t kWidest = 48;

std::string yesNo(bool value) {
    return value ? "yes" : "no";
}

std::string orNone(const std::string& text) {
    return text.empty() ? "-" : text;
}

std::vector<std::size_t> widthsOf(const Rows& rows) {
    std::vector<std::size_t> widths(rows.front().size());
    for (const auto& row : rows) {
        for (std::size_t i = 0; i < row.size(); ++i) {
            widths[i] = std::max(widths[i], widthOf(row[i]));
        }
    }
    return widths;
}

// The first row is the heading; the last column may be of any length.
std::string table(const std::string& title, Rows rows) {
    if (rows.size() == 1) {
        return title + ": none\n";
    }
    std::sort(rows.begin() + 1, rows.end());
    const std::vector<std::size_t> widths = widthsOf(rows);
    std::string text = title + "\n";
    for (const auto& row : rows) {
        std::string line;
        for (std::size_t i = 0; i < row.size(); ++i) {
            const bool last = i + 1 == row.size();
            line += "  " + row[i];
            line.append(last ? 0 : widths[i] - widthOf(row[i]), ' ');
        }
        text += line + "\n";
    }
    return text;
}

std::string devicesOf(const Route& route) {
    std::string text;
    for (const std::string& name : route.devices) {
        text += (text.empty() ? "" : ", ") + plainText(name, kWidest);
    }
    return orNone(text);
}

// What a stream does with its devices, in a word or two.
std::string captureOf(const Route& route) {
    if (route.hears && route.monitors) {
        return "source and monitor";
    }
    return route.hears ? "source" : route.monitors ? "monitor" : "-";
}

std::string directionOf(const Properties& node, const Route& route) {
    const auto direction = reportedDirection(node);
    if (!direction && !route.plays && !route.captures()) {
        return "-"; // a JACK program that is linked to no device
    }
    const bool plays = direction ? *direction == Direction::Playback : route.plays;
    return plays ? "playback" : "capture";
}

} // namespace

void OnceReport::handle(const GraphEvent& event) {
    std::visit([this](const auto& what) { on(what); }, event);
}

// ---- The picture

void OnceReport::take(const Cycle& cycle) {
    const std::string quantum = fmt::format(
        "{}/{}", cycle.frames, cycle.rateDenominator / std::max(cycle.rateNumerator, 1U));
    const auto tell = [&](ObjectId id) {
        if (Node* const node = find(id)) {
            node->quantum = quantum;
        }
    };
    tell(cycle.driver.id);
    for (const NodeCycle& follower : cycle.followers) {
        tell(follower.id);
    }
}

bool OnceReport::complete() const {
    return std::none_of(nodes_.begin(), nodes_.end(), [](const auto& entry) {
        const Node& node = entry.second;
        return node.running && isDevice(node.properties) && node.quantum.empty();
    });
}

OnceReport::Node* OnceReport::find(ObjectId id) {
    const auto found = nodes_.find(id);
    return found == nodes_.end() ? nullptr : &found->second;
}

void OnceReport::on(const ClientChanged& event) {
    if (clients_.size() < kMaxObjects || clients_.contains(event.id)) {
        clients_[event.id] = event.properties;
    } else {
        ++ignored_;
    }
}

void OnceReport::on(const NodeChanged& event) {
    if (nodes_.size() >= kMaxObjects && !nodes_.contains(event.id)) {
        ++ignored_;
        return;
    }
    nodes_[event.id].properties = event.properties;
    routes_.setNode(event.id, event.properties);
}

void OnceReport::on(const NodeStateChanged& event) {
    if (Node* const node = find(event.id)) {
        node->running = event.state == NodeState::Running;
    }
}

void OnceReport::on(const NodeVolumeChanged& event) {
    if (Node* const node = find(event.id)) {
        node->volume = event.linearVolume;
        node->muted = event.muted;
    }
}

void OnceReport::on(const NodeFormatChanged& event) {
    if (Node* const node = find(event.id)) {
        node->format = event.format;
    }
}

void OnceReport::on(const LinkAdded& event) {
    ignored_ += routes_.addLink(event) ? 0 : 1;
}

void OnceReport::on(const ObjectRemoved& event) {
    clients_.erase(event.id);
    nodes_.erase(event.id);
    routes_.remove(event.id);
}

void OnceReport::on(const Settled&) {}

void OnceReport::on(const Disconnected&) {
    *this = OnceReport();
}

// ---- The table

const Properties& OnceReport::clientOf(const Node& node) const {
    static const Properties kNobody;
    const std::string text = property(node.properties, "client.id");
    ObjectId id = 0;
    std::from_chars(text.data(), text.data() + text.size(), id);
    const auto found = clients_.find(id);
    return text.empty() || found == clients_.end() ? kNobody : found->second;
}

OnceReport::Row OnceReport::deviceRow(const Node& node) const {
    const std::string mediaClass = property(node.properties, "media.class");
    return {plainText(property(node.properties, "node.name"), kWidest),
            plainText(mediaClass.substr(std::string("Audio/").size()), kWidest),
            node.running ? "running" : "stopped",
            fmt::format("{:.2f}", perceivedVolume(node.volume)),
            yesNo(node.muted),
            node.running ? orNone(node.quantum) : "-",
            orNone(plainText(node.format, kWidest))};
}

std::optional<OnceReport::Row> OnceReport::streamRow(ObjectId id, const Node& node) const {
    if (!reportedDirection(node.properties) && !passesSound(node.properties)) {
        return std::nullopt;
    }
    const Properties& client = clientOf(node);
    const Route route = routes_.routeOf(id);
    const auto pid = processId(node.properties, client);
    return Row{plainText(applicationName(node.properties, client), kWidest),
               pid ? std::to_string(*pid) : "-",
               directionOf(node.properties, route),
               node.running ? "running" : "stopped",
               fmt::format("{:.2f}", perceivedVolume(node.volume)),
               yesNo(node.muted),
               captureOf(route),
               orNone(plainText(node.format, kWidest)),
               devicesOf(route)};
}

std::string OnceReport::text() const {
    Rows devices{{"NAME", "KIND", "STATE", "VOLUME", "MUTED", "QUANTUM", "FORMAT"}};
    Rows streams{{"APPLICATION", "PID", "DIRECTION", "STATE", "VOLUME", "MUTED", "CAPTURES",
                  "FORMAT", "DEVICES"}};
    for (const auto& [id, node] : nodes_) {
        if (isDevice(node.properties)) {
            devices.push_back(deviceRow(node));
        } else if (auto row = streamRow(id, node)) {
            streams.push_back(std::move(*row));
        }
    }
    std::string result =
        table("Devices", std::move(devices)) + "\n" + table("Streams", std::move(streams));
    if (ignored_ != 0) {
        result += fmt::format("\n{} more objects are not shown\n", ignored_);
    }
    return result;
}

} // namespace halyard::pipewire
