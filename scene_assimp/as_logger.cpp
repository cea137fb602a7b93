#include "as_logger.h"

#include "b_format.h"
#include "b_log.h"

#include <cstring>

namespace as {

AssimpLogger::AssimpLogger() : Assimp::Logger(Assimp::Logger::NORMAL) {}

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
        base::logFormatted(base::logScene, level, "assimp| {}", message);
        return;
    }
    if (!m_repeatReported) {
        m_repeatReported = true;
        base::logFormatted(base::logScene, base::logInfo,
                           "Skipping one or more lines with the same contents...");
    }
} catch (...) {
    // assimp calls this from code that does not expect exceptions; a line
    // the host log could not take is lost rather than unwinding through it.
}

} // namespace as
