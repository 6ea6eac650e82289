// The commands, each in a source of its own. They know nothing of the command line.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "Context.h"
#include "linux/store/Schema.h"
#include "reading/GlitchTally.h"

namespace halyard::ctl {

// Of no command at all.
Exit runOverview(Context& context);
Exit runStatus(Context& context);
Exit runSessions(Context& context);
Exit runMessages(Context& context);
// Each, or summed up.
Exit runGlitches(Context& context, std::optional<reading::GlitchKey> by);
// The rows of a table that is none of the above.
Exit runTable(Context& context, linux_::StoreTable table);

enum class Watched : std::uint8_t { Messages, Glitches, Events, Incidents };
// Until nobody reads the output any more.
Exit runWatch(Context& context, Watched what);

struct SendOptions {
    std::vector<std::int64_t> sessions{}; // none: all that are started
    std::uint32_t category = 0;
    std::uint16_t type = 0;
    std::string file = "-";
};
Exit runSend(Context& context, const SendOptions& options);

struct SessionOptions {
    std::uint16_t serviceType = 0;
    std::optional<std::string> application{};
    std::string file = "-";
};
Exit runSession(Context& context, const SessionOptions& options);

enum class ConsentAction : std::uint8_t { Give, Withdraw, Show };
Exit runConsent(Context& context, ConsentAction action);
// How far the exporter is; what would leave now.
Exit runExportStatus(Context& context);
Exit runExportPreview(Context& context);

Exit runCheck(Context& context, bool repair);
Exit runPurge(Context& context);
// Into `file`.
Exit runTimeline(Context& context, const std::string& file);
Exit runTrace(Context& context, const std::string& file);

} // namespace halyard::ctl
