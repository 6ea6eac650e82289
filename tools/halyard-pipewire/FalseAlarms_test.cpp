// What people and programs do with streams all day is no glitch. For real; skipped
// where PipeWire is not installed.
//
// For minutes, and a table of what was told:
//   HALYARD_MINUTES=10 test_false_alarms --gtest_also_run_disabled_tests
//     --gtest_filter='*ForMinutes'

#include <cstdlib>
#include <fmt/core.h>
#include <functional>
#include <gtest/gtest.h>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "GlitchWatchTesting.h"

namespace halyard::pipewire {
namespace {

using namespace std::chrono_literals;
using testing::GlitchPlayer;

double realNow() {
    return static_cast<double>(monotonicNow() + realTimeOffset()) / 1e9;
}

class FalseAlarmsTest : public ::testing::Test {
protected:
    struct Action {
        std::string name;
        std::function<void()> act;
    };
    struct Window {
        std::string name;
        double from = 0;
        double to = 0;
    };
    struct Row {
        int times = 0;
        double seconds = 0;
        std::map<std::string, int> told; // by cause
    };

    void SetUp() override {
        if (!testing::PrivatePipeWire::installed()) {
            GTEST_SKIP() << "pipewire, wireplumber, pw-play and wpctl are not installed";
        }
        server_.start();
        // The header says that there is more; players stop where the file does.
        server_.run({"sh", "-c", "head -c 48044 $0/silence.wav >$0/short.wav", server_.folder()});
        graph_ = std::make_unique<WatchedGraph>();
        steady_ = player("steady");
        ASSERT_TRUE(graph_->untilWatched("steady"));
    }

    static std::unique_ptr<GlitchPlayer> player(const std::string& name,
                                                const std::string& target = "out.speaker") {
        return std::make_unique<GlitchPlayer>(
            std::vector<std::string>{"--target=" + target, "--name=" + name});
    }
    // A program runs while the graph is watched.
    void run(const std::vector<std::string>& arguments) {
        server_.run(arguments);
        graph_->pass(100ms);
    }
    void setting(const std::string& name, const std::string& value) {
        run({"pw-metadata", "-n", "settings", "0", name, value});
    }
    void move(const std::string& device) {
        run({"pw-metadata", graph_->idOf("steady"), "target.object", graph_->serialOf(device),
             "Spa:Id"});
    }
    // For a moment, beside the steady one.
    void another(const std::string& ending, const std::vector<std::string>& options) {
        GlitchPlayer second(options);
        graph_->pass(200ms);
        graph_->command(second, ending);
        second.process().wait();
    }

    std::vector<Action> actions() {
        const auto tool = [this](std::vector<std::string> arguments) {
            return [this, arguments = std::move(arguments)] { run(arguments); };
        };
        const std::vector<std::string> second{"--target=out.speaker", "--name=second"};
        return {
            {"a second stream starts and stops", [=, this] { another("stop", second); }},
            {"a second program just exits", [=, this] { another("exit 0", second); }},
            {"a short sound plays to its end",
             tool({"pw-play", "--target=out.speaker", server_.folder() / "short.wav"})},
            {"a stream starts on the other device",
             [this] {
                 another("stop", {"--target=out.headphones", "--name=second"});
             }},
            {"a recorder of the microphone starts and stops",
             [this] {
                 another("stop", {"--capture", "--target=in.microphone"});
             }},
            {"a recorder of what plays starts and stops",
             [this] {
                 another("stop", {"--capture", "--target=out.speaker",
                                  "--property=stream.capture.sink=true", "--name=monitor"});
             }},
            {"pause and resume",
             [this] {
                 graph_->command(*steady_, "pause");
                 graph_->pass(200ms);
                 graph_->command(*steady_, "resume");
             }},
            {"pause, and resume at once",
             [this] {
                 graph_->command(*steady_, "pause");
                 graph_->command(*steady_, "resume");
             }},
            {"pause, the device is suspended, resume",
             [this] {
                 graph_->command(*steady_, "pause");
                 run({"pw-cli", "send-command", graph_->idOf("out.speaker"), "Suspend", "{}"});
                 graph_->command(*steady_, "resume");
             }},
            {"to the other device", [this] { move("out.headphones"); }},
            {"and back", [this] { move("out.speaker"); }},
            {"mute", tool({"wpctl", "set-mute", graph_->idOf("steady"), "1"})},
            {"unmute", tool({"wpctl", "set-mute", graph_->idOf("steady"), "0"})},
            {"volume", tool({"wpctl", "set-volume", graph_->idOf("out.speaker"), "0.5"})},
            {"2,048 frames are forced", [this] { setting("clock.force-quantum", "2048"); }},
            {"512 frames are forced", [this] { setting("clock.force-quantum", "512"); }},
            {"no more", [this] { setting("clock.force-quantum", "0"); }},
            {"44,100 Hz are forced", [this] { setting("clock.force-rate", "44100"); }},
            {"no more", [this] { setting("clock.force-rate", "0"); }},
            {"another bridge comes and goes", [] { WatchedGraph().closeAll(); }},
        };
    }

