#include "load/Daemon.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <ctime>
#include <fcntl.h>
#include <fstream>
#include <memory>
#include <sqlite3.h>
#include <sstream>
#include <stdexcept>
#include <string_view>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace halyard::load {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;

constexpr auto kStartLimit = 20s;
constexpr std::size_t kLogTail = 2000;

// Reads "Name:   123 kB".
std::uint64_t statusBytes(const std::string& status, std::string_view name) {
    const std::size_t at = status.find(name);
    return at == std::string::npos ? 0
                                   : std::strtoull(&status[at + name.size()], nullptr, 10) * 1024;
}

std::string readFile(const fs::path& path) {
    std::ostringstream text;
    text << std::ifstream(path).rdbuf();
    return text.str();
}

std::uint64_t countRows(sqlite3* database, const char* query) {
    sqlite3_stmt* statement = nullptr;
    if (sqlite3_prepare_v2(database, query, -1, &statement, nullptr) != SQLITE_OK) {
        throw std::runtime_error(std::string("the store: ") + sqlite3_errmsg(database));
    }
    const bool found = sqlite3_step(statement) == SQLITE_ROW;
    const auto count = static_cast<std::uint64_t>(found ? sqlite3_column_int64(statement, 0) : 0);
    sqlite3_finalize(statement);
    return count;
}

} // namespace

Daemon::Daemon(const Options& options, const DaemonSettings& settings)
    : options_(options), directory_(options.directory) {
    for (const char* name : {"etc", "state", "run", "log"}) {
        fs::create_directory(directory_.path() / name);
    }
    writeConfiguration(settings);
    spawn();
    try {
        awaitSocket();
    } catch (...) {
        ::kill(pid_, SIGKILL);
        ::waitpid(pid_, nullptr, 0);
        throw;
    }
}

Daemon::~Daemon() {
    if (pid_ > 0) {
        ::kill(pid_, SIGKILL);
        ::waitpid(pid_, nullptr, 0);
    }
}

// Room for every row, so that what is counted at the end is what was sent.
void Daemon::writeConfiguration(const DaemonSettings& settings) const {
    std::ofstream file(directory_.path() / "etc" / "halyard.toml");
    file << "[store]\nmax_bytes = \"64GiB\"\n";
    if (!options_.syncInterval.empty()) {
        file << "sync_interval = \"" << options_.syncInterval << "\"\n";
    }
    file << "[log]\nlevel = \"" << settings.logLevel << "\"\n";
    if (!settings.analytics) {
        file << "[analytics]\nwanted = []\n";
    }
    if (settings.tracing) {
        file << "[feature_flags.AudioAnalytics]\nTracing = true\n";
    }
}

void Daemon::spawn() {
    const pid_t parent = ::getpid();
    pid_ = ::fork();
    if (pid_ < 0) {
        throw std::system_error(errno, std::generic_category(), "fork");
    }
    if (pid_ == 0) {
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        if (::getppid() != parent) {
            ::_exit(127);
        }
        run();
    }
}

void Daemon::run() const {
    const auto set = [this](const char* name, const char* folder) {
        ::setenv(name, (directory_.path() / folder).c_str(), 1);
    };
    set("CONFIGURATION_DIRECTORY", "etc");
    set("STATE_DIRECTORY", "state");
    set("RUNTIME_DIRECTORY", "run");
    set("LOGS_DIRECTORY", "log");
    for (const char* name : {"NOTIFY_SOCKET", "JOURNAL_STREAM", "LISTEN_FDS", "LISTEN_PID"}) {
        ::unsetenv(name);
    }
    const int log = ::open((directory_.path() / "stderr").c_str(),
                           O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
    ::dup2(log, STDOUT_FILENO);
    ::dup2(log, STDERR_FILENO);
    ::execl(options_.daemon.c_str(), options_.daemon.c_str(), nullptr);
    ::_exit(127);
}

void Daemon::awaitSocket() {
    const auto deadline = std::chrono::steady_clock::now() + kStartLimit;
    while (std::chrono::steady_clock::now() < deadline) {
        int status = 0;
        if (::waitpid(pid_, &status, WNOHANG) == pid_) {
            failWithLog(options_.daemon + " ended at once");
        }
        try {
            connect().barrier();
            return;
        } catch (const std::system_error&) {
            std::this_thread::sleep_for(2ms); // no socket yet
        }
    }
    failWithLog(options_.daemon + " takes no connections");
}

void Daemon::failWithLog(const std::string& what) const {
    const std::string log = readFile(directory_.path() / "stderr");
    throw std::runtime_error(what + "; its log ends:\n" +
                             log.substr(log.size() - std::min(log.size(), kLogTail)));
}

std::string Daemon::socketPath() const {
    return directory_.path() / "run" / "reporting.sock";
}

Connection Daemon::connect() const {
    return Connection(socketPath(), std::chrono::seconds(options_.timeoutSeconds));
}

std::uint64_t Daemon::cpuNanoseconds() const {
    clockid_t clock = 0;
    timespec time{};
    if (::clock_getcpuclockid(pid_, &clock) != 0 || ::clock_gettime(clock, &time) != 0) {
        throw std::runtime_error("cannot read the daemon's CPU time");
    }
    return static_cast<std::uint64_t>(time.tv_sec) * 1000000000U +
           static_cast<std::uint64_t>(time.tv_nsec);
}

MemoryUse Daemon::memory() const {
    const std::string status = readFile("/proc/" + std::to_string(pid_) + "/status");
    return {.residentBytes = statusBytes(status, "VmRSS:"),
            .peakBytes = statusBytes(status, "VmHWM:")};
}

Rows Daemon::rows() const {
    const std::string path = directory_.path() / "state" / "telemetry.db";
    sqlite3* opened = nullptr;
    const int result = sqlite3_open_v2(path.c_str(), &opened, SQLITE_OPEN_READONLY, nullptr);
    const std::unique_ptr<sqlite3, decltype(&sqlite3_close)> database(opened, &sqlite3_close);
    if (result != SQLITE_OK) {
        throw std::runtime_error(path + ": " + sqlite3_errmsg(database.get()));
    }
    sqlite3_busy_timeout(database.get(), 5000);
    return {.uploads = countRows(database.get(), "SELECT count(*) FROM upload_message"),
            .analytics =
                countRows(database.get(), "SELECT count(*) FROM analytics_event WHERE name <> "
                                          "'com.kestrel.halyard.hyreportingclientuptime'")};
}

void Daemon::stop() {
    ::kill(pid_, SIGTERM);
    const auto deadline =
        std::chrono::steady_clock::now() + std::chrono::seconds(options_.timeoutSeconds);
    int status = 0;
    while (::waitpid(pid_, &status, WNOHANG) == 0) {
        if (std::chrono::steady_clock::now() > deadline) {
            failWithLog("the daemon does not end on SIGTERM");
        }
        std::this_thread::sleep_for(2ms);
    }
    pid_ = -1;
    if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) {
        failWithLog("the daemon did not end with 0");
    }
}

} // namespace halyard::load
