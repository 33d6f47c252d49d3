// Cut first, between characters, and then looked at: a character that the cut had halved would make all of the text
// foreign.
#include "kesto-pipewire/Text.h"

#include "foundation/values/String.h"

#include <algorithm>

namespace kesto_pipewire {

namespace {

bool continuesCharacter(char byte)
{
    return (static_cast<unsigned char>(byte) & 0xC0) == 0x80;
}

} // namespace

std::string tidyText(std::string_view text, std::size_t maximumBytes)
{
    if (text.size() > maximumBytes) {
        auto end = maximumBytes;
        while (end > 0 && continuesCharacter(text[end]))
            --end;
        text = text.substr(0, end);
    }
    std::string tidy(text);
    if (!foundation::isValidUtf8(tidy))
        std::ranges::replace_if(tidy, [](char byte) { return static_cast<unsigned char>(byte) >= 0x80; }, '?');
    return tidy;
}

} // namespace kesto_pipewire
