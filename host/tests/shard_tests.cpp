// Shards of a batch, resumed runs and merged reports, in-process; the bad
// shard switches through the host itself.
#include "batch_report.h"
#include "batch_shard.h"
#include "report_merge.h"

#include "child_run.h"
#include <fcntl.h>

#include <gtest/gtest.h>
#include <rapidjson/document.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <map>
#include <set>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;

std::vector<std::string> names(std::size_t count, const char* prefix = "dir/model") {
    std::vector<std::string> out;
    for (std::size_t i = 0; i < count; ++i)
        out.push_back(prefix + std::to_string(i) + (i % 3 ? ".obj" : ".ply"));
    return out;
}

// Each name in one shard of 1..N; no shard left empty by a weak hash; a new
// file moves no other; the value is fixed (FNV-1a, then MurmurHash3's
// finaliser), so machines agree.
TEST(BatchShards, PartitionIsCompleteDisjointAndStable) {
    const std::vector<std::string> all = names(400);
    for (std::uint32_t n = 1; n <= 16; ++n) {
        SCOPED_TRACE(n);
        std::vector<std::set<std::string>> shards(n + 1);
        for (const std::string& name : all) {
            const std::uint32_t k = host::shardOf(name, n);
            ASSERT_GE(k, 1u);
            ASSERT_LE(k, n);
            shards[k].insert(name);
        }
        std::set<std::string> joined;
        std::size_t total = 0;
        for (std::uint32_t k = 1; k <= n; ++k) {
            EXPECT_GT(shards[k].size(), all.size() / n / 3) << "shard " << k;
            total += shards[k].size();
            joined.insert(shards[k].begin(), shards[k].end());
        }
        EXPECT_EQ(total, all.size());
        EXPECT_EQ(joined.size(), all.size());
        // The same files listed with more beside them keep their shards.
        for (const std::string& name : names(50, "new/extra"))
            shards[host::shardOf(name, n)].insert(name);
        for (const std::string& name : all)
            EXPECT_TRUE(shards[host::shardOf(name, n)].contains(name));
    }
    EXPECT_EQ(host::shardOf("a", 7), std::uint32_t(0x82a2a958a9bece5bull % 7 + 1));
}

TEST(BatchShards, ParsesKOfN) {
    const std::pair<const char*, bool> cases[] = {
        {"1/4", true},  {"4/4", true},   {"1/1", true},   {"0/4", false},  {"5/4", false},
        {"1/0", false}, {"0/0", false},  {"a/b", false},  {"1", false},    {"1/", false},
        {"/4", false},  {"1/4x", false}, {"-1/4", false}, {" 1/4", false}, {"", false},
    };
    for (const auto& [text, valid] : cases) {
        host::Shard shard;
        base::string error;
        EXPECT_EQ(host::parseShard(text, shard, error), valid) << text;
        EXPECT_EQ(error.empty(), valid) << text << ": " << error;
    }
    host::Shard shard;
    base::string error;
    ASSERT_TRUE(host::parseShard("3/16", shard, error));
    EXPECT_EQ(shard.index, 3u);
    EXPECT_EQ(shard.count, 16u);
}

struct EnvCase {
    const char* name;
    std::map<std::string, std::string> env;
    std::uint32_t count;
    bool valid;
    std::uint32_t index, shards;
};

TEST(BatchShards, FromSchedulerVariables) {
    auto slurm = [](const char* id, const char* first, const char* last, const char* count) {
        return std::map<std::string, std::string>{{"SLURM_ARRAY_TASK_ID", id},
                                                  {"SLURM_ARRAY_TASK_MIN", first},
                                                  {"SLURM_ARRAY_TASK_MAX", last},
                                                  {"SLURM_ARRAY_TASK_COUNT", count}};
    };
    const EnvCase cases[] = {
        {"slurm from 0", slurm("0", "0", "3", "4"), 0, true, 1, 4},
        {"slurm from 0, last", slurm("3", "0", "3", "4"), 0, true, 4, 4},
        {"slurm from 1", slurm("1", "1", "4", "4"), 0, true, 1, 4},
        {"slurm from 1, last", slurm("4", "1", "4", "4"), 0, true, 4, 4},
        {"slurm with a step", slurm("2", "0", "6", "4"), 0, false, 0, 0},
        {"slurm count given", slurm("2", "1", "4", "4"), 8, true, 2, 8},
        {"slurm without its range", {{"SLURM_ARRAY_TASK_ID", "1"}}, 0, false, 0, 0},
        {"slurm id not a number", slurm("x", "0", "3", "4"), 0, false, 0, 0},
        {"indexed job", {{"JOB_COMPLETION_INDEX", "0"}}, 4, true, 1, 4},
        {"indexed job, last", {{"JOB_COMPLETION_INDEX", "3"}}, 4, true, 4, 4},
        {"indexed job beyond its count", {{"JOB_COMPLETION_INDEX", "4"}}, 4, false, 0, 0},
        {"indexed job without a count", {{"JOB_COMPLETION_INDEX", "0"}}, 0, false, 0, 0},
        {"no scheduler", {}, 4, false, 0, 0},
    };
    for (const EnvCase& c : cases) {
        SCOPED_TRACE(c.name);
        host::Shard shard;
        base::string error;
        const bool valid = host::shardFromEnvironment(
            [&](const char* name) {
                const auto it = c.env.find(name);
                return it == c.env.end() ? nullptr : it->second.c_str();
            },
            c.count, shard, error);
        ASSERT_EQ(valid, c.valid) << error;
        if (valid) {
            EXPECT_EQ(shard.index, c.index);
            EXPECT_EQ(shard.count, c.shards);
        } else {
            EXPECT_FALSE(error.empty());
        }
    }
}

