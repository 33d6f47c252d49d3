// SPDX-License-Identifier: Apache-2.0
// The contract of platform/FileSystem.h: folders with their permissions, files that are complete or missing, and the
// errors of files that cannot be written or read.
#include "platform/contract/Contract.h"
#include "platform/linux/diagnostics/FolderLimits.h"
#include "platform/linux/diagnostics/LinuxFileSystem.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeClock.h"
#include "support/fakes/FakeFiles.h"
#include "support/fakes/FakeLog.h"
#include "support/fakes/FakeWorkQueues.h"

#include <gmock/gmock.h>
#include <optional>

namespace contract {
namespace {

namespace fs = std::filesystem;
using platform::KeptFiles;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Not;

class FileSystemSubject {
public:
    virtual ~FileSystemSubject() = default;
    [[nodiscard]] virtual platform::FileSystem& files() = 0;
    // The permissions of the folder, if it exists.
    [[nodiscard]] virtual std::optional<unsigned> permissionsOf(const fs::path& folder) = 0;
    // The names in the folder, sorted, hidden ones too.
    [[nodiscard]] virtual std::vector<std::string> namesIn(const fs::path& folder) = 0;
    // The text of a file, if it exists.
    [[nodiscard]] virtual std::optional<std::string> textOf(const fs::path& file) = 0;
    // A file of another program, outside the root.
    [[nodiscard]] virtual fs::path writeElsewhere(const std::string& text) = 0;
    // Runs the background work.
    virtual void work() = 0;
};

class FakeFileSystemSubject final : public FileSystemSubject {
public:
    [[nodiscard]] platform::FileSystem& files() override { return files_; }
    [[nodiscard]] std::optional<unsigned> permissionsOf(const fs::path& folder) override
    {
        const auto found = files_.directories.find(folder);
        return found == files_.directories.end() ? std::nullopt : std::optional(found->second);
    }
    [[nodiscard]] std::vector<std::string> namesIn(const fs::path& folder) override
    {
        std::vector<std::string> names;
        for (const auto& [path, text] : files_.files)
            if (path.parent_path() == folder)
                names.push_back(path.filename());
        for (const auto& [path, permissions] : files_.directories)
            if (path.parent_path() == folder)
                names.push_back(path.filename());
        std::ranges::sort(names);
        return names;
    }
    [[nodiscard]] std::optional<std::string> textOf(const fs::path& file) override
    {
        const auto found = files_.files.find(file);
        return found == files_.files.end() ? std::nullopt : std::optional(found->second);
    }
    [[nodiscard]] fs::path writeElsewhere(const std::string& text) override
    {
        files_.files["/elsewhere/file"] = text;
        return "/elsewhere/file";
    }
    void work() override { queues_.runAll(); }

private:
    support::FakeClock clock_;
    support::FakeWorkQueues queues_{clock_};
    support::FakeFileSystem files_{&queues_};
};

class LinuxFileSystemSubject final : public FileSystemSubject {
public:
    [[nodiscard]] platform::FileSystem& files() override { return files_; }
    [[nodiscard]] std::optional<unsigned> permissionsOf(const fs::path& folder) override
    {
        const fs::file_status status = fs::symlink_status(folder);
        return fs::is_directory(status) ? std::optional(static_cast<unsigned>(status.permissions())) : std::nullopt;
    }
    [[nodiscard]] std::vector<std::string> namesIn(const fs::path& folder) override { return support::namesIn(folder); }
    [[nodiscard]] std::optional<std::string> textOf(const fs::path& file) override
    {
        return fs::is_regular_file(file) ? std::optional(support::readFile(file)) : std::nullopt;
    }
    [[nodiscard]] fs::path writeElsewhere(const std::string& text) override
    {
        support::writeFile(elsewhere_ / "file", text);
        return elsewhere_ / "file";
    }
    void work() override { queues_.runAll(); }

private:
    const support::TemporaryDirectory root_;
    const support::TemporaryDirectory elsewhere_;
    support::FakeLog log_;
    support::FakeClock clock_;
    support::FakeWorkQueues queues_{clock_};
    platform::FolderLimits limits_{queues_, platform::ProviderLog(log_)};
    platform::LinuxFileSystem files_{root_.path(), &limits_};
};

bool isNote(std::string_view name)
{
    return name.starts_with("note-");
}

class FileSystemContract : public Suite<FileSystemSubject> {
protected:
    // The result; on success the error is empty.
    std::error_code write(const fs::path& path, std::string_view text)
    {
        const auto file = files.createAtomically(path);
        if (!file)
            return file.error();
        (*file)->write(text);
        const auto written = (*file)->commit();
        return written ? std::error_code() : written.error();
    }
    std::error_code make(const fs::path& folder, unsigned permissions = 0777)
    {
        const auto made = files.createDirectories(folder, permissions);
        return made ? std::error_code() : made.error();
    }
    // Writes a file, and reports it.
    void add(const std::string& name, const KeptFiles& kept, std::size_t size = 1)
    {
        ASSERT_FALSE(write(root / name, std::string(size, 'x')));
        files.keepWithin(root, kept, size);
        subject->work();
    }

