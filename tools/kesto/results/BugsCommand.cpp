// SPDX-License-Identifier: Apache-2.0
// `kesto bugs`: the bugs that the service captured, as a table, or one with all its details.
#include "foundation/values/Json.h"
#include "kesto/Commands.h"
#include "kesto/ServiceDirectories.h"
#include "kesto/Terminal.h"
#include "kesto/results/CapturedBugs.h"

#include <algorithm>
#include <fmt/format.h>
#include <memory>
#include <optional>
#include <stdexcept>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

struct BugsOptions {
    std::filesystem::path directory;
    std::optional<std::uint64_t> number;
    bool isJson = false;
};

constexpr std::size_t numberColumns = 6;
constexpr std::size_t timeColumns = 19;
constexpr std::size_t sizeColumns = 10;
constexpr std::size_t processColumns = 16;

// "-" for a tombstone.
std::string sizeText(const std::optional<std::uint64_t>& bytes)
{
    constexpr std::uint64_t kibi = 1024;
    return bytes ? fmt::format("{} KiB", (*bytes + kibi - 1) / kibi) : "-";
}

std::string entryText(const Dictionary& dictionary, std::string_view key)
{
    const Value* const value = dictionary.find(key);
    return value == nullptr ? "?" : printable(shownText(*value));
}

// "haptics DSP_Playback Gimbo": service type, category and type.
std::string bugText(const Dictionary& signature)
{
    return fmt::format("{} {} {}", entryText(signature, "type"), entryText(signature, "subType"),
                       entryText(signature, "subtypeContext"));
}

void printTable(const std::vector<CapturedBug>& captures)
{
    const std::size_t width = outputWidth();
    fmt::print("{:>{}} {} {:>{}} {} {}\n", "NUMBER", numberColumns, padded("TIME", timeColumns), "STATE", sizeColumns,
               padded("PROCESS", processColumns), "BUG");
    for (const CapturedBug& capture : captures)
        fmt::print("{:>{}} {} {:>{}} {} {}\n", capture.number, numberColumns, momentText(capture.time),
                   sizeText(capture.bytes), sizeColumns,
                   padded(fitted(entryText(capture.signature, "detectedProcess"), processColumns), processColumns),
                   fitted(bugText(capture.signature),
                          columnsBehind(numberColumns + timeColumns + sizeColumns + processColumns + 4, width)));
}

Dictionary describe(const CapturedBug& capture)
{
    return {{"number", capture.number},
            {"time", capture.time},
            {"directory", capture.directory.native()},
            {"bytes", capture.bytes ? Value(*capture.bytes) : Value()},
            {"signature", capture.signature},
            {"response", capture.response}};
}

void printJson(const Dictionary& dictionary)
{
    std::string line;
    foundation::appendJsonText(dictionary, line);
    fmt::print("{}\n", line);
}

// The kernel's tables hold tabs, which do not align here.
std::string lineText(const Value& value)
{
    std::string text = shownText(value);
    std::ranges::replace(text, '\t', ' ');
    return printable(text);
}

bool isContainer(const Value& value)
{
    return value.kind() == Value::Kind::Array || value.kind() == Value::Kind::Dictionary;
}

void printBelow(const Value& value, std::size_t indent);

// "key: value", or the key with its content below.
void printEntry(std::string_view key, const Value& value, std::size_t indent)
{
    const bool isBelow = isContainer(value);
    fmt::print("{:{}}{}:{}{}\n", "", indent, printable(key), isBelow ? "" : " ", isBelow ? "" : lineText(value));
    printBelow(value, indent + 2);
}

// Prints each entry of a dictionary or element of a list on a line of its own; nothing for other values.
void printBelow(const Value& value, std::size_t indent)
{
    if (const auto dictionary = value.dictionary())
        for (const auto& [key, inside] : *dictionary)
            printEntry(key, inside, indent);
    if (const auto array = value.array())
        for (const Value& element : *array) {
            if (!isContainer(element))
                fmt::print("{:{}}{}\n", "", indent, lineText(element));
            printBelow(element, indent);
        }
}

void printWhole(const CapturedBug& capture)
{
    fmt::print("bug {} of {}\n{}\n\n", capture.number, momentText(capture.time), printable(capture.directory.native()));
    printEntry("signature", capture.signature, 0);
    printEntry("response", capture.response, 0);
    if (!capture.bytes)
        fmt::print("The state of the device was removed to make room for newer captures.\n");
    for (const auto& [name, value] : stateOf(capture))
        printEntry(name, value, 0);
}

void show(const BugsOptions& options)
{
    const auto captures = capturedBugsIn(options.directory);
    if (options.number) {
        const auto found = std::ranges::find(captures, *options.number, &CapturedBug::number);
        if (found == captures.end())
            throw std::runtime_error(
                fmt::format("bug {} does not exist in {}", *options.number, options.directory.native()));
        if (options.isJson)
            printJson(describe(*found).with("state", stateOf(*found)));
        else
            printWhole(*found);
    } else if (options.isJson)
        for (const CapturedBug& capture : captures)
            printJson(describe(capture));
    else if (captures.empty())
        fmt::print("No bugs were captured in {}.\n", options.directory.native());
    else
        printTable(captures);
}

} // namespace

void addBugsCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<BugsOptions>();
    CLI::App* command = application.add_subcommand("bugs", "Lists the captured bugs, or shows one");
    command->add_option("NUMBER", options->number, "The bug to show with all its details");
    command->add_option("--directory", options->directory, "The captures, if they are not at their usual place");
    command->add_flag("--json", options->isJson, "One JSON object in each line, for programs");
    command->callback([options, &exitStatus] {
        if (options->directory.empty())
            options->directory = usualDatabase().parent_path() / "bug-captures";
        show(*options);
        exitStatus = exitOk;
    });
}
