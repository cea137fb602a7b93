#include "scene_features.h"

#include "animation_view.h"
#include "b_format.h"
#include "b_json.h"
#include "output_file.h"
#include "scene_interfaces.h"
#include "scene_stats.h"

#include <algorithm>
#include <cctype>
#include <mutex>

namespace host {

namespace {

// Collects the findings of one mesh's validation: whether an error was
// logged, and the warnings by kind.
class FindingsLog final : public base::ILog {
public:
    FindingsLog() { setMaxLevel(base::logWarning); }

    void log(base::name_id, int level, std::string_view message) override {
        std::lock_guard lock(m_mutex);
        if (level <= base::logError)
            m_failed = true;
        // The kind is the text without the mesh's name, numbers folded, so
        // that one finding at a thousand positions is one kind.
        base::string kind(level <= base::logError ? "error: " : "warning: ");
        bool inNumber = false;
        for (char c : withoutTag(message)) {
            const bool digit = std::isdigit(static_cast<unsigned char>(c)) != 0;
            if (!digit)
                kind += c;
            else if (!inNumber)
                kind += 'N';
            inNumber = digit;
        }
        auto found = std::find_if(m_kinds.begin(), m_kinds.end(),
                                  [&](const auto& k) { return k.first == kind; });
        if (found == m_kinds.end())
            m_kinds.emplace_back(std::move(kind), 1);
        else
            ++found->second;
    }

    bool takeFailed() {
        std::lock_guard lock(m_mutex);
        return std::exchange(m_failed, false);
    }
    const base::vector<std::pair<base::string, std::uint64_t>>& kinds() const { return m_kinds; }

private:
    std::mutex m_mutex;
    bool m_failed = false;
    base::vector<std::pair<base::string, std::uint64_t>> m_kinds;
};

} // namespace

int writeDocument(ImportedScene& scene, const base::string& output, base::JSONLayout layout) {
    base::string error;
    if (writeOutput(
            output,
            [&](base::Stream& stream) {
                return base::writeFactory(scene.factory, stream, 120, nullptr, layout);
            },
            error)) {
        if (output != "-")
            scene.record.output = output;
        return 0;
    }
    std::fprintf(stderr, "scene-import: %s\n", error.c_str());
    scene.record.reason = error;
    scene.record.status = "failed";
    return 1;
}

int validateMeshes(ImportedScene& scene) {
    FindingsLog findings;
    std::uint32_t checked = 0, failed = 0;
    {
        base::ScopedLog scoped(findings);
        for (std::uint32_t id = 0; id < scene.factory.pluginCount(); ++id) {
            base::ref<base::IPlugin> plugin = scene.factory.plugin(id);
            const auto* mesh = dynamic_cast<const scene::IMesh*>(plugin.get());
            if (!mesh)
                continue;
            ++checked;
            // A count mismatch fails as well as any logged error.
            const bool counted = mesh->validate();
            if (findings.takeFailed() || !counted)
                ++failed;
        }
    }
    std::FILE* to = scene.text;
    for (const auto& [kind, count] : findings.kinds())
        std::fprintf(to, "validate: %s (%llu %s)\n", kind.c_str(),
                     static_cast<unsigned long long>(count), count == 1 ? "time" : "times");
    std::fprintf(to, "validate: %u meshes checked, %u failed\n", checked, failed);
    if (!failed)
        return 0;
    scene.record.status = "invalid";
    scene.record.reason = base::format("{} of {} meshes failed validation", failed, checked);
    return 3;
}

int printSummary(ImportedScene& scene) {
    const base::string text =
        formatSummary(collectStats(scene.factory), scene.seconds) + animationSummary(scene.factory);
    std::fwrite(text.data(), 1, text.size(), scene.text);
    return 0;
}

} // namespace host
