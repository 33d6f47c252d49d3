// SPDX-License-Identifier: Apache-2.0
// The memory that ended sessions leave: that of a service, some time after three long sessions. All rounds wait at the
// same time.
#include "Groups.h"
#include "support/SampleMessage.h"
#include "support/ServiceProcess.h"

#include <array>
#include <cstring>
#include <deque>
#include <fmt/format.h>
#include <initializer_list>
#include <stdexcept>
#include <thread>
#include <utility>
#include <vector>

namespace bench {
namespace {

constexpr int changeCount = 200'000;
constexpr std::array<std::int64_t, 3> reporters{2, 3, 4};
constexpr std::chrono::seconds settling(1);
constexpr std::chrono::seconds patience(10); // what the service promises to need at most

// A client that reads its answers and ignores their content.
class Player {
public:
    explicit Player(const ServiceProcess& service) : socket_(service.connect()) { }

    // A session with so many changes of volume, from its creation to its end.
    void play(std::int64_t reporter, int changes)
    {
        constexpr int create = 1;
        constexpr int start = 5;
        constexpr int stop = 7;
        constexpr int destroy = 8;
        call(create, {reporter});
        answers(1);
        call(start, {reporter}); // answered when the session ends
        for (int change = 0; change <= changes; ++change)
            changeVolume(reporter, change);
        answers(std::exchange(unanswered_, 0));
        call(stop, {reporter});
        call(destroy, {reporter});
        answers(3);
    }

private:
    static constexpr std::size_t mostUnanswered = 1000;

    void call(int method, std::initializer_list<foundation::Value> arguments)
    {
        constexpr int number = 1; // the same for all calls: the client does not look at it
        std::vector<foundation::Value> call{number, method};
        call.insert(call.end(), arguments);
        writeAll(socket_.get(), frame(foundation::Array(std::move(call))));
    }
    void changeVolume(std::int64_t reporter, int change)
    {
        constexpr int sendMessage = 6;
        call(sendMessage,
             {foundation::Dictionary{{"session_output_running", true},
                                     {"PomoSessionVolume", change % 2},
                                     {"kestoreporting_timestamp", change}},
              sampleCategory, sampleType, foundation::Array{foundation::Value(reporter)}});
        if (++unanswered_ == mostUnanswered)
            answers(std::exchange(unanswered_, 0));
    }
    void answers(std::size_t count)
    {
        for (; count != 0; --count) {
            std::array<char, sizeof(std::uint32_t)> head;
            std::uint32_t size = 0;
            bool isThere = readAll(socket_.get(), head.data(), head.size());
            std::memcpy(&size, head.data(), head.size());
            answer_.resize(size);
            isThere = isThere && readAll(socket_.get(), answer_.data(), answer_.size());
            if (!isThere)
                throw std::runtime_error("the service ended the connection");
        }
    }

    platform::FileDescriptor socket_;
    std::size_t unanswered_ = 0;
    std::string answer_;
};

} // namespace

void measureEndedSessions(const BenchOptions& options, Report& report)
{
    std::deque<ServiceProcess> services;
    std::deque<Player> players;
    std::vector<double> before;
    std::vector<double> after;
    for (int round = 0; round < options.rounds; ++round) {
        showProgress(fmt::format("sessions that ended: service {} of {}", round + 1, options.rounds));
        const auto& service = services.emplace_back(options, "used = []", ServiceProcess::Build::Internal);
        auto& player = players.emplace_back(service);
        player.play(1, 10); // allocates what later sessions share
        std::this_thread::sleep_for(settling);
        before.push_back(residentMegabytes(service.identifier()));
        for (const std::int64_t reporter : reporters)
            player.play(reporter, changeCount);
    }
    std::this_thread::sleep_for(patience);
    for (const auto& service : services)
        after.push_back(residentMegabytes(service.identifier()));
    clearProgress();
    report.add({fmt::format("resident {} s after {} sessions of {} changes of volume ended", patience.count(),
                            reporters.size(), changeCount),
                "MB", after, PeerFigure{"before them", before}});
}

} // namespace bench
