// Call-stack capture for exceptions. Capture can be switched off process-wide
// (the file system does so around probing, where exceptions are expected).
#pragma once

#include "b_memory.h"

#include <atomic>

namespace base {

class StackWalker : NonCopyable {
public:
    // Appends the calling thread's stack, one demangled frame a line, skipping
    // 'skip' innermost frames. Appends nothing while capture is off.
    void appendCallStack(string& out, int skip = 0) const;

    bool captureEnabled() const noexcept { return m_enabled.load(std::memory_order_relaxed); }
    // Answers the previous setting.
    bool setCaptureEnabled(bool enabled) noexcept { return m_enabled.exchange(enabled); }

private:
    std::atomic<bool> m_enabled{true};
};

StackWalker& stackWalker();

// Switches capture off for a scope and restores the previous setting on every
// way out.
class ScopedStackCapture : NonCopyable {
public:
    explicit ScopedStackCapture(bool enabled)
        : m_previous(stackWalker().setCaptureEnabled(enabled)) {}
    ~ScopedStackCapture() { stackWalker().setCaptureEnabled(m_previous); }

private:
    bool m_previous;
};

} // namespace base
