// SPDX-License-Identifier: Apache-2.0
// The requesting thread collects the state at the moment of the bug; the background queue reads /proc and writes to the
// disk, which may block.
#include "platform/linux/bugs/LinuxBugCapture.h"

#include "foundation/text/PrettyJsonWriter.h"
#include "platform/linux/bugs/BugEvidence.h"
#include "platform/linux/files/SystemError.h"

#include <algorithm>
#include <fmt/format.h>
#include <utility>

namespace platform {
namespace {

using foundation::Dictionary;
using foundation::Value;

// JSON for people and programs. Numbers that JSON cannot express become text.
std::string jsonOf(const Value& value)
{
    std::string json;
    bool isWhole = false;
    {
        foundation::PrettyJsonWriter writer([&json](std::string_view piece) { json += piece; });
        writer.write(value);
        isWhole = writer.isWhole();
    }
    return isWhole ? json + '\n' : jsonOf(value.text());
}

Dictionary refusal(std::string_view reason)
{
    return {{"success", false}, {"reason", reason}};
}

} // namespace

class LinuxBugCapture::Reporter final : public BugCaptureReporter {
public:
    explicit Reporter(LinuxBugCapture& capture) : capture_(capture) { }

    void requestSnapshot(Dictionary signature, double duration, const std::optional<Value>& event,
                         const std::optional<Value>& payload, Reply reply) override
    {
        capture_.submit({std::move(signature), duration, event.value_or(Value()), payload.value_or(Value()),
                         std::move(reply), currentSender()});
    }

private:
    LinuxBugCapture& capture_;
};

LinuxBugCapture::LinuxBugCapture(const std::filesystem::path& stateDirectory, Sources sources, ProviderLog log,
                                 const Limits& limits)
    : sources_(std::move(sources)),
      log_(log),
      limits_(limits),
      folder_(stateDirectory, limits.folder)
{
}

std::unique_ptr<BugCaptureReporter> LinuxBugCapture::makeReporter()
{
    return std::make_unique<Reporter>(*this);
}

// Whether a snapshot may be taken now; counts the refusal.
bool LinuxBugCapture::admit()
{
    const double now = sources_.clock.systemUptime();
    const foundation::Lock lock(lock_);
    while (!admitted_.empty() && now - admitted_.front() >= limits_.seconds)
        admitted_.pop_front();
    const bool isTooMuch = std::max(admitted_.size(), waiting_.size()) >= limits_.mostAtOnce;
    if (isTooMuch)
        sources_.ledger.count(ledger::Counter::CapturesRefused);
    else
        admitted_.push_back(now);
    return !isTooMuch;
}

void LinuxBugCapture::submit(Request request)
{
    WorkQueue& queue = sources_.workQueues.backgroundQueue();
    if (!admit()) {
        queue.submit([reply = std::move(request.reply)]() mutable {
            reply(refusal("too many snapshots were asked for: wait some minutes"));
        });
        return;
    }
    if (describeState_)
        request.state = describeState_();
    const foundation::Lock lock(lock_);
    waiting_.push_back(std::move(request));
    if (!std::exchange(isTaking_, true))
        queue.submit([this] { takeNext(); });
}

// Takes one snapshot in each item, so that other items of the queue run in between.
void LinuxBugCapture::takeNext()
{
    Request request;
    {
        const foundation::Lock lock(lock_);
        request = std::move(waiting_.front());
        waiting_.pop_front();
    }
    Dictionary response = capture(request);
    request.reply(std::move(response));
    const foundation::Lock lock(lock_);
    isTaking_ = !waiting_.empty();
    if (isTaking_)
        sources_.workQueues.backgroundQueue().submit([this] { takeNext(); });
}

Dictionary LinuxBugCapture::capture(const Request& request)
{
    const auto name = write(request);
    sources_.ledger.count(name ? ledger::Counter::CapturesTaken : ledger::Counter::CapturesFailed);
    sources_.ledger.count(ledger::Counter::CapturesEvicted, folder_.takeRemoved());
    if (!name) {
        log_.error("a bug was not captured in {}: {}", folder_.path().native(), name.error());
        return refusal(name.error());
    }
    log_.note("captured a bug: {}", (folder_.path() / *name).native());
    return responseOf(*name);
}

Dictionary LinuxBugCapture::responseOf(std::string_view name) const
{
    return {{"success", true}, {"snapshot", name}, {"directory", (folder_.path() / name).native()}};
}

// The name of the snapshot, or the reason why it failed.
std::expected<std::string, std::string> LinuxBugCapture::write(const Request& request)
{
    if (const auto error = folder_.checkFreeSpace())
        return std::unexpected(error == std::errc::no_space_on_device
                                   ? fmt::format("less than {} MiB are free", limits_.folder.bytesLeftFree >> 20)
                                   : std::string(systemErrorText(error.value())));
    const double time = sources_.clock.secondsSince1970();
    auto name = folder_.nextName(time);
    if (!name)
        return std::unexpected(std::string(systemErrorText(name.error().value())));
    const auto error = folder_.add(
        *name, {{"signature.json", jsonOf(request.signature)}, {"response.json", jsonOf(responseOf(*name))}},
        stateAt(time, request));
    if (error)
        return std::unexpected(std::string(systemErrorText(error.value())));
    return *std::move(name);
}

std::vector<BugCaptureFolder::File> LinuxBugCapture::stateAt(double time, const Request& request) const
{
    const Value* const process = request.signature.find("detectedProcess");
    const Dictionary asked{{"time", time},
                           {"systemUptime", sources_.clock.systemUptime()},
                           {"duration", request.duration},
                           {"event", request.event},
                           {"payload", request.payload},
                           {"sender", request.sender == 0 ? Value() : Value(request.sender)},
                           {"refusedBefore", sources_.ledger.sinceStart()[ledger::Counter::CapturesRefused]}};
    return {{"request.json", jsonOf(asked)},
            {"log.txt", sources_.log.text()},
            {"processes.json",
             jsonOf(processEvidence(sources_.proc, process == nullptr ? std::string_view() : process->stringView(),
                                    request.sender))},
            {"sound.json", jsonOf(soundEvidence(sources_.proc))},
            {"service.json", jsonOf(request.state)}};
}

} // namespace platform
