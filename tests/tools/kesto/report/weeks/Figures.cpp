// SPDX-License-Identifier: Apache-2.0
// The truth is asked for one figure at a time: slow, and too simple to be wrong in the way of the report.
#include "tools/kesto/report/weeks/Figures.h"

#include <algorithm>
#include <cmath>
#include <fmt/format.h>
#include <functional>
#include <set>

namespace kesto_tool {
namespace {

std::string dateOf(std::chrono::year_month_day date)
{
    return fmt::format("{}-{:02}-{:02}", static_cast<int>(date.year()), static_cast<unsigned>(date.month()),
                       static_cast<unsigned>(date.day()));
}

std::string keyOf(const std::string& text)
{
    return text.empty() ? "?" : text;
}

void set(Figures& figures, const std::string& name, double value)
{
    if (value != 0)
        figures[name] = value;
}

void setSums(Figures& figures, const std::string& name, const Played& played)
{
    set(figures, name + " seconds", played.seconds);
    set(figures, name + " muted", played.mutedSeconds);
    set(figures, name + " unheard", played.noVolumeSeconds);
    set(figures, name + " sessions", static_cast<double>(played.sessions));
    set(figures, name + " faults", static_cast<double>(played.faults));
}

void setAll(Figures& figures, const std::string& name, const Played& played)
{
    setSums(figures, name, played);
    set(figures, name + " mean volume", played.meanVolume().value_or(0));
    set(figures, name + " faults an hour", played.faultsAnHour().value_or(0));
}

// The rates are divided here: those of the report are what is tested.
void setTruth(Figures& figures, const std::string& name, const Played& played)
{
    constexpr double least = 1e-6; // what is left of nothing by rounding
    setSums(figures, name, played);
    if (const double heard = played.seconds - played.mutedSeconds - played.noVolumeSeconds; heard > least)
        set(figures, name + " mean volume", played.volumeSeconds / heard);
    if (played.seconds > 0)
        set(figures, name + " faults an hour", static_cast<double>(played.faults) / (played.seconds / 3600));
}

// One fault in a second is thousands an hour.
double roundingOf(const std::string& name, double value)
{
    return name.ends_with(" mean volume") || name.ends_with(" faults an hour") ? 1e-4 * std::max(1.0, value) : 1e-3;
}

class Truth {
public:
    Truth(const weeks::Weeks& weeks, bool isRecording) : weeks_(weeks), isRecording_(isRecording) { }

    using Chosen = std::function<bool(const weeks::Stretch&)>;

    // Of the stretches that are chosen, and of the faults in them, in a span of time.
    [[nodiscard]] Played played(const TimeSpan& span, const Chosen& isChosen) const
    {
        Played played;
        std::set<std::int64_t> sessions;
        for (const weeks::Stretch& stretch : weeks_.stretches) {
            const double seconds =
                std::min(stretch.began + stretch.seconds, span.until) - std::max(stretch.began, span.from);
            if (stretch.isRecording != isRecording_ || !isChosen(stretch) || seconds <= 0)
                continue;
            sessions.insert(stretch.session);
            played.seconds += seconds;
            played.mutedSeconds += stretch.volume == 0.0 ? seconds : 0;
            played.noVolumeSeconds += stretch.volume ? 0 : seconds;
            played.volumeSeconds += stretch.volume.value_or(0) * seconds;
        }
        played.sessions = sessions.size();
        for (const weeks::Fault& fault : weeks_.faults)
            if (fault.happened >= span.from && fault.happened < span.until && isChosen(stretchOf(fault))
                && stretchOf(fault).isRecording == isRecording_)
                ++played.faults;
        return played;
    }

    [[nodiscard]] const weeks::Stretch& stretchOf(const weeks::Fault& fault) const
    {
        return *std::ranges::find_if(weeks_.stretches, [&](const weeks::Stretch& stretch) {
            return stretch.session == fault.session && stretch.began <= fault.happened
                && fault.happened < stretch.began + stretch.seconds;
        });
    }

