// Nodes, links and clients by their IDs. The state of a stream or device is computed from the links each time: there
// are few links, and so the state is always consistent.
#include "kesto-pipewire/Graph.h"

#include "kesto-pipewire/ValidText.h"

#include <algorithm>
#include <set>
#include <utility>

namespace kesto_pipewire {

namespace {

constexpr std::size_t maximumDevicesBytes = 1024;

std::optional<Direction> directionOfClass(std::string_view mediaClass)
{
    if (mediaClass == "Stream/Output/Audio")
        return Direction::Output;
    if (mediaClass == "Stream/Input/Audio")
        return Direction::Input;
    return std::nullopt;
}

// A device that both takes and gives sound counts as one that takes it.
std::optional<Direction> directionOfDevice(std::string_view mediaClass)
{
    if (mediaClass == "Audio/Sink" || mediaClass == "Audio/Duplex")
        return Direction::Output;
    if (mediaClass == "Audio/Source")
        return Direction::Input;
    return std::nullopt;
}

} // namespace

bool Graph::hasRoom(std::size_t count, std::size_t maximum)
{
    if (count < maximum)
        return true;
    ++ignoredObjects_;
    return false;
}

Graph::Interest Graph::addNode(ObjectID id, const NodeAnnouncement& announcement)
{
    const auto direction = directionOfClass(announcement.mediaClass);
    const auto device = directionOfDevice(announcement.mediaClass);
    if (!hasRoom(nodes_.size(), maximumObjects) || (direction && !hasRoom(streams_, maximumStreams)))
        return Interest::None;
    const auto [place, isNew] = nodes_.try_emplace(
        id, Node{announcement.serial, tidyText(announcement.name), direction, false, announcement.client});
    auto& node = place->second;
    if (!isNew || (!direction && !device))
        return Interest::None;
    if (direction) {
        ++streams_;
        return Interest::Stream;
    }
    if (!hasRoom(devices_, maximumDevices)) // streams still get its name
        return Interest::None;
    ++devices_;
    node.isDevice = true;
    deviceListener_.deviceAppeared(node.serial, {*device, node.name});
    return Interest::Device;
}

void Graph::addLink(ObjectID link, ObjectID outputNode, ObjectID inputNode, Moment when)
{
    if (!hasRoom(links_.size(), maximumObjects))
        return;
    links_[link] = {outputNode, inputNode};
    for (const auto node : {outputNode, inputNode})
        reportLinks(node, when);
}

void Graph::remove(ObjectID object, Moment when)
{
    if (const auto link = links_.extract(object))
        for (const auto node : {link.mapped().outputNode, link.mapped().inputNode})
            reportLinks(node, when);
    removeNode(object, when);
    clients_.erase(object);
}

void Graph::removeNode(ObjectID id, Moment when)
{
    const auto removed = nodes_.extract(id);
    if (!removed)
        return;
    const auto& node = removed.mapped();
    streams_ -= node.direction.has_value();
    devices_ -= node.isDevice;
    runningStreams_ -= node.direction && node.isRunning;
    if (node.hasAppeared)
        listener_.gone(node.serial, when);
    if (node.isDevice)
        deviceListener_.deviceGone(node.serial);

    // Links usually go before their nodes. If a link stays, it must not connect the next object with this ID to the
    // node's partners.
    std::set<ObjectID> partners;
    std::erase_if(links_, [&](const auto& entry) {
        const auto& link = entry.second;
        if (link.touches(id))
            partners.insert(link.outputNode == id ? link.inputNode : link.outputNode);
        return link.touches(id);
    });
    for (const auto partner : partners)
        reportLinks(partner, when);
}

void Graph::endStreams(Moment when)
{
    for (auto& [id, node] : nodes_)
        if (std::exchange(node.hasAppeared, false))
            listener_.gone(node.serial, when);
}

void Graph::clear(Moment when)
{
    endStreams(when); // before the devices, because their statistics belong to the streams' sessions
    for (const auto& [id, node] : nodes_)
        if (node.isDevice)
            deviceListener_.deviceGone(node.serial);
    nodes_.clear();
    links_.clear();
    clients_.clear();
    streams_ = devices_ = runningStreams_ = 0;
}

void Graph::describeClient(ObjectID client, Identity identity)
{
    if (clients_.contains(client) || hasRoom(clients_.size(), maximumObjects))
        clients_[client] = std::move(identity);
}

void Graph::describeNode(ObjectID id, const Identity& identity, std::string_view role, Moment when)
{
    const auto found = nodes_.find(id);
    if (found == nodes_.end() || !found->second.direction || found->second.hasAppeared)
        return;
    auto& node = found->second;
    node.hasAppeared = true;
    listener_.appeared(node.serial, {*node.direction, std::string(role), applicationOf(node, identity)}, when);
    reportDevices(id, when);
}

std::string Graph::applicationOf(const Node& node, const Identity& own) const
{
    const auto client = node.client ? clients_.find(*node.client) : clients_.end();
    const auto& owner = client == clients_.end() ? own : client->second;
    for (const auto field : {&Identity::applicationID, &Identity::binary, &Identity::name})
        for (const auto* identity : {&own, &owner})
            if (const auto& text = identity->*field; !text.empty())
                return tidyText(text);
    return {};
}

Graph::Node* Graph::appearedStream(ObjectID id)
{
    const auto found = nodes_.find(id);
    return found != nodes_.end() && found->second.hasAppeared ? &found->second : nullptr;
}

void Graph::setRunning(ObjectID id, bool running, Moment when)
{
    auto* node = appearedStream(id);
    if (!node || node->isRunning == running)
        return;
    node->isRunning = running;
    runningStreams_ += running ? 1 : -1;
    if (running)
        node->setOffAt = when;
    listener_.runningChanged(node->serial, running, when);
}

void Graph::setVolume(ObjectID id, double volume, Moment when)
{
    if (const auto* node = appearedStream(id))
        listener_.volumeChanged(node->serial, volume, when);
}

void Graph::setFormat(ObjectID id, const StreamFormat& format, Moment when)
{
    if (const auto* node = appearedStream(id))
        listener_.formatChanged(node->serial, format, when);
}

void Graph::setDeviceState(ObjectID id, DeviceState state, Moment when)
{
    const auto found = nodes_.find(id);
    if (found == nodes_.end() || !found->second.isDevice)
        return;
    auto& node = found->second;
    const bool runs = state == DeviceState::Running;
    if (runs && !node.isRunning)
        node.setOffAt = when;
    node.isRunning = runs;
    deviceListener_.deviceStateChanged(node.serial, state, when);
}

void Graph::noteCycle(const Cycle& cycle)
{
    const auto began = momentOfMonotonic(cycle.began);
    bool anyIsLate = false;
    for (auto part : cycle.followers) {
        part.isLate = part.isLate && !isSettingOff(part.node, began);
        anyIsLate = anyIsLate || part.isLate;
        if (const auto* stream = part.isLate ? appearedStream(part.node) : nullptr)
            listener_.cycleWasLate(stream->serial, began);
        reportCycle(part);
    }
    if (auto driver = cycle.driver) {
        driver->isLate = anyIsLate;
        reportCycle(*driver);
    }
}

// The state of other objects and of removed ones is unknown: they count as running.
bool Graph::isSettingOff(ObjectID id, Moment when) const
{
    const auto found = nodes_.find(id);
    if (found == nodes_.end() || !(found->second.direction || found->second.isDevice))
        return false;
    const auto& setOffAt = found->second.setOffAt;
    return !setOffAt || when.uptime < setOffAt->uptime + startUpTime;
}

void Graph::reportCycle(const NodeCycle& cycle)
{
    if (const auto found = nodes_.find(cycle.node); found != nodes_.end() && found->second.isDevice)
        deviceListener_.deviceCycle(found->second.serial, cycle);
}

std::string Graph::devicesOf(ObjectID id) const
{
    std::set<std::string_view> names; // each channel has a link, so a device may come several times
    for (const auto& [ignored, link] : links_)
        if (link.touches(id))
            if (const auto peer = nodes_.find(link.outputNode == id ? link.inputNode : link.outputNode);
                peer != nodes_.end() && !peer->second.name.empty())
                names.insert(peer->second.name);
    std::string devices;
    for (const auto name : names)
        devices.append(devices.empty() ? "" : ",").append(name);
    return tidyText(devices, maximumDevicesBytes);
}

void Graph::reportLinks(ObjectID id, Moment when)
{
    reportDevices(id, when);
    reportWanted(id, when);
}

void Graph::reportWanted(ObjectID id, Moment when)
{
    const auto found = nodes_.find(id);
    if (found == nodes_.end() || !found->second.isDevice)
        return;
    const auto touches = [id](const auto& link) { return link.second.touches(id); };
    deviceListener_.deviceWanted(found->second.serial, std::ranges::any_of(links_, touches), when);
}

void Graph::reportDevices(ObjectID id, Moment when)
{
    if (const auto* node = appearedStream(id))
        listener_.devicesChanged(node->serial, devicesOf(id), when);
}

} // namespace kesto_pipewire
