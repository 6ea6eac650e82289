// The C ABI over Client (SessionC.cpp has the sessions, DictionaryC.cpp the dictionaries):
// arguments checked, nothing thrown across.

#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>

#include "client/Handles.h"

using halyard::client::Callback;
using halyard::client::Client;
using halyard::client::copySized;
using halyard::client::doneCallback;
using halyard::client::Record;
using halyard::client::recordOf;
using halyard::client::Settings;
using halyard::client::submitMessage;
using halyard::protocol::Method;

namespace {

constexpr std::size_t kMaxIDs = 4096;

Settings settingsOf(const halyard_options& options) {
    Settings settings;
    if (options.socket_path != nullptr) {
        settings.socketPaths = {options.socket_path};
    } else {
        settings.socketPaths = halyard::client::defaultSocketPaths(
            [](const char* name) -> const char* { return std::getenv(name); }, ::geteuid() == 0);
    }
    settings.memoryLimit = options.memory_limit;
    settings.retryFirst = std::chrono::milliseconds(options.retry_first_ms);
    settings.retryLast = std::chrono::milliseconds(options.retry_last_ms);
    settings.connectionChanged = options.connection_changed;
    settings.context = options.context;
    return settings;
}

std::unique_ptr<halyard_client> makeClient(const halyard_options& options) {
    auto client = std::make_shared<Client>(settingsOf(options), halyard::client::systemClock());
    if (!client->startThread()) {
        errno = EAGAIN;
        return nullptr;
    }
    return std::unique_ptr<halyard_client>(new halyard_client{std::move(client)});
}

halyard_result query(halyard_client* client, Method method, std::int64_t reporterID,
                     const Callback& callback) {
    return client->client->submit({.record = recordOf(method, reporterID, callback)});
}

} // namespace

