// Keyframe evaluation and layer playback.
//
// One algorithm serves all eleven value types: a value is loaded as N
// components of its computation scalar (float for int and the float types,
// double for the double types), interpolated component-wise (quaternions by
// slerp in linear segments) and stored back.
#include "scene_animation_math.h"
#include "scene_getter.h"
#include "scene_interfaces.h"

#include "b_exception.h"
#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstring>
#include <limits>
#include <memory>
#include <string>

namespace scene {

namespace {

using ::base::TimeCode;
using namespace anim;

// The curve's entries, found in one pass over the map (a per-name lookup
// would cost a binary search each, on the hottest path of playback).
struct CurveEntries {
    const ::base::Attribute* times = nullptr;
    const ::base::Attribute* values = nullptr;
    const ::base::Attribute* interpolation = nullptr;
    const ::base::Attribute* pre = nullptr;
    const ::base::Attribute* post = nullptr;
    const ::base::Attribute* tangents = nullptr;
    const ::base::Attribute* weights = nullptr;
    const ::base::Attribute* tension = nullptr;
    const ::base::Attribute* tightness = nullptr;
};

const ::base::Attribute* followed(const ::base::Attribute* a) {
    if (a)
        if (::base::AttribLink* link = const_cast<::base::Attribute*>(a)->asLink())
            return link->resolve();
    return a;
}

CurveEntries curveEntries(const ::base::AttribMap& curve) {
    CurveEntries e;
    if (curve.base()) {
        // Inherited entries: the map's own lookup knows the rules.
        auto find = [&](::base::name_id n) { return followed(curve.findInherited(n)); };
        e = {find(names::times),
             find(names::values),
             find(names::interpolation),
             find(names::preExtrapolation),
             find(names::postExtrapolation),
             find(names::tangents),
             find(names::weights),
             find(names::tension),
             find(names::tightness)};
        return e;
    }
    for (const auto& [n, a] : curve.entries()) {
        const ::base::Attribute* v = followed(a);
        if (n == names::times)
            e.times = v;
        else if (n == names::values)
            e.values = v;
        else if (n == names::interpolation)
            e.interpolation = v;
        else if (n == names::preExtrapolation)
            e.pre = v;
        else if (n == names::postExtrapolation)
            e.post = v;
        else if (n == names::tangents)
            e.tangents = v;
        else if (n == names::weights)
            e.weights = v;
        else if (n == names::tension)
            e.tension = v;
        else if (n == names::tightness)
            e.tightness = v;
    }
    return e;
}

template <class T>
const ::base::ArrayOf<T>* arrayOf(const ::base::Attribute* a) {
    if (!a || a->typeName() != ::base::TypeTraits<T>::n_array_name)
        return nullptr;
    return static_cast<const ::base::ArrayOf<T>*>(a->data());
}

// The typed storage behind a curve's entries (null where an entry is absent
// or of another type), as the evaluation reads it.
struct Resolved {
    const std::uint8_t* pre = nullptr;
    const std::uint8_t* post = nullptr;
    const std::uint8_t* mode = nullptr;
    const float* tension = nullptr;
    const float* tightness = nullptr;
    const ::base::ArrayOf<std::uint8_t>* modes = nullptr;
    const ::base::ArrayOf<TimeCode>* times = nullptr;
    const void* values = nullptr; // an ArrayOf of 'valuesType'
    ::base::name_id valuesType;   // empty without values
    const ::base::ArrayOf<float>* tangents = nullptr;
    const ::base::ArrayOf<float>* weights = nullptr;
    bool weightsPresent = false;
};

template <class T>
const T* scalarData(const ::base::Attribute* a) {
    return a && a->typeName() == ::base::TypeTraits<T>::n_name ? static_cast<const T*>(a->data())
                                                               : nullptr;
}

Resolved resolve(const CurveEntries& e) {
    Resolved r;
    r.pre = scalarData<std::uint8_t>(e.pre);
    r.post = scalarData<std::uint8_t>(e.post);
    r.tension = scalarData<float>(e.tension);
    r.tightness = scalarData<float>(e.tightness);
    r.mode = scalarData<std::uint8_t>(e.interpolation);
    if (!r.mode)
        r.modes = arrayOf<std::uint8_t>(e.interpolation);
    r.times = arrayOf<TimeCode>(e.times);
    if (e.values) {
        r.values = e.values->data();
        r.valuesType = e.values->typeName();
    }
    r.tangents = arrayOf<float>(e.tangents);
    r.weights = arrayOf<float>(e.weights);
    r.weightsPresent = e.weights != nullptr;
    return r;
}

const ::base::AttribMap* curveMap(const ::base::AttribMap& channel, std::uint32_t index) {
    const ::base::Attribute* curves = followed(channel.findInherited(names::curves));
    if (!curves)
        return nullptr;
    ::base::AttribArray* list = const_cast<::base::Attribute*>(curves)->asArray();
    if (!list || index >= list->size())
        return nullptr;
    const ::base::Attribute* item = followed(list->item(index));
    return item ? const_cast<::base::Attribute*>(item)->asMap() : nullptr;
}

void channelLog(int level, const char* text, const ::base::IPlugin& channel) {
    ::base::logFormatted(::base::logScene, level, text, channel.name());
}

} // namespace

// ---- Per-curve memo ----

// The busy flag and curve 0's verdict, hint and checks come first: playback
// of many channels reads few cache lines per evaluation.
struct IKeyframeChannel::Memo {
    // Entries of a curve map beyond this many are not worth resolving ahead.
    static constexpr std::size_t maxWatched = 16;

