// SPDX-License-Identifier: Apache-2.0
// Failures are ignored: a lost notification affects only the service manager, which has time-outs of its own.
#include "platform/linux/process/ServiceManager.h"

#include "platform/linux/process/Environment.h"

#include <systemd/sd-daemon.h>

namespace platform {

void notifyReady(const std::string& status)
{
    ::sd_notifyf(0, "READY=1\nSTATUS=%s", status.c_str());
}

void notifyStopping(const std::string& status)
{
    ::sd_notifyf(0, "STOPPING=1\nSTATUS=%s", status.c_str());
}

void notifyStatus(const std::string& status)
{
    ::sd_notifyf(0, "STATUS=%s", status.c_str());
}

bool hasServiceManager()
{
    return !environment("NOTIFY_SOCKET").empty();
}

} // namespace platform
