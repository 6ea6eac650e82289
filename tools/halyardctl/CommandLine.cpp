#include "CommandLine.h"

#include <CLI/CLI.hpp>
#include <functional>
#include <string>

#include "commands/Commands.h"
#include "output/TimeArgument.h"
#include "output/Words.h"
#include "report/Report.h"

namespace halyard::ctl {
namespace {

// None for any other word.
std::optional<reading::GlitchKey> glitchKey(const std::string& name) {
    using reading::GlitchKey;
    return name == "app"      ? std::optional(GlitchKey::Application)
           : name == "device" ? std::optional(GlitchKey::Device)
           : name == "cause"  ? std::optional(GlitchKey::Cause)
           : name == "hour"   ? std::optional(GlitchKey::Hour)
                              : std::nullopt;
}

// None for any other word.
std::optional<Watched> watchedKind(const std::string& name) {
    return name == "messages"    ? std::optional(Watched::Messages)
           : name == "glitches"  ? std::optional(Watched::Glitches)
           : name == "events"    ? std::optional(Watched::Events)
           : name == "incidents" ? std::optional(Watched::Incidents)
                                 : std::nullopt;
}

// None for any other word.
std::optional<ConsentAction> consentAction(const std::string& name) {
    return name == "give"       ? std::optional(ConsentAction::Give)
           : name == "withdraw" ? std::optional(ConsentAction::Withdraw)
           : name == "show"     ? std::optional(ConsentAction::Show)
                                : std::nullopt;
}

// An option whose value goes by a printed name or by its number.
template <class Number>
CLI::Option* takeNumber(CLI::App* command, const char* name, Number& number,
                        std::optional<Number> (*read)(std::string_view), const char* what) {
    return command
        ->add_option_function<std::string>(
            name,
            [&number, name, read](const std::string& text) {
                const auto value = read(text);
                if (!value) {
                    throw CLI::ValidationError(name, "\"" + text + "\" is no name or number");
                }
                number = *value;
            },
            what)
        ->type_name("NAME|N");
}

class CommandLine {
public:
    explicit CommandLine(Context& context);

    Exit run(int count, const char* const* words);

private:
    CLI::App* add(const char* name, const char* what, std::function<Exit()> run);
    void addPlaces();
    // Commands that list rows of the store.
    void addLists();
    // Commands about files.
    void addFiles();
    void addConsent();
    void addExport();
    void addReport();
    void addWatch();
    // Commands about the store as a whole.
    void addCare();
    // Commands that report.
    void addSenders();
    void takeRange(CLI::App* command);
    void takeApplication(CLI::App* command);

