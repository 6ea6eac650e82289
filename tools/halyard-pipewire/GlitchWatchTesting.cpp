#include "GlitchWatchTesting.h"

#include <algorithm>
#include <stdexcept>

#include "halyard/halyard.h"

namespace halyard::pipewire {

using namespace std::chrono_literals;

namespace {

// An episode is told at the latest this long after its end.
constexpr Nanoseconds kTold = 2'000'000'000;

} // namespace

WatchedGraph::WatchedGraph()
    : streams_(*this, 1),
      glitchWatch_(*this, {.note = [this](const std::string& text) { notes_ += text + '\n'; }}),
      graph_({.remote = {}, .cycle = [this](const Cycle& cycle) { took(cycle); }},
             [this](const GraphEvent& event) { heard(event); }) {
    streams_.observe(glitchWatch_);
    glitchWatch_.settled = [this](StreamKey stream) { streams_.settle(stream); };
    until([this] { return nodes_.contains("out.headphones"); });
}

WatchedGraph::~WatchedGraph() = default;

void WatchedGraph::heard(const GraphEvent& event) {
    if (const auto* const node = std::get_if<NodeChanged>(&event)) {
        nodes_[property(node->properties, "node.name")] = *node;
    }
    streams_.handle(event);
    watch();
}

void WatchedGraph::took(const Cycle& cycle) {
    seen_ = std::max(seen_, cycle.driver.signal);
    glitchWatch_.take(cycle);
}

void WatchedGraph::watch() {
    if (std::exchange(watching_, glitchWatch_.watching()) != watching_) {
        graph_.every(watching_ ? GlitchWatch::kTick : 0ms, [this] {
            glitchWatch_.tick();
            watch();
        });
    }
}

// ---- Sessions

void WatchedGraph::open(std::int64_t id, std::uint16_t, const Contents& configuration) {
    sessions_[id].application = configuration.get<std::string>("HostApplicationDisplayID");
}

void WatchedGraph::send(std::int64_t id, const Message& message) {
    Session& session = sessions_[id];
    if (message.type == HALYARD_TYPE_ISSUE_DETECTOR) {
        glitches_.push_back({session.application, message.contents, message.category});
    } else if (message.category == HALYARD_CATEGORY_PLAYBACK ||
               message.category == HALYARD_CATEGORY_RECORD) {
        session.playing = message.type == HALYARD_TYPE_START;
        if (!session.playing) {
            session.stop = message;
        }
    }
}

bool WatchedGraph::playing(const std::string& application) const {
    return std::any_of(sessions_.begin(), sessions_.end(), [&](const auto& entry) {
        return entry.second.application == application && entry.second.playing;
    });
}

bool WatchedGraph::closed(const std::string& application) const {
    return std::any_of(sessions_.begin(), sessions_.end(), [&](const auto& entry) {
        return entry.second.application == application && entry.second.closed;
    });
}

const Message* WatchedGraph::lastStop(const std::string& application) const {
    const Message* found = nullptr;
    for (const auto& [id, session] : sessions_) {
        if (session.application == application && session.stop) {
            found = &*session.stop;
        }
    }
    return found;
}

std::string WatchedGraph::idOf(const std::string& node) const {
    return std::to_string(nodes_.at(node).id);
}

std::string WatchedGraph::serialOf(const std::string& node) const {
    return property(nodes_.at(node).properties, "object.serial");
}

// ---- The loop

bool WatchedGraph::until(const std::function<bool()>& done, std::chrono::milliseconds patience) {
    const auto deadline = std::chrono::steady_clock::now() + patience;
    while (!done()) {
        if (std::chrono::steady_clock::now() > deadline) {
            return false;
        }
        graph_.iterate(10ms);
    }
    return true;
}

void WatchedGraph::pass(std::chrono::milliseconds time) {
    until([] { return false; }, time);
}

bool WatchedGraph::untilSeen(Nanoseconds moment) {
    return until([&] {
        const bool runs = std::any_of(sessions_.begin(), sessions_.end(),
                                      [](const auto& entry) { return entry.second.playing; });
        return monotonicNow() >= moment + kTold && (!runs || seen_ >= moment);
    });
}

testing::Episode WatchedGraph::command(testing::GlitchPlayer& player, const std::string& text) {
    player.send(text);
    std::optional<testing::Episode> answer;
    if (!until([&] { return (answer = player.answered()).has_value(); })) {
        throw std::runtime_error("the player does not answer");
    }
    return *answer;
}

bool WatchedGraph::untilWatched(const std::string& application) {
    return until([&] {
        return playing(application) &&
               notes_.find("thread of \"" + application + "\"") != std::string::npos;
    });
}

} // namespace halyard::pipewire
