// SPDX-License-Identifier: Apache-2.0
// Values that RapidCheck makes: of every kind, nested, with keys that repeat and text of all lengths of UTF-8.
#pragma once

#include "foundation/values/Value.h"
#include "support/PrintValues.h"

#include <rapidcheck.h>
#include <string>

namespace generated {

rc::Gen<std::string> text();
rc::Gen<foundation::String> key(); // one of a few, so that keys repeat
rc::Gen<foundation::Number> number(); // never NaN, which does not equal even its own copy
rc::Gen<foundation::Value> scalar();
rc::Gen<foundation::Value> value(int depth = 3);
rc::Gen<foundation::Dictionary::Entries> entries(int depth = 2);

} // namespace generated
