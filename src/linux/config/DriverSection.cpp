#include <fmt/format.h>

#include "linux/config/SettingsSections.h"
#include "linux/drivers/SourceKinds.h"

namespace halyard::linux_ {
namespace {

struct Channel {
    DriverChannel values;
    bool hasFormat = false;
};

bool isSource(std::string_view text) {
    const std::size_t colon = text.find(':');
    return colon != std::string_view::npos && colon > 0 && colon + 1 < text.size();
}

template <auto member> void readText(TomlReader& reader, const NamedNode& at, Channel& into) {
    reader.read(at, into.values.*member);
}

void readFormat(TomlReader& reader, const NamedNode& at, Channel& into) {
    into.hasFormat = true;
    reader.readNamed<ChannelFormat>(at, kChannelFormats, into.values.format);
}

constexpr TomlReader::Key<Channel> kChannelKeys[] = {
    {"group", &readText<&DriverChannel::group>},
    {"subgroup", &readText<&DriverChannel::subgroup>},
    {"driver", &readText<&DriverChannel::driver>},
    {"name", &readText<&DriverChannel::name>},
    {"unit", &readText<&DriverChannel::unit>},
    {"format", &readFormat},
    {"source", &readText<&DriverChannel::source>},
};

void check(TomlReader& reader, const NamedNode& at, Channel& channel) {
    DriverChannel& values = channel.values;
    if (!values.group && !values.subgroup) {
        reader.fail(at.node, fmt::format("{} needs a group or a subgroup", at.name));
    }
    if (values.name.empty()) {
        reader.fail(at.node, fmt::format("{} needs a name", at.name));
    }
    if (!isSource(values.source)) {
        reader.fail(at.node, fmt::format("{} needs a source such as \"file:/sys/...\"", at.name));
    }
    if (!channel.hasFormat) {
        const SourceKind* const kind = findSourceKind(values.source);
        values.format = kind != nullptr ? kind->format : ChannelFormat::Simple;
    }
}

// Added to those of the files before.
void readChannels(TomlReader& reader, const NamedNode& at, Settings& into) {
    const toml::array* const channels = at.node.as_array();
    if (channels == nullptr) {
        reader.fail(at.node,
                    fmt::format("{0} must be a list of tables, each begun by [[{0}]]", at.name));
        return;
    }
    if (channels->size() + into.driverChannels.size() > kMaxDriverChannels) {
        reader.fail(at.node,
                    fmt::format("{} has more than {} entries", at.name, kMaxDriverChannels));
        return;
    }
    for (const toml::node& node : *channels) {
        Channel channel;
        reader.readSection<Channel>({node, at.name}, kChannelKeys, channel);
        if (node.is_table()) {
            check(reader, {node, at.name}, channel);
            into.driverChannels.push_back(std::move(channel.values));
        }
    }
}

constexpr TomlReader::Key<Settings> kDriversKeys[] = {{"channel", &readChannels}};

} // namespace

void readDrivers(TomlReader& reader, const NamedNode& at, Settings& into) {
    reader.readSection<Settings>(at, kDriversKeys, into);
}

} // namespace halyard::linux_
