// SPDX-License-Identifier: Apache-2.0
// The other end of the wire, in the test's own process: uses the protocol over a real socket, records the calls, and
// answers as the test wants.
#pragma once

#include "foundation/Mutex.h"
#include "foundation/cbor/Cbor.h"
#include "platform/linux/connection/FrameReader.h"
#include "platform/linux/files/FileDescriptor.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

namespace sdk_test {

// How long a test waits before it fails.
constexpr std::chrono::seconds patience{20};

// A client's connection, seen from the service. The service's thread.
class Peer {
public:
    explicit Peer(platform::FileDescriptor socket) : socket_(std::move(socket)) { }

    // Sends [call, error, values...].
    void answer(std::uint64_t call, std::vector<foundation::Value> values, foundation::Value error = {});
    void sendFrame(std::string_view frame);
    void sendBytes(std::string_view bytes);
    // Sends descriptors, which the caller keeps, with the next frame.
    void attach(std::vector<int> descriptors) { attached_ = std::move(descriptors); }
    // Ends the connection after the current call.
    void close() { isOver_ = true; }

    std::map<std::int64_t, std::uint16_t> sessions; // reporter to service type
    std::map<std::int64_t, std::uint64_t> heldStarts; // reporter to call

private:
    friend class FakeService;
    [[nodiscard]] ssize_t sendWithDescriptors(std::string_view bytes);
    platform::FileDescriptor socket_;
    std::vector<int> attached_;
    platform::FrameReader reader_;
    foundation::CborDecoder decoder_;
    bool isOver_ = false;
};

// Answers as kestod does, as far as one client can tell.
void answerObediently(Peer& peer, const foundation::Array& call);
// Answers nothing.
inline void answerNothing(Peer&, const foundation::Array&) { }

class FakeService {
public:
    using Handler = std::function<void(Peer& peer, const foundation::Array& call)>;

    // Listens until it is destroyed.
    explicit FakeService(std::string path, Handler handler = answerObediently);
    ~FakeService();
    FakeService(const FakeService&) = delete;
    FakeService& operator=(const FakeService&) = delete;

    // Waits for so many calls, or until the time is over, and returns all calls so far.
    [[nodiscard]] std::vector<foundation::Array> waitForCalls(std::size_t count);
    [[nodiscard]] std::size_t connections() const; // the number made so far

    // Calls the function on the service's thread for each connected client; returns when all calls are done.
    void forEachPeer(const std::function<void(Peer& peer)>& action);
    void disconnectAll()
    {
        forEachPeer([](Peer& peer) { peer.close(); });
    }
    // While this is off, the service reads nothing from clients.
    void setReading(bool isReading);

private:
    void run();
    void performActions();
    void accept();
    void read(Peer& peer);
    void onThread(std::function<void()> action);

    const std::string path_;
    const Handler handler_;
    platform::FileDescriptor listener_;
    platform::FileDescriptor doorbell_;
    std::vector<std::unique_ptr<Peer>> peers_;
    bool isReading_ = true;

    mutable foundation::Mutex mutex_;
    foundation::Condition changed_;
    std::vector<foundation::Array> calls_ KESTO_GUARDED_BY(mutex_);
    std::size_t connections_ KESTO_GUARDED_BY(mutex_) = 0;
    std::function<void()> action_ KESTO_GUARDED_BY(mutex_);
    bool isStopping_ KESTO_GUARDED_BY(mutex_) = false;
    std::thread thread_;
};

// ---- Looking into calls: [call, method, arguments...] ----

[[nodiscard]] inline std::int64_t integerAt(const foundation::Array& array, std::size_t index)
{
    return array[index].number()->int64Value();
}
[[nodiscard]] inline std::uint64_t callNumber(const foundation::Array& call)
{
    return static_cast<std::uint64_t>(integerAt(call, 0));
}
[[nodiscard]] inline std::int64_t method(const foundation::Array& call)
{
    return integerAt(call, 1);
}

} // namespace sdk_test
