// Values that RapidCheck makes up: of every kind, nested, with keys that repeat and text of all lengths of UTF-8.
#pragma once

#include "foundation/values/Value.h"
#include "support/PrintValues.h"

#include <rapidcheck.h>
#include <string>

namespace generated {

rc::Gen<std::string> text();
rc::Gen<foundation::String> key(); // few different ones, so that they repeat
rc::Gen<foundation::Number> number(); // finite ones only: what is not a number equals nothing, not even its own copy
rc::Gen<foundation::Value> scalar();
rc::Gen<foundation::Value> value(int depth = 3);
rc::Gen<foundation::Dictionary::Entries> entries(int depth = 2);

} // namespace generated
