#include "linux/config/TomlValue.h"

#include <chrono>
#include <fmt/format.h>
#include <string>
#include <utility>
#include <vector>

namespace halyard::linux_ {
namespace {

std::int64_t dayNumber(const toml::date& date) {
    const std::chrono::year_month_day day(
        std::chrono::year(date.year), std::chrono::month(date.month), std::chrono::day(date.day));
    return std::chrono::sys_days(day).time_since_epoch().count();
}

Date toDate(const toml::date_time& moment) {
    const std::int64_t minutes = moment.offset ? moment.offset->minutes : 0;
    const std::int64_t seconds =
        moment.time.hour * 3600 + moment.time.minute * 60 + moment.time.second - minutes * 60;
    return {dayNumber(moment.date) * 86400 + seconds, moment.time.nanosecond};
}

std::string toText(const toml::time& time) {
    std::string text = fmt::format("{:02}:{:02}:{:02}", time.hour, time.minute, time.second);
    if (time.nanosecond != 0) {
        text += fmt::format(".{:09}", time.nanosecond);
    }
    return text;
}

std::optional<Value> listOf(const toml::array& array, int depth) {
    std::vector<Value> items;
    for (const toml::node& element : array) {
        std::optional<Value> item = valueOfToml(element, depth);
        if (!item) {
            return std::nullopt;
        }
        items.push_back(std::move(*item));
    }
    return List(std::move(items));
}

std::optional<Value> dictionaryOf(const toml::table& table, int depth) {
    std::vector<Dictionary::Entry> entries;
    for (const auto& [key, element] : table) {
        std::optional<Value> value = valueOfToml(element, depth);
        if (!value) {
            return std::nullopt;
        }
        entries.push_back({Value(key.str()), std::move(*value)});
    }
    return Dictionary(std::move(entries));
}

std::optional<Value> scalarOf(const toml::node& node) {
    switch (node.type()) {
    case toml::node_type::string:
        return Value(node.ref<std::string>());
    case toml::node_type::integer:
        return Value(node.ref<std::int64_t>());
    case toml::node_type::floating_point:
        return Value(node.ref<double>());
    case toml::node_type::boolean:
        return Value(node.ref<bool>());
    case toml::node_type::date:
        return Value(toDate({node.ref<toml::date>(), toml::time{}}));
    case toml::node_type::date_time:
        return Value(toDate(node.ref<toml::date_time>()));
    case toml::node_type::time:
        return Value(toText(node.ref<toml::time>()));
    default:
        return Value();
    }
}

} // namespace

std::optional<Value> valueOfToml(const toml::node& node, int depth) {
    const bool nests = node.is_array() || node.is_table();
    if (!nests) {
        return scalarOf(node);
    }
    if (depth == 0) {
        return std::nullopt;
    }
    return node.is_array() ? listOf(*node.as_array(), depth - 1)
                           : dictionaryOf(*node.as_table(), depth - 1);
}

} // namespace halyard::linux_
