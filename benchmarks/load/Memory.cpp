#include "load/Memory.h"

#include <algorithm>
#include <chrono>
#include <sys/resource.h>
#include <thread>

#include "load/Daemon.h"
#include "load/Throughput.h"

namespace halyard::load {
namespace {

using namespace std::chrono_literals;
using protocol::Arguments;
using protocol::Method;

constexpr std::uint32_t kSessionConnections = 4;
constexpr std::uint32_t kMessagesPerSession = 1000;
constexpr auto kTick = 10ms;

// For us and, by inheritance, for the daemon: a descriptor per connection.
void allowConnections(std::uint32_t count) {
    rlimit limit{};
    ::getrlimit(RLIMIT_NOFILE, &limit);
    const rlim_t wanted = count + 64;
    limit.rlim_cur = std::min(std::max(limit.rlim_cur, wanted), limit.rlim_max);
    ::setrlimit(RLIMIT_NOFILE, &limit);
}

std::uint64_t settledBytes(const Daemon& daemon, Connection& control) {
    control.call(Method::AdminFlush);
    return daemon.memory().residentBytes;
}

double share(std::uint64_t before, std::uint64_t after, std::uint32_t count) {
    return (static_cast<double>(after) - static_cast<double>(before)) / count;
}

// A line per start, with the list of all sessions, is not what is measured here.
DaemonSettings quiet() {
    return {.analytics = true, .logLevel = "error"};
}

void measureConnections(const Options& options, IdleMemory& result) {
    Daemon daemon(options, quiet());
    Connection control = daemon.connect();
    result.idleBytes = settledBytes(daemon, control);
    std::vector<Connection> idle;
    for (std::uint32_t i = 0; i < options.connections; ++i) {
        idle.push_back(daemon.connect());
        idle.back().barrier();
    }
    result.perConnection =
        share(result.idleBytes, settledBytes(daemon, control), options.connections);
}

void forEverySession(std::vector<Connection>& owners, std::uint32_t count, Method method) {
    Arguments arguments;
    for (std::uint32_t i = 0; i < count; ++i) {
        arguments.reporterID = i + 1;
        owners[i % owners.size()].notify(method, arguments);
    }
    for (Connection& owner : owners) {
        owner.barrier();
    }
}

void measureSessions(const Options& options, IdleMemory& result) {
    Daemon daemon(options, quiet());
    Connection control = daemon.connect();
    std::vector<Connection> owners;
    for (std::uint32_t i = 0; i < kSessionConnections; ++i) {
        owners.push_back(daemon.connect());
        owners.back().barrier();
    }
    const std::uint64_t before = settledBytes(daemon, control);
    forEverySession(owners, options.sessions, Method::CreateReportingSession);
    const std::uint64_t created = settledBytes(daemon, control);
    forEverySession(owners, options.sessions, Method::StartReportingSessionForID);
    const std::uint64_t started = settledBytes(daemon, control);
    result.perCreatedSession = share(before, created, options.sessions);
    result.perStartedSession = share(before, started, options.sessions);
}

// One client of the held load: sends its stream over and over.
class HoldClient {
public:
    HoldClient(const Daemon& daemon, const Stream& stream, std::int64_t reporterID)
        : connection_(daemon.connect()), stream_(stream) {
        arguments_.reporterID = reporterID;
        connection_.call(Method::CreateReportingSession, arguments_);
        connection_.notify(Method::StartReportingSessionForID, arguments_);
    }

    void sendUpTo(std::uint64_t due) {
        while (sent_ < due) {
            const std::size_t index = sent_ % stream_.ends.size();
            const std::size_t begin = index == 0 ? 0 : stream_.ends[index - 1];
            connection_.send(
                std::string_view(stream_.bytes).substr(begin, stream_.ends[index] - begin));
            if (++sent_ % kMessagesPerSession == 0) {
                connection_.notify(Method::StopReportingSessionForID, arguments_);
                connection_.notify(Method::StartReportingSessionForID, arguments_);
                connection_.barrier();
            }
        }
    }

private:
    Connection connection_;
    const Stream& stream_;
    Arguments arguments_;
    std::uint64_t sent_ = 0;
};

} // namespace

IdleMemory measureIdleMemory(const Options& options) {
    allowConnections(options.connections);
    IdleMemory result;
    measureConnections(options, result);
    measureSessions(options, result);
    return result;
}

std::vector<HoldSample> holdLoad(const Options& options) {
    const std::vector<Stream> streams = makeStreams(options, modes().front());
    Daemon daemon(options, {.analytics = true, .logLevel = options.logLevel});
    std::vector<HoldClient> clients;
    for (std::size_t i = 0; i < streams.size(); ++i) {
        clients.emplace_back(daemon, streams[i], static_cast<std::int64_t>(i + 1));
    }
    const double rate = static_cast<double>(options.rate) / options.clients;
    const double interval = std::max(1.0, options.holdSeconds / 12.0);
    std::vector<HoldSample> samples;
    const auto begin = std::chrono::steady_clock::now();
    double elapsed = 0;
    do {
        std::this_thread::sleep_for(kTick);
        elapsed = std::chrono::duration<double>(std::chrono::steady_clock::now() - begin).count();
        const auto due = static_cast<std::uint64_t>(elapsed * rate);
        for (HoldClient& client : clients) {
            client.sendUpTo(due);
        }
        const bool last = elapsed >= options.holdSeconds;
        if (last || elapsed >= interval * static_cast<double>(samples.size())) {
            samples.push_back({elapsed, daemon.memory().residentBytes, due * options.clients});
        }
    } while (elapsed < options.holdSeconds);
    return samples;
}

} // namespace halyard::load
