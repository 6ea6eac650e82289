#include "linux/system/AtomicFile.h"

#include <atomic>
#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>
#include <utility>

#include "linux/system/PrivateFiles.h"

namespace halyard::linux_ {
namespace {

constexpr mode_t kMode = 0644;

// Unique among those who write here, and never followed when it is a link that
// somebody planted.
std::filesystem::path temporaryName(const std::filesystem::path& path) {
    static std::atomic<unsigned> count{0};
    return path.parent_path() /
           fmt::format(".{}.{}-{}", path.filename().string(), ::getpid(), count.fetch_add(1));
}

} // namespace

AtomicFile::AtomicFile(std::filesystem::path path)
    : path_(std::move(path)), temporary_(temporaryName(path_)) {
    (void)::unlink(temporary_.c_str()); // Of a process that had our number and was killed.
    const int fd =
        ::open(temporary_.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, kMode);
    if (fd < 0) {
        failed();
        return;
    }
    stream_ = ::fdopen(fd, "w");
    if (stream_ == nullptr) {
        failed();
        ::close(fd);
    }
}

AtomicFile::~AtomicFile() {
    if (stream_ != nullptr) {
        (void)std::fclose(stream_);
        (void)::unlink(temporary_.c_str());
    }
}

void AtomicFile::failed() {
    if (result_.ok()) {
        result_ = Failure::ofErrno();
    }
}

void AtomicFile::write(std::string_view text) {
    if (stream_ != nullptr && std::fwrite(text.data(), 1, text.size(), stream_) != text.size()) {
        failed();
    }
}

Result<void> AtomicFile::syncDirectory() const {
    const auto parent = path_.has_parent_path() ? path_.parent_path() : ".";
    const int fd = ::open(parent.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (fd < 0) {
        return Failure::ofErrno();
    }
    Result<void> result;
    if (::fsync(fd) != 0) {
        result = Failure::ofErrno();
    }
    ::close(fd);
    return result;
}

Result<void> AtomicFile::commit() {
    if (stream_ == nullptr) {
        return result_;
    }
    if (std::ferror(stream_) != 0 && result_.ok()) {
        result_ = Failure{std::errc::io_error};
    }
    if (const auto shared = shareWithReaders(::fileno(stream_)); !shared.ok()) {
        result_ = result_.ok() ? shared : result_;
    }
    if (std::fflush(stream_) != 0 || ::fsync(::fileno(stream_)) != 0) {
        failed();
    }
    if (std::fclose(std::exchange(stream_, nullptr)) != 0) {
        failed();
    }
    if (result_.ok() && ::rename(temporary_.c_str(), path_.c_str()) != 0) {
        failed();
    }
    if (!result_.ok()) {
        (void)::unlink(temporary_.c_str());
        return result_;
    }
    return syncDirectory();
}

} // namespace halyard::linux_
