// SPDX-License-Identifier: Apache-2.0
// Looks first, and claims what nobody has: most pseudonyms are old.
#include "kesto-ingest/stream/Owners.h"

#include "kesto-ingest/stream/Subjects.h"

namespace kesto_ingest {

namespace {

constexpr std::size_t mostKnown = 200'000; // some 30 MB

} // namespace

std::expected<std::string, std::string> Owners::claim(const std::string& device, const std::string& credential)
{
    if (const auto known = known_.find(device); known != known_.end())
        return known->second;
    const std::string subject = std::string(ownerPrefix) + device;
    auto entry = stream_.last(subject);
    if (entry && !*entry) {
        const Put first{.subject = subject, .payload = credential};
        const auto answers = stream_.put({&first, 1});
        if (!answers)
            return std::unexpected(answers.error());
        entry = answers->front() ? Entry{.payload = credential, .sequence = *answers->front()} : stream_.last(subject);
    }
    if (!entry)
        return std::unexpected(entry.error());
    if (!*entry)
        return std::unexpected("the owner of a pseudonym was removed from " + std::string(ownerStream));
    if (known_.size() >= mostKnown)
        known_.clear();
    return known_.emplace(device, (*entry)->payload).first->second;
}

} // namespace kesto_ingest
