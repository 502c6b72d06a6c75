// Running outside programs: fork, execv, wait.
#include <cerrno>
#include <cstdarg>
#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/navocore.h"

namespace {

constexpr int kMaxExecArgs = 4;

// In the child: only async-signal-safe calls, since the parent may have threads.
[[noreturn]] void exec_child(const char *program, const char *const argv[], int report_fd) {
    int null_fd = ::open("/dev/null", O_RDWR);
    if (null_fd >= 0) {
        dup2(null_fd, STDIN_FILENO);
        dup2(null_fd, STDOUT_FILENO);
        dup2(null_fd, STDERR_FILENO);
        if (null_fd > STDERR_FILENO)
            ::close(null_fd);
    }
    execv(program, const_cast<char *const *>(argv));
    int err = errno;
    if (report_fd >= 0)
        (void)!::write(report_fd, &err, sizeof err);
    _exit(127);
}

// True when the child reported that execv failed (the pipe closes on a good exec).
bool exec_failed(int read_fd) {
    int err = 0;
    ssize_t n;
    do {
        n = ::read(read_fd, &err, sizeof err);
    } while (n < 0 && errno == EINTR);
    return n == static_cast<ssize_t>(sizeof err);
}

int wait_child(pid_t pid) {
    int status = 0;
    pid_t rc;
    do {
        rc = waitpid(pid, &status, 0);
    } while (rc < 0 && errno == EINTR);
    if (rc < 0 || !WIFEXITED(status))
        return -1;
    return WEXITSTATUS(status);
}

int run(const char *program, const char *const argv[], bool wait) {
    int report[2] = {-1, -1};
    if (wait && pipe2(report, O_CLOEXEC) != 0) {
        NLIBCErrSet(kNavoErrSystem);
        return -1;
    }
    pid_t pid = fork();
    if (pid == 0)
        exec_child(program, argv, report[1]);
    if (report[1] >= 0)
        ::close(report[1]);
    if (pid < 0) {
        if (report[0] >= 0)
            ::close(report[0]);
        NLIBCErrSet(kNavoErrSystem);
        return -1;
    }
    if (!wait)
        return 0;
    bool not_started = exec_failed(report[0]);
    ::close(report[0]);
    int status = wait_child(pid);
    if (not_started || status != 0) {
        NLIBCErrSet(kNavoErrChildFailed);
        return not_started ? -1 : status;
    }
    return 0;
}

} // namespace

int NLIBCExec(const char *program, ...) noexcept {
    const char *argv[kMaxExecArgs + 2] = {program};
    va_list ap;
    va_start(ap, program);
    int n = 1;
    const char *arg = nullptr;
    // A fifth argument means the list was not ended where it should have been.
    for (int i = 0; i <= kMaxExecArgs && (arg = va_arg(ap, const char *)) != nullptr; ++i)
        if (i < kMaxExecArgs)
            argv[n++] = arg;
    va_end(ap);
    if (program == nullptr || arg != nullptr) {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    return run(program, argv, true);
}

int NLIBCExecv(const char *program, const char *const argv[], int wait) noexcept {
    if (program == nullptr || argv == nullptr || argv[0] == nullptr) {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    return run(program, argv, wait != 0);
}
