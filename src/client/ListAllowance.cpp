// SPDX-License-Identifier: Apache-2.0
// A list counts when it is made, which a log statement does only for a line that it writes.
#include "client/ListAllowance.h"

#include "foundation/text/Format.h"
#include "ledger/Report.h"
#include "platform/Platform.h"
#include "utility/ServerQueue.h"

#include <optional>
#include <vector>

namespace client {
namespace {

// Of this installation of the platform, so that tests do not share it.
BytesOfTheMinute& ofAllClients()
{
    static std::optional<BytesOfTheMinute> bytes;
    static std::uint64_t installation = 0;
    if (!bytes || installation != platform::installationNumber()) {
        bytes.emplace(ListAllowance::mostBytesAMinuteOfAllClients);
        installation = platform::installationNumber();
    }
    return *bytes;
}

} // namespace

bool BytesOfTheMinute::isUsedUp()
{
    constexpr double minute = 60;
    const double now = platform::current().clock.systemUptime();
    if (now - minuteBegan_ >= minute) {
        minuteBegan_ = now;
        used_ = 0;
    }
    return used_ >= most_;
}

template <typename Describe> std::string ListAllowance::use(std::size_t sessions, Describe describe)
{
    utility::assertServerQueue();
    if (ofThisClient_.isUsedUp() || ofAllClients().isUsedUp())
        return ledger::countedText(sessions, "session");
    std::string description = describe();
    ofThisClient_.use(description.size());
    ofAllClients().use(description.size());
    return description;
}

std::string ListAllowance::describe(std::size_t count, const NextSession& next)
{
    return use(count, [&] { return descriptionOfSessions(count, next); });
}

std::string ListAllowance::describe(std::span<const std::int64_t> reporterIDs)
{
    return use(reporterIDs.size(), [&] { return foundation::format("[{}]", foundation::join(reporterIDs, ",")); });
}

std::string descriptionOfSessions(std::size_t count, const NextSession& next)
{
    constexpr std::size_t longest = std::size_t{24} << 10; // roughly what one log line shows
    std::vector<foundation::Value> descriptions;
    std::size_t length = 0;
    while (descriptions.size() != count) {
        if (length > longest) {
            descriptions.emplace_back(foundation::format("... {} more", count - descriptions.size()));
            break;
        }
        const std::string description = next()->description();
        length += description.size();
        descriptions.emplace_back(description);
    }
    return foundation::Value(foundation::Array(std::move(descriptions))).text();
}

} // namespace client
