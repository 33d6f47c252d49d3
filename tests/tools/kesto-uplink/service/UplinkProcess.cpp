// SPDX-License-Identifier: Apache-2.0
// The process ends with the test, even if the test is killed.
#include "tools/kesto-uplink/service/UplinkProcess.h"

#include <csignal>
#include <cstdio>
#include <fcntl.h>
#include <fmt/format.h>
#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>

namespace uplink_test {

UplinkProcess::UplinkProcess(std::filesystem::path database, const std::string& server) : database_(std::move(database))
{
    writeCredentials("name = \"alpha\"\npassword = \"secret\"\nplain = true\n");
    writeConfiguration(
        fmt::format("enabled = true\nservers = [\"{}\"]\ncredentials = \"{}\"\ninterval = 0.2\nforget = \"queued\"\n"
                    "[events.\"*\"]\nnumber = \"keep\"\n",
                    server, (directory_ / "credentials.toml").native()));
}

UplinkProcess::~UplinkProcess()
{
    if (process_ > 0) {
        signal(SIGKILL);
        static_cast<void>(exitStatus());
    }
    if (testing::Test::HasFailure())
        std::fprintf(stderr, "--- log of the uplink:\n%s", log().c_str());
}

void UplinkProcess::writeConfiguration(const std::string& text) const
{
    support::writeFile(directory_ / "uplink.toml", text);
}

void UplinkProcess::writeCredentials(const std::string& text) const
{
    support::writeFile(directory_ / "credentials.toml", text);
    std::filesystem::permissions(directory_ / "credentials.toml", std::filesystem::perms(0600));
}

void UplinkProcess::start()
{
    const std::string configuration = directory_ / "uplink.toml";
    const std::string logFile = directory_ / "log";
    process_ = ::fork();
    if (process_ == 0) {
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        ::dup2(::open(logFile.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600), STDERR_FILENO);
        ::execl(KESTO_UPLINK_PATH, "kesto-uplink", "run", "--configuration", configuration.c_str(), "--database",
                database_.c_str(), "--state", directory_.path().c_str(), nullptr);
        ::_exit(127);
    }
}

void UplinkProcess::signal(int number) const
{
    ::kill(process_, number);
}

int UplinkProcess::exitStatus()
{
    int status = 0;
    ::waitpid(process_, &status, 0);
    process_ = 0;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

std::string UplinkProcess::log() const
{
    return support::readFile(directory_ / "log");
}

} // namespace uplink_test