class BatchFiles : public ::testing::Test {
protected:
    void SetUp() override {
        m_dir = fs::temp_directory_path() /
                ("shard_tests_" + std::to_string(::getpid()) + "_" +
                 ::testing::UnitTest::GetInstance()->current_test_info()->name());
        fs::remove_all(m_dir);
        fs::create_directories(m_dir);
    }
    void TearDown() override { fs::remove_all(m_dir); }

    base::string path(const char* name) const { return (m_dir / name).string().c_str(); }
    void write(const char* name, const std::string& text) const {
        std::ofstream(m_dir / name, std::ios::binary) << text;
    }
    void touch(const char* name, long seconds, long nanoseconds = 0) const {
        const timespec times[2] = {{seconds, nanoseconds}, {seconds, nanoseconds}};
        ASSERT_EQ(::utimensat(AT_FDCWD, path(name).c_str(), times, 0), 0);
    }

    fs::path m_dir;
};

TEST_F(BatchFiles, SkipsOnlyDocumentsNewerThanTheirModel) {
    write("m.ply", "x");
    EXPECT_FALSE(host::upToDate(path("m.ply"), path("m.ply.json"))) << "no document yet";
    write("m.ply.json", "{}");
    const struct {
        long model, modelNs, document, documentNs;
        bool skip;
    } cases[] = {
        {1000, 0, 2000, 0, true}, {2000, 0, 1000, 0, false}, {1000, 0, 1000, 0, false},
        {1000, 5, 1000, 6, true}, {1000, 6, 1000, 5, false},
    };
    for (const auto& c : cases) {
        touch("m.ply", c.model, c.modelNs);
        touch("m.ply.json", c.document, c.documentNs);
        EXPECT_EQ(host::upToDate(path("m.ply"), path("m.ply.json")), c.skip)
            << c.model << "." << c.modelNs << " vs " << c.document << "." << c.documentNs;
    }
}

host::ImportRecord record(const std::string& file, const char* status) {
    host::ImportRecord r;
    r.model = file.c_str();
    r.status = status;
    r.vertices = file.size();
    if (std::string(status) == "failed")
        r.reason = "cannot import";
    return r;
}

rapidjson::Document parse(const base::string& text) {
    rapidjson::Document doc;
    doc.Parse(text.data(), text.size());
    EXPECT_TRUE(doc.IsObject());
    return doc;
}

// file -> the record as text, so equality ignores order only.
std::map<std::string, std::string> recordsOf(const rapidjson::Document& doc) {
    std::map<std::string, std::string> out;
    for (const auto& r : doc["records"].GetArray()) {
        std::string fields;
        for (const auto& m : r.GetObject())
            if (m.value.IsString())
                fields += std::string(m.name.GetString()) + "=" + m.value.GetString() + ";";
            else if (m.value.IsUint64())
                fields += std::string(m.name.GetString()) + "=" +
                          std::to_string(m.value.GetUint64()) + ";";
        out[r["file"].GetString()] = fields;
    }
    return out;
}

