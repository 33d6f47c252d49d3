// SPDX-License-Identifier: Apache-2.0
// Nodes, links and clients by their IDs. The state of a stream or device is computed from the links each time: there
// are few links, and so the state is always consistent.
#include "kesto-pipewire/Graph.h"

#include "kesto-pipewire/ValidText.h"

#include <fmt/format.h>

#include <algorithm>
#include <utility>

namespace kesto_pipewire {

namespace {

constexpr std::size_t maximumDevicesBytes = 1024;

// In the numbers of a filter's recording streams, which its playing streams have without it. Serials count from 0.
constexpr StreamSerial recordingMark = StreamSerial{1} << 63;

std::optional<Direction> directionOfClass(std::string_view mediaClass)
{
    if (mediaClass == "Stream/Output/Audio")
        return Direction::Output;
    if (mediaClass == "Stream/Input/Audio")
        return Direction::Input;
    return std::nullopt;
}

// The stream's name in reports.
std::string streamName(std::string_view nodeName, StreamSerial serial, bool isRecordingOfFilter)
{
    const auto suffix = fmt::format("#{}{}", serial, isRecordingOfFilter ? ".input" : "");
    return tidyText(nodeName.empty() ? "unnamed" : nodeName, maximumNameBytes - suffix.size()) + suffix;
}

} // namespace

bool Graph::hasRoom(std::size_t count, std::size_t maximum)
{
    if (count < maximum)
        return true;
    ++ignoredObjects_;
    return false;
}

Graph::Node* Graph::find(ObjectID id)
{
    const auto found = nodes_.find(id);
    return found == nodes_.end() ? nullptr : &found->second;
}

const Graph::Node* Graph::find(ObjectID id) const
{
    const auto found = nodes_.find(id);
    return found == nodes_.end() ? nullptr : &found->second;
}

Graph::Interest Graph::addNode(ObjectID id, const NodeAnnouncement& announcement)
{
    const auto mediaClass = announcement.mediaClass;
    const auto direction = directionOfClass(mediaClass);
    if (!hasRoom(nodes_.size(), maximumObjects) || (direction && !hasRoom(streams_, maximumStreams)))
        return Interest::None;
    Node node{.serial = announcement.serial, .name = tidyText(announcement.name), .client = announcement.client};
    node.direction = direction;
    node.isSink = mediaClass == "Audio/Sink" || mediaClass == "Audio/Duplex";
    node.isSource = mediaClass == "Audio/Source" || mediaClass == "Audio/Duplex";
    if (direction)
        node.kind = Kind::Stream;
    else if (node.isSink || node.isSource)
        node.kind = Kind::Device;
    else if (mediaClass.empty())
        node.kind = Kind::Filter;
    const auto [place, isNew] = nodes_.try_emplace(id, std::move(node));
    return isNew ? follow(place->second) : Interest::None;
}

Graph::Interest Graph::follow(Node& node)
{
    if (node.kind == Kind::Stream) {
        node.isFollowed = true;
        ++streams_;
        return Interest::Stream;
    }
    if (node.kind != Kind::Device || !hasRoom(devices_, maximumDevices)) // streams still get its name
        return Interest::None;
    node.isFollowed = true;
    ++devices_;
    // A device that both takes and gives sound counts as one that takes it.
    deviceListener_.deviceAppeared(node.serial, {node.isSink ? Direction::Output : Direction::Input, node.name});
    return Interest::Device;
}

void Graph::addPortWithoutSound(ObjectID port)
{
    if (hasRoom(portsWithoutSound_.size(), maximumObjects))
        portsWithoutSound_.insert(port);
}

std::optional<ObjectID> Graph::addLink(ObjectID id, const LinkEnds& ends, Moment when)
{
    if (!hasRoom(links_.size(), maximumObjects))
        return std::nullopt;
    const bool carriesSound =
        !portsWithoutSound_.contains(ends.outputPort) && !portsWithoutSound_.contains(ends.inputPort);
    const auto& link = links_[id] = {ends, carriesSound};
    for (const auto node : {ends.outputNode, ends.inputNode})
        reportLinks(node, when);
    return followFilter(link);
}

std::optional<ObjectID> Graph::followFilter(const Link& link)
{
    const bool plays = isUse(link, link.outputNode, Direction::Output);
    const bool records = isUse(link, link.inputNode, Direction::Input);
    const auto id = plays ? link.outputNode : link.inputNode;
    auto* node = plays || records ? find(id) : nullptr;
    if (!node || node->kind != Kind::Filter || node->isFollowed || !hasRoom(streams_, maximumStreams))
        return std::nullopt;
    node->isFollowed = true;
    node->volume = 1; // nothing scales what it plays or records
    ++streams_;
    return id;
}

void Graph::remove(ObjectID object, Moment when)
{
    if (const auto link = links_.extract(object))
        for (const auto node : {link.mapped().outputNode, link.mapped().inputNode})
            reportLinks(node, when);
    removeNode(object, when);
    clients_.erase(object);
    portsWithoutSound_.erase(object);
}

void Graph::removeNode(ObjectID id, Moment when)
{
    const auto removed = nodes_.extract(id);
    if (!removed)
        return;
    auto& node = removed.mapped();
    streams_ -= node.isFollowed && node.kind != Kind::Device;
    devices_ -= node.isDevice();
    endSides(node, when);
    if (node.isDevice())
        deviceListener_.deviceGone(node.serial);

    // Links usually go before their nodes. If a link stays, it must not connect the next object with this ID to the
    // node's partners.
    std::set<ObjectID> partners;
    std::erase_if(links_, [&](const auto& entry) {
        const auto& link = entry.second;
        if (link.touches(id))
            partners.insert(link.partnerOf(id));
        return link.touches(id);
    });
    for (const auto partner : partners)
        reportLinks(partner, when);
}

void Graph::endStreams(Moment when)
{
    for (auto& [id, node] : nodes_)
        endSides(node, when);
}

void Graph::endSides(Node& node, Moment when)
{
    node.description.reset();
    for (const auto direction : {Direction::Output, Direction::Input}) {
        const auto side = std::exchange(node.side(direction), {});
        runningStreams_ -= side.isRunning;
        if (side.hasAppeared)
            listener_.gone(node.serialOf(direction), when);
    }
}

void Graph::clear(Moment when)
{
    endStreams(when); // before the devices, because their statistics belong to the streams' sessions
    for (const auto& [id, node] : nodes_)
        if (node.isDevice())
            deviceListener_.deviceGone(node.serial);
    nodes_.clear();
    links_.clear();
    clients_.clear();
    portsWithoutSound_.clear();
    streams_ = devices_ = runningStreams_ = 0;
}

void Graph::describeClient(ObjectID client, Identity identity)
{
    if (clients_.contains(client) || hasRoom(clients_.size(), maximumObjects))
        clients_[client] = std::move(identity);
}

void Graph::setLinkGroup(ObjectID id, std::string_view group, Moment when)
{
    auto* node = find(id);
    if (!node || std::exchange(node->hasLinkGroup, true))
        return;
    node->linkGroup = group.substr(0, maximumNameBytes);
    if (!node->isDevice() || anyDeviceIsUndescribed())
        return;
    for (const auto& [other, candidate] : nodes_) // those that have waited for this
        if (candidate.description && !candidate.linkGroup.empty())
            reportDevices(other, when);
}

void Graph::describeNode(ObjectID id, const Identity& identity, std::string_view role, Moment when)
{
    auto* node = find(id);
    if (!node || node->kind == Kind::Device || !node->isFollowed || node->description)
        return;
    node->description = {.role = std::string(role), .application = applicationOf(*node, identity)};
    reportDevices(id, when);
}

// Only when a member of a link group is linked and all devices are described, it is known whether it belongs to a
// chain.
bool Graph::isStreamOfItsOwn(ObjectID id, const Node& node) const
{
    if (node.kind != Kind::Stream || !node.description || node.isOfChain)
        return false;
    if (node.linkGroup.empty() || node.side(*node.direction).hasAppeared)
        return true;
    return !otherEndOfChain(node) && !partnersOf(id).empty() && !anyDeviceIsUndescribed();
}

bool Graph::anyDeviceIsUndescribed() const
{
    return std::ranges::any_of(nodes_,
                               [](const auto& each) { return each.second.isDevice() && !each.second.hasLinkGroup; });
}

void Graph::appear(Node& node, Direction direction, Moment when)
{
    if (std::exchange(node.side(direction).hasAppeared, true))
        return;
    const bool isFilter = node.kind == Kind::Filter;
    auto description = *node.description;
    description.direction = direction;
    description.name = streamName(node.name, node.serial, isFilter && direction == Direction::Input);
    description.isFilter = isFilter;
    listener_.appeared(node.serialOf(direction), description, when);
    if (node.volume)
        listener_.volumeChanged(node.serialOf(direction), *node.volume, when);
    if (node.format)
        listener_.formatChanged(node.serialOf(direction), *node.format, when);
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
    auto* node = find(id);
    return node && node->direction && node->side(*node->direction).hasAppeared ? node : nullptr;
}

void Graph::setRunning(ObjectID id, bool running, Moment when)
{
    auto* node = find(id);
    if (!node || !node->description)
        return;
    if (running && !node->isRunning)
        node->setOffAt = when;
    node->isRunning = running;
    if (node->kind == Kind::Filter)
        reportFilter(id, when);
    else if (appearedStream(id))
        reportSideRunning(*node, *node->direction, running, when);
}

void Graph::reportSideRunning(Node& node, Direction direction, bool running, Moment when)
{
    if (std::exchange(node.side(direction).isRunning, running) == running)
        return;
    runningStreams_ += running ? 1 : -1;
    if (running)
        node.setOffAt = when;
    listener_.runningChanged(node.serialOf(direction), running, when);
}

void Graph::setVolume(ObjectID id, double volume, Moment when)
{
    auto* node = find(id);
    if (!node || !node->direction)
        return;
    node->volume = volume;
    if (appearedStream(id))
        listener_.volumeChanged(node->serial, volume, when);
}

void Graph::setFormat(ObjectID id, const StreamFormat& format, Moment when)
{
    auto* node = find(id);
    if (!node || !node->direction)
        return;
    node->format = format;
    if (appearedStream(id))
        listener_.formatChanged(node->serial, format, when);
}

void Graph::setDeviceState(ObjectID id, DeviceState state, Moment when)
{
    auto* node = find(id);
    if (!node || !node->isDevice())
        return;
    const bool runs = state == DeviceState::Running;
    if (runs && !node->isRunning)
        node->setOffAt = when;
    node->isRunning = runs;
    deviceListener_.deviceStateChanged(node->serial, state, when);
}

void Graph::setDeviceRate(ObjectID id, std::int32_t rate, Moment when)
{
    auto* node = find(id);
    if (!node || !node->isDevice() || std::exchange(node->rate, rate) == rate)
        return;
    for (const auto partner : partnersOf(id))
        reportFilter(partner, when);
}

void Graph::noteCycle(const Cycle& cycle)
{
    const auto began = momentOfMonotonic(cycle.began);
    bool anyIsLate = false;
    for (auto part : cycle.followers) {
        part.isLate = part.isLate && !isSettingOff(part.node, began);
        anyIsLate = anyIsLate || part.isLate;
        if (part.isLate)
            reportLateCycle(part.node, began);
        reportCycle(part);
    }
    if (auto driver = cycle.driver) {
        driver->isLate = anyIsLate;
        reportCycle(*driver);
    }
}

void Graph::reportLateCycle(ObjectID id, Moment began)
{
    auto* node = find(id);
    for (const auto direction : {Direction::Output, Direction::Input})
        if (node && node->side(direction).hasAppeared)
            listener_.cycleWasLate(node->serialOf(direction), began);
}

// The state of other objects and of removed ones is unknown: they count as running.
bool Graph::isSettingOff(ObjectID id, Moment when) const
{
    const auto* node = find(id);
    if (!node || !node->isFollowed)
        return false;
    return !node->setOffAt || when.uptime < node->setOffAt->uptime + startUpTime;
}

void Graph::reportCycle(const NodeCycle& cycle)
{
    if (const auto* node = find(cycle.node); node && node->isDevice())
        deviceListener_.deviceCycle(node->serial, cycle);
}

std::set<ObjectID> Graph::partnersOf(ObjectID id) const
{
    std::set<ObjectID> partners;
    for (const auto& [ignored, link] : links_)
        if (link.touches(id))
            partners.insert(link.partnerOf(id));
    return partners;
}

std::optional<ObjectID> Graph::otherEndOfChain(const Node& node) const
{
    const auto isChain = [](const Node& device, const Node& stream) {
        return device.kind == Kind::Device && stream.kind == Kind::Stream
            && (stream.direction == Direction::Output ? device.isSink : device.isSource);
    };
    if (node.linkGroup.empty())
        return std::nullopt;
    const auto other = std::ranges::find_if(nodes_, [&](const auto& each) {
        const auto& candidate = each.second;
        return candidate.linkGroup == node.linkGroup && (isChain(node, candidate) || isChain(candidate, node));
    });
    return other == nodes_.end() ? std::nullopt : std::optional(other->first);
}

std::string Graph::devicesText(const std::set<ObjectID>& partners) const
{
    std::set<std::string_view> names;
    Seen seen;
    for (const auto partner : partners)
        addDevices(names, partner, seen);
    std::string devices;
    for (const auto name : names)
        devices.append(devices.empty() ? "" : ",").append(name);
    return tidyText(devices, maximumDevicesBytes);
}

void Graph::addDevices(std::set<std::string_view>& names, ObjectID partner, Seen& seen) const
{
    const auto* node = find(partner);
    if (!node || !seen.insert(partner).second)
        return;
    const auto stream = node->kind == Kind::Device ? otherEndOfChain(*node) : std::nullopt;
    if (stream)
        for (const auto next : partnersOf(*stream))
            addDevices(names, next, seen);
    else if (!node->name.empty())
        names.insert(node->name);
}

void Graph::reportLinks(ObjectID id, Moment when)
{
    reportDevices(id, when);
    reportWanted(id, when);
}

void Graph::reportWanted(ObjectID id, Moment when)
{
    const auto* node = find(id);
    if (!node || !node->isDevice())
        return;
    const auto touches = [id](const auto& link) { return link.second.touches(id); };
    deviceListener_.deviceWanted(node->serial, std::ranges::any_of(links_, touches), when);
}

void Graph::reportDevices(ObjectID id, Moment when)
{
    Seen seen;
    reportDevices(id, when, seen);
}

// The devices of a chain's stream are those of all that is linked with the chain's device.
void Graph::reportDevices(ObjectID id, Moment when, Seen& seen)
{
    reportFilter(id, when);
    auto* node = find(id);
    if (node && isStreamOfItsOwn(id, *node)) {
        appear(*node, *node->direction, when);
        listener_.devicesChanged(node->serial, devicesText(partnersOf(id)), when);
        reportSideRunning(*node, *node->direction, node->isRunning, when);
        return;
    }
    const auto device = node && node->kind == Kind::Stream ? otherEndOfChain(*node) : std::nullopt;
    if (device)
        node->isOfChain = true;
    if (device && seen.insert(*device).second)
        for (const auto partner : partnersOf(*device))
            reportDevices(partner, when, seen);
}

// Whether the link joins the filter with a device for which or from which it takes sound in that direction.
bool Graph::isUse(const Link& link, ObjectID filter, Direction direction) const
{
    const bool isOutput = direction == Direction::Output;
    if (!link.carriesSound || (isOutput ? link.outputNode : link.inputNode) != filter)
        return false;
    const auto* device = find(isOutput ? link.inputNode : link.outputNode);
    return device && (isOutput ? device->isSink : device->isSource);
}

Graph::Use Graph::useOf(ObjectID filter, Direction direction) const
{
    const bool isOutput = direction == Direction::Output;
    Use use;
    for (const auto& [ignored, link] : links_) {
        if (!isUse(link, filter, direction))
            continue;
        const auto device = isOutput ? link.inputNode : link.outputNode;
        use.ports.insert(isOutput ? link.outputPort : link.inputPort);
        use.devices.insert(device);
        use.rate = std::max(use.rate, find(device)->rate);
    }
    return use;
}

void Graph::reportFilter(ObjectID id, Moment when)
{
    auto* node = find(id);
    if (!node || node->kind != Kind::Filter || !node->description)
        return;
    for (const auto direction : {Direction::Output, Direction::Input}) {
        const auto use = useOf(id, direction);
        const auto channels = static_cast<int>(use.ports.size());
        if (channels == 0 && !node->side(direction).hasAppeared)
            continue;
        appear(*node, direction, when);
        const auto serial = node->serialOf(direction);
        listener_.devicesChanged(serial, devicesText(use.devices), when);
        if (channels > 0 && use.rate > 0)
            listener_.formatChanged(serial, {fmt::format("F32P/{}/{}", use.rate, channels), channels}, when);
        reportSideRunning(*node, direction, node->isRunning && channels > 0, when);
    }
}

StreamSerial Graph::Node::serialOf(Direction which) const noexcept
{
    return kind == Kind::Filter && which == Direction::Input ? serial | recordingMark : serial;
}

} // namespace kesto_pipewire
