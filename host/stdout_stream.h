// A write-only base::Stream over the process's standard output, so the JSON
// writer can target a pipe as it targets a file.
#pragma once

#include "stream/b_stream.h"

namespace host {

base::Stream stdoutStream();

} // namespace host
