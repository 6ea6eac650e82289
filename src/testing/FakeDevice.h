// A device whose answers a test sets.
#pragma once

#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/Device.h"

namespace halyard::testing {

class FakePreferences final : public platform::Preferences {
public:
    Value value(std::string_view key, std::string_view domain) const override {
        const auto found = values.find({std::string(domain), std::string(key)});
        return found != values.end() ? found->second : Value();
    }

    std::map<std::pair<std::string, std::string>, Value> values; // by domain and key
};

class FakeFeatureFlags final : public platform::FeatureFlags {
public:
    bool isEnabled(std::string_view domain, std::string_view flag) const override {
        const auto found = flags.find({std::string(domain), std::string(flag)});
        return found != flags.end() && found->second;
    }

    std::map<std::pair<std::string, std::string>, bool> flags; // by domain and flag
};

class FakeDeviceProperties final : public platform::DeviceProperties {
public:
    std::optional<bool> boolean(std::string_view name) const override {
        asked.emplace_back(name);
        const auto found = booleans.find(std::string(name));
        return found != booleans.end() ? std::optional(found->second) : std::nullopt;
    }

    std::map<std::string, bool> booleans;
    mutable std::vector<std::string> asked;
};

// Hands out rising tokens, beginning with 1. A post submits to the queue of the
// registration, so the test drains that queue to see the handler run.
class FakeNotifications final : public platform::Notifications {
public:
    struct Registered {
        std::string name;
        std::shared_ptr<platform::SerialQueue> queue;
        Handler handler;
        int token;
    };

    Registration registerFor(std::string_view name, std::shared_ptr<platform::SerialQueue> queue,
                             Handler handler) override {
        if (failureStatus != 0) {
            return {failureStatus, 0};
        }
        const int token = static_cast<int>(registrations.size()) + 1;
        registrations.push_back({std::string(name), std::move(queue), std::move(handler), token});
        return {0, token};
    }
    void post(std::string_view name) override {
        posted.emplace_back(name);
        for (const Registered& registered : registrations) {
            if (registered.name == name) {
                registered.queue->async(
                    [handler = registered.handler, token = registered.token] { handler(token); });
            }
        }
    }

    std::uint32_t failureStatus = 0; // what every registration answers
    std::vector<Registered> registrations;
    std::vector<std::string> posted;
};

class FakeProcessTable final : public platform::ProcessTable {
public:
    std::optional<platform::ProcessInfo> infoForPID(std::int32_t pid) const override {
        const auto found = names.find(pid);
        return found != names.end() ? std::optional(platform::ProcessInfo{found->second})
                                    : std::nullopt;
    }

    std::map<std::int32_t, std::string> names;
};

class FakeOwnProcess final : public platform::OwnProcess {
public:
    std::int32_t pid() const override { return ownPID; }
    std::string name() const override { return ownName; }
    void terminate(int status) override { terminations.push_back(status); }

    std::int32_t ownPID = 4242;
    std::string ownName = "halyardd";
    std::vector<int> terminations; // the statuses
};

} // namespace halyard::testing