extern "C" {

const char* halyard_result_text(halyard_result result) {
    switch (result) {
    case HALYARD_OK:
        return "accepted";
    case HALYARD_INVALID:
        return "bad argument, or dictionary not well formed";
    case HALYARD_QUEUE_FULL:
        return "dropped: the queue is full";
    case HALYARD_TOO_LARGE:
        return "dropped: too large";
    case HALYARD_CLOSED:
        return "the client has been destroyed";
    case HALYARD_FORKED:
        return "the client belongs to the parent process";
    case HALYARD_TIMED_OUT:
        return "timed out";
    case HALYARD_NO_MEMORY:
        return "out of memory";
    case HALYARD_MISUSE:
        return "not to be called from a callback";
    }
    return "unknown result";
}

// ---- Client -----------------------------------------------------------------------

halyard_client* halyard_client_create(const char* socket_path) {
    halyard_options options{};
    options.size = sizeof(options);
    options.socket_path = socket_path;
    return halyard_client_create_with_options(&options);
}

halyard_client* halyard_client_create_with_options(const halyard_options* given) {
    if (given == nullptr || given->size < sizeof(given->size)) {
        errno = EINVAL;
        return nullptr;
    }
    halyard_options options{};
    copySized(options, *given, given->size);
    if (options.socket_path != nullptr &&
        std::strlen(options.socket_path) >= sizeof(sockaddr_un::sun_path)) {
        errno = ENAMETOOLONG;
        return nullptr;
    }
    try {
        return makeClient(options).release();
    } catch (...) {
        errno = ENOMEM;
        return nullptr;
    }
}

halyard_result halyard_client_destroy(halyard_client* client, uint32_t timeout_ms) {
    if (client == nullptr) {
        return HALYARD_INVALID;
    }
    if (client->client->isForked()) {
        // What the parent's thread was working on is in no known state here, so it
        // is left alone.
        static_cast<void>(new (std::nothrow) std::shared_ptr<Client>(client->client));
        delete client;
        return HALYARD_FORKED;
    }
    if (client->client->onThread()) {
        return HALYARD_MISUSE;
    }
    const halyard_result result = client->client->close(std::chrono::milliseconds(timeout_ms));
    delete client;
    return result;
}

halyard_result halyard_client_flush(halyard_client* client, uint32_t timeout_ms) {
    if (client == nullptr) {
        return HALYARD_INVALID;
    }
    if (client->client->isForked()) {
        return HALYARD_FORKED;
    }
    return client->client->onThread()
               ? HALYARD_MISUSE
               : client->client->flush(std::chrono::milliseconds(timeout_ms));
}

halyard_result halyard_client_statistics(const halyard_client* client, halyard_statistics* out) {
    if (client == nullptr || out == nullptr || out->size < sizeof(out->size)) {
        return HALYARD_INVALID;
    }
    const Client::Counters& counters = client->client->counters();
    halyard_statistics now{};
    now.size = out->size;
    now.sent = counters.sent.load(std::memory_order_relaxed);
    now.dropped_queue_full = counters.queueFull.load(std::memory_order_relaxed);
    now.dropped_discarded = counters.discarded.load(std::memory_order_relaxed);
    now.dropped_too_large = counters.tooLarge.load(std::memory_order_relaxed);
    now.dropped_invalid = counters.invalid.load(std::memory_order_relaxed);
    now.reconnects = counters.reconnects.load(std::memory_order_relaxed);
    now.queued_bytes = client->client->queue().used();
    now.memory_limit = client->client->queue().capacity();
    copySized(*out, now, out->size);
    return client->client->isForked() ? HALYARD_FORKED : HALYARD_OK;
}

// ---- Without a session ------------------------------------------------------------

halyard_result halyard_client_send(halyard_client* client, const halyard_dictionary* message,
                                   uint32_t category, uint16_t type, const int64_t* reporter_ids,
                                   size_t count, halyard_done_fn done, void* context) {
    if (client == nullptr || message == nullptr || count > kMaxIDs ||
        (reporter_ids == nullptr && count != 0)) {
        return HALYARD_INVALID;
    }
    Record record = recordOf(Method::SendMessage, 0, doneCallback(done, context));
    record.broadcast = reporter_ids == nullptr;
    record.idCount = static_cast<std::uint32_t>(count);
    return submitMessage(*client->client, message, record, category, type, reporter_ids);
}

halyard_result halyard_client_get_service_type(halyard_client* client, int64_t reporter_id,
                                               halyard_service_type_fn answered, void* context) {
    if (client == nullptr || answered == nullptr) {
        return HALYARD_INVALID;
    }
    Callback callback;
    callback.shape = Callback::Shape::ServiceType;
    callback.serviceType = answered;
    callback.context = context;
    return query(client, Method::GetServiceNameForReporterID, reporter_id, callback);
}

halyard_result halyard_client_reporter_valid(halyard_client* client, int64_t reporter_id,
                                             halyard_reporter_fn answered, void* context) {
    if (client == nullptr || answered == nullptr) {
        return HALYARD_INVALID;
    }
    Callback callback;
    callback.shape = Callback::Shape::Reporter;
    callback.reporter = answered;
    callback.context = context;
    return query(client, Method::ReporterIDValid, reporter_id, callback);
}

halyard_result halyard_client_get_all_reporters(halyard_client* client,
                                                halyard_reporters_fn answered, void* context) {
    if (client == nullptr || answered == nullptr) {
        return HALYARD_INVALID;
    }
    Callback callback;
    callback.shape = Callback::Shape::Reporters;
    callback.reporters = answered;
    callback.context = context;
    return query(client, Method::GetAllReporters, 0, callback);
}

halyard_result halyard_client_kill_service(halyard_client* client, halyard_done_fn refused,
                                           void* context) {
    if (client == nullptr) {
        return HALYARD_INVALID;
    }
    return query(client, Method::KillService, 0, doneCallback(refused, context));
}

} // extern "C"
