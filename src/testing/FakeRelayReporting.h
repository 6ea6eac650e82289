// An upload framework that records what it is given and whose back ends answer
// when and how a test wants.
#pragma once

#include <memory>
#include <utility>
#include <vector>

#include "platform/RelayReporting.h"

namespace halyard::testing {

class FakeRelayReporting final : public platform::RelayReportingFramework {
public:
    enum class Backends { AnswerAtOnce, AnswerNone, AnswerWhenTold };

    struct Message {
        std::uint16_t category;
        std::uint32_t type;
        Dictionary payload;
    };
    struct Upload {
        Dictionary sessionInfo;
        Dictionary userInfo;
        platform::RelayReporting::BackendHandler answer;
        std::vector<Message> messages;
        std::vector<platform::Repeats> repeats;
        platform::UploadEnding ending = platform::UploadEnding::Stopped;
        int flushes = 0;
        bool closed = false;
    };
    struct Single {
        Dictionary sessionInfo;
        Dictionary userInfo;
        Message message;
    };

    Value newSecureHierarchyTokenFromParentToken(const Value&) override {
        return Value("token-" + std::to_string(++tokens_));
    }

    std::shared_ptr<platform::RelayReporting> initWithSessionInfo(const Dictionary& sessionInfo,
                                                                  const Dictionary& userInfo,
                                                                  const List&) override {
        auto upload = std::make_shared<Upload>();
        upload->sessionInfo = sessionInfo;
        upload->userInfo = userInfo;
        uploads.push_back(upload);
        return std::make_shared<Session>(*this, std::move(upload));
    }

    MaybeError sendOneMessageWithSessionInfo(const Dictionary& sessionInfo,
                                             const Dictionary& userInfo, std::uint16_t category,
                                             std::uint32_t type,
                                             const Dictionary& payload) override {
        if (failure) {
            ++failed;
            return failure;
        }
        singles.push_back({sessionInfo, userInfo, {category, type, payload}});
        return std::nullopt;
    }

    Backends backends = Backends::AnswerAtOnce;
    MaybeError failure; // what every send answers
    std::uint64_t failed = 0;
    std::vector<std::shared_ptr<Upload>> uploads;
    std::vector<Single> singles;

private:
    class Session final : public platform::RelayReporting {
    public:
        Session(FakeRelayReporting& owner, std::shared_ptr<Upload> upload)
            : owner_(owner), upload_(std::move(upload)) {}
        ~Session() override { upload_->closed = true; }

        void startConfigurationWithCompletionHandler(BackendHandler handler) override {
            switch (owner_.backends) {
            case Backends::AnswerAtOnce:
                handler(List{Value("fake")});
                break;
            case Backends::AnswerNone:
                handler(std::nullopt);
                break;
            case Backends::AnswerWhenTold:
                upload_->answer = std::move(handler);
                break;
            }
        }
        MaybeError sendMessageWithCategory(std::uint16_t category, std::uint32_t type,
                                           Dictionary payload) override {
            if (owner_.failure) {
                ++owner_.failed;
                return owner_.failure;
            }
            upload_->messages.push_back({category, type, std::move(payload)});
            return std::nullopt;
        }
        void noteRepeats(const platform::Repeats& repeats) override {
            upload_->repeats.push_back(repeats);
        }
        void noteEnding(platform::UploadEnding ending) override { upload_->ending = ending; }
        void flushMessages() override { ++upload_->flushes; }
        std::string description() const override { return "upload"; }

    private:
        FakeRelayReporting& owner_;
        std::shared_ptr<Upload> upload_;
    };

    int tokens_ = 0;
};

} // namespace halyard::testing
