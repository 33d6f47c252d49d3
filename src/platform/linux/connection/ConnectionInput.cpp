// The checks that every frame passes before the connection looks for a call in it.
#include "platform/linux/connection/ConnectionInput.h"

#include <fmt/format.h>
#include <string>
#include <utility>

namespace platform {

std::expected<std::optional<ConnectionInput::Frame>, Connection::Violation> ConnectionInput::next()
{
    using Violation = Connection::Violation;
    const auto frame = reader_.next();
    if (!frame)
        return std::unexpected(Violation{fmt::format("a frame is longer than {} bytes", longestFrame)});
    if (!*frame)
        return std::nullopt;
    const auto value = decoder_.decode(**frame);
    if (!value)
        return std::unexpected(Violation{std::string(foundation::description(value.error()))});
    auto array = value->array();
    if (!array)
        return std::unexpected(Violation{"a frame is not an array"});
    return Frame{*std::move(array), (*frame)->size()};
}

} // namespace platform
