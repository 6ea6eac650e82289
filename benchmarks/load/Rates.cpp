#include "load/Rates.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <thread>

#include "load/Daemon.h"
#include "load/Throughput.h"
#include "load/Workers.h"

namespace halyard::load {
namespace {

using protocol::Arguments;
using protocol::Method;
using Clock = std::chrono::steady_clock;
using Seconds = std::chrono::duration<double>;

const Mode kPacedMode{.name = "requests, addressed", .requests = true, .addressed = true};

// The clients' turns lie evenly between each other.
std::vector<double> sendPaced(Connection& client, const Stream& stream, Clock::time_point first,
                              Seconds period) {
    std::vector<double> answers;
    for (std::size_t i = 0; i < stream.ends.size(); ++i) {
        std::this_thread::sleep_until(
            first + std::chrono::duration_cast<Clock::duration>(period * static_cast<double>(i)));
        const std::size_t begin = i == 0 ? 0 : stream.ends[i - 1];
        const auto sent = Clock::now();
        client.send(std::string_view(stream.bytes).substr(begin, stream.ends[i] - begin));
        client.awaitAnswer();
        answers.push_back(Seconds(Clock::now() - sent).count());
    }
    return answers;
}

struct Cost {
    double seconds = 0;
    std::uint64_t cpu = 0;
};

template <class Work> Cost costOf(const Daemon& daemon, Work work) {
    const std::uint64_t cpu = daemon.cpuNanoseconds();
    const auto begin = Clock::now();
    work();
    return {Seconds(Clock::now() - begin).count(), daemon.cpuNanoseconds() - cpu};
}

// The answer to a start is held until the stop, so nobody asks for it.
constexpr std::array kLife = {Method::CreateReportingSession,    Method::SetServiceType,
                              Method::SetConfiguration,          Method::StartReportingSessionForID,
                              Method::StopReportingSessionForID, Method::DestroyReportingSession};

Arguments argumentsFor(std::uint32_t session) {
    Arguments arguments;
    arguments.reporterID = session + 1;
    arguments.serviceType = 0;
    arguments.dictionary = {{"HostApplicationDisplayID", "player"}};
    return arguments;
}

void liveOneByOne(Connection& client, std::uint32_t sessions) {
    for (std::uint32_t i = 0; i < sessions; ++i) {
        for (const Method method : kLife) {
            if (method == Method::StartReportingSessionForID) {
                client.notify(method, argumentsFor(i));
            } else {
                client.call(method, argumentsFor(i));
            }
        }
    }
}

void liveTogether(Connection& client, std::uint32_t sessions) {
    for (const Method method : kLife) {
        for (std::uint32_t i = 0; i < sessions; ++i) {
            client.notify(method, argumentsFor(i));
        }
    }
    client.barrier();
}

} // namespace

PacedLoad measurePaced(const Options& options) {
    Options load = options;
    load.messages = std::max(options.clients, options.rate * options.pacedSeconds);
    const std::vector<Stream> streams = makeStreams(load, kPacedMode);
    const Daemon daemon(options, {.logLevel = options.logLevel});
    std::vector<Connection> clients = connectClients(daemon, options, kPacedMode);
    Connection control = daemon.connect();
    control.call(Method::AdminFlush);

    const Seconds period(static_cast<double>(options.clients) / options.rate);
    std::vector<std::vector<double>> answers(clients.size());
    const Cost cost = costOf(daemon, [&] {
        const auto begin = Clock::now();
        runWorkers(clients.size(), [&](std::size_t i) {
            const Seconds offset = period * static_cast<double>(i) / options.clients;
            answers[i] =
                sendPaced(clients[i], streams[i],
                          begin + std::chrono::duration_cast<Clock::duration>(offset), period);
        });
        control.call(Method::AdminFlush);
    });
    PacedLoad result{.seconds = cost.seconds, .cpuNanoseconds = cost.cpu, .answerSeconds = {}};
    for (const std::vector<double>& each : answers) {
        result.answerSeconds.insert(result.answerSeconds.end(), each.begin(), each.end());
    }
    result.requests = result.answerSeconds.size();
    std::sort(result.answerSeconds.begin(), result.answerSeconds.end());
    return result;
}

Churn measureChurn(const Options& options) {
    const Daemon daemon(options, {.logLevel = options.logLevel});
    Connection client = daemon.connect();
    client.barrier();
    const Cost awaited = costOf(daemon, [&] {
        liveOneByOne(client, options.churn);
        client.call(Method::AdminFlush);
    });
    const Cost together = costOf(daemon, [&] {
        liveTogether(client, options.churn);
        client.call(Method::AdminFlush);
    });
    return {options.churn, awaited.seconds, awaited.cpu, together.seconds, together.cpu};
}

} // namespace halyard::load
