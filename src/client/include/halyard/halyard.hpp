// The C++ face of libhalyard: owners for the handles of halyard.h, and callbacks
// as callables. Everything is said there; here only what differs.
//
// Header-only, so that nothing but the C ABI crosses the library's border. No
// function throws (but std::function's allocation); no callback may.
#pragma once

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <ranges>
#include <span>
#include <string>
#include <string_view>
#include <utility>

#include "halyard/halyard.h"

namespace halyard::reporting {

using Result = halyard_result;

// Why a request failed, as a value of its own.
struct Failure {
    std::string domain;
    std::int64_t code = 0;
    std::string message;
};

namespace detail {

// Runs a heap-allocated callable once. The C ABI calls it exactly once when the
// request was accepted; accept() frees it when the request was not.
template <class Function> struct Once {
    static Function* make(Function function) { return new Function(std::move(function)); }
    template <class... Args> static void run(void* context, Args&&... args) noexcept {
        const std::unique_ptr<Function> function(static_cast<Function*>(context));
        (*function)(std::forward<Args>(args)...);
    }
    static Result accept(Result result, Function* function) {
        if (result != HALYARD_OK) {
            delete function;
        }
        return result;
    }
};

// Null on success. Valid during the callback.
struct FailureView {
    explicit FailureView(const halyard_error* error) {
        if (error != nullptr) {
            failure = {error->domain, error->code, error->message};
            pointer = &failure;
        }
    }
    Failure failure;
    const Failure* pointer = nullptr;
};

} // namespace detail

// The failure is null on success and lives only during the call.
using Done = std::function<void(const Failure*)>;
using ServiceTypeAnswer = std::function<void(const Failure*, std::uint16_t serviceType)>;
using ReporterAnswer =
    std::function<void(const Failure*, std::int64_t reporterID, std::uint16_t serviceType)>;
using ReportersAnswer = std::function<void(const Failure*, std::span<const std::int64_t>)>;

namespace detail {

inline void runDone(void* context, const halyard_error* error) noexcept {
    Once<Done>::run(context, FailureView(error).pointer);
}
inline void runServiceType(void* context, const halyard_error* error,
                           std::uint16_t serviceType) noexcept {
    Once<ServiceTypeAnswer>::run(context, FailureView(error).pointer, serviceType);
}
inline void runReporter(void* context, const halyard_error* error, std::int64_t reporterID,
                        std::uint16_t serviceType) noexcept {
    Once<ReporterAnswer>::run(context, FailureView(error).pointer, reporterID, serviceType);
}
inline void runReporters(void* context, const halyard_error* error, const std::int64_t* ids,
                         std::size_t count) noexcept {
    Once<ReportersAnswer>::run(context, FailureView(error).pointer, std::span(ids, count));
}

// `call` takes a C callback and its context; both null without a callable.
template <class Call> Result withDone(Done done, Call call) {
    if (!done) {
        return call(nullptr, nullptr);
    }
    Done* const kept = Once<Done>::make(std::move(done));
    return Once<Done>::accept(call(runDone, kept), kept);
}

} // namespace detail

// A message or a configuration, written front to back. Movable, not copyable.
class Dictionary {
public:
    explicit Dictionary(std::size_t capacity = 0) : handle_(halyard_dictionary_create(capacity)) {}

