// SPDX-License-Identifier: Apache-2.0
// The port of the metrics is any free one, which the copy names when it is ready.
#include "fleet/IngestCopy.h"

#include "support/TemporaryDirectory.h"
#include "tools/kesto-ingest/FleetServers.h"

#include <csignal>
#include <fmt/format.h>
#include <sstream>
#include <stdexcept>

namespace fleet {

namespace {

std::string configuration(const std::filesystem::path& directory, const std::string& user, const std::string& brokers,
                          const std::string& databases)
{
    std::filesystem::create_directories(directory);
    const auto secret = directory / (user + ".secret");
    support::writeFile(secret, fmt::format("user = \"{0}\"\npassword = \"{0}\"\n", user));
    std::filesystem::permissions(secret, std::filesystem::perms(0600));
    const auto file = directory / (user + ".toml");
    support::writeFile(file,
                       fmt::format("[stream]\nservers = {}\ncredentials = \"{}\"\n[database]\nservers = {}\n"
                                   "[batches]\nseconds = 0.2\n[metrics]\nport = 0\n",
                                   brokers, secret.native(), databases));
    return file;
}

} // namespace

void setUpStreams(const std::filesystem::path& directory, const std::string& brokers, int replicas,
                  int redeliverSeconds)
{
    const std::string file = configuration(directory, "admin", brokers, R"(["http://127.0.0.1:1"])"); // is not asked
    std::string errors;
    const auto isMade = [&] { // a cluster needs a moment for its first leader
        const auto setup = sdk_test::run({KESTO_INGEST_PATH, "setup", "--configuration", file, "--replicas",
                                          std::to_string(replicas), "--gigabytes", "1", "--dead-gigabytes", "0.1",
                                          "--redeliver-seconds", std::to_string(redeliverSeconds)});
        errors = setup.errors;
        return setup.status == 0;
    };
    try {
        kesto_ingest::waitUntil("the streams are made", isMade);
    } catch (const std::runtime_error& error) {
        throw std::runtime_error(error.what() + std::string("; kesto-ingest says: ") + errors);
    }
}

IngestCopy::IngestCopy(const std::filesystem::path& directory, const std::string& brokers, const std::string& databases)
    : process_(std::make_unique<sdk_test::Process>(
          sdk_test::Process::Arguments{"setpriv", "--pdeathsig", "KILL", KESTO_INGEST_PATH, "run", "--configuration",
                                       configuration(directory, "ingest", brokers, databases)}))
{
    const std::string before = "ready; metrics on ";
    kesto_ingest::waitUntil("kesto-ingest is ready", [this] { return log().contains("/metrics\n"); });
    const std::string lines = log();
    const std::size_t place = lines.find(before) + before.size();
    metricsAddress_ = lines.substr(place, lines.find('\n', place) - place);
}

void IngestCopy::kill()
{
    process_.reset();
}

void IngestCopy::end()
{
    process_->signal(SIGTERM);
    if (process_->wait() != 0)
        throw std::runtime_error("kesto-ingest does not end well: " + log());
}

std::int64_t IngestCopy::metric(const std::string& beginning) const
{
    std::istringstream lines(kesto_ingest::ask(metricsAddress_));
    std::int64_t sum = 0;
    for (std::string line; std::getline(lines, line);)
        if (line.starts_with(beginning))
            sum += std::stoll(line.substr(line.rfind(' ')));
    return sum;
}

} // namespace fleet
