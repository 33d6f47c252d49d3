// SPDX-License-Identifier: Apache-2.0
// Decimal text of a number with a bounded count of fraction digits, for people and for bucket names.
#pragma once

#include <string>

namespace foundation {

// The number in fixed notation, rounded half to even to `maximumFractionDigits`. Trailing zeros are dropped down to
// `minimumFractionDigits`, or to the maximum if that is smaller. The separator is "." in every locale. Any thread.
[[nodiscard]] std::string formatDecimal(double number, unsigned minimumFractionDigits, unsigned maximumFractionDigits);

} // namespace foundation
