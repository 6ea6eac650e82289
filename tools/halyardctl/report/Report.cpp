#include "report/Report.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <fmt/format.h>

#include "output/Progress.h"
#include "output/Words.h"
#include "report/DigestGathering.h"
#include "report/DigestJson.h"
#include "report/ReportPage.h"

namespace halyard::ctl {
namespace {

Outcome<void> gather(Context& context, const ReportOptions& options, Digest& digest,
                     const Digest::Limits& limits) {
    digest.scope = {context.now, context.range, context.applicationPattern};
    if (!options.trace.empty()) {
        auto trace = reading::readTraceResults(options.trace);
        if (!trace.ok()) {
            return trace.failure();
        }
        digest.trace = std::move(trace).value();
        digest.trace->resize(std::min(digest.trace->size(), limits.durations));
    }
    auto reader = context.openStore();
    if (!reader.ok()) {
        return reader.failure();
    }
    Progress progress("Reading the store");
    return gatherDigest(reader.value(), digest, limits,
                        [&progress](double share) { progress.update(share); });
}

Exit printJson(Context& context, const Digest& digest) {
    JsonStream json(context.terminal.stream());
    json.beginDocument();
    writeDigest(json, digest, RowForm::Plain);
    json.endDocument();
    return finish(context, {});
}

Trouble cannotWrite(const std::string& path) {
    const int why = errno;
    return {why == EACCES || why == EPERM ? Exit::NotAllowed : Exit::Failed,
            Failure::ofErrno("cannot write " + path).message()};
}

Exit writeFile(Context& context, const Digest& digest, const std::string& path) {
    std::FILE* const file = std::fopen(path.c_str(), "we");
    if (file == nullptr) {
        return fail(cannotWrite(path));
    }
    const bool written =
        writePage(file, [&](JsonStream& json) { writeDigest(json, digest, RowForm::Packed); });
    const long size = std::ftell(file);
    if (std::fclose(file) != 0 || !written) {
        return fail(cannotWrite(path));
    }
    context.terminal.write(fmt::format("{}: {} and {}, {}\n", path,
                                       counted(digest.sessionCount, "session", "sessions"),
                                       counted(digest.glitchSum.glitches, "glitch", "glitches"),
                                       sizeOf(static_cast<std::uint64_t>(std::max(0L, size)))));
    return finish(context, {});
}

} // namespace

Exit runReport(Context& context, const ReportOptions& options) {
    const Digest::Limits limits;
    Digest digest(limits);
    const Outcome<void> gathered = gather(context, options, digest, limits);
    if (!gathered.ok()) {
        return fail(gathered.failure());
    }
    return context.json ? printJson(context, digest) : writeFile(context, digest, options.output);
}

} // namespace halyard::ctl
