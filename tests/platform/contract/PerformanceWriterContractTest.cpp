// SPDX-License-Identifier: Apache-2.0
// The contract of platform/PerformanceWriter.h: the content of a closed file, and places where opening fails.
#include "platform/contract/Contract.h"
#include "platform/linux/diagnostics/LinuxFileSystem.h"
#include "platform/linux/trace/LinuxPerformanceWriter.h"
#include "support/ParseJson.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeFiles.h"
#include "support/fakes/FakeLog.h"

#include <gmock/gmock.h>
#include <limits>
#include <map>
#include <optional>

namespace contract {
namespace {

using enum platform::PerformanceUnit;
using Measurement = support::FakePerformanceWriter::Measurement;
using testing::ElementsAre;
using testing::IsEmpty;

// A closed file.
struct Document {
    std::string project;
    std::uint32_t version = 0;
    std::vector<Measurement> measurements;
    std::map<std::string, foundation::Value, std::less<>> remarks; // the test's, and perhaps others
};

class PerformanceWriterSubject {
public:
    virtual ~PerformanceWriterSubject() = default;
    [[nodiscard]] virtual platform::PerformanceWriter& writer() = 0;
    [[nodiscard]] virtual platform::FileSystem& files() = 0;
    // The file at that path, if it exists.
    [[nodiscard]] virtual std::optional<Document> read(const std::filesystem::path& path) = 0;
};

class FakePerformanceWriterSubject final : public PerformanceWriterSubject {
public:
    [[nodiscard]] platform::PerformanceWriter& writer() override { return writer_; }
    [[nodiscard]] platform::FileSystem& files() override { return files_; }
    [[nodiscard]] std::optional<Document> read(const std::filesystem::path& path) override
    {
        std::optional<Document> found;
        for (const auto& file : writer_.files())
            if (file->path == path && file->closed)
                found = {file->project, file->version, file->measurements, file->remarks};
        return found;
    }

private:
    support::FakeFileSystem files_;
    support::FakePerformanceWriter writer_{files_};
};

class LinuxPerformanceWriterSubject final : public PerformanceWriterSubject {
public:
    [[nodiscard]] platform::PerformanceWriter& writer() override { return writer_; }
    [[nodiscard]] platform::FileSystem& files() override { return files_; }
    [[nodiscard]] std::optional<Document> read(const std::filesystem::path& path) override
    {
        if (!std::filesystem::exists(path))
            return std::nullopt;
        const auto json = support::parseJson(support::readFile(path)).value().dictionary().value();
        Document document{.project = std::string(json.find("project")->stringView()),
                          .version = json.find("version")->exactly<std::uint32_t>().value(),
                          .measurements = {},
                          .remarks = {}};
        const auto records = json.find("records")->array().value(); // kept: the loop would outlive the temporary
        for (const auto& record : records) {
            const auto fields = record.dictionary().value();
            EXPECT_EQ(fields.find("unit")->stringView(), "ns");
            document.measurements.push_back({std::string(fields.find("name")->stringView()),
                                             fields.find("value")->number()->doubleValue(), Nanoseconds});
        }
        for (const auto& [key, value] : json)
            document.remarks.emplace(key.view(), value);
        return document;
    }

private:
    const support::TemporaryDirectory directory_;
    support::FakeLog log_;
    platform::LinuxFileSystem files_{directory_.path()};
    platform::LinuxPerformanceWriter writer_{files_, platform::ProviderLog(log_)};
};

class PerformanceWriterContract : public Suite<PerformanceWriterSubject> {
protected:
    auto open() { return subject->writer().open(path, "KestoReporting", 4); }

