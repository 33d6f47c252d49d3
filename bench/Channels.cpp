// SPDX-License-Identifier: Apache-2.0
// Driver statistics: a snapshot of a thousand channels compared with reading the same files in one loop, formatting
// their changes, and publishing values compared with writing a file for each.
#include "Groups.h"
#include "driver/KestoReportingDriverUtility.h"
#include "platform/linux/channels/ChannelDifference.h"
#include "platform/linux/channels/LinuxReportingChannels.h"
#include "support/InProcessPlatform.h"

#include <array>
#include <cstdlib>
#include <ctime>
#include <fcntl.h>
#include <filesystem>
#include <fmt/format.h>
#include <fstream>
#include <kesto/channels.hpp>
#include <stdexcept>
#include <thread>
#include <unistd.h>

namespace bench {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t channelCount = 1000;
const std::vector<platform::ChannelSelection> speaker{{"Speaker", std::nullopt}};

// A temporary directory in the usual, in-memory place of channels, if that exists.
class ChannelRoot {
public:
    ChannelRoot()
    {
        std::string pattern = fs::exists("/dev/shm") ? "/dev/shm/kesto-bench-XXXXXX" : "/tmp/kesto-bench-XXXXXX";
        if (::mkdtemp(pattern.data()) == nullptr)
            throw std::runtime_error("no temporary directory");
        path_ = pattern;
    }
    ~ChannelRoot()
    {
        std::error_code ignored;
        fs::remove_all(path_, ignored);
    }
    ChannelRoot(const ChannelRoot&) = delete;
    ChannelRoot& operator=(const ChannelRoot&) = delete;

    [[nodiscard]] const fs::path& path() const { return path_; }

private:
    fs::path path_;
};

void write(const fs::path& path, std::string_view text)
{
    if (!(std::ofstream(path) << text << std::flush))
        throw std::runtime_error("a channel cannot be written");
}

// Half of the channels are numbers, the others histograms of ten buckets and states; the text is that after so many
// periods.
std::string textOfChannel(std::size_t channel, std::size_t periods)
{
    if (channel % 2 == 0)
        return fmt::format("simple\n{}\n", channel + periods);
    if (channel % 4 == 3)
        return fmt::format("state\nRunning {} {} 0.880000\nIdle {} {} 0.120000\n", 12 + periods, 88'000 * periods,
                           11 + periods, 12'000 * periods);
    std::string text = "histogram us\n3 97\n";
    for (std::size_t bucket = 0; bucket < 10; ++bucket)
        text += fmt::format("{} {} {}\n", bucket * 10, bucket * 10 + 10, (bucket % 3) * periods);
    return text;
}

std::vector<fs::path> publishAll(const fs::path& root, std::size_t periods)
{
    std::vector<fs::path> files;
    const fs::path folder = root / "amp<0x1a>" / "Speaker" / "-";
    fs::create_directories(folder);
    for (std::size_t channel = 0; channel < channelCount; ++channel) {
        files.push_back(folder / fmt::format("measured value {:04}", channel));
        write(files.back(), textOfChannel(channel, periods));
    }
    return files;
}

// Nanoseconds for each channel.
double costOfSample(platform::LinuxReportingChannels& channels, const platform::ReportingChannels::Subscribed& of)
{
    constexpr std::size_t times = 10;
    return nanosecondsEach(times,
                           [&](std::size_t) {
                               const auto sample = channels.createSamples(*of.subscription, *of.channels,
                                                                          *channels.readChannels(speaker));
                               if (!sample || sample->channels.size() != channelCount)
                                   throw std::runtime_error("not all channels were sampled");
                               use(*sample);
                           })
        / channelCount;
}

double costOfReading(const std::vector<fs::path>& files)
{
    constexpr std::size_t times = 10;
    std::array<char, 4096> buffer;
    return nanosecondsEach(times * files.size(), [&](std::size_t each) {
        const int file = ::open(files[each % files.size()].c_str(), O_RDONLY | O_CLOEXEC);
        if (::read(file, buffer.data(), buffer.size()) <= 0)
            throw std::runtime_error("a file cannot be read");
        ::close(file);
        use(buffer);
    });
}

double costOfDifference(const platform::ReportingSample& from, const platform::ReportingSample& to)
{
    constexpr std::size_t times = 20;
    return nanosecondsEach(times,
                           [&](std::size_t) {
                               const auto difference = platform::channelDifference(from, to);
                               KestoReportingDriverUtility::DriverStats stats;
                               for (const auto& channel : difference.channels) {
                                   if (!channel.states.empty())
                                       KestoReportingDriverUtility::processStateData(channel, stats);
                                   else if (!channel.buckets.empty())
                                       KestoReportingDriverUtility::processHistogramData(channel, stats);
                                   else
                                       KestoReportingDriverUtility::processSimpleData(channel, stats);
                               }
                               if (stats.size() != channelCount)
                                   throw std::runtime_error("not all channels were put into words");
                               use(stats);
                           })
        / channelCount;
}

void measureSampling(const BenchOptions& options, Report& report)
{
    const InProcessPlatform platform;
    const ChannelRoot root;
    platform::LinuxReportingChannels channels(root.path(), "/nowhere", platform::current().ledger,
                                              platform::ProviderLog(platform::current().log));
    publishAll(root.path(), 1);
    const auto subscribed = channels.createSubscription(
        *channels.copyChannelsInGroup("Speaker", std::nullopt, *channels.readChannels(speaker)).channels);
    const auto sample = [&] {
        return channels.createSamples(*subscribed.subscription, *subscribed.channels, *channels.readChannels(speaker))
            .value();
    };
    const platform::ReportingSample before = sample();
    const auto files = publishAll(root.path(), 2);
    const platform::ReportingSample after = sample();

    const auto sampling = compete(
        options, "sampling channels", [&] { return costOfSample(channels, subscribed); },
        [&] { return costOfReading(files); }, [&] { return costOfDifference(before, after); });
    report.add({fmt::format("a channel in a snapshot of {}", channelCount), "ns", sampling[0],
                PeerFigure{"reading the files in a loop", sampling[1]}, Target::ratioAtMost(2)});
    report.add({"how a channel changed, put into words", "ns", sampling[2], std::nullopt, Target::figureAtMost(2000)});
}

void check(kesto::Status status)
{
    if (status != kesto::Status::Ok)
        throw std::runtime_error(fmt::format("libkesto: {}", kesto::errorText(status)));
}

// The processor time of all threads of this process, in nanoseconds.
double processTime()
{
    timespec time{};
    ::clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &time);
    return static_cast<double>(time.tv_sec) * 1e9 + static_cast<double>(time.tv_nsec);
}

class Publishing {
public:
    Publishing()
    {
        kesto::PublisherOptions options;
        options.root = root_.path();
        check(publisher_.open(options));
        for (std::size_t index = 0; index < channels_.size(); ++index)
            check(channels_[index].create(publisher_, {"mixer", "Tx", "", fmt::format("channel {}", index)}));
        check(histogram_.create(publisher_, {"mixer", "Tx", "", "histogram"}, "us", {0, 10, 20, 50, 100, 200, 500}));
        check(state_.create(publisher_, {"mixer", "Speaker", "", "state"}, {"Idle", "Running"}));
    }

