// SPDX-License-Identifier: Apache-2.0
// Stretches come by session, so a line has met a session before exactly if it was the last one that it met: no line
// keeps a list of sessions.
#include "kesto/report/Report.h"

#include "kesto/report/Calendar.h"

#include <algorithm>
#include <cmath>
#include <map>
#include <string_view>
#include <tuple>
#include <unordered_map>
#include <utility>

std::optional<double> Played::meanVolume() const
{
    const double heard = seconds - mutedSeconds - noVolumeSeconds;
    constexpr double least = 1e-6; // what is left of nothing by rounding
    return heard > least ? std::optional(volumeSeconds / heard) : std::nullopt;
}

std::optional<double> Played::faultsAnHour() const
{
    constexpr double secondsAnHour = 3600;
    return seconds > 0 ? std::optional(static_cast<double>(faults) * secondsAnHour / seconds) : std::nullopt;
}

namespace {

using Index = std::size_t;

// The part of a stretch that lies in a span of time.
struct Piece {
    std::int64_t session = 0;
    double from = 0;
    double until = 0;
    std::optional<double> volume; // 0 to 1
};

struct Sum {
    Played played;
    std::optional<std::int64_t> lastSession;

    bool meets(std::int64_t session) { return std::exchange(lastSession, session) != session; }

    void add(const Piece& piece)
    {
        const double seconds = piece.until - piece.from;
        played.sessions += meets(piece.session) ? 1 : 0;
        played.seconds += seconds;
        if (!piece.volume)
            played.noVolumeSeconds += seconds;
        else if (*piece.volume == 0)
            played.mutedSeconds += seconds;
        else
            played.volumeSeconds += seconds * *piece.volume;
    }
};

// The lines of a table, in the order in which their keys are met.
class Lines {
public:
    Index of(std::string_view key)
    {
        const auto [place, isNew] = places_.try_emplace(key, keys_.size());
        if (isNew) {
            keys_.push_back(key);
            sums_.emplace_back();
        }
        return place->second;
    }
    Sum& operator[](Index line) { return sums_[line]; }

    // The places of the lines in the finished table. The keys must still be there.
    template <typename Before> std::vector<Index> sort(Before isBefore)
    {
        std::vector<Index> order(keys_.size());
        for (Index line = 0; line < order.size(); ++line)
            order[line] = line;
        std::ranges::sort(order, [&](Index one, Index other) {
            const Played& first = sums_[one].played;
            const Played& second = sums_[other].played;
            if (isBefore(first, second) || isBefore(second, first))
                return isBefore(first, second);
            return keys_[one] < keys_[other];
        });
        std::vector<Index> ranks(order.size());
        for (Index rank = 0; rank < order.size(); ++rank) {
            ranks[order[rank]] = rank;
            finished_.push_back({.key = std::string(keys_[order[rank]]), .played = sums_[order[rank]].played});
        }
        return ranks;
    }
    std::vector<ReportLine> take() { return std::move(finished_); }

private:
    std::unordered_map<std::string_view, Index> places_;
    std::vector<std::string_view> keys_;
    std::vector<Sum> sums_;
    std::vector<ReportLine> finished_;
};

bool hasMoreTime(const Played& one, const Played& other)
{
    return std::tie(one.seconds, one.faults) > std::tie(other.seconds, other.faults);
}

bool hasMoreFaults(const Played& one, const Played& other)
{
    return one.faults > other.faults;
}

// A span with ends: up to now, and from the first that was played.
TimeSpan withEnds(TimeSpan span, const History& history)
{
    if (span.until == std::numeric_limits<double>::infinity())
        span.until = history.now;
    if (span.from == -std::numeric_limits<double>::infinity()) {
        span.from = span.until;
        for (const PlayedStretch& stretch : history.stretches)
            span.from = std::min(span.from, stretch.began);
    }
    return {.from = std::max(span.from, calendarSpan.from), .until = std::min(span.until, calendarSpan.until)};
}

class ReportMaker {
public:
    ReportMaker(const History& history, const TimeSpan& span, bool isRecording, DayStart dayStart) : history_(history)
    {
        report_.isRecording = isRecording;
        report_.span = withEnds(span, history);
        for (const auto& [date, ofDay] : daysOf(report_.span, dayStart))
            report_.days.push_back({.date = date, .span = ofDay, .played = {}, .byApplication = {}, .byDevice = {}});
        days_.resize(report_.days.size());
    }

    Report make()
    {
        for (const PlayedStretch& stretch : history_.stretches)
            if (const auto piece = pieceOf(stretch))
                add(stretch, *piece);
        for (const Fault& fault : history_.faults)
            if (fault.happened >= report_.span.from && fault.happened < report_.span.until)
                add(fault);
        finishTables();
        finishDays();
        report_.isOverlapping = areOverlapping();
        findWorst();
        return std::move(report_);
    }

private:
    // What counts, and in which lines.
    struct CountedPiece {
        Piece piece;
        Index application;
        Index device;
    };
    struct CountedFault {
        const Fault* fault;
        Index application;
        Index device;
    };
    struct DaySums {
        Sum all;
        std::vector<Sum> devices;
    };

