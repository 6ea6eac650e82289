// What an operation came to that may fail: its value, or why there is none.
//
// The one way in which whatever touches the system says so. `ok()` is asked
// before either half is looked at, so that no text can be taken for a value and
// no default value for success. A success costs what its value costs; only a
// failure makes a text. Values; any thread.
#pragma once

#include <cassert>
#include <concepts>
#include <optional>
#include <string>
#include <system_error>
#include <type_traits>
#include <utility>
#include <variant>

namespace halyard {

// Who knows more about a kind of failure (a line, a code of another library)
// derives from it and says Result<T, ThatFailure>.
struct Failure {
    std::errc code{};   // The system's; none when the system did not refuse.
    std::string text{}; // What was tried, or what is wrong; may be left out.

    bool operator==(const Failure&) const = default;

    // For people: the text, what the code means, or "TEXT: MEANING".
    [[nodiscard]] std::string message() const;

    // Of the system call that just failed.
    [[nodiscard]] static Failure ofErrno(std::string text = {});
};

template <class T, class F = Failure> class [[nodiscard]] Result {
public:
    template <std::convertible_to<T> U>
    requires(!std::derived_from<std::remove_cvref_t<U>, F> &&
             !std::same_as<std::remove_cvref_t<U>, Result>) Result(U&& value)
        : held_(std::in_place_index<0>, std::forward<U>(value)) {}
    Result(F failure) : held_(std::in_place_index<1>, std::move(failure)) {}

    bool ok() const { return held_.index() == 0; }

    // Requires ok().
    const T& value() const& {
        assert(ok());
        return *std::get_if<0>(&held_);
    }
    T& value() & {
        assert(ok());
        return *std::get_if<0>(&held_);
    }
    T&& value() && { return std::move(value()); }

    // Requires !ok().
    const F& failure() const {
        assert(!ok());
        return *std::get_if<1>(&held_);
    }

    bool operator==(const Result&) const = default;

private:
    std::variant<T, F> held_;
};

// Done, or why not.
template <class F> class [[nodiscard]] Result<void, F> {
public:
    Result() = default;
    Result(F failure) : failure_(std::move(failure)) {}

    bool ok() const { return !failure_; }

    // Requires !ok().
    const F& failure() const {
        assert(!ok());
        return *failure_;
    }

    bool operator==(const Result&) const = default;

private:
    std::optional<F> failure_;
};

} // namespace halyard
