#include "platform/Platform.h"

#include <cassert>
#include <fmt/format.h>
#include <utility>

#include "common/Description.h"
#include "platform/Device.h"
#include "platform/Log.h"

fmt::format_context::iterator
fmt::formatter<halyard::Value>::format(const halyard::Value& value,
                                       fmt::format_context& context) const {
    const std::string text = halyard::describe(value);
    return fmt::format_to(context.out(), "{}", text); // All of it at a time.
}

namespace halyard::platform {
namespace {

// More than any line of our own has; what makes one longer came from a client.
constexpr std::size_t kLongestText = 16 * 1024;

const Platform* installed = nullptr;

std::string_view baseName(std::string_view path) {
    return path.substr(path.rfind('/') + 1);
}

} // namespace

bool BuildKind::isInternal(const DeviceProperties& device) const {
    std::call_once(asked_, [&] { internal_ = device.boolean("InternalBuild").value_or(false); });
    return internal_;
}

void install(const Platform* platform) {
    installed = platform;
}

const Platform& current() {
    assert(installed != nullptr);
    return *installed;
}

bool logEnabled(LogLevel level) {
    return installed != nullptr && installed->log->isEnabled(level);
}

void logFormatted(LogLevel level, LogCategory category, const LogPlace& where,
                  fmt::string_view format, fmt::format_args arguments) {
    fmt::memory_buffer text;
    fmt::vformat_to(fmt::appender(text), format, arguments);
    if (text.size() <= kLongestText) {
        logText(level, category, where, {text.data(), text.size()}, nullptr);
    } else {
        logText(level, category, where, cutForLog(fmt::to_string(text)), nullptr);
    }
}

std::string cutForLog(std::string text) {
    return shortened(std::move(text), kLongestText);
}

void logText(LogLevel level, LogCategory category, const LogPlace& where, std::string_view text,
             LogMemo* memo) {
    installed->log->write(
        {level, category, baseName(where.file), where.line, where.function, text, memo});
}

} // namespace halyard::platform