    Dictionary& set(const char* key, std::string_view value) {
        halyard_dictionary_set_text(get(), key, value.data(), value.size());
        return *this;
    }
    Dictionary& set(const char* key, const char* value) {
        return set(key, std::string_view(value));
    }
    Dictionary& set(const char* key, bool value) {
        halyard_dictionary_set_bool(get(), key, value);
        return *this;
    }
    Dictionary& set(const char* key, double value) {
        halyard_dictionary_set_double(get(), key, value);
        return *this;
    }
    Dictionary& set(const char* key, float value) {
        halyard_dictionary_set_float(get(), key, value);
        return *this;
    }
    template <std::signed_integral T> Dictionary& set(const char* key, T value) {
        halyard_dictionary_set_int(get(), key, value);
        return *this;
    }
    template <std::unsigned_integral T> Dictionary& set(const char* key, T value) {
        halyard_dictionary_set_uint(get(), key, value);
        return *this;
    }
    // A list of what a range has: texts, numbers, or ranges of them.
    template <std::ranges::input_range Range>
        requires(!std::convertible_to<const Range&, std::string_view>)
    Dictionary& set(const char* key, const Range& values) {
        beginList(key);
        for (const auto& value : values) {
            set(nullptr, value);
        }
        return end();
    }
    Dictionary& setDate(const char* key, std::int64_t seconds, std::uint32_t nanoseconds) {
        halyard_dictionary_set_date(get(), key, seconds, nanoseconds);
        return *this;
    }
    // In a list: the next element.
    template <class T> Dictionary& add(T value) { return set(nullptr, value); }
    Dictionary& beginDictionary(const char* key = nullptr) {
        halyard_dictionary_begin_dictionary(get(), key);
        return *this;
    }
    Dictionary& beginList(const char* key = nullptr) {
        halyard_dictionary_begin_list(get(), key);
        return *this;
    }
    Dictionary& end() {
        halyard_dictionary_end(get());
        return *this;
    }
    Dictionary& clear() {
        halyard_dictionary_clear(get());
        return *this;
    }

    halyard_dictionary* get() const { return handle_.get(); }

private:
    struct Destroy {
        void operator()(halyard_dictionary* handle) const { halyard_dictionary_destroy(handle); }
    };
    std::unique_ptr<halyard_dictionary, Destroy> handle_;
};

// halyard_issue: sound that was missing. The texts are borrowed during the call.
struct Issue {
    std::uint32_t category = 0; // HALYARD_CATEGORY_PLAYBACK or HALYARD_CATEGORY_RECORD
    const char* issueType = nullptr;
    const char* rtaidClient = nullptr;
    const char* node = nullptr;
    double anyChannelSilenceSeconds = 0;
};

// One reporting session; destroyed at the daemon with the object. May outlive
// its client.
class Session {
public:
    Session() = default;
    explicit Session(halyard_session* handle) : handle_(handle) {}

    explicit operator bool() const { return handle_ != nullptr; }
    std::int64_t reporterID() const { return halyard_session_reporter_id(get()); }
    Result setServiceType(std::uint16_t serviceType) {
        return halyard_session_set_service_type(get(), serviceType);
    }
    Result setConfiguration(const Dictionary& configuration) {
        return halyard_session_set_configuration(get(), configuration.get());
    }
    Result start(Done stopped = nullptr) {
        return detail::withDone(std::move(stopped), [this](halyard_done_fn done, void* context) {
            return halyard_session_start(get(), done, context);
        });
    }
    Result stop(Done done = nullptr) {
        return detail::withDone(std::move(done), [this](halyard_done_fn call, void* context) {
            return halyard_session_stop(get(), call, context);
        });
    }
    Result send(const Dictionary& message, std::uint32_t category, std::uint16_t type) {
        return halyard_session_send(get(), message.get(), category, type);
    }
    Result reportIssue(const Issue& issue) { return report(issue, nullptr); }
    Result reportIssue(const Issue& issue, const Dictionary& more) {
        return report(issue, more.get());
    }

    halyard_session* get() const { return handle_.get(); }

private:
    Result report(const Issue& issue, const halyard_dictionary* more) {
        halyard_issue raw{};
        raw.size = sizeof(raw);
        raw.category = issue.category;
        raw.issue_type = issue.issueType;
        raw.rtaid_client = issue.rtaidClient;
        raw.node = issue.node;
        raw.any_channel_silence_seconds = issue.anyChannelSilenceSeconds;
        raw.more = more;
        return halyard_session_report_issue(get(), &raw);
    }
    struct Destroy {
        void operator()(halyard_session* handle) const { halyard_session_destroy(handle); }
    };
    std::unique_ptr<halyard_session, Destroy> handle_;
};

// The connection. Destruction flushes for flushTimeoutMs at most.
class Client {
public:
    using ConnectionChanged = std::function<void(bool connected)>;

    struct Options {
        const char* socketPath = nullptr;
        std::size_t memoryLimit = 0;
        std::uint32_t retryFirstMs = 0;
        std::uint32_t retryLastMs = 0;
        std::uint32_t flushTimeoutMs = 1000;
        ConnectionChanged connectionChanged = nullptr;
    };

