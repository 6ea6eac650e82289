// What a player plays or records with: a stream, as programs have them, or a
// filter, which is what a JACK client is to PipeWire.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>

struct pw_core;

namespace halyard::glitching {

enum class Activity { None, Paused, Running };

class VoiceListener {
public:
    // On the data thread, in each cycle.
    virtual void cycle() = 0;
    virtual void activityChanged() = 0;

protected:
    ~VoiceListener() = default;
};

// Only on the thread of the core's loop.
class Voice {
public:
    struct Options {
        std::map<std::string, std::string> properties;
        bool capture = false;
        bool filter = false;
        bool paused = false;
    };

    // Borrows the core and the listener. Throws when PipeWire refuses.
    static std::unique_ptr<Voice> make(pw_core* core, const Options& options,
                                       VoiceListener& listener);
    virtual ~Voice() = default;

    virtual void setActive(bool active) = 0;
    virtual void setProperty(const std::string& key, const std::string& value) = 0;
    virtual Activity activity() const = 0;
    virtual std::uint32_t nodeId() const = 0;
};

} // namespace halyard::glitching
