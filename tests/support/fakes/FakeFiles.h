// SPDX-License-Identifier: Apache-2.0
// Files in a test's memory: those of the file system and those of the performance-data writer.
#pragma once

#include "platform/FileSystem.h"
#include "platform/PerformanceWriter.h"
#include "platform/WorkQueue.h"

#include <map>
#include <string>
#include <vector>

namespace support {

// One thread, as the other class.
class FakeFileSystem final : public platform::FileSystem {
public:
    std::map<std::filesystem::path, unsigned> directories; // with their permissions; besides the root, which exists
    std::map<std::filesystem::path, std::string> files;
    struct KeptWithin {
        std::filesystem::path folder;
        platform::KeptFiles kept;
        std::uint64_t bytes;
    };
    std::vector<KeptWithin> keptWithin; // the calls of `keepWithin`, in order
    std::error_code directoryError; // the error of the next attempts, if set
    std::error_code createError;
    std::error_code writeError;
    platform::FileSystem* disk = nullptr; // serves `readFile`, if set

    // Without queues folders have no limits.
    explicit FakeFileSystem(platform::WorkQueues* queues = nullptr) : queues_(queues) { }

    [[nodiscard]] std::filesystem::path diagnosticLogRoot() const override { return "/diagnostics"; }
    std::expected<void, std::error_code> createDirectories(const std::filesystem::path& path,
                                                           unsigned permissions) override;
    std::expected<std::unique_ptr<platform::AtomicFile>, std::error_code>
    createAtomically(const std::filesystem::path& path) override;
    void keepWithin(const std::filesystem::path& folder, const platform::KeptFiles& kept, std::uint64_t bytes) override;
    std::expected<std::string, std::error_code> readFile(const std::filesystem::path& path, std::size_t limit) override;

private:
    friend class FakePerformanceWriter;
    class File;
    [[nodiscard]] bool isDirectory(const std::filesystem::path& path) const;
    [[nodiscard]] std::error_code commit(const std::filesystem::path& path, const std::string& text);
    [[nodiscard]] std::vector<std::filesystem::path> beyond(const std::filesystem::path& folder,
                                                            const platform::KeptFiles& kept) const;

    platform::WorkQueues* const queues_;
    std::map<std::filesystem::path, std::uint64_t> writtenAs_; // the sequence number among all files
    std::uint64_t written_ = 0;
};

class FakePerformanceWriter final : public platform::PerformanceWriter {
public:
    struct Measurement {
        std::string name;
        double value;
        platform::PerformanceUnit unit;
        friend bool operator==(const Measurement&, const Measurement&) = default;
    };
    struct File {
        std::filesystem::path path;
        std::string project;
        std::uint32_t version = 0;
        std::vector<Measurement> measurements;
        std::map<std::string, foundation::Value, std::less<>> remarks;
        bool closed = false;
    };

    bool canOpen = true;

    // Opens a file where the file system, which must outlive the writer, would accept one.
    explicit FakePerformanceWriter(FakeFileSystem& fileSystem) : fileSystem_(fileSystem) { }

    // The files that were opened, in order.
    [[nodiscard]] const std::vector<std::shared_ptr<File>>& files() const { return files_; }

    std::unique_ptr<platform::PerformanceFile> open(const std::filesystem::path& path, std::string_view project,
                                                    std::uint32_t version) override;

private:
    class Handle;
    FakeFileSystem& fileSystem_;
    std::vector<std::shared_ptr<File>> files_;
};

} // namespace support
