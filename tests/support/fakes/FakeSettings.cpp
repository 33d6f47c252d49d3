// SPDX-License-Identifier: Apache-2.0
// A process's name is cut and cleaned as by the kernel and the real provider.
#include "support/fakes/FakeSettings.h"

#include "foundation/values/String.h"

namespace support {

void FakeProcessTable::add(std::int32_t processIdentifier, std::string name)
{
    constexpr std::size_t longestName = 15;
    name.resize(std::min(name.size(), longestName));
    foundation::replaceWhatIsNotUtf8(name);
    names_.insert_or_assign(processIdentifier, std::move(name));
}

} // namespace support
