#include "CycleFiles.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <dirent.h>
#include <fcntl.h>
#include <filesystem>
#include <fmt/format.h>
#include <iterator>
#include <memory>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

namespace halyard::pipewire {
namespace {

constexpr std::chrono::seconds kInterval{1};
constexpr std::size_t kMaxName = 200;
constexpr int kMaxSwept = 4096; // entries of a folder, which anybody may fill
constexpr const char* kSuffixes[] = {".wait", ".busy", ".cycle", ".counts"};
constexpr const char* kCounts = ".counts"; // Last: who finds it finds the others.
constexpr std::string_view kPlain = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz"
                                    "0123456789-._";

// Of FNV-1a.
std::uint64_t hashOf(std::string_view text) {
    std::uint64_t hash = 0xCBF29CE484222325;
    for (const char character : text) {
        hash = (hash ^ static_cast<unsigned char>(character)) * 0x100000001B3;
    }
    return hash;
}

bool isOurs(std::string_view name) {
    const bool temporary = name.starts_with('.');
    name.remove_prefix(temporary ? 1 : 0);
    if (!name.starts_with("out-") && !name.starts_with("in-")) {
        return false;
    }
    return temporary ? name.find(".tmp-") != std::string_view::npos
                     : std::any_of(std::begin(kSuffixes), std::end(kSuffixes),
                                   [&](const char* suffix) { return name.ends_with(suffix); });
}

bool writeAll(int file, std::string_view text) {
    while (!text.empty()) {
        const ssize_t wrote = ::write(file, text.data(), text.size());
        if (wrote < 0 && errno != EINTR) {
            return false;
        }
        text.remove_prefix(wrote < 0 ? 0 : static_cast<std::size_t>(wrote));
    }
    return true;
}

// In the order of kSuffixes.
std::array<std::string, std::size(kSuffixes)> textsOf(const DeviceCycles& device) {
    return {device.wait.text(), device.busy.text(), device.cycle.text(), device.countsText()};
}

} // namespace

std::string cycleFileName(std::string_view device, bool isSink) {
    std::string name = isSink ? "out-" : "in-";
    for (const char character : device) {
        const std::string part =
            kPlain.find(character) != std::string_view::npos
                ? std::string(1, character)
                : fmt::format("%{:02X}", static_cast<unsigned char>(character));
        name += part;
    }
    if (name.size() > kMaxName) {
        // No plain name has a "~". Nor does one end in half a "%XX".
        const std::string end = fmt::format("~{:016X}", hashOf(device));
        std::size_t keep = kMaxName - end.size();
        for (const std::size_t back : {1U, 2U}) {
            keep -= name[keep - back] == '%' ? back : 0;
        }
        name.replace(keep, std::string::npos, end);
    }
    return name;
}

std::vector<std::string> cycleFolders(const char* (*environment)(const char*), bool isRoot,
                                      const std::string& socketPath) {
    if (!socketPath.empty()) {
        return {(std::filesystem::path(socketPath).parent_path() / "cycles").native()};
    }
    const auto set = [&](const char* name) -> std::string {
        const char* const value = environment(name);
        return value != nullptr ? value : "";
    };
    std::vector<std::string> folders;
    const std::string runtime = set("RUNTIME_DIRECTORY");
    if (!runtime.empty()) {
        // A service manager may name several, separated by colons.
        folders.push_back(runtime.substr(0, runtime.find(':')) + "/cycles");
    }
    const std::string session = set("XDG_RUNTIME_DIR");
    if (!isRoot && !session.empty()) {
        folders.push_back(session + "/halyard/cycles");
    }
    folders.push_back("/run/halyard/cycles");
    return folders;
}

// The folder as it is now; open for as long as this lives.
class CycleFiles::Folder {
public:
    explicit Folder(const std::vector<std::string>& paths) {
        for (const std::string& path : paths) {
            descriptor_ = ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
            if (descriptor_ >= 0) {
                path_ = path;
                return;
            }
        }
    }
    ~Folder() {
        if (isOpen()) {
            ::close(descriptor_);
        }
    }
    Folder(const Folder&) = delete;
    Folder& operator=(const Folder&) = delete;

