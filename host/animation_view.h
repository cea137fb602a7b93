// What the host does with an imported scene's animation: the summary line,
// playing the scene at a time (--time) and sampling the motion of every
// animated node (--frames).
#pragma once

#include "b_memory.h"
#include "b_plugin_factory.h"
#include "listing.h"

#include <cstdint>

namespace base {
class CmdLineOptions;
template <class T>
class CmdLineValue;
} // namespace base

namespace host {

struct AnimationSwitches {
    base::CmdLineValue<double>* time = nullptr;
    base::CmdLineValue<int>* frames = nullptr;
};

AnimationSwitches registerAnimationSwitches(base::CmdLineOptions& options);

// "animation: C clips, L layers, K channels, S s to E s" (the time range of
// the newest scene), or "" when the factory holds no layer.
base::string animationSummary(const base::PluginFactory& factory);

// Sets the "time" of every scene of the factory and lets every layer
// evaluate, so the layers' outputs (and the node attributes linked to them)
// hold the values at that time.
void playAt(base::PluginFactory& factory, double seconds);

// 'count' evenly spaced samples over the newest scene's time range (its
// start alone for one sample) of the world transform of every node with an
// animated "translate", "rotate" or "scale", as one JSON document. The
// scenes are left at the last sample's time.
base::string sampleFrames(base::PluginFactory& factory, std::uint32_t count);

// The --list kinds asked for (when any) at each time of --time (a "time T"
// line before each when there are several), then the --frames document.
base::string animationReport(base::PluginFactory& factory, const AnimationSwitches& switches,
                             const base::vector<ListKind>& listed);

} // namespace host
