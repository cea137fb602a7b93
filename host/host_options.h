// The host's command line: every switch in one list (the host's own, the
// importer options of the scene library, and those of the host's features),
// parsed once and checked before anything is read, so that a bad value is a
// usage error naming the switch and what it allows.
#pragma once

#include "b_cmdline.h"
#include "b_json.h"
#include "b_memory.h"

#include <cstdint>

namespace host {

struct HostSwitches {
    base::CmdLineValue<bool>* help = nullptr;
    base::CmdLineValue<base::string>* output = nullptr;
    base::CmdLineValue<base::string>* plugin = nullptr;
    base::CmdLineValue<bool>* summary = nullptr;
    base::CmdLineValue<bool>* validate = nullptr;
    base::CmdLineValue<int>* verbose = nullptr;
    base::CmdLineValue<bool>* quiet = nullptr;
    base::CmdLineValue<bool>* flipTextureCoordinates = nullptr;
    base::CmdLineValue<bool>* flipFaceWinding = nullptr;
    base::CmdLineValue<std::int64_t>* timeout = nullptr;
    base::CmdLineValue<bool>* noIsolation = nullptr;
    base::CmdLineValue<std::int64_t>* maxMemory = nullptr;
    base::CmdLineValue<base::string>* jsonLayout = nullptr;
};

// Adds the host's switches and the importer and scene options to 'options'.
HostSwitches registerHostSwitches(base::CmdLineOptions& options);

// Parses 'argv' into 'options' and checks every value against what its
// switch allows. False with a message for the user in 'error'.
bool parseCommandLine(base::CmdLineOptions& options, int argc, const char* const* argv,
                      base::vector<base::string>& positional, base::string& error);

// Whether a bool switch was given and not switched off ("--validate false").
bool isOn(const base::CmdLineValue<bool>* option) noexcept;

// The layout --json-layout asks for (checked by parseCommandLine).
base::JSONLayout jsonLayout(const HostSwitches& switches) noexcept;

} // namespace host