    bool isOpen() const { return descriptor_ >= 0; }
    const std::string& path() const { return path_; }
    bool has(const std::string& name) const {
        struct stat facts {};
        return isOpen() && ::fstatat(descriptor_, name.c_str(), &facts, AT_SYMLINK_NOFOLLOW) == 0;
    }
    void remove(const std::string& name) const { ::unlinkat(descriptor_, name.c_str(), 0); }
    // An errno value, or 0.
    int replace(const std::string& name, std::string_view text) const;
    // Removes files of this form and of this user.
    void sweep() const;

private:
    int create(const std::string& name) const {
        constexpr int kFlags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
        return ::openat(descriptor_, name.c_str(), kFlags, 0644);
    }
    bool isOwn(const char* name) const {
        struct stat facts {};
        return ::fstatat(descriptor_, name, &facts, AT_SYMLINK_NOFOLLOW) == 0 &&
               facts.st_uid == ::geteuid();
    }

    int descriptor_ = -1;
    std::string path_;
};

int CycleFiles::Folder::replace(const std::string& name, std::string_view text) const {
    const std::string temporary = fmt::format(".{}.tmp-{}", name, ::getpid());
    int file = create(temporary);
    if (file < 0 && errno == EEXIST) {
        remove(temporary); // Of a process that had our id, and died here.
        file = create(temporary);
    }
    if (file < 0) {
        return errno;
    }
    // The daemon is another user, whatever the umask says.
    bool done = ::fchmod(file, 0644) == 0 && writeAll(file, text);
    done = ::close(file) == 0 && done;
    done = done && ::renameat(descriptor_, temporary.c_str(), descriptor_, name.c_str()) == 0;
    const int error = done ? 0 : errno;
    if (!done) {
        remove(temporary);
    }
    return error;
}

void CycleFiles::Folder::sweep() const {
    const int copy = ::openat(descriptor_, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    const std::unique_ptr<DIR, int (*)(DIR*)> entries(copy >= 0 ? ::fdopendir(copy) : nullptr,
                                                      ::closedir);
    if (entries == nullptr) {
        return;
    }
    for (int left = kMaxSwept; left > 0; --left) {
        const dirent* const entry = ::readdir(entries.get());
        if (entry == nullptr) {
            return;
        }
        if (isOurs(entry->d_name) && isOwn(entry->d_name)) {
            ::unlinkat(descriptor_, entry->d_name, 0);
        }
    }
}

CycleFiles::CycleFiles(std::vector<std::string> folders, Note note)
    : folders_(std::move(folders)), note_(std::move(note)) {}

void CycleFiles::write(CycleStatistics& statistics, SteadyTime now) {
    if (last_ && now - *last_ < kInterval) {
        return;
    }
    last_ = now;
    const Folder folder(folders_);
    if (folder.isOpen() && !std::exchange(swept_, true)) {
        folder.sweep();
    }
    forgetLost(folder, statistics);
    if (folder.isOpen()) {
        tell(folder, writeChanged(folder, statistics));
    }
}

void CycleFiles::forgetLost(const Folder& folder, CycleStatistics& statistics) {
    for (std::size_t place = 0; place < names_.size(); ++place) {
        if (!folder.has(names_[place] + kCounts)) {
            statistics.restart(place);
            written_[place] = kNothing;
        }
    }
    for (std::size_t place = names_.size(); place < statistics.devices().size(); ++place) {
        const DeviceCycles& device = statistics.devices()[place];
        names_.push_back(cycleFileName(device.device, device.isSink));
        written_.push_back(kNothing);
    }
}

int CycleFiles::writeChanged(const Folder& folder, const CycleStatistics& statistics) {
    int failure = 0;
    for (std::size_t place = 0; place < names_.size(); ++place) {
        const DeviceCycles& device = statistics.devices()[place];
        if (written_[place] == device.cycles) {
            continue;
        }
        const auto texts = textsOf(device);
        int error = 0;
        for (std::size_t part = 0; part < texts.size() && error == 0; ++part) {
            error = folder.replace(names_[place] + kSuffixes[part], texts[part]);
        }
        written_[place] = error == 0 ? device.cycles : kNothing;
        failure = error != 0 ? error : failure;
    }
    return failure;
}

void CycleFiles::tell(const Folder& folder, int error) {
    const bool failing = error != 0;
    if (std::exchange(failing_, failing) == failing || !note_) {
        return;
    }
    note_(failing ? fmt::format("statistics of cycles cannot be written to {}: {}", folder.path(),
                                std::strerror(error))
                  : fmt::format("statistics of cycles can be written to {} again", folder.path()));
}

void CycleFiles::remove() {
    const Folder folder(folders_);
    for (const std::string& name : names_) {
        for (const char* suffix : kSuffixes) {
            folder.remove(name + suffix);
        }
    }
    names_.clear();
    written_.clear();
}

} // namespace halyard::pipewire
