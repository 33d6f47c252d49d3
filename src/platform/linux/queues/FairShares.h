// Who comes next when many share the time of one thread, so that no one waits for the work of others.
//
// A share is what one client wants of that time; it belongs to a user. Next comes the user whose shares have taken the
// least time so far, and among the user's shares the one that took the least: start-time fair queueing (P. Goyal, H. M.
// Vin, H. Cheng, 1996) at two levels. A share or user that wanted nothing for a while goes on where the others are now:
// a pause earns no time to be used at once later, and costs none.
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <memory>

namespace platform {

// One thread at a time.
class FairShares {
public:
    using Duration = std::chrono::nanoseconds;

    struct User;
    // What takes part derives from this, and leaves it to this class.
    struct Share {
        std::shared_ptr<User> user;
        Duration used{};
        bool wantsTime = false; // or is being served
    };

    FairShares() = default;
    ~FairShares();
    FairShares(const FairShares&) = delete;
    FairShares& operator=(const FairShares&) = delete;

    // Once for each share, first.
    void admit(Share& share, std::uint32_t user);
    // The share wants time, until it is charged as one that wants no more.
    void enter(const std::shared_ptr<Share>& share);

    [[nodiscard]] bool isEmpty() const noexcept { return only_ == nullptr && contest_.empty(); }
    // Whether several shares want time.
    [[nodiscard]] bool isContested() const;
    // The share that comes next; not if none wants time.
    [[nodiscard]] Share& first() const;
    // The same, which is served now. `charge` must be called before the next call of this.
    [[nodiscard]] Share& serveFirst();
    // The share that was served took so long.
    void charge(Duration time, bool wantsMore);

private:
    // Those that want time, by the time that they used. Who is being served stays at the front: all others come in
    // behind.
    template <typename Each> using Contest = std::multimap<Duration, std::shared_ptr<Each>>;

    template <typename Each> static void enter(Contest<Each>& contest, const std::shared_ptr<Each>& each, Duration now);
    template <typename Each> static void chargeFirst(Contest<Each>& contest, Duration time, bool wantsMore);

    void compete(const std::shared_ptr<Share>& share);

    std::map<std::uint32_t, std::weak_ptr<User>> users_;
    std::shared_ptr<Share> only_; // the one that wants time, if there is no other: then nothing has to be sorted
    Contest<User> contest_; // otherwise
    Duration now_{}; // what the user that was served last had used before
};

} // namespace platform
