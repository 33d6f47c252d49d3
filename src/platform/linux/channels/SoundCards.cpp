// SPDX-License-Identifier: Apache-2.0
// The parser finds values by their names and not by columns, which differ between kernels; missing or unknown text
// gives no channel.
#include "platform/linux/channels/SoundCards.h"

#include "foundation/values/String.h"
#include "platform/linux/channels/ChannelSelections.h"
#include "platform/linux/files/SmallFile.h"

#include <algorithm>
#include <charconv>
#include <string_view>

namespace platform {
namespace {

namespace fs = std::filesystem;

bool isNumber(std::string_view text)
{
    return !text.empty() && text.find_first_not_of("0123456789") == std::string_view::npos;
}

// The names in a folder of the form prefix, number and perhaps one of these letters, in the order of the numbers.
std::vector<std::string> numberedNames(const fs::path& folder, std::string_view prefix, std::string_view letters)
{
    std::vector<std::string> names;
    std::error_code error;
    for (auto entry = fs::directory_iterator(folder, error); !error && entry != fs::directory_iterator();
         entry.increment(error)) {
        std::string name = entry->path().filename();
        std::string_view number = name;
        if (!number.starts_with(prefix))
            continue;
        number.remove_prefix(prefix.size());
        if (!letters.empty() && !number.empty() && letters.find(number.back()) != std::string_view::npos)
            number.remove_suffix(1);
        else if (!letters.empty())
            continue;
        if (isNumber(number))
            names.push_back(std::move(name));
    }
    std::ranges::sort(names, {},
                      [](const std::string& name) { return std::pair(name.size(), std::string_view(name)); });
    return names;
}

std::string_view trimmed(std::string_view text)
{
    const std::size_t first = text.find_first_not_of(" \t");
    if (first == std::string_view::npos)
        return {};
    return text.substr(first, text.find_last_not_of(" \t") - first + 1);
}

// The text behind "name :" on its line; empty if the line is missing.
std::string_view valueOf(std::string_view name, std::string_view text)
{
    while (!text.empty()) {
        const std::size_t end = std::min(text.find('\n'), text.size() - 1);
        const std::string_view line = text.substr(0, end);
        text.remove_prefix(end + 1);
        const std::size_t colon = line.find(':');
        if (colon != std::string_view::npos && trimmed(line.substr(0, colon)) == name)
            return trimmed(line.substr(colon + 1));
    }
    return {};
}

// The number at the start of the text; 0 if it is missing or negative.
std::int64_t leadingNumber(std::string_view text)
{
    std::int64_t number = 0;
    std::from_chars(text.data(), text.data() + text.size(), number);
    return std::max<std::int64_t>(number, 0);
}

// "1240.123456789" in milliseconds.
std::int64_t milliseconds(std::string_view time)
{
    constexpr std::int64_t most = INT64_MAX / 1000 - 1;
    constexpr std::size_t digits = 3;
    const std::size_t point = time.find('.');
    const std::string_view fraction = point == std::string_view::npos ? "" : time.substr(point + 1, digits);
    return std::min(leadingNumber(time), most) * 1000 + (fraction.size() == digits ? leadingNumber(fraction) : 0);
}

// A stream's place, and the kernel's files about it.
class Stream {
public:
    Stream(ReportingChannel place, std::string name, const fs::path& folder)
        : place_(std::move(place)),
          name_(std::move(name)),
          status_(read(folder / "status"))
    {
        if (isOpen())
            parameters_ = read(folder / "hw_params");
    }

    void append(std::vector<ReportingChannel>& channels) const
    {
        if (status_.empty())
            return;
        channels.push_back(pointer("hw_ptr"));
        channels.push_back(pointer("appl_ptr"));
        const std::string_view state = valueOf("state", status_);
        if (state.empty())
            return;
        channels.push_back(residency("state", state, timeInState()));
        const bool isRunning = state == "RUNNING" || state == "DRAINING";
        if (const std::string format = this->format(); !format.empty())
            channels.push_back(residency("format", format, isRunning ? timeInState() : 0));
    }

private:
    // Empty for a missing file, and for content that no kernel writes.
    static std::string read(const fs::path& file)
    {
        auto text = readSmallFile(file, SoundCards::largestFile);
        return text && foundation::isValidUtf8(*text) ? *std::move(text) : std::string();
    }

    [[nodiscard]] bool isOpen() const { return !valueOf("state", status_).empty(); } // else "closed"

    [[nodiscard]] std::uint64_t timeInState() const
    {
        const std::int64_t since = milliseconds(valueOf("trigger_time", status_));
        const std::int64_t now = milliseconds(valueOf("tstamp", status_));
        return since > 0 && now > since ? static_cast<std::uint64_t>(now - since) : 0;
    }

    // Format, rate and channels; empty before they are set.
    [[nodiscard]] std::string format() const
    {
        const std::string_view format = valueOf("format", parameters_);
        const std::int64_t rate = leadingNumber(valueOf("rate", parameters_));
        const std::int64_t channels = leadingNumber(valueOf("channels", parameters_));
        if (format.empty() || rate == 0 || channels == 0)
            return {};
        return std::string(format) + '/' + std::to_string(rate) + '/' + std::to_string(channels);
    }

    [[nodiscard]] ReportingChannel channel(std::string_view what, ChannelFormat format) const
    {
        ReportingChannel channel = place_;
        channel.format = static_cast<std::uint8_t>(format);
        channel.name = name_ + ' ';
        channel.name->append(what);
        return channel;
    }
    [[nodiscard]] ReportingChannel pointer(std::string_view name) const
    {
        ReportingChannel made = channel(name, ChannelFormat::Simple);
        made.unit = "frames";
        made.value = leadingNumber(valueOf(name, status_));
        return made;
    }
    [[nodiscard]] ReportingChannel residency(std::string_view what, std::string_view state, std::uint64_t time) const
    {
        ReportingChannel made = channel(what, ChannelFormat::State);
        made.unit = "ms";
        made.states.push_back({.name = std::string(state), .transitions = 1, .residency = time, .dutyCycle = 1});
        return made;
    }

    const ReportingChannel place_;
    const std::string name_;
    const std::string status_;
    std::string parameters_;
};

// "PCH", or the folder's name for a card without an ID.
std::string cardName(const fs::path& folder)
{
    const auto text = readSmallFile(folder / "id", SoundCards::largestFile);
    const std::string_view name = text ? trimmed(std::string_view(*text).substr(0, text->find('\n'))) : "";
    return name.empty() || !foundation::isValidUtf8(name) ? folder.filename().string() : std::string(name);
}

} // namespace

std::vector<ReportingChannel> SoundCards::read(const std::vector<ChannelSelection>& selections) const
{
    std::vector<ReportingChannel> channels;
    std::size_t streams = 0;
    for (const std::string& card : numberedNames(root_, "card", "")) {
        ReportingChannel place;
        place.driver = cardName(root_ / card);
        for (const std::string& device : numberedNames(root_ / card, "pcm", "pc")) {
            place.group = device.back() == 'p' ? "Tx" : "Rx";
            place.subgroup = device;
            if (!selects(selections, place.group, place.subgroup))
                continue;
            for (const std::string& stream : numberedNames(root_ / card / device, "sub", ""))
                if (++streams <= mostStreams)
                    Stream(place, stream, root_ / card / device / stream).append(channels);
        }
    }
    return channels;
}

} // namespace platform