    platform::FileSystem& files = subject->files();
    const fs::path root = files.diagnosticLogRoot();
};
KESTO_CONTRACT(FileSystemContract, (provider<FileSystemSubject, FakeFileSystemSubject>("Fake")),
               (provider<FileSystemSubject, LinuxFileSystemSubject>("Linux")));

// --- folders

TEST_P(FileSystemContract, HasARootToWriteTo)
{
    EXPECT_TRUE(root.is_absolute());
    EXPECT_FALSE(make(root));
    EXPECT_FALSE(write(root / "a.json", "text"));
}

TEST_P(FileSystemContract, MakesAFolderAndThoseAboveItThatAreMissingWithThePermissions)
{
    EXPECT_FALSE(make(root / "Audio/Reporting", 0777));
    EXPECT_EQ(subject->permissionsOf(root / "Audio"), 0777U);
    EXPECT_EQ(subject->permissionsOf(root / "Audio/Reporting"), 0777U);
    EXPECT_FALSE(make(root / "others", 0750));
    EXPECT_EQ(subject->permissionsOf(root / "others"), 0750U);
}

TEST_P(FileSystemContract, LeavesFoldersThatExistAsTheyAre)
{
    ASSERT_FALSE(make(root / "Audio", 0750));
    ASSERT_FALSE(make(root / "Audio/Reporting", 0777));
    ASSERT_FALSE(make(root / "Audio/Reporting", 0700));
    EXPECT_EQ(subject->permissionsOf(root / "Audio"), 0750U);
    EXPECT_EQ(subject->permissionsOf(root / "Audio/Reporting"), 0777U);
}

TEST_P(FileSystemContract, MakesNoFolderWhereAFileStands)
{
    ASSERT_FALSE(write(root / "file", "text"));
    EXPECT_EQ(make(root / "file"), std::errc::not_a_directory);
    EXPECT_EQ(make(root / "file/inside"), std::errc::not_a_directory);
    EXPECT_EQ(write(root / "file/inside", "text"), std::errc::not_a_directory);
    EXPECT_EQ(subject->textOf(root / "file"), "text");
}

TEST_P(FileSystemContract, WritesNothingOutsideOfItsRoot)
{
    for (const fs::path& path : {fs::path("/outside"), root.parent_path(), root / "..", root / "a/../../outside",
                                 fs::path("relative"), fs::path(), fs::path("/")}) {
        EXPECT_EQ(make(path), std::errc::invalid_argument) << path;
        EXPECT_EQ(write(path / "file", "text"), std::errc::invalid_argument) << path;
    }
    EXPECT_THAT(subject->namesIn(root), IsEmpty());
}

TEST_P(FileSystemContract, TakesNoNameOfMoreThan255Bytes)
{
    EXPECT_FALSE(make(root / std::string(255, 'x')));
    EXPECT_EQ(make(root / std::string(256, 'x')), std::errc::filename_too_long);
    EXPECT_FALSE(write(root / std::string(255, 'y'), "text"));
    EXPECT_EQ(write(root / std::string(256, 'y'), "text"), std::errc::filename_too_long);
    EXPECT_EQ(subject->namesIn(root).size(), 2U);
}

// --- unfinished files

TEST_P(FileSystemContract, PutsAFileInItsPlaceWholeWhenItIsCommitted)
{
    const auto file = files.createAtomically(root / "a.json").value();
    file->write("one ");
    file->write("");
    file->write(std::string_view("and\0two", 7));
    EXPECT_EQ(subject->textOf(root / "a.json"), std::nullopt) << "not before";
    ASSERT_TRUE(file->commit());
    EXPECT_EQ(subject->textOf(root / "a.json"), std::string("one and\0two", 11));
    EXPECT_THAT(subject->namesIn(root), ElementsAre("a.json"));
}

TEST_P(FileSystemContract, LeavesTheOldFileInItsPlaceUntilThen)
{
    ASSERT_FALSE(write(root / "a.json", "old"));
    const auto file = files.createAtomically(root / "a.json").value();
    file->write("new");
    EXPECT_EQ(subject->textOf(root / "a.json"), "old");
    ASSERT_TRUE(file->commit());
    EXPECT_EQ(subject->textOf(root / "a.json"), "new");
}

TEST_P(FileSystemContract, LeavesNothingOfAFileThatIsNotCommitted)
{
    ASSERT_FALSE(write(root / "a.json", "old"));
    {
        const auto file = files.createAtomically(root / "a.json").value();
        file->write("half of the n");
        const auto other = files.createAtomically(root / "b.json").value();
        other->write("x");
    }
    EXPECT_EQ(subject->textOf(root / "a.json"), "old");
    EXPECT_THAT(subject->namesIn(root), ElementsAre("a.json"));
}

TEST_P(FileSystemContract, BeginsAgainWithAnEmptyFileWhenItIsCleared)
{
    const auto file = files.createAtomically(root / "a.json").value();
    file->write(std::string(100'000, 'x'));
    file->clear();
    file->write("short");
    ASSERT_TRUE(file->commit());
    EXPECT_EQ(subject->textOf(root / "a.json"), "short");
}

TEST_P(FileSystemContract, MakesTwoFilesOfOneNameAtATimeAndTheLastCommitCounts)
{
    const auto first = files.createAtomically(root / "a.json").value();
    const auto second = files.createAtomically(root / "a.json").value();
    first->write("first");
    second->write("second");
    ASSERT_TRUE(second->commit());
    ASSERT_TRUE(first->commit());
    EXPECT_EQ(subject->textOf(root / "a.json"), "first");
}

TEST_P(FileSystemContract, SaysWhyAFileCannotBeWritten)
{
    EXPECT_EQ(write(root / "missing/a.json", "text"), std::errc::no_such_file_or_directory);
    ASSERT_FALSE(make(root / "folder"));
    EXPECT_EQ(write(root / "folder", "text"), std::errc::is_a_directory);
    EXPECT_FALSE(write(root / "folder/a.json", "text"));
    EXPECT_THAT(subject->namesIn(root), ElementsAre("folder")) << "nothing of the attempts is left";
}

// --- folders within limits

TEST_P(FileSystemContract, KeepsAsManyFilesOfTheKindAsThereMayBe)
{
    const KeptFiles kept{4, 1000, isNote};
    for (const char* name : {"note-1", "other", "note-2", "note-3", "note-4"})
        add(name, kept);
    EXPECT_THAT(subject->namesIn(root), ElementsAre("note-1", "note-2", "note-3", "note-4", "other"));
    add("note-5", kept);
    const auto names = subject->namesIn(root);
    EXPECT_LE(std::ranges::count_if(names, isNote), 4);
    EXPECT_THAT(names, Contains("note-5")) << "the newest";
    EXPECT_THAT(names, Contains("other")) << "it is not of this kind";
    EXPECT_THAT(names, Not(Contains("note-1"))) << "the oldest";
}

TEST_P(FileSystemContract, KeepsAsManyBytesOfTheKindAsThereMayBe)
{
    const KeptFiles kept{100, 1000, isNote};
    for (const char* name : {"note-1", "note-2", "note-3"})
        add(name, kept, 400);
    const auto names = subject->namesIn(root);
    EXPECT_THAT(names, Contains("note-3"));
    EXPECT_THAT(names, Not(Contains("note-1")));
    add("note-4", kept, 5000);
    EXPECT_THAT(subject->namesIn(root), ElementsAre("note-4")) << "the newest stays, even if it is too large";
}

TEST_P(FileSystemContract, RemovesNothingBeforeTheBackgroundGetsToIt)
{
    const KeptFiles kept{1, 1000, isNote};
    for (const char* name : {"note-1", "note-2"}) {
        ASSERT_FALSE(write(root / name, "x"));
        files.keepWithin(root, kept, 1);
    }
    EXPECT_THAT(subject->namesIn(root), ElementsAre("note-1", "note-2"));
    subject->work();
    EXPECT_THAT(subject->namesIn(root), ElementsAre("note-2"));
}

// --- reading

TEST_P(FileSystemContract, ReadsFilesAnywhereUpToTheLimit)
{
    const std::string text("some\0bytes", 10);
    const fs::path elsewhere = subject->writeElsewhere(text);
    EXPECT_EQ(files.readFile(elsewhere, 10).value(), text);
    EXPECT_EQ(files.readFile(elsewhere, 1 << 20).value(), text);
    EXPECT_EQ(files.readFile(elsewhere, 9).error(), std::errc::file_too_large);
    ASSERT_FALSE(write(root / "empty", ""));
    EXPECT_EQ(files.readFile(root / "empty", 0).value(), "");
}

TEST_P(FileSystemContract, SaysWhyAFileCannotBeRead)
{
    EXPECT_EQ(files.readFile(root / "missing", 10).error(), std::errc::no_such_file_or_directory);
    EXPECT_EQ(files.readFile(root, 10).error(), std::errc::invalid_argument);
    ASSERT_FALSE(make(root / "folder"));
    EXPECT_EQ(files.readFile(root / "folder", 10).error(), std::errc::invalid_argument);
    ASSERT_FALSE(write(root / "a", "text"));
    EXPECT_EQ(files.readFile(root / std::string("a\0b", 3), 10).error(), std::errc::invalid_argument)
        << "the text before the zero is not its name";
}

} // namespace
} // namespace contract
