// Messages of one kind, a line each: whatever is remembered of those before changes nothing of
// what one becomes.

#include <cstdint>
#include <string_view>

#include "Require.h"
#include "content/PayloadAttributes.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace halyard::exporting;
    constexpr otlp::Tag kTag = 6;
    std::string_view rest(reinterpret_cast<const char*>(data), size);
    const Omission omission({"secret"});
    PayloadAttributes remembering(omission);
    PayloadAttributes parsing(omission);
    AttributeBytes again;
    AttributeBytes anew;
    while (!rest.empty()) {
        const std::string_view json = rest.substr(0, rest.find('\n'));
        rest.remove_prefix(json.size() == rest.size() ? json.size() : json.size() + 1);
        remembering.addOfKind(again, kTag, 0, json);
        parsing.add(anew, kTag, json);
        halyard::fuzz::require(again.texts == anew.texts && again.numbers == anew.numbers);
        again.clear();
        anew.clear();
    }
    return 0;
}
