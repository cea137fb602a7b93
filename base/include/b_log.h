// The host log: one process-wide ILog behind log(). Levels: 0 plain text,
// 1 critical, 2 error, 3 warning, 4 information, 5 debug. Messages above the
// log's maximum level are dropped before they are formatted (see b_format.h).
#pragma once

#include "b_name.h"

#include <mutex>
#include <string_view>

namespace base {

enum LogLevel : int {
    logText = 0,
    logCritical = 1,
    logError = 2,
    logWarning = 3,
    logInfo = 4,
    logDebug = 5,
};

// Channels. Constants are interned when base1 loads.
extern const name_id logAll;
extern const name_id logIO;
extern const name_id logScene;
extern const name_id logSystem;

class ILog {
public:
    virtual ~ILog() = default;
    virtual void log(name_id channel, int level, std::string_view message) = 0;

    int maxLevel() const noexcept { return m_maxLevel.load(std::memory_order_relaxed); }
    void setMaxLevel(int level) noexcept { m_maxLevel.store(level, std::memory_order_relaxed); }

private:
    std::atomic<int> m_maxLevel{logWarning};
};

// "[crit]", "[erro]", "[warn]", "[info]", "[debg]"; level 0 has no marker.
const char* levelMarker(int level) noexcept;

// Writes each message on its own line to standard error, marked with its level.
class StdErrLog final : public ILog {
public:
    void log(name_id channel, int level, std::string_view message) override;

private:
    std::mutex m_mutex;
};

// Keeps every message; tests assert on the exact texts.
class CaptureLog final : public ILog {
public:
    struct Entry {
        name_id channel;
        int level;
        string message;
    };
    CaptureLog() { setMaxLevel(logDebug); }
    void log(name_id channel, int level, std::string_view message) override;

    vector<Entry> entries() const;
    vector<string> messages() const;
    std::size_t count(std::string_view message) const;
    void clear();

private:
    mutable std::mutex m_mutex;
    vector<Entry> m_entries;
};

// The process-wide log; a standard-error writer unless replaced.
ILog& log();
// Installs a log (nullptr restores the standard-error writer); answers the
// previous one. The caller keeps ownership.
ILog* setLog(ILog* log);

// Installs a log for the lifetime of a scope (tests).
class ScopedLog : NonCopyable {
public:
    explicit ScopedLog(ILog& log) : m_previous(setLog(&log)) {}
    ~ScopedLog() { setLog(m_previous); }

private:
    ILog* m_previous;
};

} // namespace base
