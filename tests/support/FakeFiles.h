// Files that exist only in a test's memory: those of the file system and those of the performance-data writer.
#pragma once

#include "platform/FileSystem.h"
#include "platform/PerformanceWriter.h"

#include <map>
#include <string>
#include <vector>

namespace support {

// One thread, as is the other.
class FakeFileSystem final : public platform::FileSystem {
public:
    std::map<std::filesystem::path, unsigned> directories; // with their permissions
    std::map<std::filesystem::path, std::string> files;
    struct KeptWithin {
        std::filesystem::path folder;
        platform::KeptFiles kept;
        std::uint64_t bytes;
    };
    std::vector<KeptWithin> keptWithin; // what was told, in order
    std::error_code directoryError; // of the next attempts, unless it is none
    std::error_code createError;
    std::error_code writeError;
    platform::FileSystem* disk = nullptr; // reads what `readFile` is asked for, if there is one

    [[nodiscard]] std::filesystem::path diagnosticLogRoot() const override { return "/diagnostics"; }
    std::expected<void, std::error_code> createDirectories(const std::filesystem::path& path,
                                                           unsigned permissions) override
    {
        if (directoryError)
            return std::unexpected(directoryError);
        directories.try_emplace(path, permissions);
        return {};
    }
    std::expected<std::unique_ptr<platform::AtomicFile>, std::error_code>
    createAtomically(const std::filesystem::path& path) override
    {
        if (createError)
            return std::unexpected(createError);
        return std::make_unique<File>(*this, path);
    }
    void keepWithin(const std::filesystem::path& folder, const platform::KeptFiles& kept, std::uint64_t bytes) override
    {
        keptWithin.push_back({folder, kept, bytes});
    }
    std::expected<std::string, std::error_code> readFile(const std::filesystem::path& path, std::size_t limit) override
    {
        if (disk != nullptr)
            return disk->readFile(path, limit);
        const auto found = files.find(path);
        if (found == files.end())
            return std::unexpected(make_error_code(std::errc::no_such_file_or_directory));
        if (found->second.size() > limit)
            return std::unexpected(make_error_code(std::errc::file_too_large));
        return found->second;
    }

private:
    class File final : public platform::AtomicFile {
    public:
        File(FakeFileSystem& fileSystem, std::filesystem::path path) : fileSystem_(fileSystem), path_(std::move(path))
        {
        }

        void write(std::string_view text) override { text_ += text; }
        void clear() override { text_.clear(); }
        std::expected<void, std::error_code> commit() override
        {
            if (fileSystem_.writeError)
                return std::unexpected(fileSystem_.writeError);
            fileSystem_.files.insert_or_assign(path_, text_);
            return {};
        }

    private:
        FakeFileSystem& fileSystem_;
        const std::filesystem::path path_;
        std::string text_;
    };
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

    // The files that were opened, in order.
    [[nodiscard]] const std::vector<std::shared_ptr<File>>& files() const { return files_; }

    std::unique_ptr<platform::PerformanceFile> open(const std::filesystem::path& path, std::string_view project,
                                                    std::uint32_t version) override
    {
        if (!canOpen)
            return nullptr;
        return std::make_unique<Handle>(
            files_.emplace_back(std::make_shared<File>(path, std::string(project), version)));
    }

private:
    class Handle final : public platform::PerformanceFile {
    public:
        explicit Handle(std::shared_ptr<File> file) : file_(std::move(file)) { }
        ~Handle() override { file_->closed = true; }
        Handle(const Handle&) = delete;
        Handle& operator=(const Handle&) = delete;

        void write(std::string_view name, double value, platform::PerformanceUnit unit) override
        {
            file_->measurements.push_back({std::string(name), value, unit});
        }
        void remark(std::string_view key, const foundation::Value& value) override
        {
            file_->remarks.insert_or_assign(std::string(key), value);
        }

    private:
        const std::shared_ptr<File> file_;
    };

    std::vector<std::shared_ptr<File>> files_;
};

} // namespace support
