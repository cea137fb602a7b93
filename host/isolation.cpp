#include "isolation.h"

#include "b_format.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace host {

base::string signalText(int signal) {
    switch (signal) {
    case SIGSEGV:
        return "segmentation fault";
    case SIGABRT:
        return "aborted";
    case SIGBUS:
        return "bus error";
    case SIGFPE:
        return "floating-point exception";
    case SIGILL:
        return "illegal instruction";
    case SIGKILL:
        return "killed";
    case SIGTERM:
        return "terminated";
    case SIGXCPU:
        return "CPU time limit exceeded";
    default:
        return base::format("signal {}", signal);
    }
}

IsolatedChild::IsolatedChild(const IsolationLimits& limits, const ChildJob& job)
    : m_timeout(limits.timeoutSeconds), m_started(std::chrono::steady_clock::now()) {
    int fds[2];
    if (::pipe2(fds, O_CLOEXEC) != 0) {
        m_done = true;
        m_end.failure = base::format("cannot start the import process: {}", std::strerror(errno));
        return;
    }
    // Buffered output would otherwise be written by both processes.
    std::fflush(nullptr);
    m_pid = ::fork();
    if (m_pid < 0) {
        ::close(fds[0]);
        ::close(fds[1]);
        m_done = true;
        m_end.failure = base::format("cannot start the import process: {}", std::strerror(errno));
        return;
    }
    if (m_pid == 0) {
        ::close(fds[0]);
        // The child must not outlive a host that is killed.
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        if (limits.maxMemoryMiB) {
            const rlim_t bytes = rlim_t(limits.maxMemoryMiB) << 20;
            const rlimit cap{bytes, bytes};
            ::setrlimit(RLIMIT_AS, &cap);
        }
        int code = 1;
        try {
            code = job(fds[1]);
        } catch (...) {
            code = 1;
        }
        ::close(fds[1]);
        std::fflush(nullptr);
        // A normal exit, so that the leak checker of a sanitized build still
        // judges the import.
        std::exit(code);
    }
    ::close(fds[1]);
    m_end.pid = m_pid;
#ifdef SYS_pidfd_open
    m_pidFd = int(::syscall(SYS_pidfd_open, m_pid, 0));
    if (m_pidFd >= 0)
        ::fcntl(m_pidFd, F_SETFD, FD_CLOEXEC);
#endif
    m_recordFd = fds[0];
    ::fcntl(m_recordFd, F_SETFL, ::fcntl(m_recordFd, F_GETFL) | O_NONBLOCK);
}

IsolatedChild::~IsolatedChild() {
    if (!m_done && m_pid > 0) {
        ::kill(m_pid, SIGKILL);
        ::waitpid(m_pid, nullptr, 0);
    }
    if (m_recordFd >= 0)
        ::close(m_recordFd);
    if (m_pidFd >= 0)
        ::close(m_pidFd);
}

void IsolatedChild::finish(int status, std::uint64_t peakKiB) {
    m_done = true;
    m_end.seconds =
        std::chrono::duration<double>(std::chrono::steady_clock::now() - m_started).count();
    m_end.peakKiB = peakKiB;
    if (m_killed) {
        m_end.kind = ChildEnd::timedOut;
        m_end.code = m_timeout;
    } else if (WIFSIGNALED(status)) {
        m_end.kind = ChildEnd::signalled;
        m_end.code = WTERMSIG(status);
    } else {
        m_end.kind = ChildEnd::exited;
        m_end.code = WEXITSTATUS(status);
    }
    if (m_recordFd >= 0) {
        ::close(m_recordFd);
        m_recordFd = -1;
    }
    if (m_pidFd >= 0) {
        ::close(m_pidFd);
        m_pidFd = -1;
    }
}

void IsolatedChild::poll() {
    if (m_done)
        return;
    if (m_recordFd >= 0) {
        char buffer[4096];
        for (;;) {
            const ssize_t n = ::read(m_recordFd, buffer, sizeof buffer);
            if (n > 0) {
                m_end.record.append(buffer, std::size_t(n));
                continue;
            }
            if (n < 0 && errno == EINTR)
                continue;
            if (n == 0) {
                // The child closed its channel (it is ending); polling a
                // closed channel would only spin.
                ::close(m_recordFd);
                m_recordFd = -1;
            }
            break;
        }
    }
    int status = 0;
    rusage usage{};
    pid_t reaped = ::wait4(m_pid, &status, WNOHANG, &usage);
    if (reaped == m_pid) {
        // Whatever the child wrote just before it ended.
        if (m_recordFd >= 0) {
            char buffer[4096];
            for (ssize_t n; (n = ::read(m_recordFd, buffer, sizeof buffer)) > 0;)
                m_end.record.append(buffer, std::size_t(n));
        }
        finish(status, std::uint64_t(usage.ru_maxrss));
        return;
    }
    if (m_timeout && !m_killed &&
        std::chrono::steady_clock::now() - m_started >= std::chrono::seconds(m_timeout)) {
        m_killed = true;
        ::kill(m_pid, SIGKILL);
        reaped = ::wait4(m_pid, &status, 0, &usage);
        finish(status, reaped == m_pid ? std::uint64_t(usage.ru_maxrss) : 0);
    }
}

void IsolatedChild::waitAny(std::span<IsolatedChild* const> children,
                            std::chrono::milliseconds maxWait) {
    base::vector<pollfd> fds;
    fds.reserve(2 * children.size());
    for (IsolatedChild* child : children) {
        if (child->m_done)
            continue;
        if (child->m_recordFd >= 0)
            fds.push_back({child->m_recordFd, POLLIN, 0});
        if (child->m_pidFd >= 0)
            fds.push_back({child->m_pidFd, POLLIN, 0});
    }
    // A child that ended is noticed by its process descriptor or, without
    // one, by its closed channel; the short cap then covers the moment
    // between the channel closing and the child being reapable, and the time
    // limits.
    const int wait = int(std::min<std::int64_t>(maxWait.count(), 50));
    ::poll(fds.data(), nfds_t(fds.size()), wait);
    for (IsolatedChild* child : children)
        child->poll();
}

ChildEnd runIsolated(const IsolationLimits& limits, const ChildJob& job) {
    IsolatedChild child(limits, job);
    IsolatedChild* const one[] = {&child};
    while (!child.done())
        IsolatedChild::waitAny(one, std::chrono::milliseconds(50));
    return child.end();
}

} // namespace host
