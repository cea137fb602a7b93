// The logger the importer installs in assimp for the duration of one import:
// every assimp message goes to the host log on the scene channel, and runs of
// identical messages are folded into one line plus a "Skipping" note. A
// message that comes back after others is not repeated either: when the
// import ends (the logger is deleted) one line gives its count.
#pragma once

#include <assimp/Logger.hpp>

#include "b_memory.h"

#include <cstddef>
#include <cstdint>
#include <functional>

namespace as {

// Allocated with plain new: Assimp::Logger brings assimp's heap operators,
// and DefaultLogger::kill deletes it there.
class AssimpLogger final : public Assimp::Logger {
public:
    AssimpLogger();
    // Writes the counts of the messages that came back after others.
    ~AssimpLogger() override;

    // Streams are assimp's own output path; the host log replaces them.
    bool attachStream(Assimp::LogStream* stream, unsigned int severity) override;
    bool detachStream(Assimp::LogStream* stream, unsigned int severity) override;

    void OnDebug(const char* message) override;
    void OnVerboseDebug(const char* message) override;
    void OnInfo(const char* message) override;
    void OnWarn(const char* message) override;
    void OnError(const char* message) override;

private:
    void forward(const char* message, int level);
    // Whether 'message' was forwarded earlier in this import (and counts it).
    bool seenBefore(const char* message, int level);

    struct Seen {
        std::uint32_t repeats = 0;
        int level = 0;
        // Whether it came back after a different message.
        bool interleaved = false;
    };

    static constexpr std::size_t lastMessageSize = 1024;
    // Bounds the memory a reader that logs endless distinct lines can cost;
    // beyond it new messages are forwarded without being remembered.
    static constexpr std::size_t maxRemembered = 4096;
    char m_lastMessage[lastMessageSize] = {};
    bool m_repeatReported = false;
    // The last message was held back as a repeat: its run is in the counts.
    bool m_lastSuppressed = false;
    base::map<base::string, Seen, std::less<>> m_seen;
    base::vector<const base::string*> m_order;
};

} // namespace as
