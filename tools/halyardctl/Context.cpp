#include "Context.h"

#include <fmt/format.h>
#include <fnmatch.h>
#include <unistd.h>

#include "linux/system/Directories.h"

namespace halyard::ctl {
namespace {

namespace fs = std::filesystem;

Outcome<fs::path> ofThisUser(fs::path linux_::Directories::*which, const char* option) {
    auto resolved = linux_::resolveDirectory(which, linux_::processEnvironment, ::getuid());
    if (!resolved.ok()) {
        return Trouble(Exit::NothingThere,
                       fmt::format("{}; name it with {}", resolved.failure().message(), option));
    }
    return std::move(resolved).value();
}

} // namespace

Outcome<fs::path> Context::stateDirectory() const {
    if (stateOption) {
        return fs::path(*stateOption);
    }
    return ofThisUser(&linux_::Directories::state, "--state");
}

Outcome<fs::path> Context::socketPath() const {
    if (socketOption) {
        return fs::path(*socketOption);
    }
    auto directory = ofThisUser(&linux_::Directories::runtime, "--socket");
    return directory.ok() ? Outcome<fs::path>(directory.value() / "reporting.sock") : directory;
}

Outcome<fs::path> Context::configurationDirectory() const {
    using linux_::Directories;
    if (configurationOption) {
        return fs::path(*configurationOption);
    }
    const auto unset = [](std::string_view) { return std::optional<std::string>(); };
    const auto system = linux_::resolveDirectories(unset, 0);
    if (stateOption && system.ok() &&
        fs::path(*stateOption).lexically_normal() == system.value().state) {
        return system.value().configuration;
    }
    return ofThisUser(&Directories::configuration, "--config");
}

Outcome<fs::path> Context::storePath() const {
    auto directory = stateDirectory();
    return directory.ok() ? Outcome<fs::path>(directory.value() / reading::StoreReader::kFileName)
                          : directory;
}

Outcome<reading::StoreReader> Context::openStore() const {
    const auto path = storePath();
    if (!path.ok()) {
        return path.failure();
    }
    auto reader = reading::StoreReader::open(path.value());
    if (reader.ok() && reader.value().isLogMissing()) {
        complain(fmt::format("{} has a write-ahead log that cannot be read here: its last rows are "
                             "missing",
                             path.value().native()));
    }
    return reader;
}

bool Context::wantsApplication(const std::optional<std::string>& application) const {
    return applicationPattern.empty() ||
           (application && ::fnmatch(applicationPattern.c_str(), application->c_str(), 0) == 0);
}

Exit fail(const Trouble& trouble) {
    complain(trouble.message());
    return trouble.exit;
}

Exit finish(Context& context, const Outcome<void>& read) {
    const bool written = context.terminal.flush();
    if (!read.ok()) {
        return fail(read.failure());
    }
    if (const std::string why = context.terminal.complaint(); !written && !why.empty()) {
        complain(why);
        return Exit::Failed;
    }
    return Exit::Done;
}

} // namespace halyard::ctl
