// SPDX-License-Identifier: Apache-2.0
// A listener on a private socket, with a delegate that records its calls.
#pragma once

#include "foundation/Mutex.h"
#include "platform/linux/connection/LinuxConnectionListener.h"
#include "platform/linux/connection/SocketClient.h"
#include "platform/linux/queues/LinuxWorkQueues.h"
#include "support/Progress.h"
#include "support/TemporaryDirectory.h"
#include "support/TestPlatform.h"

#include <chrono>
#include <functional>
#include <gtest/gtest.h>
#include <map>
#include <string>
#include <thread>
#include <vector>

namespace support {

inline constinit platform::LogCategory connectionTestCategory{"com.quarn.kesto", "kerc"};

// Keeps all events of a connection, in order.
struct ConnectionRecord {
    std::shared_ptr<platform::Connection> connection;
    std::vector<platform::Connection::Call> calls; // with their callers; empty if the test handles the calls
    std::vector<std::string> history; // "call 1", "interrupted", "invalidated"
    std::vector<std::thread::id> threads; // of the history
};

class ConnectionTest : public testing::Test, public platform::ConnectionListenerDelegate {
public:
    bool shouldAcceptNewConnection(platform::ConnectionListener&,
                                   const std::shared_ptr<platform::Connection>& connection) override
    {
        auto record = std::make_shared<ConnectionRecord>();
        record->connection = connection;
        connection->setCallHandler(
            [this, record](platform::Connection::Call call) { return take(*record, std::move(call)); });
        connection->setInterruptionHandler([this, record] { note(*record, "interrupted"); });
        connection->setInvalidationHandler([this, record] { note(*record, "invalidated"); });
        if (beforeResuming)
            beforeResuming(*connection);
        progress.change([&] { records.push_back(record); });
        connection->resume();
        return true;
    }

protected:
    using Handler = std::function<std::expected<void, platform::Connection::Violation>(ConnectionRecord&,
                                                                                       platform::Connection::Call&)>;

    void TearDown() override { stop(); } // while all members of the test exist

    // Starts the listener and returns when it is listening.
    void listen()
    {
        auto socket = platform::ListeningSocket::bind(path);
        ASSERT_TRUE(socket) << description(socket.error());
        auto created =
            platform::LinuxConnectionListener::create(*std::move(socket), ledger, connectionTestCategory, descriptors);
        ASSERT_TRUE(created) << created.error().message();
        listener = *std::move(created);
        listener->setDelegate(*this);
        if (beforeListening)
            beforeListening();
        bool isListening = false;
        listener->setListeningHandler([&] { progress.change([&] { isListening = true; }); });
        thread = std::thread([this] { listener->resume(); });
        ASSERT_TRUE(progress.waitFor([&] { return isListening; }));
    }

    void stop()
    {
        if (!thread.joinable())
            return;
        listener->stop();
        thread.join();
    }

    // The record of the next connection, which the client makes.
    ConnectionRecord& connected()
    {
        const std::size_t index = taken++;
        if (!progress.waitFor([&] { return records.size() > index; }))
            throw std::runtime_error("no connection was accepted");
        return *progress.look([&] { return records[index]; });
    }

    [[nodiscard]] bool waitForHistory(ConnectionRecord& record, const std::vector<std::string>& history)
    {
        return progress.waitFor([&] { return record.history == history; });
    }
    [[nodiscard]] bool waitForEnd(ConnectionRecord& record)
    {
        return progress.waitFor([&] { return !record.history.empty() && record.history.back() == "invalidated"; });
    }
    [[nodiscard]] bool waitForCalls(ConnectionRecord& record, std::size_t count)
    {
        return progress.waitFor([&] { return record.calls.size() >= count; });
    }
    [[nodiscard]] std::size_t callsOf(ConnectionRecord& record)
    {
        return progress.look([&] { return record.calls.size(); });
    }
    [[nodiscard]] std::uint64_t counted(ledger::Counter counter) const { return ledger.account()[counter]; }
    [[nodiscard]] bool waitForCount(ledger::Counter counter, std::uint64_t value)
    {
        return waitUntil([&] { return counted(counter) >= value; });
    }
    [[nodiscard]] bool waitForCounter(const std::atomic<std::uint64_t>& counter, std::uint64_t value)
    {
        return waitUntil([&] { return counter >= value; });
    }
    template <typename Condition> [[nodiscard]] static bool waitUntil(Condition condition)
    {
        const auto deadline = std::chrono::steady_clock::now() + longestWait;
        while (!condition()) {
            if (std::chrono::steady_clock::now() > deadline)
                return false;
            std::this_thread::yield();
        }
        return true;
    }

    // The log lines of connections that broke, and of connections that were behind.
    [[nodiscard]] std::vector<std::string> logged() { return linesThatAreBehind(false); }
    [[nodiscard]] std::vector<std::string> loggedBehind() { return linesThatAreBehind(true); }
    [[nodiscard]] static std::string endsBecause(const std::string& reason)
    {
        return "connection of process " + std::to_string(::getpid()) + " (user " + std::to_string(::getuid())
            + ") ends: " + reason;
    }

    TestPlatform platform;
    TemporaryDirectory directory;
    const std::filesystem::path path = directory.path() / "socket";
    Progress progress;
    std::vector<std::shared_ptr<ConnectionRecord>> records;
    Handler handler; // instead of keeping the call
    std::function<void(platform::Connection&)> beforeResuming; // on the connection thread
    std::function<void()> beforeListening; // sets up the listener
    std::size_t descriptors = platform::LinuxConnectionListener::mostDescriptors();
    ledger::Ledger ledger;
    std::unique_ptr<platform::LinuxConnectionListener> listener;
    std::thread thread;

private:
    std::expected<void, platform::Connection::Violation> take(ConnectionRecord& record, platform::Connection::Call call)
    {
        if (handler)
            return handler(record, call);
        const auto number = call.frame[0].number()->int64Value();
        note(record, "call " + std::to_string(number));
        progress.change([&] { record.calls.push_back(std::move(call)); });
        return {};
    }

    void note(ConnectionRecord& record, std::string event)
    {
        progress.change([&] {
            record.history.push_back(std::move(event));
            record.threads.push_back(std::this_thread::get_id());
        });
    }

    std::vector<std::string> linesThatAreBehind(bool wanted)
    {
        std::vector<std::string> lines;
        for (const LogLine& line : platform.log.lines("kerc"))
            if (line.message.contains(" was behind: ") == wanted)
                lines.push_back(line.message);
        return lines;
    }

    std::size_t taken = 0;
};

} // namespace support
