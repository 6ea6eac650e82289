#include "Player.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <sstream>
#include <stdexcept>
#include <sys/resource.h>
#include <unistd.h>

#include "PipeWireHeaders.h"

namespace halyard::glitching {

struct Player::Hooks {
    spa_hook core{};
    pw_core_events events{};
};

namespace {

// As players of music are configured, their data threads are in a real-time class
// where that is allowed. Old releases ask for the file, new ones for the property.
pw_properties* contextProperties(bool ordinary) {
    return pw_properties_new(PW_KEY_CONFIG_NAME, ordinary ? "client.conf" : "client-rt.conf",
                             "module.rt", ordinary ? "false" : "true", nullptr);
}

pw_properties* clientProperties(const std::string& name) {
    return pw_properties_new(PW_KEY_APP_NAME, name.c_str(), nullptr);
}

Voice::Options voiceOptions(const Player::Options& options) {
    Voice::Options voice = options.voice;
    if (voice.filter) { // what PipeWire's libjack gives a client's node
        voice.properties["media.role"] = "DSP";
        voice.properties.insert({{PW_KEY_MEDIA_CATEGORY, "Duplex"},
                                 {PW_KEY_NODE_ALWAYS_PROCESS, "true"},
                                 {PW_KEY_NODE_WANT_DRIVER, "true"}});
    }
    voice.properties.insert({{PW_KEY_MEDIA_TYPE, "Audio"},
                             {PW_KEY_MEDIA_CATEGORY, voice.capture ? "Capture" : "Playback"},
                             {PW_KEY_APP_NAME, options.name},
                             {PW_KEY_NODE_NAME, options.name}});
    return voice;
}

} // namespace

Player::Player(const Options& options)
    : hooks_(std::make_unique<Hooks>()),
      trouble_([this] { pw_loop_signal_event(pw_main_loop_get_loop(loop_), event_); }),
      startsPaused_(options.voice.paused) {
    pw_init(nullptr, nullptr);
    loop_ = pw_main_loop_new(nullptr);
    pw_loop* const loop = pw_main_loop_get_loop(loop_);
    event_ = pw_loop_add_event(loop, onEvent, this);
    pw_loop_add_io(loop, STDIN_FILENO, SPA_IO_IN | SPA_IO_HUP, false, onInput, this);
    context_ = pw_context_new(loop, contextProperties(options.ordinary), 0);
    core_ = context_ == nullptr ? nullptr
                                : pw_context_connect(context_, clientProperties(options.name), 0);
    if (core_ == nullptr) {
        throw std::runtime_error("PipeWire is not there");
    }
    hooks_->events.version = PW_VERSION_CORE_EVENTS;
    hooks_->events.error = onError;
    pipewire::raw::listen(core_, &hooks_->core, &hooks_->events, this);
    for (int made = 0; made < options.streams; ++made) {
        voices_.push_back(Voice::make(core_, voiceOptions(options), *this));
    }
}

Player::~Player() {
    disconnect();
    pw_context_destroy(context_);
    pw_main_loop_destroy(loop_);
    pw_deinit();
}

void Player::disconnect() {
    voices_.clear();
    if (core_ != nullptr) {
        spa_hook_remove(&hooks_->core);
        pw_core_disconnect(core_);
        core_ = nullptr;
    }
}

int Player::run() {
    pw_main_loop_run(loop_);
    return status_;
}

void Player::end(int status) {
    status_ = status;
    pw_main_loop_quit(loop_);
}

void Player::onError(void* data, unsigned id, int, int result, const char* message) {
    std::fprintf(stderr, "glitch_player: %s\n", message);
    if (id == PW_ID_CORE && result == -EPIPE) {
        static_cast<Player*>(data)->end(EXIT_FAILURE);
    }
}

// ---- The data thread

void Player::cycle() {
    if (dataThread_ == 0) {
        dataThread_ = gettid();
        pw_loop_signal_event(pw_main_loop_get_loop(loop_), event_);
    }
    trouble_.cycle();
}

// ---- What is told

void Player::onEvent(void* data, unsigned long) {
    auto& self = *static_cast<Player*>(data);
    self.introduce();
    if (const auto span = self.trouble_.collect()) {
        self.answer(self.ordered_, *span);
    }
}

bool Player::all(Activity activity) const {
    return std::all_of(voices_.begin(), voices_.end(),
                       [activity](const auto& voice) { return voice->activity() == activity; });
}

void Player::introduce() {
    const bool ready = startsPaused_ ? all(Activity::Paused) : dataThread_ != 0;
    if (introduced_ || !ready || voices_.empty()) {
        return;
    }
    introduced_ = true;
    std::printf("{\"pid\":%d,\"tid\":%d,\"node\":%u}\n", getpid(), dataThread_.load(),
                voices_.front()->nodeId());
    std::fflush(stdout);
}

void Player::activityChanged() {
    introduce();
    if (change_ && all(change_->wanted)) {
        const Change change = *change_;
        change_.reset();
        answer(change.command, {change.before, Moment::now()});
    }
}

void Player::answer(const std::string& command, const Span& span) const {
    std::printf("{\"done\":\"%s\",\"tid\":%d,\"monotonic_before\":%lld,\"monotonic_after\":%lld,"
                "\"realtime_before\":%lld,\"realtime_after\":%lld}\n",
                command.c_str(), dataThread_.load(), static_cast<long long>(span.before.monotonic),
                static_cast<long long>(span.after.monotonic),
                static_cast<long long>(span.before.realtime),
                static_cast<long long>(span.after.realtime));
    std::fflush(stdout);
}

// ---- What is commanded

void Player::onInput(void* data, int, unsigned) {
    static_cast<Player*>(data)->hear();
}

void Player::hear() {
    std::array<char, 4096> bytes{};
    const ssize_t count = read(STDIN_FILENO, bytes.data(), bytes.size());
    if (count <= 0) {
        end(EXIT_SUCCESS);
        return;
    }
    input_.append(bytes.data(), static_cast<std::size_t>(count));
    for (auto newline = input_.find('\n'); newline != std::string::npos;
         newline = input_.find('\n')) {
        const std::string line = input_.substr(0, newline);
        input_.erase(0, newline + 1);
        obey(line);
    }
}

void Player::obey(const std::string& line) {
    std::istringstream words(line);
    std::string command;
    std::int64_t amount = 0;
    std::int64_t cycles = 1;
    words >> command >> amount >> cycles;
    if (const auto kind = kindOf(command)) {
        order(command, *kind, amount, cycles);
    } else if (command == "pause" || command == "resume") {
        change(command, command == "pause" ? Activity::Paused : Activity::Running);
    } else if (command == "quantum") {
        setQuantum(command, amount);
    } else {
        leave(command, amount);
    }
}

void Player::order(const std::string& command, Kind kind, std::int64_t amount,
                   std::int64_t cycles) {
    if (trouble_.busy()) {
        return refuse(command + ": one is under way");
    }
    ordered_ = command;
    try {
        trouble_.order(kind, std::chrono::milliseconds(amount), std::max<std::int64_t>(cycles, 1));
    } catch (const std::exception& error) {
        refuse(command + ": " + error.what());
    }
}

// Not by an exception: PipeWire's loop is between us and main().
void Player::refuse(const std::string& why) {
    std::fprintf(stderr, "glitch_player: %s\n", why.c_str());
    end(2);
}

void Player::change(const std::string& command, Activity wanted) {
    change_ = Change{command, wanted, Moment::now()};
    for (const auto& voice : voices_) {
        voice->setActive(wanted == Activity::Running);
    }
    activityChanged();
}

void Player::setQuantum(const std::string& command, std::int64_t frames) {
    const Moment before = Moment::now();
    for (const auto& voice : voices_) {
        voice->setProperty("node.force-quantum", std::to_string(frames));
    }
    answer(command, {before, Moment::now()});
}

void Player::leave(const std::string& command, std::int64_t status) {
    const Moment before = Moment::now();
    if (command == "stop") {
        disconnect();
        answer(command, {before, Moment::now()});
        end(EXIT_SUCCESS);
        return;
    }
    answer(command, {before, before});
    if (command == "exit") {
        std::exit(static_cast<int>(status)); // the stream runs on until the kernel ends it
    } else if (command == "die") {
        raise(SIGKILL);
    } else if (command == "abort") {
        const rlimit none{0, 0};
        setrlimit(RLIMIT_CORE, &none);
        std::abort();
    }
    refuse("unknown command: " + command);
}

} // namespace halyard::glitching
