// Whether what is collected may leave the machine: said by a file of its own, which wins
// over what an operator wrote, so that neither edits the other's.
//
// What is in force is asked of the daemon's own reader of the configuration.
#include <fmt/format.h>
#include <sys/stat.h>
#include <system_error>

#include "commands/Commands.h"
#include "linux/config/SettingsFiles.h"
#include "linux/system/AtomicFile.h"
#include "output/JsonStream.h"
#include "output/Sanitise.h"
#include "output/Words.h"
#include "reading/ConsentNote.h"

namespace halyard::ctl {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view kKey = "export.consent";
constexpr std::string_view kFile = "consent.toml";
// Of what is made here: the daemon, of another user, must read it.
constexpr mode_t kFileMode = 0644;
constexpr fs::perms kFolderMode = fs::perms{0755};

struct InForce {
    bool given = false;
    std::optional<fs::path> file; // that decides
};

std::string named(const fs::path& path) {
    return sanitised(path.native());
}

Exit exitOf(std::errc code) {
    const bool refused = code == std::errc::permission_denied ||
                         code == std::errc::operation_not_permitted ||
                         code == std::errc::read_only_file_system;
    return refused ? Exit::NotAllowed : Exit::Failed;
}

Outcome<InForce> inForce(const fs::path& directory) {
    const auto loaded = linux_::loadSettings(directory);
    if (!loaded.ok()) {
        const linux_::SettingsFailure& failure = loaded.failure();
        return Trouble(Exit::Failed,
                       fmt::format("{}:{}:{}: {}", sanitised(failure.file), failure.line,
                                   failure.column, sanitised(failure.message())));
    }
    const auto* const file = loaded.value().decidingFile(kKey);
    return InForce{loaded.value().settings.exporting.consent,
                   file == nullptr ? std::nullopt : std::optional(file->path)};
}

std::string inWords(const InForce& consent) {
    return fmt::format("{}: {}", consent.given ? "given" : "not given",
                       consent.file ? named(*consent.file) + " says so"
                                    : "no file says anything, which means no");
}

// Since when the daemon knows of what is in force; none when it has not noted that.
std::optional<double> notedSince(Context& context, bool given) {
    const auto path = context.storePath();
    std::error_code ignored;
    if (!path.ok() || !fs::exists(path.value(), ignored)) {
        return std::nullopt;
    }
    auto reader = context.openStore();
    const auto note = reader.ok() ? reading::newestConsentNote(reader.value())
                                  : Outcome<std::optional<reading::ConsentNote>>(reader.failure());
    if (!note.ok()) {
        complain(note.failure().message());
        return std::nullopt;
    }
    const bool matches = note.value() && note.value()->given == given;
    return matches ? std::optional(note.value()->time) : std::nullopt;
}

void write(Context& context, const InForce& now, const std::optional<bool>& before) {
    JsonStream json(context.terminal.stream());
    json.beginDocument();
    json.beginObject();
    json.key("given");
    json.boolean(now.given);
    json.field("file", now.file ? std::optional(now.file->native()) : std::nullopt);
    json.field("since", notedSince(context, now.given));
    if (before) {
        json.key("before");
        json.boolean(*before);
    }
    json.endObject();
    json.endDocument();
}

Trouble cannotWrite(const fs::path& path, std::errc code) {
    return {exitOf(code), fmt::format("cannot write {}: {}", named(path), Failure{code}.message())};
}

// With those above it, as far as they are missing.
Outcome<void> makeFolder(const fs::path& folder) {
    std::error_code error;
    if (fs::is_directory(folder, error)) {
        return {};
    }
    if (folder.has_parent_path() && folder.parent_path() != folder) {
        if (auto made = makeFolder(folder.parent_path()); !made.ok()) {
            return made;
        }
    }
    fs::create_directory(folder, error);
    if (!error) {
        fs::permissions(folder, kFolderMode, error); // Whatever the umask.
    }
    return error ? cannotWrite(folder, static_cast<std::errc>(error.value())) : Outcome<void>();
}

Outcome<void> writeFile(const fs::path& path, bool given) {
    if (auto made = makeFolder(path.parent_path()); !made.ok()) {
        return made;
    }
    linux_::AtomicFile file(path);
    file.write(
        fmt::format("# Written by \"halyardctl consent {}\". It wins over {} and over those\n"
                    "# files of this folder whose names come before its own.\n"
                    "[export]\nconsent = {}\n",
                    given ? "give" : "withdraw", linux_::kSettingsFile, given));
    if (file.stream() != nullptr) {
        (void)::fchmod(::fileno(file.stream()), kFileMode);
    }
    const Result<void> written = file.commit();
    return written.ok() ? Outcome<void>() : cannotWrite(path, written.failure().code);
}

Exit show(Context& context, const fs::path& directory) {
    const auto now = inForce(directory);
    if (!now.ok()) {
        return fail({now.failure().exit, now.failure().message() + "; the daemon keeps what was in "
                                                                   "force before that mistake"});
    }
    if (context.json) {
        write(context, now.value(), std::nullopt);
        return finish(context, {});
    }
    const auto since = notedSince(context, now.value().given);
    context.terminal.write(fmt::format(
        "Consent is {}.\n{}", inWords(now.value()),
        since ? fmt::format("The daemon has noted that at {}.\n", dayAndTime(*since)) : ""));
    return finish(context, {});
}

// What was written is not all there is: other files may say otherwise, or be broken.
Exit tell(Context& context, const fs::path& file, const Outcome<InForce>& before,
          const Outcome<InForce>& now) {
    if (!now.ok()) {
        return fail({Exit::Failed,
                     fmt::format("wrote {}, but it does not hold yet: {}; the daemon keeps what "
                                 "was in force before that mistake",
                                 named(file), now.failure().message())});
    }
    if (context.json) {
        write(context, now.value(),
              before.ok() ? std::optional(before.value().given) : std::nullopt);
    } else {
        context.terminal.write(fmt::format(
            "Wrote {}.\nConsent is {}.\nBefore it was {}.\n", named(file), inWords(now.value()),
            before.ok() ? inWords(before.value()) : "unknown: " + before.failure().message()));
    }
    const Exit ended = finish(context, {});
    if (now.value().file != file) {
        return fail({Exit::Failed, fmt::format("{} wins over {}, which has no effect: change it "
                                               "there, or remove that file",
                                               named(*now.value().file), named(file))});
    }
    return ended;
}

} // namespace

Exit runConsent(Context& context, ConsentAction action) {
    const auto directory = context.configurationDirectory();
    if (!directory.ok()) {
        return fail(directory.failure());
    }
    if (action == ConsentAction::Show) {
        return show(context, directory.value());
    }
    const auto before = inForce(directory.value());
    const fs::path file = directory.value() / linux_::kDropInFolder / kFile;
    if (const auto written = writeFile(file, action == ConsentAction::Give); !written.ok()) {
        return fail(written.failure());
    }
    return tell(context, file, before, inForce(directory.value()));
}

} // namespace halyard::ctl
