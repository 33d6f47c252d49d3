// SPDX-License-Identifier: Apache-2.0
// The contract of platform/TraceEmitter.h: each call of `emit` is one event of the trace, and does nothing without a
// trace.
#include "platform/contract/Contract.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/trace/EmittedEvent.h"
#include "platform/linux/trace/TracefsEmitter.h"
#include "support/fakes/FakeTraceEmitter.h"

#include <algorithm>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <system_error>
#include <unistd.h>

namespace contract {
namespace {

using support::KeptEmission;
using testing::ElementsAre;
using testing::IsEmpty;

class TraceEmitterSubject {
public:
    virtual ~TraceEmitterSubject() = default;
    [[nodiscard]] virtual platform::TraceEmitter& emitter() = 0;
    // Whether a trace runs; at first none does.
    virtual void trace(bool isTracing) = 0;
    // The events in the trace since the last time.
    [[nodiscard]] virtual std::vector<KeptEmission> take() = 0;
};

class FakeTraceEmitterSubject final : public TraceEmitterSubject {
public:
    FakeTraceEmitterSubject() { emitter_.setTraced(false); }
    [[nodiscard]] platform::TraceEmitter& emitter() override { return emitter_; }
    void trace(bool isTracing) override { emitter_.setTraced(isTracing); }
    [[nodiscard]] std::vector<KeptEmission> take() override { return emitter_.takeEvents(); }

private:
    support::FakeTraceEmitter emitter_;
};

// A pipe stands in for the marker of the kernel.
class LinuxTraceEmitterSubject final : public TraceEmitterSubject {
public:
    LinuxTraceEmitterSubject()
    {
        std::array<int, 2> ends{};
        if (::pipe2(ends.data(), O_CLOEXEC | O_NONBLOCK) != 0)
            throw std::system_error(errno, std::generic_category(), "pipe");
        reader_ = platform::FileDescriptor(ends[0]);
        writer_ = platform::FileDescriptor(ends[1]);
    }
    [[nodiscard]] platform::TraceEmitter& emitter() override { return emitter_; }
    void trace(bool isTracing) override { emitter_.setMarker(isTracing ? writer_.get() : -1); }
    [[nodiscard]] std::vector<KeptEmission> take() override
    {
        std::vector<KeptEmission> events;
        platform::EmittedEvent record;
        for (ssize_t size = 0; (size = ::read(reader_.get(), &record, sizeof record)) >= 0;) {
            EXPECT_EQ(size, ssize_t{sizeof record});
            EXPECT_EQ(record.tag, platform::EmittedEvent::ownTag);
            events.push_back({record.code, record.arguments});
        }
        return events;
    }

private:
    platform::FileDescriptor reader_;
    platform::FileDescriptor writer_;
    platform::TracefsEmitter emitter_;
};

using TraceEmitterContract = Suite<TraceEmitterSubject>;
KESTO_CONTRACT(TraceEmitterContract, (provider<TraceEmitterSubject, FakeTraceEmitterSubject>("Fake")),
               (provider<TraceEmitterSubject, LinuxTraceEmitterSubject>("Linux")));

TEST_P(TraceEmitterContract, LeavesOneEventForEachCallInTheirOrder)
{
    subject->trace(true);
    subject->emitter().emit(0x21044828, {});
    subject->emitter().emit(0x21044814, {});
    subject->emitter().emit(0x21044828, {});
    EXPECT_THAT(subject->take(),
                ElementsAre(KeptEmission{0x21044828}, KeptEmission{0x21044814}, KeptEmission{0x21044828}));
    EXPECT_THAT(subject->take(), IsEmpty());
}

TEST_P(TraceEmitterContract, CarriesTheWholeCodeAndAllArguments)
{
    subject->trace(true);
    subject->emitter().emit(0xFFFFFFFF, {1, 0, 3, ~std::uint64_t{0}});
    EXPECT_THAT(subject->take(), ElementsAre(KeptEmission{0xFFFFFFFF, {1, 0, 3, ~std::uint64_t{0}}}));
}

TEST_P(TraceEmitterContract, DoesNothingWithoutATrace)
{
    subject->emitter().emit(1, {});
    subject->trace(true);
    subject->emitter().emit(2, {});
    subject->trace(false);
    subject->emitter().emit(3, {});
    EXPECT_THAT(subject->take(), ElementsAre(KeptEmission{2}));
}

TEST_P(TraceEmitterContract, MayBeUsedByManyThreads)
{
    constexpr std::uint64_t each = 100;
    subject->trace(true);
    {
        std::vector<std::jthread> threads;
        for (std::uint32_t code = 0; code < 3; ++code)
            threads.emplace_back([&, code] {
                for (std::uint64_t number = 0; number < each; ++number)
                    subject->emitter().emit(code, {number});
            });
    }
    std::array<std::uint64_t, 3> next{};
    for (const KeptEmission& event : subject->take())
        EXPECT_EQ(event.arguments[0], next.at(event.code)++);
    EXPECT_THAT(next, ElementsAre(each, each, each));
}

} // namespace
} // namespace contract