    Context& context_;
    std::string ignored_; // by CLI11's check, which keeps what it stands for
    std::string by_;
    std::string file_;
    std::string watched_ = "messages";
    std::string consent_;
    std::string export_;
    bool repair_ = false;
    SendOptions send_{};
    SessionOptions session_{};
    ReportOptions report_{};
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
    addWatch();
    addSenders();
    addFiles();
    addCare();
    addConsent();
    addExport();
    addReport();
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
    command->add_option("--since", ignored_, "Nothing older: a time, today, yesterday, or 90m")
        ->type_name("TIME")
        ->check(CLI::Validator(take(context_.range.since), ""));
    command->add_option("--until", ignored_, "Nothing from then on")
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
    const auto list = [this](const char* name, const char* what, std::function<Exit()> run) {
        CLI::App* const command = add(name, what, std::move(run));
        takeRange(command);
        return command;
    };
    const auto table = [&](const char* name, const char* what, linux_::StoreTable of) {
        list(name, what, [this, of] { return runTable(context_, of); });
    };
    takeApplication(list("sessions", "What played and recorded, how long, and on what",
                         [this] { return runSessions(context_); }));
    takeApplication(
        list("messages", "Every message that was kept", [this] { return runMessages(context_); }));
    CLI::App* const glitches =
        list("glitches", "When sound was missing, for how long, on what, and why",
             [this] { return runGlitches(context_, glitchKey(by_)); });
    takeApplication(glitches);
    glitches->add_option("--by", by_, "Summed up by application, device, cause or hour")
        ->type_name("app|device|cause|hour")
        ->check([](const std::string& name) {
            return glitchKey(name) ? "" : "app, device, cause or hour";
        });
    table("events", "The analytics events", linux_::StoreTable::AnalyticsEvent);
    table("energy", "What was told to the energy ledger", linux_::StoreTable::EnergyEvent);
    table("incidents", "What was captured for analysis", linux_::StoreTable::Incident);
    table("metrics", "What was posted as a metric", linux_::StoreTable::Metric);
}

void CommandLine::addFiles() {
    CLI::App* const trace = add("trace", "What a trace measured: the durations in a results file",
                                [this] { return runTrace(context_, file_); });
    CLI::App* const timeline =
        add("timeline", "Sessions, glitches and volumes as trace events, for viewers",
            [this] { return runTimeline(context_, file_); });
    timeline->add_option("--output", file_, "The file to write")
        ->type_name("FILE.json")
        ->required();
    takeRange(timeline);
    takeApplication(timeline);
    trace->add_option("FILE", file_, "tracing_results.pbj of a trace")->required();
}

void CommandLine::addCare() {
    add("check", "Whether the store is sound", [this] { return runCheck(context_, repair_); })
        ->add_flag("--repair", repair_,
                   "Set a damaged store aside and save what can be read; without a daemon only");
    add("purge", "Removes everything that was collected", [this] { return runPurge(context_); });
}

void CommandLine::addExport() {
    CLI::App* const of = add("export", "How far the export is, or what would leave now", [this] {
        return export_ == "status" ? runExportStatus(context_) : runExportPreview(context_);
    });
    of->add_option("WHAT", export_, "status or preview")
        ->type_name("")
        ->required()
        ->check([](const std::string& name) {
            return name == "status" || name == "preview" ? "" : "status or preview";
        });
    of->add_option("--config", context_.configurationOption, "The daemon's configuration directory")
        ->type_name("DIR");
}

void CommandLine::addConsent() {
    CLI::App* const consent =
        add("consent", "Whether what is collected may leave the machine",
            [this] { return runConsent(context_, *consentAction(consent_)); });
    consent->add_option("ACTION", consent_, "give, withdraw or show")
        ->type_name("")
        ->required()
        ->check([](const std::string& name) {
            return consentAction(name) ? "" : "give, withdraw or show";
        });
    consent
        ->add_option("--config", context_.configurationOption,
                     "The daemon's configuration directory")
        ->type_name("DIR");
}

void CommandLine::addReport() {
    CLI::App* const report =
        add("report", "A page that shows how the sound did, to open in a browser", [this] {
            if (report_.output.empty() && !context_.json) {
                return fail({Exit::WrongUse, "report needs --output FILE.html, or --json"});
            }
            return runReport(context_, report_);
        });
    takeRange(report);
    takeApplication(report);
    report->add_option("--output", report_.output, "The page, which is written anew")
        ->type_name("FILE.html");
    report->add_option("--trace", report_.trace, "With the durations of this trace's results file")
        ->type_name("FILE");
}

void CommandLine::addWatch() {
    CLI::App* const watch = add("watch", "What comes into the store, as it comes",
                                [this] { return runWatch(context_, *watchedKind(watched_)); });
    takeApplication(watch);
    watch->add_option("KIND", watched_, "messages, glitches, events or incidents")
        ->type_name("")
        ->check([](const std::string& name) {
            return watchedKind(name) ? "" : "messages, glitches, events or incidents";
        });
}

void CommandLine::addSenders() {
    const auto takeFile = [](CLI::App* command, std::string& file, const char* what) {
        command->add_option("--json-file", file, what)->type_name("FILE|-");
    };
    CLI::App* const send =
        add("send", "Sends messages", [this] { return runSend(context_, send_); });
    send->add_option("--session", send_.sessions, "To this session, instead of all")
        ->type_name("ID")
        ->expected(1)
        ->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
    takeNumber(send, "--category", send_.category, categoryOf, "Of the messages")->required();
    takeNumber(send, "--type", send_.type, typeOf, "Of the messages")->required();
    takeFile(send, send_.file, "A dictionary a line; else standard input");
    CLI::App* const session = add("session", "Holds a session while it reads messages",
                                  [this] { return runSession(context_, session_); });
    takeNumber(session, "--service", session_.serviceType, serviceTypeOf, "What it reports for");
    session->add_option("--app", session_.application, "Its application")->type_name("NAME");
    takeFile(session, session_.file,
             "{\"category\": …, \"type\": …, \"message\": {…}} a line; else standard input");
}

Exit CommandLine::run(int count, const char* const* words) {
    try {
        app_.parse(count, words);
    } catch (const CLI::ParseError& error) {
        // Help and version come this way, too.
        return app_.exit(error) == 0 ? Exit::Done : Exit::WrongUse;
    }
    return chosen_ ? chosen_() : runOverview(context_);
}

} // namespace

Exit runCommandLine(Context& context, int count, const char* const* words) {
    return CommandLine(context).run(count, words);
}

} // namespace halyard::ctl
