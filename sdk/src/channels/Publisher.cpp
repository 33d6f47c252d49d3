// SPDX-License-Identifier: Apache-2.0
// One lock protects the list of channels and their files. Changes of values never take it: they use the channel's own
// mark and the bell.
#include "channels/Publisher.h"

#include "SignalFreeThread.h"
#include "platform/linux/channels/ChannelOwner.h"
#include "platform/linux/files/FilesAt.h"

#include <algorithm>
#include <cerrno>
#include <new>
#include <system_error>
#include <unistd.h>

namespace {

using libkesto::ChannelClock;
using std::chrono::milliseconds;

constexpr int shareOfTime = 20; // the thread writes for at most a twentieth of its time
constexpr milliseconds pauseAfterFailure(5000);
constexpr milliseconds longestPause(60'000);

int pollTime(ChannelClock::duration pause)
{
    const auto rounded = std::chrono::ceil<milliseconds>(pause);
    return static_cast<int>(std::clamp(rounded, milliseconds(0), longestPause).count());
}

} // namespace

kesto_publisher::kesto_publisher(Settings settings, platform::FileDescriptor doorbell)
    : process_(::getpid()),
      settings_(std::move(settings)),
      owner_(platform::randomDigits()),
      bell_(std::move(doorbell)),
      refreshed_(ChannelClock::now())
{
}

std::unique_ptr<kesto_publisher> kesto_publisher::create(Settings settings)
{
    platform::FileDescriptor doorbell = libkesto::Doorbell::makeDescriptor();
    if (!doorbell)
        return nullptr;
    std::unique_ptr<kesto_publisher> publisher(new kesto_publisher(std::move(settings), std::move(doorbell)));
    return publisher->start() ? std::move(publisher) : nullptr;
}

bool kesto_publisher::start() noexcept
{
    return libkesto::startThread(thread_, [this] { run(); });
}

kesto_publisher::~kesto_publisher()
{
    isEnding_.store(true);
    bell_.ring();
    if (thread_.joinable())
        thread_.join();
    const foundation::Lock lock(lock_);
    for (const Published& published : channels_)
        published.folder->remove(published.name);
}

void kesto_publisher::run() noexcept
{
    pthread_setname_np(pthread_self(), "libkesto-files");
    while (!isEnding_.load()) { // its ring may have come during the rest
        sleepUntilNeeded();
        if (isEnding_.load())
            return;
        const Time begin = ChannelClock::now();
        int error = 0;
        {
            const foundation::Lock lock(lock_);
            error = write(isRefreshDue(begin));
        }
        const auto share = (ChannelClock::now() - begin) * shareOfTime;
        const ChannelClock::duration least = error == 0 ? settings_.writeInterval : pauseAfterFailure;
        rest(begin + std::max(least, share));
    }
}

void kesto_publisher::rest(Time end) noexcept
{
    for (Time now = ChannelClock::now(); now < end && !isEnding_.load(); now = ChannelClock::now())
        bell_.wait(pollTime(end - now));
}

void kesto_publisher::sleepUntilNeeded() noexcept
{
    constexpr int forever = -1;
    int pause = forever;
    bell_.fallAsleep(); // before the check for changes
    {
        const foundation::Lock lock(lock_);
        if (std::ranges::any_of(channels_, [](const Published& each) { return each.channel->isChanged(); }))
            return bell_.stayAwake();
        if (timedChannels_ > 0 && settings_.refreshInterval)
            pause = pollTime(refreshed_ + *settings_.refreshInterval - ChannelClock::now());
    }
    bell_.wait(pause);
}

bool kesto_publisher::isRefreshDue(Time now) const noexcept
{
    return timedChannels_ > 0 && settings_.refreshInterval && now - refreshed_ >= *settings_.refreshInterval;
}

int kesto_publisher::write(bool isRefresh) noexcept
{
    const Time now = ChannelClock::now();
    if (isRefresh)
        refreshed_ = now;
    int error = 0;
    for (Published& published : channels_)
        if (published.channel->isChanged() || (isRefresh && published.channel->isTimed()))
            if (const int failure = write(published, now); failure != 0)
                error = failure;
    return error;
}

int kesto_publisher::write(Published& published, Time now) noexcept
{
    published.channel->setChanged(false); // before its value is read: later changes are written next time
    int error = 0;
    try {
        text_.clear();
        published.channel->appendText(text_, now);
        error = published.folder->replace(published.name, text_);
    } catch (const std::bad_alloc&) {
        error = ENOMEM;
    }
    ++(error == 0 ? filesWritten_ : filesFailed_);
    if (error != 0)
        published.channel->setChanged(true);
    return error;
}

std::shared_ptr<libkesto::ChannelFolder> kesto_publisher::folder(libkesto::ChannelPlace place)
{
    std::weak_ptr<libkesto::ChannelFolder>& known = folders_[place];
    auto folder = known.lock();
    if (folder)
        return folder;
    std::weak_ptr<libkesto::DriverClaim>& knownClaim = claims_[place.front()];
    auto claim = knownClaim.lock();
    if (!claim)
        knownClaim = claim = std::make_shared<libkesto::DriverClaim>(owner_);
    known = folder = std::make_shared<libkesto::ChannelFolder>(
        settings_.root, std::move(place), platform::channelTemporaryFileName(owner_), std::move(claim));
    return folder;
}

std::expected<kesto_channel*, kesto_status> kesto_publisher::add(std::unique_ptr<kesto_channel> channel,
                                                                 libkesto::ChannelPlace place, std::string name)
{
    kesto_channel* const added = channel.get();
    {
        const foundation::Lock lock(lock_);
        if (channels_.size() >= KESTO_MOST_CHANNELS)
            return std::unexpected(KESTO_TOO_LARGE);
        channels_.reserve(channels_.size() + 1);
        Published published{std::move(channel), folder(std::move(place)), std::move(name)};
        if (const int error = write(published, ChannelClock::now()); error != 0) {
            errno = error;
            return std::unexpected(KESTO_SYSTEM_ERROR);
        }
        added->setPublisher(*this);
        channels_.push_back(std::move(published));
        if (!added->isTimed())
            return added;
        ++timedChannels_;
    }
    bell_.ring(); // from now on the thread needs time-outs
    return added;
}

void kesto_publisher::remove(const kesto_channel& channel) noexcept
{
    const foundation::Lock lock(lock_);
    const auto found = std::ranges::find(channels_, &channel, [](const Published& each) { return each.channel.get(); });
    if (found == channels_.end())
        return;
    found->folder->remove(found->name);
    timedChannels_ -= channel.isTimed() ? 1 : 0;
    channels_.erase(found);
    const auto hasExpired = [](const auto& known) { return known.second.expired(); };
    std::erase_if(folders_, hasExpired);
    std::erase_if(claims_, hasExpired);
}

kesto_status kesto_publisher::flush() noexcept
{
    const foundation::Lock lock(lock_);
    const int error = write(true);
    if (error == 0)
        return KESTO_OK;
    errno = error;
    return KESTO_SYSTEM_ERROR;
}

kesto_publisher_statistics kesto_publisher::statistics() const noexcept
{
    return {.files_written = filesWritten_.get(), .files_failed = filesFailed_.get()};
}
