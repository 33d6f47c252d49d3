// SPDX-License-Identifier: Apache-2.0
// A transport without servers, and the stream behind it, which tests break as servers break.
#pragma once

#include "kesto-uplink/transport/Transport.h"

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <deque>
#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

namespace uplink_test {

// The servers' side.
struct FakeStream {
    std::vector<std::pair<std::string, std::string>> messages; // ID and bytes, in order
    std::map<std::string, kesto_uplink::Confirmation> confirmations; // the last of each device
    bool isReachable = true;
    bool isFull = false;
    int connections = 0; // so far
    unsigned losesConnectionsAfter = 0; // so many batches; 0: never
    bool hasConfirmations = true;
    std::function<void()> afterConnecting;
    std::function<void()> afterStoring; // before the device gets its answer
};

class FakeTransport : public kesto_uplink::Transport {
public:
    using Answer = kesto_uplink::Answer;
    using Kind = Answer::Kind;

    explicit FakeTransport(FakeStream& stream) : stream_(stream) { }

    // What servers would refuse.
    bool hasWrongPassword = false;
    bool lacksPermission = false;
    // Answers nothing; `put` then waits for `interrupt`, or its time limit.
    bool isFrozen = false;
    std::chrono::milliseconds timeLimit{};

    Answer connect() override
    {
        connected_ = false;
        if (isInterrupted())
            return {Kind::Interrupted, false, {}};
        if (!stream_.isReachable)
            return away("no server is there");
        if (hasWrongPassword)
            return {Kind::Refused, false, "wrong password: check the credentials file"};
        ++stream_.connections;
        putsOfConnection_ = 0;
        connected_ = true;
        if (stream_.afterConnecting)
            stream_.afterConnecting();
        return {};
    }

    void disconnect() override { connected_ = false; }

    Answer put(const std::string& id, std::string_view batch) override
    {
        if (!isConnected())
            return away("there is no connection");
        if (isFrozen) {
            std::unique_lock lock(mutex_);
            interruption_.wait_for(lock, timeLimit, [this] { return isInterrupted_; });
        }
        if (isInterrupted())
            return {Kind::Interrupted, false, {}};
        if (isFrozen)
            return away("no answer in time");
        if (lacksPermission)
            return {Kind::Refused, false, "permissions: check the accounts"};
        if (stream_.isFull)
            return {Kind::Full, false, "the stream is full"};
        if (stream_.losesConnectionsAfter != 0 && ++putsOfConnection_ > stream_.losesConnectionsAfter) {
            connected_ = false;
            return away("the connection is lost");
        }
        const bool isKnown =
            std::ranges::any_of(stream_.messages, [&](const auto& message) { return message.first == id; });
        if (!isKnown)
            stream_.messages.emplace_back(id, batch);
        if (stream_.afterStoring)
            stream_.afterStoring();
        return {Kind::Stored, isKnown, {}};
    }

    Confirmed lastConfirmation(const std::string& device) override
    {
        if (!isConnected() || !stream_.hasConfirmations)
            return std::unexpected(away("no confirmations"));
        device_ = device;
        told_ = current();
        return told_;
    }

    Confirmed awaitConfirmation(std::chrono::milliseconds /*limit*/) override
    {
        if (!isConnected())
            return std::unexpected(away("there is no connection"));
        if (isInterrupted())
            return std::unexpected(Answer{Kind::Interrupted, false, {}});
        const auto next = current();
        if (next == told_)
            return std::optional<kesto_uplink::Confirmation>();
        told_ = next;
        return told_;
    }

    void interrupt() override
    {
        const std::scoped_lock lock(mutex_);
        isInterrupted_ = true;
        interruption_.notify_all();
    }

private:
    static Answer away(std::string sentence) { return {Kind::Away, false, std::move(sentence)}; }

    bool isConnected() const { return connected_ && stream_.isReachable; }
    bool isInterrupted()
    {
        const std::scoped_lock lock(mutex_);
        return isInterrupted_;
    }
    std::optional<kesto_uplink::Confirmation> current() const
    {
        const auto found = stream_.confirmations.find(device_);
        return found == stream_.confirmations.end() ? std::nullopt : std::optional(found->second);
    }

    FakeStream& stream_;
    bool connected_ = false;
    unsigned putsOfConnection_ = 0;
    std::string device_;
    std::optional<kesto_uplink::Confirmation> told_;
    std::mutex mutex_;
    std::condition_variable interruption_;
    bool isInterrupted_ = false;
};

} // namespace uplink_test
