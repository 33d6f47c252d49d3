// SPDX-License-Identifier: Apache-2.0
// The checks that every frame passes before the connection looks for a call in it.
#include "platform/linux/connection/ConnectionInput.h"

#include <fmt/format.h>
#include <utility>

namespace platform {

std::expected<std::optional<ConnectionInput::Frame>, ConnectionInput::Refusal> ConnectionInput::next()
{
    using enum ledger::Counter;
    const auto frame = reader_.next();
    if (!frame)
        return std::unexpected(Refusal{fmt::format("a frame is longer than {} bytes", longestFrame), FramesTooLong});
    if (!*frame)
        return std::nullopt;
    const auto value = decoder_.decode(**frame);
    if (!value)
        return std::unexpected(Refusal{std::string(foundation::description(value.error())), FramesNotCbor});
    auto array = value->array();
    if (!array)
        return std::unexpected(Refusal{"a frame is not an array", FramesNotCbor});
    return Frame{*std::move(array), (*frame)->size(), decoder_.mostMemory()};
}

} // namespace platform
