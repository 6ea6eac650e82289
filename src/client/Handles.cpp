#include "client/Handles.h"

#include "client/Frames.h"
#include "protocol/Wire.h"

namespace halyard::client {

Record recordOf(protocol::Method method, std::int64_t reporterID, Callback callback) {
    Record record{.method = method};
    record.reporterID = reporterID;
    record.callback = callback;
    return record;
}

halyard_result refuse(Client& client, const Record& record, halyard_result reason) {
    return client.isForked() ? HALYARD_FORKED : client.refuse(record, reason);
}

halyard_result submitDictionary(Client& client, Submission submission,
                                const DictionaryWriter& writer) {
    halyard_result error = writer.error();
    const std::size_t elements = writer.elementCount() + 2 * submission.record.entryCount +
                                 submission.record.idCount + kFrameElements;
    if (error == HALYARD_OK && elements > protocol::kMaxElements) {
        error = HALYARD_TOO_LARGE;
    }
    if (error != HALYARD_OK) {
        return refuse(client, submission.record, error);
    }
    submission.body = writer.body();
    submission.record.entryCount += writer.entryCount();
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

} // namespace halyard::client
