// Walks a parsed file section by section, and keeps what is wrong with it.
//
// Goes on after a mistake, so that the one told is the first of the file, whatever
// order the walk has. What a file leaves out stays as it was in what it is read into:
// so a second file wins over the first, key by key. Sections are tables of keys, each
// with the function that reads it. On the stack of one reading; only the settings'
// sources include this: the library's header is heavy.
#pragma once

#include <algorithm>
#include <cstdint>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <toml++/toml.h>
#include <utility>
#include <vector>

#include "linux/config/Settings.h"

namespace halyard::linux_ {

// A node of the file with the dotted path of its key, for messages.
struct NamedNode {
    const toml::node& node;
    std::string name;
};

class TomlReader {
public:
    using Words = std::vector<std::string>;
    template <class T> using Names = std::span<const std::pair<std::string_view, T>>;
    template <class T> struct Key {
        std::string_view name;
        void (*read)(TomlReader& reader, const NamedNode& at, T& into);
    };

    explicit TomlReader(std::string_view path) : path_(path) {}

    void fail(const toml::node& where, std::string message);
    void warn(const toml::source_region& where, std::string message);

    // Each leaves `into` alone, and tells the mistake, when there is one.
    [[nodiscard]] const toml::table* table(const NamedNode& at);
    void read(const NamedNode& at, bool& into);
    void read(const NamedNode& at, std::string& into);
    void read(const NamedNode& at, std::optional<std::string>& into);
    void read(const NamedNode& at, Words& into);
    void readIds(const NamedNode& at, Words& into); // texts or numbers
    void readSize(const NamedNode& at, std::uint64_t least, std::uint64_t& into);
    void readSwitches(const NamedNode& at, Settings::Switches& into);
    template <class T> void readNamed(const NamedNode& at, Names<T> names, T& into);
    template <class T> void readSection(const NamedNode& at, std::span<const Key<T>> keys, T& into);

    // What it came to, with `settings` when nothing was wrong.
    Result<ParsedSettings, SettingsFailure> finish(Settings settings);

private:
    void readWords(const NamedNode& at, const std::string& complaint, bool orIds, Words& into);

    const std::string path_;
    ParsedSettings result_;                  // but for the settings
    std::optional<SettingsFailure> failure_; // the first of the file so far
};

[[nodiscard]] std::string join(const std::string& parent, std::string_view key);

// The reader of a key whose kind says how: a member of T.
template <auto member, class T> void readInto(TomlReader& reader, const NamedNode& at, T& into) {
    reader.read(at, into.*member);
}

template <class T> void TomlReader::readNamed(const NamedNode& at, Names<T> names, T& into) {
    const std::string_view word = at.node.value_exact<std::string_view>().value_or("");
    std::string known;
    for (const auto& [candidate, value] : names) {
        if (candidate == word) {
            into = value;
            return;
        }
        known += (known.empty() ? "\"" : ", \"") + std::string(candidate) + "\"";
    }
    fail(at.node, at.name + " must be one of " + known);
}

template <class T>
void TomlReader::readSection(const NamedNode& at, std::span<const Key<T>> keys, T& into) {
    const toml::table* const section = table(at);
    if (section == nullptr) {
        return;
    }
    for (const Key<T>& key : keys) {
        result_.known.insert(join(at.name, key.name));
    }
    for (const auto& [name, element] : *section) {
        const std::string_view wanted = name.str();
        const auto known = std::find_if(keys.begin(), keys.end(),
                                        [&](const Key<T>& key) { return key.name == wanted; });
        const std::string path = join(at.name, wanted);
        if (known == keys.end()) {
            warn(name.source(), "unknown key " + path + " has no effect");
        } else {
            result_.given.insert(path);
            known->read(*this, {element, path}, into);
        }
    }
}

} // namespace halyard::linux_
