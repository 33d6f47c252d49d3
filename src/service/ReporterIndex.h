// Which clients have a session of a reporter ID, so that a look-up over all clients costs the same for any number of
// clients. By definition the result is that of a walk over the registry, in the order of registration, that stops at
// the first client with the ID; so the index keeps the clients of an ID in that order.
#pragma once

#include "foundation/values/IntegerHash.h"

#include <cstdint>
#include <map>
#include <memory>
#include <unordered_map>

class KestoReportingClientServerInstance;

namespace service {

// One thread at a time, which the owner ensures. Clients that are not registered do not count.
class ReporterIndex {
public:
    using Client = KestoReportingClientServerInstance;

    void registerClient(const Client& client) { registrationOf_.try_emplace(&client, nextRegistration_++); }

    // All IDs of the client must have been removed.
    void unregisterClient(const Client& client) { registrationOf_.erase(&client); }

    void add(std::int64_t reporterID, const Client& client)
    {
        if (const auto registration = registrationOf_.find(&client); registration != registrationOf_.end())
            clientsOf_[reporterID].try_emplace(registration->second, &client);
    }

    void remove(std::int64_t reporterID, const Client& client)
    {
        const auto registration = registrationOf_.find(&client);
        const auto clients = clientsOf_.find(reporterID);
        if (registration == registrationOf_.end() || clients == clientsOf_.end())
            return;
        clients->second.erase(registration->second);
        if (clients->second.empty())
            clientsOf_.erase(clients);
    }

    // Of the clients with the ID, the one that registered first, or null.
    [[nodiscard]] const Client* find(std::int64_t reporterID) const
    {
        const auto clients = clientsOf_.find(reporterID);
        return clients == clientsOf_.end() ? nullptr : clients->second.begin()->second;
    }

private:
    using Registration = std::uint64_t;

    Registration nextRegistration_ = 0;
    std::unordered_map<const Client*, Registration> registrationOf_;
    std::unordered_map<std::int64_t, std::map<Registration, const Client*>, foundation::IntegerHash> clientsOf_;
};

} // namespace service
