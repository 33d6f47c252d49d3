// SPDX-License-Identifier: Apache-2.0
// `kesto top`: what plays now and what the service does, again and again.
//
// The screen asks only while somebody can see it: not in a pause or under the list of keys, and not while the program
// is stopped or in the background.
#include "kesto/Commands.h"
#include "kesto/ServiceDirectories.h"
#include "kesto/Terminal.h"
#include "kesto/status/StatusSource.h"
#include "kesto/top/PlayingStreams.h"
#include "kesto/top/Screen.h"
#include "kesto/top/TopLook.h"
#include "kesto/top/TopText.h"
#include "platform/linux/process/Environment.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <fmt/format.h>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <thread>
#include <unistd.h>
#include <utility>
#include <vector>

namespace {

using Clock = std::chrono::steady_clock;
using Seconds = std::chrono::duration<double>;

struct TopOptions {
    std::filesystem::path socket;
    std::filesystem::path ledgerFile;
    std::filesystem::path database;
    double delay = 2;
    bool isBatch = false;
    bool isJson = false;
    std::optional<std::size_t> iterations;
    std::string order = "since";
};

struct OrderChoice {
    char key;
    std::string_view name;
    TopOrder order;
};

constexpr std::array<OrderChoice, 5> orders{{{'s', "since", TopOrder::Since},
                                             {'a', "application", TopOrder::Application},
                                             {'d', "device", TopOrder::Device},
                                             {'v', "volume", TopOrder::Volume},
                                             {'f', "faults", TopOrder::Faults}}};

std::vector<std::string> orderNames()
{
    std::vector<std::string> names;
    names.reserve(orders.size());
    for (const OrderChoice& choice : orders)
        names.emplace_back(choice.name);
    return names;
}

TopOrder orderNamed(std::string_view name)
{
    return std::ranges::find(orders, name, &OrderChoice::name)->order;
}

// Asks, and remembers the look before.
class TopSource {
public:
    explicit TopSource(const TopOptions& options)
        : status_(options.socket, options.ledgerFile),
          streams_(options.database)
    {
    }

    // The descriptor to wait for before `take`; -1: there is a new look already.
    int request()
    {
        int descriptor = -1;
        lookWith([&] {
            descriptor = status_.request();
            return descriptor < 0 ? status_.take() : std::nullopt;
        });
        return descriptor;
    }

    // False if the answer is not there yet: `request` again.
    bool take()
    {
        return lookWith([this] { return status_.take(); });
    }

    // Waits for the answer.
    const TopLook& read()
    {
        lookWith([this] { return std::optional(status_.read()); });
        return *look_;
    }

    [[nodiscard]] const std::optional<TopLook>& look() const noexcept { return look_; }
    [[nodiscard]] int exitStatus() const
    {
        return look_ && look_->status ? exitStatusOf(*look_->status) : exitNotRunning;
    }

private:
    // False if there is neither a status nor an error yet.
    template <typename Ask> bool lookWith(Ask ask)
    {
        TopLook look;
        try {
            look.status = ask();
            if (!look.status)
                return false;
        } catch (const StatusError& error) {
            look.statusProblem = error.what();
        }
        look.time = Seconds(std::chrono::system_clock::now().time_since_epoch()).count();
        look.steadyTime = Seconds(Clock::now().time_since_epoch()).count();
        look.rates = ratesOf(look, look_ ? &*look_ : nullptr);
        if (look.isStoringStretches())
            readStreams(look);
        look_ = std::move(look);
        return true;
    }

    void readStreams(TopLook& look)
    {
        try {
            look.streams = streams_.read();
        } catch (const EventStoreError& error) {
            look.storeProblem = error.what();
        }
    }

    StatusSource status_;
    PlayingStreams streams_;
    std::optional<TopLook> look_;
};

void printLines(const std::vector<std::string>& lines)
{
    for (const std::string& line : lines)
        fmt::print("{}\n", line);
}

// --- One look after the other, for programs and for files

class TopLines {
public:
    explicit TopLines(const TopOptions& options) : options_(options), source_(options) { }

    int run()
    {
        const std::size_t iterations = options_.iterations.value_or(options_.isBatch ? SIZE_MAX : 1);
        for (std::size_t look = 0; look < iterations; ++look) {
            if (look != 0)
                std::this_thread::sleep_for(Seconds(options_.delay));
            print(source_.read(), look != 0);
            if (std::fflush(stdout) != 0)
                throw std::runtime_error("the output could not be written");
        }
        return source_.exitStatus();
    }

private:
    void print(TopLook look, bool isLater) const
    {
        sortStreams(look.streams, orderNamed(options_.order));
        if (options_.isJson) {
            fmt::print("{}\n", topJson(look));
            return;
        }
        if (isLater)
            fmt::print("\n");
        printLines(topLines(look, {}, {.width = outputWidth(), .isUTF8 = showsUTF8()}));
    }

    const TopOptions& options_;
    TopSource source_;
};

// --- The screen

class TopScreen {
public:
    explicit TopScreen(const TopOptions& options)
        : iterations_(options.iterations.value_or(SIZE_MAX)),
          delay_(options.delay),
          order_(orderNamed(options.order)),
          source_(options)
    {
    }

    // A signal ends the program as it would have without a screen; one that is ignored, with a failure. The last of so
    // many looks stays on the terminal.
    int run()
    {
        if (const auto signal = showUntilTheEnd()) {
            ::raise(*signal);
            return exitFailure;
        }
        if (!isOver_)
            printLines(topLines(sortedLook(), {}, style()));
        return source_.exitStatus();
    }

private:
    std::optional<int> showUntilTheEnd()
    {
        Screen screen;
        while (looks_ < iterations_ && !isOver_) {
            askIfDue(screen);
            const auto events = screen.wait(isAsking_ ? descriptor_ : -1, limit(screen));
            if (events.end)
                return events.end;
            if (isAsking_ && events.isReadable)
                take();
            for (const char key : events.keys)
                take(key);
            if (std::exchange(isNew_, false) || events.isToDraw || !events.keys.empty() || isAsking_)
                draw(screen);
        }
        return std::nullopt;
    }

