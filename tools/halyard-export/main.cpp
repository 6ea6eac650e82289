// halyard-export: sends what halyardd's store holds to a receiver, if the device's owner
// agreed.

#include <CLI/CLI.hpp>
#include <chrono>
#include <cstdio>
#include <exception>
#include <fmt/core.h>
#include <memory>
#include <optional>
#include <random>
#include <string>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include "Exporter.h"
#include "Places.h"
#include "Plans.h"
#include "PrintingReceiver.h"
#include "Wait.h"
#include "linux/config/Configuration.h"
#include "linux/system/LogWriter.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "send/HttpReceiver.h"

namespace {

using namespace halyard;
using namespace halyard::exporting;

struct Arguments {
    std::optional<std::string> state;
    bool once = false;
    bool dryRun = false;
};

enum Status : int { kDone = 0, kLeft = 1, kWrongUse = 2 };

double now() {
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch())
        .count();
}

double chance() {
    static std::mt19937_64 engine{std::random_device()()};
    return std::uniform_real_distribution<double>(0, 1)(engine);
}

// What is settled, read again whenever a file of it changes.
class Settled {
public:
    explicit Settled(const std::filesystem::path& directory)
        : directory_(directory), configuration_(directory) {}

    // False: nothing changed.
    bool refresh() {
        const std::string signature = configurationSignature(directory_);
        if (signature == signature_) {
            return false;
        }
        signature_ = signature;
        // Whether consent still holds cannot be told from a file that cannot be read.
        isGood_ = configuration_.reload() != linux_::Configuration::Outcome::Refused;
        return true;
    }
    // While a request is under way: what refresh() would find.
    bool hasChanged() const { return configurationSignature(directory_) != signature_; }

    // Nothing is sent where something about it is wrong.
    Exporter::Plan plan() const {
        std::string trouble;
        Exporter::Plan plan =
            planFor(*configuration_.settings(), linux_::processEnvironment, trouble);
        if (!trouble.empty()) {
            HY_LOG_ERROR(HYReportingPlatformCategory, "{}", trouble);
        }
        plan.options.consent = plan.options.consent && isGood_;
        return plan;
    }
    const linux_::Configuration& configuration() const { return configuration_; }

private:
    const std::filesystem::path directory_;
    linux_::Configuration configuration_;
    std::string signature_ = "never read";
    bool isGood_ = true;
};

int complain(const Failure& failure) {
    fmt::print(stderr, "halyard-export: {}\n", failure.message());
    return kLeft;
}

int dryRun(const Places& places) {
    Settled settled(places.configuration);
    settled.refresh();
    auto plan = planToShow(*settled.configuration().settings(), linux_::processEnvironment);
    auto place = ExportPlace::inMemory(places.own / ExportPlace::kFileName, now());
    if (!plan.ok() || !place.ok()) {
        return complain(plan.ok() ? place.failure() : plan.failure());
    }
    if (plan.value().ignoresConsent) {
        fmt::print(stderr, "halyard-export: there is no consent, so nothing leaves; this would if "
                           "everything had been agreed to\n");
    }
    PrintingReceiver printer(stdout);
    plan.value().receiver = &printer;
    Exporter exporter(places.store / reading::StoreReader::kFileName, std::move(place.value()),
                      {now, chance, [] { return true; }});
    exporter.follow(std::move(plan.value()));
    Exporter::Step step;
    do {
        step = exporter.step();
    } while (step.hasMore && printer.isGood());
    return printer.isGood() && !step.isLeft ? kDone : kLeft;
}

// Sends until it is told to end, or, once, until there is nothing more.
int run(const Places& places, bool once) {
    Wait wait(places.store, places.configuration);
    Settled settled(places.configuration);
    (void)::mkdir(places.own.c_str(), 0700);
    auto place = ExportPlace::open(places.own / ExportPlace::kFileName, now());
    if (!place.ok()) {
        return complain(place.failure());
    }
    const auto mayGoOn = [&] { return !wait.isEnded() && !settled.hasChanged(); };
    Exporter exporter(places.store / reading::StoreReader::kFileName, std::move(place.value()),
                      {now, chance, mayGoOn});
    std::unique_ptr<HttpReceiver> receiver;
    std::chrono::milliseconds delay{0};
    bool canSend = false;
    double due = 0; // when to look at the store
    while (!wait.isEnded()) {
        if (settled.refresh()) {
            Exporter::Plan plan = settled.plan();
            delay = plan.options.delay;
            canSend = plan.options.consent && plan.options.isAnythingSent();
            receiver = std::make_unique<HttpReceiver>(plan.options, mayGoOn);
            plan.receiver = receiver.get();
            exporter.follow(std::move(plan));
            due = 0;
        }
        if (now() >= due) {
            const Exporter::Step step = exporter.step();
            if (once && !step.hasMore) {
                return step.isLeft || !canSend ? kLeft : kDone;
            }
            due = step.hasMore ? 0 : step.next;
        }
        const double sleep = due - now();
        if (sleep > 0) {
            const bool isNews =
                wait.until(sleep, due > now() + std::chrono::duration<double>(delay).count())
                    .byStore;
            due =
                isNews ? std::min(due, now() + std::chrono::duration<double>(delay).count()) : due;
        }
    }
    return kDone;
}

Arguments parse(int count, char** words, int& status) {
    Arguments arguments;
    CLI::App app("Sends what halyardd's store holds to a receiver of the OpenTelemetry protocol.\n"
                 "Nothing leaves before the device's owner agreed: [export] in halyard.toml.",
                 "halyard-export");
    app.set_version_flag("--version", "halyard-export " HALYARD_VERSION);
    app.add_option("--state", arguments.state, "The daemon's state directory")->type_name("DIR");
    auto* const once = app.add_flag("--once", arguments.once, "Send what is there, and end");
    app.add_flag("--dry-run", arguments.dryRun,
                 "Print what would leave, as JSON, one request a line; connect nowhere")
        ->excludes(once);
    try {
        app.parse(count, words);
    } catch (const CLI::ParseError& error) {
        status = app.exit(error) == 0 ? kDone : kWrongUse;
    }
    return arguments;
}

} // namespace

int main(int count, char** words) {
    int status = -1;
    const Arguments arguments = parse(count, words, status);
    if (status >= 0) {
        return status;
    }
    // Made for itself alone, and never written to a file by a crash: it holds keys.
    (void)::umask(077);
    const rlimit none{0, 0};
    (void)::setrlimit(RLIMIT_CORE, &none);
    const auto places = placesOf(arguments.state, linux_::processEnvironment, ::geteuid());
    if (!places.ok()) {
        return complain(places.failure());
    }
    linux_::LogWriter log(linux_::LogWriter::defaultOutput());
    platform::Platform platform;
    platform.log = &log;
    platform::install(&platform);
    const int ended =
        arguments.dryRun ? dryRun(places.value()) : run(places.value(), arguments.once);
    platform::install(nullptr);
    return ended;
}
