#include "batch_shard.h"

#include "b_format.h"

#include <sys/stat.h>

#include <charconv>

namespace host {

namespace {

bool whole(std::string_view text, std::uint32_t& value) {
    const char* end = text.data() + text.size();
    const auto [stop, failure] = std::from_chars(text.data(), end, value);
    return !text.empty() && failure == std::errc() && stop == end;
}

bool checked(const Shard& shard, std::string_view source, base::string& error) {
    if (shard.count == 0 || shard.index == 0 || shard.index > shard.count) {
        error = base::format("{} names shard {}/{}; it needs 1 <= K <= N", source, shard.index,
                             shard.count);
        return false;
    }
    return true;
}

} // namespace

bool parseShard(std::string_view text, Shard& shard, base::string& error) {
    const std::size_t slash = text.find('/');
    if (slash == std::string_view::npos || !whole(text.substr(0, slash), shard.index) ||
        !whole(text.substr(slash + 1), shard.count)) {
        error = base::format("--shard wants K/N (shard K of N, 1 <= K <= N), not '{}'", text);
        return false;
    }
    return checked(shard, "--shard", error);
}

bool shardFromEnvironment(const Environment& env, std::uint32_t count, Shard& shard,
                          base::string& error) {
    auto number = [&](const char* name, std::uint32_t& value) {
        const char* text = env(name);
        if (text && whole(text, value))
            return true;
        error = text ? base::format("--shard-from-env: {} is '{}', not a whole number", name, text)
                     : base::format("--shard-from-env: {} is not set", name);
        return false;
    };
    if (env("SLURM_ARRAY_TASK_ID")) {
        std::uint32_t id = 0, first = 0, last = 0, tasks = 0;
        if (!number("SLURM_ARRAY_TASK_ID", id) || !number("SLURM_ARRAY_TASK_MIN", first) ||
            !number("SLURM_ARRAY_TASK_MAX", last) || !number("SLURM_ARRAY_TASK_COUNT", tasks))
            return false;
        // With a step ("--array=0-9:2") or a list the ids are not 0..N-1 plus
        // an offset, and some shards would never run.
        if (last < first || last - first + 1 != tasks) {
            error = base::format("--shard-from-env: the Slurm array {}-{} has {} tasks; it must "
                                 "be a range without a step",
                                 first, last, tasks);
            return false;
        }
        shard = {id >= first ? id - first + 1 : 0, count ? count : tasks};
        return checked(shard, "--shard-from-env", error);
    }
    if (env("JOB_COMPLETION_INDEX")) {
        std::uint32_t index = 0;
        if (!number("JOB_COMPLETION_INDEX", index))
            return false;
        if (count == 0) {
            error = "--shard-from-env with JOB_COMPLETION_INDEX needs --shard-count N";
            return false;
        }
        shard = {index + 1, count};
        return checked(shard, "--shard-from-env", error);
    }
    error = "--shard-from-env: neither SLURM_ARRAY_TASK_ID nor JOB_COMPLETION_INDEX is set";
    return false;
}

std::uint32_t shardOf(std::string_view name, std::uint32_t count) noexcept {
    // FNV-1a, 64 bits, then MurmurHash3's 64-bit finaliser: fixed by their
    // definitions, so every machine and every release agrees on a file's
    // shard. The finaliser spreads names that differ in their last bytes
    // ("model1.obj", "model2.obj") evenly over any count.
    std::uint64_t hash = 0xcbf29ce484222325ull;
    for (unsigned char c : name) {
        hash ^= c;
        hash *= 0x100000001b3ull;
    }
    hash ^= hash >> 33;
    hash *= 0xff51afd7ed558ccdull;
    hash ^= hash >> 33;
    hash *= 0xc4ceb9fe1a85ec53ull;
    hash ^= hash >> 33;
    return count ? std::uint32_t(hash % count) + 1 : 1;
}

bool upToDate(const base::string& model, const base::string& output) noexcept {
    struct stat in {
    }, out{};
    if (::stat(model.c_str(), &in) != 0 || ::stat(output.c_str(), &out) != 0)
        return false;
    return out.st_mtim.tv_sec > in.st_mtim.tv_sec ||
           (out.st_mtim.tv_sec == in.st_mtim.tv_sec && out.st_mtim.tv_nsec > in.st_mtim.tv_nsec);
}

} // namespace host