    // Evaluation is a read: two threads may evaluate one channel. The memo is
    // only an accelerator, so a busy memo is simply bypassed.
    std::atomic_flag busy = ATOMIC_FLAG_INIT;

    struct Curve : ::base::NonCopyable {
        const void* times = nullptr; // the storage the verdict belongs to
        std::size_t count = 0;
        bool ascending = true;
        std::uint32_t hint = 0;
        // Where the keys around the hint were last read: fetched ahead while
        // the checks run. Only ever prefetched, never read, as they may be
        // stale.
        const void* nearTimes = nullptr;
        const void* nearValues = nullptr;

        // The curve's entries as last found, kept while playback reads the
        // same curve again and again. Nothing tells the channel when a curve
        // map or its arrays change, so every attribute taken here carries a
        // watch node, which its destructor nulls; together with the list
        // slot and the entry count this catches any replacement, removal,
        // insertion or addition. Values and sizes are read afresh each time.
        bool resolved = false;
        std::uint32_t nodeCount = 0;
        const ::base::AttribArray* list = nullptr;
        const ::base::AttribMap* map = nullptr;
        std::size_t entryCount = 0;
        Resolved entries;
        ::base::WatchNode nodes[maxWatched + 2];

        ~Curve() { forget(); }

        void forget() {
            for (std::uint32_t i = 0; i < nodeCount; ++i)
                if (::base::Attribute* watched = nodes[i].watched)
                    watched->removeWatch(nodes[i]);
            nodeCount = 0;
            resolved = false;
        }
        void reset() {
            forget();
            times = nullptr;
            count = 0;
            ascending = true;
            hint = 0;
            nearTimes = nearValues = nullptr;
        }
        bool watch(const ::base::Attribute* a) {
            ::base::WatchNode& node = nodes[nodeCount];
            node.owner = this;
            if (!const_cast<::base::Attribute*>(a)->addWatch(node))
                return false;
            ++nodeCount;
            return true;
        }
        // Whether the entries found earlier are still the curve's.
        bool live(std::uint32_t index) const {
            if (!resolved)
                return false;
            for (std::uint32_t i = 0; i < nodeCount; ++i)
                if (!nodes[i].watched)
                    return false;
            return list->item(index) == map && map->entries().size() == entryCount && !map->base();
        }
    };

