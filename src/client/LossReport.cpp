#include "client/LossReport.h"

#include <utility>

#include "protocol/Wire.h"

namespace halyard::client {

void LossReport::append(std::string& out, const Client::Losses& losses) {
    protocol::Arguments arguments;
    for (std::size_t i = 0; i < losses.size(); ++i) {
        if (losses[i] != told_[i]) {
            arguments.dictionary.set(protocol::kClientLossNames[i], losses[i] - told_[i]);
        }
    }
    if (!arguments.dictionary.empty()) {
        protocol::appendCall(out, std::nullopt, protocol::Method::ClientDropped, arguments);
        telling_ = losses;
    }
}

void LossReport::written() {
    if (telling_) {
        told_ = *std::exchange(telling_, std::nullopt);
    }
}

} // namespace halyard::client
