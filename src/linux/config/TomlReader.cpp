#include "linux/config/TomlReader.h"

#include <fmt/format.h>
#include <limits>

#include "linux/config/Quantities.h"

namespace halyard::linux_ {
namespace {

std::string sizeForPeople(std::uint64_t bytes) {
    return bytes % kMiB == 0 ? fmt::format("{}MiB", bytes / kMiB)
                             : fmt::format("{}KiB", bytes / kKiB);
}

} // namespace

std::string join(const std::string& parent, std::string_view key) {
    return parent.empty() ? std::string(key) : fmt::format("{}.{}", parent, key);
}

Result<ParsedSettings, SettingsFailure> TomlReader::finish(Settings settings) {
    if (failure_) {
        return std::move(*failure_);
    }
    auto& warnings = result_.warnings;
    std::stable_sort(warnings.begin(), warnings.end(),
                     [](const SettingsWarning& left, const SettingsWarning& right) {
                         return left.line < right.line;
                     });
    if (warnings.size() > kMaxSettingsWarnings) {
        result_.warningsLeftOut = warnings.size() - kMaxSettingsWarnings;
        warnings.resize(kMaxSettingsWarnings);
    }
    result_.settings = std::move(settings);
    return std::move(result_);
}

void TomlReader::fail(const toml::node& where, std::string message) {
    const toml::source_position at = where.source().begin;
    if (!failure_ || std::pair(at.line, at.column) < std::pair(failure_->line, failure_->column)) {
        failure_.emplace();
        failure_->text = std::move(message);
        failure_->file = path_;
        failure_->line = at.line;
        failure_->column = at.column;
    }
}

void TomlReader::warn(const toml::source_region& where, std::string message) {
    result_.warnings.push_back({where.begin.line, std::move(message)});
}

const toml::table* TomlReader::table(const NamedNode& at) {
    const toml::table* const table = at.node.as_table();
    if (table == nullptr) {
        fail(at.node, fmt::format("{} must be a table", at.name));
    }
    return table;
}

void TomlReader::read(const NamedNode& at, bool& into) {
    if (const auto value = at.node.value_exact<bool>()) {
        into = *value;
    } else {
        fail(at.node, fmt::format("{} must be true or false", at.name));
    }
}

void TomlReader::read(const NamedNode& at, std::string& into) {
    if (auto value = at.node.value_exact<std::string>()) {
        into = std::move(*value);
    } else {
        fail(at.node, fmt::format("{} must be a text", at.name));
    }
}

void TomlReader::read(const NamedNode& at, std::optional<std::string>& into) {
    read(at, into.emplace());
}

void TomlReader::read(const NamedNode& at, Words& into) {
    readWords(at, fmt::format("{} must be a list of texts", at.name), false, into);
}

void TomlReader::readIds(const NamedNode& at, Words& into) {
    readWords(at, fmt::format("{} must be a list of texts or numeric ids", at.name), true, into);
}

void TomlReader::readWords(const NamedNode& at, const std::string& complaint, bool orIds,
                           Words& into) {
    const toml::array* const array = at.node.as_array();
    if (array == nullptr) {
        fail(at.node, complaint);
        return;
    }
    into.clear();
    for (const toml::node& element : *array) {
        const auto id = element.value_exact<std::int64_t>();
        const auto word = element.value_exact<std::string>();
        if (word && !word->empty()) {
            into.push_back(*word);
        } else if (orIds && id && *id >= 0 && *id < std::numeric_limits<std::uint32_t>::max()) {
            into.push_back(std::to_string(*id));
        } else {
            fail(element, complaint);
        }
    }
}

void TomlReader::readSize(const NamedNode& at, std::uint64_t least, std::uint64_t& into) {
    std::optional<std::uint64_t> bytes =
        parseByteSize(at.node.value_exact<std::string>().value_or(""));
    const auto number = at.node.value_exact<std::int64_t>();
    if (number && *number >= 0) {
        bytes = static_cast<std::uint64_t>(*number);
    }
    if (!bytes) {
        fail(at.node,
             fmt::format("{} must be a size such as \"256MiB\" or a number of bytes", at.name));
    } else if (*bytes < least) {
        fail(at.node, fmt::format("{} must be at least {}", at.name, sizeForPeople(least)));
    } else {
        into = *bytes;
    }
}

void TomlReader::readSwitches(const NamedNode& at, Settings::Switches& into) {
    const toml::table* const switches = table(at);
    if (switches == nullptr) {
        return;
    }
    for (const auto& [key, element] : *switches) {
        read({element, join(at.name, key.str())}, into[std::string(key.str())]);
    }
}

} // namespace halyard::linux_
