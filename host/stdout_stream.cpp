#include "stdout_stream.h"

#include <unistd.h>

#include <cerrno>

namespace host {

namespace {

class StdoutWorker final : public base::StreamWorker {
public:
    StdoutWorker() : StreamWorker("<stdout>", base::capWrite) {}

    std::uint64_t read(void*, std::uint64_t) override { return 0; }
    // Loops over short writes; a closed pipe ends the count early, which the
    // writer reports as a failed document.
    std::uint64_t write(const void* buffer, std::uint64_t bytes) override {
        const char* cursor = static_cast<const char*>(buffer);
        std::uint64_t done = 0;
        while (done < bytes) {
            const ssize_t n = ::write(STDOUT_FILENO, cursor + done, bytes - done);
            if (n < 0 && errno == EINTR)
                continue;
            if (n <= 0)
                break;
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

private:
    std::uint64_t m_position = 0;
};

} // namespace

base::Stream stdoutStream() {
    return base::Stream(base::ref<base::StreamWorker>(new StdoutWorker));
}

} // namespace host
