// SPDX-License-Identifier: Apache-2.0
// Failures show values as their text, not as their bytes.
#pragma once

#include "foundation/values/Value.h"

#include <ostream>

namespace foundation {

inline void PrintTo(const Value& value, std::ostream* out)
{
    *out << value.text();
}
inline void PrintTo(const Array& array, std::ostream* out)
{
    *out << Value(array).text();
}
inline void PrintTo(const Dictionary& dictionary, std::ostream* out)
{
    *out << Value(dictionary).text();
}

// The same for values that RapidCheck found.
inline void showValue(const Value& value, std::ostream& out)
{
    PrintTo(value, &out);
}
inline void showValue(const Array& array, std::ostream& out)
{
    PrintTo(array, &out);
}
inline void showValue(const Dictionary& dictionary, std::ostream& out)
{
    PrintTo(dictionary, &out);
}

} // namespace foundation
