// How a batch names its outputs and finds its models, in-process.
#include "archive_maker.h"
#include "batch.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;

struct NamingCase {
    const char* name;
    std::vector<std::string> names;
    std::vector<std::string> outputs;
    std::size_t notes;
};

// Every input keeps a document of its own, also when a renamed collision
// lands on the name another input asks for.
TEST(BatchOutputs, DistinctNamesForCollisions) {
    const NamingCase cases[] = {
        {"distinct",
         {"a.ply", "sub/a.ply", "a.obj"},
         {"o/a.ply.json", "o/sub/a.ply.json", "o/a.obj.json"},
         0},
        {"three alike",
         {"a.ply", "a.ply", "a.ply"},
         {"o/a.ply.json", "o/a.ply-2.json", "o/a.ply-3.json"},
         2},
        {"renamed onto a taken name",
         {"a.ply-2", "a.ply", "a.ply"},
         {"o/a.ply-2.json", "o/a.ply.json", "o/a.ply-3.json"},
         1},
    };
    for (const NamingCase& c : cases) {
        SCOPED_TRACE(c.name);
        base::vector<host::BatchInput> inputs;
        for (const std::string& name : c.names)
            inputs.push_back({base::string("/in/") + name.c_str(), name.c_str(), {}});
        const base::vector<base::string> notes = host::assignOutputs(inputs, "o/");
        EXPECT_EQ(notes.size(), c.notes);
        for (std::size_t i = 0; i < inputs.size(); ++i)
            EXPECT_EQ(inputs[i].output, c.outputs[i].c_str());
    }
}

// Models by extension (a compressed one by its content's), in order; the
// output folder inside the input folder is not entered.
TEST(BatchOutputs, ModelsBelowAFolder) {
    const fs::path dir = fs::temp_directory_path() / ("batch_tests_" + std::to_string(::getpid()));
    fs::remove_all(dir);
    for (const char* file :
         {"b/z.ply", "b/a.OBJ", "top.ply.gz", "notes.txt", "out/old.ply", "c.gz"}) {
        fs::create_directories((dir / file).parent_path());
        std::ofstream(dir / file) << "x";
    }
    // An archive is a folder of its own; one that cannot be read stays an
    // input, so its failure is reported.
    archive_maker::writeZip((dir / "pack.zip").string(),
                            {{"m/one.obj", archive_maker::textBytes("v 0 0 0\n")},
                             {"two.ply", archive_maker::textBytes("ply\n")},
                             {"m/tex.png", archive_maker::textBytes("png")}});
    std::ofstream(dir / "bad.zip") << "not a zip";
    base::vector<host::BatchInput> inputs;
    base::string error;
    ASSERT_TRUE(host::collectModels(dir.string().c_str(), "ply;obj", (dir / "out").string().c_str(),
                                    inputs, error))
        << error;
    std::vector<std::string> names;
    for (const host::BatchInput& input : inputs)
        names.emplace_back(input.name);
    EXPECT_EQ(names,
              (std::vector<std::string>{"b/a.OBJ", "b/z.ply", "bad.zip", "pack.zip/m/one.obj",
                                        "pack.zip/two.ply", "top.ply.gz"}));
    EXPECT_EQ(inputs[3].model, (dir / "pack.zip/m/one.obj").string().c_str());
    EXPECT_FALSE(host::collectModels((dir / "missing").string().c_str(), "ply", {}, inputs, error));
    EXPECT_NE(error.find("missing"), base::string::npos);
    fs::remove_all(dir);
}

} // namespace
