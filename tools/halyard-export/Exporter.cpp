#include "Exporter.h"

#include <algorithm>
#include <cmath>
#include <fmt/format.h>

#include "StoreAccess.h"
#include "platform/Log.h"

namespace halyard::exporting {
namespace {

using reading::Outcome;

// Somebody has to give us other credentials, which may happen where we cannot see it.
constexpr double kRefusedSeconds = 3600;
constexpr double kDay = 86400;
// Of what a receiver says.
constexpr std::size_t kMostWords = 200;
// Spans first show what their logs belong to, but logs are what is new most often.
constexpr Signal kOrder[] = {Signal::Logs, Signal::Traces, Signal::Metrics};

std::string wordsOf(const Answer& answer) {
    return answer.status == 0 ? answer.error : fmt::format("it answers {}", answer.status);
}

} // namespace

void Exporter::follow(Plan plan) {
    plan_ = std::move(plan);
    lanes_ = {};
    collector_.reset();
    scope_.omission = Omission(plan_.options.omit);
    scope_.drivers = plan_.drivers;
    scope_.analyticsEvents = plan_.options.analyticsEvents;
    scope_.sharesSessions =
        plan_.options.isSent(Signal::Traces) && plan_.options.isSent(Signal::Metrics);
    scope_.limits = plan_.options.limits;
    resource_.deviceName = plan_.deviceName;
    resource_.system = systemFacts();
    resource_.own = plan_.options.resource;
}

Exporter::Step Exporter::step() {
    Step step;
    if (!plan_.options.consent || plan_.receiver == nullptr) {
        return step;
    }
    for (const Signal signal : kOrder) {
        if (!plan_.options.isSent(signal)) {
            continue;
        }
        Lane& lane = laneOf(signal);
        if (world_.now() < lane.notBefore) {
            step.isLeft = true;
            step.next = std::min(step.next, lane.notBefore);
            continue;
        }
        if (const auto done = stepOf(signal, step); !done.ok()) {
            // The store or our own place: worth another try, like a receiver.
            step.isLeft = true;
            ++lane.failures;
            lane.notBefore = world_.now() + std::chrono::duration<double>(
                                                delayAfter(lane.failures, world_.chance(), {}))
                                                .count();
            step.next = std::min(step.next, lane.notBefore);
            tell(signal, done.failure().message());
        }
    }
    return step;
}

Outcome<bool> Exporter::take(Signal signal, Batch& batch) {
    auto store = openStore(store_);
    if (!store.ok()) {
        return store.failure();
    }
    if (!store.value()) {
        return false;
    }
    reading::StoreReader& reader = *store.value();
    auto facts = factsOf(reader);
    if (!facts.ok()) {
        return facts.failure();
    }
    if (facts.value().device.empty() && !plan_.ignoresConsent) {
        return false;
    }
    if (collector_ == nullptr || scope_.identity.device() != facts.value().device) {
        scope_.identity = Identity(facts.value().device);
        resource_.device = facts.value().device;
        collector_ = std::make_unique<Collector>(scope_);
        if (auto followed = place_.follow(facts.value().device); !followed.ok()) {
            return followed.failure();
        }
    }
    scope_.consent = plan_.ignoresConsent ? ConsentHistory::always() : facts.value().consent;
    auto collected = collector_->collect(signal, reader, place_, world_.now());
    if (!collected.ok()) {
        return collected.failure();
    }
    batch = std::move(collected.value());
    return true;
}

Outcome<void> Exporter::stepOf(Signal signal, Step& step) {
    Batch batch;
    const auto taken = take(signal, batch);
    if (!taken.ok()) {
        return taken.failure();
    }
    if (!taken.value()) {
        return {};
    }
    if (batch.body.count() > 0) {
        auto sent = send(signal, batch, step);
        collector_->takeBack(std::move(batch.body));
        return sent;
    }
    step.hasMore = step.hasMore || batch.hasMore;
    return place_.commit(signal, batch.change, world_.now());
}

Exporter::Load Exporter::loadOf(const Batch& batch) {
    batch.body.finish(resourceAttributes(resource_, scope_.omission), plain_);
    if (plan_.options.compress) {
        if (const std::string_view packed = gzip_.compressed(plain_); !packed.empty()) {
            return {packed, true};
        }
    }
    return {plain_, false};
}

Outcome<void> Exporter::send(Signal signal, Batch& batch, Step& step) {
    Lane& lane = laneOf(signal);
    const Load load = loadOf(batch);
    const double now = world_.now();
    if (place_.bytesToday(now) + load.body.size() > plan_.options.maxBytesPerDay) {
        lane.notBefore = (std::floor(now / kDay) + 1) * kDay;
        step.isLeft = true;
        step.next = std::min(step.next, lane.notBefore);
        tell(signal, fmt::format("max_bytes_per_day ({}) is used up until midnight (UTC)",
                                 plan_.options.maxBytesPerDay));
        return {};
    }
    if (!world_.mayGoOn()) {
        step.isLeft = true;
        return {};
    }
    const Answer answer = plan_.receiver->post(signal, load.body, load.isCompressed);
    step.isLeft = step.isLeft || answer.isStopped;
    if (answer.isStopped) {
        return {};
    }
    switch (verdictOn(answer)) {
    case Verdict::Accepted:
        // There may be more, even if it was not known when the batch was taken.
        step.hasMore = true;
        return accept(signal, batch, answer, load.body.size());
    case Verdict::Dropped:
        step.hasMore = true;
        return giveUp(signal, batch, answer);
    default:
        retryLater(signal, answer);
        step.isLeft = true;
        step.next = std::min(step.next, lane.notBefore);
        return place_.noteFailure(wordsOf(answer), world_.now());
    }
}

Outcome<void> Exporter::giveUp(Signal signal, Batch& batch, const Answer& answer) {
    if (batch.countable() > 0) {
        batch.change.losses[Loss::Refused] += batch.countable();
        tell(signal, fmt::format("{} are given up: {} answers {}", nameOf(signal),
                                 shownAddress(plan_.options.urls[static_cast<std::size_t>(signal)]),
                                 answer.status));
    }
    auto committed = place_.commit(signal, batch.change, world_.now());
    if (committed.ok()) {
        collector_->arrived(signal);
    }
    return committed;
}

Outcome<void> Exporter::accept(Signal signal, Batch& batch, const Answer& answer,
                               std::size_t bytes) {
    const PartialSuccess partial = partialSuccessIn(answer.body);
    const std::uint64_t rejected = std::min<std::uint64_t>(partial.rejected, batch.countable());
    if (rejected > 0) {
        batch.change.losses[Loss::Rejected] += rejected;
        tell(signal, fmt::format("the receiver rejected {} records: {}", rejected,
                                 std::string_view(partial.message).substr(0, kMostWords)));
    } else {
        tell(signal, "");
    }
    batch.change.records = batch.body.count() - rejected;
    batch.change.bytesSent = bytes;
    Lane& lane = laneOf(signal);
    lane.failures = 0;
    auto committed = place_.commit(signal, batch.change, world_.now());
    if (committed.ok()) {
        collector_->arrived(signal);
    }
    return committed;
}

void Exporter::retryLater(Signal signal, const Answer& answer) {
    Lane& lane = laneOf(signal);
    ++lane.failures;
    const bool isRefused = verdictOn(answer) == Verdict::Refused;
    const double delay = isRefused
                             ? kRefusedSeconds
                             : std::chrono::duration<double>(
                                   delayAfter(lane.failures, world_.chance(), answer.retryAfter))
                                   .count();
    lane.notBefore = world_.now() + delay;
    tell(signal, fmt::format("{} does not take {}: {}; it is tried again",
                             shownAddress(plan_.options.urls[static_cast<std::size_t>(signal)]),
                             nameOf(signal), wordsOf(answer)));
}

// One line an episode: what stays the same is not said again.
void Exporter::tell(Signal signal, const std::string& trouble) {
    Lane& lane = laneOf(signal);
    if (trouble == lane.told) {
        return;
    }
    if (trouble.empty()) {
        HY_LOG_DEFAULT(HYReportingPlatformCategory, "{} are taken again", nameOf(signal));
    } else {
        HY_LOG_ERROR(HYReportingPlatformCategory, "{}", trouble);
    }
    lane.told = trouble;
}

} // namespace halyard::exporting
