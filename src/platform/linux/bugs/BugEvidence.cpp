// SPDX-License-Identifier: Apache-2.0
// Files of /proc report a wrong size, may vanish while they are read, and hold names that foreign processes chose.
#include "platform/linux/bugs/BugEvidence.h"

#include "foundation/values/String.h"
#include "platform/linux/files/FilesAt.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <fcntl.h>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace platform {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

constexpr std::size_t longestName = 64; // of kernel threads; processes have at most 15 bytes
constexpr unsigned deepestSoundFolder = 6;
constexpr std::size_t mostNames = std::size_t{1} << 20; // in a folder of the kernel's

// The parts that end with that byte, as text; a last part without it counts too.
Array partsOf(std::string bytes, char end)
{
    foundation::replaceWhatIsNotUtf8(bytes);
    std::vector<Value> parts;
    for (std::string_view rest = bytes; !rest.empty();) {
        const std::size_t length = rest.find(end);
        parts.emplace_back(rest.substr(0, length));
        rest.remove_prefix(length == std::string_view::npos ? rest.size() : length + 1);
    }
    return Array(std::move(parts));
}

std::optional<std::string> nameOf(int process)
{
    auto name = readFileAt(process, "comm", longestName);
    if (!name)
        return std::nullopt;
    if (name->ends_with('\n'))
        name->pop_back();
    foundation::replaceWhatIsNotUtf8(*name);
    return *std::move(name);
}

Dictionary describeProcess(std::int64_t number, int process, const BugEvidenceLimits& limits)
{
    Dictionary::Entries entries{{"pid", number}};
    for (const char* file : {"status", "stat", "cmdline", "wchan", "limits"}) {
        auto bytes = readFileAt(process, file, limits.longestProcessFile);
        if (!bytes) // the process ended, or this file is not readable
            entries.push_back({file, Value()});
        else
            entries.push_back({file, partsOf(*std::move(bytes), std::string_view(file) == "cmdline" ? '\0' : '\n')});
    }
    return Dictionary(std::move(entries));
}

std::vector<std::int64_t> processNumbers(int proc)
{
    std::vector<std::int64_t> numbers;
    for (const std::string& name : namesIn(proc, mostNames).value_or(std::vector<std::string>())) {
        std::int64_t number = 0;
        const char* const end = name.data() + name.size();
        if (const auto [read, error] = std::from_chars(name.data(), end, number); error == std::errc() && read == end)
            numbers.push_back(number);
    }
    std::ranges::sort(numbers);
    return numbers;
}

// The files of a folder and of its subfolders, up to a limit.
class SoundFiles {
public:
    explicit SoundFiles(const BugEvidenceLimits& limits) : limits_(limits), bytesLeft_(limits.mostSoundBytes) { }

    void addFolder(int folder, const std::string& prefix, unsigned depth)
    {
        for (const std::string& name : namesIn(folder, mostNames).value_or(std::vector<std::string>())) {
            if (files_.size() >= limits_.mostSoundFiles || bytesLeft_ == 0)
                return;
            if (const auto inside = openDirectoryAt(folder, name)) {
                if (depth > 0)
                    addFolder(inside->get(), prefix + name + '/', depth - 1);
            } else if (auto bytes = readFileAt(folder, name, std::min(limits_.longestSoundFile, bytesLeft_))) {
                bytesLeft_ -= bytes->size();
                std::string path = prefix + name;
                foundation::replaceWhatIsNotUtf8(path);
                files_.push_back({foundation::String(path), partsOf(*std::move(bytes), '\n')});
            }
        }
    }

    [[nodiscard]] Dictionary take() { return Dictionary(std::move(files_)); }

private:
    const BugEvidenceLimits& limits_;
    std::size_t bytesLeft_;
    Dictionary::Entries files_;
};

FileDescriptor openFolder(const std::filesystem::path& path)
{
    return FileDescriptor(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

} // namespace

Dictionary processEvidence(const std::filesystem::path& proc, std::string_view processName, std::int64_t first,
                           const BugEvidenceLimits& limits)
{
    std::int64_t found = 0;
    std::vector<Value> processes;
    if (const FileDescriptor folder = openFolder(proc)) {
        auto numbers = processNumbers(folder.get());
        std::ranges::stable_partition(numbers, [first](std::int64_t number) { return number == first; });
        for (const std::int64_t number : numbers) {
            const auto process = openDirectoryAt(folder.get(), std::to_string(number));
            if (!process || nameOf(process->get()) != processName)
                continue;
            if (static_cast<std::size_t>(found++) < limits.mostProcesses)
                processes.emplace_back(describeProcess(number, process->get(), limits));
        }
    }
    return {{"name", processName}, {"found", found}, {"processes", Array(std::move(processes))}};
}

Dictionary soundEvidence(const std::filesystem::path& proc, const BugEvidenceLimits& limits)
{
    SoundFiles files(limits);
    if (const FileDescriptor folder = openFolder(proc))
        if (const auto sound = openDirectoryAt(folder.get(), "asound"))
            files.addFolder(sound->get(), "", deepestSoundFolder);
    return files.take();
}

} // namespace platform
