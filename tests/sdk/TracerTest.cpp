// SPDX-License-Identifier: Apache-2.0
// Emitting trace events while a client connects, gets the marker, and loses its connection again. The marker is a pipe,
// the page the service's own.
#include "kesto/trace.hpp"
#include "platform/linux/trace/EmittedEvent.h"
#include "platform/linux/trace/EmitterAccess.h"
#include "sdk/Allocations.h"
#include "sdk/FakeService.h"
#include "sdk/Recorder.h"
#include "support/TemporaryDirectory.h"

#include <array>
#include <atomic>
#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <gmock/gmock.h>
#include <optional>
#include <sys/mman.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace {

using foundation::Array;
using foundation::Value;
using kesto::State;
using kesto::Status;
using platform::EmittedEvent;
using platform::FileDescriptor;
using platform::TraceSwitchPage;
using sdk_test::FakeService;
using sdk_test::patience;
using sdk_test::Peer;
using testing::ElementsAre;
using testing::IsEmpty;

class TracerTest : public testing::Test {
protected:
    TracerTest()
    {
        std::array<int, 2> ends{};
        EXPECT_EQ(::pipe2(ends.data(), O_NONBLOCK | O_CLOEXEC), 0);
        out = FileDescriptor(ends[0]);
        in = FileDescriptor(ends[1]);
        EXPECT_FALSE(access.open(in.get()));
        access.ask(this, [this](const platform::EmitterDescriptors& handedOut) { descriptors = handedOut; });
    }

    static bool isRequest(const Array& call) { return call.size() == 2 && call[1].string().has_value(); }
    // Sends the descriptors.
    void answer(Peer& peer, const Array& call)
    {
        if (!isRequest(call))
            return sdk_test::answerObediently(peer, call);
        ++requests;
        EXPECT_EQ(call[1].string()->view(), "trace");
        peer.attach(attached);
        peer.answer(sdk_test::callNumber(call), {});
    }
    void serve()
    {
        attached = {descriptors.marker, descriptors.page};
        service.emplace(path, [this](Peer& peer, const Array& call) { answer(peer, call); });
    }
    void open(bool trace = true, bool reconnect = false)
    {
        kesto::Options options;
        options.socketPath = path;
        options.stateChanged = states.callback();
        options.trace = trace;
        options.reconnect = reconnect;
        options.firstRetry = std::chrono::milliseconds(1);
        ASSERT_EQ(client.open(options), Status::Ok);
    }
    static bool waitUntil(const std::function<bool()>& holds)
    {
        const auto end = std::chrono::steady_clock::now() + patience;
        bool result = holds();
        for (; !result && std::chrono::steady_clock::now() < end; result = holds())
            std::this_thread::yield();
        return result;
    }
    // The complete records that were written to the marker.
    std::vector<EmittedEvent> records()
    {
        std::vector<EmittedEvent> records(1000);
        const ssize_t size = ::read(out.get(), records.data(), records.size() * sizeof(EmittedEvent));
        EXPECT_EQ(size < 0 ? 0 : size % static_cast<ssize_t>(sizeof(EmittedEvent)), 0);
        records.resize(size < 0 ? 0 : static_cast<std::size_t>(size) / sizeof(EmittedEvent));
        return records;
    }
    std::vector<std::uint32_t> codes()
    {
        std::vector<std::uint32_t> codes;
        for (const EmittedEvent& record : records())
            codes.push_back(record.code);
        return codes;
    }
    static std::size_t openDescriptors()
    {
        const std::filesystem::directory_iterator all("/proc/self/fd");
        return static_cast<std::size_t>(std::distance(begin(all), end(all)));
    }

    FileDescriptor out;
    FileDescriptor in;
    platform::EmitterAccess access;
    platform::EmitterDescriptors descriptors;
    std::vector<int> attached;
    std::atomic<int> requests = 0;
    support::TemporaryDirectory directory;
    const std::string path = directory / "service";
    std::optional<FakeService> service;
    sdk_test::States states;
    kesto::Client client;
};

