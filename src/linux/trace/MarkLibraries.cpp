#include "linux/trace/MarkLibraries.h"

#include <algorithm>
#include <cstring>
#include <elf.h>
#include <fmt/format.h>
#include <sstream>
#include <sys/stat.h>
#include <unistd.h>

#include "linux/system/SmallFile.h"
#include "platform/Log.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr const char* kFunction = "evmark_trace";
constexpr const char* kLibraryPrefix = "libhalyard.so";
constexpr std::size_t kMostMapBytes = 4 * 1024 * 1024;
// A file whose tables are longer is no library of ours.
constexpr std::size_t kMostSections = 1024;
constexpr std::size_t kMostSegments = 256;
constexpr std::size_t kMostSymbols = 65536;
constexpr std::size_t kMostNameBytes = 1024 * 1024;

// Reads the tables of an ELF file that may hold anything: each with one read, and
// none that is too long or ends behind the file. Borrows the descriptor.
class ElfFile {
public:
    explicit ElfFile(int file) : file_(file) {
        const auto header = table<Elf64_Ehdr>(0, 1, 1);
        if (!header.empty() && std::memcmp(header[0].e_ident, ELFMAG, SELFMAG) == 0 &&
            header[0].e_ident[EI_CLASS] == ELFCLASS64 &&
            header[0].e_shentsize == sizeof(Elf64_Shdr) &&
            header[0].e_phentsize == sizeof(Elf64_Phdr)) {
            sections_ = table<Elf64_Shdr>(header[0].e_shoff, header[0].e_shnum, kMostSections);
            segments_ = table<Elf64_Phdr>(header[0].e_phoff, header[0].e_phnum, kMostSegments);
        }
    }

    std::optional<std::uint64_t> offsetOf(std::string_view function) const {
        for (const Elf64_Shdr& section : sections_) {
            if (section.sh_type == SHT_DYNSYM) {
                return fileOffset(address(section, function));
            }
        }
        return std::nullopt;
    }

private:
    // Empty when it has more entries than `most` or cannot be read as a whole.
    template <class T>
    std::vector<T> table(std::uint64_t at, std::uint64_t entries, std::size_t most) const {
        std::vector<T> read(entries <= most ? entries : 0);
        const std::size_t size = read.size() * sizeof(T);
        if (at > INT64_MAX || ::pread(file_, read.data(), size, static_cast<off_t>(at)) !=
                                  static_cast<ssize_t>(size)) {
            read.clear();
        }
        return read;
    }
    // The text that begins there; none when the names end before it does.
    static std::optional<std::string_view> nameAt(const std::vector<char>& names,
                                                  std::uint64_t at) {
        const auto begin =
            names.begin() + static_cast<std::ptrdiff_t>(std::min<std::uint64_t>(at, names.size()));
        const auto end = std::find(begin, names.end(), '\0');
        return end != names.end() ? std::optional(std::string_view(begin, end)) : std::nullopt;
    }

    std::optional<std::uint64_t> address(const Elf64_Shdr& symbols,
                                         std::string_view function) const {
        if (symbols.sh_link >= sections_.size()) {
            return std::nullopt;
        }
        const Elf64_Shdr& section = sections_[symbols.sh_link];
        const auto names = table<char>(section.sh_offset, section.sh_size, kMostNameBytes);
        for (const Elf64_Sym& symbol : table<Elf64_Sym>(
                 symbols.sh_offset, symbols.sh_size / sizeof(Elf64_Sym), kMostSymbols)) {
            if (symbol.st_shndx != SHN_UNDEF && nameAt(names, symbol.st_name) == function) {
                return symbol.st_value;
            }
        }
        return std::nullopt;
    }

    std::optional<std::uint64_t> fileOffset(std::optional<std::uint64_t> address) const {
        for (const Elf64_Phdr& segment : segments_) {
            if (address && segment.p_type == PT_LOAD && *address >= segment.p_vaddr &&
                *address - segment.p_vaddr < segment.p_filesz) {
                return *address - segment.p_vaddr + segment.p_offset;
            }
        }
        return std::nullopt;
    }

    const int file_;
    std::vector<Elf64_Shdr> sections_;
    std::vector<Elf64_Phdr> segments_;
};

// The path of a line of /proc/PID/maps that maps code of our library.
std::optional<std::string> libraryPath(const std::string& line) {
    if (line.find(kLibraryPrefix) == std::string::npos) {
        return std::nullopt; // There may be tens of thousands.
    }
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

} // namespace

std::optional<std::uint64_t> functionOffset(const fs::path& library, std::string_view function) {
    const RegularFile file(library);
    return file.opened().ok() ? ElfFile(file.descriptor()).offsetOf(function) : std::nullopt;
}

// What a client maps is its own to choose, and so are the bounds that it meets
// first: so many paths of one process are looked at, and each look reads a bounded
// number of bytes. A process that has gone is forgotten, so that those who come and
// go use nothing up. What all of them together can use up are the probes.
std::vector<MarkLibraries::Library>
MarkLibraries::newLibrariesOf(const std::vector<std::int32_t>& pids) {
    std::vector<Library> found;
    std::set<std::int32_t> present;
    for (const std::int32_t pid : pids) {
        if (present.size() < kMostProcesses && present.insert(pid).second &&
            !seenProcesses_.contains(pid)) {
            addLibrariesOf(pid, found);
        }
    }
    seenProcesses_ = std::move(present);
    return found;
}

void MarkLibraries::addLibrariesOf(std::int32_t pid, std::vector<Library>& found) {
    const auto maps = readSmallFile(fmt::format("/proc/{}/maps", pid), kMostMapBytes);
    std::istringstream lines(maps.ok() ? maps.value() : std::string());
    std::set<std::string> paths;
    for (std::string line; paths.size() < kMostOfProcess && std::getline(lines, line);) {
        const auto path = libraryPath(line);
        if (path && paths.insert(*path).second) {
            addLibrary(pid, *path, found);
        }
    }
}

void MarkLibraries::addLibrary(std::int32_t pid, const std::string& path,
                               std::vector<Library>& found) {
    // A process may live in another root than ours.
    const auto file = std::make_shared<RegularFile>(fmt::format("/proc/{}/root{}", pid, path));
    struct stat facts {};
    if (!file->opened().ok() || ::fstat(file->descriptor(), &facts) != 0) {
        return;
    }
    const std::pair<std::uint64_t, std::uint64_t> key{facts.st_dev, facts.st_ino};
    if (toldOfMore_ || seenFiles_.contains(key)) {
        return;
    }
    const auto offset = ElfFile(file->descriptor()).offsetOf(kFunction);
    if (!offset) {
        return;
    }
    if (seenFiles_.size() < kMostLibraries) {
        seenFiles_.insert(key);
        found.push_back({path, *offset, file});
    } else {
        toldOfMore_ = true;
        HY_LOG_ERROR(HYReportingTraceCategory,
                     "a client's library is not traced: {}: {} others are; no line tells of "
                     "further ones",
                     path, kMostLibraries);
    }
}

} // namespace halyard::linux_
