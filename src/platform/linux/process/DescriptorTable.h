// SPDX-License-Identifier: Apache-2.0
// The kernel's table of this process's descriptors. The kernel doubles it when the next descriptor does not fit. In a
// process with several threads it waits for all processors meanwhile, 10 ms and more under load, and every thread that
// opens a descriptor waits with it. So a service whose clients come by the thousand makes the table large at its start.
#pragma once

#include <cstddef>

namespace platform {

// Makes the table large enough for so many descriptors, or for as many as the process may have. It takes 8 bytes of the
// kernel's memory for each. Before the first thread is started. If the system has no memory for it, the table grows
// later.
void reserveDescriptors(std::size_t count);

} // namespace platform
