// The logger the importer installs in assimp for the duration of one import:
// every assimp message goes to the host log on the scene channel, and runs of
// identical messages are folded into one line plus a "Skipping" note.
#pragma once

#include <assimp/Logger.hpp>

#include <cstddef>

namespace as {

// Allocated with plain new: Assimp::Logger brings assimp's heap operators,
// and DefaultLogger::kill deletes it there.
class AssimpLogger final : public Assimp::Logger {
public:
    AssimpLogger();

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

    static constexpr std::size_t lastMessageSize = 1024;
    char m_lastMessage[lastMessageSize] = {};
    bool m_repeatReported = false;
};

} // namespace as
