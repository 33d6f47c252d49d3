// SPDX-License-Identifier: Apache-2.0
// Stretches come by session, so a line has met a session before exactly if it was the last one that it met: no line
// keeps a list of sessions.
#include "kesto/report/Report.h"

#include "foundation/values/Microseconds.h"
#include "kesto/report/Calendar.h"

#include <algorithm>
#include <cmath>
#include <map>
#include <string_view>
#include <tuple>
#include <unordered_map>
#include <utility>

using foundation::secondsOf;
using foundation::wholeMicroseconds;

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

Played PlayedSum::played() const
{
    return {.seconds = secondsOf(microseconds),
            .mutedSeconds = secondsOf(muted),
            .noVolumeSeconds = secondsOf(noVolume),
            .volumeSeconds = secondsOf(volume),
            .sessions = sessions,
            .faults = faults};
}

namespace {

using Index = std::size_t;
using Microseconds = std::int64_t; // since 1970 UTC, or a length
using Millionths = std::int64_t; // of the slider

constexpr double far = 4e12; // seconds, from any calendar

// The part of a stretch that lies in a span of time.
struct Piece {
    std::int64_t session = 0;
    Microseconds from = 0;
    Microseconds until = 0;
    std::optional<Millionths> volume;

    [[nodiscard]] Microseconds length() const { return until - from; }
};

struct Sum {
    PlayedSum played{};
    std::optional<std::int64_t> lastSession;

    bool meets(std::int64_t session) { return std::exchange(lastSession, session) != session; }

    void add(const Piece& piece)
    {
        const Microseconds length = piece.length();
        played.sessions += meets(piece.session) ? 1 : 0;
        played.microseconds += length;
        if (!piece.volume)
            played.noVolume += length;
        else if (*piece.volume == 0)
            played.muted += length;
        else
            played.volume += atVolume(length, *piece.volume);
    }

    // A millionth of the product, and of two the higher: whole numbers, as of the fleet, in which seconds go before
    // their rest so that no product is too large.
    static Microseconds atVolume(Microseconds length, Millionths volume)
    {
        constexpr std::int64_t million = 1'000'000;
        return length / million * volume + (length % million * volume + million / 2) / million;
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
            const PlayedSum& first = sums_[one].played;
            const PlayedSum& second = sums_[other].played;
            if (isBefore(first, second) || isBefore(second, first))
                return isBefore(first, second);
            return keys_[one] < keys_[other];
        });
        std::vector<Index> ranks(order.size());
        for (Index rank = 0; rank < order.size(); ++rank) {
            ranks[order[rank]] = rank;
            finished_.push_back({.key = std::string(keys_[order[rank]]), .played = sums_[order[rank]].played.played()});
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

bool hasMoreTime(const PlayedSum& one, const PlayedSum& other)
{
    return std::tie(one.microseconds, one.faults) > std::tie(other.microseconds, other.faults);
}

bool hasMoreFaults(const PlayedSum& one, const PlayedSum& other)
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
        if (report_.span.from < report_.span.until) {
            from_ = wholeMicroseconds(report_.span.from);
            until_ = wholeMicroseconds(report_.span.until);
        }
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
            if (std::isfinite(fault.happened) && momentOf(fault.happened) >= from_ && momentOf(fault.happened) < until_)
                add(fault, momentOf(fault.happened));
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
        Microseconds moment;
        Index application;
        Index device;
    };
    struct DaySums {
        Sum all;
        std::vector<Sum> devices;
    };

    // What is far outside of every calendar is no further than this.
    static Microseconds momentOf(double seconds) { return wholeMicroseconds(std::clamp(seconds, -far, far)); }
    static Microseconds endOf(const PlayedStretch& stretch)
    {
        const bool isFar = std::abs(stretch.began) > far || std::abs(stretch.seconds) > far;
        return isFar ? momentOf(stretch.began + stretch.seconds)
                     : wholeMicroseconds(stretch.began) + wholeMicroseconds(stretch.seconds);
    }

    // None of times that no clock shows.
    [[nodiscard]] std::optional<Piece> pieceOf(const PlayedStretch& stretch) const
    {
        if (!std::isfinite(stretch.began) || !std::isfinite(stretch.began + stretch.seconds))
            return std::nullopt;
        Piece piece{.session = stretch.session,
                    .from = std::max(momentOf(stretch.began), from_),
                    .until = std::min(endOf(stretch), until_),
                    .volume = {}};
        const bool hasJustBegun = stretch.isRunning && piece.from == piece.until;
        if (!(piece.from < piece.until) && !hasJustBegun)
            return std::nullopt;
        if (stretch.volume && std::isfinite(*stretch.volume))
            piece.volume = foundation::wholeMillionths(std::clamp(*stretch.volume, 0.0, 1.0));
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
            atVolume_[stepOf(*piece.volume)] += piece.length();
        pieces_.push_back({piece, application, device});
    }