    explicit Client(Options options)
        : changed_(std::make_unique<ConnectionChanged>(std::move(options.connectionChanged))),
          flushTimeoutMs_(options.flushTimeoutMs) {
        halyard_options raw{};
        raw.size = sizeof(raw);
        raw.socket_path = options.socketPath;
        raw.memory_limit = options.memoryLimit;
        raw.retry_first_ms = options.retryFirstMs;
        raw.retry_last_ms = options.retryLastMs;
        raw.context = changed_.get();
        raw.connection_changed = *changed_ ? runChanged : nullptr;
        handle_ = halyard_client_create_with_options(&raw);
    }
    explicit Client(const char* socketPath = nullptr) : Client(Options{.socketPath = socketPath}) {}
    Client(Client&& other) noexcept
        : changed_(std::move(other.changed_)), flushTimeoutMs_(other.flushTimeoutMs_),
          handle_(std::exchange(other.handle_, nullptr)) {}
    Client& operator=(Client&&) = delete;
    ~Client() { halyard_client_destroy(handle_, flushTimeoutMs_); }

    explicit operator bool() const { return handle_ != nullptr; }

    // Reporter ID 0: a random one. An empty Session when it could not be made.
    Session createSession(std::int64_t reporterID = 0) {
        return Session(halyard_session_create(handle_, reporterID));
    }
    Result send(const Dictionary& message, std::uint32_t category, std::uint16_t type,
                std::span<const std::int64_t> reporterIDs, Done done = nullptr) {
        // An empty span may have no address, which would mean a broadcast.
        static constexpr std::int64_t kNone = 0;
        const std::int64_t* const ids = reporterIDs.empty() ? &kNone : reporterIDs.data();
        return sendTo(message, category, type, ids, reporterIDs.size(), std::move(done));
    }
    Result broadcast(const Dictionary& message, std::uint32_t category, std::uint16_t type,
                     Done done = nullptr) {
        return sendTo(message, category, type, nullptr, 0, std::move(done));
    }
    Result getServiceType(std::int64_t reporterID, ServiceTypeAnswer answered) {
        using Once = detail::Once<ServiceTypeAnswer>;
        ServiceTypeAnswer* const kept = Once::make(std::move(answered));
        return Once::accept(
            halyard_client_get_service_type(handle_, reporterID, detail::runServiceType, kept),
            kept);
    }
    Result reporterValid(std::int64_t reporterID, ReporterAnswer answered) {
        using Once = detail::Once<ReporterAnswer>;
        ReporterAnswer* const kept = Once::make(std::move(answered));
        return Once::accept(
            halyard_client_reporter_valid(handle_, reporterID, detail::runReporter, kept), kept);
    }
    Result getAllReporters(ReportersAnswer answered) {
        using Once = detail::Once<ReportersAnswer>;
        ReportersAnswer* const kept = Once::make(std::move(answered));
        return Once::accept(halyard_client_get_all_reporters(handle_, detail::runReporters, kept),
                            kept);
    }
    Result killService(Done refused = nullptr) {
        return detail::withDone(std::move(refused), [this](halyard_done_fn call, void* context) {
            return halyard_client_kill_service(handle_, call, context);
        });
    }
    Result flush(std::uint32_t timeoutMs) { return halyard_client_flush(handle_, timeoutMs); }
    halyard_statistics statistics() const {
        halyard_statistics result{};
        result.size = sizeof(result);
        halyard_client_statistics(handle_, &result);
        return result;
    }

    halyard_client* get() const { return handle_; }

private:
    static void runChanged(void* context, halyard_connection_state state) noexcept {
        (*static_cast<ConnectionChanged*>(context))(state == HALYARD_CONNECTED);
    }
    Result sendTo(const Dictionary& message, std::uint32_t category, std::uint16_t type,
                  const std::int64_t* ids, std::size_t count, Done done) {
        return detail::withDone(std::move(done), [&](halyard_done_fn call, void* context) {
            return halyard_client_send(handle_, message.get(), category, type, ids, count, call,
                                       context);
        });
    }

    // Owned here at a fixed address, because the handle's thread borrows it.
    std::unique_ptr<ConnectionChanged> changed_;
    std::uint32_t flushTimeoutMs_;
    halyard_client* handle_ = nullptr;
};

} // namespace halyard::reporting
