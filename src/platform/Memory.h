// The memory of the process, as the rest of the system sees it.
#pragma once

#include <cstddef>

namespace platform {

// Any thread.
class Memory {
public:
    virtual ~Memory() = default;
    // Reports that so many bytes which had gathered for clients are free. Once the sum is large, the system gets them
    // back some seconds later; until then the next session may use them.
    virtual void letGo(std::size_t bytes) = 0;
};

} // namespace platform
