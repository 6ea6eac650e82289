// Against a daemon's side of the socket, played by the test.

#include "ClientSessions.h"

#include <array>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <gtest/gtest.h>
#include <optional>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>
#include <vector>

#include "protocol/Wire.h"

namespace halyard::pipewire {
namespace {

using protocol::Call;
using protocol::Method;

// Takes one connection and reads its calls.
class DaemonSide final {
public:
    DaemonSide() {
        std::array<char, 32> folder{"/tmp/halyard-sessions-XXXXXX"};
        folder_ = mkdtemp(folder.data());
        path_ = folder_ / "s";
        listener_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strncpy(address.sun_path, path_.c_str(), sizeof(address.sun_path) - 1);
        bind(listener_, reinterpret_cast<const sockaddr*>(&address), sizeof(address));
        listen(listener_, 1);
    }
    ~DaemonSide() {
        close(peer_);
        close(listener_);
        std::filesystem::remove_all(folder_);
    }

    const char* path() const { return path_.c_str(); }

    // The next call; waits for it.
    Call next() {
        if (peer_ < 0) {
            peer_ = accept(listener_, nullptr, nullptr);
        }
        protocol::FrameScanner scanner;
        while (scanner.scan(stream_) == protocol::FrameScanner::Outcome::Incomplete) {
            std::array<char, 4096> bytes{};
            const ssize_t count = read(peer_, bytes.data(), bytes.size());
            if (count <= 0) {
                ADD_FAILURE() << "the connection ended";
                return {};
            }
            stream_.append(bytes.data(), static_cast<std::size_t>(count));
        }
        const auto call = decoder_.decode(stream_.substr(0, scanner.frameLength()));
        stream_.erase(0, scanner.frameLength());
        return call.value_or(Call{});
    }
    Method nextMethod() { return next().method.value_or(Method::KillService); }

    void answer(const Call& call) {
        std::string bytes;
        protocol::appendAnswer(bytes, call.messageID.value_or(0), {}, Value(true));
        ASSERT_EQ(write(peer_, bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
    }

private:
    std::filesystem::path folder_;
    std::filesystem::path path_;
    int listener_ = -1;
    int peer_ = -1;
    std::string stream_;
    protocol::CallDecoder decoder_;
};

class ClientSessionsTest : public ::testing::Test {
protected:
    // Opens session 77 and reads how it is made.
    void openSession() {
        sessions_.open(77, HALYARD_SERVICE_ALERTS, {{"HostApplicationDisplayID", "bell"}});
        for (int calls = 0; calls < 4; ++calls) {
            daemon_.next();
        }
    }

    DaemonSide daemon_;
    reporting::Client client_{daemon_.path()};
    ClientSessions sessions_{client_};
};

TEST_F(ClientSessionsTest, ASessionIsMadeTypedConfiguredAndStarted) {
    sessions_.open(77, HALYARD_SERVICE_ALERTS, {{"HostApplicationDisplayID", "bell"}});

    const Call create = daemon_.next();
    EXPECT_EQ(create.method, Method::CreateReportingSession);
    EXPECT_EQ(create.arguments.reporterID, 77);
    const Call type = daemon_.next();
    EXPECT_EQ(type.method, Method::SetServiceType);
    EXPECT_EQ(type.arguments.serviceType, HALYARD_SERVICE_ALERTS);
    const Call configuration = daemon_.next();
    EXPECT_EQ(configuration.method, Method::SetConfiguration);
    EXPECT_EQ(configuration.arguments.dictionary["HostApplicationDisplayID"], Value("bell"));
    EXPECT_EQ(daemon_.nextMethod(), Method::StartReportingSessionForID);
}

TEST_F(ClientSessionsTest, AMessageArrivesAsItIs) {
    openSession();
    sessions_.send(77, {HALYARD_CATEGORY_VOLUME,
                        HALYARD_TYPE_ACTIVATE,
                        {{"VQSessionVolume", 1.0},
                         {"VQSessionVolumePlayingState", 1},
                         {"active_devices", List{"a", "b"}},
                         {"nested", Dictionary{{"on", true}}}}});

    const Call send = daemon_.next();
    EXPECT_EQ(send.method, Method::SendMessage);
    EXPECT_EQ(send.arguments.category, std::uint32_t{HALYARD_CATEGORY_VOLUME});
    EXPECT_EQ(send.arguments.type, HALYARD_TYPE_ACTIVATE);
    EXPECT_EQ(send.arguments.reporterIDs, protocol::ReporterIDs{77});
    const Dictionary& message = send.arguments.dictionary;
    EXPECT_EQ(message["VQSessionVolume"].kind(), Value::Kind::Double);
    EXPECT_EQ(message["VQSessionVolumePlayingState"], Value(1));
    EXPECT_EQ(message["active_devices"], Value(List{"a", "b"}));
    EXPECT_EQ(message["nested"], Value(Dictionary{{"on", true}}));
    EXPECT_TRUE(message.contains("hyreporting_timestamp"));
}

TEST_F(ClientSessionsTest, AClosedSessionIsStoppedWithAnAnswerThenDestroyed) {
    openSession();
    sessions_.close(77);

    const Call stop = daemon_.next();
    EXPECT_EQ(stop.method, Method::StopReportingSessionForID);
    EXPECT_TRUE(stop.messageID.has_value());
    EXPECT_EQ(daemon_.nextMethod(), Method::DestroyReportingSession);
    daemon_.answer(stop);
    EXPECT_EQ(sessions_.refused(), 0U);
}

TEST_F(ClientSessionsTest, AMessageForNoSessionIsCounted) {
    sessions_.send(5, {HALYARD_CATEGORY_PLAYBACK, HALYARD_TYPE_START, {}});
    sessions_.close(5);
    EXPECT_EQ(sessions_.refused(), 1U);
}

} // namespace
} // namespace halyard::pipewire
