#include "PipeWireTesting.h"

#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <fcntl.h>
#include <spawn.h>
#include <stdexcept>
#include <string_view>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>

namespace halyard::testing {

namespace fs = std::filesystem;

namespace {

constexpr std::string_view kDevices = R"(
context.objects = [
  { factory = adapter args = { factory.name = support.null-audio-sink
      node.name = "out.speaker" media.class = Audio/Sink object.linger = true
      audio.position = [ FL FR ] monitor.channel-volumes = true priority.session = 1000 } }
  { factory = adapter args = { factory.name = support.null-audio-sink
      node.name = "out.headphones" media.class = Audio/Sink object.linger = true
      audio.position = [ FL FR ] monitor.channel-volumes = true priority.session = 900 } }
  { factory = adapter args = { factory.name = support.null-audio-sink
      node.name = "in.microphone" media.class = Audio/Source/Virtual object.linger = true
      audio.position = [ FL FR ] priority.session = 800 } }
]
)";

// The session manager runs without D-Bus and hardware.
constexpr std::string_view kNoDBus = R"(
alsa_monitor.enabled = false
v4l2_monitor.enabled = false
libcamera_monitor.enabled = false
default_access.enabled = false
)";

void append32(std::string& to, std::uint32_t value) {
    for (int shift = 0; shift < 32; shift += 8) {
        to.push_back(static_cast<char>(value >> shift & 0xFF));
    }
}

// A minute of 16-bit stereo silence at 48 kHz.
std::string silentWave() {
    constexpr std::uint32_t kBytes = 60 * 48000 * 4;
    std::string wave = "RIFF";
    append32(wave, 36 + kBytes);
    wave += "WAVEfmt ";
    append32(wave, 16);
    append32(wave, 2U << 16 | 1U); // two channels, PCM
    append32(wave, 48000);
    append32(wave, 48000 * 4);
    append32(wave, 16U << 16 | 4U);
    wave += "data";
    append32(wave, kBytes);
    return wave + std::string(kBytes, '\0');
}

bool inPath(const std::string& program) {
    for (const char* folder : {"/usr/bin/", "/usr/local/bin/", "/bin/"}) {
        if (access((folder + program).c_str(), X_OK) == 0) {
            return true;
        }
    }
    return false;
}

} // namespace

Child::Child(const std::vector<std::string>& arguments, const fs::path& logFile, const Ends& ends) {
    std::vector<char*> argv;
    for (const std::string& argument : arguments) {
        argv.push_back(const_cast<char*>(argument.c_str()));
    }
    argv.push_back(nullptr);
    posix_spawn_file_actions_t files;
    posix_spawn_file_actions_init(&files);
    if (!logFile.empty()) {
        posix_spawn_file_actions_addopen(&files, 1, logFile.c_str(), O_WRONLY | O_CREAT | O_APPEND,
                                         0600);
        posix_spawn_file_actions_adddup2(&files, 1, 2);
    }
    if (ends.input >= 0) {
        posix_spawn_file_actions_adddup2(&files, ends.input, 0);
    }
    if (ends.output >= 0) {
        posix_spawn_file_actions_adddup2(&files, ends.output, 1);
    }
    const int error = posix_spawnp(&pid_, argv[0], &files, nullptr, argv.data(), environ);
    posix_spawn_file_actions_destroy(&files);
    if (error != 0) {
        throw std::runtime_error("cannot start " + arguments[0]);
    }
}

Child::Child(Child&& other) noexcept : pid_(std::exchange(other.pid_, -1)) {}

Child& Child::operator=(Child&& other) noexcept {
    kill();
    pid_ = std::exchange(other.pid_, -1);
    return *this;
}

void Child::signal(int number) const {
    if (::kill(pid_, number) != 0) {
        throw std::runtime_error("no such process");
    }
    if (number == SIGSTOP) {
        siginfo_t ignored{};
        waitid(P_PID, static_cast<id_t>(pid_), &ignored, WSTOPPED | WNOWAIT);
    }
}

void Child::kill() {
    if (pid_ > 0) {
        ::kill(pid_, SIGTERM);
        ::kill(pid_, SIGCONT); // one that is stopped would not hear
        wait();
    }
}

int Child::wait() {
    int status = 0;
    const pid_t pid = std::exchange(pid_, -1);
    return waitpid(pid, &status, 0) == pid && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

bool PrivatePipeWire::installed() {
    return inPath("pipewire") && inPath("wireplumber") && inPath("pw-play") && inPath("wpctl");
}

bool PrivatePipeWire::pulseInstalled() {
    return installed() && inPath("pipewire-pulse") && inPath("paplay");
}

PrivatePipeWire::PrivatePipeWire() {
    folder_.write("config/pipewire/pipewire.conf.d/sinks.conf", kDevices);
    folder_.write("config/wireplumber/main.lua.d/60-nodbus.lua", kNoDBus);
    folder_.write("config/wireplumber/bluetooth.lua.d/60-off.lua",
                  "bluez_monitor.enabled = false\n");
    folder_.write("silence.wav", silentWave());
    for (const char* name : {"XDG_RUNTIME_DIR", "PIPEWIRE_RUNTIME_DIR", "XDG_STATE_HOME"}) {
        setenv(name, folder_.path().c_str(), 1);
    }
    setenv("XDG_CONFIG_HOME", (folder_ / "config").c_str(), 1);
    for (const char* name : {"PIPEWIRE_REMOTE", "DBUS_SESSION_BUS_ADDRESS", "DISPLAY"}) {
        unsetenv(name);
    }
}

PrivatePipeWire::~PrivatePipeWire() {
    stop();
}

void PrivatePipeWire::start() {
    daemon_ = Child({"pipewire"}, log("pipewire"));
    awaitSocket("pipewire-0"); // or the session manager gives up
    sessionManager_ = Child({"wireplumber"}, log("wireplumber"));
    // A stream that comes before it knows the devices is told that there is none.
    run({"sh", "-c", "until wpctl inspect @DEFAULT_AUDIO_SINK@; do sleep 0.02; done"});
}

void PrivatePipeWire::startPulse() {
    pulse_ = Child({"pipewire-pulse"}, log("pipewire-pulse"));
    awaitSocket("pulse/native");
}

void PrivatePipeWire::awaitSocket(const std::string& name) {
    run({"sh", "-c", "until [ -S '" + (folder_ / name).string() + "' ]; do sleep 0.02; done"});
}

void PrivatePipeWire::forceQuantum(std::uint32_t frames) {
    run({"pw-metadata", "-n", "settings", "0", "clock.force-quantum", std::to_string(frames)});
}

void PrivatePipeWire::stop() {
    pulse_.kill();
    sessionManager_.kill();
    daemon_.kill();
    fs::remove(folder_ / "pipewire-0");
}

Child PrivatePipeWire::play(const std::string& role) {
    return Child({"pw-play", "--media-role=" + role, "--target=out.speaker", "-P",
                  "{ application.name=test-player }", folder_ / "silence.wav"},
                 log("play"));
}

Child PrivatePipeWire::record() {
    return Child({"pw-record", "--target=out.speaker", "-P",
                  "{ stream.capture.sink=true application.name=test-recorder }",
                  folder_ / "recording.wav"},
                 log("record"));
}

void PrivatePipeWire::run(const std::vector<std::string>& arguments) {
    if (Child(arguments, log("run")).wait() != 0) {
        throw std::runtime_error(arguments[0] + " failed");
    }
}

} // namespace halyard::testing
