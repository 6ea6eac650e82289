// The player itself: its connection to PipeWire, its streams, and the commands that
// it obeys.
#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <sys/types.h>
#include <vector>

#include "Trouble.h"
#include "Voice.h"

struct pw_context;
struct pw_core;
struct pw_main_loop;
struct spa_source;

namespace halyard::glitching {

// Lives on the main thread, which runs PipeWire's loop; only cycle() is called by
// the data thread.
class Player final : private VoiceListener {
public:
    struct Options {
        std::string name = "glitch_player";
        Voice::Options voice;
        int streams = 1;
        bool ordinary = false; // without a real-time class
    };

    // Throws when PipeWire is not there.
    explicit Player(const Options& options);
    ~Player();

    // Until told to end; the exit status.
    int run();

private:
    // What answers when all streams have got there.
    struct Change {
        std::string command;
        Activity wanted;
        Moment before;
    };

    void cycle() override;
    void activityChanged() override;
    void hear();
    void obey(const std::string& line);
    void order(const std::string& command, Kind kind, std::int64_t amount, std::int64_t cycles);
    void refuse(const std::string& why);
    void change(const std::string& command, Activity wanted);
    void setQuantum(const std::string& command, std::int64_t frames);
    void leave(const std::string& command, std::int64_t status);
    void answer(const std::string& command, const Span& span) const;
    void introduce();
    bool all(Activity activity) const;
    void disconnect();
    void end(int status);

    static void onInput(void* data, int fd, unsigned events);
    static void onEvent(void* data, unsigned long count);
    static void onError(void* data, unsigned id, int sequence, int result, const char* message);

    pw_main_loop* loop_ = nullptr;
    pw_context* context_ = nullptr;
    pw_core* core_ = nullptr;
    spa_source* event_ = nullptr;
    struct Hooks;
    std::unique_ptr<Hooks> hooks_;
    Trouble trouble_;
    std::string ordered_;
    std::atomic<pid_t> dataThread_ = 0;
    std::string input_;
    std::optional<Change> change_;
    const bool startsPaused_;
    bool introduced_ = false;
    int status_ = 0;
    std::vector<std::unique_ptr<Voice>> voices_; // last: these call the rest
};

} // namespace halyard::glitching
