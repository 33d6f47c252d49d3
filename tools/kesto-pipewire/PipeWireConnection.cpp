// SPDX-License-Identifier: Apache-2.0
// A class for each kind of bound object: its listener decodes the object's events and passes them to the graph.
#include "kesto-pipewire/PipeWireConnection.h"

#include "kesto-pipewire/Pods.h"

#include <pipewire/client.h>
#include <pipewire/context.h>
#include <pipewire/extensions/profiler.h>
#include <pipewire/keys.h>
#include <pipewire/link.h>
#include <pipewire/node.h>
#include <pipewire/port.h>
#include <pipewire/proxy.h>
#include <pipewire/type.h>
#include <spa/utils/string.h>

#include <array>
#include <cerrno>
#include <charconv>
#include <utility>

namespace kesto_pipewire {

namespace {

std::string_view textOf(const spa_dict& properties, const char* key)
{
    const auto* text = spa_dict_lookup(&properties, key);
    return text ? text : "";
}

template <typename Number> std::optional<Number> numberOf(const spa_dict& properties, const char* key)
{
    const auto text = textOf(properties, key);
    Number number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    return error == std::errc() && end == text.data() + text.size() && !text.empty() ? std::optional(number)
                                                                                     : std::nullopt;
}

Identity identityOf(const spa_dict& properties)
{
    return {std::string(textOf(properties, PW_KEY_APP_ID)), std::string(textOf(properties, PW_KEY_APP_PROCESS_BINARY)),
            std::string(textOf(properties, PW_KEY_APP_NAME))};
}

} // namespace

class PipeWireConnection::Bound {
public:
    Bound(PipeWireConnection& connection, ObjectID id, const char* type, std::uint32_t version)
        : connection_(connection),
          id_(id),
          proxy_(static_cast<pw_proxy*>(pw_registry_bind(connection.registry(), id, type, version, 0)))
    {
    }
    virtual ~Bound()
    {
        if (proxy_)
            pw_proxy_destroy(proxy_);
    }
    Bound(const Bound&) = delete;
    Bound& operator=(const Bound&) = delete;

protected:
    [[nodiscard]] Graph& graph() noexcept { return connection_.graph(); }

    PipeWireConnection& connection_;
    const ObjectID id_;
    pw_proxy* const proxy_;
    spa_hook hook_{}; // the library removes it with the proxy
};

namespace {

class BoundClient : public PipeWireConnection::Bound {
public:
    BoundClient(PipeWireConnection& connection, ObjectID id)
        : Bound(connection, id, PW_TYPE_INTERFACE_Client, PW_VERSION_CLIENT)
    {
        if (proxy_)
            pw_client_add_listener(reinterpret_cast<pw_client*>(proxy_), &hook_, &events, this);
    }

private:
    static void hearInfo(void* data, const pw_client_info* info)
    {
        auto* self = static_cast<BoundClient*>(data);
        if (info->props)
            self->graph().describeClient(self->id_, identityOf(*info->props));
    }

    static constexpr pw_client_events events{PW_VERSION_CLIENT_EVENTS, hearInfo, nullptr};
};

// A filter has no parameters of a stream: its ports have formats of their own, and it has no volume.
class BoundStream : public PipeWireConnection::Bound {
public:
    enum class Kind : std::uint8_t { Stream, Filter };
    BoundStream(PipeWireConnection& connection, ObjectID id, Kind kind)
        : Bound(connection, id, PW_TYPE_INTERFACE_Node, PW_VERSION_NODE)
    {
        if (!proxy_)
            return;
        auto* node = reinterpret_cast<pw_node*>(proxy_);
        std::array<std::uint32_t, 2> followed{SPA_PARAM_Props, SPA_PARAM_Format};
        pw_node_add_listener(node, &hook_, &events, this);
        if (kind == Kind::Stream)
            pw_node_subscribe_params(node, followed.data(), followed.size());
    }

private:
    static void hearInfo(void* data, const pw_node_info* info)
    {
        auto* self = static_cast<BoundStream*>(data);
        const auto now = currentMoment();
        if (info->props) {
            self->graph().setLinkGroup(self->id_, textOf(*info->props, PW_KEY_NODE_LINK_GROUP), now);
            self->graph().describeNode(self->id_, identityOf(*info->props), textOf(*info->props, PW_KEY_MEDIA_ROLE),
                                       now);
        }
        self->graph().setRunning(self->id_, info->state == PW_NODE_STATE_RUNNING, now);
        self->connection_.followProfiler();
    }

