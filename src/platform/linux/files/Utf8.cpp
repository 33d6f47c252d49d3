// Slow and simple, character by character: it is done only for text that was found not to be UTF-8.
#include "platform/linux/files/Utf8.h"

#include "foundation/values/String.h"

#include <algorithm>

namespace platform {
namespace {

std::size_t lengthOfFirstCharacter(std::string_view text)
{
    for (std::size_t length = 1; length <= std::min<std::size_t>(4, text.size()); ++length)
        if (foundation::isValidUtf8(text.substr(0, length)))
            return length;
    return 0;
}

} // namespace

void replaceWhatIsNotUtf8(std::string& text)
{
    if (foundation::isValidUtf8(text))
        return;
    for (std::size_t at = 0; at < text.size();) {
        const std::size_t length = lengthOfFirstCharacter(std::string_view(text).substr(at));
        if (length == 0)
            text[at] = '?';
        at += std::max<std::size_t>(1, length);
    }
}

} // namespace platform
