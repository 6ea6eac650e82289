#include <algorithm>
#include <cstdio>
#include <exception>

#include "load/Report.h"

namespace {

using namespace halyard::load;

// The measurement whose CPU cost is the median.
template <class Measure> Measurement medianOf(std::uint32_t rounds, Measure measureOnce) {
    std::vector<Measurement> all;
    for (std::uint32_t round = 0; round < rounds; ++round) {
        all.push_back(measureOnce());
        std::fprintf(stderr, "%s: %.0f messages/s, %.0f ns\n", all.back().mode.c_str(),
                     all.back().messagesPerSecond(), all.back().cpuPerMessage());
    }
    std::sort(all.begin(), all.end(), [](const Measurement& left, const Measurement& right) {
        return left.cpuPerMessage() < right.cpuPerMessage();
    });
    return all[all.size() / 2];
}

Report measureAll(const Options& options) {
    Report report;
    if (options.throughput) {
        report.throughput.push_back(
            medianOf(options.rounds, [&] { return measureFloor(options); }));
        for (const Mode& mode : modes()) {
            if (options.mode.empty() || options.mode == mode.name) {
                report.throughput.push_back(
                    medianOf(options.rounds, [&] { return measure(options, mode); }));
            }
        }
    }
    if (options.memory) {
        report.idle = measureIdleMemory(options);
    }
    if (options.holdSeconds > 0) {
        report.held = holdLoad(options);
    }
    for (std::uint32_t round = 0; round < options.rounds; ++round) {
        if (options.pacedSeconds > 0) {
            report.paced.push_back(measurePaced(options));
        }
        if (options.churn > 0) {
            report.churn.push_back(measureChurn(options));
        }
    }
    return report;
}

} // namespace

int main(int count, char** arguments) {
    try {
        const auto options = parseOptions(count, arguments);
        if (options) {
            const Report report = measureAll(*options);
            const std::string text =
                options->json ? asJson(*options, report) : asTable(*options, report);
            std::fputs(text.c_str(), stdout);
        }
        return 0;
    } catch (const std::exception& error) {
        std::fprintf(stderr, "halyard-load: %s\n", error.what());
        return 1;
    }
}
