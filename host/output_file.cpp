#include "output_file.h"

#include "b_format.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>

namespace host {

namespace {

class FdWorker final : public base::StreamWorker {
public:
    FdWorker(int fd, std::string_view name) : StreamWorker(name, base::capWrite), m_fd(fd) {}

    std::uint64_t read(void*, std::uint64_t) override { return 0; }
    // Loops over short writes; an error ends the count early, which the
    // writer reports as a failed document.
    std::uint64_t write(const void* buffer, std::uint64_t bytes) override {
        const char* cursor = static_cast<const char*>(buffer);
        std::uint64_t done = 0;
        while (done < bytes) {
            const ssize_t n = ::write(m_fd, cursor + done, bytes - done);
            if (n < 0 && errno == EINTR)
                continue;
            if (n <= 0) {
                m_error = n < 0 ? errno : EIO;
                break;
            }
            done += std::uint64_t(n);
        }
        m_position += done;
        return done;
    }
    std::uint64_t setPosition(std::int64_t, std::uint32_t) override { return m_position; }
    std::uint64_t getPosition() override { return m_position; }
    std::uint64_t getSize() override { return m_position; }
    void setSize(std::uint64_t) override {}
    void flush(std::uint32_t) override {}

    int error() const noexcept { return m_error; }

private:
    int m_fd;
    std::uint64_t m_position = 0;
    int m_error = 0;
};

} // namespace

base::Stream fdStream(int fd, std::string_view name) {
    return base::Stream(base::ref<base::StreamWorker>(new FdWorker(fd, name)));
}

int fdStreamError(const base::Stream& stream) noexcept {
    const auto* worker = dynamic_cast<const FdWorker*>(stream.worker());
    return worker ? worker->error() : 0;
}

base::string temporaryPath(const base::string& target, pid_t pid) {
    const std::size_t slash = target.rfind('/');
    const std::size_t name = slash == base::string::npos ? 0 : slash + 1;
    return base::format("{}.{}.{}.tmp", target.substr(0, name), target.substr(name), int(pid));
}

bool writeAtomically(const base::string& target, const std::function<bool(base::Stream&)>& write,
                     base::string& error) {
    const base::string temporary = temporaryPath(target, ::getpid());
    const int fd = ::open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
    if (fd < 0) {
        error = base::format("cannot write '{}': {}", target, std::strerror(errno));
        return false;
    }
    bool written = false;
    int failure = 0;
    {
        base::Stream stream = fdStream(fd, target);
        try {
            written = write(stream);
        } catch (...) {
            written = false;
        }
        failure = fdStreamError(stream);
    }
    if (written && ::fsync(fd) != 0) {
        written = false;
        failure = errno;
    }
    if (::close(fd) != 0 && written) {
        written = false;
        failure = errno;
    }
    if (written && ::rename(temporary.c_str(), target.c_str()) != 0) {
        written = false;
        failure = errno;
    }
    if (!written) {
        ::unlink(temporary.c_str());
        error = failure ? base::format("cannot write '{}': {}", target, std::strerror(failure))
                        : base::format("writing '{}' failed", target);
    }
    return written;
}

bool writeOutput(const base::string& output, const std::function<bool(base::Stream&)>& write,
                 base::string& error) {
    if (output != "-")
        return writeAtomically(output, write, error);
    base::Stream stream = fdStream(STDOUT_FILENO, "<stdout>");
    bool written = false;
    try {
        written = write(stream);
    } catch (...) {
    }
    if (!written) {
        const int failure = fdStreamError(stream);
        error = failure
                    ? base::format("cannot write to standard output: {}", std::strerror(failure))
                    : base::string("writing to standard output failed");
    }
    return written;
}

base::string outputProblem(const base::string& output) {
    struct stat info {};
    if (::stat(output.c_str(), &info) == 0 && S_ISDIR(info.st_mode))
        return base::format("cannot write '{}': it is a folder", output);
    std::filesystem::path folder = std::filesystem::path(output.c_str()).parent_path();
    if (folder.empty())
        folder = ".";
    if (::stat(folder.c_str(), &info) != 0)
        return base::format("cannot write '{}': the folder '{}' does not exist", output,
                            folder.string());
    if (!S_ISDIR(info.st_mode))
        return base::format("cannot write '{}': '{}' is not a folder", output, folder.string());
    return {};
}

bool sameFile(const base::string& a, const base::string& b) noexcept {
    struct stat x {
    }, y{};
    return ::stat(a.c_str(), &x) == 0 && ::stat(b.c_str(), &y) == 0 && x.st_dev == y.st_dev &&
           x.st_ino == y.st_ino;
}

} // namespace host
