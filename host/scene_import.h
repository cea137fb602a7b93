// One import in the current process: loads the importer module, creates a
// factory with the scene types, an "AssimpImporter" with the options of the
// command line, imports the model, then hands the factory to the host's
// features in order (write the document, validate, summarise, list, ...).
// The host runs this in an isolated child (isolation.h) or, with
// --no-isolation, in its own process.
//
// A feature is one function: it receives the imported scene, does its work,
// prints to 'text' (standard error when the document goes to standard
// output) and answers an exit code (0, or the code the host should end with).
// Features add what a batch report shows to 'record'.
#pragma once

#include "b_cmdline.h"
#include "b_memory.h"
#include "b_plugin_factory.h"
#include "host_log.h"
#include "import_record.h"

#include <cstdio>
#include <functional>
#include <span>

namespace host {

struct ImportedScene {
    base::PluginFactory& factory;
    const base::string& model;
    const base::CmdLineOptions& options;
    HostLog& log;
    // Seconds the import itself took.
    double seconds;
    std::FILE* text;
    ImportRecord& record;
};

using SceneFeature = std::function<int(ImportedScene&)>;

struct ImportSettings {
    base::string model;
    // The document's path, "-" for standard output, empty for none. The
    // factory is named after its folder so that texture paths come out
    // relative to the document.
    base::string output;
    base::string modulePath;
    // Where a batch wants the scene's thumbnail PNG; empty for none.
    base::string thumbnail;
};

// Imports 'settings.model' and runs 'features' on the result; fills 'record'
// (status, reason, counts) and answers the exit code: 1 when the model or
// the module fails, 2 when an option does not fit its attribute, otherwise
// the first non-zero code of a feature.
int importScene(const ImportSettings& settings, const base::CmdLineOptions& options, HostLog& log,
                std::span<const SceneFeature> features, ImportRecord& record);

// Why 'path' cannot be a model, found before assimp runs (missing, a folder,
// not a regular file, unreadable, empty); empty when it can.
base::string modelProblem(const base::string& path);

} // namespace host
