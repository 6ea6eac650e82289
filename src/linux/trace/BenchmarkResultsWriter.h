// Results in the JSON of Google Benchmark, which its own tools and those of
// others compare and plot: an entry for each value. Beside NAME.EXT it writes
// NAME.trace.json, the same intervals for viewers of traces.
//
// Both appear whole or not at all. Writers are for one thread at a time.
#pragma once

#include "linux/system/Directories.h"
#include "platform/Clock.h"
#include "platform/ResultsWriter.h"

namespace halyard::linux_ {

class BenchmarkResultsFiles final : public platform::ResultsFiles {
public:
    // Borrows `clock`.
    BenchmarkResultsFiles(Directories directories, const platform::Clock& clock)
        : directories_(std::move(directories)), clock_(clock) {}

    std::unique_ptr<platform::ResultsWriter> open(std::string_view path, std::string_view name,
                                                  std::uint32_t version) override;

private:
    const Directories directories_;
    const platform::Clock& clock_;
};

} // namespace halyard::linux_
