#pragma once

#include <memory>
#include <string>
#include <vector>

#include "platform/ResultsWriter.h"

namespace halyard::testing {

// Keeps what was written. With `refuse` no file can be opened.
class FakeResultsFiles final : public platform::ResultsFiles {
public:
    struct NamedValue {
        std::string name;
        double value;

        bool operator==(const NamedValue&) const = default;
    };
    struct File {
        std::string path;
        std::string name;
        std::uint32_t version = 0;
        std::vector<NamedValue> values;
        std::vector<platform::TraceTimeline> timelines;
        bool closed = false;
    };

    std::unique_ptr<platform::ResultsWriter> open(std::string_view path, std::string_view name,
                                                  std::uint32_t version) override {
        if (refuse) {
            return nullptr;
        }
        files.push_back(std::make_shared<File>());
        files.back()->path = path;
        files.back()->name = name;
        files.back()->version = version;
        return std::make_unique<Writer>(files.back());
    }

    std::vector<std::shared_ptr<File>> files;
    bool refuse = false;

private:
    class Writer final : public platform::ResultsWriter {
    public:
        explicit Writer(std::shared_ptr<File> file) : file_(std::move(file)) {}
        void newValue(std::string_view name, platform::ResultsUnit /*unit*/,
                      double value) override {
            file_->values.push_back({std::string(name), value});
        }
        void newTimeline(const platform::TraceTimeline& timeline) override {
            file_->timelines.push_back(timeline);
        }
        void close() override { file_->closed = true; }

    private:
        const std::shared_ptr<File> file_;
    };
};

} // namespace halyard::testing
