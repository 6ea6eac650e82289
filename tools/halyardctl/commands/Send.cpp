// Messages from the command line, into sessions that there are or one of their own.
#include <array>
#include <fmt/format.h>
#include <sys/random.h>

#include "commands/Commands.h"
#include "daemon/DaemonClient.h"
#include "daemon/Lines.h"
#include "daemon/Stamps.h"
#include "output/JsonStream.h"
#include "output/Words.h"

namespace halyard::ctl {
namespace {

using protocol::Arguments;
using protocol::Method;

// Takes each line's message to the daemon. What is wrong with a line is told, and the
// next one is looked at; only without the daemon there is no going on.
class Sender {
public:
    // What a line holds, where it goes and as what; none when it is no such line.
    using Read = std::function<std::optional<Arguments>(const Dictionary&)>;

    Sender(DaemonClient& daemon, Lines& lines) : daemon_(daemon), lines_(lines) {}

    Outcome<void> run(std::string_view expected, const Read& read) {
        while (const auto line = lines_.next()) {
            const auto dictionary = dictionaryIn(*line);
            auto arguments = dictionary ? read(*dictionary) : std::nullopt;
            if (!arguments) {
                tell(expected);
                continue;
            }
            addStamps(arguments->dictionary);
            const auto answer = daemon_.call(Method::SendMessage, *arguments);
            if (answer.ok()) {
                ++sent_;
            } else if (daemon_.isLost()) {
                return answer.failure();
            } else {
                tell(answer.failure().text);
            }
        }
        return {};
    }
    std::uint64_t sent() const { return sent_; }
    Exit exit() const { return anyWrong_ ? Exit::Failed : Exit::Done; }

private:
    void tell(std::string_view what) {
        anyWrong_ = true;
        complain(fmt::format("line {}: {}", lines_.number(), what));
    }

    DaemonClient& daemon_;
    Lines& lines_;
    std::uint64_t sent_ = 0;
    bool anyWrong_ = false;
};

struct Ends {
    DaemonClient daemon;
    Lines lines;
};

Outcome<Ends> openEnds(const Context& context, const std::string& file) {
    const auto socket = context.socketPath();
    if (!socket.ok()) {
        return socket.failure();
    }
    auto lines = Lines::open(file);
    if (!lines.ok()) {
        return lines.failure();
    }
    auto daemon = DaemonClient::connect(socket.value());
    if (!daemon.ok()) {
        return daemon.failure();
    }
    return Ends{std::move(daemon).value(), std::move(lines).value()};
}

Exit tellSent(Context& context, std::optional<std::int64_t> session, const Sender& sender,
              const Outcome<void>& done) {
    if (context.json) {
        JsonStream json(context.terminal.stream());
        json.beginDocument();
        json.beginObject();
        if (session) {
            json.field("session_id", session);
        }
        json.countField("sent", sender.sent());
        json.endObject();
        json.endDocument();
    } else {
        context.terminal.write(fmt::format("{} sent{}\n",
                                           counted(sender.sent(), "message", "messages"),
                                           session ? fmt::format(" in session {}", *session) : ""));
    }
    const Exit ended = finish(context, done);
    return ended == Exit::Done ? sender.exit() : ended;
}

std::int64_t randomID() {
    std::uint64_t id = 0;
    while (id == 0) {
        if (::getrandom(&id, sizeof id, 0) != static_cast<ssize_t>(sizeof id)) {
            id = 1;
        }
        id &= 0x7FFFFFFFFFFFFFFFU;
    }
    return static_cast<std::int64_t>(id);
}

// By name or by number.
template <class Number>
std::optional<Number> numberIn(const Value& value,
                               std::optional<Number> (*named)(std::string_view)) {
    if (value.isString()) {
        return named(value.text());
    }
    const bool fits = value.isInteger() && value.integerValue() >= 0 &&
                      value.unsignedValue() <= std::numeric_limits<Number>::max();
    return fits ? std::optional(static_cast<Number>(value.unsignedValue())) : std::nullopt;
}

std::optional<Arguments> argumentsIn(const Dictionary& line, std::int64_t session) {
    const auto category = numberIn(line["category"], categoryOf);
    const auto type = numberIn(line["type"], typeOf);
    if (!category || !type || !line["message"].isDictionary()) {
        return std::nullopt;
    }
    Arguments arguments;
    arguments.dictionary = line["message"].dictionary();
    arguments.category = *category;
    arguments.type = *type;
    arguments.reporterIDs = {{session}};
    return arguments;
}

Outcome<void> openSession(DaemonClient& daemon, const SessionOptions& options, std::int64_t id) {
    Arguments arguments;
    arguments.reporterID = id;
    arguments.serviceType = options.serviceType;
    std::vector<Method> methods = {Method::CreateReportingSession, Method::SetServiceType};
    if (options.application) {
        arguments.dictionary.set("HostApplicationDisplayID", *options.application);
        methods.push_back(Method::SetConfiguration);
    }
    for (const Method method : methods) {
        if (const auto answer = daemon.call(method, arguments); !answer.ok()) {
            return answer.failure();
        }
    }
    // Answered when the session stops.
    return daemon.start(Method::StartReportingSessionForID, arguments);
}

Outcome<void> closeSession(DaemonClient& daemon, std::int64_t id) {
    Arguments arguments;
    arguments.reporterID = id;
    for (const Method method :
         {Method::StopReportingSessionForID, Method::DestroyReportingSession}) {
        if (const auto answer = daemon.call(method, arguments); !answer.ok()) {
            return answer.failure();
        }
    }
    return {};
}

} // namespace

Exit runSend(Context& context, const SendOptions& options) {
    auto ends = openEnds(context, options.file);
    if (!ends.ok()) {
        return fail(ends.failure());
    }
    Sender sender(ends.value().daemon, ends.value().lines);
    const Outcome<void> done = sender.run("no dictionary", [&](const Dictionary& message) {
        Arguments arguments;
        arguments.dictionary = message;
        arguments.category = options.category;
        arguments.type = options.type;
        if (!options.sessions.empty()) {
            arguments.reporterIDs = options.sessions;
        }
        return std::optional(arguments);
    });
    return tellSent(context, std::nullopt, sender, done);
}

Exit runSession(Context& context, const SessionOptions& options) {
    auto ends = openEnds(context, options.file);
    if (!ends.ok()) {
        return fail(ends.failure());
    }
    auto& [daemon, lines] = ends.value();
    const std::int64_t id = randomID();
    if (const auto opened = openSession(daemon, options, id); !opened.ok()) {
        return fail(opened.failure());
    }
    Sender sender(daemon, lines);
    Outcome<void> done = sender.run("not {\"category\": …, \"type\": …, \"message\": {…}}",
                                    [id](const Dictionary& line) { return argumentsIn(line, id); });
    done = done.ok() ? closeSession(daemon, id) : done;
    return tellSent(context, id, sender, done);
}

} // namespace halyard::ctl
