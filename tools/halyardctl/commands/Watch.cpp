// What comes into the store, as it comes.
#include <fmt/format.h>
#include <poll.h>

#include "commands/Commands.h"
#include "commands/GlitchWords.h"
#include "commands/MessageRows.h"
#include "commands/TableRows.h"
#include "common/HYReportingUtility.h"
#include "output/Sanitise.h"
#include "output/Words.h"
#include "reading/StoreFollower.h"

namespace halyard::ctl {
namespace {

using linux_::StoreTable;
using reading::Row;
using reading::StoreFollower;
using reading::StoreReader;

// Shows rows of one kind.
class Watcher {
public:
    Watcher(Context& context, Watched what)
        : context_(context), what_(what), json_(context.terminal.stream()) {}

    Outcome<StoreFollower> open() const {
        const auto path = context_.storePath();
        if (!path.ok()) {
            return path.failure();
        }
        const linux_::StoreTableSchema& table = storeSchema(tableOf(what_));
        const bool ofMessages = tableOf(what_) == StoreTable::UploadMessage;
        const std::string columns = ofMessages ? kMessageColumns : columnNames(table);
        return StoreFollower::open(path.value(), std::string(table.name), columns,
                                   what_ == Watched::Glitches
                                       ? fmt::format("type = {}", kAudioEventTypeIssueDetector)
                                       : "");
    }

    bool show(StoreReader& reader, const Row& row) {
        switch (what_) {
        case Watched::Messages:
        case Watched::Glitches: {
            reading::SessionDirectory directory(reader);
            const Message message = messageIn(row, directory, fields_);
            what_ == Watched::Messages ? showMessage(message) : showGlitch(message, row);
            break;
        }
        case Watched::Events:
        case Watched::Incidents:
            showRow(row);
            break;
        }
        return context_.terminal.goesOn();
    }

private:
    static StoreTable tableOf(Watched what) {
        switch (what) {
        case Watched::Events:
            return StoreTable::AnalyticsEvent;
        case Watched::Incidents:
            return StoreTable::Incident;
        default:
            return StoreTable::UploadMessage;
        }
    }

    void showMessage(const Message& message) {
        if (!context_.wantsApplication(message.names.application)) {
            return;
        }
        if (context_.json) {
            json_.beginDocument();
            writeMessage(json_, message);
            return json_.endDocument();
        }
        line(message.time, fmt::format("{}  {} {}  {}", message.names.application.value_or("-"),
                                       message.category, message.type, message.payload));
    }
    void showGlitch(const Message& message, const Row& row) {
        (void)fields_.parse(message.payload);
        constexpr int kCategory = 4;
        reading::Glitch glitch =
            glitchIn(fields_, static_cast<std::uint32_t>(row.integer(kCategory)), message.names);
        glitch.session = message.session;
        glitch.told = message.time.value_or(0);
        if (!context_.wantsApplication(glitch.application)) {
            return;
        }
        if (context_.json) {
            json_.beginDocument();
            writeGlitch(json_, glitch);
            return json_.endDocument();
        }
        context_.terminal.write(sentenceOf(context_.terminal, glitch, glitch.told) + "\n");
    }
    void showRow(const Row& row) {
        if (context_.json) {
            json_.beginDocument();
            writeRow(json_, tableOf(what_), row);
            return json_.endDocument();
        }
        line(row.maybeReal(3), fmt::format("{}  {}", row.text(1), row.text(2)));
    }
    void line(std::optional<double> time, const std::string& text) {
        std::string shown = time ? timeOfDay(*time) + "  " : "";
        shown += sanitised(text);
        const std::size_t width = context_.terminal.width();
        context_.terminal.write((width == 0 ? shown : shortened(shown, width)) + "\n");
    }

    Context& context_;
    const Watched what_;
    JsonStream json_;
    reading::JsonFields fields_;
};

// Waits a look's time. False when nobody reads the output any more.
bool waitForNextLook(std::FILE* output) {
    pollfd reader{::fileno(output), 0, 0};
    return ::poll(&reader, 1, StoreFollower::kMilliseconds) <= 0;
}

} // namespace

Exit runWatch(Context& context, Watched what) {
    Watcher watcher(context, what);
    auto follower = watcher.open();
    if (!follower.ok()) {
        return fail(follower.failure());
    }
    Outcome<void> looked;
    do {
        looked = follower.value().look(
            [&](StoreReader& reader, const Row& row) { return watcher.show(reader, row); });
    } while (looked.ok() && context.terminal.flush() && waitForNextLook(context.terminal.stream()));
    return finish(context, looked);
}

} // namespace halyard::ctl
