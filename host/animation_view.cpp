#include "animation_view.h"

#include "listing.h"

#include "b_cmdline.h"
#include "b_format.h"
#include "b_plugin_attribute.h"
#include "b_timecode.h"
#include "scene_getter.h"
#include "scene_interfaces.h"

#include <algorithm>
#include <cmath>
#include <cstdio>

namespace host {

namespace names = scene::names;
using base::TimeCode;

AnimationSwitches registerAnimationSwitches(base::CmdLineOptions& options) {
    AnimationSwitches s;
    s.time = options.addValue<double>(
        "--time", {},
        "Play the scene's animation at this time in seconds before writing it; with several "
        "times, --list prints at each of them.",
        1, 1000);
    s.frames = options.addValue<int>(
        "--frames", {},
        "Print this many evenly spaced samples of every animated node's world transform over "
        "the scene's time range, as one JSON document.");
    return s;
}

namespace {

base::vector<base::ref<base::IPlugin>> objectsOf(const base::PluginFactory& factory,
                                                 base::name_id type) {
    base::vector<base::ref<base::IPlugin>> found;
    for (std::uint32_t id = 0; id < factory.pluginCount(); ++id)
        if (base::ref<base::IPlugin> object = factory.plugin(id);
            object && object->className() == type)
            found.push_back(object);
    return found;
}

// The newest scene's time range in seconds; false without one.
bool timeRange(const base::PluginFactory& factory, double& start, double& end) {
    const auto scenes = objectsOf(factory, names::scene);
    if (scenes.empty())
        return false;
    const base::IPlugin& scene = *scenes.back();
    start = scene::get(scene, names::startTime, TimeCode()).seconds();
    end = scene::get(scene, names::endTime, TimeCode()).seconds();
    return true;
}

bool animated(const base::IPlugin& node) {
    for (base::name_id attribute : {names::translate, names::rotate, names::scale})
        if (const base::Attribute* entry = node.findEntry(attribute))
            if (const_cast<base::Attribute*>(entry)->asLink())
                return true;
    return false;
}

void appendNumber(base::string& out, double value) {
    char text[32];
    // JSON has no NaN or infinities.
    std::snprintf(text, sizeof text, "%.9g", std::isfinite(value) ? value : 0.0);
    out += text;
}

void appendString(base::string& out, const base::string& text) {
    out += '"';
    for (char c : text) {
        if (c == '"' || c == '\\') {
            out += '\\';
            out += c;
        } else if (static_cast<unsigned char>(c) < 0x20) {
            char escaped[8];
            std::snprintf(escaped, sizeof escaped, "\\u%04x", unsigned(c));
            out += escaped;
        } else {
            out += c;
        }
    }
    out += '"';
}

} // namespace

base::string animationSummary(const base::PluginFactory& factory) {
    const std::size_t layers = objectsOf(factory, names::animLayer).size();
    if (layers == 0)
        return {};
    double start = 0, end = 0;
    timeRange(factory, start, end);
    char range[64];
    std::snprintf(range, sizeof range, "%g s to %g s\n", start, end);
    return base::format("animation: {} clips, {} layers, {} channels, ",
                        objectsOf(factory, names::animClip).size(), layers,
                        objectsOf(factory, names::keyframeChannel).size()) +
           range;
}

void playAt(base::PluginFactory& factory, double seconds) {
    const TimeCode time = TimeCode::fromSeconds(seconds);
    for (const auto& scene : objectsOf(factory, names::scene))
        scene->setAttribute(names::time, time);
    for (const auto& object : objectsOf(factory, names::animLayer))
        if (auto* layer = dynamic_cast<scene::IAnimLayer*>(object.get()))
            layer->evaluate();
}

base::string sampleFrames(base::PluginFactory& factory, std::uint32_t count) {
    double start = 0, end = 0;
    timeRange(factory, start, end);
    base::string out = "{\"start\": ";
    appendNumber(out, start);
    out += ", \"end\": ";
    appendNumber(out, end);
    out += ", \"frames\": [";
    for (std::uint32_t f = 0; f < count; ++f) {
        const double time = count > 1 ? start + (end - start) * f / (count - 1) : start;
        playAt(factory, time);
        out += f ? ",\n  {\"time\": " : "\n  {\"time\": ";
        appendNumber(out, time);
        out += ", \"nodes\": {";
        bool first = true;
        for (const NodeWorld& n : nodeWorlds(factory)) {
            if (!animated(*n.node))
                continue;
            out += first ? "\n    " : ",\n    ";
            first = false;
            appendString(out, n.node->name(true));
            // Row-major 3x3 part, then the translation.
            out += ": [";
            for (int r = 0; r < 3; ++r)
                for (int c = 0; c < 3; ++c) {
                    appendNumber(out, n.world.m.m[r][c]);
                    out += ", ";
                }
            appendNumber(out, n.world.t.x);
            out += ", ";
            appendNumber(out, n.world.t.y);
            out += ", ";
            appendNumber(out, n.world.t.z);
            out += "]";
        }
        out += "}}";
    }
    out += "]}\n";
    return out;
}

base::string animationReport(base::PluginFactory& factory, const AnimationSwitches& switches,
                             const base::vector<ListKind>& listed) {
    base::string out;
    if (!listed.empty()) {
        const auto& times = switches.time->values();
        if (times.size() <= 1) {
            out = formatListing(factory, listed);
        } else {
            for (double time : times) {
                playAt(factory, time);
                char line[64];
                std::snprintf(line, sizeof line, "time %.17g\n", time);
                out += line;
                out += formatListing(factory, listed);
            }
        }
    }
    if (switches.frames->isSet())
        out += sampleFrames(factory, std::uint32_t(std::max(switches.frames->value(), 1)));
    return out;
}

} // namespace host
