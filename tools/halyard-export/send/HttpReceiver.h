// A receiver by HTTP.
//
// What it answers is not trusted: redirects are not followed, of a body no more is read
// than anybody needs, and a receiver that never answers is left after the time-out.
// Nothing of headers, keys or bodies is ever written to a log. One thread.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "Options.h"
#include "send/Receiver.h"

namespace halyard::exporting {

class HttpReceiver final : public Receiver {
public:
    // Asked about every second while a request is under way; false ends it at once.
    using MayGoOn = std::function<bool()>;

    HttpReceiver(const Options& options, MayGoOn mayGoOn);
    ~HttpReceiver() override;
    HttpReceiver(const HttpReceiver&) = delete;
    HttpReceiver& operator=(const HttpReceiver&) = delete;

    Answer post(Signal signal, std::string_view body, bool isCompressed) override;

private:
    struct Handle;

    const Options options_;
    const MayGoOn mayGoOn_;
    std::unique_ptr<Handle> handle_; // keeps its connection from request to request
};

} // namespace halyard::exporting
