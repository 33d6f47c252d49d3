// The contract of platform/TraceMarkers.h: each marker is one event of the trace, and without a trace it does nothing.
#include "platform/contract/Contract.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/trace/TraceMarker.h"
#include "platform/linux/trace/TracefsMarkers.h"
#include "support/fakes/FakeTraceMarkers.h"

#include <algorithm>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <system_error>
#include <unistd.h>

namespace contract {
namespace {

using support::TraceMarkerEvent;
using testing::ElementsAre;
using testing::IsEmpty;

class TraceMarkersSubject {
public:
    virtual ~TraceMarkersSubject() = default;
    [[nodiscard]] virtual platform::TraceMarkers& markers() = 0;
    // Whether a trace runs; at first none does.
    virtual void trace(bool isTracing) = 0;
    // The events in the trace since the last time.
    [[nodiscard]] virtual std::vector<TraceMarkerEvent> take() = 0;
};

class FakeTraceMarkersSubject final : public TraceMarkersSubject {
public:
    FakeTraceMarkersSubject() { markers_.setTraced(false); }
    [[nodiscard]] platform::TraceMarkers& markers() override { return markers_; }
    void trace(bool isTracing) override { markers_.setTraced(isTracing); }
    [[nodiscard]] std::vector<TraceMarkerEvent> take() override { return markers_.takeEvents(); }

private:
    support::FakeTraceMarkers markers_;
};

// A pipe stands for the marker of the kernel.
class LinuxTraceMarkersSubject final : public TraceMarkersSubject {
public:
    LinuxTraceMarkersSubject()
    {
        std::array<int, 2> ends{};
        if (::pipe2(ends.data(), O_CLOEXEC | O_NONBLOCK) != 0)
            throw std::system_error(errno, std::generic_category(), "pipe");
        reader_ = platform::FileDescriptor(ends[0]);
        writer_ = platform::FileDescriptor(ends[1]);
    }
    [[nodiscard]] platform::TraceMarkers& markers() override { return markers_; }
    void trace(bool isTracing) override { markers_.setMarker(isTracing ? writer_.get() : -1); }
    [[nodiscard]] std::vector<TraceMarkerEvent> take() override
    {
        std::vector<TraceMarkerEvent> events;
        platform::TraceMarkerRecord record;
        for (ssize_t size = 0; (size = ::read(reader_.get(), &record, sizeof record)) >= 0;) {
            EXPECT_EQ(size, ssize_t{sizeof record});
            EXPECT_EQ(record.tag, platform::TraceMarkerRecord::ownTag);
            events.push_back({record.code, record.arguments});
        }
        return events;
    }

private:
    platform::FileDescriptor reader_;
    platform::FileDescriptor writer_;
    platform::TracefsMarkers markers_;
};

using TraceMarkersContract = Suite<TraceMarkersSubject>;
KESTO_CONTRACT(TraceMarkersContract, (provider<TraceMarkersSubject, FakeTraceMarkersSubject>("Fake")),
               (provider<TraceMarkersSubject, LinuxTraceMarkersSubject>("Linux")));

TEST_P(TraceMarkersContract, LeaveOneEventForEachMarkerInTheirOrder)
{
    subject->trace(true);
    subject->markers().emit(0x21044828, {});
    subject->markers().emit(0x21044814, {});
    subject->markers().emit(0x21044828, {});
    EXPECT_THAT(subject->take(),
                ElementsAre(TraceMarkerEvent{0x21044828}, TraceMarkerEvent{0x21044814}, TraceMarkerEvent{0x21044828}));
    EXPECT_THAT(subject->take(), IsEmpty());
}

TEST_P(TraceMarkersContract, CarryTheWholeCodeAndAllArguments)
{
    subject->trace(true);
    subject->markers().emit(0xFFFFFFFF, {1, 0, 3, ~std::uint64_t{0}});
    EXPECT_THAT(subject->take(), ElementsAre(TraceMarkerEvent{0xFFFFFFFF, {1, 0, 3, ~std::uint64_t{0}}}));
}

TEST_P(TraceMarkersContract, DoNothingWithoutATrace)
{
    subject->markers().emit(1, {});
    subject->trace(true);
    subject->markers().emit(2, {});
    subject->trace(false);
    subject->markers().emit(3, {});
    EXPECT_THAT(subject->take(), ElementsAre(TraceMarkerEvent{2}));
}

TEST_P(TraceMarkersContract, MayBeLeftByManyThreads)
{
    constexpr std::uint64_t each = 100;
    subject->trace(true);
    {
        std::vector<std::jthread> threads;
        for (std::uint32_t code = 0; code < 3; ++code)
            threads.emplace_back([&, code] {
                for (std::uint64_t number = 0; number < each; ++number)
                    subject->markers().emit(code, {number});
            });
    }
    std::array<std::uint64_t, 3> next{};
    for (const TraceMarkerEvent& event : subject->take())
        EXPECT_EQ(event.arguments[0], next.at(event.code)++);
    EXPECT_THAT(next, ElementsAre(each, each, each));
}

} // namespace
} // namespace contract