    // None of times that no clock shows.
    [[nodiscard]] std::optional<Piece> pieceOf(const PlayedStretch& stretch) const
    {
        const double ends = stretch.began + stretch.seconds;
        if (!std::isfinite(stretch.began) || !std::isfinite(ends))
            return std::nullopt;
        Piece piece{.session = stretch.session,
                    .from = std::max(stretch.began, report_.span.from),
                    .until = std::min(ends, report_.span.until),
                    .volume = {}};
        const bool hasJustBegun = stretch.isRunning && piece.from == piece.until;
        if (!(piece.from < piece.until) && !hasJustBegun)
            return std::nullopt;
        if (stretch.volume && std::isfinite(*stretch.volume))
            piece.volume = std::clamp(*stretch.volume, 0.0, 1.0);
        return piece;
    }

    [[nodiscard]] std::string_view applicationOf(std::int64_t session) const
    {
        const HistorySession* const known = sessionOf(history_, session);
        return known == nullptr ? std::string_view() : std::string_view(known->application);
    }

    void add(const PlayedStretch& stretch, const Piece& piece)
    {
        const Index application = applications_.of(applicationOf(stretch.session));
        const Index device = devices_.of(stretch.device);
        for (Sum* const sum :
             {&all_, &applications_[application], &devices_[device], &formats_[formats_.of(stretch.format)]})
            sum->add(piece);
        report_.running += stretch.isRunning && running_.meets(stretch.session) ? 1 : 0;
        report_.vanished += hasVanished(stretch) && vanished_.meets(stretch.session) ? 1 : 0;
        if (piece.volume && *piece.volume > 0)
            report_.secondsAtVolume[stepOf(*piece.volume)] += piece.until - piece.from;
        pieces_.push_back({piece, application, device});
    }

    // In the span.
    [[nodiscard]] bool hasVanished(const PlayedStretch& stretch) const
    {
        return stretch.hasVanished && stretch.began + stretch.seconds <= report_.span.until;
    }

    static Index stepOf(double volume)
    {
        const double step = std::ceil(volume * Report::volumeSteps);
        return static_cast<Index>(std::clamp(step, 1.0, double{Report::volumeSteps})) - 1;
    }

    void add(const Fault& fault)
    {
        const PlayedStretch* const stretch = stretchOf(history_, fault);
        const Index application = applications_.of(applicationOf(fault.session));
        const Index device = devices_.of(fault.device);
        const Index format = formats_.of(stretch == nullptr ? std::string_view() : std::string_view(stretch->format));
        for (Sum* const sum : {&all_, &applications_[application], &devices_[device], &formats_[format]})
            ++sum->played.faults;
        faults_.push_back({&fault, application, device});
    }

    void finishTables()
    {
        std::ranges::stable_sort(faults_, {}, [](const CountedFault& each) { return each.fault->session; });
        for (const auto& [fault, application, device] : faults_) {
            Sum& kind = kinds_[kinds_.of(fault->kind)];
            ++kind.played.faults;
            kind.played.sessions += kind.meets(fault->session) ? 1 : 0;
        }
        report_.all = all_.played;
        applicationRanks_ = applications_.sort(hasMoreTime);
        deviceRanks_ = devices_.sort(hasMoreTime);
        formats_.sort(hasMoreTime);
        kinds_.sort(hasMoreFaults);
        report_.applications = applications_.take();
        report_.devices = devices_.take();
        report_.formats = formats_.take();
        report_.faultKinds = kinds_.take();
    }

    // --- Days

    // Of a moment in the span.
    [[nodiscard]] Index dayAt(double moment) const
    {
        const auto next =
            std::ranges::upper_bound(report_.days, moment, {}, [](const ReportDay& day) { return day.span.from; });
        return static_cast<Index>(std::max<std::ptrdiff_t>(next - report_.days.begin(), 1) - 1);
    }

    void finishDays()
    {
        const auto atMost = [](const auto& lines) { return std::min(lines.size(), Report::mostInDays); };
        for (Index day = 0; day < days_.size(); ++day) {
            days_[day].devices.resize(atMost(report_.devices));
            report_.days[day].byApplication.resize(atMost(report_.applications));
        }
        for (const CountedPiece& each : pieces_)
            addToDays(each);
        for (const auto& [fault, application, device] : faults_) {
            DaySums& sums = days_[dayAt(fault->happened)];
            ++sums.all.played.faults;
            if (const Index rank = deviceRanks_[device]; rank < sums.devices.size())
                ++sums.devices[rank].played.faults;
        }
        for (Index day = 0; day < days_.size(); ++day) {
            report_.days[day].played = days_[day].all.played;
            for (const Sum& device : days_[day].devices)
                report_.days[day].byDevice.push_back(device.played);
        }
    }

