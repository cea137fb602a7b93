// What one import came to, as a batch report lists it: status, the one-line
// reason of a failure, object counts per type, vertices, faces, time, peak
// memory, log counts and the document written. An isolated child sends its
// record to the host as "key<TAB>value" lines.
#pragma once

#include "b_memory.h"

#include <cstdint>
#include <string_view>
#include <utility>

namespace host {

struct ImportRecord {
    base::string model;
    // "imported", "failed", "invalid" (validation found errors), "crashed",
    // "timeout".
    base::string status = "failed";
    base::string reason;
    base::vector<std::pair<base::string, std::uint32_t>> types;
    std::uint64_t vertices = 0;
    std::uint64_t faces = 0;
    double seconds = 0;
    std::uint64_t peakKiB = 0;
    std::uint32_t warnings = 0;
    std::uint32_t errors = 0;
    base::string firstWarning;
    base::string output;

    std::uint64_t objects() const noexcept;
};

// The record as "key<TAB>value" lines (tabs and line breaks in texts become
// blanks), and back. Unknown keys are ignored.
base::string encodeRecord(const ImportRecord& record);
void decodeRecord(std::string_view text, ImportRecord& record);
// Writes the encoded record to a child's record channel.
void sendRecord(int fd, const ImportRecord& record);

} // namespace host
