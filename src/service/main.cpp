#include <fmt/core.h>
#include <unistd.h>

#include "halyard/halyard.h"
#include "linux/LinuxPlatform.h"
#include "linux/system/Directories.h"
#include "linux/system/PrivateFiles.h"
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
    linux_::makeNewFilesPrivate();
    const auto directories = linux_::resolveDirectories(linux_::processEnvironment, ::getuid());
    if (!directories.ok()) {
        return fail(directories.failure().message());
    }
    if (const auto created = linux_::createDirectories(directories.value()); !created.ok()) {
        return fail(created.failure().message());
    }
    LibraryTraceMarks traceMarks;
    linux_::LinuxPlatform linuxPlatform(directories.value(), traceMarks);
    const auto service = HYReportingServiceDelegate::make();
    if (const auto opened = linuxPlatform.open(service.get()); !opened.ok()) {
        return fail(opened.failure().message());
    }
    linuxPlatform.serve();
    return 0;
}
