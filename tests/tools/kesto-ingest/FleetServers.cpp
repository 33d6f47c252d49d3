// SPDX-License-Identifier: Apache-2.0
// The scripts of packaging/fleet start the servers; their processes become the servers.
#include "tools/kesto-ingest/FleetServers.h"

#include "kesto-ingest/database/Tables.h"
#include "platform/linux/files/FileDescriptor.h"

#include <curl/curl.h>
#include <gtest/gtest.h>

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <csignal>
#include <cstdlib>
#include <stdexcept>
#include <thread>
#include <utility>

namespace kesto_ingest {

namespace {

std::unique_ptr<sdk_test::Process> startScript(sdk_test::Process::Arguments arguments)
{
    arguments.insert(arguments.begin(), {"setpriv", "--pdeathsig", "KILL"});
    arguments[3] = std::string(KESTO_FLEET) + "/" + arguments[3];
    return std::make_unique<sdk_test::Process>(arguments);
}

bool takesConnections(std::uint16_t port)
{
    const platform::FileDescriptor tried(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(port);
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    return ::connect(tried.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}

} // namespace

std::uint16_t freePort()
{
    const platform::FileDescriptor made(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t size = sizeof address;
    if (::bind(made.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0
        || ::getsockname(made.get(), reinterpret_cast<sockaddr*>(&address), &size) != 0)
        throw std::runtime_error("no free port");
    return ntohs(address.sin_port);
}

std::string ask(const std::string& address, const std::string& body)
{
    const std::unique_ptr<CURL, decltype(&curl_easy_cleanup)> handle(curl_easy_init(), curl_easy_cleanup);
    std::string text;
    const auto keep = +[](char* bytes, std::size_t, std::size_t count, void* kept) {
        static_cast<std::string*>(kept)->append(bytes, count);
        return count;
    };
    curl_easy_setopt(handle.get(), CURLOPT_URL, address.c_str());
    curl_easy_setopt(handle.get(), CURLOPT_NOPROXY, "*");
    curl_easy_setopt(handle.get(), CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(handle.get(), CURLOPT_TIMEOUT, 20L);
    curl_easy_setopt(handle.get(), CURLOPT_WRITEFUNCTION, keep);
    curl_easy_setopt(handle.get(), CURLOPT_WRITEDATA, &text);
    if (!body.empty()) {
        curl_easy_setopt(handle.get(), CURLOPT_POSTFIELDS, body.c_str());
        curl_easy_setopt(handle.get(), CURLOPT_POSTFIELDSIZE, static_cast<long>(body.size()));
    }
    return curl_easy_perform(handle.get()) == CURLE_OK ? text : "";
}

void waitUntil(const std::string& what, const std::function<bool()>& holds)
{
    constexpr std::chrono::milliseconds step{20};
    constexpr std::chrono::seconds longest{30};
    const auto end = std::chrono::steady_clock::now() + longest;
    while (!holds()) {
        ASSERT_LT(std::chrono::steady_clock::now(), end) << what;
        std::this_thread::sleep_for(step);
    }
}

NatsServer::NatsServer(const std::filesystem::path& directory)
    : process_(
          startScript({"start-nats", directory, std::to_string(port_), std::string(KESTO_FLEET) + "/accounts.conf"}))
{
    waitUntil("nats-server takes connections", [this] { return takesConnections(port_); });
}

ClickHouseServer::ClickHouseServer(std::filesystem::path directory) : directory_(std::move(directory))
{
    start();
}

void ClickHouseServer::start()
{
    process_ = startScript({"start-clickhouse", directory_, std::to_string(port_), std::to_string(tcpPort_)});
    waitUntil("ClickHouse answers", [this] { return ask(address()) == "Ok.\n"; });
}

void ClickHouseServer::end()
{
    process_.reset();
}

void ClickHouseServer::makeTables() const
{
    std::string statement;
    for (const char character : tablesSql("kesto", "")) {
        statement += character;
        if (character == ';') {
            statement.pop_back();
            EXPECT_EQ(ask(address() + "/", statement), "");
            statement.clear();
        }
    }
}

std::string ClickHouseServer::select(const std::string& query) const
{
    std::string text = ask(address() + "/?database=kesto", query);
    if (text.ends_with('\n'))
        text.pop_back();
    return text;
}

} // namespace kesto_ingest