    // Curve 0 lives here, the others (rarely more than a few) apart: watch
    // nodes must not move.
    Curve first;
    ::base::vector<std::unique_ptr<Curve>> more;

    Curve* find(std::uint32_t index) {
        if (index == 0)
            return &first;
        return index <= more.size() ? more[index - 1].get() : nullptr;
    }
    Curve& at(std::uint32_t index) {
        if (index == 0)
            return first;
        while (more.size() < index)
            more.push_back(std::make_unique<Curve>());
        return *more[index - 1];
    }
    void clear() {
        first.reset();
        more.clear();
    }
};

IKeyframeChannel::IKeyframeChannel(::base::IPluginDesc* descriptor, ::base::PluginFactory* factory,
                                   std::uint32_t id)
    : ::base::IPlugin(descriptor, factory, id), m_memo(new Memo) {}

IKeyframeChannel::~IKeyframeChannel() {
    delete m_memo;
}

void IKeyframeChannel::attributeChanged(::base::name_id name, ::base::Attribute* attribute,
                                        std::uint32_t flags) {
    if (!m_memo->busy.test_and_set(std::memory_order_acquire)) {
        m_memo->clear();
        m_memo->busy.clear(std::memory_order_release);
    }
    ::base::IPlugin::attributeChanged(name, attribute, flags);
}

namespace {

// Holds the memo for one evaluation; not owning it means bypassing it.
class MemoGuard {
public:
    explicit MemoGuard(IKeyframeChannel::Memo& memo)
        : m_memo(memo), m_owned(!memo.busy.test_and_set(std::memory_order_acquire)) {}
    ~MemoGuard() {
        if (m_owned)
            m_memo.busy.clear(std::memory_order_release);
    }
    MemoGuard(const MemoGuard&) = delete;
    MemoGuard& operator=(const MemoGuard&) = delete;
    explicit operator bool() const { return m_owned; }

private:
    IKeyframeChannel::Memo& m_memo;
    bool m_owned;
};

// Takes the entries of the channel's own curve 'index' into 'c' when they can
// be watched: no links or inheritance on the way, whose targets could change
// elsewhere.
void resolveCurve(IKeyframeChannel::Memo::Curve& c, const IKeyframeChannel& channel,
                  std::uint32_t index, const Resolved& found) {
    c.forget();
    const ::base::Attribute* own = channel.findEntry(names::curves);
    const ::base::AttribArray* list = own && !const_cast<::base::Attribute*>(own)->asLink()
                                          ? const_cast<::base::Attribute*>(own)->asArray()
                                          : nullptr;
    ::base::Attribute* item = list ? list->item(index) : nullptr;
    const ::base::AttribMap* map = item && !item->asLink() ? item->asMap() : nullptr;
    if (!map || map->base() || map->entries().size() > IKeyframeChannel::Memo::maxWatched)
        return;
    for (const auto& entry : map->entries())
        if (entry.second->asLink())
            return;
    bool watched = c.watch(list) && c.watch(map);
    for (const auto& entry : map->entries())
        watched = watched && c.watch(entry.second);
    if (!watched) {
        c.forget();
        return;
    }
    c.list = list;
    c.map = map;
    c.entryCount = map->entries().size();
    c.entries = found;
    c.resolved = true;
}

// Ascending check of 'times' for curve 'c', done once per storage. Answers
// false (after logging once) for a curve whose times go backwards.
bool timesAscending(IKeyframeChannel::Memo::Curve* c, const IKeyframeChannel& channel,
                    const TimeCode* times, std::size_t n) {
    auto scan = [&] {
        for (std::size_t i = 1; i < n; ++i)
            if (times[i] < times[i - 1])
                return false;
        return true;
    };
    if (!c)
        return scan();
    if (c->times != times || c->count != n) {
        c->times = times;
        c->count = n;
        c->hint = 0;
        c->ascending = scan();
        if (!c->ascending)
            channelLog(::base::logError,
                       "keyframeChannel |{}| The 'times' attribute is not in ascending order!",
                       channel);
    }
    return c->ascending;
}

} // namespace

template <class T>
T IKeyframeChannel::computeValue(std::uint32_t curveIndex, TimeCode time) const {
    const MemoGuard guard(*m_memo);
    Memo::Curve* memo = guard ? m_memo->find(curveIndex) : nullptr;
    if (memo) {
        __builtin_prefetch(memo->nearTimes);
        __builtin_prefetch(memo->nearValues);
        __builtin_prefetch(memo->entries.times);
        __builtin_prefetch(memo->entries.values);
        __builtin_prefetch(memo->map);
    }
    Resolved r;
    if (memo && memo->live(curveIndex)) {
        r = memo->entries;
    } else {
        const ::base::AttribMap* curve = curveMap(*this, curveIndex);
        if (!curve)
            return T{};
        r = resolve(curveEntries(*curve));
        if (guard) {
            memo = &m_memo->at(curveIndex);
            resolveCurve(*memo, *this, curveIndex, r);
        }
    }

    Curve<T> c;
    if (r.pre)
        c.pre = *r.pre;
    if (r.post)
        c.post = *r.post;
    if (r.tension)
        c.tension = *r.tension;
    if (r.tightness)
        c.tightness = *r.tightness;
    if (r.mode) {
        c.mode = *r.mode;
    } else if (r.modes) {
        c.modes = r.modes->data();
        c.modeCount = r.modes->size();
    }

    const bool typed = r.valuesType == ::base::TypeTraits<T>::n_array_name;
    if (r.values && !typed) {
        channelLog(::base::logError, "keyframeChannel |{}| Incompatible 'values' type!", *this);
        return T{};
    }
    const auto* values = static_cast<const ::base::ArrayOf<T>*>(r.values);
    if (!values || values->empty()) {
        channelLog(::base::logError, "keyframeChannel |{}| Empty 'values' attribute detected!",
                   *this);
        return T{};
    }
    if (values->size() == 1)
        return (*values)[0];
    const auto* times = r.times;
    if (!times || times->empty()) {
        channelLog(::base::logError, "keyframeChannel |{}| Empty 'times' attribute detected!",
                   *this);
        return T{};
    }
    if (times->size() != values->size()) {
        channelLog(::base::logError,
                   "keyframeChannel |{}| Different number of 'keys' and 'values' detected!", *this);
        return T{};
    }
    c.times = times->data();
    c.values = values->data();
    c.n = values->size();

    if (c.usesBezier()) {
        const auto* tangents = r.tangents;
        if (!tangents || tangents->size() != 2 * c.n) {
            channelLog(::base::logWarning,
                       "keyframeChannel |{}| Missing or wrong tangents provided for the Bezier "
                       "curve! Falling back to linear interpolation!",
                       *this);
            c.bezierFallback = true;
        } else {
            c.tangents = tangents->data();
            if (r.weights && r.weights->size() == tangents->size())
                c.weights = r.weights->data();
            else if (r.weightsPresent)
                channelLog(::base::logWarning,
                           "keyframeChannel |{}| Invalid tangent weights provided for the Bezier "
                           "curve! The curve will not work properly!",
                           *this);
        }
    }

    if (!timesAscending(memo, *this, c.times, c.n))
        return T{};
    c.hint = memo ? memo->hint : 0;
    T result = evaluateCurve(c, time);
    if (memo) {
        memo->hint = c.hint;
        memo->nearTimes = c.times + c.hint;
        memo->nearValues = c.values + c.hint;
    }
    return result;
}

// The mode of a curve or key that is not one of the four.
[[noreturn]] void anim::throwMode() {
    throw ::base::switch_exception("scene_animation", __LINE__,
                                   "scene::IKeyframeChannel::computeValue");
}

// ---- Key setting ----

template <class T>
bool IKeyframeChannel::setKey(std::uint32_t curveIndex, TimeCode time, const T& value) {
    const ::base::AttribArray* curves = findArray(names::curves);
    if (!curves || curves->size() == 0) {
        channelLog(::base::logError, "keyframeChannel |{}| Trying to set a key without any curves!",
                   *this);
        return false;
    }
    ::base::AttribMap* curve =
        curveIndex < curves->size() ? curves->item(curveIndex)->asMap() : nullptr;
    const ::base::Attribute* v = curve ? curve->findEntry(names::values) : nullptr;
    const ::base::Attribute* t = curve ? curve->findEntry(names::times) : nullptr;
    const bool fits = curve && (!v || v->typeName() == ::base::TypeTraits<T>::n_array_name) &&
                      (!t || t->typeName() == ::base::TypeTraits<TimeCode>::n_array_name) &&
                      (v ? v->size() : 0) == (t ? t->size() : 0);
    if (!fits) {
        channelLog(::base::logError,
                   "keyframeChannel |{}| Wrong number of components in the curve!", *this);
        return false;
    }
    auto& times = curve->vecAttribute<TimeCode>(names::times)->items();
    auto& values = curve->vecAttribute<T>(names::values)->items();
    const auto at = std::lower_bound(times.begin(), times.end(), time);
    const std::size_t k = std::size_t(at - times.begin());
    if (at != times.end() && *at == time) {
        values[k] = value;
    } else {
        times.insert(at, time);
        values.insert(values.begin() + std::ptrdiff_t(k), value);
        // Per-key companions keep their pairing with the keys.
        if (auto* modes = curve->findEntry(names::interpolation);
            modes && modes->typeName() == ::base::TypeTraits<std::uint8_t>::n_array_name) {
            auto& m = *static_cast<::base::ArrayOf<std::uint8_t>*>(modes->data());
            if (m.size() + 1 == times.size())
                m.insert(m.begin() + std::ptrdiff_t(k), k ? m[k - 1] : std::uint8_t(1));
        }
        for (::base::name_id n : {names::tangents, names::weights})
            if (auto* pairs = curve->findEntry(n);
                pairs && pairs->typeName() == ::base::TypeTraits<float>::n_array_name) {
                auto& p = *static_cast<::base::ArrayOf<float>*>(pairs->data());
                if (p.size() + 2 == 2 * times.size()) {
                    const float fill = n == names::weights ? 1.0f / 3.0f : 0.0f;
                    p.insert(p.begin() + std::ptrdiff_t(2 * k), {fill, fill});
                }
            }
    }
    if (const MemoGuard guard(*m_memo); guard)
        if (Memo::Curve* memo = m_memo->find(curveIndex))
            memo->reset();
    return true;
}

#define SCENE_CHANNEL_TYPE(T)                                                                      \
    template T IKeyframeChannel::computeValue<T>(std::uint32_t, TimeCode) const;                   \
    template bool IKeyframeChannel::setKey<T>(std::uint32_t, TimeCode, const T&);
SCENE_CHANNEL_TYPES(SCENE_CHANNEL_TYPE)
#undef SCENE_CHANNEL_TYPE

// ---- Layer playback ----

namespace {

using OutputFn = void (*)(const IKeyframeChannel&, TimeCode, ::base::AttribArray&, std::uint32_t);

// Writes channel's curve 0 at 'time' into item 'index' of 'outputs'. Items
// take no watch nodes, so every read through a link asks the layer first
// (refreshPath) and a replaced item is never read through a stale cache.
template <class T>
void computeOutput(const IKeyframeChannel& channel, TimeCode time, ::base::AttribArray& outputs,
                   std::uint32_t index) {
    const T value = channel.computeValue<T>(0, time);
    ::base::Attribute* item = outputs.item(index);
    if (item && item->hasFlag(::base::Attribute::flagNoWatch) &&
        item->typeName() == ::base::TypeTraits<T>::n_name) {
        static_cast<::base::TypedAttribute<T>*>(item)->setValue(value);
        return;
    }
    auto* fresh = new ::base::TypedAttribute<T>(value);
    fresh->setFlag(::base::Attribute::flagNoWatch);
    outputs.setItem(index, fresh);
}

struct ChannelType {
    ::base::name_id (*arrayName)();
    OutputFn output;
};

template <class T>
::base::name_id arrayNameOf() {
    return ::base::TypeTraits<T>::n_array_name;
}

const ChannelType channelTypes[] = {
#define SCENE_CHANNEL_TYPE(T) {&arrayNameOf<T>, &computeOutput<T>},
    SCENE_CHANNEL_TYPES(SCENE_CHANNEL_TYPE)
#undef SCENE_CHANNEL_TYPE
};

// (time − playAt) · speed / 100 in ticks, truncated toward zero, saturated to
// the 64-bit range.
TimeCode localTime(TimeCode time, TimeCode playAt, std::uint8_t speed) {
    const __int128 t = (__int128(time.ticks()) - playAt.ticks()) * speed / 100;
    constexpr auto lo = std::numeric_limits<std::int64_t>::min();
    constexpr auto hi = std::numeric_limits<std::int64_t>::max();
    return TimeCode(t < lo ? lo : t > hi ? hi : std::int64_t(t));
}

} // namespace

struct IAnimLayer::Playback {
    struct Clip {
        ::base::ref<IAnimClip> clip;
        TimeCode playAt;
        std::uint8_t playSpeed = 100;
        ::base::vector<::base::ref<IKeyframeChannel>> channels; // null: no channel there
    };
    ::base::vector<Clip> clips;
    std::uint32_t outputCount = 0;
    bool dirty = true;
    bool evaluated = false;
    bool running = false; // evaluation writes outputs, which must not re-enter it
    TimeCode lastTime;
};

IAnimLayer::IAnimLayer(::base::IPluginDesc* descriptor, ::base::PluginFactory* factory,
                       std::uint32_t id)
    : ::base::IPlugin(descriptor, factory, id), m_playback(new Playback) {}

IAnimLayer::~IAnimLayer() {
    delete m_playback;
}

void IAnimLayer::pluginChanged(::base::IPlugin&, ::base::name_id, std::uint32_t, std::uint64_t) {
    m_playback->dirty = true;
}

void IAnimLayer::attributeChanged(::base::name_id name, ::base::Attribute* attribute,
                                  std::uint32_t flags) {
    m_playback->dirty = true;
    ::base::IPlugin::attributeChanged(name, attribute, flags);
}

void IAnimLayer::refreshPath(::base::AttribPath& path, ::base::name_id) {
    // Only reads of the outputs are answered by playing.
    if (path.size() < 2 || path[1].name != names::outputs || m_playback->running)
        return;
    const TimeCode* time = findAttribute<TimeCode>(names::time);
    if (m_playback->dirty || !m_playback->evaluated || !time || *time != m_playback->lastTime)
        evaluate();
}

void IAnimLayer::evaluate() {
    Playback& p = *m_playback;
    if (p.running)
        return;
    p.running = true;
    struct Done {
        bool& flag;
        ~Done() { flag = false; }
    } done{p.running};

    const std::string layerName(name().c_str());
    if (p.dirty) {
        for (auto& clip : p.clips) {
            clip.clip->removeListener(*this);
            for (auto& channel : clip.channels)
                if (channel)
                    channel->removeListener(*this);
        }
        p.clips.clear();
        p.outputCount = 0;
        p.dirty = false;
        if (const ::base::AttribArray* actions = findArray(names::actions)) {
            for (::base::Attribute* item : actions->items()) {
                const ::base::AttribMap* action = item->asMap();
                const auto* clipRef =
                    action ? action->findAttribute<::base::ref<::base::IPlugin>>(names::animClip)
                           : nullptr;
                auto* clip = clipRef ? dynamic_cast<IAnimClip*>(clipRef->get()) : nullptr;
                if (!clip)
                    continue;
                Playback::Clip record;
                record.clip = ::base::ref<IAnimClip>(clip);
                record.playAt = get(*action, names::playAt, TimeCode());
                record.playSpeed = get(*action, names::playSpeed, std::uint8_t(100));
                if (get(*clip, names::endTime, TimeCode()) <
                    get(*clip, names::startTime, TimeCode()))
                    ::base::logFormatted(::base::logScene, ::base::logWarning,
                                         "animLayer |{}| Negative animation clip duration!",
                                         layerName);
                clip->addListener(*this);
                if (const auto* list = clip->findVecAttribute<::base::ref<::base::IPlugin>>(
                        names::keyframeChannels)) {
                    record.channels.reserve(list->size());
                    for (const auto& ref : *list) {
                        auto* channel = dynamic_cast<IKeyframeChannel*>(ref.get());
                        record.channels.emplace_back(channel);
                        if (channel)
                            channel->addListener(*this);
                    }
                }
                p.outputCount += std::uint32_t(record.channels.size());
                p.clips.push_back(std::move(record));
            }
        }
    }

    const TimeCode* time = findAttribute<TimeCode>(names::time);
    if (!time) {
        ::base::logFormatted(::base::logScene, ::base::logWarning,
                             "animLayer |{}| is missing time attribute!", layerName);
        return;
    }
    p.lastTime = *time;
    p.evaluated = true;

    ::base::AttribArray* outputs = arrayAttribute(names::outputs);
    if (!outputs)
        return;
    while (outputs->size() < p.outputCount) {
        // Placeholder until the channel's value type is known.
        auto* hole = new ::base::AttribMap(attribFactory());
        hole->setFlag(::base::Attribute::flagNoWatch);
        outputs->append(hole);
    }
    std::uint32_t output = 0;
    for (const Playback::Clip& clip : p.clips) {
        const TimeCode local = localTime(p.lastTime, clip.playAt, clip.playSpeed);
        const std::string clipName(clip.clip->name().c_str());
        for (std::uint32_t j = 0; j < clip.channels.size(); ++j, ++output) {
            const IKeyframeChannel* channel = clip.channels[j].get();
            if (!channel) {
                ::base::logFormatted(::base::logScene, ::base::logWarning,
                                     "animLayer |{}| Animation clip '{}' has no channel at index "
                                     "{}! Skipping calculation.",
                                     layerName, clipName, j);
                continue;
            }
            const ::base::AttribArray* curves = channel->findArray(names::curves);
            if (!curves || curves->size() == 0) {
                ::base::logFormatted(::base::logScene, ::base::logWarning,
                                     "animLayer |{}| Animation clip '{}' has no keyframe assigned "
                                     "for channel at index {}! Skipping calculation.",
                                     layerName, clipName, j);
                continue;
            }
            const ::base::AttribMap* curve = curves->item(0)->asMap();
            const ::base::Attribute* values =
                curve ? followed(curve->findInherited(names::values)) : nullptr;
            if (!values) {
                ::base::logFormatted(::base::logScene, ::base::logWarning,
                                     "animLayer |{}| Keyframe '{}' has no valid data! Skipping "
                                     "calculation.",
                                     layerName, channel->name());
                continue;
            }
            const ::base::name_id type = values->typeName();
            const ChannelType* found = nullptr;
            for (const ChannelType& candidate : channelTypes)
                if (candidate.arrayName() == type)
                    found = &candidate;
            if (!found) {
                ::base::logFormatted(::base::logScene, ::base::logWarning,
                                     "animLayer |{}| Keyframe '{}' has unknown type! Skipping "
                                     "calculation.",
                                     layerName, channel->name());
                continue;
            }
            found->output(*channel, local, *outputs, output);
        }
    }
}

} // namespace scene
