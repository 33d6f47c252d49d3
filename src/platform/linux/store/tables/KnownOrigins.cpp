// SPDX-License-Identifier: Apache-2.0
// Sources and sessions side by side.
#include "platform/linux/store/tables/KnownOrigins.h"

namespace platform {

void KnownOrigins::begin(const OriginAnnouncements& announced)
{
    for (const SourceBegin& source : announced.sources)
        sources.begin(source);
    for (const SessionBegin& session : announced.sessions)
        sessions.begin(session);
}

void KnownOrigins::end(const OriginAnnouncements& announced)
{
    for (const OriginEnd& session : announced.sessionEnds)
        sessions.end(session);
    for (const OriginEnd& source : announced.sourceEnds)
        sources.end(source);
}

void KnownOrigins::committed()
{
    sources.committed();
    sessions.committed();
}

void KnownOrigins::rolledBack()
{
    sources.rolledBack();
    sessions.rolledBack();
}

std::optional<ledger::Culprit> KnownOrigins::culpritOf(const Origin& origin)
{
    const auto* const source = sources.find(origin.source);
    if (source == nullptr)
        return std::nullopt;
    const auto* const session = sessions.find(origin.session);
    return ledger::Culprit{.user = source->begin.userIdentifier,
                           .process = source->begin.processName,
                           .application = session == nullptr ? std::string() : session->begin.application};
}

std::optional<SessionOwner> KnownOrigins::ownerOf(std::uint64_t session)
{
    const auto* const known = sessions.find(session);
    if (known == nullptr || known->ended)
        return std::nullopt;
    const auto* const source = sources.find(known->begin.source);
    return SessionOwner{.user = source == nullptr ? 0 : source->begin.userIdentifier,
                        .process = source == nullptr ? 0 : source->begin.processIdentifier,
                        .reporterID = known->begin.reporterID};
}

void KnownOrigins::countLoss(ledger::Counter reason, const EventsByOrigin& events, ledger::Tally& tally)
{
    for (const auto& [origin, count] : events)
        if (const auto culprit = culpritOf(origin))
            tally.add(reason, *culprit, count);
        else
            tally.add(reason, count);
}

bool KnownOrigins::hasChanged() const noexcept
{
    return !sources.changed().empty() || !sessions.changed().empty();
}

} // namespace platform
