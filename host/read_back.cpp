#include "read_back.h"

#include "b_format.h"
#include "b_json.h"
#include "output_file.h"
#include "scene_interfaces.h"
#include "scene_stats.h"
#include "stream/b_fs.h"

#include <chrono>
#include <cstdio>
#include <filesystem>

namespace host {

int readBack(const base::string& document, const base::string& output, bool summary, HostLog& log,
             base::JSONLayout layout) {
    const auto started = std::chrono::steady_clock::now();
    // Named like an import's factory: after the folder of the document.
    std::error_code ignored;
    base::string folder(std::filesystem::absolute(std::filesystem::path(document.c_str()), ignored)
                            .parent_path()
                            .string());
    folder += '/';
    base::ref<base::PluginFactory> factory(new base::PluginFactory(folder));
    scene::register_scene_schema(*factory);

    bool read = false;
    log.beginImport();
    try {
        base::Stream in = base::fs::master().open(document, base::fs::openRead);
        read = base::readFactory(*factory, in);
    } catch (const base::exception& e) {
        log.flushPendingError();
        std::fprintf(stderr, "scene-import: cannot read '%s': %s\n", document.c_str(),
                     e.message().c_str());
        return 1;
    }
    // The document's own lines come before the host's verdict. A value that
    // did not read is logged but does not stop the reader: it is a problem
    // of the document all the same.
    log.flushPendingError();
    if (log.errors() || log.warnings())
        read = false;
    if (!read)
        std::fprintf(stderr,
                     "scene-import: '%s' has problems (see above); what could be read "
                     "is kept\n",
                     document.c_str());

    int code = read ? 0 : 1;
    base::string error;
    if (!output.empty())
        writeOutput(
            output,
            [&](base::Stream& stream) {
                return base::writeFactory(*factory, stream, 120, nullptr, layout);
            },
            error);
    if (!error.empty()) {
        std::fprintf(stderr, "scene-import: %s\n", error.c_str());
        code = 1;
    }
    if (summary) {
        const double seconds =
            std::chrono::duration<double>(std::chrono::steady_clock::now() - started).count();
        const base::string text = formatSummary(collectStats(*factory), seconds);
        std::fwrite(text.data(), 1, text.size(), output == "-" ? stderr : stdout);
    }
    return code;
}

} // namespace host
