// What would leave the device, key by key, out of the very requests.
//
// Not thread-safe.
#pragma once

#include <array>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <tuple>

#include <rapidjson/document.h>

#include "Options.h"
#include "send/Compression.h"
#include "send/Receiver.h"

namespace halyard::exporting {

// A receiver that looks at requests instead of sending them.
class Preview final : public Receiver {
public:
    struct Key {
        std::uint64_t count = 0;
        std::string example; // of the first that had one
    };
    // Where it stands: the signal ("resource" for what each request says), the name of the
    // record, and the key, those of dictionaries inside after a dot.
    using Place = std::tuple<std::string, std::string, std::string>;

    // Takes what is not compressed.
    Answer post(Signal signal, std::string_view body, bool isCompressed) override;

    const std::map<Place, Key>& keys() const { return keys_; }
    std::uint64_t records(Signal signal) const {
        return records_[static_cast<std::size_t>(signal)];
    }
    std::uint64_t requests() const { return requests_; }
    // As they would be sent.
    std::uint64_t bytes() const { return bytes_; }
    // Keys beyond those that are listed.
    std::uint64_t leftOut() const { return leftOut_; }

private:
    void takeItem(Signal signal, const rapidjson::Value& item);
    void takeAttributes(const std::string& where, const std::string& name,
                        const rapidjson::Value& holder);
    void takeValue(const std::string& where, const std::string& name, const std::string& key,
                   const rapidjson::Value& value);
    void add(const std::string& where, const std::string& name, const std::string& key,
             const std::string& example);

    Gzip gzip_;
    std::map<Place, Key> keys_;
    std::array<std::uint64_t, kSignals> records_{};
    std::uint64_t requests_ = 0;
    std::uint64_t bytes_ = 0;
    std::uint64_t leftOut_ = 0;
};

} // namespace halyard::exporting
