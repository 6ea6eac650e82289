// What never leaves the device, whatever it stands in.
//
// A key is left out with its value, at any depth. "application" is more than a key: it
// stands for every place of the application's name, so that values which name it go as
// well, under whatever key they stand.
//
// A value; any thread may read it.
#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace halyard::exporting {

class Omission {
public:
    static constexpr std::string_view kApplication = "application";

    Omission() = default;
    explicit Omission(std::vector<std::string> keys);

    bool omits(std::string_view key) const;
    bool omitsApplication() const { return omitsApplication_; }

    // Whether the text of a summary, which tells dictionaries as texts, holds a key that
    // never leaves.
    bool isToldIn(std::string_view summaryText) const;

private:
    std::vector<std::string> keys_; // sorted
    bool omitsApplication_ = false;
};

// Whether `text` holds `name` as a word of its own. An empty name is nowhere.
bool mentions(std::string_view text, std::string_view name);

} // namespace halyard::exporting
