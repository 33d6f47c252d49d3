// SPDX-License-Identifier: Apache-2.0
// The contract of platform/ProcessTable.h: processes by number, with the kernel's names for them.
#include "platform/contract/Contract.h"
#include "platform/linux/NamedProcess.h"
#include "platform/linux/process/LinuxProcessTable.h"
#include "support/fakes/FakeSettings.h"

#include <limits>
#include <map>

namespace contract {
namespace {

class ProcessTableSubject {
public:
    virtual ~ProcessTableSubject() = default;
    [[nodiscard]] virtual platform::ProcessTable& table() = 0;
    // Starts a process of that name; returns its number.
    [[nodiscard]] virtual std::int32_t start(const std::string& name) = 0;
    virtual void rename(std::int32_t process, const std::string& name) = 0;
    virtual void end(std::int32_t process) = 0;
};

class FakeProcessTableSubject final : public ProcessTableSubject {
public:
    [[nodiscard]] platform::ProcessTable& table() override { return table_; }
    [[nodiscard]] std::int32_t start(const std::string& name) override
    {
        table_.add(++last_, name);
        return last_;
    }
    void rename(std::int32_t process, const std::string& name) override { table_.add(process, name); }
    void end(std::int32_t process) override { table_.remove(process); }

private:
    support::FakeProcessTable table_;
    std::int32_t last_ = 1000;
};

class LinuxProcessTableSubject final : public ProcessTableSubject {
public:
    [[nodiscard]] platform::ProcessTable& table() override { return table_; }
    [[nodiscard]] std::int32_t start(const std::string& name) override
    {
        auto process = std::make_unique<support::NamedProcess>(name);
        const std::int32_t number = process->identifier();
        processes_.emplace(number, std::move(process));
        return number;
    }
    void rename(std::int32_t process, const std::string& name) override { processes_.at(process)->rename(name); }
    void end(std::int32_t process) override { processes_.at(process)->end(); }

private:
    std::map<std::int32_t, std::unique_ptr<support::NamedProcess>> processes_;
    platform::LinuxProcessTable table_;
};

class ProcessTableContract : public Suite<ProcessTableSubject> {
protected:
    // The present entry, without the cache.
    [[nodiscard]] std::optional<std::string> nameOf(std::int32_t process)
    {
        subject->table().forget(process);
        const auto entry = subject->table().entry(process);
        if (!entry)
            return std::nullopt;
        EXPECT_EQ(entry->processIdentifier, process);
        return entry->commandName;
    }
};
KESTO_CONTRACT(ProcessTableContract, (provider<ProcessTableSubject, FakeProcessTableSubject>("Fake")),
               (provider<ProcessTableSubject, LinuxProcessTableSubject>("Linux")));

TEST_P(ProcessTableContract, HoldsTheOwnProcessUnderItsOwnName)
{
    const std::int32_t own = subject->table().ownProcessIdentifier();
    EXPECT_GT(own, 0);
    EXPECT_NE(subject->table().ownProcessName(), "");
    EXPECT_EQ(nameOf(own), subject->table().ownProcessName());
}

TEST_P(ProcessTableContract, HoldsEachProcessByItsNumber)
{
    const std::int32_t player = subject->start("player");
    const std::int32_t recorder = subject->start("recorder");
    EXPECT_NE(player, recorder);
    EXPECT_EQ(nameOf(player), "player");
    EXPECT_EQ(nameOf(recorder), "recorder");
}

TEST_P(ProcessTableContract, HoldsNoProcessThatThereIsNot)
{
    const std::int32_t player = subject->start("player");
    EXPECT_EQ(nameOf(player), "player");
    subject->end(player);
    EXPECT_EQ(nameOf(player), std::nullopt);
    for (const std::int32_t number :
         {0, -1, std::numeric_limits<std::int32_t>::min(), std::numeric_limits<std::int32_t>::max()})
        EXPECT_EQ(nameOf(number), std::nullopt) << number;
}

TEST_P(ProcessTableContract, TellsTheNameOfNowOfAProcessThatWasForgotten)
{
    const std::int32_t process = subject->start("before");
    EXPECT_EQ(subject->table().entry(process)->commandName, "before");
    subject->rename(process, "after");
    subject->table().forget(process);
    EXPECT_EQ(subject->table().entry(process)->commandName, "after");
}

TEST_P(ProcessTableContract, CutsNamesAtFifteenBytes)
{
    const std::int32_t process = subject->start("fifteen bytes..");
    EXPECT_EQ(nameOf(process), "fifteen bytes..");
    subject->rename(process, "fifteen bytes and more");
    EXPECT_EQ(nameOf(process), "fifteen bytes a");
}

TEST_P(ProcessTableContract, HasAQuestionMarkForEachByteOfANameThatIsNotUtf8)
{
    const std::int32_t process = subject->start("\xff\xfe player \xc3\xa9");
    EXPECT_EQ(nameOf(process), "?? player \xc3\xa9");
    subject->rename(process, "cut in a sign \xe9\x9f\xb3"); // its fifteenth byte is the first of three
    EXPECT_EQ(nameOf(process), "cut in a sign ?");
}

} // namespace
} // namespace contract
