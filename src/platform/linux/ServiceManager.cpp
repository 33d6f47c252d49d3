#include "platform/linux/ServiceManager.h"

#include <systemd/sd-daemon.h>

namespace platform {

// A notification that does not arrive harms nobody but the service manager, which has time-outs of its own.

void notifyReady(const std::string& status)
{
    ::sd_notifyf(0, "READY=1\nSTATUS=%s", status.c_str());
}

void notifyStatus(const std::string& status)
{
    ::sd_notifyf(0, "STATUS=%s", status.c_str());
}

} // namespace platform
