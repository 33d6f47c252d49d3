// SPDX-License-Identifier: Apache-2.0
// Refuses what a disk refuses: a file without a folder, a folder in place of a file, and paths that lead out of the
// root.
#include "support/fakes/FakeFiles.h"

#include "foundation/values/Json.h"

#include <algorithm>
#include <functional>
#include <utility>

namespace support {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t longestName = 255;

std::unexpected<std::error_code> failure(std::errc reason)
{
    return std::unexpected(std::make_error_code(reason));
}

} // namespace

class FakeFileSystem::File final : public platform::AtomicFile {
public:
    File(FakeFileSystem& fileSystem, fs::path path) : fileSystem_(fileSystem), path_(std::move(path)) { }

    void write(std::string_view text) override { text_ += text; }
    void clear() override { text_.clear(); }
    std::expected<void, std::error_code> commit() override
    {
        if (const auto error = fileSystem_.commit(path_, text_))
            return std::unexpected(error);
        return {};
    }

private:
    FakeFileSystem& fileSystem_;
    const fs::path path_;
    std::string text_;
};

bool FakeFileSystem::isDirectory(const fs::path& path) const
{
    return path == diagnosticLogRoot() || directories.contains(path);
}

std::expected<void, std::error_code> FakeFileSystem::createDirectories(const fs::path& path, unsigned permissions)
{
    if (directoryError)
        return std::unexpected(directoryError);
    const fs::path below = path.lexically_relative(diagnosticLogRoot());
    if (below.empty() || std::ranges::find(below, "..") != below.end())
        return failure(std::errc::invalid_argument);
    fs::path step = diagnosticLogRoot();
    for (const fs::path& name : below) {
        if (name == ".")
            continue;
        step /= name;
        if (name.native().size() > longestName)
            return failure(std::errc::filename_too_long);
        if (files.contains(step))
            return failure(std::errc::not_a_directory);
        directories.try_emplace(step, permissions);
    }
    return {};
}

std::expected<std::unique_ptr<platform::AtomicFile>, std::error_code>
FakeFileSystem::createAtomically(const fs::path& path)
{
    if (createError)
        return std::unexpected(createError);
    const fs::path folder = path.parent_path();
    const fs::path below = folder.lexically_relative(diagnosticLogRoot());
    if (below.empty() || std::ranges::find(below, "..") != below.end())
        return failure(std::errc::invalid_argument);
    if (files.contains(folder))
        return failure(std::errc::not_a_directory);
    if (!isDirectory(folder))
        return failure(std::errc::no_such_file_or_directory);
    return std::make_unique<File>(*this, path);
}

std::error_code FakeFileSystem::commit(const fs::path& path, const std::string& text)
{
    if (writeError)
        return writeError;
    if (path.filename().native().size() > longestName)
        return std::make_error_code(std::errc::filename_too_long);
    if (isDirectory(path))
        return std::make_error_code(std::errc::is_a_directory);
    files.insert_or_assign(path, text);
    writtenAs_[path] = ++written_;
    return {};
}

void FakeFileSystem::keepWithin(const fs::path& folder, const platform::KeptFiles& kept, std::uint64_t bytes)
{
    keptWithin.push_back({folder, kept, bytes});
    if (queues_ != nullptr && !beyond(folder, kept).empty())
        queues_->backgroundQueue().submit([this, folder, kept] {
            for (const fs::path& path : beyond(folder, kept))
                files.erase(path);
        });
}

// The files of the kind that exceed the limits, counted from the youngest.
std::vector<fs::path> FakeFileSystem::beyond(const fs::path& folder, const platform::KeptFiles& kept) const
{
    std::map<std::uint64_t, fs::path, std::greater<>> youngestFirst;
    for (const auto& [path, number] : writtenAs_)
        if (path.parent_path() == folder && kept.isOne(path.filename().native()) && files.contains(path))
            youngestFirst.emplace(number, path);
    std::vector<fs::path> beyond;
    std::size_t count = 0;
    std::uint64_t bytes = 0;
    for (const auto& [number, path] : youngestFirst) {
        bytes += files.at(path).size();
        if (++count > 1 && (count > kept.most || bytes > kept.mostBytes))
            beyond.push_back(path);
    }
    return beyond;
}

std::expected<std::string, std::error_code> FakeFileSystem::readFile(const fs::path& path, std::size_t limit)
{
    if (disk != nullptr)
        return disk->readFile(path, limit);
    if (path.native().contains('\0') || isDirectory(path))
        return failure(std::errc::invalid_argument);
    const auto found = files.find(path);
    if (found == files.end())
        return failure(std::errc::no_such_file_or_directory);
    if (found->second.size() > limit)
        return failure(std::errc::file_too_large);
    return found->second;
}

class FakePerformanceWriter::Handle final : public platform::PerformanceFile {
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
        std::string json;
        file_->remarks.insert_or_assign(std::string(key),
                                        foundation::appendJson(value, json) ? value : foundation::Value());
    }

private:
    const std::shared_ptr<File> file_;
};

std::unique_ptr<platform::PerformanceFile> FakePerformanceWriter::open(const fs::path& path, std::string_view project,
                                                                       std::uint32_t version)
{
    if (!canOpen || fileSystem_.isDirectory(path) || !fileSystem_.createAtomically(path))
        return nullptr;
    return std::make_unique<Handle>(files_.emplace_back(std::make_shared<File>(path, std::string(project), version)));
}

} // namespace support
