// The status for a person at a terminal.
#pragma once

#include "foundation/values/Value.h"

#include <cstddef>
#include <string>

// Tables of what the service counted, cut to the width.
[[nodiscard]] std::string statusText(const foundation::Dictionary& report, std::size_t width);