    static void hearParameter(void* data, int, std::uint32_t kind, std::uint32_t, std::uint32_t, const spa_pod* value)
    {
        auto* self = static_cast<BoundStream*>(data);
        if (!value)
            return;
        if (kind == SPA_PARAM_Props)
            if (const auto volume = readVolume(*value))
                self->graph().setVolume(self->id_, *volume, currentMoment());
        if (kind == SPA_PARAM_Format)
            if (const auto format = readFormat(*value))
                self->graph().setFormat(self->id_, *format, currentMoment());
    }

    static constexpr pw_node_events events{PW_VERSION_NODE_EVENTS, hearInfo, hearParameter};
};

class BoundDevice : public PipeWireConnection::Bound {
public:
    BoundDevice(PipeWireConnection& connection, ObjectID id)
        : Bound(connection, id, PW_TYPE_INTERFACE_Node, PW_VERSION_NODE)
    {
        if (!proxy_)
            return;
        auto* node = reinterpret_cast<pw_node*>(proxy_);
        std::array<std::uint32_t, 1> followed{SPA_PARAM_Format};
        pw_node_add_listener(node, &hook_, &events, this);
        pw_node_subscribe_params(node, followed.data(), followed.size());
    }

private:
    static void hearInfo(void* data, const pw_node_info* info)
    {
        auto* self = static_cast<BoundDevice*>(data);
        if (info->props)
            self->graph().setLinkGroup(self->id_, textOf(*info->props, PW_KEY_NODE_LINK_GROUP), currentMoment());
        if (const auto state = stateOf(info->state))
            self->graph().setDeviceState(self->id_, *state, currentMoment());
    }

    static std::optional<DeviceState> stateOf(pw_node_state state)
    {
        switch (state) {
        case PW_NODE_STATE_ERROR: return DeviceState::Error;
        case PW_NODE_STATE_SUSPENDED: return DeviceState::Suspended;
        case PW_NODE_STATE_IDLE: return DeviceState::Idle;
        case PW_NODE_STATE_RUNNING: return DeviceState::Running;
        case PW_NODE_STATE_CREATING: break;
        }
        return std::nullopt;
    }

    static void hearParameter(void* data, int, std::uint32_t kind, std::uint32_t, std::uint32_t, const spa_pod* value)
    {
        auto* self = static_cast<BoundDevice*>(data);
        if (const auto rate = value && kind == SPA_PARAM_Format ? readRate(*value) : std::nullopt)
            self->graph().setDeviceRate(self->id_, *rate, currentMoment());
    }

    static constexpr pw_node_events events{PW_VERSION_NODE_EVENTS, hearInfo, hearParameter};
};

class BoundProfiler : public PipeWireConnection::Bound {
public:
    BoundProfiler(PipeWireConnection& connection, ObjectID id)
        : Bound(connection, id, PW_TYPE_INTERFACE_Profiler, PW_VERSION_PROFILER)
    {
        if (proxy_)
            pw_profiler_add_listener(reinterpret_cast<pw_profiler*>(proxy_), &hook_, &events, this);
    }

private:
    static void hearProfile(void* data, const spa_pod* profile)
    {
        auto& graph = static_cast<BoundProfiler*>(data)->graph();
        readCycles(*profile, [&graph](const Cycle& cycle) { graph.noteCycle(cycle); });
    }

