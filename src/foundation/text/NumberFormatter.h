// Decimal text of a number with a bounded count of fraction digits, for people and for bucket names.
#pragma once

#include <string>

namespace foundation {

// The number in fixed notation, rounded half to even to `maximumFractionDigits`, its trailing zeros
// dropped down to `minimumFractionDigits` or, where that is less, to the maximum; "." whatever the locale. Any thread.
[[nodiscard]] std::string formatDecimal(double number, unsigned minimumFractionDigits, unsigned maximumFractionDigits);

} // namespace foundation
