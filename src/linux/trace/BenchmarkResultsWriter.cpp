#include "linux/trace/BenchmarkResultsWriter.h"

#include <array>
#include <cstdlib>
#include <rapidjson/filewritestream.h>
#include <rapidjson/prettywriter.h>
#include <thread>
#include <unistd.h>

#include "common/Description.h"
#include "common/Utf8.h"
#include "linux/system/AtomicFile.h"
#include "linux/system/PrivateFiles.h"
#include "linux/trace/TimelineFile.h"
#include "platform/Log.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

std::string hostName() {
    std::array<char, 256> name{};
    return ::gethostname(name.data(), name.size() - 1) == 0 ? name.data() : "";
}

std::string executable() {
    std::error_code error;
    return fs::read_symlink("/proc/self/exe", error).string();
}

std::string dateText(platform::WallTime time) {
    return rfc3339({std::chrono::floor<std::chrono::seconds>(time).time_since_epoch().count(), 0});
}

class BenchmarkResultsWriter final : public platform::ResultsWriter {
public:
    // Requires files that are open.
    BenchmarkResultsWriter(std::unique_ptr<AtomicFile> file, std::unique_ptr<AtomicFile> timeline)
        : file_(std::move(file)), timeline_(std::move(timeline)),
          stream_(file_->stream(), buffer_, sizeof buffer_), json_(stream_) {}

    void begin(std::string_view name, std::uint32_t version, platform::WallTime time) {
        json_.SetIndent(' ', 2);
        json_.StartObject();
        key("context");
        json_.StartObject();
        field("date", dateText(time));
        field("host_name", hostName());
        field("executable", executable());
        key("num_cpus");
        json_.Uint(std::thread::hardware_concurrency());
        writeLoad();
        field("library_build_type", "release");
        field("name", name);
        key("version");
        json_.Uint(version);
        json_.EndObject();
        key("benchmarks");
        json_.StartArray();
    }

    void newValue(std::string_view name, platform::ResultsUnit /*unit*/, double value) override {
        json_.StartObject();
        field("name", name);
        field("run_name", name);
        field("run_type", "iteration");
        key("iterations");
        json_.Uint(1);
        key("real_time");
        json_.Double(value);
        key("cpu_time");
        json_.Double(value);
        field("time_unit", "ns");
        json_.EndObject();
    }
    void newTimeline(const platform::TraceTimeline& timeline) override { timeline_.add(timeline); }

    void close() override {
        json_.EndArray();
        json_.EndObject();
        stream_.Put('\n');
        stream_.Flush();
        report(file_->commit(), "the values");
        report(timeline_.commit(), "the time line");
    }

private:
    void key(std::string_view name) {
        json_.Key(name.data(), static_cast<rapidjson::SizeType>(name.size()));
    }
    void field(std::string_view name, std::string_view value) {
        key(name);
        const std::string valid = replaceInvalidUtf8(value);
        json_.String(valid.data(), static_cast<rapidjson::SizeType>(valid.size()));
    }
    void writeLoad() {
        double load[3] = {};
        const int known = ::getloadavg(load, 3);
        key("load_avg");
        json_.StartArray();
        for (int i = 0; i < known; ++i) {
            json_.Double(load[i]);
        }
        json_.EndArray();
    }
    static void report(const Result<void>& result, const char* what) {
        if (!result.ok()) {
            HY_LOG_ERROR(HYReportingTraceCategory, "trace results are not written: {}: {}", what,
                         result.failure().message());
        }
    }

    const std::unique_ptr<AtomicFile> file_;
    TimelineFile timeline_;
    char buffer_[16384];
    rapidjson::FileWriteStream stream_;
    rapidjson::PrettyWriter<rapidjson::FileWriteStream> json_;
};

} // namespace

std::unique_ptr<platform::ResultsWriter>
BenchmarkResultsFiles::open(std::string_view path, std::string_view name, std::uint32_t version) {
    const fs::path values = directories_.mapped(path);
    if (!refuseLink(values.parent_path()).ok()) {
        return nullptr;
    }
    auto file = std::make_unique<AtomicFile>(values);
    auto timeline = std::make_unique<AtomicFile>(fs::path(values).replace_extension(".trace.json"));
    if (file->stream() == nullptr || timeline->stream() == nullptr) {
        return nullptr;
    }
    auto writer = std::make_unique<BenchmarkResultsWriter>(std::move(file), std::move(timeline));
    writer->begin(name, version, clock_.wallTime());
    return writer;
}

} // namespace halyard::linux_