    void addToDays(const CountedPiece& counted)
    {
        const auto& [piece, application, device] = counted;
        for (Index day = dayAt(piece.from); day < days_.size(); ++day) {
            const TimeSpan& span = report_.days[day].span;
            Piece part = piece;
            part.from = std::max(piece.from, span.from);
            part.until = std::min(piece.until, span.until);
            days_[day].all.add(part);
            if (const Index rank = applicationRanks_[application]; rank < Report::mostInDays)
                report_.days[day].byApplication[rank] += part.until - part.from;
            if (const Index rank = deviceRanks_[device]; rank < Report::mostInDays)
                days_[day].devices[rank].add(part);
            if (piece.until <= span.until)
                return;
        }
    }

    // --- All together

    [[nodiscard]] bool areOverlapping() const
    {
        constexpr double rounding = 0.001; // of stretches that follow one another
        std::vector<std::pair<double, double>> times;
        times.reserve(pieces_.size());
        for (const CountedPiece& each : pieces_)
            times.emplace_back(each.piece.from, each.piece.until);
        std::ranges::sort(times);
        double latest = -std::numeric_limits<double>::infinity();
        for (const auto& [from, until] : times) {
            if (std::min(latest, until) - from > rounding)
                return true;
            latest = std::max(latest, until);
        }
        return false;
    }

    // The faults are sorted by session, and so are the pieces.
    void findWorst()
    {
        struct OfSession {
            std::int64_t lateCycles = 0;
            std::size_t faults = 0;
            std::int64_t session = 0;
        };
        std::vector<OfSession> sessions;
        for (const auto& [fault, application, device] : faults_) {
            if (fault->session == 0)
                continue;
            if (sessions.empty() || sessions.back().session != fault->session)
                sessions.push_back({.session = fault->session});
            sessions.back().lateCycles += fault->lateCycles;
            ++sessions.back().faults;
        }
        report_.withFaults = sessions.size();
        report_.faultless = report_.all.sessions
            - static_cast<std::size_t>(std::ranges::count_if(
                sessions, [this](std::int64_t session) { return hasPlayed(session); }, &OfSession::session));
        std::ranges::stable_sort(sessions, [](const OfSession& one, const OfSession& other) {
            return std::tie(one.lateCycles, one.faults) > std::tie(other.lateCycles, other.faults);
        });
        sessions.resize(std::min(sessions.size(), Report::mostWorst));
        for (const OfSession& each : sessions)
            report_.worst.push_back(worstSession(each.session, each.lateCycles));
    }

    [[nodiscard]] bool hasPlayed(std::int64_t session) const
    {
        return std::ranges::binary_search(pieces_, session, {},
                                          [](const CountedPiece& each) { return each.piece.session; });
    }

    [[nodiscard]] WorstSession worstSession(std::int64_t id, std::int64_t lateCycles) const
    {
        WorstSession worst;
        const HistorySession* const known = sessionOf(history_, id);
        worst.session = known == nullptr ? HistorySession() : *known;
        worst.session.id = id;
        worst.lateCycles = lateCycles;
        Sum sum;
        std::map<std::string_view, double> devices;
        for (const PlayedStretch& stretch :
             std::ranges::equal_range(history_.stretches, id, {}, &PlayedStretch::session)) {
            const auto piece = pieceOf(stretch);
            if (!piece)
                continue;
            sum.add(*piece);
            devices[stretch.device] += piece->until - piece->from;
            worst.stretches.push_back(stretch);
            worst.isRunning |= stretch.isRunning;
            worst.hasVanished |= hasVanished(stretch);
        }
        for (const CountedFault& each :
             std::ranges::equal_range(faults_, id, {}, [](const CountedFault& each) { return each.fault->session; }))
            worst.faults.push_back(*each.fault);
        worst.played = sum.played;
        worst.played.faults = worst.faults.size();
        worst.devices = longestFirst(devices);
        return worst;
    }

    static std::string longestFirst(const std::map<std::string_view, double>& devices)
    {
        std::vector<std::pair<std::string_view, double>> sorted(devices.begin(), devices.end());
        std::ranges::stable_sort(sorted, std::greater(), &std::pair<std::string_view, double>::second);
        std::string text;
        for (const auto& [device, seconds] : sorted)
            if (!device.empty())
                text.append(text.empty() ? "" : "; ").append(device);
        return text;
    }

    const History& history_;
    Report report_;
    Sum all_;
    Sum running_; // of these two only whether they met a session
    Sum vanished_;
    Lines applications_;
    Lines devices_;
    Lines formats_;
    Lines kinds_;
    std::vector<Index> applicationRanks_;
    std::vector<Index> deviceRanks_;
    std::vector<DaySums> days_;
    std::vector<CountedPiece> pieces_;
    std::vector<CountedFault> faults_;
};

} // namespace

Report makeReport(const History& history, const TimeSpan& span, bool isRecording, DayStart dayStart)
{
    return ReportMaker(history, span, isRecording, dayStart).make();
}