    static constexpr pw_profiler_events events{PW_VERSION_PROFILER_EVENTS, hearProfile};
};

} // namespace

const pw_core_events PipeWireConnection::coreEvents{
    .version = PW_VERSION_CORE_EVENTS,
    .info = nullptr,
    .done = nullptr,
    .ping = nullptr,
    .error = [](void* data, std::uint32_t id, int, int error,
                const char*) { static_cast<PipeWireConnection*>(data)->failed(id, error); },
    .remove_id = nullptr,
    .bound_id = nullptr,
    .add_mem = nullptr,
    .remove_mem = nullptr,
};

const pw_registry_events PipeWireConnection::registryEvents{
    .version = PW_VERSION_REGISTRY_EVENTS,
    .global =
        [](void* data, std::uint32_t id, std::uint32_t, const char* type, std::uint32_t, const spa_dict* properties) {
            const spa_dict none{0, 0, nullptr};
            static_cast<PipeWireConnection*>(data)->objectAppeared(id, type, properties ? *properties : none);
        },
    .global_remove = [](void* data, std::uint32_t id) { static_cast<PipeWireConnection*>(data)->objectRemoved(id); },
};

std::unique_ptr<PipeWireConnection> PipeWireConnection::open(pw_context& context, const std::string& remote,
                                                             Graph& graph, std::function<void()> lost)
{
    auto* properties = pw_properties_new(PW_KEY_APP_NAME, "kesto-pipewire", nullptr);
    if (!remote.empty())
        pw_properties_set(properties, PW_KEY_REMOTE_NAME, remote.c_str());
    auto* core = pw_context_connect(&context, properties, 0);
    return core ? std::unique_ptr<PipeWireConnection>(new PipeWireConnection(core, graph, std::move(lost))) : nullptr;
}

PipeWireConnection::PipeWireConnection(pw_core* core, Graph& graph, std::function<void()> lost)
    : graph_(graph),
      lost_(std::move(lost)),
      core_(core),
      registry_(pw_core_get_registry(core, PW_VERSION_REGISTRY, 0))
{
    pw_core_add_listener(core_, &coreHook_, &coreEvents, this);
    pw_registry_add_listener(registry_, &registryHook_, &registryEvents, this);
}

PipeWireConnection::~PipeWireConnection()
{
    profiler_.reset();
    bound_.clear();
    spa_hook_remove(&registryHook_);
    spa_hook_remove(&coreHook_);
    pw_proxy_destroy(reinterpret_cast<pw_proxy*>(registry_));
    pw_core_disconnect(core_);
}

// An error of a single object means that it has gone, or has no format yet; the connection goes on.
void PipeWireConnection::failed(ObjectID id, int error)
{
    if (id == PW_ID_CORE && error == -EPIPE && lost_)
        std::exchange(lost_, nullptr)();
}

void PipeWireConnection::objectAppeared(ObjectID id, std::string_view type, const spa_dict& properties)
{
    if (type == PW_TYPE_INTERFACE_Node) {
        nodeAppeared(id, properties);
    } else if (type == PW_TYPE_INTERFACE_Client) {
        bound_[id] = std::make_unique<BoundClient>(*this, id);
    } else if (type == PW_TYPE_INTERFACE_Link) {
        linkAppeared(id, properties);
    } else if (type == PW_TYPE_INTERFACE_Port) {
        const auto format = textOf(properties, PW_KEY_FORMAT_DSP);
        const bool isSound = format.empty() || format == "32 bit float mono audio";
        if (!isSound || textOf(properties, PW_KEY_PORT_MONITOR) == "true")
            graph_.addPortWithoutSound(id);
    } else if (type == PW_TYPE_INTERFACE_Profiler) {
        profilerID_ = id;
        followProfiler();
    }
}

void PipeWireConnection::linkAppeared(ObjectID id, const spa_dict& properties)
{
    const auto output = numberOf<ObjectID>(properties, PW_KEY_LINK_OUTPUT_NODE);
    const auto input = numberOf<ObjectID>(properties, PW_KEY_LINK_INPUT_NODE);
    if (!output || !input)
        return;
    const LinkEnds ends{
        .outputNode = *output,
        .inputNode = *input,
        .outputPort = numberOf<ObjectID>(properties, PW_KEY_LINK_OUTPUT_PORT).value_or(PW_ID_ANY),
        .inputPort = numberOf<ObjectID>(properties, PW_KEY_LINK_INPUT_PORT).value_or(PW_ID_ANY),
    };
    if (const auto filter = graph_.addLink(id, ends, currentMoment()))
        bound_[*filter] = std::make_unique<BoundStream>(*this, *filter, BoundStream::Kind::Filter);
    followProfiler();
}

void PipeWireConnection::nodeAppeared(ObjectID id, const spa_dict& properties)
{
    const NodeAnnouncement node{
        .serial = numberOf<StreamSerial>(properties, PW_KEY_OBJECT_SERIAL).value_or(id),
        .mediaClass = textOf(properties, PW_KEY_MEDIA_CLASS),
        .name = textOf(properties, PW_KEY_NODE_NAME),
        .client = numberOf<ObjectID>(properties, PW_KEY_CLIENT_ID),
    };
    switch (graph_.addNode(id, node)) {
    case Graph::Interest::Stream:
        bound_[id] = std::make_unique<BoundStream>(*this, id, BoundStream::Kind::Stream);
        break;
    case Graph::Interest::Device: bound_[id] = std::make_unique<BoundDevice>(*this, id); break;
    case Graph::Interest::None: break;
    }
}

void PipeWireConnection::objectRemoved(ObjectID id)
{
    bound_.erase(id);
    if (profilerID_ == id)
        profilerID_.reset();
    graph_.remove(id, currentMoment());
    followProfiler();
}

void PipeWireConnection::followProfiler()
{
    const bool wanted = profilerID_ && graph_.anyStreamRuns();
    if (wanted && !profiler_)
        profiler_ = std::make_unique<BoundProfiler>(*this, *profilerID_);
    else if (!wanted)
        profiler_.reset();
}

} // namespace kesto_pipewire
