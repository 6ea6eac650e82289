#include "ProfileReader.h"

#include <array>

#include "PipeWireHeaders.h"

namespace halyard::pipewire {

namespace {

// The fields of a struct by their place, as far as they are there.
class Fields final {
public:
    explicit Fields(const spa_pod* block) {
        if (block == nullptr || !spa_pod_is_struct(block)) {
            return;
        }
        raw::forEachPod(block, [this](const spa_pod* field) {
            if (count_ < fields_.size()) {
                fields_[count_++] = field;
            }
        });
    }

    bool empty() const { return count_ == 0; }
    std::optional<std::int64_t> wide(std::size_t place) const {
        std::int64_t value = 0;
        return place < count_ && spa_pod_get_long(fields_[place], &value) == 0
                   ? std::optional(value)
                   : std::nullopt;
    }
    std::optional<std::int32_t> number(std::size_t place) const {
        std::int32_t value = 0;
        return place < count_ && spa_pod_get_int(fields_[place], &value) == 0 ? std::optional(value)
                                                                              : std::nullopt;
    }
    std::optional<spa_fraction> fraction(std::size_t place) const {
        spa_fraction value{};
        return place < count_ && spa_pod_get_fraction(fields_[place], &value) == 0
                   ? std::optional(value)
                   : std::nullopt;
    }

private:
    std::array<const spa_pod*, 16> fields_{};
    std::size_t count_ = 0;
};

// Int id, String name, Long previous signal, Long signal, Long awake, Long finish,
// Int status, Fraction latency; since 1.0 Int missed cycles.
std::optional<NodeCycle> readNode(const spa_pod* block) {
    const Fields fields(block);
    const auto id = fields.number(0);
    const auto previous = fields.wide(2);
    const auto signal = fields.wide(3);
    const auto awake = fields.wide(4);
    const auto finish = fields.wide(5);
    const auto status = fields.number(6);
    if (!id || !previous || !signal || !awake || !finish || !status) {
        return std::nullopt;
    }
    NodeCycle node{.id = static_cast<ObjectId>(*id),
                   .previousSignal = *previous,
                   .signal = *signal,
                   .awake = *awake,
                   .finish = *finish,
                   .progress = static_cast<Progress>(*status),
                   .missedSoFar = std::nullopt};
    if (const auto missed = fields.number(8)) {
        node.missedSoFar = static_cast<std::uint32_t>(*missed);
    }
    return node;
}

// Int flags, Int id, String name, Long nanoseconds, Fraction rate, Long position,
// Long duration, Long delay, Double rate difference, Long next nanoseconds; since 1.0
// more.
bool readClock(const spa_pod* block, Cycle& cycle) {
    const Fields fields(block);
    const auto time = fields.wide(3);
    const auto rate = fields.fraction(4);
    const auto duration = fields.wide(6);
    if (!time || !rate || !duration) {
        return false;
    }
    cycle.clock = *time;
    cycle.rateNumerator = rate->num;
    cycle.rateDenominator = rate->denom;
    cycle.frames = *duration;
    cycle.nextClock = fields.wide(9).value_or(0);
    return true;
}

// Reads one record into `cycle`; false when it lacks a clock or a driver.
bool readRecord(const spa_pod* record, Cycle& cycle) {
    bool hasClock = false;
    bool hasDriver = false;
    cycle.followers.clear();
    cycle.driverMissedSoFar = 0;
    raw::forEachProperty(record, [&](std::uint32_t key, const spa_pod* value) {
        if (key == SPA_PROFILER_info) {
            // Long counter, three Floats of load, Int missed cycles.
            cycle.driverMissedSoFar =
                static_cast<std::uint32_t>(Fields(value).number(4).value_or(0));
        } else if (key == SPA_PROFILER_clock) {
            hasClock = readClock(value, cycle);
        } else if (key == SPA_PROFILER_driverBlock) {
            if (const auto node = readNode(value)) {
                cycle.driver = *node;
                hasDriver = true;
            }
        } else if (key == SPA_PROFILER_followerBlock &&
                   cycle.followers.size() < Cycle::kMaxFollowers) {
            if (const auto node = readNode(value)) {
                cycle.followers.push_back(*node);
            }
        }
    });
    return hasClock && hasDriver && cycle.length() > 0;
}

} // namespace

std::size_t readProfile(const spa_pod* portion, std::size_t size, const CycleListener& listener) {
    if (size < sizeof(spa_pod) || SPA_POD_SIZE(portion) > size || !spa_pod_is_struct(portion)) {
        return 1;
    }
    std::size_t skipped = 0;
    Cycle cycle;
    raw::forEachPod(portion, [&](const spa_pod* record) {
        if (readRecord(record, cycle)) {
            listener(cycle);
        } else {
            ++skipped;
        }
    });
    return skipped;
}

} // namespace halyard::pipewire
