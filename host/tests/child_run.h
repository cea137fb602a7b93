// Runs a shell command line for the host's tests: its standard output, its
// exit code (128 + the signal for a death by a signal) and, when a file is
// named, the standard error the command line sent there.
#pragma once

#include <sys/wait.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

namespace hosttest {

struct CommandRun {
    int code = -1;
    std::string out;
    std::string err;
};

inline std::string readText(const std::filesystem::path& path) {
    std::ifstream in(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(in), {});
}

inline CommandRun runCommand(const std::string& command,
                             const std::filesystem::path& errFile = {}) {
    CommandRun run;
    FILE* pipe = popen(command.c_str(), "r");
    if (!pipe)
        return run;
    char buffer[65536];
    for (std::size_t n; (n = std::fread(buffer, 1, sizeof buffer, pipe)) > 0;)
        run.out.append(buffer, n);
    const int status = pclose(pipe);
    run.code = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    if (!errFile.empty())
        run.err = readText(errFile);
    return run;
}

} // namespace hosttest
