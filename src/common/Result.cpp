#include "common/Result.h"

#include <cerrno>

namespace halyard {

std::string Failure::message() const {
    if (code == std::errc{}) {
        return text;
    }
    const std::string meaning = std::make_error_code(code).message();
    return text.empty() ? meaning : text + ": " + meaning;
}

Failure Failure::ofErrno(std::string text) {
    return {static_cast<std::errc>(errno), std::move(text)};
}

} // namespace halyard
