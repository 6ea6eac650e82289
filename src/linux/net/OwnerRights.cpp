#include "linux/net/OwnerRights.h"

#include <utility>

namespace halyard::linux_ {
namespace {

constexpr std::chrono::minutes kKept{1};
constexpr std::size_t kMaxAnswers = 64; // Beyond, all are forgotten.

} // namespace

OwnerRights::OwnerRights(const platform::Clock& clock, Lists lists, std::uint32_t ownUid,
                         FindUser findUser)
    : clock_(clock), lists_(std::move(lists)), ownUid_(ownUid), findUser_(std::move(findUser)) {}

bool OwnerRights::mayConnect(std::uint32_t uid) {
    if (uid == 0 || uid == ownUid_) {
        return true; // Needs nobody's word.
    }
    std::shared_ptr<const Access> access = lists_();
    const bool full = answers_.size() == kMaxAnswers && !answers_.contains(uid);
    if (access != access_ || full) {
        access_ = std::move(access);
        answers_.clear();
    }
    const platform::SteadyTime now = clock_.steadyTime();
    Answer& answer = answers_[uid];
    if (now >= answer.until) {
        answer.mayConnect = rightsOf(findUser_(uid), *access_, ownUid_) != PeerRights::None;
        answer.until = now + kKept;
    }
    return answer.mayConnect;
}

} // namespace halyard::linux_