    const std::filesystem::path root = subject->files().diagnosticLogRoot();
    const std::filesystem::path path = root / "results";
};
KESTO_CONTRACT(PerformanceWriterContract, (provider<PerformanceWriterSubject, FakePerformanceWriterSubject>("Fake")),
               (provider<PerformanceWriterSubject, LinuxPerformanceWriterSubject>("Linux")));

TEST_P(PerformanceWriterContract, KeepsMeasurementsInTheirOrderUnderTheirProject)
{
    auto file = open();
    ASSERT_NE(file, nullptr);
    file->write("mix", 187'250, Nanoseconds);
    file->write("", 0.5, Nanoseconds);
    file->write("mix", 18'446'744'073'709'551'615.0, Nanoseconds);
    file->write("a \"b\"\né", 0, Nanoseconds);
    file.reset();
    const auto written = subject->read(path);
    ASSERT_TRUE(written);
    EXPECT_EQ(written->project, "KestoReporting");
    EXPECT_EQ(written->version, 4U);
    EXPECT_THAT(written->measurements,
                ElementsAre(Measurement{"mix", 187'250, Nanoseconds}, Measurement{"", 0.5, Nanoseconds},
                            Measurement{"mix", 18'446'744'073'709'551'615.0, Nanoseconds},
                            Measurement{"a \"b\"\né", 0, Nanoseconds}));
}

TEST_P(PerformanceWriterContract, KeepsAFileWithoutMeasurements)
{
    open().reset();
    const auto written = subject->read(path);
    ASSERT_TRUE(written);
    EXPECT_THAT(written->measurements, IsEmpty());
}

TEST_P(PerformanceWriterContract, KeepsRemarksWheneverTheyAreMade)
{
    auto file = open();
    file->remark("lostEvents", 7);
    file->write("mix", 1, Nanoseconds);
    file->remark("problem \"é\"", "it is \"odd\"");
    file->write("mix", 2, Nanoseconds);
    file.reset();
    const auto written = subject->read(path);
    ASSERT_TRUE(written);
    EXPECT_EQ(written->measurements.size(), 2U);
    EXPECT_EQ(written->remarks.at("lostEvents"), foundation::Value(7));
    EXPECT_EQ(written->remarks.at("problem \"é\""), foundation::Value("it is \"odd\""));
}

TEST_P(PerformanceWriterContract, KeepsNullForARemarkThatIsNotFiniteAndTheRestOfTheFile)
{
    auto file = open();
    file->remark("share", std::numeric_limits<double>::quiet_NaN());
    file->write("mix", 1, Nanoseconds);
    file.reset();
    const auto written = subject->read(path);
    ASSERT_TRUE(written);
    EXPECT_EQ(written->remarks.at("share"), foundation::Value());
    EXPECT_THAT(written->measurements, ElementsAre(Measurement{"mix", 1, Nanoseconds}));
}

TEST_P(PerformanceWriterContract, LeavesTheFormerFileThereUntilTheNewOneIsClosed)
{
    {
        const auto former = open();
        former->write("former", 1, Nanoseconds);
    }
    auto file = subject->writer().open(path, "Other", 5);
    file->write("new", 2, Nanoseconds);
    EXPECT_THAT(subject->read(path)->measurements, ElementsAre(Measurement{"former", 1, Nanoseconds}));
    file.reset();
    EXPECT_THAT(subject->read(path)->measurements, ElementsAre(Measurement{"new", 2, Nanoseconds}));
    EXPECT_EQ(subject->read(path)->version, 5U);
}

TEST_P(PerformanceWriterContract, WritesSeveralFilesAtATime)
{
    auto one = open();
    auto two = subject->writer().open(root / "more", "Other", 1);
    one->write("a", 1, Nanoseconds);
    two->write("b", 2, Nanoseconds);
    one->write("c", 3, Nanoseconds);
    one.reset();
    two.reset();
    EXPECT_EQ(subject->read(path)->measurements.size(), 2U);
    EXPECT_THAT(subject->read(root / "more")->measurements, ElementsAre(Measurement{"b", 2, Nanoseconds}));
}

TEST_P(PerformanceWriterContract, OpensNoFileWhereNoneCanBe)
{
    EXPECT_EQ(subject->writer().open(root / "missing/results", "p", 1), nullptr) << "its folder is missing";
    EXPECT_EQ(subject->writer().open("/outside/results", "p", 1), nullptr);
    ASSERT_TRUE(subject->files().createDirectories(path, 0777));
    EXPECT_EQ(open(), nullptr) << "a folder has its name";
    EXPECT_NE(subject->writer().open(path / "inside", "p", 1), nullptr);
}

} // namespace
} // namespace contract
