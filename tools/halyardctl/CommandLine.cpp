#include "CommandLine.h"

#include <CLI/CLI.hpp>
#include <functional>
#include <string>

#include "commands/Commands.h"
#include "output/TimeArgument.h"

namespace halyard::ctl {
namespace {

class CommandLine {
public:
    explicit CommandLine(Context& context);

    Exit run(int count, const char* const* words);

private:
    CLI::App* add(const char* name, const char* what, std::function<Exit()> run);
    void addPlaces();
    // Commands that list rows of the store.
    void addLists();
    void takeRange(CLI::App* command);
    void takeApplication(CLI::App* command);

    Context& context_;
    CLI::App app_{"How the sound of this device is doing, and what halyardd knows of it."};
    std::function<Exit()> chosen_;
};

CommandLine::CommandLine(Context& context) : context_(context) {
    app_.name("halyardctl");
    app_.require_subcommand(0, 1);
    app_.set_version_flag("--version", "halyardctl " HALYARD_VERSION);
    addPlaces();
    add("status", "What the daemon says of itself", [this] { return runStatus(context_); });
    addLists();
}

CLI::App* CommandLine::add(const char* name, const char* what, std::function<Exit()> run) {
    CLI::App* const command = app_.add_subcommand(name, what);
    command->fallthrough(); // Options of all commands may stand behind it, too.
    command->callback([this, run = std::move(run)] { chosen_ = run; });
    return command;
}

void CommandLine::addPlaces() {
    app_.add_option("--state", context_.stateOption, "The daemon's state directory")
        ->type_name("DIR");
    app_.add_option("--socket", context_.socketOption, "The daemon's socket")->type_name("PATH");
    app_.add_flag("--json", context_.json, "For programs: JSON instead of text");
}

void CommandLine::takeRange(CLI::App* command) {
    const auto take = [this](double& bound) {
        return [this, &bound](const std::string& text) {
            const auto time = timeArgument(text, context_.now);
            bound = time.value_or(bound);
            return time ? std::string()
                        : "\"" + text +
                              "\" is no time: say 2026-11-22T14:00:00Z, today, "
                              "yesterday, or how long ago, like 90m";
        };
    };
    static std::string ignored;
    command->add_option("--since", ignored, "Nothing older: a time, today, yesterday, or 90m")
        ->type_name("TIME")
        ->check(CLI::Validator(take(context_.range.since), ""));
    command->add_option("--until", ignored, "Nothing from then on")
        ->type_name("TIME")
        ->check(CLI::Validator(take(context_.range.until), ""));
}

void CommandLine::takeApplication(CLI::App* command) {
    command
        ->add_option("--app", context_.applicationPattern,
                     "Only applications whose name fits this shell pattern")
        ->type_name("PATTERN");
}

void CommandLine::addLists() {
    for (CLI::App* const command :
         {add("sessions", "What played and recorded", [this] { return runSessions(context_); }),
          add("messages", "Every message that was kept",
              [this] { return runMessages(context_); })}) {
        takeRange(command);
        takeApplication(command);
    }
}

Exit CommandLine::run(int count, const char* const* words) {
    try {
        app_.parse(count, words);
    } catch (const CLI::ParseError& error) {
        // Help and version come this way, too.
        return app_.exit(error) == 0 ? Exit::Done : Exit::WrongUse;
    }
    return chosen_ ? chosen_() : Exit::WrongUse;
}

} // namespace

Exit runCommandLine(Context& context, int count, const char* const* words) {
    return CommandLine(context).run(count, words);
}

} // namespace halyard::ctl
