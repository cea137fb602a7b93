#include "host_log.h"

#include <algorithm>

namespace host {

std::string_view withoutTag(std::string_view message) noexcept {
    // Tags are short: a bar far into the text belongs to the text.
    const std::size_t bar = message.find("| ");
    if (bar == std::string_view::npos || bar > 512)
        return message;
    return message.substr(bar + 2);
}

void HostLog::setShownLevel(int level) {
    m_shown = level;
    // Warnings and errors always reach log(): they are counted, and the
    // reason of a failure is known.
    setMaxLevel(std::max(level, int(base::logWarning)));
}

void HostLog::log(base::name_id channel, int level, std::string_view message) {
    std::unique_lock lock(m_mutex);
    if (level == base::logWarning) {
        if (m_warnings++ == 0)
            m_firstWarning.assign(withoutTag(message));
    } else if (level >= base::logCritical && level <= base::logError) {
        ++m_errors;
        m_lastError.assign(withoutTag(message));
        // Held back until the next line: when the import then fails, this
        // line is its reason and the host states it once.
        base::string previous;
        base::name_id previousChannel = m_pendingChannel;
        const int previousLevel = m_pendingLevel;
        const bool hadPending = m_hasPending;
        previous.swap(m_pending);
        m_pending.assign(message);
        m_pendingChannel = channel;
        m_pendingLevel = level;
        m_hasPending = level <= m_shown;
        lock.unlock();
        if (hadPending)
            show(previousChannel, previousLevel, previous);
        return;
    }
    const bool flush = m_hasPending;
    base::string pending;
    if (flush) {
        pending.swap(m_pending);
        m_hasPending = false;
    }
    const base::name_id pendingChannel = m_pendingChannel;
    const int pendingLevel = m_pendingLevel;
    lock.unlock();
    if (flush)
        show(pendingChannel, pendingLevel, pending);
    if (level <= m_shown)
        show(channel, level, message);
}

void HostLog::show(base::name_id channel, int level, std::string_view message) {
    m_out.log(channel, level, message);
}

base::string HostLog::lastError() const {
    std::lock_guard lock(m_mutex);
    return m_lastError;
}

base::string HostLog::firstWarning() const {
    std::lock_guard lock(m_mutex);
    return m_firstWarning;
}

std::uint32_t HostLog::warnings() const {
    std::lock_guard lock(m_mutex);
    return m_warnings;
}

std::uint32_t HostLog::errors() const {
    std::lock_guard lock(m_mutex);
    return m_errors;
}

void HostLog::beginImport() {
    flushPendingError();
    std::lock_guard lock(m_mutex);
    m_lastError.clear();
    m_firstWarning.clear();
    m_warnings = m_errors = 0;
}

void HostLog::dropPendingError() {
    std::lock_guard lock(m_mutex);
    m_hasPending = false;
    m_pending.clear();
}

void HostLog::flushPendingError() {
    std::unique_lock lock(m_mutex);
    if (!m_hasPending)
        return;
    m_hasPending = false;
    base::string pending;
    pending.swap(m_pending);
    lock.unlock();
    show(m_pendingChannel, m_pendingLevel, pending);
}

} // namespace host
