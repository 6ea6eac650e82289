// What every command gets: where things are, what was asked of all commands, and
// where to write.
//
// Made by main; not thread-safe.
#pragma once

#include <filesystem>
#include <optional>
#include <string>

#include "output/Terminal.h"
#include "reading/StoreReader.h"
#include "reading/TimeRange.h"
#include "reading/Trouble.h"

namespace halyard::ctl {

using reading::Exit;
using reading::Outcome;
using reading::Trouble;

struct Context {
    Terminal& terminal;
    double now = 0; // seconds since 1970
    std::optional<std::string> stateOption{};
    std::optional<std::string> socketOption{};
    std::optional<std::string> configurationOption{};
    bool json = false;
    reading::TimeRange range{};
    std::string applicationPattern{}; // empty: all

    // As --state, --socket and --config say, or where the daemon of this user would have
    // them.
    Outcome<std::filesystem::path> stateDirectory() const;
    Outcome<std::filesystem::path> socketPath() const;
    // That of the system's daemon where --state names its state directory.
    Outcome<std::filesystem::path> configurationDirectory() const;
    Outcome<std::filesystem::path> storePath() const;
    Outcome<reading::StoreReader> openStore() const;

    bool wantsApplication(const std::optional<std::string>& application) const;
};

// Tells what went wrong; the status to end with.
Exit fail(const Trouble& trouble);
// Of a command that has written all it had.
Exit finish(Context& context, const Outcome<void>& read);

} // namespace halyard::ctl
