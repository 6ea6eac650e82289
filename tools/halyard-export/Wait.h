// Sleeps until something happens that concerns the exporter: a write to the store, a
// changed configuration, a signal to end, or a time that has come.
//
// The write-ahead log is watched, not asked: a store that nobody writes to wakes nobody
// but for a look once a minute, in case a watch was missed. One thread.
#pragma once

#include <filesystem>
#include <string>

namespace halyard::exporting {

class Wait {
public:
    // Directories that are missing are looked for again at each wait.
    Wait(std::filesystem::path state, std::filesystem::path configuration);
    ~Wait();
    Wait(const Wait&) = delete;
    Wait& operator=(const Wait&) = delete;

    struct Woken {
        bool byStore = false;
        bool byConfiguration = false;
        bool byEnd = false;
    };
    // `seconds` may be infinite; at most a minute. What happened between two calls wakes
    // the second at once. `watchesStore`: false while it is known to have something new.
    Woken until(double seconds, bool watchesStore);
    // SIGTERM or SIGINT has come, without waiting.
    bool isEnded();

private:
    void watch();
    static bool drain(int descriptor);

    const std::filesystem::path state_;
    const std::filesystem::path configuration_;
    int storeEvents_ = -1;
    int configurationEvents_ = -1;
    int signals_ = -1;
    bool ended_ = false;
};

// Changes whenever a file of the configuration does.
std::string configurationSignature(const std::filesystem::path& directory);

} // namespace halyard::exporting
