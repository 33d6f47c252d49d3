// A list a thread: a turn runs on one thread, so what it sends is gathered without a lock.
#include "platform/linux/connection/Outbox.h"

#include "platform/linux/connection/FrameReader.h"
#include "platform/linux/connection/LinuxConnection.h"

#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

namespace platform {
namespace {

// Frames, with their heads, for one connection.
struct Letter {
    std::shared_ptr<LinuxConnection> connection;
    std::string frames;
};

using Letters = std::vector<Letter>;

thread_local Letters gathered; // one answer after the other for the same connection makes one letter already

// One letter of all those for the same connection, in their order.
Letters merged(Letters letters)
{
    Letters result;
    std::unordered_map<const LinuxConnection*, std::size_t> places;
    for (Letter& letter : letters) {
        const auto [place, isFirst] = places.try_emplace(letter.connection.get(), result.size());
        if (isFirst)
            result.push_back(std::move(letter));
        else
            result[place->second].frames += letter.frames;
    }
    return result;
}

} // namespace

void Outbox::gather(LinuxConnection& connection, std::string_view frame)
{
    if (gathered.empty() || gathered.back().connection.get() != &connection)
        gathered.push_back({connection.shared_from_this(), {}});
    appendFrame(frame, gathered.back().frames);
}

WorkItem Outbox::endTurn()
{
    if (gathered.empty())
        return nullptr;
    Letters turn = std::exchange(gathered, {});
    if (turn.size() > 1)
        turn = merged(std::move(turn));
    return [letters = std::move(turn)]() mutable {
        for (Letter& letter : letters)
            letter.connection->write(std::move(letter.frames));
    };
}

} // namespace platform
