// SPDX-License-Identifier: Apache-2.0
// A user's place passes from call to call without being free in between, so that the calls keep their order.
#include "client/LongCalls.h"

#include "utility/ServerQueue.h"

#include <utility>

namespace client {

void LongCalls::begin(platform::Turn& turn, std::uint32_t user, platform::Lane& lane, Work work)
{
    utility::assertServerQueue();
    const auto [found, isFree] = users_.try_emplace(user);
    if (isFree)
        work(turn, placeOf(user));
    else
        found->second.push_back({lane.pause(), std::move(work)});
}

LongCalls::Place LongCalls::placeOf(std::uint32_t user)
{
    return {nullptr, [self = shared_from_this(), user](const void*) { self->leave(user); }};
}

void LongCalls::leave(std::uint32_t user)
{
    const auto found = users_.find(user);
    if (found->second.empty()) {
        users_.erase(found);
        return;
    }
    Waiting next = std::move(found->second.front());
    found->second.pop_front();
    next.resume([work = std::move(next.work), place = placeOf(user)](platform::Turn& turn) mutable {
        work(turn, std::move(place));
    });
}

} // namespace client
