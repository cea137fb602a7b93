// Runs work in a child process, so that a crash, a hang or a runaway
// allocation in assimp ends that child and not the host. The child is forked
// from the host (it inherits the loaded state and the standard streams),
// runs the job, hands a small text record back through a pipe and exits with
// the job's code. The parent waits with a time limit and kills the child's
// process group when the time is up.
#pragma once

#include "b_memory.h"

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <span>

namespace host {

struct IsolationLimits {
    // Wall-clock limit of one child; 0 waits for ever.
    std::uint32_t timeoutSeconds = 600;
    // Address-space limit of the child in MiB; 0 keeps the host's.
    std::uint64_t maxMemoryMiB = 0;
};

// How a child ended.
struct ChildEnd {
    enum Kind { exited, signalled, timedOut, notStarted } kind = notStarted;
    // The exit code, or the signal number.
    int code = 0;
    double seconds = 0;
    // Peak resident memory of the child (from the kernel's accounting).
    std::uint64_t peakKiB = 0;
    // What the job wrote to its record channel.
    base::string record;
    pid_t pid = -1;
    // Why the child could not be started (kind notStarted).
    base::string failure;
};

// "segmentation fault", "aborted", ... or "signal N".
base::string signalText(int signal);

// The job runs in the child with the write end of the record channel; its
// answer is the child's exit code.
using ChildJob = std::function<int(int recordFd)>;

class IsolatedChild : base::NonCopyable {
public:
    // Forks and runs 'job' in the child. When the fork fails, done() is true
    // at once with kind notStarted.
    IsolatedChild(const IsolationLimits& limits, const ChildJob& job);
    ~IsolatedChild();

    pid_t pid() const noexcept { return m_pid; }
    bool done() const noexcept { return m_done; }
    const ChildEnd& end() const noexcept { return m_end; }

    // Reads what the child wrote, reaps it when it has ended and kills it when
    // its time is up. Does not block.
    void poll();

    // Waits until one of 'children' that is still running changes (or up to
    // 'maxWait'), then polls them all.
    static void waitAny(std::span<IsolatedChild* const> children,
                        std::chrono::milliseconds maxWait);

private:
    void finish(int status, std::uint64_t peakKiB);

    pid_t m_pid = -1;
    int m_recordFd = -1;
    // Readable once the child has ended (-1 where the kernel offers none):
    // lets a waiting host reap a child the moment it exits.
    int m_pidFd = -1;
    bool m_done = false;
    bool m_killed = false;
    std::uint32_t m_timeout;
    std::chrono::steady_clock::time_point m_started;
    ChildEnd m_end;
};

// Runs one job isolated and waits for it.
ChildEnd runIsolated(const IsolationLimits& limits, const ChildJob& job);

} // namespace host
