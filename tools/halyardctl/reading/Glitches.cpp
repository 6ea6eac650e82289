#include "reading/Glitches.h"

#include <algorithm>
#include <bit>
#include <fmt/format.h>
#include <vector>

#include "common/HYReportingUtility.h"

namespace halyard::reading {
namespace {

enum Column : int { kID, kSession, kSessionInfo, kUserInfo, kCategory, kTime, kPayload };

StoreReader::Scan scanOf(StoreReader::Ids ids) {
    return {"upload_message", "upload_session, session_info, user_info, category, time, payload",
            fmt::format("type = {}", kAudioEventTypeIssueDetector), ids.after, ids.upTo};
}

std::uint64_t mix(std::uint64_t hash, std::uint64_t with) {
    hash ^= with + 0x9E3779B97F4A7C15U + (hash << 6) + (hash >> 2);
    return hash * 0xFF51AFD7ED558CCDU ^ (hash >> 33);
}

// Which of the messages are the last of their glitch.
class LastOfEach {
public:
    void note(const Row& row, const JsonFields& fields) {
        const auto start = fields.number("glitch_start");
        if (!start) {
            return; // Told once, and so not looked up.
        }
        const std::hash<std::string_view> hashOf;
        std::uint64_t key = static_cast<std::uint64_t>(row.integer(kSession));
        key = mix(key, std::bit_cast<std::uint64_t>(*start));
        key = mix(key, hashOf(fields.text("node").value_or("")));
        key = mix(key, row.isNull(kSession) ? hashOf(row.text(kUserInfo)) : 0);
        told_.push_back({key, row.integer(kID)});
    }
    // Keeps the ids of messages that another one came after.
    void finish() {
        std::sort(told_.begin(), told_.end(), [](const Told& left, const Told& right) {
            return left.key != right.key ? left.key < right.key : left.id < right.id;
        });
        std::size_t kept = 0;
        for (std::size_t i = 0; i + 1 < told_.size(); ++i) {
            if (told_[i].key == told_[i + 1].key) {
                told_[kept++] = told_[i];
            }
        }
        told_.resize(kept);
        std::sort(told_.begin(), told_.end(),
                  [](const Told& left, const Told& right) { return left.id < right.id; });
    }
    // After finish(); by rising ids.
    bool isOutdated(std::int64_t id) {
        while (next_ < told_.size() && told_[next_].id < id) {
            ++next_;
        }
        return next_ < told_.size() && told_[next_].id == id;
    }

private:
    struct Told {
        std::uint64_t key;
        std::int64_t id;
    };
    std::vector<Told> told_;
    std::size_t next_ = 0;
};

Direction directionOf(std::uint32_t category, Direction otherwise) {
    switch (category) {
    case kAudioEventCategoryPlayback:
        return Direction::Playback;
    case kAudioEventCategoryRecord:
        return Direction::Capture;
    default:
        return otherwise;
    }
}

} // namespace

Glitch glitchIn(const JsonFields& fields, std::uint32_t category, const SessionNames& names) {
    const auto textOf = [&fields](const char* key) {
        const auto found = fields.text(key);
        return found ? std::optional<std::string>(*found) : std::nullopt;
    };
    Glitch glitch;
    glitch.application = textOf("rtaid_client");
    if (!glitch.application) {
        glitch.application = names.application;
    }
    glitch.direction = directionOf(category, names.direction);
    glitch.node = textOf("node");
    glitch.device = textOf("glitch_device");
    glitch.start = fields.number("glitch_start");
    glitch.seconds = fields.number("any_channel_silence_seconds");
    glitch.cycles = fields.integer("glitch_cycles");
    glitch.cause = textOf("issue_type");
    glitch.inferred = fields.integer("glitch_inferred").value_or(0) != 0;
    const rapidjson::Value* const evidence = fields.find("glitch_evidence");
    glitch.evidence = evidence != nullptr && evidence->IsObject() ? evidence : nullptr;
    return glitch;
}

Outcome<void> forEachGlitch(StoreReader& reader, const TimeRange& range,
                            const std::function<bool(const Glitch&)>& take) {
    // One is told of after it began, however late.
    const auto ids = reader.idsIn({range.since, TimeRange().until}, "upload_message", "time");
    if (!ids.ok()) {
        return ids.failure();
    }
    StoreReader::Ids span = ids.value();
    LastOfEach last;
    JsonFields fields;
    const auto noted = reader.forEach(scanOf(span), [&](const Row& row) {
        span.upTo = row.integer(kID); // What comes later is not looked at.
        (void)fields.parse(row.text(kPayload));
        last.note(row, fields);
        return true;
    });
    if (!noted.ok() || span.upTo == INT64_MAX) {
        return noted;
    }
    last.finish();
    SessionDirectory directory(reader);
    return reader.forEach(scanOf(span), [&](const Row& row) {
        if (last.isOutdated(row.integer(kID))) {
            return true;
        }
        const auto session = row.maybeInteger(kSession);
        const SessionNames names =
            session ? directory.namesOf(*session)
                    : namesIn(fields, row.text(kSessionInfo), row.text(kUserInfo));
        (void)fields.parse(row.text(kPayload));
        Glitch glitch = glitchIn(fields, static_cast<std::uint32_t>(row.integer(kCategory)), names);
        glitch.session = session;
        glitch.told = row.real(kTime);
        return !range.contains(glitch.time()) || take(glitch);
    });
}

} // namespace halyard::reading