TEST(MergedReports, EqualTheSingleRunAndNameWhatIsWrong) {
    std::vector<host::ImportRecord> all;
    const char* statuses[] = {"imported", "failed", "skipped", "crashed", "imported"};
    for (std::size_t i = 0; i < 40; ++i)
        all.push_back(record("in/m" + std::to_string(i) + ".obj", statuses[i % 5]));
    const base::string single = host::reportJson(all, 3.0);
    const std::uint32_t n = 4;
    std::vector<host::ReportText> shards;
    for (std::uint32_t k = 1; k <= n; ++k) {
        std::vector<host::ImportRecord> part;
        for (const host::ImportRecord& r : all)
            if (host::shardOf(r.model, n) == k)
                part.push_back(r);
        shards.push_back(
            {base::string("r") + std::to_string(k).c_str(), host::reportJson(part, 1.0, {k, n})});
    }
    host::MergedReport merged;
    base::string error;
    ASSERT_TRUE(host::mergeReports(shards, merged, error)) << error;
    EXPECT_TRUE(merged.problems.empty());
    const rapidjson::Document one = parse(single), joined = parse(merged.json);
    EXPECT_EQ(recordsOf(one), recordsOf(joined));
    for (const char* total : {"files", "imported", "skipped", "failed"})
        EXPECT_EQ(one[total].GetUint64(), joined[total].GetUint64()) << total;
    EXPECT_EQ(joined["files"].GetUint64(), 40u);
    EXPECT_EQ(joined["skipped"].GetUint64(), 8u);
    EXPECT_DOUBLE_EQ(joined["seconds"].GetDouble(), 4.0);

    // A shard missing, another given twice: both named, records kept once.
    std::vector<host::ReportText> broken = {shards[0], shards[1], shards[1]};
    host::MergedReport partial;
    ASSERT_TRUE(host::mergeReports(broken, partial, error)) << error;
    const rapidjson::Document doc = parse(partial.json);
    std::vector<unsigned> missing;
    for (const auto& k : doc["missingShards"].GetArray())
        missing.push_back(k.GetUint());
    EXPECT_EQ(missing, (std::vector<unsigned>{3, 4}));
    EXPECT_EQ(doc["problems"].Size(), partial.problems.size());
    std::size_t twice = 0, duplicates = 0;
    for (const base::string& p : partial.problems) {
        twice += p.find("given twice") != base::string::npos;
        duplicates += p.find("more than one report") != base::string::npos;
    }
    EXPECT_EQ(twice, 1u);
    EXPECT_EQ(duplicates, parse(shards[1].text)["records"].Size());
    EXPECT_EQ(doc["records"].Size(),
              parse(shards[0].text)["records"].Size() + parse(shards[1].text)["records"].Size());

    // Reports of different splits, and a document that is no report.
    host::MergedReport refused;
    const std::vector<host::ReportText> mixed = {shards[0],
                                                 {"other", host::reportJson(all, 1, {1, 2})}};
    EXPECT_FALSE(host::mergeReports(mixed, refused, error));
    EXPECT_NE(error.find("splits the batch into 4"), base::string::npos) << error;
    const std::vector<host::ReportText> junk = {{"junk", "[1,2"}};
    EXPECT_FALSE(host::mergeReports(junk, refused, error));
    EXPECT_NE(error.find("'junk' is not a batch report"), base::string::npos) << error;
}

int hostExit(const std::string& args, std::string& err) {
    // Standard error through the pipe, standard output dropped.
    const hosttest::CommandRun run =
        hosttest::runCommand("'" SCENE_IMPORT_EXE "' " + args + " 2>&1 >/dev/null");
    err = run.out;
    return run.code;
}

TEST_F(BatchFiles, BadShardSwitchesAreUsageErrors) {
    const std::string folder = "--batch '" + m_dir.string() + "' ";
    const std::pair<std::string, const char*> cases[] = {
        {"--shard 0/4", "shard 0/4"},
        {"--shard 5/4", "shard 5/4"},
        {"--shard 1/0", "shard 1/0"},
        {"--shard two/four", "not 'two/four'"},
        {"--shard 1/4 --shard-from-env", "exclude each other"},
        {"--shard-count 4", "goes with --shard-from-env"},
        {"--skip-existing", "needs -o"},
    };
    for (const auto& [args, message] : cases) {
        std::string err;
        EXPECT_EQ(hostExit(folder + args, err), 2) << args << ": " << err;
        EXPECT_NE(err.find(message), std::string::npos) << args << ": " << err;
    }
    std::string err;
    EXPECT_EQ(hostExit("--shard-from-env --shard-count 4 " + folder, err), 2) << err;
    EXPECT_NE(err.find("neither"), std::string::npos) << err;
    // One model: a shard of it means nothing, and is not silently ignored.
    EXPECT_EQ(hostExit("--shard 1/2 '" SCENE_SAMPLES_DIR "/sample.gltf'", err), 2) << err;
    EXPECT_NE(err.find("--shard needs a batch"), std::string::npos) << err;
}

} // namespace
