// SPDX-License-Identifier: Apache-2.0
// The room of the stream: batches as they come from the devices, whose pseudonym is whose, what was stored, and dead
// letters; all on JetStream. It knows neither rows nor the database.
#pragma once

#include <chrono>
#include <cstdint>
#include <expected>
#include <map>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace kesto_ingest {

// A batch in the hands of this program. The stream gives it to another copy if it is neither acknowledged nor told that
// work goes on.
struct Delivery {
    std::string subject;
    std::string edition; // of its format, by its header
    std::string_view payload; // as long as `message` lives
    std::uint64_t sequence = 0; // in the stream
    bool isRepeated = false;
    std::shared_ptr<void> message;
};

struct Entry {
    std::string payload;
    std::uint64_t sequence = 0; // in its stream
};

// A message that is published if the last one of its subject is that one.
struct Put {
    std::string subject;
    std::string payload;
    std::uint64_t after = 0; // the sequence of the last; 0: there is none
};
using PutAnswer = std::optional<std::uint64_t>; // the sequence of the new one; none: the last is another

enum class Publication : std::uint8_t {
    Taken,
    TooLarge // for the stream or a server; it would be again
};

using Headers = std::map<std::string, std::string>;

// One thread. Errors are for a person.
class Stream {
public:
    Stream() = default;
    virtual ~Stream() = default;
    Stream(const Stream&) = delete;
    Stream& operator=(const Stream&) = delete;

    // At most so many batches, oldest first; none if none came in that time.
    [[nodiscard]] virtual std::expected<std::vector<Delivery>, std::string> fetch(std::size_t most,
                                                                                  std::chrono::milliseconds wait) = 0;
    // What of these three is lost on its way comes again.
    virtual void acknowledge(const Delivery& delivery) = 0;
    virtual void workGoesOn(const Delivery& delivery) = 0;
    virtual void giveBack(const Delivery& delivery) = 0; // it comes again soon, perhaps to another copy

    // The last message of a subject, also one that another copy has just put there.
    [[nodiscard]] virtual std::expected<std::optional<Entry>, std::string> last(const std::string& subject) = 0;
    // Publishes each, without waiting for the one before. The error says that some may not be there.
    [[nodiscard]] virtual std::expected<std::vector<PutAnswer>, std::string> put(std::span<const Put> puts) = 0;
    [[nodiscard]] virtual std::expected<Publication, std::string>
    publish(const std::string& subject, std::string_view payload, const Headers& headers) = 0;
};

} // namespace kesto_ingest