    Window perform(const Action& action) {
        Window window{.name = action.name, .from = realNow()};
        action.act();
        graph_->pass(300ms);
        window.to = realNow();
        return window;
    }

    // Adds what was told since the last call to the rows of the windows.
    std::set<std::string> account(const std::vector<Window>& windows) {
        EXPECT_TRUE(graph_->untilSeenNow());
        std::set<std::string> loud;
        for (const Window& window : windows) {
            Row& row = rows_[window.name];
            ++row.times;
            row.seconds += window.to - window.from;
        }
        for (; accounted_ < graph_->glitches().size(); ++accounted_) {
            const ToldGlitch& glitch = graph_->glitches()[accounted_];
            std::string name = "between";
            for (const Window& window : windows) {
                name = glitch.start() >= window.from ? window.name : name;
            }
            ++rows_[name].told[glitch.cause()];
            loud.insert(name);
        }
        return loud;
    }

    testing::PrivatePipeWire server_;
    std::unique_ptr<WatchedGraph> graph_;
    std::unique_ptr<GlitchPlayer> steady_;
    std::map<std::string, Row> rows_;
    std::size_t accounted_ = 0;
};

// What is told each of three times comes of what was done, and not of what else runs
// on the machine.
TEST_F(FalseAlarmsTest, WhatPeopleDoIsNoGlitch) {
    std::vector<Action> left = actions();
    for (int attempt = 0; attempt < 3 && !left.empty(); ++attempt) {
        std::vector<Window> windows;
        for (const Action& action : left) {
            windows.push_back(perform(action));
        }
        const auto loud = account(windows);
        std::erase_if(left, [&](const Action& action) { return !loud.contains(action.name); });
    }
    for (const Action& action : left) {
        ADD_FAILURE() << action.name << '\n' << graph_->notes();
    }
}

TEST_F(FalseAlarmsTest, AServerThatEndsMakesNoGlitch) {
    int told = 1;
    for (int attempt = 0; attempt < 3 && told != 0; ++attempt) {
        const auto before = graph_->glitches().size();
        server_.stop();
        ASSERT_TRUE(graph_->until([this] { return graph_->closed("steady"); }));
        told = static_cast<int>(graph_->glitches().size() - before);
        steady_.reset();
        server_.start();
        graph_ = std::make_unique<WatchedGraph>();
        steady_ = player("steady");
        ASSERT_TRUE(graph_->untilWatched("steady"));
    }
    EXPECT_EQ(told, 0);
}

TEST_F(FalseAlarmsTest, DISABLED_ForMinutes) {
    const char* const minutes = std::getenv("HALYARD_MINUTES");
    const double end = realNow() + 60 * (minutes != nullptr ? std::atof(minutes) : 1);
    const std::vector<Action> all = actions();
    while (realNow() < end) {
        std::vector<Window> windows;
        for (const Action& action : all) {
            windows.push_back(perform(action));
        }
        account(windows);
    }
    fmt::print("| what | times | seconds | episodes told |\n|---|---|---|---|\n");
    for (const auto& [name, row] : rows_) {
        std::string told;
        for (const auto& [cause, count] : row.told) {
            told += fmt::format("{}{} {}", told.empty() ? "" : ", ", count, cause);
        }
        fmt::print("| {} | {} | {:.0f} | {} |\n", name, row.times, row.seconds,
                   told.empty() ? "0" : told);
    }
}

} // namespace
} // namespace halyard::pipewire
