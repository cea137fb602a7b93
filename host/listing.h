// `--list KIND`: one line per object of a kind, printed after the import (and
// after --time). Kinds are rows of one table; "nodes" prints each node's
// world position.
#pragma once

#include "b_math.h"
#include "b_memory.h"
#include "b_plugin_factory.h"

namespace base {
class CmdLineOptions;
template <class T>
class CmdLineValue;
} // namespace base

namespace host {

base::CmdLineValue<base::string>* registerListing(base::CmdLineOptions& options);

// The listing of 'kind', or false (and 'error' set) for an unknown kind.
bool listObjects(const base::PluginFactory& factory, const base::string& kind, base::string& out,
                 base::string& error);

// The world transform of every node reachable from the roots of the
// factory's scenes, by node, parents composed before children.
struct NodeWorld {
    const base::IPlugin* node;
    base::mat43 world;
};
base::vector<NodeWorld> nodeWorlds(const base::PluginFactory& factory);

} // namespace host
