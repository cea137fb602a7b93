// Animations: each source animation becomes a clip of keyframe channels, a
// layer whose one action plays it, and a rest clip ("_off") holding the values
// the animated node attributes had; those attributes become links to the
// layer's outputs, so playing the layer moves the nodes.
#include "as_importer.h"

#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"
#include "b_plugin_factory.h"
#include "scene_schema.h"

#include <assimp/anim.h>
#include <assimp/scene.h>

#include <algorithm>
#include <cfloat>
#include <cmath>
#include <cstring>
#include <limits>
#include <string_view>

namespace as {

namespace names = scene::names;
using base::TimeCode;

namespace {

constexpr std::uint32_t createFlags =
    base::PluginFactory::createNullIfUnknown | base::PluginFactory::createReportUnknown;

// assimp's own reading of an unspecified rate.
constexpr double defaultTicksPerSecond = 25.0;

std::string_view view(const aiString& s) {
    return {s.data, s.length};
}

// Source ticks to scene time, truncated toward zero. Out of range saturates
// toward its own side, so converted times keep the order of the source ones.
TimeCode sceneTime(double ticks, double ticksPerSecond) {
    const double t = ticks / ticksPerSecond * double(TimeCode::ticksPerSecond);
    if (t >= 9223372036854775808.0)
        return TimeCode(std::numeric_limits<std::int64_t>::max());
    if (!(t > -9223372036854775808.0))
        return TimeCode(std::numeric_limits<std::int64_t>::min());
    return TimeCode(std::int64_t(t));
}

template <class T>
base::ref<T> create(base::PluginFactory& factory, base::name_id type) {
    base::ref<base::IPlugin> made = factory.create(type, createFlags);
    return base::ref<T>(dynamic_cast<T*>(made.get()));
}

// The value a channel stores for a key, and whether two keys differ (every
// component compared as a float; NaN differs from everything).
base::vec3d valueOf(const aiVectorKey& k, base::vec3d*) {
    return {double(k.mValue.x), double(k.mValue.y), double(k.mValue.z)};
}
base::vec3f valueOf(const aiVectorKey& k, base::vec3f*) {
    return {float(k.mValue.x), float(k.mValue.y), float(k.mValue.z)};
}
base::quatf valueOf(const aiQuatKey& k, base::quatf*) {
    return {float(k.mValue.w), float(k.mValue.x), float(k.mValue.y), float(k.mValue.z)};
}
bool sameValue(const aiVectorKey& a, const aiVectorKey& b) {
    return float(a.mValue.x) == float(b.mValue.x) && float(a.mValue.y) == float(b.mValue.y) &&
           float(a.mValue.z) == float(b.mValue.z);
}
bool sameValue(const aiQuatKey& a, const aiQuatKey& b) {
    return float(a.mValue.w) == float(b.mValue.w) && float(a.mValue.x) == float(b.mValue.x) &&
           float(a.mValue.y) == float(b.mValue.y) && float(a.mValue.z) == float(b.mValue.z);
}

// Puts 'rest' as the single value of 'curve' when it holds a T.
template <class T>
bool storeRest(base::AttribMap& curve, const base::Attribute& rest) {
    if (rest.typeName() != base::TypeTraits<T>::n_name)
        return false;
    curve.vecAttribute<T>(names::values)->items().push_back(*static_cast<const T*>(rest.data()));
    return true;
}

// One created channel: what it drives.
struct Output {
    base::ref<scene::INode> node;
    base::name_id attribute;
};

// The value a node attribute had before the first animation of this import
// linked it; later animations of the same attribute reuse it.
struct RestValue {
    scene::INode* node;
    base::name_id attribute;
    base::Attribute* value; // owned clone, or null when it was of another type
};

class AnimationImport {
public:
    AnimationImport(base::PluginFactory& factory, const aiScene& source,
                    const base::map<base::string, base::ref<scene::INode>>& nodes)
        : m_factory(factory), m_source(source), m_nodes(nodes) {}
    ~AnimationImport() {
        for (RestValue& rest : m_rest)
            delete rest.value;
    }

