// SPDX-License-Identifier: Apache-2.0
// Notifications to the service manager that started the service.
#pragma once

#include <string>

namespace platform {

// Reports that the service now takes connections, with one line about its status for people. Does nothing without a
// service manager. Any thread.
void notifyReady(const std::string& status);
// Reports that the service ends. The same.
void notifyStopping(const std::string& status);
// Replaces that line. The same.
void notifyStatus(const std::string& status);
// Whether a service manager wants to be notified. The same.
[[nodiscard]] bool hasServiceManager();

} // namespace platform
