// SPDX-License-Identifier: Apache-2.0
// The daemon counts as running when its socket answers; its output is not read.
#include "peers/DaemonPeer.h"

#include "support/Harness.h"

#include <fmt/format.h>
#include <stdexcept>
#include <thread>

namespace bench {
namespace {
constexpr const char* program = "/usr/bin/dbus-daemon";
}

bool DaemonPeer::isInstalled()
{
    return std::filesystem::exists(program);
}

DaemonPeer::DaemonPeer()
    : process_(ChildProcess::execute({program, "--session", "--nofork", "--nopidfile",
                                      fmt::format("--address=unix:path={}", (directory_.path() / "bus").native())},
                                     {}, directory_.path() / "log"))
{
}

Bus DaemonPeer::connect() const
{
    constexpr std::chrono::microseconds pause(50);
    constexpr std::chrono::seconds patience(10);
    for (const auto start = Clock::now(); Clock::now() - start < patience; std::this_thread::sleep_for(pause))
        if (std::filesystem::exists(directory_.path() / "bus"))
            if (auto bus = connectToBus(directory_.path() / "bus"))
                return bus;
    throw std::runtime_error("dbus-daemon does not run");
}

platform::FileDescriptor DaemonPeer::connectSocket() const
{
    auto socket = connectTo(directory_.path() / "bus");
    if (!socket)
        throw std::runtime_error("dbus-daemon does not take another client");
    joinBus(socket.get());
    return socket;
}

} // namespace bench
