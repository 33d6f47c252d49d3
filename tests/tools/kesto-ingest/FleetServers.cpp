// SPDX-License-Identifier: Apache-2.0
// The scripts of packaging/fleet start the servers; their processes become the servers.
//
// nats-server chooses a free port itself. ClickHouse cannot: if another program was faster, it ends, and is started
// with other ports.
#include "tools/kesto-ingest/FleetServers.h"

#include "kesto-ingest/database/Tables.h"
#include "platform/linux/files/FileDescriptor.h"

#include <curl/curl.h>
#include <gtest/gtest.h>

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/wait.h>

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

bool hasEnded(const sdk_test::Process& process)
{
    siginfo_t ended{};
    ::waitid(P_PID, static_cast<id_t>(process.identifier()), &ended, WEXITED | WNOHANG | WNOWAIT);
    return ended.si_pid != 0;
}

// The kernel chooses a port of 127.0.0.1. Another program may take it before the server does.
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

} // namespace

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
    const CURLcode code = curl_easy_perform(handle.get());
    return code == CURLE_OK ? text : std::string("no answer: ") + curl_easy_strerror(code);
}

void waitUntil(const std::string& what, const std::function<bool()>& holds)
{
    constexpr std::chrono::milliseconds step{20};
    constexpr std::chrono::seconds longest{90};
    const auto end = std::chrono::steady_clock::now() + longest;
    while (!holds()) {
        if (std::chrono::steady_clock::now() >= end)
            throw std::runtime_error("it takes too long until " + what);
        std::this_thread::sleep_for(step);
    }
}

NatsServer::NatsServer(const std::filesystem::path& directory)
    : process_(startScript({"start-nats", directory, "-1", std::string(KESTO_FLEET) + "/accounts.conf"}))
{
    const auto file = directory / ("nats-server_" + std::to_string(process_->identifier()) + ".ports");
    constexpr std::string_view before = "127.0.0.1:";
    waitUntil("nats-server tells its port", [&] {
        if (hasEnded(*process_))
            throw std::runtime_error("nats-server does not start: " + support::readFile(directory / "output"));
        const std::string text = std::filesystem::exists(file) ? support::readFile(file) : "";
        const auto place = text.find(before);
        if (place == std::string::npos || !text.contains('}'))
            return false;
        port_ = static_cast<std::uint16_t>(std::stoi(text.substr(place + before.size())));
        return true;
    });
}

void NatsServer::end()
{
    process_.reset();
}

ClickHouseServer::ClickHouseServer(std::filesystem::path directory) : directory_(std::move(directory))
{
    std::filesystem::create_directories(directory_);
    start();
}

void ClickHouseServer::start()
{
    constexpr int mostAttempts = 5;
    for (int attempt = 0; attempt < mostAttempts; ++attempt) {
        port_ = freePort();
        process_ = startScript({"start-clickhouse", directory_, std::to_string(port_), std::to_string(freePort())});
        waitUntil("ClickHouse answers", [this] { return hasEnded(*process_) || isReady(); });
        if (!hasEnded(*process_))
            return;
    }
    throw std::runtime_error("ClickHouse does not start: " + support::readFile(directory_ / "errors"));
}

// Another server may have been faster to take the port.
bool ClickHouseServer::isReady() const
{
    return ask(address() + "/", "SELECT data_path FROM system.databases WHERE name = 'default'")
        .starts_with(std::filesystem::canonical(directory_).native() + "/");
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
