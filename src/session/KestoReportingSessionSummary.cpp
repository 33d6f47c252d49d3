// SPDX-License-Identifier: Apache-2.0
// The session's summary: one event with every value of each key and, on internal builds, all messages in a file that
// diagnostic tools read.
#define KESTO_LOG_NAME "KestoReportingSession"
#include "foundation/cbor/Cbor.h"
#include "foundation/text/Format.h"
#include "foundation/text/LocalTime.h"
#include "foundation/text/PrettyJsonWriter.h"
#include "foundation/text/StringBuilder.h"
#include "platform/Platform.h"
#include "session/EntryReader.h"
#include "session/KestoReportingSession.h"
#include "utility/KestoReportingUtility.h"

#include <algorithm>
#include <filesystem>
#include <map>

namespace {

using foundation::Dictionary;

constexpr std::string_view summaryKey = "KESTO_Session_Summary_Event";
constexpr std::string_view summaryDirectory = "Audio/Reporting";
constexpr unsigned summaryDirectoryPermissions = 0777;

// The texts of each key's values, joined by commas, in the order in which the keys first came.
//
// Clients choose the number of keys and the length of the texts, and a text may be many times longer than its values in
// the store. So the budget pays for the texts while they exist.
class ValuesByKey {
public:
    explicit ValuesByKey(std::shared_ptr<session::StorageBudget> budget) : share_(std::move(budget)) { }

    // The position of the key's text. Nearly every message has the keys in the same order, so the key behind the last
    // one is tried first. The fallback is a sorted index, which no choice of keys makes slow.
    std::size_t positionOf(std::string_view key)
    {
        if (const std::size_t next = last_ + 1; next < values_.size() && values_[next].key == key)
            return next;
        if (const auto found = positions_.find(key); found != positions_.end())
            return found->second;
        values_.push_back({.key = key});
        positions_.emplace(values_.back().key, values_.size() - 1);
        pay(bytesOfAKey + key.size());
        return values_.size() - 1;
    }

    // A value that repeats the key's last value costs next to nothing.
    void append(std::size_t position, foundation::CborItem value)
    {
        last_ = position;
        Values& values = values_[position];
        if (values.last.isSameAs(value)) {
            ++values.repetitions;
            return;
        }
        appendRepetitions(values);
        appendText(values, value);
        values.last = value;
    }

    // Whether the budget had too little memory. All further work is then useless.
    [[nodiscard]] bool isOutOfMemory() const { return isOutOfMemory_; }

    // Nothing if the budget had too little memory.
    std::optional<Dictionary> finish() &&
    {
        Dictionary::Entries entries;
        for (Values& values : values_) {
            appendRepetitions(values);
            if (isOutOfMemory_)
                return std::nullopt;
            values.text.dropLast(); // the comma
            entries.push_back({values.key, std::move(values.text).finish()});
        }
        return entries;
    }

private:
    struct Values {
        foundation::String key;
        foundation::StringBuilder text = {}; // with a comma behind each value
        std::size_t lastSize = 0; // of the last value's text, with its comma
        foundation::CborItem last = {};
        std::size_t repetitions = 0; // of the last value, not written yet
    };
    static constexpr std::size_t bytesOfAKey = 256; // all that a key takes, here and in the dictionary
    static constexpr std::size_t paidAtOnce = 4096;

    void appendText(Values& values, foundation::CborItem value)
    {
        if (isOutOfMemory_)
            return;
        foundation::StringBuilder& text = values.text;
        const std::size_t sizeBefore = text.size();
        if (const auto number = value.number())
            number->appendText(text);
        else if (value.kind() == foundation::Value::Kind::String)
            text.append(value.stringView());
        else
            text.append(value.text());
        text.append(',');
        values.lastSize = text.size() - sizeBefore;
        pay(values.lastSize);
    }

    void appendRepetitions(Values& values)
    {
        pay(values.lastSize * values.repetitions);
        if (!isOutOfMemory_)
            values.text.repeatLast(values.lastSize, values.repetitions);
        values.repetitions = 0;
    }

    void pay(std::size_t bytes)
    {
        used_ += bytes;
        if (used_ > share_.bytes())
            isOutOfMemory_ = isOutOfMemory_ || !share_.grow(std::max(used_ - share_.bytes(), paidAtOnce));
    }

