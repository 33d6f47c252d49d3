// SPDX-License-Identifier: Apache-2.0
// The service's own code reads the file, so that the warnings match the service's behaviour.
#include "kesto/trace/TraceParametersFile.h"

#include "foundation/plist/PropertyList.h"
#include "kesto/Terminal.h"
#include "kesto/files/InputFile.h"
#include "platform/linux/diagnostics/LinuxFileSystem.h"
#include "platform/linux/files/FilesAt.h"
#include "platform/linux/files/LockedFile.h"
#include "platform/linux/files/WriteAll.h"
#include "tracing/TraceParamsParser.h"

#include <algorithm>
#include <cerrno>
#include <fmt/format.h>
#include <stdexcept>
#include <system_error>
#include <unistd.h>

namespace fs = std::filesystem;

namespace {

bool isCollected(std::uint32_t code)
{
    return code >= firstTraceCode && code <= lastTraceCode;
}

// Empty for a point that can be measured.
std::string whyNeverMeasured(const TraceDataParams& point)
{
    for (const std::uint32_t code : {point.beginCode, point.endCode})
        if (!isCollected(code))
            return fmt::format("the code {:#010x} is not from {:#x} to {:#x}", code, firstTraceCode, lastTraceCode);
    return point.beginCode == point.endCode ? "it begins and ends with one code" : "";
}

constexpr std::string_view copyBegin = ".kesto-";
constexpr std::string_view copyEnd = ".plist";

bool isLeftCopy(int folder, const std::string& name)
{
    return !platform::randomDigitsBetween(copyBegin, copyEnd, name).empty() && platform::isOwnFileAt(folder, name)
        && platform::isMakerGoneAt(folder, name);
}

} // namespace

TraceParametersFile readTraceParameters(const fs::path& path)
{
    TraceParametersFile file{.path = fs::absolute(path), .text = {}, .params = {}};
    file.text = readInput(file.path, foundation::PropertyListLimits().bytes);
    const auto list = foundation::readPropertyList(file.text);
    if (!list)
        throw std::runtime_error(fmt::format("{} is not a parameters file: {}", printable(file.path.native()),
                                             printable(list.error().text)));
    file.params = *TraceParamsParser::paramsOf(*list);
    if (file.params.traceType == TraceParams::signpostTrace)
        throw std::runtime_error(
            fmt::format("{} asks for a trace of signposts ({} is {}), which the service does not support",
                        printable(file.path.native()), TraceDataType, TraceDataTypeOSSignpost));
    return file;
}

std::vector<std::string> warningsOf(const TraceParams& params)
{
    std::vector<std::string> warnings;
    if (!params.problem.empty())
        warnings.push_back(params.problem);
    if (params.leftOut != 0)
        warnings.push_back(fmt::format("{} traces and points of the parameters file will be left out: no more than {} "
                                       "are read",
                                       params.leftOut, TraceParamsParser::mostTracesAndPoints));
    if (params.traceDataParams.empty())
        warnings.emplace_back("it has no points, so nothing will be measured");
    for (std::size_t index = 0; index < params.traceDataParams.size(); ++index) {
        const TraceDataParams& point = params.traceDataParams[index];
        const std::string which = fmt::format("point {}, \"{}\": ", index + 1, printable(point.name));
        if (!point.isTypeKnown)
            warnings.push_back(which
                               + "its type is not Interval, Impulse or Level, so it counts as one like the "
                                 "point before it");
        if (const std::string why = whyNeverMeasured(point); !why.empty())
            warnings.push_back(fmt::format("{}measures nothing, because {}", which, why));
    }
    return warnings;
}

void removeLeftTraceParametersCopies(const fs::path& root, const fs::path& folder)
{
    constexpr std::size_t mostNames = 100'000; // other users may make files there
    const auto opened = platform::LinuxFileSystem(root).openDirectory(folder);
    const auto names = opened ? platform::namesIn(opened->get(), mostNames) : std::unexpected(opened.error());
    for (const std::string& name : names.value_or(std::vector<std::string>()))
        if (isLeftCopy(opened->get(), name))
            ::unlinkat(opened->get(), name.c_str(), 0);
}

TraceParametersCopy::TraceParametersCopy(const fs::path& root, const fs::path& folder, std::string_view text)
    : name_(fmt::format("{}{}{}", copyBegin, platform::randomDigits(), copyEnd)),
      path_(folder / name_)
{
    const auto fail = [this](int error) {
        throw std::runtime_error(
            fmt::format("cannot write {}: {}", printable(path_.native()), std::generic_category().message(error)));
    };
    auto opened = platform::LinuxFileSystem(root).openDirectory(folder);
    if (!opened)
        fail(opened.error().value());
    folder_ = *std::move(opened);
    file_ = platform::makeLockedFileAt(folder_.get(), name_);
    if (!file_)
        fail(errno);
    if (const int error = platform::writeAll(file_.get(), text); error != 0) {
        ::unlinkat(folder_.get(), name_.c_str(), 0);
        fail(error);
    }
}

TraceParametersCopy::~TraceParametersCopy()
{
    ::unlinkat(folder_.get(), name_.c_str(), 0);
}
