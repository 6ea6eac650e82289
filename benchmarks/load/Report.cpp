#include "load/Report.h"

#include <fmt/format.h>
#include <thread>

#include "common/Json.h"

namespace halyard::load {
namespace {

constexpr double kMiB = 1024.0 * 1024.0;

double mebibytes(std::uint64_t bytes) {
    return static_cast<double>(bytes) / kMiB;
}

double meanBytes(const Measurement& row) {
    return static_cast<double>(row.bytes) / static_cast<double>(row.messages);
}

std::string throughputTable(const Options& options, const std::vector<Measurement>& rows) {
    const double floor = rows.front().cpuPerMessage();
    std::string text = fmt::format(
        "{} messages of {:.0f} bytes (8 keys), {} connections, blocks of {} KiB, {} requests in "
        "flight,\n{} % repeats, log level {}, store below {}, {} processors; medians of {} "
        "rounds\n\n",
        rows.front().messages, meanBytes(rows.front()), options.clients,
        Connection::kBlockBytes / 1024, options.inFlight, options.repeats, options.logLevel,
        options.directory, std::thread::hardware_concurrency(), options.rounds);
    text += fmt::format("{:<40}{:>11}{:>13}{:>9}{:>10}{:>11}{:>11}\n", "", "messages/s",
                        "CPU ns/msg", "x floor", "peak MiB", "uploads", "analytics");
    for (const Measurement& row : rows) {
        const double cpu = row.cpuPerMessage();
        text += fmt::format("{:<40}{:>11.0f}{:>13.0f}{:>9.1f}", row.mode, row.messagesPerSecond(),
                            cpu, cpu / floor);
        if (row.peakBytes && row.rows) {
            text += fmt::format("{:>10.1f}{:>11}{:>11}", mebibytes(*row.peakBytes),
                                row.rows->uploads, row.rows->analytics);
        }
        text += '\n';
    }
    return text + "\nfloor: a process that reads the bytes of the notifications and appends them "
                  "to a file,\nfdatasync per MiB; the daemon's times end when all is durable "
                  "(admin.flush).\n";
}

std::string idleTable(const Options& options, const IdleMemory& idle) {
    return fmt::format("\nmemory (RSS): idle {:.1f} MiB; per idle connection {:.2f} KiB (of {}); "
                       "per session\ncreated {:.2f} KiB, started {:.2f} KiB (of {})\n",
                       mebibytes(idle.idleBytes), idle.perConnection / 1024, options.connections,
                       idle.perCreatedSession / 1024, idle.perStartedSession / 1024,
                       options.sessions);
}

std::string heldTable(const std::vector<HoldSample>& samples) {
    std::string text = "\nheld load: seconds, messages sent, RSS MiB\n";
    for (const HoldSample& sample : samples) {
        text += fmt::format("{:>8.0f}{:>12}{:>10.1f}\n", sample.seconds, sample.messages,
                            mebibytes(sample.residentBytes));
    }
    return text;
}

double percentile(const PacedLoad& load, std::size_t percent) {
    return load.answerSeconds[load.answerSeconds.size() * percent / 100];
}

std::string pacedTable(const Options& options, const std::vector<PacedLoad>& loads) {
    std::string text = fmt::format(
        "\n{} requests/s, evenly, {} connections: CPU us/request, answers after us: p50, p99\n",
        options.rate, options.clients);
    for (const PacedLoad& load : loads) {
        text += fmt::format("{:>10.1f}{:>10.0f}{:>10.0f}\n", load.cpuPerRequest() / 1e3,
                            percentile(load, 50) * 1e6, percentile(load, 99) * 1e6);
    }
    return text;
}

std::string churnTable(const std::vector<Churn>& churns) {
    std::string text = "\nsessions: each request awaited: s, CPU s; all together: s, CPU s\n";
    for (const Churn& churn : churns) {
        text += fmt::format("{:>8}{:>10.2f}{:>10.2f}{:>10.2f}{:>10.2f}\n", churn.sessions,
                            churn.awaitedSeconds, static_cast<double>(churn.awaitedCpu) / 1e9,
                            churn.togetherSeconds, static_cast<double>(churn.togetherCpu) / 1e9);
    }
    return text;
}

Dictionary asDictionary(const PacedLoad& load) {
    return {{"requests", load.requests},
            {"seconds", load.seconds},
            {"cpu_ns_per_request", load.cpuPerRequest()},
            {"answer_p50_sec", percentile(load, 50)},
            {"answer_p99_sec", percentile(load, 99)}};
}

Dictionary asDictionary(const Churn& churn) {
    return {{"sessions", churn.sessions},
            {"awaited_sec", churn.awaitedSeconds},
            {"awaited_cpu_ns", churn.awaitedCpu},
            {"together_sec", churn.togetherSeconds},
            {"together_cpu_ns", churn.togetherCpu}};
}

Dictionary asDictionary(const Measurement& row) {
    Dictionary result{{"mode", row.mode},
                      {"messages", row.messages},
                      {"bytes", row.bytes},
                      {"seconds", row.seconds},
                      {"messages_per_second", row.messagesPerSecond()},
                      {"cpu_ns_per_message", row.cpuPerMessage()}};
    if (row.peakBytes && row.rows) {
        result.set("peak_rss_bytes", *row.peakBytes);
        result.set("upload_rows", row.rows->uploads);
        result.set("analytics_rows", row.rows->analytics);
    }
    return result;
}

template <class Row> List asList(const std::vector<Row>& rows) {
    List list;
    for (const Row& row : rows) {
        list.append(asDictionary(row));
    }
    return list;
}

Dictionary asDictionary(const Options& options) {
    return {{"messages", options.messages},
            {"clients", options.clients},
            {"repeats_percent", options.repeats},
            {"in_flight", options.inFlight},
            {"rounds", options.rounds},
            {"connections", options.connections},
            {"sessions", options.sessions},
            {"log_level", options.logLevel},
            {"rate", options.rate},
            {"sync_interval", options.syncInterval},
            {"directory", options.directory},
            {"block_bytes", Connection::kBlockBytes},
            {"processors", std::thread::hardware_concurrency()}};
}

} // namespace

std::string asTable(const Options& options, const Report& report) {
    std::string text;
    if (!report.throughput.empty()) {
        text += throughputTable(options, report.throughput);
    }
    if (report.idle) {
        text += idleTable(options, *report.idle);
    }
    if (!report.held.empty()) {
        text += heldTable(report.held);
    }
    if (!report.paced.empty()) {
        text += pacedTable(options, report.paced);
    }
    if (!report.churn.empty()) {
        text += churnTable(report.churn);
    }
    return text;
}

std::string asJson(const Options& options, const Report& report) {
    Dictionary result{{"options", asDictionary(options)}};
    result.set("throughput", asList(report.throughput));
    result.set("paced", asList(report.paced));
    result.set("churn", asList(report.churn));
    if (report.idle) {
        result.set("memory",
                   Dictionary{{"idle_bytes", report.idle->idleBytes},
                              {"per_connection_bytes", report.idle->perConnection},
                              {"per_created_session_bytes", report.idle->perCreatedSession},
                              {"per_started_session_bytes", report.idle->perStartedSession}});
    }
    List held;
    for (const HoldSample& sample : report.held) {
        held.append(Dictionary{{"seconds", sample.seconds},
                               {"messages", sample.messages},
                               {"rss_bytes", sample.residentBytes}});
    }
    result.set("held", held);
    return toPrettyJson(result) + "\n";
}

} // namespace halyard::load
