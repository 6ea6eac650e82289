// Sends what is new in the store, signal by signal, and remembers how far it got.
//
// Each signal goes its own way: one that a receiver refuses does not hold up the others.
// Time, chance and the receiver are given, so that every decision can be tested. One
// thread.
#pragma once

#include <array>
#include <filesystem>
#include <functional>
#include <limits>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "Options.h"
#include "content/Collector.h"
#include "content/Resource.h"
#include "place/ExportPlace.h"
#include "send/Compression.h"
#include "send/Receiver.h"

namespace halyard::exporting {

struct ExporterWorld {
    std::function<double()> now;    // seconds since 1970
    std::function<double()> chance; // 0 to 1
    // False while nothing may be sent any more, whatever was decided before.
    std::function<bool()> mayGoOn;
};

class Exporter {
public:
    static constexpr double kNever = std::numeric_limits<double>::infinity();

    // Borrows `receiver`. `ignoresConsent`: for who only shows what would leave.
    struct Plan {
        Options options;
        Receiver* receiver = nullptr;
        std::optional<std::string> deviceName;
        DriverNames drivers;
        bool ignoresConsent = false;
    };

    Exporter(std::filesystem::path store, ExportPlace place, ExporterWorld world)
        : store_(std::move(store)), place_(std::move(place)), world_(std::move(world)) {}

    // What waited because of the last plan is tried at once.
    void follow(Plan plan);

    struct Step {
        bool hasMore = false; // call again now
        bool isLeft = false;  // something could not be sent
        double next = kNever; // when to try again what was not sent
    };
    // At most one request of each signal.
    Step step();

    const ExportPlace& place() const { return place_; }

private:
    struct Lane {
        unsigned failures = 0;
        double notBefore = 0;
        std::string told; // what the log has been told of it
    };
    // A body as it is sent; valid until the next.
    struct Load {
        std::string_view body;
        bool isCompressed = false;
    };

    // False: there is nothing to read now.
    reading::Outcome<bool> take(Signal signal, Batch& batch);
    reading::Outcome<void> stepOf(Signal signal, Step& step);
    reading::Outcome<void> send(Signal signal, Batch& batch, Step& step);
    reading::Outcome<void> accept(Signal signal, Batch& batch, const Answer& answer,
                                  std::size_t bytes);
    reading::Outcome<void> giveUp(Signal signal, Batch& batch, const Answer& answer);
    void retryLater(Signal signal, const Answer& answer);
    void tell(Signal signal, const std::string& trouble);
    Load loadOf(const Batch& batch);
    Lane& laneOf(Signal signal) { return lanes_[static_cast<std::size_t>(signal)]; }

    const std::filesystem::path store_;
    ExportPlace place_;
    const ExporterWorld world_;
    Plan plan_;
    ExportScope scope_;
    ResourceFacts resource_;
    std::unique_ptr<Collector> collector_;
    std::array<Lane, kSignals> lanes_;
    std::string plain_; // the body of the last load
    Gzip gzip_;
};

} // namespace halyard::exporting
