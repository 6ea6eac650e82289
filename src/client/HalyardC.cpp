// The C ABI over Client (DictionaryC.cpp has the dictionaries): handles, arguments checked, nothing
// thrown across.

#include <sys/random.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>

#include "client/Client.h"
#include "client/DictionaryHandle.h"
#include "client/Frames.h"
#include "halyard/halyard.h"
#include "protocol/Wire.h"

using halyard::client::Abandoned;
using halyard::client::Callback;
using halyard::client::Client;
using halyard::client::DictionaryWriter;
using halyard::client::doneCallback;
using halyard::client::Record;
using halyard::client::Settings;
using halyard::client::Submission;
using halyard::protocol::Method;

// A client lives as long as its handle or a session's.
struct halyard_client {
    std::shared_ptr<Client> client;
};

struct halyard_session {
    std::shared_ptr<Client> client;
    std::int64_t reporterID;
    std::atomic<bool> started{false};
    // Made beforehand, so that destruction needs no memory.
    std::unique_ptr<Abandoned> abandoned = std::make_unique<Abandoned>();
};

namespace {

constexpr std::size_t kMaxIDs = 4096;

// `size` bytes of what the caller's version of the struct has, the rest zero.
template <class Struct> void copySized(Struct& to, const Struct& from, std::size_t size) {
    std::memcpy(&to, &from, std::min(size, sizeof(Struct)));
}

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

std::int64_t randomID() {
    std::int64_t id = 0;
    while (id == 0) {
        if (::getrandom(&id, sizeof(id), 0) != sizeof(id)) {
            id = 0;
        }
        id &= INT64_MAX; // Positive ones read better in logs.
    }
    return id;
}

int errnoOf(halyard_result result) {
    switch (result) {
    case HALYARD_CLOSED:
        return EPIPE;
    case HALYARD_FORKED:
        return ECHILD;
    default:
        return EAGAIN;
    }
}

Record recordOf(Method method, std::int64_t reporterID, Callback callback = {}) {
    Record record{.method = method};
    record.reporterID = reporterID;
    record.callback = callback;
    return record;
}

halyard_result submitTo(const halyard_session* session, Method method, Callback callback = {},
                        std::uint16_t serviceType = 0) {
    Record record = recordOf(method, session->reporterID, callback);
    record.type = serviceType;
    return session->client->submit({.record = record});
}

halyard_result query(halyard_client* client, Method method, std::int64_t reporterID,
                     const Callback& callback) {
    return client->client->submit({.record = recordOf(method, reporterID, callback)});
}

// Completes `submission` with the dictionary and hands it over.
halyard_result submitDictionary(Client& client, Submission submission,
                                const DictionaryWriter& writer) {
    halyard_result error = writer.error();
    const std::size_t elements =
        writer.elementCount() + submission.record.idCount + halyard::client::kFrameElements;
    if (error == HALYARD_OK && elements > halyard::protocol::kMaxElements) {
        error = HALYARD_TOO_LARGE;
    }
    if (error != HALYARD_OK) {
        return client.isForked() ? HALYARD_FORKED : client.refuse(submission.record, error);
    }
    submission.body = writer.body();
    submission.record.entryCount = writer.entryCount();
    submission.present = writer.stamps();
    return client.submit(submission);
}

halyard_result submitMessage(Client& client, const halyard_dictionary* message, Record record,
                             std::uint32_t category, std::uint16_t type, const std::int64_t* ids) {
    record.category = category;
    record.type = type;
    return submitDictionary(client, {.record = record, .ids = ids, .stamped = true},
                            message->writer);
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

// ---- Sessions ---------------------------------------------------------------------

halyard_session* halyard_session_create(halyard_client* client, int64_t reporter_id) {
    if (client == nullptr || !client->client->countSession()) {
        errno = client == nullptr ? EINVAL : EMFILE;
        return nullptr;
    }
    int error = ENOMEM;
    try {
        std::unique_ptr<halyard_session> session(
            new halyard_session{client->client, reporter_id != 0 ? reporter_id : randomID()});
        const halyard_result result = submitTo(session.get(), Method::CreateReportingSession);
        if (result == HALYARD_OK) {
            return session.release();
        }
        error = errnoOf(result);
    } catch (...) {
    }
    client->client->uncountSession();
    errno = error;
    return nullptr;
}

void halyard_session_destroy(halyard_session* handle) {
    if (handle == nullptr) {
        return;
    }
    const std::unique_ptr<halyard_session> session(handle);
    session->abandoned->reporterID = session->reporterID;
    session->abandoned->started = session->started.load();
    halyard_result result = HALYARD_OK;
    if (session->abandoned->started) {
        result = submitTo(handle, Method::StopReportingSessionForID);
        session->abandoned->started = result != HALYARD_OK;
    }
    if (result == HALYARD_OK) {
        result = submitTo(handle, Method::DestroyReportingSession);
    }
    if (result == HALYARD_QUEUE_FULL) {
        session->client->abandon(std::move(session->abandoned));
    }
    session->client->uncountSession();
}

int64_t halyard_session_reporter_id(const halyard_session* session) {
    return session != nullptr ? session->reporterID : 0;
}

halyard_result halyard_session_set_service_type(halyard_session* session, uint16_t service_type) {
    if (session == nullptr) {
        return HALYARD_INVALID;
    }
    return submitTo(session, Method::SetServiceType, {}, service_type);
}

halyard_result halyard_session_set_configuration(halyard_session* session,
                                                 const halyard_dictionary* configuration) {
    if (session == nullptr || configuration == nullptr) {
        return HALYARD_INVALID;
    }
    return submitDictionary(*session->client,
                            {.record = recordOf(Method::SetConfiguration, session->reporterID)},
                            configuration->writer);
}

halyard_result halyard_session_start(halyard_session* session, halyard_done_fn stopped,
                                     void* context) {
    if (session == nullptr) {
        return HALYARD_INVALID;
    }
    const halyard_result result =
        submitTo(session, Method::StartReportingSessionForID, doneCallback(stopped, context));
    if (result == HALYARD_OK) {
        session->started.store(true);
    }
    return result;
}

halyard_result halyard_session_stop(halyard_session* session, halyard_done_fn done, void* context) {
    if (session == nullptr) {
        return HALYARD_INVALID;
    }
    const halyard_result result =
        submitTo(session, Method::StopReportingSessionForID, doneCallback(done, context));
    if (result == HALYARD_OK) {
        session->started.store(false);
    }
    return result;
}

halyard_result halyard_session_send(halyard_session* session, const halyard_dictionary* message,
                                    uint32_t category, uint16_t type) {
    if (session == nullptr || message == nullptr) {
        return HALYARD_INVALID;
    }
    Record record = recordOf(Method::SendMessage, session->reporterID);
    record.idCount = 1;
    return submitMessage(*session->client, message, record, category, type, &session->reporterID);
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
