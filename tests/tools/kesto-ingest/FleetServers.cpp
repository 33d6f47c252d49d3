// SPDX-License-Identifier: Apache-2.0
// The scripts of packaging/fleet start the servers; their processes become the servers.
#include "tools/kesto-ingest/FleetServers.h"

#include "kesto-ingest/database/Tables.h"
#include "platform/linux/files/FileDescriptor.h"

#include <curl/curl.h>
#include <fmt/format.h>
#include <fmt/ranges.h>

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

bool takesConnections(std::uint16_t port)
{
    const platform::FileDescriptor made(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const sockaddr_in address = support::loopback(port);
    return ::connect(made.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}

void awaitStart(const sdk_test::Process& process, const std::string& name, const std::filesystem::path& output,
                const std::function<bool()>& isReady)
{
    waitUntil(name + " answers", [&] {
        if (hasEnded(process))
            throw std::runtime_error(name + " does not start: " + support::readFile(output) + process.errors());
        return isReady();
    });
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
    constexpr std::chrono::seconds longest{240};
    const auto end = std::chrono::steady_clock::now() + longest;
    while (!holds()) {
        if (std::chrono::steady_clock::now() >= end)
            throw std::runtime_error("it takes too long until " + what);
        std::this_thread::sleep_for(step);
    }
}

NatsServer::NatsServer(const std::filesystem::path& directory)
    : NatsServer(directory, std::filesystem::path(KESTO_FLEET) / "accounts.conf")
{
}

NatsServer::NatsServer(std::filesystem::path directory, std::filesystem::path accounts, std::uint16_t clusterPort,
                       std::vector<std::uint16_t> routes)
    : directory_(std::move(directory)),
      accounts_(std::move(accounts)),
      clusterPort_(clusterPort),
      routes_(std::move(routes))
{
    start();
}

void NatsServer::start()
{
    sdk_test::Process::Arguments arguments{"start-nats", directory_, std::to_string(port_.number()), accounts_};
    if (clusterPort_ != 0) {
        arguments.push_back(std::to_string(clusterPort_));
        arguments.push_back(fmt::format("{}", fmt::join(routes_, ",")));
    }
    process_ = startScript(arguments);
    awaitStart(*process_, "nats-server", directory_ / "output", [this] { return takesConnections(port_.number()); });
}

void NatsServer::end()
{
    process_.reset();
}

ZooKeeperServer::ZooKeeperServer(const std::filesystem::path& directory)
    : process_(startScript({"start-zookeeper", directory, std::to_string(port_.number())}))
{
    awaitStart(*process_, "ZooKeeper", directory / "output", [this] { return takesConnections(port_.number()); });
}

ClickHouseServer::ClickHouseServer(std::filesystem::path directory)
    : directory_(std::move(directory)),
      arguments_{"start-clickhouse", directory_, std::to_string(port()), std::to_string(ownTCPPort_.number())}
{
    start();
}

ClickHouseServer::ClickHouseServer(std::filesystem::path directory, std::uint16_t tcpPort, const Membership& membership)
    : directory_(std::move(directory)),
      arguments_{"start-clickhouse",
                 directory_,
                 std::to_string(port()),
                 std::to_string(tcpPort),
                 std::to_string(interserverPort_.number()),
                 membership.zookeeper,
                 std::to_string(membership.shard),
                 std::to_string(membership.replica),
                 membership.cluster}
{
    start();
}

void ClickHouseServer::start()
{
    std::filesystem::create_directories(directory_);
    process_ = startScript(arguments_);
    awaitStart(*process_, "ClickHouse", directory_ / "errors", [this] { return isReady(); });
}

bool ClickHouseServer::isReady() const
{
    return ask(address() + "/", "SELECT data_path FROM system.databases WHERE name = 'default'")
        .starts_with(std::filesystem::canonical(directory_).native() + "/");
}

void ClickHouseServer::end()
{
    process_.reset();
}

void ClickHouseServer::makeTables(const std::string& cluster) const
{
    std::string statement;
    for (const char character : tablesSql("kesto", cluster)) {
        statement += character;
        if (character == ';') {
            statement.pop_back();
            const std::string answer = ask(address() + "/", statement);
            if (answer.contains("Exception") || answer.starts_with("no answer"))
                throw std::runtime_error("ClickHouse does not make the tables: " + answer);
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