    [[nodiscard]] const weeks::Session& sessionOf(std::int64_t id) const
    {
        return weeks_.sessions[static_cast<std::size_t>(id - 1)];
    }

private:
    const weeks::Weeks& weeks_;
    const bool isRecording_;
};

bool areAtOnce(const weeks::Weeks& weeks, const TimeSpan& span, bool isRecording)
{
    for (std::size_t one = 0; one < weeks.stretches.size(); ++one)
        for (std::size_t other = 0; other < one; ++other) {
            const weeks::Stretch& first = weeks.stretches[one];
            const weeks::Stretch& second = weeks.stretches[other];
            const double from = std::max({first.began, second.began, span.from});
            const double until = std::min({first.began + first.seconds, second.began + second.seconds, span.until});
            if (first.isRecording == isRecording && second.isRecording == isRecording && until - from > 0.001)
                return true;
        }
    return false;
}

// The missed cycles and the faults of each session with faults, the worst first.
std::vector<std::pair<double, double>> worstOf(const weeks::Weeks& weeks, const Truth& truth, const TimeSpan& span,
                                               bool isRecording)
{
    std::map<std::int64_t, std::pair<double, double>> bySession;
    for (const weeks::Fault& fault : weeks.faults)
        if (fault.happened >= span.from && fault.happened < span.until
            && truth.stretchOf(fault).isRecording == isRecording) {
            bySession[fault.session].first += static_cast<double>(fault.lateCycles);
            bySession[fault.session].second += 1;
        }
    std::vector<std::pair<double, double>> worst;
    for (const auto& [session, counts] : bySession)
        worst.push_back(counts);
    std::ranges::sort(worst, std::greater());
    return worst;
}

} // namespace

const std::vector<ZoneDays>& zonesWithDays()
{
    using std::chrono::year;
    static const std::vector<ZoneDays> zones{
        {"Europe/Berlin",
         year(2025) / 10 / 20,
         {1760911200, 1760997600, 1761084000, 1761170400, 1761256800, 1761343200, 1761429600, 1761519600, 1761606000,
          1761692400, 1761778800, 1761865200, 1761951600, 1762038000, 1762124400}},
        {"America/New_York",
         year(2025) / 3 / 3,
         {1740978000, 1741064400, 1741150800, 1741237200, 1741323600, 1741410000, 1741496400, 1741579200, 1741665600,
          1741752000, 1741838400, 1741924800, 1742011200, 1742097600, 1742184000}},
        {"Australia/Lord_Howe",
         year(2024) / 9 / 30,
         {1727616600, 1727703000, 1727789400, 1727875800, 1727962200, 1728048600, 1728135000, 1728219600, 1728306000,
          1728392400, 1728478800, 1728565200, 1728651600, 1728738000, 1728824400}},
        {"Asia/Kolkata",
         year(2024) / 11 / 11,
         {1731263400, 1731349800, 1731436200, 1731522600, 1731609000, 1731695400, 1731781800, 1731868200, 1731954600,
          1732041000, 1732127400, 1732213800, 1732300200, 1732386600, 1732473000}}};
    return zones;
}

Figures figuresOf(const weeks::Weeks& weeks, const ZoneDays& days, const TimeSpan& span, bool isRecording)
{
    const Truth truth(weeks, isRecording);
    Figures figures;
    std::set<std::string> applications;
    std::set<std::string> devices;
    std::set<std::string> formats;
    std::set<std::int64_t> vanished;
    for (const weeks::Stretch& stretch : weeks.stretches) {
        const double ended = stretch.began + stretch.seconds;
        if (stretch.isRecording != isRecording || stretch.began >= span.until || ended <= span.from)
            continue;
        applications.insert(truth.sessionOf(stretch.session).application);
        devices.insert(stretch.devices);
        formats.insert(stretch.format);
        if (stretch.ending == weeks::Ending::Vanished && ended <= span.until)
            vanished.insert(stretch.session);
    }
    set(figures, "vanished", static_cast<double>(vanished.size()));
    set(figures, "overlapping", areAtOnce(weeks, span, isRecording) ? 1 : 0);
    const auto any = [](const weeks::Stretch&) { return true; };
    setTruth(figures, "all", truth.played(span, any));
    const auto isOf = [&](const std::string& application) {
        return [&, application](const weeks::Stretch& stretch) {
            return truth.sessionOf(stretch.session).application == application;
        };
    };
    const auto isOn = [](const std::string& device) {
        return [device](const weeks::Stretch& stretch) { return stretch.devices == device; };
    };
    for (const std::string& application : applications)
        setTruth(figures, "application " + application, truth.played(span, isOf(application)));
    for (const std::string& device : devices)
        setTruth(figures, "device " + keyOf(device), truth.played(span, isOn(device)));
    for (const std::string& format : formats)
        setTruth(figures, "format " + format,
                 truth.played(span, [&](const weeks::Stretch& stretch) { return stretch.format == format; }));
    for (std::size_t index = 0; index + 1 < days.midnights.size(); ++index) {
        const TimeSpan day{.from = std::max(span.from, days.midnights[index]),
                           .until = std::min(span.until, days.midnights[index + 1])};
        if (day.from >= day.until)
            continue;
        const std::string name = "day " + dateOf(std::chrono::sys_days(days.first) + std::chrono::days(index));
        set(figures, name + " length", day.until - day.from);
        setTruth(figures, name, truth.played(day, any));
        for (const std::string& application : applications)
            set(figures, name + " application " + application, truth.played(day, isOf(application)).seconds);
        for (const std::string& device : devices)
            setTruth(figures, name + " device " + keyOf(device), truth.played(day, isOn(device)));
    }
    for (int step = 0; step < 16; ++step)
        set(figures, fmt::format("volume {}", step),
            truth
                .played(span,
                        [&](const weeks::Stretch& stretch) {
                            return stretch.volume && *stretch.volume > step / 16.0
                                && *stretch.volume <= (step + 1) / 16.0;
                        })
                .seconds);
    const auto worst = worstOf(weeks, truth, span, isRecording);
    set(figures, "with faults", static_cast<double>(worst.size()));
    set(figures, "kind IssueDetector sessions", static_cast<double>(worst.size()));
    set(figures, "kind IssueDetector faults", static_cast<double>(truth.played(span, any).faults));
    for (std::size_t rank = 0; rank < std::min<std::size_t>(10, worst.size()); ++rank) {
        set(figures, fmt::format("worst {} cycles", rank), worst[rank].first);
        set(figures, fmt::format("worst {} faults", rank), worst[rank].second);
    }
    return figures;
}

Figures figuresOf(const Report& report)
{
    Figures figures;
    set(figures, "running", static_cast<double>(report.running));
    set(figures, "vanished", static_cast<double>(report.vanished));
    set(figures, "overlapping", report.isOverlapping ? 1 : 0);
    set(figures, "with faults", static_cast<double>(report.withFaults));
    setAll(figures, "all", report.all);
    const auto setLines = [&](const char* what, const std::vector<ReportLine>& lines) {
        for (const ReportLine& line : lines)
            setAll(figures, fmt::format("{} {}", what, keyOf(line.key)), line.played);
    };
    setLines("application", report.applications);
    setLines("device", report.devices);
    setLines("format", report.formats);
    setLines("kind", report.faultKinds);
    for (const ReportDay& day : report.days) {
        const std::string name = "day " + dateOf(day.date);
        set(figures, name + " length", day.span.until - day.span.from);
        setAll(figures, name, day.played);
        for (std::size_t index = 0; index < day.byApplication.size(); ++index)
            set(figures, name + " application " + report.applications[index].key, day.byApplication[index]);
        for (std::size_t index = 0; index < day.byDevice.size(); ++index)
            setAll(figures, name + " device " + keyOf(report.devices[index].key), day.byDevice[index]);
    }
    for (std::size_t step = 0; step < Report::volumeSteps; ++step)
        set(figures, fmt::format("volume {}", step), report.secondsAtVolume[step]);
    for (std::size_t rank = 0; rank < report.worst.size(); ++rank) {
        set(figures, fmt::format("worst {} cycles", rank), static_cast<double>(report.worst[rank].lateCycles));
        set(figures, fmt::format("worst {} faults", rank), static_cast<double>(report.worst[rank].played.faults));
    }
    return figures;
}

std::string differences(const Figures& expected, const Figures& found)
{
    std::string text;
    const auto valueIn = [](const Figures& figures, const std::string& name) {
        const auto place = figures.find(name);
        return place == figures.end() ? 0 : place->second;
    };
    std::set<std::string> names;
    for (const Figures* figures : {&expected, &found})
        for (const auto& [name, value] : *figures)
            names.insert(name);
    for (const std::string& name : names)
        if (!(std::abs(valueIn(expected, name) - valueIn(found, name)) <= roundingOf(name, valueIn(expected, name))))
            text +=
                fmt::format("{}: {} is expected, {} was found\n", name, valueIn(expected, name), valueIn(found, name));
    return text;
}

} // namespace kesto_tool
