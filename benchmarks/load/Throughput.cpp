#include "load/Throughput.h"

#include <chrono>
#include <stdexcept>

#include "load/Workers.h"

namespace halyard::load {
namespace {

using protocol::Arguments;
using protocol::Method;

// The daemon holds the answer to a start until the session stops, so it is sent
// as a notification; the barrier tells that it was taken.
void startSession(Connection& connection, std::int64_t reporterID) {
    Arguments arguments;
    arguments.reporterID = reporterID;
    arguments.serviceType = 0;
    arguments.dictionary = {{"HostApplicationDisplayID", "load-" + std::to_string(reporterID)}};
    connection.call(Method::CreateReportingSession, arguments);
    connection.call(Method::SetServiceType, arguments);
    connection.call(Method::SetConfiguration, arguments);
    connection.notify(Method::StartReportingSessionForID, arguments);
    connection.barrier();
}

void checkRows(const std::vector<Stream>& streams, const Measurement& result, bool analytics) {
    std::uint64_t distinct = 0;
    for (const Stream& stream : streams) {
        distinct += stream.distinct;
    }
    const Rows expected{.uploads = distinct, .analytics = analytics ? result.messages : 0};
    if (result.rows->uploads != expected.uploads || result.rows->analytics != expected.analytics) {
        throw std::runtime_error(result.mode + ": the store holds " +
                                 std::to_string(result.rows->uploads) + " uploaded messages and " +
                                 std::to_string(result.rows->analytics) +
                                 " analytics events, not " + std::to_string(expected.uploads) +
                                 " and " + std::to_string(expected.analytics));
    }
}

} // namespace

std::vector<Connection> connectClients(const Daemon& daemon, const Options& options,
                                       const Mode& mode) {
    std::vector<Connection> clients;
    for (std::uint32_t i = 0; i < options.clients; ++i) {
        clients.push_back(daemon.connect());
        if (i == 0 || mode.addressed) {
            startSession(clients.back(), i + 1);
        }
    }
    return clients;
}

const std::vector<Mode>& modes() {
    static const std::vector<Mode> all = {
        {.name = "notifications, addressed", .requests = false, .addressed = true},
        {.name = "notifications, broadcast", .requests = false, .addressed = false},
        {.name = "requests, addressed", .requests = true, .addressed = true},
        {.name = "requests, broadcast", .requests = true, .addressed = false},
        {.name = "notifications, addressed, no analytics",
         .requests = false,
         .addressed = true,
         .analytics = false},
    };
    return all;
}

std::vector<Stream> makeStreams(const Options& options, const Mode& mode) {
    std::vector<Stream> streams(options.clients);
    runWorkers(streams.size(), [&](std::size_t i) {
        const auto client = static_cast<std::uint32_t>(i);
        StreamPlan plan{.client = client,
                        .messages = options.messages / options.clients,
                        .repeats = options.repeats,
                        .requests = mode.requests,
                        .reporterIDs = std::nullopt};
        if (mode.addressed) {
            plan.reporterIDs = {client + 1};
        }
        streams[i] = makeStream(plan);
    });
    return streams;
}

Measurement measure(const Options& options, const Mode& mode) {
    const std::vector<Stream> streams = makeStreams(options, mode);
    Daemon daemon(options, {.analytics = mode.analytics, .logLevel = options.logLevel});
    std::vector<Connection> clients = connectClients(daemon, options, mode);
    Connection control = daemon.connect();
    control.call(Method::AdminFlush);

    Measurement result{.mode = mode.name};
    const std::uint64_t cpuBefore = daemon.cpuNanoseconds();
    const auto begin = std::chrono::steady_clock::now();
    runWorkers(clients.size(), [&](std::size_t i) {
        if (mode.requests) {
            clients[i].sendRequests(streams[i], options.inFlight);
        } else {
            clients[i].send(streams[i].bytes);
            clients[i].barrier();
        }
    });
    control.call(Method::AdminFlush);
    const std::chrono::duration<double> elapsed = std::chrono::steady_clock::now() - begin;
    result.seconds = elapsed.count();
    result.cpuNanoseconds = daemon.cpuNanoseconds() - cpuBefore;
    result.peakBytes = daemon.memory().peakBytes;
    result.rows = daemon.rows();
    for (const Stream& stream : streams) {
        result.messages += stream.ends.size();
        result.bytes += stream.bytes.size();
    }
    checkRows(streams, result, mode.analytics);
    daemon.stop();
    return result;
}

} // namespace halyard::load
