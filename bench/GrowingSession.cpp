// SPDX-License-Identifier: Apache-2.0
// The cost of recording in a growing session, in time and memory.
#include "Groups.h"
#include "foundation/cbor/Cbor.h"
#include "session/KestoReportingSession.h"
#include "support/InProcessPlatform.h"
#include "support/SampleMessage.h"

#include <fmt/format.h>
#include <malloc.h>

namespace bench {
namespace {

constexpr std::uint32_t windowSize = 1000;
constexpr std::uint32_t early = 1'000;
constexpr std::uint32_t late = 1'000'000;

// The bytes that malloc has allocated.
double allocatedBytes()
{
    const auto info = ::mallinfo2();
    return static_cast<double>(info.uordblks + info.hblkhd);
}

// A session that is sent one distinct message after the other.
class GrowingSession {
public:
    GrowingSession() { session_.start(); }

    void growTo(std::uint32_t size)
    {
        while (size_ < size)
            send(message());
    }

    // Nanoseconds for each of the messages around the `place`th.
    double costAround(std::uint32_t place)
    {
        growTo(place - windowSize / 2);
        std::vector<foundation::Dictionary> messages;
        for (std::uint32_t each = 0; each < windowSize; ++each)
            messages.push_back(message());
        return nanosecondsEach(windowSize, [&](std::size_t each) { send(messages[each]); });
    }

private:
    foundation::Dictionary message() { return sampleMessage(++number_); }
    void send(const foundation::Dictionary& message)
    {
        ++size_;
        session_.sendMessage(tally_, message, sampleCategory, sampleType, nullptr);
    }

    ledger::Tally tally_;
    KestoReportingSession session_{sampleReporterID, {1}};
    std::uint32_t size_ = 0;
    std::uint32_t number_ = numberMark;
};

} // namespace

void measureGrowingSession(const BenchOptions& options, Report& report)
{
    const InProcessPlatform platform;
    std::vector<double> earlyCosts;
    std::vector<double> lateCosts;
    std::vector<double> bytes;
    for (int round = 0; round <= options.rounds; ++round) {
        showProgress(fmt::format("a session of {} messages: round {} of {}", late, round, options.rounds));
        ::malloc_trim(0);
        const double before = allocatedBytes();
        GrowingSession session;
        const double earlyCost = session.costAround(early);
        const double lateCost = session.costAround(late);
        session.growTo(late + windowSize);
        if (round == 0)
            continue; // warms up
        earlyCosts.push_back(earlyCost);
        lateCosts.push_back(lateCost);
        bytes.push_back((allocatedBytes() - before) / (late + windowSize));
    }
    clearProgress();
    report.add({fmt::format("recording the {}th distinct message of a session", late), "ns", lateCosts,
                PeerFigure{fmt::format("the {}th", early), earlyCosts}, Target::ratioAtMost(1.2)});
    const std::vector<double> encodedSize(bytes.size(), static_cast<double>(foundation::cborSize(sampleMessage())));
    report.add({fmt::format("memory a recorded message, of {}", late), "B", bytes, PeerFigure{"its CBOR", encodedSize},
                Target::ratioAtMost(1.5)});
}

} // namespace bench
