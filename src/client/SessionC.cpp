// The C ABI's sessions over Client: handles, arguments checked, nothing thrown across.

#include <sys/random.h>

#include <cerrno>
#include <cstdlib>

#include "client/Handles.h"
#include "client/IssueEntries.h"

using halyard::client::Callback;
using halyard::client::copySized;
using halyard::client::doneCallback;
using halyard::client::IssueEntries;
using halyard::client::Record;
using halyard::client::recordOf;
using halyard::client::refuse;
using halyard::client::Submission;
using halyard::client::submitDictionary;
using halyard::client::submitMessage;
using halyard::protocol::Method;

namespace {

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

halyard_result submitTo(const halyard_session* session, Method method, Callback callback = {},
                        std::uint16_t serviceType = 0) {
    Record record = recordOf(method, session->reporterID, callback);
    record.type = serviceType;
    return session->client->submit({.record = record});
}

} // namespace

extern "C" {

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

halyard_result halyard_session_report_issue(halyard_session* session, const halyard_issue* given) {
    if (session == nullptr || given == nullptr || given->size < sizeof(given->size)) {
        return HALYARD_INVALID;
    }
    halyard_issue issue{};
    copySized(issue, *given, given->size);
    Record record = recordOf(Method::SendMessage, session->reporterID);
    record.idCount = 1;
    record.category = issue.category;
    record.type = HALYARD_TYPE_ISSUE_DETECTOR;
    IssueEntries entries;
    const halyard_result result = entries.fill(issue);
    if (result != HALYARD_OK) {
        return refuse(*session->client, record, result);
    }
    // Behind the dictionary, because the last entry of a key counts.
    record.entryCount = entries.count();
    const Submission submission{
        .record = record, .ids = &session->reporterID, .tail = entries.bytes(), .stamped = true};
    return issue.more != nullptr
               ? submitDictionary(*session->client, submission, issue.more->writer)
               : session->client->submit(submission);
}

} // extern "C"
