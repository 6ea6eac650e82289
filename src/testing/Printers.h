// How GoogleTest shows our values when an expectation fails.
#pragma once

#include <ostream>

#include "common/Description.h"
#include "common/Error.h"
#include "common/Value.h"

namespace halyard {

inline void PrintTo(const Value& value, std::ostream* out) {
    *out << describe(value);
}
inline void PrintTo(const Dictionary& dictionary, std::ostream* out) {
    *out << describe(Value(dictionary));
}
inline void PrintTo(const List& list, std::ostream* out) {
    *out << describe(Value(list));
}
inline void PrintTo(const Error& error, std::ostream* out) {
    *out << error.domain << ' ' << error.code << ' ' << error.message;
}

} // namespace halyard
