// Models inside archives on the command line: "car.zip" imports the one model
// the archive holds, or lists the models to choose from.
#pragma once

#include "b_memory.h"
#include "b_name.h"
#include "b_plugin_factory.h"

namespace host {

// Whether the path reaches into an archive or a compressed file, which the
// host's checks of plain files cannot see.
bool insideArchive(const base::string& path);

// When 'model' names an archive, replaces it with the path of the one model
// inside that the importer of 'importerType' reads. False, with 'error' set,
// when it holds none or several (listed, one a line). Other paths stay.
bool chooseArchiveModel(const base::PluginFactory& factory, base::name_id importerType,
                        base::string& model, base::string& error);

} // namespace host
