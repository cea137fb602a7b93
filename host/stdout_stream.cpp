#include "stdout_stream.h"

#include "output_file.h"

#include <unistd.h>

namespace host {

base::Stream stdoutStream() {
    return fdStream(STDOUT_FILENO, "<stdout>");
}

} // namespace host
