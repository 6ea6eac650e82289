#include "report/ReportPage.h"

#include <cassert>
#include <cstddef>
#include <sys/types.h>

// The bytes of the file that the build made of tools/halyardctl/page.
extern "C" const char halyardPageBegin[];
extern "C" const char halyardPageEnd[];

namespace halyard::ctl {
namespace {

bool put(std::FILE* to, std::string_view text) {
    return std::fwrite(text.data(), 1, text.size(), to) == text.size();
}

// What a stream of JSON writes, with each "<" as JSON also has it. Outside of texts
// there is none.
ssize_t putEscaped(void* to, const char* bytes, std::size_t size) {
    auto* const file = static_cast<std::FILE*>(to);
    std::string_view left(bytes, size);
    while (!left.empty()) {
        const std::size_t at = left.find('<');
        const bool written =
            put(file, left.substr(0, at)) && (at == std::string_view::npos || put(file, "\\u003c"));
        if (!written) {
            return 0; // As the C library wants it told.
        }
        left.remove_prefix(at == std::string_view::npos ? left.size() : at + 1);
    }
    return static_cast<ssize_t>(size);
}

} // namespace

std::string_view pageFrame() {
    return {halyardPageBegin, static_cast<std::size_t>(halyardPageEnd - halyardPageBegin)};
}

bool writePage(std::FILE* to, const std::function<void(JsonStream&)>& writeDigest) {
    const std::string_view frame = pageFrame();
    const std::size_t mark = frame.find(kDigestMark);
    assert(mark != std::string_view::npos);
    cookie_io_functions_t functions{};
    functions.write = putEscaped;
    if (!put(to, frame.substr(0, mark))) {
        return false;
    }
    std::FILE* const escaped = ::fopencookie(to, "w", functions);
    if (escaped == nullptr) {
        return false;
    }
    JsonStream json(escaped);
    json.beginDocument();
    writeDigest(json);
    const bool failed = std::ferror(escaped) != 0;
    return std::fclose(escaped) == 0 && !failed && put(to, frame.substr(mark + kDigestMark.size()));
}

} // namespace halyard::ctl
