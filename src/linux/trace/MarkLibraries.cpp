#include "linux/trace/MarkLibraries.h"

#include <algorithm>
#include <cstring>
#include <elf.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <sstream>
#include <sys/stat.h>
#include <unistd.h>

#include "linux/system/SmallFile.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr const char* kFunction = "evmark_trace";
constexpr const char* kLibraryPrefix = "libhalyard.so";
constexpr std::size_t kMostMapBytes = 4 * 1024 * 1024;
constexpr std::size_t kMostSymbols = 65536;

class ElfFile {
public:
    explicit ElfFile(const fs::path& path)
        : fd_(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY)) {
        struct stat facts {};
        valid_ = fd_ >= 0 && ::fstat(fd_, &facts) == 0 && S_ISREG(facts.st_mode) &&
                 read(0, header_) && std::memcmp(header_.e_ident, ELFMAG, SELFMAG) == 0 &&
                 header_.e_ident[EI_CLASS] == ELFCLASS64 &&
                 header_.e_shentsize == sizeof(Elf64_Shdr) &&
                 header_.e_phentsize == sizeof(Elf64_Phdr);
    }
    ~ElfFile() {
        if (fd_ >= 0) {
            ::close(fd_);
        }
    }
    ElfFile(const ElfFile&) = delete;
    ElfFile& operator=(const ElfFile&) = delete;

    std::optional<std::uint64_t> offsetOf(std::string_view function) const {
        for (std::size_t i = 0; valid_ && i < header_.e_shnum; ++i) {
            Elf64_Shdr section{};
            if (!readSection(i, section)) {
                break;
            }
            if (section.sh_type == SHT_DYNSYM) {
                return fileOffset(address(section, function));
            }
        }
        return std::nullopt;
    }

private:
    bool readBytes(std::uint64_t at, void* to, std::size_t size) const {
        return at <= INT64_MAX &&
               ::pread(fd_, to, size, static_cast<off_t>(at)) == static_cast<ssize_t>(size);
    }
    template <class T> bool read(std::uint64_t at, T& to) const {
        return readBytes(at, &to, sizeof to);
    }
    bool readSection(std::size_t index, Elf64_Shdr& section) const {
        return read(header_.e_shoff + index * sizeof(Elf64_Shdr), section);
    }
    bool nameIs(const Elf64_Shdr& names, std::uint64_t at, std::string_view expected) const {
        char name[64];
        return expected.size() < sizeof name && at < names.sh_size &&
               readBytes(names.sh_offset + at, name, expected.size() + 1) &&
               name[expected.size()] == '\0' && std::string_view(name, expected.size()) == expected;
    }

    std::optional<std::uint64_t> address(const Elf64_Shdr& symbols,
                                         std::string_view function) const {
        Elf64_Shdr names{};
        if (!readSection(symbols.sh_link, names)) {
            return std::nullopt;
        }
        const std::size_t count = std::min(symbols.sh_size / sizeof(Elf64_Sym), kMostSymbols);
        for (std::size_t i = 0; i < count; ++i) {
            Elf64_Sym symbol{};
            if (!read(symbols.sh_offset + i * sizeof symbol, symbol)) {
                break;
            }
            if (symbol.st_shndx != SHN_UNDEF && nameIs(names, symbol.st_name, function)) {
                return symbol.st_value;
            }
        }
        return std::nullopt;
    }

    std::optional<std::uint64_t> fileOffset(std::optional<std::uint64_t> address) const {
        for (std::size_t i = 0; address && i < header_.e_phnum; ++i) {
            Elf64_Phdr segment{};
            if (!read(header_.e_phoff + i * sizeof segment, segment)) {
                break;
            }
            if (segment.p_type == PT_LOAD && *address >= segment.p_vaddr &&
                *address - segment.p_vaddr < segment.p_filesz) {
                return *address - segment.p_vaddr + segment.p_offset;
            }
        }
        return std::nullopt;
    }

    const int fd_;
    bool valid_ = false;
    Elf64_Ehdr header_{};
};

// The path of a line of /proc/PID/maps that maps code of our library.
std::optional<std::string> libraryPath(const std::string& line) {
    std::istringstream fields(line);
    std::string range, permissions, offset, device, inode, path;
    fields >> range >> permissions >> offset >> device >> inode >> path;
    const bool isCode = permissions.size() == 4 && permissions[2] == 'x';
    // The kernel's definitions of probes end at blanks, and some begin comments.
    const bool isWhole = fields.peek() == std::istringstream::traits_type::eof();
    const bool isPlain = path.starts_with('/') && path.find_first_of("#\\:") == std::string::npos;
    if (!isCode || !isWhole || !isPlain ||
        !fs::path(path).filename().string().starts_with(kLibraryPrefix)) {
        return std::nullopt;
    }
    return path;
}

using FileKey = std::pair<std::uint64_t, std::uint64_t>;

std::optional<FileKey> keyOf(const std::string& path) {
    struct stat facts {};
    if (::stat(path.c_str(), &facts) != 0) {
        return std::nullopt;
    }
    return FileKey{facts.st_dev, facts.st_ino};
}

} // namespace

std::optional<std::uint64_t> functionOffset(const fs::path& library, std::string_view function) {
    return ElfFile(library).offsetOf(function);
}

std::vector<MarkLibraries::Library>
MarkLibraries::newLibrariesOf(const std::vector<std::int32_t>& pids) {
    std::vector<Library> found;
    for (const std::int32_t pid : pids) {
        if (seenProcesses_.size() < kMostProcesses && seenProcesses_.insert(pid).second) {
            addLibrariesOf(pid, found);
        }
    }
    return found;
}

void MarkLibraries::addLibrariesOf(std::int32_t pid, std::vector<Library>& found) {
    const auto maps = readSmallFile(fmt::format("/proc/{}/maps", pid), kMostMapBytes);
    const auto* const text = std::get_if<std::string>(&maps);
    std::istringstream lines(text != nullptr ? *text : std::string());
    for (std::string line; std::getline(lines, line);) {
        const auto path = libraryPath(line);
        if (!path) {
            continue;
        }
        // A process may live in another root than ours.
        const std::string theirs = fmt::format("/proc/{}/root{}", pid, *path);
        const auto key = keyOf(theirs);
        if (!key || seenFiles_.size() >= kMostLibraries || !seenFiles_.insert(*key).second) {
            continue;
        }
        const std::string& usable = keyOf(*path) == key ? *path : theirs;
        if (const auto offset = functionOffset(usable, kFunction)) {
            found.push_back({usable, *offset});
        }
    }
}

} // namespace halyard::linux_
