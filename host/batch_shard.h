// Batch runs spread over many machines by an existing scheduler (a job
// array, an indexed job, parallel over ssh): each run converts one shard of
// the inputs, chosen by a hash of the input's name relative to the batch
// root, so a file's shard never depends on what else the folder holds. A
// rerun can leave the inputs whose documents are already up to date.
#pragma once

#include "b_memory.h"

#include <cstdint>
#include <functional>
#include <string_view>

namespace host {

// Shard 'index' of 'count' (1 <= index <= count); 1/1 is the whole batch.
struct Shard {
    std::uint32_t index = 1;
    std::uint32_t count = 1;
};

// "K/N" as given to --shard. False with a message in 'error'.
bool parseShard(std::string_view text, Shard& shard, base::string& error);

// The shard a scheduler's variables name. Slurm: SLURM_ARRAY_TASK_ID minus
// SLURM_ARRAY_TASK_MIN plus 1 of SLURM_ARRAY_TASK_COUNT (the array must have
// no step, whatever its first id); an indexed job: JOB_COMPLETION_INDEX plus
// 1 of 'count'. 'count' (0: not given) also overrides Slurm's count.
using Environment = std::function<const char*(const char*)>;
bool shardFromEnvironment(const Environment& env, std::uint32_t count, Shard& shard,
                          base::string& error);

// The shard (1..count) of an input named 'name' relative to the batch root.
std::uint32_t shardOf(std::string_view name, std::uint32_t count) noexcept;

// Whether 'output' exists and was modified after 'model'.
bool upToDate(const base::string& model, const base::string& output) noexcept;

} // namespace host
