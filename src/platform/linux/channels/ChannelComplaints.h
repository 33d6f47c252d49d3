// What is wrong in the channel tree, said once, however many questions meet it and however often they are asked.
//
// The service asks one tree several questions, and most of what is wrong in it meets all of them. So every question
// remembers what its last look found, and only that is said which none of them remembers. What was right in between is
// said again.
#pragma once

#include "foundation/Mutex.h"
#include "platform/linux/channels/ChannelTree.h"
#include "platform/linux/log/ProviderLog.h"

#include <memory>
#include <system_error>
#include <vector>

namespace platform {

// Any thread.
class ChannelComplaints {
public:
    // How many of the channels that are missing are named at once; the rest is counted.
    static constexpr std::size_t mostNamed = 16;

    // What a look found.
    struct Findings {
        std::vector<ChannelProblem> problems = {};
        LeftOutChannels leftOut = {};
        std::error_code error = {}; // why the tree could not be looked at
    };
    // Of one question. Whoever asks it keeps this as long as it may be asked again.
    using Memory = std::shared_ptr<Findings>;

    ChannelComplaints(std::filesystem::path root, const ChannelTree::Limits& limits, ProviderLog log)
        : root_(std::move(root)),
          limits_(limits),
          log_(log)
    {
    }

    [[nodiscard]] Memory addQuestion();
    // Says what is new in what was found, and remembers it.
    void tell(Findings found, const Memory& memory);
    // The tree could not be looked at: what was wrong in it is remembered until it can.
    void tellUnreadable(std::error_code error, const Memory& memory);
    // Forgets what questions found that nobody keeps any more.
    void forgetDroppedQuestions();

private:
    template <typename Condition> [[nodiscard]] bool anyRemembers(Condition condition) const KESTO_REQUIRES(lock_);
    void sayProblems(const std::vector<ChannelProblem>& problems) const KESTO_REQUIRES(lock_);
    void sayWhatIsLeftOut(LeftOutChannels leftOut) const KESTO_REQUIRES(lock_);

    const std::filesystem::path root_;
    const ChannelTree::Limits limits_;
    const ProviderLog log_;
    foundation::Mutex lock_;
    std::vector<Memory> memories_ KESTO_GUARDED_BY(lock_);
};

} // namespace platform
