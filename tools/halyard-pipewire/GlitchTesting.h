// What makes streams glitch, on command and for a known time: a player that does
// so itself, a control group that freezes, a program that takes a processor.
#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <sys/types.h>
#include <thread>
#include <vector>

#include "PipeWireTesting.h"

namespace halyard::testing {

// The times of what was done, in nanoseconds of both clocks.
struct Episode {
    std::int64_t monotonicBefore = 0;
    std::int64_t monotonicAfter = 0;
    std::int64_t realtimeBefore = 0;
    std::int64_t realtimeAfter = 0;
};

// testing/glitch_player as a child; `glitch_player --help` has its options and
// commands. Ends with this object.
class GlitchPlayer final {
public:
    // Returns when it plays, or could with --paused; throws when it does not.
    explicit GlitchPlayer(const std::vector<std::string>& options);
    ~GlitchPlayer();
    GlitchPlayer(const GlitchPlayer&) = delete;
    GlitchPlayer& operator=(const GlitchPlayer&) = delete;

    // Whether it understands "fault": that takes the right to mount.
    static bool canFault();

    pid_t pid() const { return process_.pid(); }
    // 0 as long as no cycle has reached it.
    pid_t dataThread() const { return dataThread_; }
    std::uint32_t node() const { return node_; }
    Child& process() { return process_; }

    // Returns when it is done.
    Episode command(const std::string& text);
    // The same in two parts, for tests that do something meanwhile.
    void send(const std::string& text) const;
    Episode answer();
    std::optional<Episode> answered(); // does not wait

private:
    std::string line();
    std::optional<std::string> lineWithin(std::chrono::milliseconds time);
    Episode understand(const std::string& line);

    int commands_ = -1;
    int answers_ = -1;
    Child process_;
    std::string read_;
    pid_t dataThread_ = 0;
    std::uint32_t node_ = 0;
};

// A control group of this test's own whose processes can be frozen.
class FreezableGroup final {
public:
    enum class Version { One, Two };

    // Nothing where the machine has no such hierarchy or it may not be changed.
    static std::unique_ptr<FreezableGroup> make(Version version);
    // Thaws what is in it, and gives it back to the group above.
    ~FreezableGroup();
    FreezableGroup(const FreezableGroup&) = delete;
    FreezableGroup& operator=(const FreezableGroup&) = delete;

    const std::filesystem::path& path() const { return path_; }
    void add(pid_t process);
    // Both return when it is so.
    void freeze();
    void thaw();

private:
    FreezableGroup(Version version, std::filesystem::path path)
        : version_(version), path_(std::move(path)) {}

    void set(bool frozen);
    bool frozen() const;

    const Version version_;
    const std::filesystem::path path_;
};

// Keeps a thread on one processor. False where that is not allowed.
[[nodiscard]] bool pin(pid_t thread, int processor);

// Takes a processor from all that PipeWire runs, for less than the second after
// which the kernel gives ordinary threads a share of it.
class ProcessorHog final {
public:
    // False for who may not use real-time classes, or has but one processor.
    static bool allowed();

    ProcessorHog(int processor, std::chrono::milliseconds time);
    ~ProcessorHog();
    ProcessorHog(const ProcessorHog&) = delete;
    ProcessorHog& operator=(const ProcessorHog&) = delete;

    Episode wait();

private:
    Episode episode_;
    std::thread thread_; // last: it writes the rest
};

} // namespace halyard::testing
