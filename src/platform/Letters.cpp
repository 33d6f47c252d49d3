// SPDX-License-Identifier: Apache-2.0
// How the letters of a turn become one for each connection.
#include "platform/Letters.h"

#include "platform/Connection.h"

#include <unordered_map>
#include <utility>

namespace platform {

// One letter of all those for the same connection, in their order.
std::vector<Letters::Letter> Letters::merged(std::vector<Letter> letters)
{
    std::vector<Letter> result;
    std::unordered_map<const Connection*, std::size_t> places;
    for (Letter& letter : letters) {
        const auto [place, isFirst] = places.try_emplace(letter.connection.get(), result.size());
        if (isFirst)
            result.push_back(std::move(letter));
        else
            result[place->second].frames += letter.frames;
    }
    return result;
}

std::move_only_function<void()> Letters::take()
{
    if (letters_.empty())
        return nullptr;
    std::vector<Letter> taken = std::exchange(letters_, {});
    if (taken.size() > 1)
        taken = merged(std::move(taken));
    return [letters = std::move(taken)]() mutable {
        for (Letter& letter : letters)
            letter.connection->write(std::move(letter.frames));
    };
}

} // namespace platform
