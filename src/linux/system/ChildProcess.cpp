#include "linux/system/ChildProcess.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>

namespace halyard::linux_ {
namespace {

// After fork in a process of many threads: nothing but system calls.
[[noreturn]] void become(char* const* arguments, int errors, ::pid_t parent) {
    ::setpgid(0, 0);
    ::prctl(PR_SET_PDEATHSIG, SIGINT);
    sigset_t none;
    ::sigemptyset(&none);
    ::sigprocmask(SIG_SETMASK, &none, nullptr);
    ::signal(SIGPIPE, SIG_DFL);
    ::signal(SIGINT, SIG_DFL);
    const int nowhere = ::open("/dev/null", O_RDWR);
    for (const int standard : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
        ::dup2(nowhere, standard);
    }
    if (::getppid() == parent) {
        ::execvp(arguments[0], arguments);
    }
    const int error = errno;
    (void)!::write(errors, &error, sizeof error);
    ::_exit(127);
}

} // namespace

ChildProcess::~ChildProcess() {
    (void)finish();
}

Result<void> ChildProcess::start(const std::vector<std::string>& arguments) {
    std::vector<char*> pointers;
    for (const std::string& argument : arguments) {
        pointers.push_back(const_cast<char*>(argument.c_str()));
    }
    pointers.push_back(nullptr);
    int errors[2];
    if (::pipe2(errors, O_CLOEXEC) != 0) {
        return Failure::ofErrno();
    }
    const ::pid_t parent = ::getpid();
    pid_ = ::fork();
    if (pid_ == 0) {
        become(pointers.data(), errors[1], parent);
    }
    Result<void> result;
    if (pid_ < 0) {
        result = Failure::ofErrno();
    }
    ::close(errors[1]);
    int error = 0;
    if (pid_ > 0 && ::read(errors[0], &error, sizeof error) == sizeof error) {
        result = Failure{static_cast<std::errc>(error)};
    }
    ::close(errors[0]);
    if (result.ok()) {
        pidfd_ = static_cast<int>(::syscall(SYS_pidfd_open, pid_, 0));
        if (pidfd_ < 0) {
            result = Failure::ofErrno();
        }
    }
    if (!result.ok()) {
        (void)finish();
    }
    return result;
}

void ChildProcess::interrupt() {
    if (pid_ > 0) {
        ::kill(pid_, SIGINT);
    }
}

bool ChildProcess::wait(int wake, std::chrono::milliseconds limit) {
    pollfd waiting[] = {{pidfd_, POLLIN, 0}, {wake, POLLIN, 0}};
    while (::poll(waiting, 2, static_cast<int>(limit.count())) < 0 && errno == EINTR) {
    }
    return waiting[0].revents != 0;
}

int ChildProcess::finish() {
    int status = -1;
    if (pid_ > 0) {
        ::kill(-pid_, SIGKILL);
        ::kill(pid_, SIGKILL); // Before it had made its group.
        while (::waitpid(pid_, &status, 0) < 0 && errno == EINTR) {
        }
    }
    if (pidfd_ >= 0) {
        ::close(pidfd_);
    }
    pid_ = -1;
    pidfd_ = -1;
    return status;
}

} // namespace halyard::linux_
