// Decodes frames and looks at refusals, for the tests of this folder.
#pragma once

#include <gtest/gtest.h>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "protocol/Wire.h"
#include "protocol/WireTestSupport.h"

namespace halyard::protocol {

inline std::optional<Call> decode(const std::string& frame) {
    FrameScanner scanner;
    EXPECT_EQ(scanner.scan(frame), FrameScanner::Outcome::Complete);
    EXPECT_EQ(scanner.frameLength(), frame.size());
    return CallDecoder().decode(frame);
}

inline Call decodeRequest(std::string_view method, const std::vector<std::string>& params) {
    auto call = decode(packedRequest(method, params));
    EXPECT_TRUE(call.has_value());
    return call ? *call : Call{};
}

inline const std::string kEmptyMap = packedMap({});

inline void expectRefused(const std::string& method, const std::vector<std::string>& params,
                          const std::string& message,
                          IpcErrorCode code = IpcErrorCode::BadArgument) {
    const Call call = decodeRequest(method, params);
    const Error expected{"com.kestrel.halyard.ipc", static_cast<std::int64_t>(code), message};
    EXPECT_EQ(call.method, std::nullopt);
    EXPECT_EQ(call.messageID, 1U);
    ASSERT_TRUE(call.error.has_value());
    EXPECT_EQ(call.error->domain, expected.domain);
    EXPECT_EQ(call.error->code, expected.code);
    EXPECT_EQ(call.error->message, expected.message);
}

} // namespace halyard::protocol
