// The part of PipeWire's object graph that concerns sound: streams, their applications and links, and devices.
//
// The server reports objects one by one, under IDs that it soon uses again. The graph keeps just enough of them to turn
// these reports into changes of streams and devices. It is plain data and does not depend on libpipewire, so that tests
// can try every order of events without a server. All functions run on one thread.
#pragma once

#include "kesto-pipewire/Device.h"
#include "kesto-pipewire/Stream.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>

namespace kesto_pipewire {

// Any client of PipeWire can make objects; beyond these numbers they are ignored and counted.
constexpr std::size_t maximumStreams = 512;
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
    void addLink(ObjectID link, ObjectID outputNode, ObjectID inputNode, Moment when);
    // An object of any kind was removed.
    void remove(ObjectID object, Moment when);
    // Removes every stream; the devices stay.
    void endStreams(Moment when);
    // The server has gone: removes all objects.
    void clear(Moment when);

    void describeClient(ObjectID client, Identity identity);
    // The first description of a stream is its appearance; later ones are ignored.
    void describeNode(ObjectID node, const Identity& identity, std::string_view role, Moment when);

    // Ignored for nodes that have not appeared as streams.
    void setRunning(ObjectID node, bool running, Moment when);
    void setVolume(ObjectID node, double volume, Moment when);
    void setFormat(ObjectID node, const StreamFormat& format, Moment when);
    // Ignored for nodes that are not devices.
    void setDeviceState(ObjectID node, DeviceState state, Moment when);
    // Reports its cycles to each device, and late cycles to the streams; a driver was late if one of its followers was.
    // The report comes later than the cycle. By then the ID may belong to another node, with cycles that began later.
    void noteCycle(const Cycle& cycle);

    [[nodiscard]] bool anyStreamRuns() const noexcept { return runningStreams_ > 0; }
    // How many objects were ignored because there were too many.
    [[nodiscard]] std::uint64_t ignoredObjects() const noexcept { return ignoredObjects_; }

private:
    struct Node {
        StreamSerial serial = 0;
        std::string name;
        std::optional<Direction> direction; // of streams
        bool isDevice = false;
        std::optional<ObjectID> client;
        bool hasAppeared = false;
        bool isRunning = false;
        std::optional<Moment> setOffAt{}; // when it last began to run
    };
    struct Link {
        ObjectID outputNode = 0;
        ObjectID inputNode = 0;
        [[nodiscard]] bool touches(ObjectID node) const noexcept { return outputNode == node || inputNode == node; }
    };

    [[nodiscard]] bool hasRoom(std::size_t count, std::size_t maximum);
    [[nodiscard]] Node* appearedStream(ObjectID node);
    [[nodiscard]] bool isSettingOff(ObjectID node, Moment when) const;
    [[nodiscard]] std::string applicationOf(const Node& node, const Identity& own) const;
    [[nodiscard]] std::string devicesOf(ObjectID node) const;
    void reportCycle(const NodeCycle& cycle);
    void reportLinks(ObjectID node, Moment when);
    void reportDevices(ObjectID node, Moment when);
    void reportWanted(ObjectID node, Moment when);
    void removeNode(ObjectID node, Moment when);

    StreamListener& listener_;
    DeviceListener& deviceListener_;
    std::unordered_map<ObjectID, Node> nodes_;
    std::unordered_map<ObjectID, Link> links_;
    std::unordered_map<ObjectID, Identity> clients_;
    std::size_t streams_ = 0;
    std::size_t devices_ = 0;
    std::size_t runningStreams_ = 0;
    std::uint64_t ignoredObjects_ = 0;
};

} // namespace kesto_pipewire
