// The host loads the importer module through the scene library's loader,
// the same one a program embedding the importer uses.
#pragma once

#include "scene_module.h"

namespace host {

using ModuleLoader = scene::ModuleLoader;

} // namespace host
