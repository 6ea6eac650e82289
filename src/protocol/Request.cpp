#include "protocol/Request.h"

#include <atomic>

namespace halyard::protocol {

struct Reply::State {
    explicit State(std::unique_ptr<Responder> r) : responder(std::move(r)) {}
    State(const State&) = delete;
    State& operator=(const State&) = delete;
    ~State() {
        if (!answered.load()) {
            responder->answer(Error{std::string(kIpcErrorDomain),
                                    static_cast<std::int64_t>(IpcErrorCode::Unanswered),
                                    "the request was dropped without an answer"},
                              Value());
        }
    }

    std::atomic<bool> answered{false};
    std::unique_ptr<Responder> responder;
};

Reply::Reply(std::unique_ptr<Responder> responder)
    : state_(std::make_shared<State>(std::move(responder))) {}

void Reply::operator()(const MaybeError& error, const Value& result) const {
    if (state_ != nullptr && !state_->answered.exchange(true)) {
        state_->responder->answer(error, result);
    }
}

} // namespace halyard::protocol
