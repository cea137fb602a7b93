// The host's built-in features, each run on an imported scene (see
// scene_import.h): write the scene document, validate the meshes, print the
// summary.
#pragma once

#include "b_json.h"
#include "scene_import.h"

namespace host {

// Writes the factory as JSON to the document path of --output: a file
// atomically, "-" to standard output. Exit 1 with the reason when it fails.
int writeDocument(ImportedScene& scene, const base::string& output,
                  base::JSONLayout layout = base::JSONLayout::keyed);

// Validates every mesh. A mesh fails when its validation logs an error;
// warnings are counted and shown once per kind with their count. Exit 3
// when a mesh failed.
int validateMeshes(ImportedScene& scene);

// Object counts per type, vertices, faces, joints and the import time.
int printSummary(ImportedScene& scene);

} // namespace host
