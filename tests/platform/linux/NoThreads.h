// SPDX-License-Identifier: Apache-2.0
// A process that gets no more threads as long as this object exists: each would have a stack larger than all memory.
#pragma once

#include <cstddef>
#include <limits>
#include <pthread.h>
#include <stdexcept>

namespace support {

class NoThreads {
public:
    NoThreads()
    {
        pthread_attr_t huge;
        ::pthread_attr_init(&huge);
        const bool isSet = ::pthread_getattr_default_np(&usual_) == 0
            && ::pthread_attr_setstacksize(&huge, std::numeric_limits<std::size_t>::max() / 8 * 7) == 0
            && ::pthread_setattr_default_np(&huge) == 0;
        ::pthread_attr_destroy(&huge);
        if (!isSet)
            throw std::runtime_error("the default size of stacks cannot be set");
    }
    ~NoThreads()
    {
        ::pthread_setattr_default_np(&usual_);
        ::pthread_attr_destroy(&usual_);
    }
    NoThreads(const NoThreads&) = delete;
    NoThreads& operator=(const NoThreads&) = delete;

private:
    pthread_attr_t usual_{};
};

} // namespace support
