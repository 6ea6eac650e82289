#include "linux/store/StoreRelayReporting.h"

#include <algorithm>
#include <fmt/format.h>
#include <iterator>
#include <utility>

namespace halyard::linux_ {
namespace {

using namespace platform; // The kRelayReporting... names.

constexpr int kTokenWords = 8;
constexpr std::uint32_t kWordValues = 0x10000;

MaybeError notTaken(const Store& store) {
    const StoreErrorCode code = store.isOpen() ? StoreErrorCode::NotTaken : StoreErrorCode::NoStore;
    return Error{std::string(kStoreErrorDomain), static_cast<std::int64_t>(code),
                 store.isOpen() ? "the store cannot write and takes no more rows"
                                : "there is no store"};
}

bool names(const List& frameworks, std::string_view backend) {
    return frameworks.empty() ||
           std::any_of(frameworks.begin(), frameworks.end(),
                       [&](const Value& name) { return name.text() == backend; });
}

class Session final : public RelayReporting {
public:
    // `upload` is null when there is no back end for it.
    Session(Store& store, StoreUploadPtr upload) : store_(store), upload_(std::move(upload)) {}
    ~Session() override {
        if (upload_ != nullptr) {
            store_.closeUpload(upload_, ending_);
        }
    }

    void startConfigurationWithCompletionHandler(BackendHandler handler) override {
        if (upload_ == nullptr) {
            handler(std::nullopt);
        } else {
            handler(List{Value(StoreRelayReporting::kBackend)});
        }
    }
    MaybeError sendMessageWithCategory(std::uint16_t category, std::uint32_t type,
                                       Dictionary payload) override {
        const bool taken =
            upload_ != nullptr && store_.addMessage(upload_, category, type, std::move(payload));
        return taken ? MaybeError() : notTaken(store_);
    }
    void noteRepeats(const Repeats& repeats) override {
        if (upload_ != nullptr) {
            (void)store_.addRepeats(upload_, repeats); // What is lost of these is counted there.
        }
    }
    void noteEnding(UploadEnding ending) override { ending_ = ending; }
    // Every row is committed within moments anyway; a commit of its own for each
    // session that stops would only cost the others.
    void flushMessages() override {}
    std::string description() const override {
        return fmt::format("<store upload of session {}>",
                           upload_ == nullptr ? 0 : upload_->sessionID);
    }

private:
    Store& store_;
    const StoreUploadPtr upload_;
    UploadEnding ending_ = UploadEnding::Stopped;
};

} // namespace

Value StoreRelayReporting::newSecureHierarchyTokenFromParentToken(const Value&) {
    std::string token;
    for (int i = 0; i < kTokenWords; ++i) {
        fmt::format_to(std::back_inserter(token), "{:04x}", random_.uniform(kWordValues));
    }
    return token;
}

std::shared_ptr<RelayReporting>
StoreRelayReporting::initWithSessionInfo(const Dictionary& sessionInfo, const Dictionary& userInfo,
                                         const List& frameworksToCheck) {
    StoreUploadPtr upload;
    if (store_.isOpen() && names(frameworksToCheck, kBackend)) {
        upload = store_.openUpload(sessionInfo[kRelayReportingSessionInfoSessionID].integerValue(),
                                   sessionInfo, userInfo);
    }
    return std::make_shared<Session>(store_, std::move(upload));
}

MaybeError StoreRelayReporting::sendOneMessageWithSessionInfo(const Dictionary& sessionInfo,
                                                              const Dictionary& userInfo,
                                                              std::uint16_t category,
                                                              std::uint32_t type,
                                                              const Dictionary& payload) {
    const bool taken = store_.addSingleMessage(sessionInfo, userInfo, category, type, payload);
    return taken ? MaybeError() : notTaken(store_);
}

} // namespace halyard::linux_