    void run(base::IPlugin* sceneObject);

private:
    void convert(const aiAnimation& animation, std::uint32_t index);
    template <class Value, class Key>
    void convertKeys(const aiNodeAnim& channel, const Key* keys, unsigned count, const char* suffix,
                     base::name_id attribute, bool& reportedTimes);
    const base::Attribute* restValue(scene::INode& node, base::name_id attribute);

    base::PluginFactory& m_factory;
    const aiScene& m_source;
    const base::map<base::string, base::ref<scene::INode>>& m_nodes;
    base::vector<RestValue> m_rest;
    base::vector<base::ref<scene::IAnimLayer>> m_layers;
    double m_sceneStart = DBL_MAX, m_sceneEnd = -DBL_MAX; // seconds

    // The running animation.
    std::string_view m_animationName;
    double m_ticksPerSecond = defaultTicksPerSecond;
    double m_first = DBL_MAX, m_last = -DBL_MAX; // ticks
    base::ref<scene::IAnimClip> m_clip;
    base::vector<Output> m_outputs;
};

void AnimationImport::run(base::IPlugin* sceneObject) {
    for (std::uint32_t a = 0; a < m_source.mNumAnimations; ++a)
        if (const aiAnimation* animation = m_source.mAnimations[a])
            convert(*animation, a + 1);
    if (m_layers.empty())
        return;

    if (sceneObject) {
        if (m_sceneStart > m_sceneEnd)
            m_sceneStart = m_sceneEnd = 0;
        auto ticks = [](double seconds) {
            const double t = seconds * double(TimeCode::ticksPerSecond);
            return t >= 9223372036854775808.0 ? TimeCode(std::numeric_limits<std::int64_t>::max())
                   : t <= -9223372036854775808.0
                       ? TimeCode(std::numeric_limits<std::int64_t>::min())
                       : TimeCode(std::int64_t(t));
        };
        sceneObject->setAttribute(names::startTime, ticks(m_sceneStart));
        sceneObject->setAttribute(names::endTime, ticks(m_sceneEnd));
        if (auto* list = sceneObject->vecAttribute<base::ref<base::IPlugin>>(names::animLayers)) {
            list->items().clear();
            list->items().reserve(m_layers.size());
            for (const auto& layer : m_layers)
                list->items().emplace_back(layer.get());
        }
    }
    for (const auto& layer : m_layers) {
        if (sceneObject) {
            base::AttribPath path;
            path.addPlugin(sceneObject).addMember(names::time);
            layer->linkAttribute(names::time)->setPath(path);
        }
        // The outputs hold the values at the scene's time from the start, so
        // every link to them resolves in the written scene too.
        layer->evaluate();
    }
}

void AnimationImport::convert(const aiAnimation& animation, std::uint32_t index) {
    m_animationName = view(animation.mName);
    const base::string clipName =
        m_animationName.empty() ? base::format("animClip{}", index)
                                : base::string(m_animationName.data(), m_animationName.size());
    const base::string layerName =
        m_animationName.empty() ? base::format("animLayer{}", index) : clipName;
    const std::string_view logName(clipName.data(), clipName.size());

    m_ticksPerSecond = animation.mTicksPerSecond;
    if (!(m_ticksPerSecond > 0) || !std::isfinite(m_ticksPerSecond)) {
        base::logFormatted(base::logScene, base::logInfo,
                           "assimp import {}| No tick rate given; using 25 ticks per second.",
                           logName);
        m_ticksPerSecond = defaultTicksPerSecond;
    }
    if ((animation.mNumMeshChannels && animation.mMeshChannels) ||
        (animation.mNumMorphMeshChannels && animation.mMorphMeshChannels))
        base::logFormatted(base::logScene, base::logInfo,
                           "assimp import {}| Mesh and morph animation channels are not imported.",
                           logName);

    m_clip = create<scene::IAnimClip>(m_factory, names::animClip);
    if (!m_clip)
        return;
    m_clip->setAttribute(names::name, clipName);
    m_clip->vecAttribute<base::ref<base::IPlugin>>(names::keyframeChannels);
    m_first = DBL_MAX;
    m_last = -DBL_MAX;
    m_outputs.clear();

    for (unsigned c = 0; animation.mChannels && c < animation.mNumChannels; ++c) {
        const aiNodeAnim* channel = animation.mChannels[c];
        if (!channel)
            continue;
        const std::string_view nodeName = view(channel->mNodeName);
        if (m_nodes.find(base::string(nodeName.data(), nodeName.size())) == m_nodes.end()) {
            base::logFormatted(base::logScene, base::logError,
                               "assimp import {}| Unable to find node used by animation {}!",
                               nodeName, m_animationName);
            continue;
        }
        bool reportedTimes = false;
        convertKeys<base::vec3d>(*channel, channel->mPositionKeys, channel->mNumPositionKeys,
                                 "_Translate", names::translate, reportedTimes);
        convertKeys<base::quatf>(*channel, channel->mRotationKeys, channel->mNumRotationKeys,
                                 "_Rotate", names::rotate, reportedTimes);
        convertKeys<base::vec3f>(*channel, channel->mScalingKeys, channel->mNumScalingKeys,
                                 "_Scale", names::scale, reportedTimes);
    }

    // A clip none of whose channels found a node spans nothing.
    if (m_first > m_last)
        m_first = m_last = 0;
    m_clip->setAttribute(names::startTime, sceneTime(m_first, m_ticksPerSecond));
    m_clip->setAttribute(names::endTime, sceneTime(m_last, m_ticksPerSecond));
    if (!m_outputs.empty()) {
        m_sceneStart = std::min(m_sceneStart, m_first / m_ticksPerSecond);
        m_sceneEnd = std::max(m_sceneEnd, m_last / m_ticksPerSecond);
    }

    auto layer = create<scene::IAnimLayer>(m_factory, names::animLayer);
    if (!layer)
        return;
    layer->setAttribute(names::name, layerName);
    base::AttribMap* action =
        layer->arrayAttribute(names::actions, names::animLayerAction)->appendMap();
    action->setAttribute(names::animClip, base::ref<base::IPlugin>(m_clip.get()));
    action->setAttribute(names::playAt, TimeCode());
    layer->attribute(names::outputs, new base::AttribArray());

    base::vector<base::ref<base::IPlugin>> restChannels;
    for (std::uint32_t j = 0; j < m_outputs.size(); ++j) {
        scene::INode& node = *m_outputs[j].node;
        const base::name_id attribute = m_outputs[j].attribute;
        if (const base::Attribute* rest = restValue(node, attribute)) {
            auto channel = create<scene::IKeyframeChannel>(m_factory, names::keyframeChannel);
            if (channel) {
                channel->setAttribute(names::name,
                                      base::format("{}_{}_off", node.name(), attribute.view()));
                base::AttribMap* curve =
                    channel->arrayAttribute(names::curves, names::keyframeChannelCurve)
                        ->appendMap();
                storeRest<base::vec3d>(*curve, *rest) || storeRest<base::vec3f>(*curve, *rest) ||
                    storeRest<base::quatf>(*curve, *rest);
                restChannels.emplace_back(channel.get());
            }
        } else {
            base::logFormatted(base::logScene, base::logWarning,
                               "assimp import {}| Losing the value of {}.{}", logName, node.name(),
                               attribute.view());
        }
        base::AttribPath path;
        path.addPlugin(layer.get()).addMember(names::outputs).addItem(j);
        node.linkAttribute(attribute)->setPath(path);
    }

    if (!restChannels.empty())
        if (auto rest = create<scene::IAnimClip>(m_factory, names::animClip)) {
            rest->setAttribute(names::name, base::format("{}_off", clipName));
            rest->vecAttribute<base::ref<base::IPlugin>>(names::keyframeChannels)->items() =
                std::move(restChannels);
            rest->setAttribute(names::startTime, TimeCode());
            rest->setAttribute(names::endTime, TimeCode());
        }
    m_layers.push_back(layer);
    m_clip.reset();
}

const base::Attribute* AnimationImport::restValue(scene::INode& node, base::name_id attribute) {
    for (const RestValue& rest : m_rest)
        if (rest.node == &node && rest.attribute == attribute)
            return rest.value;
    // The node's own entry: after an earlier animation of this import it is
    // a link, and the value before it was kept above.
    const base::Attribute* own = node.findEntry(attribute);
    base::Attribute* kept = nullptr;
    if (own && (own->typeName() == base::TypeTraits<base::vec3d>::n_name ||
                own->typeName() == base::TypeTraits<base::vec3f>::n_name ||
                own->typeName() == base::TypeTraits<base::quatf>::n_name))
        kept = own->clone();
    m_rest.push_back({&node, attribute, kept});
    return kept;
}

template <class Value, class Key>
void AnimationImport::convertKeys(const aiNodeAnim& channel, const Key* keys, unsigned count,
                                  const char* suffix, base::name_id attribute,
                                  bool& reportedTimes) {
    if (!keys || count == 0)
        return;
    const std::string_view nodeName = view(channel.mNodeName);
    // Keys at times that are no numbers cannot be placed; the rest play in
    // time order whatever order the source lists them in.
    base::vector<const Key*> sorted;
    sorted.reserve(count);
    for (unsigned k = 0; k < count; ++k)
        if (std::isfinite(keys[k].mTime))
            sorted.push_back(&keys[k]);
    if (sorted.size() != count && !reportedTimes) {
        reportedTimes = true;
        base::logFormatted(base::logScene, base::logWarning,
                           "assimp import {}| Dropping keys with invalid times from the channel of "
                           "{}!",
                           m_animationName, nodeName);
    }
    if (sorted.empty())
        return;
    std::stable_sort(sorted.begin(), sorted.end(),
                     [](const Key* a, const Key* b) { return a->mTime < b->mTime; });

    m_first = std::min(m_first, sorted.front()->mTime);
    m_last = std::max(m_last, sorted.back()->mTime);

    auto channelObject = create<scene::IKeyframeChannel>(m_factory, names::keyframeChannel);
    if (!channelObject)
        return;
    channelObject->setAttribute(names::name,
                                base::format("{}{}", nodeName, std::string_view(suffix)));
    base::AttribMap* curve =
        channelObject->arrayAttribute(names::curves, names::keyframeChannelCurve)->appendMap();

    bool constant = true;
    for (std::size_t k = 1; k < sorted.size() && constant; ++k)
        constant = sameValue(*sorted[k], *sorted[0]);
    auto& values = curve->vecAttribute<Value>(names::values)->items();
    if (constant) {
        values.push_back(valueOf(*sorted[0], static_cast<Value*>(nullptr)));
    } else {
        values.resize(sorted.size());
        auto& times = curve->vecAttribute<TimeCode>(names::times)->items();
        times.resize(sorted.size());
        for (std::size_t k = 0; k < sorted.size(); ++k) {
            values[k] = valueOf(*sorted[k], static_cast<Value*>(nullptr));
            times[k] = sceneTime(sorted[k]->mTime, m_ticksPerSecond);
        }
    }

    m_clip->vecAttribute<base::ref<base::IPlugin>>(names::keyframeChannels)
        ->items()
        .emplace_back(channelObject.get());
    const auto found = m_nodes.find(base::string(nodeName.data(), nodeName.size()));
    m_outputs.push_back({found->second, attribute});
}

} // namespace

void AssimpImporter::importAnimations(const aiScene* scene, const NodeMap& nodesByName,
                                      base::IPlugin* sceneObject) {
    if (!scene || !scene->mAnimations || scene->mNumAnimations == 0 || !m_factory)
        return;
    AnimationImport(*m_factory, *scene, nodesByName).run(sceneObject);
}

} // namespace as
