// Prints requests instead of sending them, each as one line of JSON.
//
// One thread.
#pragma once

#include <cstdio>

#include "otlp/OtlpJson.h"
#include "send/Receiver.h"

namespace halyard::exporting {

class PrintingReceiver final : public Receiver {
public:
    explicit PrintingReceiver(std::FILE* into) : into_(into) {}

    // Takes what is not compressed.
    Answer post(Signal signal, std::string_view body, bool /*isCompressed*/) override {
        const auto json = otlp::jsonOf(signal, body);
        isGood_ = isGood_ && json && std::fputs(json->c_str(), into_) >= 0 &&
                  std::fputc('\n', into_) != EOF;
        Answer answer;
        answer.status = isGood_ ? 200 : 0;
        answer.isStopped = !isGood_;
        return answer;
    }
    // Everything was printed.
    bool isGood() const { return isGood_; }

private:
    std::FILE* const into_;
    bool isGood_ = true;
};

} // namespace halyard::exporting
