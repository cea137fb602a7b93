// The host's log: forwards to standard error up to the level the user asked
// for, counts warnings and errors for the report of an import, and keeps the
// last error back so that a failed import states its reason once, in the
// host's own line, instead of twice.
#pragma once

#include "b_log.h"
#include "b_memory.h"

#include <cstdint>
#include <mutex>
#include <string_view>

namespace host {

class HostLog final : public base::ILog {
public:
    void setShownLevel(int level);
    int shownLevel() const noexcept { return m_shown; }

    void log(base::name_id channel, int level, std::string_view message) override;

    // The last error or critical line, without its component tag.
    base::string lastError() const;
    base::string firstWarning() const;
    std::uint32_t warnings() const;
    std::uint32_t errors() const;
    // Forgets the counts and the last error: a new import starts.
    void beginImport();
    // The held-back error line is the failure's reason: drop it.
    void dropPendingError();
    // Shows the held-back error line (the import went on after it).
    void flushPendingError();

private:
    void show(base::name_id channel, int level, std::string_view message);

    base::StdErrLog m_out;
    int m_shown = base::logWarning;
    mutable std::mutex m_mutex;
    base::string m_lastError;
    base::string m_firstWarning;
    // An error line not shown yet, with its channel and level.
    base::string m_pending;
    base::name_id m_pendingChannel;
    int m_pendingLevel = 0;
    bool m_hasPending = false;
    std::uint32_t m_warnings = 0;
    std::uint32_t m_errors = 0;
};

// A log line as a user reads it: "assimp| text" and "component |object| text"
// lose their tag.
std::string_view withoutTag(std::string_view message) noexcept;

} // namespace host
