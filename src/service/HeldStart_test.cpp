// When and with what a start that is held until its session stops is answered.

#include "service/ServiceFixture.h"

namespace halyard {
namespace {

using namespace std::chrono_literals;
using Backends = testing::FakeRelayReporting::Backends;
using protocol::Method;
using ::testing::ElementsAre;

// With true, the session's upload still waits for its back ends, and thus holds
// the session, when the session falls.
class HeldStartTest : public ServiceTest, public ::testing::WithParamInterface<bool> {
protected:
    HeldStartTest() {
        platform_.relayReporting.backends =
            GetParam() ? Backends::AnswerWhenTold : Backends::AnswerAtOnce;
        client_.create(7);
        held_ = client_.start(7);
    }
    // The answers since the start.
    std::vector<Peer::Answer> answered() const {
        const auto& all = client_.connection().answered();
        return {all.begin() + 1, all.end()};
    }
    void expectDropped() const {
        ASSERT_EQ(held_->count, 1);
        EXPECT_EQ(held_->error->domain, "com.kestrel.halyard.ipc");
        EXPECT_EQ(held_->error->code, 4);
    }

    const Peer client_ = connect(100);
    Peer::Answer held_;
};

INSTANTIATE_TEST_SUITE_P(WhetherOrNotTheUploadHoldsTheSession, HeldStartTest, ::testing::Bool());

TEST_P(HeldStartTest, IsToldBeforeTheDestroyIsAnswered) {
    const auto destroyed = client_.destroy(7);
    expectDropped();
    EXPECT_THAT(answered(), ElementsAre(held_, destroyed));
}

TEST_P(HeldStartTest, IsToldBeforeTheCreationThatReplacesItsSessionIsAnswered) {
    const auto created = client_.create(7);
    expectDropped();
    EXPECT_THAT(answered(), ElementsAre(held_, created));
}

TEST_P(HeldStartTest, IsToldOnTheServiceQueueWhenItsClientIsLost) {
    const auto session = this->session(7); // As whatever may still work on it.
    client_.connection().interrupt();
    EXPECT_FALSE(held_->given());
    run();
    expectDropped();
    EXPECT_FALSE(session->started());
}

} // namespace
} // namespace halyard
