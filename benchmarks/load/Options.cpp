#include "load/Options.h"

#include <charconv>
#include <cstdio>
#include <stdexcept>
#include <string_view>

namespace halyard::load {
namespace {

constexpr const char* kHelp =
    R"(usage: halyard-load [OPTION]... HALYARDD

Starts HALYARDD in private directories, loads it, and prints what a message
costs it, next to the floor: a process that appends the same bytes to a file.

  --messages=N      messages per round and mode (200000)
  --clients=N       connections that send at once, 1 to 5 (4)
  --repeats=PERCENT share that repeats its predecessor, so is dropped (0)
  --in-flight=N     requests a client sends ahead of their answers (64)
  --rounds=N        rounds per mode; the medians are printed (3)
  --connections=N   idle connections for the memory figure (1000)
  --sessions=N      idle sessions for the memory figure (10000)
  --hold=SECONDS    hold a load this long and watch the memory (0: do not)
  --paced=SECONDS   send requests evenly for this long, each awaited (0: do not)
  --rate=N          messages per second of the held and of the paced load (2000)
  --churn=N         create, start, stop and destroy N sessions, one after the
                    other and all together (0: do not)
  --sync-interval=T how often the daemon's store syncs, such as 5s (its default)
  --log-level=LEVEL level of the daemon's log, which goes to a file (info)
  --directory=DIR   where the private directories are made (/var/tmp)
  --timeout=SECONDS longest wait for one answer (120)
  --only=WHAT       throughput, memory or rest: what the options above ask for
  --mode=NAME       throughput of this mode alone, as the table names it
  --json            print JSON
)";

struct NumberOption {
    std::string_view name;
    std::uint32_t Options::*field;
    std::uint32_t least;
    std::uint32_t most;
};

constexpr NumberOption kNumbers[] = {
    {"--messages", &Options::messages, 100, 2000000},
    {"--clients", &Options::clients, 1, 5},
    {"--repeats", &Options::repeats, 0, 99},
    {"--in-flight", &Options::inFlight, 1, 1024},
    {"--rounds", &Options::rounds, 1, 99},
    {"--connections", &Options::connections, 1, 10000},
    {"--sessions", &Options::sessions, 1, 100000},
    {"--hold", &Options::holdSeconds, 0, 3600},
    {"--paced", &Options::pacedSeconds, 0, 3600},
    {"--rate", &Options::rate, 1, 100000},
    {"--churn", &Options::churn, 0, 100000},
    {"--timeout", &Options::timeoutSeconds, 1, 3600},
};

[[noreturn]] void refuse(std::string_view argument, const std::string& why) {
    throw std::runtime_error(std::string(argument) + ": " + why + " (see --help)");
}

bool setNumber(Options& options, std::string_view name, std::string_view text) {
    for (const NumberOption& option : kNumbers) {
        if (option.name != name) {
            continue;
        }
        std::uint32_t number = 0;
        const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
        if (error != std::errc{} || end != text.data() + text.size() || number < option.least ||
            number > option.most) {
            refuse(name, "wants a number from " + std::to_string(option.least) + " to " +
                             std::to_string(option.most));
        }
        options.*option.field = number;
        return true;
    }
    return false;
}

bool setText(Options& options, std::string_view name, std::string_view text) {
    if (name == "--log-level") {
        options.logLevel = text;
    } else if (name == "--directory") {
        options.directory = text;
    } else if (name == "--sync-interval") {
        options.syncInterval = text;
    } else if (name == "--mode") {
        options.mode = text;
        options.memory = false;
    } else if (name == "--only" && (text == "throughput" || text == "memory" || text == "rest")) {
        options.throughput = text == "throughput";
        options.memory = text == "memory";
    } else {
        return false;
    }
    return true;
}

void setOption(Options& options, std::string_view argument) {
    const std::size_t equals = argument.find('=');
    if (argument == "--json") {
        options.json = true;
    } else if (equals == std::string_view::npos) {
        refuse(argument, "unknown, or without a value");
    } else {
        const std::string_view name = argument.substr(0, equals);
        const std::string_view text = argument.substr(equals + 1);
        if (!setNumber(options, name, text) && !setText(options, name, text)) {
            refuse(argument, "unknown option or value");
        }
    }
}

} // namespace

std::optional<Options> parseOptions(int count, const char* const* arguments) {
    Options options;
    for (int i = 1; i < count; ++i) {
        const std::string_view argument = arguments[i];
        if (argument == "--help") {
            std::fputs(kHelp, stdout);
            return std::nullopt;
        }
        if (argument.starts_with("-")) {
            setOption(options, argument);
        } else if (options.daemon.empty()) {
            options.daemon = argument;
        } else {
            refuse(argument, "one daemon only");
        }
    }
    if (options.daemon.empty()) {
        refuse("HALYARDD", "missing");
    }
    return options;
}

} // namespace halyard::load
