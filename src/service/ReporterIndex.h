// SPDX-License-Identifier: Apache-2.0
// Which session a reporter ID means, so that a look-up over all clients costs the same for any number of clients. By
// definition the result is that of a walk over the registry, in the order of registration, that stops at the first
// client with the ID; so the index keeps the clients of an ID in that order.
//
// Nearly every ID belongs to one client. What a look-up needs of it stands in the table itself: in a service of ten
// thousand clients each further step would be a miss of the processor's caches.
#pragma once

#include "foundation/values/IntegerHash.h"

#include <cstdint>
#include <map>
#include <memory>
#include <unordered_map>
#include <utility>

class KestoReportingClientServerInstance;
class KestoReportingSession;

namespace service {

// One thread at a time, which the owner ensures. Clients that are not registered do not count.
class ReporterIndex {
public:
    using Client = KestoReportingClientServerInstance;
    using Session = KestoReportingSession;

    struct Holder {
        std::uint64_t registration;
        const Client* client;
        std::weak_ptr<Session> session;
    };

    void registerClient(const Client& client) { registrationOf_.try_emplace(&client, nextRegistration_++); }

    // All IDs of the client must have been removed.
    void unregisterClient(const Client& client) { registrationOf_.erase(&client); }

    // The client's session of that ID is now this one.
    void add(std::int64_t reporterID, const Client& client, const std::shared_ptr<Session>& session)
    {
        const auto registration = registrationOf_.find(&client);
        if (registration == registrationOf_.end())
            return;
        Holder added{registration->second, &client, session};
        const auto [found, isNew] = firstOf_.try_emplace(reporterID, added);
        if (isNew)
            return;
        Holder& first = found->second;
        if (added.registration < first.registration)
            std::swap(first, added);
        if (added.registration == first.registration)
            first = added;
        else
            othersOf_.insert_or_assign({reporterID, added.registration}, added);
    }

    void remove(std::int64_t reporterID, const Client& client)
    {
        const auto registration = registrationOf_.find(&client);
        const auto first = firstOf_.find(reporterID);
        if (registration == registrationOf_.end() || first == firstOf_.end())
            return;
        if (registration->second != first->second.registration)
            othersOf_.erase({reporterID, registration->second});
        else if (const auto next = othersOf_.lower_bound({reporterID, 0});
                 next != othersOf_.end() && next->first.first == reporterID)
            first->second = othersOf_.extract(next).mapped();
        else
            firstOf_.erase(first);
    }

    // Of the clients with the ID, the one that registered first, or null.
    [[nodiscard]] const Holder* find(std::int64_t reporterID) const
    {
        const auto found = firstOf_.find(reporterID);
        return found == firstOf_.end() ? nullptr : &found->second;
    }

private:
    std::uint64_t nextRegistration_ = 0;
    std::unordered_map<const Client*, std::uint64_t> registrationOf_;
    std::unordered_map<std::int64_t, Holder, foundation::IntegerHash> firstOf_;
    std::map<std::pair<std::int64_t, std::uint64_t>, Holder> othersOf_; // by ID and registration
};

} // namespace service
