// glitch_player: plays or records silence, and gets into trouble when told to, so
// that tests know which cycles were missed, and why.

#include <cstdio>
#include <cstdlib>
#include <exception>
#include <getopt.h>
#include <string>

#include "Player.h"

namespace {

using namespace halyard::glitching;

constexpr const char* kUsage =
    R"(Usage: glitch_player [OPTION]...
Plays silence on PipeWire and obeys commands, one a line, on its standard input.

  --name=TEXT        application.name, also node.name (glitch_player)
  --target=NODE      target.object
  --role=ROLE        media.role (Music)
  --latency=N/RATE   node.latency (1024/48000)
  --property=KEY=VALUE
  --capture          record
  --filter           be what a JACK client is: runs at once, linked by others
  --ordinary         have no thread of a real-time class
  --streams=N        that many streams of one connection
  --paused           start without running

Its first line says {"pid", "tid" of the data thread (0 while paused), "node" of the
first stream}, then each command is answered with a line when it is done: {"done",
and the clocks before and after in ns}. In its process callback it can
  burn MS [CYCLES]   use the processor
  sleep MS [CYCLES]  wait for time
  fault MS [CYCLES]  wait for a page of a slow disk (a major fault); for who may mount
and beside it: pause, resume, quantum FRAMES (node.force-quantum), stop (as end of
input), exit N, die (SIGKILL), abort.
)";

struct Arguments {
    Player::Options player;
    int exitStatus = -1; // set: nothing to run
};

void setProperty(Voice::Options& voice, const std::string& assignment) {
    const auto middle = assignment.find('=');
    voice.properties[assignment.substr(0, middle)] =
        middle == std::string::npos ? "" : assignment.substr(middle + 1);
}

constexpr option kOptions[] = {
    {"name", required_argument, nullptr, 'n'},     {"target", required_argument, nullptr, 't'},
    {"role", required_argument, nullptr, 'r'},     {"latency", required_argument, nullptr, 'l'},
    {"property", required_argument, nullptr, 'P'}, {"capture", no_argument, nullptr, 'c'},
    {"filter", no_argument, nullptr, 'f'},         {"streams", required_argument, nullptr, 's'},
    {"paused", no_argument, nullptr, 'p'},         {"ordinary", no_argument, nullptr, 'o'},
    {"help", no_argument, nullptr, 'h'},           {}};

// False for what is none of the streams' own.
bool describesStreams(Voice::Options& voice, int option, const char* value) {
    switch (option) {
    case 't':
        voice.properties["target.object"] = value;
        return true;
    case 'r':
        voice.properties["media.role"] = value;
        return true;
    case 'l':
        voice.properties["node.latency"] = value;
        return true;
    case 'P':
        setProperty(voice, value);
        return true;
    case 'c':
        return voice.capture = true;
    case 'f':
        return voice.filter = true;
    case 'p':
        return voice.paused = true;
    default:
        return false;
    }
}

Arguments parse(int argc, char** argv) {
    Arguments arguments;
    Player::Options& player = arguments.player;
    player.voice.properties = {{"media.role", "Music"}, {"node.latency", "1024/48000"}};
    for (int found = 0; (found = getopt_long(argc, argv, "", kOptions, nullptr)) != -1;) {
        if (describesStreams(player.voice, found, optarg)) {
            continue;
        }
        switch (found) {
        case 'n':
            player.name = optarg;
            break;
        case 's':
            player.streams = std::atoi(optarg);
            break;
        case 'o':
            player.ordinary = true;
            break;
        case 'h':
            std::fputs(kUsage, stdout);
            arguments.exitStatus = EXIT_SUCCESS;
            return arguments;
        default:
            arguments.exitStatus = 2;
            return arguments;
        }
    }
    return arguments;
}

} // namespace

int main(int argc, char** argv) {
    const Arguments arguments = parse(argc, argv);
    if (arguments.exitStatus != -1) {
        return arguments.exitStatus;
    }
    try {
        return Player(arguments.player).run();
    } catch (const std::exception& error) {
        std::fprintf(stderr, "glitch_player: %s\n", error.what());
        return EXIT_FAILURE;
    }
}
