// SPDX-License-Identifier: Apache-2.0
// A server and a client with sd-bus, and the data with which a raw client can replace this client: the bytes of a call,
// read from the wire, and the length of an answer.
#include "peers/BusPeer.h"

#include "support/SampleMessage.h"

#include <array>
#include <cstring>
#include <fmt/format.h>
#include <stdexcept>
#include <unistd.h>

namespace bench {
namespace {

constexpr const char* objectPath = "/org/example/Reporting";
constexpr const char* interfaceName = "org.example.Reporting";
constexpr const char* memberName = "SendMessage";

int check(int result)
{
    if (result < 0)
        throw std::runtime_error(fmt::format("sd-bus: {}", std::strerror(-result)));
    return result;
}

struct ReleaseMessage {
    void operator()(sd_bus_message* message) const { ::sd_bus_message_unref(message); }
};
using BusMessage = std::unique_ptr<sd_bus_message, ReleaseMessage>;

// --- The message

BusMessage sampleCall(sd_bus* bus, std::uint32_t number)
{
    sd_bus_message* call = nullptr;
    check(::sd_bus_message_new_method_call(bus, &call, nullptr, objectPath, interfaceName, memberName));
    BusMessage owner(call);
    check(::sd_bus_message_append(call, "a{sv}uqax", 10, //
                                  "session_output_running", "b", 1, //
                                  "session_selected_format", "s", "S24LE/48000/2", //
                                  "mChannelsPerFrame", "x", std::int64_t{2}, //
                                  "active_devices", "s", "Built-in Speakers", //
                                  "PomoSessionVolume", "d", 0.8125, //
                                  "kestoreporting_timestamp", "d", 1'767'225'600.25, //
                                  "systemuptime_sec", "x", std::int64_t{86'523}, //
                                  "spatializationEnabled", "b", 0, //
                                  "ringerstate", "b", 1, //
                                  "frames_rendered", "u", number, //
                                  sampleCategory, sampleType, 1, sampleReporterID));
    return owner;
}

// Reads a variant of any of the basic types.
void readVariant(sd_bus_message* message)
{
    const char* contents = nullptr;
    char type = 0;
    check(::sd_bus_message_peek_type(message, &type, &contents));
    check(::sd_bus_message_enter_container(message, 'v', contents));
    union {
        const char* text;
        std::uint64_t number;
    } value;
    check(::sd_bus_message_read_basic(message, contents[0], &value));
    check(::sd_bus_message_exit_container(message));
}

int handleCall(sd_bus_message* message, void*, sd_bus_error*)
{
    check(::sd_bus_message_enter_container(message, 'a', "{sv}"));
    while (check(::sd_bus_message_enter_container(message, 'e', "sv")) != 0) {
        const char* key = nullptr;
        check(::sd_bus_message_read_basic(message, 's', &key));
        readVariant(message);
        check(::sd_bus_message_exit_container(message));
    }
    check(::sd_bus_message_exit_container(message));
    AudioEventCategory category = 0;
    std::uint16_t type = 0;
    check(::sd_bus_message_read(message, "uq", &category, &type));
    const void* reporters = nullptr;
    std::size_t size = 0;
    check(::sd_bus_message_read_array(message, 'x', &reporters, &size));
    return ::sd_bus_reply_method_return(message, "");
}

// --- The ends

const sd_bus_vtable methods[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD("SendMessage", "a{sv}uqax", "", handleCall, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END,
};

Bus makeBus(int socket)
{
    sd_bus* bus = nullptr;
    check(::sd_bus_new(&bus));
    Bus owner(bus);
    check(::sd_bus_set_fd(bus, socket, socket));
    return owner;
}

void serve(int socket)
{
    const Bus bus = makeBus(::dup(socket));
    check(::sd_bus_set_server(bus.get(), 1, {}));
    check(::sd_bus_add_object_vtable(bus.get(), nullptr, objectPath, interfaceName, methods, nullptr));
    check(::sd_bus_start(bus.get()));
    while (true)
        if (check(::sd_bus_process(bus.get(), nullptr)) == 0)
            check(::sd_bus_wait(bus.get(), UINT64_MAX));
}

} // namespace

ChildProcess runBusServer(const SocketPair& sockets)
{
    return ChildProcess::run([&] {
        try {
            serve(sockets.server.get());
        } catch (const std::exception&) {
            // The client is gone.
        }
    });
}

BusClient::BusClient(platform::FileDescriptor socket) : bus_(makeBus(::dup(socket.get()))), number_(numberMark)
{
    check(::sd_bus_start(bus_.get()));
}

void BusClient::roundTrip()
{
    const BusMessage call = sampleCall(bus_.get(), number_++);
    sd_bus_message* reply = nullptr;
    check(::sd_bus_call(bus_.get(), call.get(), 0, nullptr, &reply));
    ::sd_bus_message_unref(reply);
}

void BusClient::pipeline(std::size_t count)
{
    std::size_t begun = 0;
    std::size_t answered = 0;
    const auto countAnswer = [](sd_bus_message*, void* counter, sd_bus_error*) {
        ++*static_cast<std::size_t*>(counter);
        return 0;
    };
    while (answered < count) {
        for (; begun < count && begun - answered < RawClient::mostUnanswered; ++begun)
            check(::sd_bus_call_async(bus_.get(), nullptr, sampleCall(bus_.get(), number_++).get(), countAnswer,
                                      &answered, 0));
        if (check(::sd_bus_process(bus_.get(), nullptr)) == 0)
            check(::sd_bus_wait(bus_.get(), UINT64_MAX));
    }
}

// --- The raw client

namespace {

constexpr const char* busName = "org.freedesktop.DBus";
constexpr std::size_t placeOfSerial = 8;

// A call of the bus itself, without arguments.
BusMessage busCall(sd_bus* bus, const char* member)
{
    sd_bus_message* call = nullptr;
    check(::sd_bus_message_new_method_call(bus, &call, busName, "/org/freedesktop/DBus", busName, member));
    return BusMessage(call);
}

// The bytes that sd-bus sends for a call, read at the other end of a socket.
template <typename MakeCall> std::string encoded(MakeCall makeCall)
{
    const SocketPair sockets;
    const Bus bus = makeBus(::dup(sockets.client.get()));
    check(::sd_bus_start(bus.get()));
    writeAll(sockets.server.get(), fmt::format("DATA\r\nOK {:032x}\r\nAGREE_UNIX_FD\r\n", 1));
    std::uint64_t cookie = 0; // requesting it requests an answer
    check(::sd_bus_send(bus.get(), makeCall(bus.get()).get(), &cookie));
    check(::sd_bus_flush(bus.get()));
    std::array<char, 4096> bytes{};
    const auto count = ::read(sockets.server.get(), bytes.data(), bytes.size());
    std::string sent(bytes.data(), static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    constexpr std::string_view endOfHandshake = "BEGIN\r\n";
    return sent.substr(sent.find(endOfHandshake) + endOfHandshake.size());
}

std::uint32_t integerAt(const char* bytes)
{
    std::uint32_t value = 0;
    std::memcpy(&value, bytes, sizeof value);
    return value;
}

constexpr std::size_t sizeOfHead = 16;

// A message has a fixed head with the length of the body at 4 and that of the fields at 12, the fields up to a multiple
// of 8, and the body.
std::size_t sizeAfterHead(const char* head)
{
    return (integerAt(head + 12) + 7) / 8 * 8 + integerAt(head + 4);
}

std::size_t readAnswer(int socket)
{
    std::array<char, sizeOfHead> head{};
    bool isWhole = readAll(socket, head.data(), head.size());
    std::string rest(isWhole ? sizeAfterHead(head.data()) : 0, '\0');
    isWhole = isWhole && readAll(socket, rest.data(), rest.size());
    if (!isWhole)
        throw std::runtime_error("the D-Bus server ended the connection");
    return head.size() + rest.size();
}

void authenticate(int socket)
{
    using namespace std::string_view_literals;
    std::string user;
    for (const char digit : fmt::to_string(::getuid()))
        user += fmt::format("{:02x}", digit);
    writeAll(socket, "\0"sv);
    writeAll(socket, fmt::format("AUTH EXTERNAL {}\r\n", user));
    for (char byte = 0; byte != '\n';) // "OK" and the server's identity
        if (!readAll(socket, &byte, 1))
            throw std::runtime_error("the D-Bus server refused the connection");
    writeAll(socket, "BEGIN\r\n");
}

} // namespace

RawClient makeRawBusClient(platform::FileDescriptor socket)
{
    authenticate(socket.get());
    Request request =
        Request::marked(encoded([](sd_bus* bus) { return sampleCall(bus, numberMark); }), std::endian::native);
    request.places.push_back(placeOfSerial);
    request.setNumber(numberMark);
    writeAll(socket.get(), request.bytes);
    const std::size_t answerSize = readAnswer(socket.get());
    return {std::move(socket), std::move(request), answerSize};
}

Request busIdentityRequest()
{
    return {encoded([](sd_bus* bus) { return busCall(bus, "GetId"); }), {placeOfSerial}, std::endian::native};
}

void joinBus(int socket)
{
    authenticate(socket);
    writeAll(socket, encoded([](sd_bus* bus) { return busCall(bus, "Hello"); }));
    readAnswer(socket);
}

std::optional<std::size_t> sizeOfBusMessage(std::string_view bytes)
{
    if (bytes.size() < sizeOfHead)
        return std::nullopt;
    const std::size_t size = sizeOfHead + sizeAfterHead(bytes.data());
    return size <= bytes.size() ? std::optional(size) : std::nullopt;
}

Bus connectToBus(const std::filesystem::path& path)
{
    sd_bus* bus = nullptr;
    check(::sd_bus_new(&bus));
    Bus owner(bus);
    const char* name = nullptr;
    const bool isConnected = ::sd_bus_set_address(bus, fmt::format("unix:path={}", path.native()).c_str()) >= 0
        && ::sd_bus_set_bus_client(bus, 1) >= 0 && ::sd_bus_start(bus) >= 0
        && ::sd_bus_get_unique_name(bus, &name) >= 0;
    return isConnected ? std::move(owner) : Bus();
}

} // namespace bench
