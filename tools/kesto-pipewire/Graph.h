// SPDX-License-Identifier: Apache-2.0
// The part of PipeWire's object graph that concerns sound: streams, their applications and links, and devices.
//
// A node without a class is a filter, which is how JACK's programs look as well. Each direction in which it is linked
// with a device is a stream of its own. A chain is a device and a stream that share a `node.link-group`: the device
// passes its sound to the stream, so what is linked with that device has the devices of that stream, and the stream
// itself is not reported.
//
// The server reports objects one by one, under IDs that it soon uses again. The graph keeps just enough of them to turn
// these reports into changes of streams and devices. It is plain data and does not depend on libpipewire, so that tests
// can try every order of events without a server. All functions run on one thread.
#pragma once

#include "kesto-pipewire/Device.h"
#include "kesto-pipewire/Stream.h"

#include <array>
#include <cstddef>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>

namespace kesto_pipewire {

// Any client of PipeWire can make objects; beyond these numbers they are ignored and counted.
constexpr std::size_t maximumStreams = 512; // filters that were linked with a device included
constexpr std::size_t maximumDevices = 128;
constexpr std::size_t maximumObjects = 16384; // of each kind

constexpr double startUpTime = 0.2; // seconds; cycles that a node misses so soon after its start do not count

// A program's own description, on its client object, its node or both.
struct Identity {
    std::string applicationID{}; // `application.id`
    std::string binary{}; // `application.process.binary`
    std::string name{}; // `application.name`
};

// The server's announcement of a node.
struct NodeAnnouncement {
    StreamSerial serial = 0;
    std::string_view mediaClass{};
    std::string_view name{};
    std::optional<ObjectID> client{};
};

// What a link connects.
struct LinkEnds {
    ObjectID outputNode = 0;
    ObjectID inputNode = 0;
    ObjectID outputPort = 0;
    ObjectID inputPort = 0;
};

class Graph {
public:
    Graph(StreamListener& listener, DeviceListener& deviceListener)
        : listener_(listener),
          deviceListener_(deviceListener)
    {
    }

    // The kinds of nodes of which the graph needs further events.
    enum class Interest : std::uint8_t { None, Stream, Device };
    [[nodiscard]] Interest addNode(ObjectID node, const NodeAnnouncement& announcement);
    // A port that carries something else than a sound of its own: MIDI, or the monitor of another port.
    void addPortWithoutSound(ObjectID port);
    // Returns the filter, if this is its first link with a device: from now on the graph needs its events.
    std::optional<ObjectID> addLink(ObjectID link, const LinkEnds& ends, Moment when);
    // An object of any kind was removed.
    void remove(ObjectID object, Moment when);
    // Removes every stream; the devices stay.
    void endStreams(Moment when);
    // The server has gone: removes all objects.
    void clear(Moment when);

    void describeClient(ObjectID client, Identity identity);
    // The `node.link-group` of a stream, before its description, or of a device; it may be empty. Later ones are
    // ignored.
    void setLinkGroup(ObjectID node, std::string_view group, Moment when);
    // The first description of a stream is its appearance; a filter or a member of a link group waits for its links.
    // Later ones are ignored.
    void describeNode(ObjectID node, const Identity& identity, std::string_view role, Moment when);

    // Ignored for nodes that are not described.
    void setRunning(ObjectID node, bool running, Moment when);
    // Ignored for other nodes than streams.
    void setVolume(ObjectID node, double volume, Moment when);
    void setFormat(ObjectID node, const StreamFormat& format, Moment when);
    // Ignored for nodes that are not devices.
    void setDeviceState(ObjectID node, DeviceState state, Moment when);
    // In frames a second: that of the filters which are linked with it.
    void setDeviceRate(ObjectID node, std::int32_t rate, Moment when);
    // Reports its cycles to each device, and late cycles to the streams; a driver was late if one of its followers was.
    // The report comes later than the cycle. By then the ID may belong to another node, with cycles that began later.
    void noteCycle(const Cycle& cycle);

