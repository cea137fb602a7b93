// Command-line options of the scene library: the importer settings
// ("-importNormals", ...) and the scene's "-upAxis", and the step that turns
// parsed options into attributes of an object.
//
// Enumerations take a text or a number:
//   -importNormals, -importTangents   none|off 0, file|import 1, compute|generate 2
//   -importMultiIndex                 off 0, on 1, auto 2
//   -computeNormalsMethod,
//   -computeTangentsMethod            default 0; other methods by number
//   -upAxis                           x 0, y 1, z 2
// Switches of bool options take true/false/1/0/on/off.
#pragma once

#include "b_attrib_map.h"
#include "b_cmdline.h"
#include "b_name.h"

namespace scene {

// Adds one option per importer setting, in table order: "-" and the setting's
// name, no alternative name, the help text, exactly one value. Options already
// in the list are left as they are.
void register_importer_options(base::CmdLineOptions& options);
// Adds "-upAxis" ("Set the up axis.", one string value).
void register_scene_options(base::CmdLineOptions& options);

// Sets every attribute of the schema struct 'schemaType' (and its bases) whose
// option "-<attribute>" was given, converted to the attribute's schema type:
// "-importNormals 0" on an importer object sets importNormals (uint8) to 0,
// replacing an entry of another type. All values are converted first; when one
// does not fit its attribute the object is left unchanged and the answer is
// false with a message in 'error'. Options of attributes without a schema type
// are ignored. 'schemaType' may be any core or option struct
// (sceneImporter_schema::type(), scene_schema::type(), ...).
bool apply_command_line(const base::CmdLineOptions& options, base::AttribMap& object,
                        base::name_id schemaType, base::string& error);

} // namespace scene
