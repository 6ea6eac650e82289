// A recorder that reports one session of capture, to the daemon at its usual place or at
// the socket that the argument names, and says how that went.
//
//     c++ -std=c++20 recorder.cpp $(pkg-config --cflags --libs halyard) -o recorder

#include <cstdio>
#include <future>
#include <string>
#include <vector>

#include <halyard/halyard.hpp>

namespace reporting = halyard::reporting;

int main(int argc, char** argv) {
    // Older than the client, which calls back until it is gone.
    std::promise<std::string> answer;
    reporting::Client client(argc > 1 ? argv[1] : nullptr);
    reporting::Session session = client.createSession();
    reporting::Dictionary facts;

    session.setServiceType(HALYARD_SERVICE_GENERIC);
    session.setConfiguration(facts.set("HostApplicationDisplayID", "org.example.recorder"));
    session.start();

    const std::vector<std::string> microphones{"in.left", "in.right"};
    facts.clear().set("sample_rate", 48000).set("active_devices", microphones);
    session.send(facts, HALYARD_CATEGORY_RECORD, HALYARD_TYPE_START);
    // ... record, until a buffer overflows once: ...
    session.reportIssue({.category = HALYARD_CATEGORY_RECORD,
                         .issueType = "client_slow",
                         .rtaidClient = "org.example.recorder",
                         .node = "Example Recorder",
                         .anyChannelSilenceSeconds = 0.021});
    // ... and record on ...

    // The answer comes once everything before it has been taken.
    session.stop([&answer](const reporting::Failure* failure) {
        answer.set_value(failure != nullptr ? failure->message : "");
    });
    if (client.flush(1000) != HALYARD_OK) {
        std::fputs("recorder: no daemon takes the reports\n", stderr);
        return 1;
    }
    const std::string why = answer.get_future().get();
    std::printf("recorder: %s\n", why.empty() ? "reported" : why.c_str());
    return why.empty() ? 0 : 1;
}
