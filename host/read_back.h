// --read: a scene document read back into a fresh factory with the scene
// types registered (references by name resolved, forward ones included) and,
// with -o, written again. Import, write, read and write give the same bytes,
// which is how the document is shown to be lossless.
#pragma once

#include "b_json.h"
#include "b_memory.h"
#include "host_log.h"

namespace host {

// Reads 'document' (either layout) and writes it to 'output' ("-" standard
// output, empty for none) in 'layout'; prints the summary when asked. Problems of the document are
// logged with their lines; what can be read is read and written. Exit 0 when it read without
// problems and was written, 1 otherwise.
int readBack(const base::string& document, const base::string& output, bool summary, HostLog& log,
             base::JSONLayout layout = base::JSONLayout::keyed);

} // namespace host
