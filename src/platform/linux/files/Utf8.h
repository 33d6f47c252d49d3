// Bytes from outside as text: processes and devices name themselves as they like, and what is kept has a length.
#pragma once

#include "foundation/values/String.h"

#include <string>

namespace platform {

// Writes a "?" in the place of each byte that is not part of a UTF-8 character. Any thread.
void replaceWhatIsNotUtf8(std::string& text);

using foundation::cutBetweenCharacters;

} // namespace platform
