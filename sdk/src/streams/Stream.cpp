// SPDX-License-Identifier: Apache-2.0
// Each change first changes the state and then reports it. So a record that is followed again, because reporting it
// failed, finds nothing to change.
#include "streams/Stream.h"

#include "foundation/values/String.h"
#include "kesto/playback.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <new>
#include <unistd.h>

namespace libkesto {
namespace {

constexpr std::string_view noDevice = "none";

double rounded(double number, double parts) noexcept
{
    return std::round(number * parts) / parts;
}

double roundedToMilliseconds(double seconds) noexcept
{
    constexpr double millisecondsInASecond = 1000;
    return rounded(seconds, millisecondsInASecond);
}

std::string_view cut(std::string_view text, std::size_t longest) noexcept
{
    return foundation::cutBetweenCharacters(text, longest);
}

// Random, so that it differs from the IDs of other programs; greater than 0.
kesto_reporter randomReporter() noexcept
{
    std::uint64_t number = 0;
    if (::getentropy(&number, sizeof number) != 0) // only where a filter forbids it
        number = static_cast<std::uint64_t>(currentMoment().secondsSince1970 * 1e9);
    constexpr auto most = static_cast<std::uint64_t>(std::numeric_limits<kesto_reporter>::max());
    return static_cast<kesto_reporter>(std::max<std::uint64_t>(1, number & most));
}

void addText(MessageEncoder& message, std::string_view key, std::string text)
{
    foundation::replaceWhatIsNotUtf8(text);
    message.addKey(key);
    message.addText(text);
}

void addValue(MessageEncoder& message, std::string_view key, const foundation::Value& value)
{
    message.addKey(key);
    message.addValue(value);
}

// A message of the library's own can only fail for want of memory.
void check(const MessageEncoder& message)
{
    if (message.status() != KESTO_OK)
        throw std::bad_alloc();
}

} // namespace

Stream::Stream(Direction direction, std::string_view application, kesto_service_type type)
    : direction_(direction),
      application_(cut(application, KESTO_LONGEST_APPLICATION)),
      type_(type)
{
    device_.reserve(KESTO_LONGEST_DEVICE);
    format_.encoding.reserve(KESTO_LONGEST_ENCODING);
}

void Stream::follow(const StreamRecord& record, std::string_view texts, CallTaker* service)
{
    switch (record.action) {
    case StreamAction::Start: return start(record, texts, service);
    case StreamAction::Stop: return stop(record.when, service);
    case StreamAction::Pause: return pause(record.when, service);
    case StreamAction::Resume: return resume(record.when, service);
    case StreamAction::Volume: return setVolume(record.number, isMuted_, record.when, service);
    case StreamAction::Mute: return setVolume(setVolume_, record.isMuted, record.when, service);
    case StreamAction::Route: return setDevice(texts, record.when, service);
    case StreamAction::Format: return setFormat(record, texts, record.when, service);
    case StreamAction::Fault:
        if (isStarted_ && service != nullptr)
            reportFault(record, *service);
        return;
    }
}

// ---- What callers do ----

void Stream::start(const StreamRecord& record, std::string_view texts, CallTaker* service)
{
    stop(record.when, service);
    if (record.hasDevice)
        setDevice(texts.substr(0, record.deviceBytes), record.when, nullptr);
    if (record.hasFormat)
        setFormat(record, texts.substr(record.deviceBytes), record.when, nullptr);
    reporter_ = randomReporter();
    isStarted_ = true;
    runs_ = 0;
    startedAt_ = record.when;
    if (service != nullptr)
        openSession(*service);
    resume(record.when, service);
}

void Stream::stop(Moment when, CallTaker* service)
{
    if (!isStarted_)
        return;
    pause(when, service);
    isStarted_ = false;
    if (service == nullptr)
        return;
    MessageEncoder message;
    addValue(message, "session_duration", roundedToMilliseconds(when.uptime - startedAt_.uptime));
    send(message, category(), KESTO_EVENT_DEACTIVATE, when, *service);
    service->takeCall(call(KESTO_OPERATION_STOP_SESSION));
    service->takeCall(call(KESTO_OPERATION_DESTROY_SESSION));
}

void Stream::pause(Moment when, CallTaker* service)
{
    if (!isRunning_)
        return;
    isRunning_ = false;
    unchangedSince_ = when;
    sendRunning(when, service);
}

void Stream::resume(Moment when, CallTaker* service)
{
    if (!isStarted_ || isRunning_)
        return;
    isRunning_ = true;
    ++runs_;
    unchangedSince_ = when;
    sendRunning(when, service);
}

void Stream::setVolume(double volume, bool isMuted, Moment when, CallTaker* service)
{
    const double before = this->volume();
    setVolume_ = volume;
    isMuted_ = isMuted;
    if (this->volume() == before || !hasToReport(when, service))
        return;
    MessageEncoder message;
    addValue(message, "PomoSessionVolume", this->volume());
    send(message, KESTO_CATEGORY_VOLUME, KESTO_EVENT_STATE, when, *service);
}

void Stream::setDevice(std::string_view device, Moment when, CallTaker* service)
{
    const std::string_view given = device.empty() ? noDevice : device;
    if (hasDevice_ && given == device_)
        return;
    hasDevice_ = true;
    device_ = given;
    if (!hasToReport(when, service))
        return;
    MessageEncoder message;
    addDevice(message);
    send(message, KESTO_CATEGORY_ROUTE_CHANGE, KESTO_EVENT_STATE, when, *service);
}

void Stream::setFormat(const StreamRecord& record, std::string_view encoding, Moment when, CallTaker* service)
{
    if (format_.encoding == encoding && format_.rate == record.rate && format_.channels == record.channels)
        return;
    format_.encoding = encoding;
    format_.rate = record.rate;
    format_.channels = record.channels;
    if (!hasToReport(when, service))
        return;
    MessageEncoder message;
    addFormat(message);
    send(message, KESTO_CATEGORY_SETUP, KESTO_EVENT_STATE, when, *service);
}

void Stream::reportFault(const StreamRecord& record, CallTaker& service) const
{
    MessageEncoder message;
    addText(message, "issue", direction_ == Direction::Output ? "underrun" : "overrun");
    addValue(message, "late_cycles", record.cycles);
    addValue(message, "issue_duration", roundedToMilliseconds(record.number));
    addDevice(message);
    send(message, KESTO_CATEGORY_ERROR, KESTO_EVENT_ISSUE_DETECTOR, record.when, service);
}

void Stream::renewSession(CallTaker& service) const
{
    openSession(service);
    if (isRunning_)
        sendRunning(unchangedSince_, &service);
}

// ---- The state, and what is sent of it ----

double Stream::volume() const noexcept
{
    constexpr double parts = 10'000; // four decimals, so that equal positions of a slider are equal numbers
    return isMuted_ ? 0 : rounded(std::min(setVolume_, 1.0), parts) + 0.0; // which makes 0 of -0
}

kesto_category Stream::category() const noexcept
{
    return direction_ == Direction::Output ? KESTO_CATEGORY_PLAYBACK : KESTO_CATEGORY_RECORD;
}

bool Stream::hasToReport(Moment when, const CallTaker* service) noexcept
{
    unchangedSince_ = when;
    return isStarted_ && service != nullptr;
}

void Stream::addFormat(MessageEncoder& message) const
{
    if (format_.encoding.empty())
        return;
    std::string text = format_.encoding;
    for (const std::uint32_t part : {format_.rate, format_.channels})
        if (part > 0)
            text.append("/").append(std::to_string(part));
    addText(message, "session_selected_format", std::move(text));
    if (format_.channels > 0)
        addValue(message, "mChannelsPerFrame", format_.channels);
}

void Stream::addDevice(MessageEncoder& message) const
{
    if (hasDevice_)
        addText(message, "active_devices", device_);
}

void Stream::sendRunning(Moment when, CallTaker* service) const
{
    if (service == nullptr)
        return;
    MessageEncoder message;
    addValue(message, direction_ == Direction::Output ? "session_output_running" : "session_input_running", isRunning_);
    addFormat(message);
    addDevice(message);
    addValue(message, "PomoSessionVolume", volume());
    // Without it a second Start would repeat the first, and the service drops repetitions.
    addValue(message, "session_run", runs_);
    send(message, category(), isRunning_ ? KESTO_EVENT_START : KESTO_EVENT_STOP, when, *service);
}

void Stream::send(MessageEncoder& message, kesto_category category, kesto_event_type type, Moment when,
                  CallTaker& service) const
{
    addValue(message, timestampKey, when.secondsSince1970);
    addValue(message, uptimeKey, wholeSeconds(when.uptime));
    check(message);
    Call sent = call(KESTO_OPERATION_SEND);
    sent.head.reporter = 0;
    sent.head.category = category;
    sent.head.type = type;
    sent.head.hasReporters = true;
    sent.head.reporterCount = 1;
    sent.reporters = {reporter_};
    sent.head.entryCount = message.entryCount();
    sent.entries = message.entries();
    service.takeCall(sent);
}

void Stream::openSession(CallTaker& service) const
{
    MessageEncoder configuration;
    addText(configuration, "HostApplicationDisplayID", application_);
    check(configuration);
    service.takeCall(call(KESTO_OPERATION_CREATE_SESSION));
    Call typed = call(KESTO_OPERATION_SET_SERVICE_TYPE);
    typed.head.type = type_;
    service.takeCall(typed);
    Call configured = call(KESTO_OPERATION_SET_CONFIGURATION);
    configured.head.entryCount = configuration.entryCount();
    configured.entries = configuration.entries();
    service.takeCall(configured);
    service.takeCall(call(KESTO_OPERATION_START_SESSION));
}

Call Stream::call(kesto_operation operation) const
{
    CallHead head{.operation = operation};
    head.reporter = reporter_;
    return {.head = head, .reporters = {}, .entries = {}};
}

} // namespace libkesto
