// SPDX-License-Identifier: Apache-2.0
// The kernel's trace: the cost of an event for its emitter, and how fast the service reads the kernel's pages and
// orders the events of all processors. Emitting is measured with the real kernel; the peer is a bare write of as many
// bytes.
#include "Groups.h"
#include "platform/linux/connection/LinuxConnectionListener.h"
#include "platform/linux/trace/EmittedEvent.h"
#include "platform/linux/trace/EmitterAccess.h"
#include "platform/linux/trace/TraceMerger.h"
#include "platform/linux/trace/TracefsEmitter.h"
#include "platform/linux/trace/TracefsInstance.h"
#include "support/ChildProcess.h"
#include "support/TemporaryDirectory.h"

#include <cerrno>
#include <chrono>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <fmt/format.h>
#include <kesto/trace.hpp>
#include <memory>
#include <stdexcept>
#include <string>
#include <string_view>
#include <system_error>
#include <thread>
#include <unistd.h>

namespace bench {
namespace {

constexpr std::uint32_t code = 0x21040010;
constexpr std::uint16_t markerType = 19;
constexpr std::uint64_t firstTime = 1'000'000;

// A full page of the kernel, with events at that distance in time.
std::vector<std::byte> pageOf(std::uint64_t time, std::uint32_t distance, std::size_t& events)
{
    constexpr std::size_t pageSize = 4096;
    constexpr std::size_t headSize = 16;
    constexpr std::size_t recordSize = 48;
    constexpr std::uint32_t words = recordSize / 4;
    std::vector<std::byte> page(pageSize);
    std::size_t place = headSize;
    for (; place + 4 + recordSize <= pageSize; place += 4 + recordSize) {
        const std::uint32_t head = words | distance << 5;
        const platform::EmittedEvent event{.code = code};
        std::memcpy(page.data() + place, &head, sizeof head);
        std::memcpy(page.data() + place + 4, &markerType, sizeof markerType);
        std::memcpy(page.data() + place + 12, &event, sizeof event);
        ++events;
    }
    const std::uint64_t commit = place - headSize;
    std::memcpy(page.data(), &time, sizeof time);
    std::memcpy(page.data() + 8, &commit, sizeof commit);
    return page;
}

// Millions of events a second.
double mergingRate(std::uint32_t processors)
{
    constexpr std::size_t pagesEach = 100; // of a processor, in one reading
    constexpr std::size_t readings = 20;
    constexpr std::uint64_t span = 78 * 200; // the time of a page, at least that of its events
    std::vector<std::vector<std::byte>> pages;
    std::size_t events = 0;
    for (std::size_t page = 0; page < pagesEach * readings; ++page)
        pages.push_back(pageOf(firstTime + page * span, 200, events));
    events *= processors;
    platform::TraceMerger merger({}, markerType);
    std::size_t merged = 0;
    const double cost = nanosecondsEach(readings, [&](std::size_t reading) {
        for (std::uint32_t cpu = 0; cpu < processors; ++cpu)
            for (std::size_t page = 0; page < pagesEach; ++page)
                merger.take(cpu, pages[reading * pagesEach + page]);
        const auto ready = merger.eventsUpTo(firstTime + ((reading + 1) * pagesEach - 1) * span);
        use(ready);
        merged += ready.size();
    });
    merged += merger.eventsUpTo(UINT64_MAX).size();
    if (merged != events || merger.takeLosses() != 0)
        throw std::runtime_error(fmt::format("{} of {} events came out", merged, events));
    return static_cast<double>(events) * 1e3 / (cost * readings);
}

void measureMerging(const BenchOptions& options, Report& report)
{
    const auto rates = compete(
        options, "pages of the trace", [] { return mergingRate(1); }, [] { return mergingRate(2); },
        [] { return mergingRate(8); });
    const auto add = [&](std::string_view what, const Series& rate) {
        report.add({fmt::format("pages taken apart and merged, {}", what), "M/s", rate, {}, Target::figureAtLeast(10)});
    };
    add("1 processor", rates[0]);
    add("2 processors", rates[1]);
    add("8 processors", rates[2]);
}

// A minimal service for a client that emits: it sends the marker over a socket of its own.
class HandingService final : public platform::ConnectionListenerDelegate {
public:
    explicit HandingService(platform::EmitterAccess& access)
    {
        auto socket = platform::ListeningSocket::bind(path());
        auto listener = socket ? platform::LinuxConnectionListener::create(*std::move(socket), ledger_, category_)
                               : std::unexpected(std::error_code(EADDRINUSE, std::generic_category()));
        if (!listener)
            throw std::runtime_error("no service can listen");
        listener_ = *std::move(listener);
        listener_->setDelegate(*this);
        listener_->setEmitterAccess(access);
        thread_ = std::thread([this] { listener_->resume(); });
    }
    ~HandingService() override
    {
        listener_->stop();
        thread_.join();
    }
    HandingService(const HandingService&) = delete;
    HandingService& operator=(const HandingService&) = delete;