    double costOfAdding()
    {
        return nanosecondsEach(many, [&](std::size_t) { channels_[0].add(1); });
    }
    double costOfRecording()
    {
        return nanosecondsEach(many,
                               [&](std::size_t each) { histogram_.record(static_cast<std::int64_t>(each % 600)); });
    }
    double costOfEntering()
    {
        return nanosecondsEach(many, [&](std::size_t each) { state_.enter(each % 2); });
    }

    // A thousand values a second, on ten channels in turns: the cost for the caller and for the publisher's thread,
    // without this program's wake-ups for each tick. It measures processor time, because the wall clock would also
    // count other threads that run on the caller's processor, and so count the publisher's work twice. It takes a whole
    // second, so that the publisher writes equally often in each round.
    double costOfSecond()
    {
        constexpr int ticks = 100;
        constexpr auto tick = std::chrono::milliseconds(10);
        const double begin = processTime() - processorTime();
        double adding = 0;
        auto next = Clock::now();
        for (int count = 0; count < ticks; ++count) {
            const double start = processorTime();
            for (kesto::SimpleChannel& channel : channels_)
                channel.add(1);
            adding += processorTime() - start;
            std::this_thread::sleep_until(next += tick);
        }
        const double writing = processTime() - processorTime() - begin;
        return (adding + writing) / (ticks * static_cast<double>(channels_.size()));
    }

    // The work of a program that writes a file itself whenever a value changes.
    double costOfWriting()
    {
        constexpr std::size_t few = 500;
        const fs::path file = root_.path() / "file";
        const fs::path temporary = root_.path() / "file.new";
        return nanosecondsEach(few, [&](std::size_t each) {
            const int descriptor = ::open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
            const std::string text = fmt::format("simple\n{}\n", each);
            if (::write(descriptor, text.data(), text.size()) < 0 || ::rename(temporary.c_str(), file.c_str()) != 0)
                throw std::runtime_error("a file cannot be written");
            ::close(descriptor);
        });
    }

private:
    static constexpr std::size_t many = 200'000;

    const ChannelRoot root_;
    kesto::Publisher publisher_;
    std::array<kesto::SimpleChannel, 10> channels_;
    kesto::HistogramChannel histogram_;
    kesto::StateChannel state_;
};

void measurePublishing(const BenchOptions& options, Report& report)
{
    Publishing publishing;
    const auto costs = compete(
        options, "publishing", [&] { return publishing.costOfAdding(); }, [&] { return publishing.costOfRecording(); },
        [&] { return publishing.costOfEntering(); }, [&] { return publishing.costOfSecond(); },
        [&] { return publishing.costOfWriting(); });
    report.add({"adding to a value, for the caller", "ns", costs[0], std::nullopt, Target::figureAtMost(1000)});
    report.add(
        {"recording into a histogram, for the caller", "ns", costs[1], std::nullopt, Target::figureAtMost(1000)});
    report.add({"entering a state, for the caller", "ns", costs[2], std::nullopt, Target::figureAtMost(1000)});
    report.add({"publishing 1,000 values a second on 10 channels, all in all", "ns", costs[3],
                PeerFigure{"a file written for each", costs[4]}, Target::figureAtMost(1000)});
}

} // namespace

void measureChannels(const BenchOptions& options, Report& report)
{
    measureSampling(options, report);
    measurePublishing(options, report);
}

} // namespace bench
