// SPDX-License-Identifier: Apache-2.0
// The service may change the folder meanwhile: captures that vanish are left out.
#include "kesto/results/CapturedBugs.h"

#include "kesto/files/JsonReader.h"

#include <algorithm>
#include <charconv>
#include <ctime>
#include <fmt/format.h>
#include <fstream>
#include <stdexcept>
#include <string_view>
#include <system_error>

namespace fs = std::filesystem;

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

constexpr std::size_t longestFile = std::size_t{32} * 1024 * 1024; // more than the service writes

// Regular files only: captures hold no links.
std::optional<std::string> readFile(const fs::path& path)
{
    std::error_code error;
    if (!fs::is_regular_file(fs::symlink_status(path, error)))
        return std::nullopt;
    std::ifstream file(path, std::ios::binary);
    std::string text(std::min<std::size_t>(fs::file_size(path, error), longestFile), '\0');
    if (error || !file.read(text.data(), static_cast<std::streamsize>(text.size())))
        return std::nullopt;
    return text;
}

std::optional<Value> readJson(const fs::path& path)
{
    const auto text = readFile(path);
    return text ? parseJson(*text) : std::nullopt;
}

Dictionary readDictionary(const fs::path& path)
{
    const auto value = readJson(path);
    return value ? value->dictionary().value_or(Dictionary()) : Dictionary();
}

Array linesOf(std::string_view text)
{
    std::vector<Value> lines;
    while (!text.empty()) {
        const std::size_t length = text.find('\n');
        lines.emplace_back(text.substr(0, length));
        text.remove_prefix(length == std::string_view::npos ? text.size() : length + 1);
    }
    return Array(std::move(lines));
}

// "00000007-20260131T180000Z" is number 7, of that time.
std::optional<CapturedBug> parseName(const std::string& name)
{
    CapturedBug capture;
    const auto [end, error] = std::from_chars(name.data(), name.data() + name.size(), capture.number);
    if (error != std::errc() || end == name.data() + name.size() || *end != '-')
        return std::nullopt;
    std::tm time{};
    if (const char* const rest = ::strptime(end + 1, "%Y%m%dT%H%M%SZ", &time); rest == nullptr || *rest != '\0')
        return std::nullopt;
    capture.time = static_cast<double>(::timegm(&time));
    return capture;
}

std::vector<fs::path> filesIn(const fs::path& directory)
{
    std::vector<fs::path> files;
    std::error_code error;
    std::error_code ignored;
    for (fs::directory_iterator entry(directory, error), end; !error && entry != end; entry.increment(error))
        if (fs::is_regular_file(entry->symlink_status(ignored)))
            files.push_back(entry->path());
    std::ranges::sort(files);
    return files;
}

std::optional<std::uint64_t> bytesOf(const fs::path& state)
{
    std::error_code error;
    if (!fs::is_directory(fs::symlink_status(state, error)))
        return std::nullopt;
    std::uint64_t bytes = 0;
    for (const fs::path& file : filesIn(state))
        if (const auto size = fs::file_size(file, error); !error)
            bytes += size;
    return bytes;
}

} // namespace

std::vector<CapturedBug> capturedBugsIn(const fs::path& directory)
{
    std::vector<CapturedBug> captures;
    std::error_code error;
    std::error_code ignored; // the service may remove a capture while it is being read
    fs::directory_iterator entry(directory, error);
    if (error == std::errc::no_such_file_or_directory && fs::is_directory(directory.parent_path(), ignored))
        return captures; // the service makes the folder with the first capture
    for (; !error && entry != fs::directory_iterator(); entry.increment(error)) {
        auto capture = parseName(entry->path().filename());
        if (!capture || !fs::is_directory(entry->symlink_status(ignored)))
            continue;
        capture->directory = entry->path();
        capture->signature = readDictionary(capture->directory / "signature.json");
        capture->response = readDictionary(capture->directory / "response.json");
        capture->bytes = bytesOf(capture->directory / "state");
        captures.push_back(std::move(*capture));
    }
    if (error)
        throw std::runtime_error(fmt::format("cannot read {}: {}", directory.native(), error.message()));
    std::ranges::sort(captures, {}, &CapturedBug::number);
    return captures;
}

Dictionary stateOf(const CapturedBug& capture)
{
    Dictionary::Entries entries;
    for (const fs::path& file : filesIn(capture.directory / "state")) {
        if (file.extension() == ".json")
            entries.push_back({foundation::String(file.stem().native()), readJson(file).value_or(Value())});
        else if (const auto text = readFile(file))
            entries.push_back({foundation::String(file.stem().native()), linesOf(*text)});
        else
            entries.push_back({foundation::String(file.stem().native()), Value()});
    }
    return Dictionary(std::move(entries));
}
