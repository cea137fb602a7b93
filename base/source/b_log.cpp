#include "b_log.h"

#include <atomic>
#include <cstdio>

namespace base {

const name_id logAll("all");
const name_id logIO("io");
const name_id logScene("scene");
const name_id logSystem("system");

const char* levelMarker(int level) noexcept {
    switch (level) {
    case logCritical:
        return "[crit]";
    case logError:
        return "[erro]";
    case logWarning:
        return "[warn]";
    case logInfo:
        return "[info]";
    case logDebug:
        return "[debg]";
    default:
        return "";
    }
}

void StdErrLog::log(name_id, int level, std::string_view message) {
    std::lock_guard lock(m_mutex);
    const char* marker = levelMarker(level);
    std::fprintf(stderr, "%s%s%.*s\n", marker, *marker ? " " : "", int(message.size()),
                 message.data());
}

void CaptureLog::log(name_id channel, int level, std::string_view message) {
    std::lock_guard lock(m_mutex);
    m_entries.push_back({channel, level, string(message)});
}

vector<CaptureLog::Entry> CaptureLog::entries() const {
    std::lock_guard lock(m_mutex);
    return m_entries;
}

vector<string> CaptureLog::messages() const {
    std::lock_guard lock(m_mutex);
    vector<string> out;
    out.reserve(m_entries.size());
    for (const auto& e : m_entries)
        out.push_back(e.message);
    return out;
}

std::size_t CaptureLog::count(std::string_view message) const {
    std::lock_guard lock(m_mutex);
    std::size_t n = 0;
    for (const auto& e : m_entries)
        n += e.message == message;
    return n;
}

void CaptureLog::clear() {
    std::lock_guard lock(m_mutex);
    m_entries.clear();
}

namespace {
StdErrLog& stdErrLog() {
    static StdErrLog* log = new StdErrLog();
    return *log;
}
std::atomic<ILog*> g_log{nullptr};
} // namespace

ILog& log() {
    ILog* l = g_log.load(std::memory_order_acquire);
    return l ? *l : stdErrLog();
}

ILog* setLog(ILog* log) {
    ILog* previous = g_log.exchange(log, std::memory_order_acq_rel);
    return previous ? previous : &stdErrLog();
}

} // namespace base
