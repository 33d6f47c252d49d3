// What the service tells the service manager that started it.
#pragma once

#include <string>

namespace platform {

// That the service now takes connections, and one line for people who ask how it is. Nothing happens where no
// service manager wants to know. Any thread.
void notifyReady(const std::string& status);

} // namespace platform