    std::vector<Values> values_;
    std::map<std::string_view, std::size_t> positions_; // the keys of `values_`; their characters stay in place
    std::size_t last_ = 0; // the position of the previous value
    session::StorageShare share_;
    std::size_t used_ = 0;
    bool isOutOfMemory_ = false;
};

// Text of a client, made fit for a part of a file name: it cannot leave the directory, and it is cut between characters
// so that it fits the room (bytes).
std::string fileNamePart(std::string_view text, std::size_t room)
{
    std::string part(foundation::cutBetweenCharacters(text, room));
    for (char& character : part)
        if (character == '/' || character == '\0')
            character = '_';
    return part;
}

// Whether the name has the shape of those that `summaryFileName` makes.
bool isSummaryFileName(std::string_view name)
{
    constexpr std::string_view shape = "dddddddd-dddddd+dddd-kesto-";
    const auto fits = [](char character, char expected) {
        switch (expected) {
        case 'd': return character >= '0' && character <= '9';
        case '+': return character == '+' || character == '-';
        default: return character == expected;
        }
    };
    return name.size() > shape.size() && std::ranges::equal(name.substr(0, shape.size()), shape, fits)
        && name.ends_with(".json");
}

// The entry at one place of the payloads, and its text as it was last written.
struct WrittenEntry {
    std::string_view key;
    foundation::CborItem value = {}; // none while no text is kept
    std::string text = {};
};

void writeEntry(foundation::PrettyJsonWriter& writer, WrittenEntry& entry, foundation::CborItem value)
{
    constexpr std::size_t longestKept = 1024;
    if (entry.value.isSameAs(value))
        return writer.writeMember(entry.text);
    writer.writeMember(entry.key, value, entry.text);
    entry.value = value;
    if (entry.text.size() > longestKept)
        entry = {.key = entry.key};
}

// An array of objects with one entry, identifier to payload. False if the store holds a value that JSON cannot express.
bool writeJson(const session::MessageStore& store, foundation::PrettyJsonWriter::Sink sink)
{
    foundation::PrettyJsonWriter writer(std::move(sink));
    session::EntryReader<WrittenEntry> entries;
    writer.beginArray();
    store.forEach([&](const session::MessageStore::Message& message) {
        writer.beginObject();
        writer.key(store.identifier(message));
        writer.beginObject();
        entries.read(
            message.kind, message.payload, [](std::string_view key) { return WrittenEntry{.key = key}; },
            [&](WrittenEntry& entry, foundation::CborItem value) { writeEntry(writer, entry, value); });
        writer.endObject();
        writer.endObject();
    });
    writer.endArray();
    return writer.isWhole();
}

// The name of the file for messages that are written now.
std::string summaryFileName(AudioServiceType serviceType, const Dictionary& configuration)
{
    constexpr std::size_t longestName = 255; // of any file system
    const std::string time =
        foundation::localTimeText(platform::current().clock.secondsSince1970(), "{:%Y%m%d-%H%M%S%z}");
    const std::string beginning = foundation::format("{}-kesto-", time);
    const std::string end =
        foundation::format("-{}.json", KestoReportingUtilityGenerateServiceNameFromServiceType(serviceType));
    const std::string application = KestoReportingUtilityRetrieveAppName(configuration).text();
    return beginning + fileNamePart(application, longestName - beginning.size() - end.size()) + end;
}

} // namespace

std::optional<Dictionary> KestoReportingSession::createSummaryEventForSession() const
{
    const auto run = this->run();
    return run ? run->createSummaryEvent(serviceType_) : std::nullopt;
}

void KestoReportingSession::writeSummaryJson() const
{
    if (const auto run = this->run())
        run->writeSummaryFile(serviceType_, configuration());
}

namespace session {

std::optional<Dictionary> Run::createSummaryEvent(AudioServiceType type)
{
    const foundation::Lock lock(lock_);
    if (store_.empty())
        return std::nullopt;
    std::string serviceType;
    foundation::appendCbor(foundation::Value(type), serviceType);
    ValuesByKey values(budget_);
    values.append(values.positionOf(summaryKey), foundation::CborItem(serviceType));
    EntryReader<std::size_t> entries;
    MessageStore::Cursor cursor(store_);
    while (!values.isOutOfMemory() && cursor.next())
        entries.read(
            cursor.kind(), cursor.payload(), [&](std::string_view key) { return values.positionOf(key); },
            [&](std::size_t position, foundation::CborItem value) { values.append(position, value); });
    auto summary = std::move(values).finish();
    if (!summary) {
        ++messagesLost_;
        platform::current().ledger.count(ledger::Counter::SummariesLost);
        KESTO_LOG(KestoReportingSessionCategory(), Error, "no memory left for the summary of session {}; it is lost",
                  reporterID_);
    }
    return summary;
}

void Run::writeSummaryFile(AudioServiceType serviceType, const Dictionary& configuration) const
{
    if (!KestoReportingUtilityIsInternalBuild() || store_.empty())
        return;
    platform::FileSystem& files = platform::current().fileSystem;
    const std::filesystem::path directory = files.diagnosticLogRoot() / summaryDirectory;
    const auto directoryMade = files.createDirectories(directory, summaryDirectoryPermissions);
    const std::filesystem::path path = directory / summaryFileName(serviceType, configuration);
    const auto file = files.createAtomically(path);

    std::uint64_t bytes = 0;
    const bool isSerialised = writeJson(store_, [&](std::string_view text) {
        bytes += text.size();
        if (file)
            (*file)->write(text);
    });
    if (!isSerialised) {
        KESTO_LOG(KestoReportingSessionCategory(), Error, "dataWithJSONObject: a number is not finite");
        if (file)
            (*file)->clear();
        bytes = 0;
    }
    if (!directoryMade)
        KESTO_LOG(KestoReportingSessionCategory(), Error, "can't create logging directory at {}: {}",
                  directory.string(), directoryMade.error().message());

    auto written = file ? (*file)->commit() : std::unexpected(file.error());
    if (written)
        files.keepWithin(
            directory,
            {KestoReportingSession::mostSummaryFiles, KestoReportingSession::mostSummaryBytes, isSummaryFileName},
            bytes);
    if (written && !directoryMade)
        written = std::unexpected(directoryMade.error());
    if (written)
        KESTO_LOG(KestoReportingSessionCategory(), Info, "jsonOutput writeToURL: {}", path.string());
    else
        KESTO_LOG(KestoReportingSessionCategory(), Error, "jsonOutput writeToURL: {}", written.error().message());
}

} // namespace session