TEST_F(TracerTest, EmitsWhileATraceRuns)
{
    serve();
    open();
    const kesto::Tracer tracer(client);
    tracer.emit(1);
    EXPECT_FALSE(tracer.isActive());
    access.setTracing(true);
    ASSERT_TRUE(waitUntil([&] { return tracer.isActive(); }));
    tracer.emit(2, 1, 2, 3, UINT64_MAX);
    access.setTracing(false);
    EXPECT_FALSE(tracer.isActive());
    tracer.emit(3);
    const auto emitted = records();
    ASSERT_EQ(emitted.size(), 1U);
    EXPECT_EQ(emitted[0].tag, EmittedEvent::ownTag);
    EXPECT_EQ(emitted[0].code, 2U);
    EXPECT_THAT(emitted[0].arguments, ElementsAre(1U, 2U, 3U, UINT64_MAX));
}

TEST_F(TracerTest, MarksBothEndsOfAnInterval)
{
    serve();
    access.setTracing(true);
    open();
    const kesto::Tracer tracer(client);
    ASSERT_TRUE(waitUntil([&] { return tracer.isActive(); }));
    {
        const kesto::TraceInterval interval(tracer, KESTO_FIRST_TRACE_CODE, KESTO_LAST_TRACE_CODE);
        EXPECT_THAT(codes(), ElementsAre(0x21040000U));
    }
    EXPECT_THAT(codes(), ElementsAre(0x2104408AU));
}

TEST_F(TracerTest, OfAClientThatDidNotAskForItEmitsNothing)
{
    serve();
    access.setTracing(true);
    open(false);
    const kesto::Tracer tracer(client);
    ASSERT_EQ(client.validate(1, nullptr), Status::Ok);
    ASSERT_EQ(client.flush(patience), Status::Ok);
    EXPECT_EQ(requests, 0) << "the service does not get it either";
    EXPECT_FALSE(tracer.isActive());
    tracer.emit(1);
    kesto_tracer_emit(tracer.get(), 1, 0, 0, 0, 0);
    kesto_tracer_emit(nullptr, 1, 0, 0, 0, 0);
    kesto::Tracer().emit(1);
    EXPECT_THAT(codes(), IsEmpty());
}

TEST_F(TracerTest, DoesNotDisturbCalls)
{
    serve();
    open();
    sdk_test::Answers answers;
    ASSERT_EQ(client.createSession(42, answers.named("create")), Status::Ok);
    ASSERT_EQ(client.validate(42, answers.named("validate")), Status::Ok);
    ASSERT_EQ(client.flush(patience), Status::Ok);
    EXPECT_THAT(answers.entries(), ElementsAre("create", "validate"));
    EXPECT_EQ(requests, 1);
    EXPECT_EQ(client.statistics().unexpected_answers, 0U);
}

TEST_F(TracerTest, GoesSilentWithTheConnectionAndOnWithTheNext)
{
    serve();
    access.setTracing(true);
    open(true, true);
    const kesto::Tracer tracer(client);
    ASSERT_TRUE(waitUntil([&] { return tracer.isActive(); }));
    service.reset(); // killed during a trace: its page shows the trace for ever
    ASSERT_TRUE(waitUntil([&] { return !tracer.isActive(); }));
    kesto_tracer_emit(tracer.get(), 1, 0, 0, 0, 0);
    EXPECT_THAT(codes(), IsEmpty());
    serve();
    ASSERT_TRUE(waitUntil([&] { return tracer.isActive(); }));
    tracer.emit(2);
    EXPECT_THAT(codes(), ElementsAre(2U));
    EXPECT_GE(requests, 2);
}

