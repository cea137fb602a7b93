// Where the host's documents go. A file is written atomically: into a
// temporary file beside the target, flushed to disk, then renamed over it,
// so a failed or interrupted write leaves the previous file (or none) and
// never a partial document. Standard output is written through the same
// stream type, with write errors (a closed pipe) reported, not fatal.
#pragma once

#include "b_memory.h"
#include "stream/b_stream.h"

#include <functional>
#include <string_view>
#include <sys/types.h>

namespace host {

// A write-only stream over a file descriptor it does not own. Its worker
// remembers the errno of a failed write for the message.
base::Stream fdStream(int fd, std::string_view name);
// The errno of the last failed write of a stream made by fdStream (0 if none).
int fdStreamError(const base::Stream& stream) noexcept;

// The temporary file a process with id 'pid' writes before renaming it to
// 'target': hidden, in the target's folder. The parent of an isolated import
// removes it when the child dies.
base::string temporaryPath(const base::string& target, pid_t pid);

// Writes 'target' through 'write' as described above. False with a one-line
// reason in 'error' when the file cannot be made, 'write' answers false or
// a write fails; the temporary file is removed then.
bool writeAtomically(const base::string& target, const std::function<bool(base::Stream&)>& write,
                     base::string& error);

// Writes a document to 'output': "-" is standard output, anything else a
// file written atomically. False with the reason in 'error'.
bool writeOutput(const base::string& output, const std::function<bool(base::Stream&)>& write,
                 base::string& error);

// Why 'output' cannot receive a document, checked before anything is read:
// its folder is missing or it is a folder itself. Empty when it can.
base::string outputProblem(const base::string& output);

// Whether 'a' and 'b' name the same existing file (device and inode), through
// any spelling, symbolic or hard link.
bool sameFile(const base::string& a, const base::string& b) noexcept;

} // namespace host
