// A listener on a private socket with a delegate that keeps what it is told, and clients that speak in bytes: they
// can do everything that a hostile one could.
#pragma once

#include "foundation/Cbor.h"
#include "foundation/Mutex.h"
#include "platform/linux/FileDescriptor.h"
#include "platform/linux/FrameReader.h"
#include "platform/linux/LinuxConnectionListener.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "support/TemporaryDirectory.h"
#include "support/TestPlatform.h"

#include <chrono>
#include <condition_variable>
#include <functional>
#include <gtest/gtest.h>
#include <map>
#include <mutex>
#include <optional>
#include <poll.h>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>
#include <thread>
#include <vector>

namespace support {

constexpr std::chrono::seconds longestWait{30}; // for what must happen; a test that waits so long fails

// The encoding of a value as one frame, with its head.
inline std::string framed(const foundation::Value& value)
{
    std::string item;
    foundation::appendCbor(value, item);
    std::string bytes;
    platform::appendFrame(item, bytes);
    return bytes;
}

// The call with that number, and text to make it as large as a test needs it.
inline std::string callNumber(int number, std::size_t textLength = 0)
{
    return framed(foundation::Array{number, std::string(textLength, 'x')});
}

inline std::string answerTo(const foundation::Array& call, std::size_t textLength = 0)
{
    std::string frame;
    foundation::appendCbor(foundation::Array{call[0], std::string(textLength, 'y')}, frame);
    return frame;
}

class Client {
public:
    explicit Client(const std::filesystem::path& path) : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0))
    {
        sockaddr_un address = {};
        address.sun_family = AF_UNIX;
        path.string().copy(address.sun_path, sizeof address.sun_path - 1);
        if (::connect(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0)
            throw std::system_error(errno, std::generic_category(), "connect");
    }

    // Blocks until the service has taken the bytes.
    void write(std::string_view bytes)
    {
        while (!bytes.empty()) {
            const ssize_t count = ::send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
            if (count < 0)
                throw std::system_error(errno, std::generic_category(), "send");
            bytes.remove_prefix(static_cast<std::size_t>(count));
        }
    }

    // Writes as much as the service takes without being waited for; how many bytes that were.
    std::size_t writeWhatFits(std::string_view bytes)
    {
        const ssize_t count = ::send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
        return count < 0 ? 0 : static_cast<std::size_t>(count);
    }

    // The first number of the next frame; nothing when the service closed or reset the connection.
    std::optional<int> readNumber()
    {
        while (true) {
            const auto frame = reader_.next();
            if (!frame)
                throw std::runtime_error("the service sent a frame that is too long");
            if (*frame) {
                const auto value = decoder_.decode(**frame);
                return static_cast<int>((*value->array())[0].number()->int64Value());
            }
            if (!readMore())
                return std::nullopt;
        }
    }

    // The numbers of so many frames.
    std::vector<int> readNumbers(std::size_t count)
    {
        std::vector<int> numbers;
        while (numbers.size() < count) {
            const auto number = readNumber();
            if (!number)
                break;
            numbers.push_back(*number);
        }
        return numbers;
    }

    // Whether something is there to be read now.
    bool hasSomethingToRead()
    {
        pollfd events = {socket_.get(), POLLIN, 0};
        return ::poll(&events, 1, 0) == 1;
    }

    void waitForSomethingToRead()
    {
        pollfd events = {socket_.get(), POLLIN, 0};
        ASSERT_EQ(::poll(&events, 1, static_cast<int>(std::chrono::milliseconds(longestWait).count())), 1);
    }

    void close() { socket_ = platform::FileDescriptor(); }
    void stopWriting() { ::shutdown(socket_.get(), SHUT_WR); }
    void stopReading() { ::shutdown(socket_.get(), SHUT_RD); }
    [[nodiscard]] int descriptor() const { return socket_.get(); }

private:
    bool readMore()
    {
        waitForSomethingToRead();
        const ssize_t count = ::recv(socket_.get(), buffer_.data(), buffer_.size(), MSG_DONTWAIT);
        if (count <= 0)
            return false;
        reader_.feed({buffer_.data(), static_cast<std::size_t>(count)});
        return true;
    }

    platform::FileDescriptor socket_;
    platform::FrameReader reader_;
    foundation::CborDecoder decoder_;
    std::vector<char> buffer_ = std::vector<char>(256 * 1024);
};

// Something that threads tell each other: a state that is waited for. Any thread.
class Progress {
public:
    // Changes what the predicates look at.
    template <typename Change> void change(Change change)
    {
        const std::scoped_lock lock(mutex_);
        change();
        changed_.notify_all();
    }
    template <typename Predicate> [[nodiscard]] bool waitFor(Predicate predicate)
    {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, longestWait, predicate);
    }
    template <typename Look> auto look(Look look)
    {
        const std::scoped_lock lock(mutex_);
        return look();
    }

private:
    std::mutex mutex_;
    std::condition_variable changed_;
};

inline constinit platform::LogCategory connectionTestCategory{"com.quarn.kesto", "kerc"};

// Keeps everything that happens on a connection, in order.
struct ConnectionRecord {
    std::shared_ptr<platform::Connection> connection;
    std::vector<platform::Connection::Call> calls; // unless the test handles them; with who made them
    std::vector<std::string> history; // "call 1", "interrupted", "invalidated"
    std::vector<std::thread::id> threads; // of the history
};

class ConnectionTest : public testing::Test, public platform::ConnectionListenerDelegate {
public:
    bool shouldAcceptNewConnection(platform::ConnectionListener&,
                                   const std::shared_ptr<platform::Connection>& connection) override
    {
        if (!accepts)
            return false;
        auto record = std::make_shared<ConnectionRecord>();
        record->connection = connection;
        connection->setCallHandler(
            [this, record](platform::Connection::Call call) { return take(*record, std::move(call)); });
        connection->setInterruptionHandler([this, record] { note(*record, "interrupted"); });
        connection->setInvalidationHandler([this, record] { note(*record, "invalidated"); });
        progress.change([&] { records.push_back(record); });
        connection->resume();
        return true;
    }

protected:
    using Handler = std::function<std::expected<void, platform::Connection::Violation>(ConnectionRecord&,
                                                                                       platform::Connection::Call&)>;

    void TearDown() override { stop(); } // while all of the test is there still

    // Starts the listener and returns when it is listening.
    void listen()
    {
        auto socket = platform::ListeningSocket::bind(path);
        ASSERT_TRUE(socket) << description(socket.error());
        auto created = platform::LinuxConnectionListener::create(*std::move(socket), connectionTestCategory);
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
    [[nodiscard]] bool waitForCounter(const std::atomic<std::uint64_t>& counter, std::uint64_t value)
    {
        const auto deadline = std::chrono::steady_clock::now() + longestWait;
        while (counter < value) {
            if (std::chrono::steady_clock::now() > deadline)
                return false;
            std::this_thread::yield();
        }
        return true;
    }

    // The lines of connections that broke, and those of connections that were behind.
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
    bool accepts = true;
    Handler handler; // instead of keeping the call
    std::function<void()> beforeListening; // what is to be set on the listener
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
