// SPDX-License-Identifier: Apache-2.0
// What NetworkManager says, on a bus of the test's own: it stands in for NetworkManager, with the one property that
// counts.
#include "kesto-uplink/rounds/Metered.h"
#include "support/EnvironmentVariable.h"
#include "support/TemporaryDirectory.h"

#include <atomic>
#include <chrono>
#include <csignal>
#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <systemd/sd-bus.h>
#include <thread>
#include <unistd.h>

namespace uplink_test {
namespace {

using kesto_uplink::Metered;
using kesto_uplink::networkIsMetered;

class SystemBus {
public:
    SystemBus() : address_("unix:path=" + (directory_ / "bus").native()), variable_("DBUS_SYSTEM_BUS_ADDRESS", address_)
    {
        process_ = ::fork();
        if (process_ == 0) {
            ::prctl(PR_SET_PDEATHSIG, SIGKILL);
            ::execlp("dbus-daemon", "dbus-daemon", "--session", "--nofork", "--nopidfile", "--address",
                     address_.c_str(), nullptr);
            ::_exit(127);
        }
        for (int attempt = 0; attempt < 6000 && !isOpen(); ++attempt)
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    ~SystemBus()
    {
        ::kill(process_, SIGKILL);
        ::waitpid(process_, nullptr, 0);
    }
    SystemBus(const SystemBus&) = delete;
    SystemBus& operator=(const SystemBus&) = delete;

private:
    // The socket's file is there before the bus listens.
    static bool isOpen()
    {
        sd_bus* bus = nullptr;
        const bool isOpen = sd_bus_open_system(&bus) >= 0;
        sd_bus_close_unref(bus);
        return isOpen;
    }

    support::TemporaryDirectory directory_;
    std::string address_;
    support::EnvironmentVariable variable_;
    pid_t process_ = 0;
};

class NetworkManager {
public:
    explicit NetworkManager(std::uint32_t metered) : metered_(metered)
    {
        static const sd_bus_vtable table[] = {SD_BUS_VTABLE_START(0), SD_BUS_PROPERTY("Metered", "u", nullptr, 0, 0),
                                              SD_BUS_VTABLE_END};
        EXPECT_GE(sd_bus_open_system(&bus_), 0);
        EXPECT_GE(sd_bus_add_object_vtable(bus_, nullptr, "/org/freedesktop/NetworkManager",
                                           "org.freedesktop.NetworkManager", table, &metered_),
                  0);
        EXPECT_GE(sd_bus_request_name(bus_, "org.freedesktop.NetworkManager", 0), 0);
        thread_ = std::thread([this] {
            constexpr std::uint64_t turn = 10'000; // microseconds, after which it looks whether it ends
            while (!ends_) {
                while (sd_bus_process(bus_, nullptr) > 0) { }
                sd_bus_wait(bus_, turn);
            }
        });
    }
    ~NetworkManager()
    {
        ends_ = true;
        thread_.join();
        sd_bus_flush_close_unref(bus_);
    }
    NetworkManager(const NetworkManager&) = delete;
    NetworkManager& operator=(const NetworkManager&) = delete;

private:
    std::uint32_t metered_;
    sd_bus* bus_ = nullptr;
    std::atomic<bool> ends_ = false;
    std::thread thread_;
};

TEST(NetworkIsMetered, NetworkManagerKnowsOrGuesses)
{
    const SystemBus bus;
    const std::pair<std::uint32_t, Metered> answers[] = {
        {0, Metered::Unknown}, {1, Metered::Yes}, {2, Metered::No}, {3, Metered::Yes}, {4, Metered::No}};
    for (const auto& [said, meant] : answers) {
        const NetworkManager manager(said);
        EXPECT_EQ(networkIsMetered(), meant) << said;
    }
}

TEST(NetworkIsMetered, withoutNetworkManagerOrWithoutABusItIsUnknown)
{
    {
        const SystemBus bus;
        EXPECT_EQ(networkIsMetered(), Metered::Unknown);
    }
    const support::EnvironmentVariable nowhere("DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/nowhere");
    EXPECT_EQ(networkIsMetered(), Metered::Unknown);
}

} // namespace
} // namespace uplink_test
