// SPDX-License-Identifier: Apache-2.0
// The text is cut first, so that a character which the cut halves becomes "?" as well.
#include "kesto-pipewire/ValidText.h"

#include "foundation/values/String.h"

namespace kesto_pipewire {

std::string tidyText(std::string_view text, std::size_t maximumBytes)
{
    std::string tidy(foundation::cutBetweenCharacters(text, maximumBytes));
    foundation::replaceWhatIsNotUtf8(tidy);
    return tidy;
}

} // namespace kesto_pipewire
