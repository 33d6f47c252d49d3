// SPDX-License-Identifier: Apache-2.0
// A build without systemd: no service manager wants to be notified.
#include "platform/linux/process/ServiceManager.h"

namespace platform {

void notifyReady(const std::string&) { }
void notifyStopping(const std::string&) { }
void notifyStatus(const std::string&) { }

bool hasServiceManager()
{
    return false;
}

} // namespace platform
