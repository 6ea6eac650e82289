#include <fmt/core.h>
#include <unistd.h>
#include <variant>

#include "halyard/halyard.h"
#include "linux/LinuxPlatform.h"
#include "linux/system/Directories.h"
#include "platform/Log.h"
#include "service/HYReportingServiceDelegate.h"

namespace {

using namespace halyard;

// The daemon emits its marks through the library that its clients use, so one
// probe sees both.
class LibraryTraceMarks final : public platform::TraceMarks {
public:
    void mark(std::uint32_t code, std::uint64_t arg1, std::uint64_t arg2, std::uint64_t arg3,
              std::uint64_t arg4) override {
        ::evmark_trace(code, arg1, arg2, arg3, arg4);
    }
};

int fail(const std::string& why) {
    fmt::print(stderr, "halyardd: {}\n", why);
    return 1;
}

} // namespace

int main(int argc, char** /*argv*/) {
    if (argc > 1) {
        return fail("takes no arguments; see docs/configuration.md");
    }
    auto resolved = linux_::resolveDirectories(linux_::processEnvironment, ::getuid());
    if (const auto* error = std::get_if<std::string>(&resolved)) {
        return fail(*error);
    }
    const auto& directories = std::get<linux_::Directories>(resolved);
    if (const auto error = linux_::createDirectories(directories)) {
        return fail(*error);
    }
    LibraryTraceMarks traceMarks;
    linux_::LinuxPlatform linuxPlatform(directories, traceMarks);
    const auto service = HYReportingServiceDelegate::make();
    if (const auto error = linuxPlatform.open(service.get())) {
        return fail(*error);
    }
    linuxPlatform.serve();
    return 0;
}
