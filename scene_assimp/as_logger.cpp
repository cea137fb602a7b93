#include "as_logger.h"

#include "b_format.h"
#include "b_log.h"

#include <algorithm>
#include <cstring>
#include <string_view>

namespace as {

AssimpLogger::AssimpLogger() : Assimp::Logger(Assimp::Logger::NORMAL) {}

AssimpLogger::~AssimpLogger() {
    try {
        for (const base::string* text : m_order) {
            const Seen& seen = m_seen.find(*text)->second;
            if (seen.interleaved)
                base::logFormatted(base::logScene, seen.level, "assimp| {} (repeated {} more {})",
                                   *text, seen.repeats, seen.repeats == 1 ? "time" : "times");
        }
    } catch (...) {
    }
}

bool AssimpLogger::attachStream(Assimp::LogStream*, unsigned int) {
    return false;
}

bool AssimpLogger::detachStream(Assimp::LogStream*, unsigned int) {
    return false;
}

void AssimpLogger::OnDebug(const char* message) {
    forward(message, base::logDebug);
}

void AssimpLogger::OnVerboseDebug(const char* message) {
    forward(message, base::logDebug);
}

void AssimpLogger::OnInfo(const char* message) {
    forward(message, base::logInfo);
}

void AssimpLogger::OnWarn(const char* message) {
    forward(message, base::logWarning);
}

void AssimpLogger::OnError(const char* message) {
    forward(message, base::logError);
}

bool AssimpLogger::seenBefore(const char* message, int level) {
    const auto found = m_seen.find(std::string_view(message));
    if (found == m_seen.end()) {
        if (m_seen.size() < maxRemembered) {
            const auto added = m_seen.emplace(base::string(message), Seen{0, level, false});
            m_order.push_back(&added.first->first);
        }
        return false;
    }
    Seen& seen = found->second;
    ++seen.repeats;
    seen.level = std::min(seen.level, level);
    return true;
}

void AssimpLogger::forward(const char* message, int level) try {
    if (!message)
        message = "";
    // Compared in full, but only the first 1023 characters are kept, so a
    // longer message never counts as a repeat of itself.
    if (std::strcmp(message, m_lastMessage) != 0) {
        std::size_t length = std::strlen(message);
        if (length >= lastMessageSize)
            length = lastMessageSize - 1;
        std::memcpy(m_lastMessage, message, length);
        m_lastMessage[length] = '\0';
        m_repeatReported = false;
        m_lastSuppressed = seenBefore(message, level);
        if (m_lastSuppressed) {
            m_seen.find(std::string_view(message))->second.interleaved = true;
            return;
        }
        base::logFormatted(base::logScene, level, "assimp| {}", message);
        return;
    }
    seenBefore(message, level);
    if (!m_repeatReported && !m_lastSuppressed) {
        m_repeatReported = true;
        base::logFormatted(base::logScene, base::logInfo,
                           "Skipping one or more lines with the same contents...");
    }
} catch (...) {
    // assimp calls this from code that does not expect exceptions; a line
    // the host log could not take is lost rather than unwinding through it.
}

} // namespace as