    // In the span.
    [[nodiscard]] bool hasVanished(const PlayedStretch& stretch) const
    {
        return stretch.hasVanished && endOf(stretch) <= until_;
    }

    // Of one that is not muted.
    static Index stepOf(Millionths volume)
    {
        return static_cast<Index>((volume * Millionths{Report::volumeSteps} - 1) / Millionths{1'000'000});
    }

    void add(const Fault& fault, Microseconds moment)
    {
        const PlayedStretch* const stretch = stretchOf(history_, fault);
        const Index application = applications_.of(applicationOf(fault.session));
        const Index device = devices_.of(fault.device);
        const Index format = formats_.of(stretch == nullptr ? std::string_view() : std::string_view(stretch->format));
        for (Sum* const sum : {&all_, &applications_[application], &devices_[device], &formats_[format]})
            ++sum->played.faults;
        faults_.push_back({&fault, moment, application, device});
    }

    void finishTables()
    {
        std::ranges::stable_sort(faults_, {}, [](const CountedFault& each) { return each.fault->session; });
        for (const auto& [fault, moment, application, device] : faults_) {
            Sum& kind = kinds_[kinds_.of(fault->kind)];
            ++kind.played.faults;
            kind.played.sessions += kind.meets(fault->session) ? 1 : 0;
        }
        report_.all = all_.played.played();
        std::ranges::transform(atVolume_, report_.secondsAtVolume.begin(), secondsOf);
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
    [[nodiscard]] Index dayAt(Microseconds moment) const
    {
        const auto next = std::ranges::upper_bound(
            report_.days, moment, {}, [](const ReportDay& day) { return wholeMicroseconds(day.span.from); });
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
        for (const auto& [fault, moment, application, device] : faults_) {
            DaySums& sums = days_[dayAt(moment)];
            ++sums.all.played.faults;
            if (const Index rank = deviceRanks_[device]; rank < sums.devices.size())
                ++sums.devices[rank].played.faults;
        }
        for (Index day = 0; day < days_.size(); ++day) {
            report_.days[day].played = days_[day].all.played.played();
            for (const Sum& device : days_[day].devices)
                report_.days[day].byDevice.push_back(device.played.played());
        }
    }

    void addToDays(const CountedPiece& counted)
    {
        const auto& [piece, application, device] = counted;
        for (Index day = dayAt(piece.from); day < days_.size(); ++day) {
            const Microseconds ends = wholeMicroseconds(report_.days[day].span.until);
            Piece part = piece;
            part.from = std::max(piece.from, wholeMicroseconds(report_.days[day].span.from));
            part.until = std::min(piece.until, ends);
            days_[day].all.add(part);
            if (const Index rank = applicationRanks_[application]; rank < Report::mostInDays)
                report_.days[day].byApplication[rank] += secondsOf(part.length());
            if (const Index rank = deviceRanks_[device]; rank < Report::mostInDays)
                days_[day].devices[rank].add(part);
            if (piece.until <= ends)
                return;
        }
    }

    // --- All together

    [[nodiscard]] bool areOverlapping() const
    {
        constexpr Microseconds rounding = 1000; // of stretches that follow one another
        std::vector<std::pair<Microseconds, Microseconds>> times;
        times.reserve(pieces_.size());
        for (const CountedPiece& each : pieces_)
            times.emplace_back(each.piece.from, each.piece.until);
        std::ranges::sort(times);
        Microseconds latest = from_;
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
        for (const auto& [fault, moment, application, device] : faults_) {
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
        std::map<std::string_view, Microseconds> devices;
        for (const PlayedStretch& stretch :
             std::ranges::equal_range(history_.stretches, id, {}, &PlayedStretch::session)) {
            const auto piece = pieceOf(stretch);
            if (!piece)
                continue;
            sum.add(*piece);
            devices[stretch.device] += piece->length();
            worst.stretches.push_back(stretch);
            worst.isRunning |= stretch.isRunning;
            worst.hasVanished |= hasVanished(stretch);
        }
        for (const CountedFault& each :
             std::ranges::equal_range(faults_, id, {}, [](const CountedFault& each) { return each.fault->session; }))
            worst.faults.push_back(*each.fault);
        worst.played = sum.played.played();
        worst.played.faults = worst.faults.size();
        worst.devices = longestFirst(devices);
        return worst;
    }

    static std::string longestFirst(const std::map<std::string_view, Microseconds>& devices)
    {
        std::vector<std::pair<std::string_view, Microseconds>> sorted(devices.begin(), devices.end());
        std::ranges::stable_sort(sorted, std::greater(), &std::pair<std::string_view, Microseconds>::second);
        std::string text;
        for (const auto& [device, time] : sorted)
            if (!device.empty())
                text.append(text.empty() ? "" : "; ").append(device);
        return text;
    }

    const History& history_;
    Report report_;
    Microseconds from_ = 0; // of the span
    Microseconds until_ = 0;
    std::array<Microseconds, Report::volumeSteps> atVolume_{};
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