TEST_F(TracerTest, MayBeUsedByThreadsWhileConnectionsComeAndGo)
{
    serve();
    access.setTracing(true);
    open(true, true);
    const kesto::Tracer tracer(client);
    std::atomic<bool> isOver = false;
    std::vector<std::thread> threads;
    for (std::uint32_t number = 0; number < 2; ++number)
        threads.emplace_back([&, number] {
            while (!isOver)
                tracer.emit(number);
        });
    bool isAlwaysReached = true;
    for (int round = 0; round < 10; ++round) {
        isAlwaysReached &= waitUntil([&] { return !records().empty(); });
        service->disconnectAll();
        isAlwaysReached &= waitUntil([&] { return requests > round + 1; });
    }
    isOver = true;
    for (std::thread& thread : threads)
        thread.join();
    EXPECT_TRUE(isAlwaysReached);
    for (const EmittedEvent& record : records())
        EXPECT_EQ(record.tag, EmittedEvent::ownTag) << "nothing is torn";
}

TEST_F(TracerTest, StaysSilentWithoutDescriptors)
{
    serve();
    attached = {};
    access.setTracing(true);
    open();
    const kesto::Tracer tracer(client);
    ASSERT_TRUE(waitUntil([&] { return requests == 1; }));
    ASSERT_EQ(client.validate(1, nullptr), Status::Ok);
    ASSERT_EQ(client.flush(patience), Status::Ok) << "the connection goes on";
    EXPECT_FALSE(tracer.isActive());
}

TEST_F(TracerTest, TakesNoPageThatCouldGoAway)
{
    const FileDescriptor unsealed(::memfd_create("page", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    ASSERT_EQ(::ftruncate(unsealed.get(), TraceSwitchPage::size), 0);
    const FileDescriptor small(::memfd_create("page", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    ASSERT_EQ(::ftruncate(small.get(), 16), 0);
    ASSERT_EQ(::fcntl(small.get(), F_ADD_SEALS, F_SEAL_SHRINK), 0);
    std::size_t told = 0; // changes of state
    for (const std::vector<int>& wrong :
         {std::vector{in.get(), unsealed.get()}, {in.get(), small.get()}, {in.get(), in.get()}, {in.get()}}) {
        serve();
        attached = wrong;
        open();
        EXPECT_EQ(states.reasons.waitFor(told + 2).at(told + 1), Status::ProtocolViolation);
        EXPECT_EQ(client.state(), State::Disconnected);
        EXPECT_FALSE(kesto::Tracer(client).isActive());
        client = {};
        told = states.reasons.entries().size();
        service.reset();
    }
}

TEST_F(TracerTest, KeepsNoDescriptorThatItIsNotToHave)
{
    serve();
    attached = {in.get(), descriptors.page, out.get(), out.get(), out.get()};
    access.setTracing(true);
    open();
    const kesto::Tracer tracer(client);
    ASSERT_TRUE(waitUntil([&] { return tracer.isActive(); }));
    const std::size_t before = openDescriptors();
    service->forEachPeer([&](Peer& peer) {
        for (int count = 0; count < 10; ++count) {
            peer.attach({in.get(), descriptors.page});
            peer.answer(99, {});
        }
    });
    ASSERT_EQ(client.validate(1, nullptr), Status::Ok);
    ASSERT_EQ(client.flush(patience), Status::Ok);
    EXPECT_LE(openDescriptors(), before + 2) << "at most the last ones";
    client = {};
    service.reset();
}

TEST_F(TracerTest, CallsNothingAndAllocatesNothingForRealTime)
{
    serve();
    access.setTracing(true);
    open();
    const kesto::Tracer tracer(client);
    ASSERT_TRUE(waitUntil([&] { return tracer.isActive(); }));
    errno = EXDEV;
    const auto before = sdk_test::allocations();
    tracer.emit(1);
    const int error = errno; // first, because later code may change it
    EXPECT_EQ(sdk_test::allocations(), before);
    EXPECT_EQ(error, EXDEV);
    out = {};
    in = {};
    EXPECT_TRUE(tracer.isActive());
}

TEST_F(TracerTest, MayBeUsedInAForkedChild)
{
    serve();
    access.setTracing(true);
    open();
    const kesto::Tracer tracer(client);
    ASSERT_TRUE(waitUntil([&] { return tracer.isActive(); }));
    const pid_t child = ::fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
        tracer.emit(7);
        ::_exit(0);
    }
    ::waitpid(child, nullptr, 0);
    EXPECT_THAT(codes(), ElementsAre(7U));
}

} // namespace
