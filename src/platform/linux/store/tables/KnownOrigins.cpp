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

bool KnownOrigins::hasChanged() const noexcept
{
    return !sources.changed().empty() || !sessions.changed().empty();
}

} // namespace platform
