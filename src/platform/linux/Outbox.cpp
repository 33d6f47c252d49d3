#include "platform/linux/Outbox.h"

#include "platform/linux/FrameReader.h"
#include "platform/linux/LinuxConnection.h"

#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

namespace platform {
namespace {

// All that a turn has for one connection.
struct Letter {
    std::shared_ptr<LinuxConnection> connection;
    std::string frames;
};

struct Turn {
    std::vector<Letter> letters;
    std::unordered_map<const LinuxConnection*, std::size_t> places; // of the connections' letters
};

thread_local Turn turn;

Letter& letterTo(std::shared_ptr<LinuxConnection> connection)
{
    const auto [place, isNew] = turn.places.try_emplace(connection.get(), turn.letters.size());
    if (isNew)
        turn.letters.push_back({std::move(connection), {}});
    return turn.letters[place->second];
}

} // namespace

void Outbox::gather(std::shared_ptr<LinuxConnection> connection, std::string_view frame)
{
    appendFrame(frame, letterTo(std::move(connection)).frames);
}

WorkItem Outbox::endTurn()
{
    if (turn.letters.empty())
        return nullptr;
    turn.places.clear();
    return [letters = std::exchange(turn.letters, {})]() mutable {
        for (Letter& letter : letters)
            letter.connection->write(std::move(letter.frames));
        letters.clear();
    };
}

} // namespace platform
