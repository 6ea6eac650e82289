// Everything that was collected, gone.
#include <fmt/format.h>
#include <unistd.h>

#include "commands/Commands.h"
#include "daemon/DaemonClient.h"
#include "linux/system/CollectedFiles.h"
#include "linux/system/Directories.h"
#include "output/JsonStream.h"
#include "output/Words.h"
#include "reading/StoreCheck.h"

namespace halyard::ctl {
namespace {

namespace fs = std::filesystem;
using protocol::Method;

// The daemon that has the store open does it, or it is done here.
//
// A daemon that answers is not always the one that has this store open: --state may name
// another's, or a copy. So the process that has it open is compared with the one that
// answers; ids that mean nothing here (of another container) are taken on trust.
class Purge {
public:
    Purge(Context& context, fs::path state)
        : context_(context), state_(std::move(state)),
          store_(state_ / reading::StoreReader::kFileName) {}

    Outcome<std::uint64_t> run() {
        const auto holder = reading::storeHolder(store_);
        if (!holder && context_.stateOption) {
            return purgeHere();
        }
        const auto socket = context_.socketPath();
        auto daemon = socket.ok() ? DaemonClient::connect(socket.value())
                                  : Outcome<DaemonClient>(socket.failure());
        if (daemon.ok()) {
            return purgeThrough(daemon.value(), holder.value_or(0));
        }
        if (holder || daemon.failure().exit != Exit::NothingThere) {
            return daemon.failure();
        }
        return purgeHere();
    }

private:
    Outcome<std::uint64_t> purgeThrough(DaemonClient& daemon, std::int32_t holder) const {
        const auto status = daemon.call(Method::AdminStatus);
        if (!status.ok()) {
            return status.failure();
        }
        const std::int64_t pid = status.value().dictionary()["pid"].integerValue();
        if (holder > 0 && pid != holder) {
            return Trouble(Exit::Failed,
                           fmt::format("process {} has {} open, and the daemon that answers is "
                                       "process {}: name its socket with --socket",
                                       holder, store_.native(), pid));
        }
        const auto purged = daemon.call(Method::AdminPurge);
        return purged.ok() ? Outcome<std::uint64_t>(
                                 static_cast<std::uint64_t>(purged.value().integerValue()))
                           : purged.failure();
    }

    Outcome<std::uint64_t> purgeHere() const {
        const auto rows = reading::purgeStore(store_);
        if (!rows.ok() && rows.failure().exit != Exit::NothingThere) {
            return rows;
        }
        const Result<void> files = linux_::removeCollectedState(state_);
        const Result<void> logs = linux_::removeCollectedLogs(logsDirectory());
        for (const Result<void>* const result : {&files, &logs}) {
            if (!result->ok()) {
                return Trouble(Exit::Failed, result->failure().message());
            }
        }
        return rows;
    }

    // Where the service manager says; else those that go with the state directory: the
    // usual ones of the usual place, or what lies inside, as an ordinary user's do.
    fs::path logsDirectory() const {
        using linux_::Directories;
        const auto usual = [](fs::path Directories::*which) {
            const auto found =
                linux_::resolveDirectory(which, linux_::processEnvironment, ::getuid());
            return found.ok() ? found.value().lexically_normal() : fs::path();
        };
        const auto managed = linux_::processEnvironment("LOGS_DIRECTORY");
        const bool isUsual = usual(&Directories::state) == state_.lexically_normal();
        const fs::path logs = usual(&Directories::logs);
        const bool isOurs = isUsual || (managed && !managed->empty());
        return isOurs && !logs.empty() ? logs : state_ / "log";
    }

    Context& context_;
    const fs::path state_;
    const fs::path store_;
};

} // namespace

Exit runPurge(Context& context) {
    const auto state = context.stateDirectory();
    if (!state.ok()) {
        return fail(state.failure());
    }
    const auto rows = Purge(context, state.value()).run();
    if (!rows.ok()) {
        return fail(rows.failure());
    }
    if (context.json) {
        JsonStream json(context.terminal.stream());
        json.beginDocument();
        json.beginObject();
        json.countField("rows", rows.value());
        json.endObject();
        json.endDocument();
    } else {
        context.terminal.write(fmt::format("{} and everything beside them are gone.\n",
                                           counted(rows.value(), "row", "rows")));
    }
    return finish(context, {});
}

} // namespace halyard::ctl
