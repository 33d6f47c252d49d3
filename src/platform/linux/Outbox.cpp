#include "platform/linux/Outbox.h"

#include "platform/linux/FrameReader.h"
#include "platform/linux/LinuxConnection.h"

#include <algorithm>
#include <string>
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

// Makes one letter of those for the same connection.
void merge(Letters& letters)
{
    std::ranges::stable_sort(letters, {}, [](const Letter& letter) { return letter.connection.get(); });
    auto last = letters.begin();
    for (auto letter = last + 1; letter != letters.end(); ++letter) {
        if (letter->connection == last->connection)
            last->frames += letter->frames;
        else
            *++last = std::move(*letter);
    }
    letters.erase(last + 1, letters.end());
}

} // namespace

void Outbox::gather(std::shared_ptr<LinuxConnection> connection, std::string_view frame)
{
    if (gathered.empty() || gathered.back().connection != connection)
        gathered.push_back({std::move(connection), {}});
    appendFrame(frame, gathered.back().frames);
}

WorkItem Outbox::endTurn()
{
    if (gathered.empty())
        return nullptr;
    if (gathered.size() > 1)
        merge(gathered);
    return [letters = std::exchange(gathered, {})]() mutable {
        for (Letter& letter : letters)
            letter.connection->write(std::move(letter.frames));
        letters.clear();
    };
}

} // namespace platform