    void askIfDue(const Screen& screen)
    {
        if (isAsking_ || !isAwake(screen) || Clock::now() < next_)
            return;
        isAsking_ = true;
        asked_ = Clock::now();
        request();
    }

    void request()
    {
        descriptor_ = source_.request();
        if (descriptor_ < 0)
            finish();
    }

    void take()
    {
        if (source_.take())
            finish();
        else
            request();
    }

    void finish()
    {
        isAsking_ = false;
        isNew_ = true;
        ++looks_;
        next_ = Clock::now() + std::chrono::duration_cast<Clock::duration>(Seconds(delay_));
    }

    [[nodiscard]] bool isAwake(const Screen& screen) const { return !isPaused_ && !isHelp_ && screen.isShown(); }

    // Rounded up, so that the screen does not wake too early again and again.
    [[nodiscard]] std::optional<std::chrono::milliseconds> limit(const Screen& screen) const
    {
        if (isNew_)
            return std::chrono::milliseconds(0);
        if (isAsking_)
            return std::chrono::seconds(1); // to say that no answer comes
        if (!isAwake(screen))
            return std::nullopt;
        return std::max(std::chrono::ceil<std::chrono::milliseconds>(next_ - Clock::now()),
                        std::chrono::milliseconds(0));
    }

    void take(char key)
    {
        if (const auto* const choice = std::ranges::find(orders, key, &OrderChoice::key); choice != orders.end())
            order_ = choice->order;
        switch (key) {
        case 'q': isOver_ = true; break;
        case 'h': isHelp_ = !isHelp_; break;
        case ' ': isPaused_ = !isPaused_; break;
        case '+': setDelay(delay_ * 2); break;
        case '-': setDelay(delay_ / 2); break;
        default: break;
        }
    }

    void setDelay(double delay)
    {
        const double before = std::exchange(delay_, std::clamp(delay, shortestWait, longestWait));
        next_ += std::chrono::duration_cast<Clock::duration>(Seconds(delay_ - before));
    }

    void draw(Screen& screen) const
    {
        TopStyle fitting = style();
        fitting.height = outputHeight();
        screen.draw(isHelp_ ? topHelpLines(fitting) : topLines(sortedLook(), note(), fitting));
    }

    [[nodiscard]] static TopStyle style()
    {
        return {.width = outputWidth(), .hasColor = platform::environment("NO_COLOR").empty(), .isUTF8 = showsUTF8()};
    }

    [[nodiscard]] TopLook sortedLook() const
    {
        TopLook look = source_.look().value_or(TopLook{.statusProblem = "the service has not answered yet"});
        sortStreams(look.streams, order_);
        return look;
    }

    [[nodiscard]] std::string note() const
    {
        std::string note = isPaused_ ? "paused" : fmt::format("every {:g} s", delay_);
        const auto waited = std::chrono::floor<std::chrono::seconds>(Clock::now() - asked_).count();
        if (isAsking_ && waited > 0)
            note += fmt::format(", no answer for {} s", waited);
        return note + "; h lists the keys";
    }

    const std::size_t iterations_;
    double delay_;
    TopOrder order_;
    TopSource source_;
    std::size_t looks_ = 0;
    bool isPaused_ = false;
    bool isHelp_ = false;
    bool isOver_ = false;
    bool isNew_ = false; // a look that was not drawn yet
    bool isAsking_ = false;
    int descriptor_ = -1;
    Clock::time_point asked_;
    Clock::time_point next_ = Clock::now();
};

bool hasScreen()
{
    const std::string terminal = platform::environment("TERM");
    return ::isatty(STDOUT_FILENO) != 0 && !terminal.empty() && terminal != "dumb";
}

} // namespace

void addTopCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<TopOptions>();
    CLI::App* command = application.add_subcommand("top", "Shows what plays now and what the service does");
    command->add_option("--socket", options->socket, "The service's socket, if it is not at its usual place");
    command->add_option("--ledger", options->ledgerFile,
                        "The file to read if the service does not run, if it is not at its usual place");
    command->add_option("--database", options->database, "The event store, if it is not at its usual place");
    command->add_option("--delay", options->delay, "Seconds between two looks, 0.01 to 86400; 2 by default")
        ->check(secondsToWait());
    command->add_flag("--batch", options->isBatch, "One look after the other as text, without keys");
    command->add_option("--iterations", options->iterations, "End after this many looks")->check(atLeastOne());
    command->add_flag("--json", options->isJson, "One JSON object for each look, for programs");
    command->add_option("--sort", options->order, "What comes first; since by default")
        ->check(CLI::IsMember(orderNames()));
    command->footer("Keys: q ends, h lists all.\n"
                    "Where standard output is no terminal: one look, unless --batch or --iterations ask for more.\n"
                    "Exit status: 0 if the service runs and lost nothing since its start, 1 if it lost something,\n"
                    "2 if the command line was wrong, 3 if the service does not run or does not answer.");
    command->callback([options, &exitStatus] {
        if (options->socket.empty())
            options->socket = usualSocket();
        if (options->ledgerFile.empty())
            options->ledgerFile = usualLedger();
        if (options->database.empty())
            options->database = usualDatabase();
        const bool isScreen = !options->isBatch && !options->isJson && hasScreen();
        exitStatus = isScreen ? TopScreen(*options).run() : TopLines(*options).run();
    });
}