    [[nodiscard]] std::string path() const { return directory_.path() / "service"; }

private:
    bool shouldAcceptNewConnection(platform::ConnectionListener&,
                                   const std::shared_ptr<platform::Connection>& connection) override
    {
        connection->setCallHandler(
            [](const platform::Connection::Call&) { return std::expected<void, platform::Connection::Violation>(); });
        connection->resume();
        return true;
    }

    ledger::Ledger ledger_;
    static inline constinit platform::LogCategory category_{"com.quarn.kesto", "bench"};
    const support::TemporaryDirectory directory_;
    std::unique_ptr<platform::LinuxConnectionListener> listener_;
    std::thread thread_;
};

// All emitters, on one marker.
class Emitting {
public:
    explicit Emitting(int marker) : marker_(marker)
    {
        if (access_.open(marker))
            throw std::runtime_error("the page is missing");
        access_.setTracing(true);
        kesto::Options options;
        options.socketPath = service_.path();
        options.trace = true;
        if (client_.open(options) != kesto::Status::Ok)
            throw std::runtime_error("the client cannot be made");
        constexpr std::chrono::seconds patience(10);
        for (const auto start = Clock::now(); !kesto::Tracer(client_).isActive(); std::this_thread::yield())
            if (Clock::now() - start > patience)
                throw std::runtime_error("the client got no marker");
        setTracing(false);
    }

    void setTracing(bool isTracing)
    {
        access_.setTracing(isTracing);
        emitter_.setMarker(isTracing ? marker_ : -1);
    }
    double costOfWriting(std::size_t count)
    {
        const platform::EmittedEvent record{.code = code};
        return nanosecondsEach(count, [&](std::size_t) {
            [[maybe_unused]] const ssize_t written = ::write(marker_, &record, sizeof record);
        });
    }
    double costOfClient(std::size_t count)
    {
        const kesto::Tracer tracer(client_);
        return nanosecondsEach(count, [&](std::size_t number) { tracer.emit(code, number); });
    }
    double costOfService(std::size_t count)
    {
        platform::TraceEmitter& emitter = emitter_;
        return nanosecondsEach(count, [&](std::size_t number) { emitter.emit(code, {number}); });
    }

private:
    const int marker_;
    platform::EmitterAccess access_;
    platform::TracefsEmitter emitter_;
    const HandingService service_{access_};
    kesto::Client client_;
};

void measureSilence(const BenchOptions& options, Report& report)
{
    constexpr std::size_t count = 10'000'000;
    const platform::FileDescriptor nothing(::open("/dev/null", O_WRONLY | O_CLOEXEC));
    Emitting emitting(nothing.get());
    const auto costs = compete(
        options, "emitting while no trace runs", [&] { return emitting.costOfClient(count); },
        [&] { return emitting.costOfService(count); });
    report.add({"an event while no trace runs, a client's", "ns", costs[0], {}, Target::figureAtMost(2)});
    report.add({"an event while no trace runs, the service's", "ns", costs[1], {}, Target::figureAtMost(2)});
}

constexpr std::string_view emitting = "an event while a trace runs";

void measureEmittingOn(const std::filesystem::path& tracefs, const std::string& name, const BenchOptions& options,
                       Report& report)
{
    constexpr std::size_t count = 100'000;
    auto instance = platform::TracefsInstance::open(tracefs, name);
    if (!instance)
        return report.skip(std::string(emitting), instance.error().what);
    if (const auto error = instance->switchOn(); error)
        return report.skip(std::string(emitting), error.message());
    Emitting all(instance->marker());
    all.setTracing(true);
    const auto costs = compete(
        options, "emitting", [&] { return all.costOfClient(count); }, [&] { return all.costOfService(count); },
        [&] { return all.costOfWriting(count); });
    instance->switchOff();
    const PeerFigure write{"a bare write to the marker", costs[2]};
    report.add({fmt::format("{}, a client's", emitting), "ns", costs[0], write, Target::ratioAtMost(1.2)});
    report.add({fmt::format("{}, the service's", emitting), "ns", costs[1], write, Target::ratioAtMost(1.2)});
}

void measureEmitting(const BenchOptions& options, Report& report)
{
    const std::string name = "kesto-bench";
    const auto tracefs = platform::findTracefs("/proc/self/mounts");
    if (!tracefs)
        return report.skip(std::string(emitting), "tracefs is not mounted");
    measureEmittingOn(*tracefs, name, options, report);
    std::error_code ignored;
    std::filesystem::remove(*tracefs / "instances" / name, ignored);
}

} // namespace

void measureTraceEventCost(const BenchOptions& options, Report& report)
{
    measureMerging(options, report);
    measureSilence(options, report);
    measureEmitting(options, report);
}

} // namespace bench
