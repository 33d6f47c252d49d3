// SPDX-License-Identifier: Apache-2.0
// Pages of the kernel's trace made by hand, and imitations of tracefs.
#pragma once

#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/trace/EmittedEvent.h"
#include "support/TemporaryDirectory.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <optional>
#include <span>
#include <stdexcept>
#include <string>
#include <string_view>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace support {

constexpr std::uint16_t rawDataType = 19;

// A page as a 64-bit kernel makes it.
class RingBufferPageBuilder {
public:
    static constexpr std::size_t size = 4096;

    explicit RingBufferPageBuilder(std::uint64_t time) : time_(time) { append(time); }

    // A record at that time, which must not be before that of the previous record.
    RingBufferPageBuilder& record(std::uint64_t time, std::string_view bytes)
    {
        constexpr std::size_t mostWords = 28;
        advanceTo(time);
        const std::size_t words = (bytes.size() + 3) / 4;
        if (words <= mostWords && bytes.size() % 4 == 0 && words > 0) {
            head(static_cast<std::uint32_t>(words));
        } else {
            head(0);
            append(static_cast<std::uint32_t>(bytes.size() + 4));
        }
        data_.append(bytes).append(words * 4 - bytes.size(), '\0');
        return *this;
    }
    // An event of the service's own.
    RingBufferPageBuilder& event(std::uint64_t time, std::uint32_t code, std::uint32_t thread = 1,
                                 std::array<std::uint64_t, 4> arguments = {})
    {
        return record(time, eventBytes({.code = code, .arguments = arguments}, thread));
    }
    static std::string eventBytes(const platform::EmittedEvent& emitted, std::uint32_t thread,
                                  std::uint16_t type = rawDataType)
    {
        std::string bytes(8 + sizeof emitted, '\0');
        std::memcpy(bytes.data(), &type, sizeof type);
        std::memcpy(bytes.data() + 4, &thread, sizeof thread);
        std::memcpy(bytes.data() + 8, &emitted, sizeof emitted);
        return bytes;
    }
    RingBufferPageBuilder& extend(std::uint64_t by)
    {
        word(30, static_cast<std::uint32_t>(by & 0x7FFFFFF));
        append(static_cast<std::uint32_t>(by >> 27));
        time_ += by;
        return *this;
    }
    RingBufferPageBuilder& stamp(std::uint64_t time)
    {
        word(31, static_cast<std::uint32_t>(time & 0x7FFFFFF));
        append(static_cast<std::uint32_t>(time >> 27));
        time_ = time;
        return *this;
    }
    // The place of a discarded event of so many bytes.
    RingBufferPageBuilder& takenBack(std::uint32_t after, std::uint32_t bytes)
    {
        word(29, after);
        append(bytes);
        data_.append(bytes - 4, '\x55');
        time_ += after;
        return *this;
    }
    RingBufferPageBuilder& endOfData()
    {
        word(29, 0);
        return *this;
    }
    RingBufferPageBuilder& bytes(std::string_view any)
    {
        data_ += any;
        return *this;
    }
    RingBufferPageBuilder& missed(std::optional<std::uint64_t> count)
    {
        missed_ = true;
        missedCount_ = count;
        return *this;
    }

    // The complete page.
    [[nodiscard]] std::string page(std::optional<std::uint64_t> claimedSize = {}) const
    {
        std::uint64_t commit = claimedSize.value_or(data_.size() - 8);
        commit |= missed_ ? std::uint64_t{1} << 31 : 0;
        commit |= missedCount_ ? std::uint64_t{1} << 30 : 0;
        std::string page = data_.substr(0, 8);
        page.append(reinterpret_cast<const char*>(&commit), sizeof commit).append(data_.substr(8));
        if (missedCount_)
            page.append(reinterpret_cast<const char*>(&*missedCount_), sizeof *missedCount_);
        if (page.size() > size)
            throw std::logic_error("more than a page");
        page.resize(size);
        return page;
    }

private:
    void advanceTo(std::uint64_t time)
    {
        if (time < time_)
            throw std::logic_error("time goes backwards");
        if (time - time_ > 0x7FFFFFF)
            extend(time - time_);
        delta_ = static_cast<std::uint32_t>(time - time_);
        time_ = time;
    }
    void head(std::uint32_t kind) { word(kind, delta_); }
    void word(std::uint32_t kind, std::uint32_t delta) { append(kind | delta << 5); }
    template <typename Number> void append(Number number)
    {
        data_.append(reinterpret_cast<const char*>(&number), sizeof number);
    }

    std::uint64_t time_;
    std::uint32_t delta_ = 0;
    std::string data_; // the time, then the records
    bool missed_ = false;
    std::optional<std::uint64_t> missedCount_;
};

inline std::span<const std::byte> asBytes(std::string_view text)
{
    return std::as_bytes(std::span(text));
}

// A directory with the files of an instance that the service uses. Pages are pipes: each page is read once.
class TracefsTree {
public:
    explicit TracefsTree(int processors = 2, const std::string& name = "kesto")
        : instance(directory.path() / "tracing/instances" / name)
    {
        namespace fs = std::filesystem;
        fs::create_directories(instance / "events/ftrace/raw_data");
        for (const char* file : {"tracing_on", "trace_clock", "trace", "buffer_size_kb", "trace_marker_raw"})
            writeFile(instance / file, "before");
        writeFile(instance / "buffer_subbuf_size_kb", "4\n");
        writeFile(instance / "events/header_page",
                  "\tfield: u64 timestamp;\toffset:0;\tsize:8;\tsigned:0;\n"
                  "\tfield: local_t commit;\toffset:8;\tsize:8;\tsigned:1;\n"
                  "\tfield: int overwrite;\toffset:8;\tsize:1;\tsigned:1;\n"
                  "\tfield: char data;\toffset:16;\tsize:4080;\tsigned:0;\n");
        writeFile(instance / "events/ftrace/raw_data/format",
                  "name: raw_data\nID: 19\nformat:\n"
                  "\tfield:unsigned short common_type;\toffset:0;\tsize:2;\tsigned:0;\n"
                  "\tfield:int common_pid;\toffset:4;\tsize:4;\tsigned:1;\n\n"
                  "\tfield:unsigned int id;\toffset:8;\tsize:4;\tsigned:0;\n"
                  "\tfield:char buf[];\toffset:12;\tsize:0;\tsigned:0;\n");
        for (int cpu = 0; cpu < processors; ++cpu) {
            const fs::path folder = instance / "per_cpu" / ("cpu" + std::to_string(cpu));
            fs::create_directories(folder);
            const fs::path pipe = folder / "trace_pipe_raw";
            if (::mkfifo(pipe.c_str(), 0600) != 0)
                throw std::runtime_error("no pipe can be made");
            pipes_.emplace_back(::open(pipe.c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC));
        }
        writeFile(mounts,
                  "proc /proc proc rw 0 0\nnone " + (directory.path() / "tracing").native() + " tracefs rw 0 0\n");
    }

    void put(int cpu, const std::string& page)
    {
        if (::write(pipes_[static_cast<std::size_t>(cpu)].get(), page.data(), page.size())
            != static_cast<ssize_t>(page.size()))
            throw std::runtime_error("the pipe is full");
    }
    [[nodiscard]] std::string content(const char* file) const { return readFile(instance / file); }

    const TemporaryDirectory directory;
    const std::filesystem::path instance;
    const std::filesystem::path mounts = directory.path() / "mounts";

private:
    std::vector<platform::FileDescriptor> pipes_;
};

} // namespace support
