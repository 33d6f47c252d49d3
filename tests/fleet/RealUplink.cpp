// SPDX-License-Identifier: Apache-2.0
// Each look at the state opens it for a moment only, since a look may lock it.
#include "fleet/RealUplink.h"

#include "fleet/Device.h"
#include "kesto-uplink/outbox/StoreReader.h"
#include "kesto-uplink/state/State.h"
#include "support/TemporaryDirectory.h"
#include "tools/kesto-ingest/FleetServers.h"

#include <csignal>
#include <fmt/format.h>
#include <stdexcept>
#include <utility>

namespace fleet {

using kesto_uplink::State;

RealUplink::RealUplink(std::filesystem::path directory, std::filesystem::path store, const std::string& credential,
                       const std::string& servers)
    : directory_(std::move(directory)),
      store_(std::move(store))
{
    std::filesystem::create_directories(state());
    const auto credentials = directory_ / "credentials.toml";
    support::writeFile(credentials, fmt::format("name = \"{0}\"\npassword = \"{0}\"\nplain = true\n", credential));
    std::filesystem::permissions(credentials, std::filesystem::perms(0600));
    support::writeFile(directory_ / "uplink.toml",
                       fmt::format("enabled = true\nservers = {}\ncredentials = \"{}\"\ninterval = 0.2\n{}", servers,
                                   credentials.native(), rules));
}

void RealUplink::start()
{
    process_ = std::make_unique<sdk_test::Process>(
        sdk_test::Process::Arguments{"setpriv", "--pdeathsig", "KILL", KESTO_UPLINK_PATH, "run", "--configuration",
                                     directory_ / "uplink.toml", "--database", store_, "--state", state()});
}

void RealUplink::kill()
{
    process_.reset();
}

std::string RealUplink::log() const
{
    return process_ ? process_->errors() : "";
}

bool RealUplink::isAllSent() const
{
    auto opened = State::openPresent(state());
    return opened && opened->queued() == kesto_uplink::StoreReader(store_).newest();
}

void RealUplink::awaitAllSent() const
{
    try {
        kesto_ingest::waitUntil("a real uplink has sent all", [this] { return isAllSent(); });
    } catch (const std::runtime_error& error) {
        throw std::runtime_error(error.what() + std::string("; it says: ") + log());
    }
}

std::int64_t RealUplink::sentUpTo() const
{
    auto opened = State::openPresent(state());
    return opened ? opened->queued().id : 0;
}

std::int64_t RealUplink::batches() const
{
    auto opened = State::openPresent(state());
    return opened ? opened->totals().batches : 0;
}

std::uint64_t RealUplink::rows() const
{
    auto opened = State::openPresent(state());
    return opened ? static_cast<std::uint64_t>(opened->totals().rows) : 0;
}

Chapter RealUplink::chapter() const
{
    return {.pseudonym = State::openPresent(state())->identity().pseudonym, .store = store_};
}

} // namespace fleet
