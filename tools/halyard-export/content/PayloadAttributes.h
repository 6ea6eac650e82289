// The dictionaries of the store as attributes.
//
// Not thread-safe: the scratch buffers are used again.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "content/Omission.h"
#include "otlp/Attributes.h"
#include "reading/JsonFields.h"

namespace halyard::exporting {

// What stands before each key of ours.
inline constexpr std::string_view kPrefix = "halyard.";

class PayloadAttributes {
public:
    // Borrows `omission`.
    explicit PayloadAttributes(const Omission& omission) : omission_(omission) {}

    // The names that stand for the application of what follows.
    void setNames(std::vector<std::string> names) { names_ = std::move(names); }

    bool isLeftOut(std::string_view key, std::string_view text) const;

    // All entries of a JSON object, their keys after kPrefix. What is no object has none.
    void addAll(otlp::Writer& writer, otlp::Tag tag, std::string_view json);
    // One entry; nothing where it is left out.
    void add(otlp::Writer& writer, otlp::Tag tag, std::string_view key,
             const rapidjson::Value& value);
    void addText(otlp::Writer& writer, otlp::Tag tag, std::string_view key, std::string_view text);

private:
    // False: it is left out.
    bool append(std::string& any, const rapidjson::Value& value, int depth);
    bool appendDictionary(std::string& any, const rapidjson::Value& value, int depth);
    bool appendList(std::string& any, const rapidjson::Value& value, int depth);
    bool namesApplication(std::string_view text) const;

    const Omission& omission_;
    std::vector<std::string> names_;
    bool isSummary_ = false;
    reading::JsonFields fields_;
    std::string any_;
    std::string key_;
};

} // namespace halyard::exporting
