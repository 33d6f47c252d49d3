// SPDX-License-Identifier: Apache-2.0
// The stream on a cluster of nats-server, by libnats. It connects again by itself.
#pragma once

#include "kesto-ingest/stream/Stream.h"

#include <chrono>
#include <memory>
#include <string>
#include <vector>

namespace kesto_ingest {

struct JetStreamConfiguration {
    std::vector<std::string> servers; // such as "nats://127.0.0.1:4222"
    std::string user{};
    std::string password{};
    std::string nkey{}; // the public one; with the seed it takes the place of user and password
    std::string nkeySeedFile{};
    std::string certificateAuthority{}; // a file; empty: no TLS
    std::chrono::milliseconds timeLimit{5000}; // of one question

    friend bool operator==(const JetStreamConfiguration&, const JetStreamConfiguration&) = default;
};

// What `setup` makes.
struct StreamSizes {
    int replicas = 1;
    std::int64_t eventsBytes = std::int64_t{8} << 30; // waiting batches; then devices are refused, and wait
    std::int64_t deadBytes = std::int64_t{1} << 30; // then the oldest dead letters go
    std::chrono::seconds redeliverAfter{60}; // what a copy neither acknowledges nor says that it works on
};

class JetStream : public Stream {
public:
    // Throws std::runtime_error, for a person, if no server takes the connection.
    explicit JetStream(const JetStreamConfiguration& configuration);
    ~JetStream() override;

    // Makes the streams and the consumer, or sets those that are there to these sizes.
    [[nodiscard]] std::expected<void, std::string> setUp(const StreamSizes& sizes);

    [[nodiscard]] std::expected<std::vector<Delivery>, std::string> fetch(std::size_t most,
                                                                          std::chrono::milliseconds wait) override;
    void acknowledge(const Delivery& delivery) override;
    void workGoesOn(const Delivery& delivery) override;
    void giveBack(const Delivery& delivery) override;
    [[nodiscard]] std::expected<std::optional<Entry>, std::string> last(const std::string& subject) override;
    [[nodiscard]] std::expected<std::vector<PutAnswer>, std::string> put(std::span<const Put> puts) override;
    [[nodiscard]] std::expected<Publication, std::string> publish(const std::string& subject, std::string_view payload,
                                                                  const Headers& headers) override;

private:
    struct Connection;

    void tell(const Delivery& delivery, const std::string& word);
    [[nodiscard]] std::expected<void, std::string> putSome(std::span<const Put> puts, std::span<PutAnswer> answers);

    std::unique_ptr<Connection> connection_;
};

} // namespace kesto_ingest