    [[nodiscard]] bool anyStreamRuns() const noexcept { return runningStreams_ > 0; }
    // How many objects were ignored because there were too many.
    [[nodiscard]] std::uint64_t ignoredObjects() const noexcept { return ignoredObjects_; }

private:
    enum class Kind : std::uint8_t { Other, Stream, Filter, Device };
    // A stream, or one direction of a filter.
    struct Side {
        bool hasAppeared = false;
        bool isRunning = false;
    };
    struct Node {
        Kind kind = Kind::Other;
        StreamSerial serial = 0;
        std::string name;
        std::optional<ObjectID> client;
        std::optional<Direction> direction{}; // of streams
        bool isSink = false; // a device, which may be both
        bool isSource = false;
        bool isFollowed = false; // the graph gets its events
        bool hasLinkGroup = false; // whether it is known, even if it is empty
        std::string linkGroup{};
        bool isOfChain = false; // stays so if the chain's device goes first
        std::optional<StreamDescription> description{}; // of streams and filters
        std::array<Side, 2> sides{}; // by direction; a stream has one
        bool isRunning = false;
        std::optional<double> volume{};
        std::optional<StreamFormat> format{}; // of streams
        std::int32_t rate = 0; // of devices; 0 while it is not known
        std::optional<Moment> setOffAt{}; // when it last began to run

        [[nodiscard]] bool isDevice() const noexcept { return kind == Kind::Device && isFollowed; }
        // Distinguishes a filter's two streams.
        [[nodiscard]] StreamSerial serialOf(Direction which) const noexcept;
        [[nodiscard]] Side& side(Direction which) { return sides.at(static_cast<std::size_t>(which)); }
        [[nodiscard]] const Side& side(Direction which) const { return sides.at(static_cast<std::size_t>(which)); }
    };
    struct Link : LinkEnds {
        bool carriesSound = true;
        [[nodiscard]] bool touches(ObjectID node) const noexcept { return outputNode == node || inputNode == node; }
        [[nodiscard]] ObjectID partnerOf(ObjectID node) const noexcept
        {
            return outputNode == node ? inputNode : outputNode;
        }
    };
    // A filter's links with devices in one direction.
    struct Use {
        std::set<ObjectID> ports; // of the filter
        std::set<ObjectID> devices;
        std::int32_t rate = 0; // of a device; 0 while none is known
    };

    [[nodiscard]] bool hasRoom(std::size_t count, std::size_t maximum);
    [[nodiscard]] Node* find(ObjectID node);
    [[nodiscard]] const Node* find(ObjectID node) const;
    // The stream, if it has appeared. Not for filters.
    [[nodiscard]] Node* appearedStream(ObjectID node);
    [[nodiscard]] bool isSettingOff(ObjectID node, Moment when) const;
    [[nodiscard]] std::string applicationOf(const Node& node, const Identity& own) const;

    // The device or stream at the other end of a chain; nothing for a node that is not part of one.
    [[nodiscard]] std::optional<ObjectID> otherEndOfChain(const Node& node) const;
    // The nodes that are linked with it.
    [[nodiscard]] std::set<ObjectID> partnersOf(ObjectID node) const;
    [[nodiscard]] bool isStreamOfItsOwn(ObjectID id, const Node& node) const;
    [[nodiscard]] bool anyDeviceIsUndescribed() const;
    [[nodiscard]] bool isUse(const Link& link, ObjectID filter, Direction direction) const;
    [[nodiscard]] Use useOf(ObjectID filter, Direction direction) const;
    // The devices with which all these are, through chains.
    [[nodiscard]] std::string devicesText(const std::set<ObjectID>& partners) const;
    using Seen = std::set<ObjectID>; // each node of a chain is visited once
    void addDevices(std::set<std::string_view>& names, ObjectID partner, Seen& seen) const;

    Interest follow(Node& node);
    std::optional<ObjectID> followFilter(const Link& link);
    void appear(Node& node, Direction direction, Moment when);
    void endSides(Node& node, Moment when);
    void reportFilter(ObjectID filter, Moment when);
    void reportSideRunning(Node& node, Direction direction, bool running, Moment when);
    void reportCycle(const NodeCycle& cycle);
    void reportLateCycle(ObjectID node, Moment began);
    void reportLinks(ObjectID node, Moment when);
    void reportDevices(ObjectID node, Moment when);
    void reportDevices(ObjectID node, Moment when, Seen& seen);
    void reportWanted(ObjectID node, Moment when);
    void removeNode(ObjectID node, Moment when);

    StreamListener& listener_;
    DeviceListener& deviceListener_;
    std::unordered_map<ObjectID, Node> nodes_;
    std::unordered_map<ObjectID, Link> links_;
    std::unordered_set<ObjectID> portsWithoutSound_;
    std::unordered_map<ObjectID, Identity> clients_;
    std::size_t streams_ = 0;
    std::size_t devices_ = 0;
    std::size_t runningStreams_ = 0; // sides
    std::uint64_t ignoredObjects_ = 0;
};

} // namespace kesto_pipewire
